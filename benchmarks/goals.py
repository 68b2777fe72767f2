"""benchmarks/goals.py: the goals, one row each.

A row whose figure a run does not yield has failed. None is left out because its program is missing.
"""
from dataclasses import dataclass

from benchmarks.figures import SLACK, Bound

AT_MOST, AT_LEAST = Bound.AT_MOST, Bound.AT_LEAST


@dataclass(frozen=True)
class Goal:
    number: str
    what: str
    over: str
    bound: Bound
    goal: float
    stretch: float | None = None
    unit: str = ""
    # What has a unit, a size or a count, has none: two runs agree on it.
    slack: float = SLACK


REFERENCE = "the reference"
WITH_POLKIT = "the reference with polkit"
STOCK = "the accounts daemon"
MINIMAL = "the minimal daemon"

GOALS = (
    Goal("1", "GetUser, everything allowed", "Ping of the same process", AT_MOST, 1.40, 1.30),
    Goal("2a", "GetUser, everything allowed", REFERENCE, AT_MOST, 1.08, 1.03),
    Goal("2b", "CheckUser, everything allowed", REFERENCE, AT_MOST, 1.08, 1.03),
    Goal("2c", "GetGroup, everything allowed", REFERENCE, AT_MOST, 1.08, 1.03),
    Goal("3a", "GetUser with polkit, root", WITH_POLKIT, AT_MOST, 1.05, 1.02),
    Goal("3b", "GetUser with polkit, allowed by a rule", WITH_POLKIT, AT_MOST, 1.05, 1.02),
    Goal("3c", "GetUser with polkit, refused", WITH_POLKIT, AT_MOST, 1.05, 1.02),
    Goal("4", "GetUser with the policy file", REFERENCE, AT_MOST, 1.10, 1.05),
    Goal("5", "Processor time of the service, GetUser with polkit", WITH_POLKIT, AT_MOST, 1.10, 1.03),
    Goal("6", "GetUser calls a second, 8 callers, with polkit", WITH_POLKIT, AT_LEAST, 0.95, 0.98),
    Goal("7a", "GetUserList, 100 users", REFERENCE, AT_MOST, 1.15, 1.05),
    Goal("7b", "GetUserList, 1,000 users", REFERENCE, AT_MOST, 1.15, 1.05),
    Goal("7c", "GetUserList, 10,000 users", REFERENCE, AT_MOST, 1.15, 1.05),
    Goal("7d", "GetUserList, 59,001 users", REFERENCE, AT_MOST, 1.15, 1.05),
    Goal("8", "AddUser, 25 users, ext4", "the floor of the chain and " + WITH_POLKIT, AT_MOST, 1.10, 1.04),
    Goal("9", "AddUser, 25 users, tmpfs", "hash, pidof and " + WITH_POLKIT, AT_MOST, 1.20, 1.10),
    Goal("10a", STOCK + "'s CreateUser and SetPassword (it also makes a home directory), 25 users, ext4",
         "AddUser", AT_LEAST, 10, 12),
    Goal("10b", STOCK + "'s CreateUser and SetPassword (it also makes a home directory), 10,000 users,"
         " ext4", "AddUidUser", AT_LEAST, 8.5, 13),
    Goal("11a", "useradd and chpasswd, 25 users, ext4", "AddUser", AT_LEAST, 4, 4.3),
    Goal("11b", "useradd and chpasswd, 10,000 users, ext4", "AddUidUser", AT_LEAST, 4.3, 6.5),
    Goal("12a", STOCK + "'s DeleteUser, 25 users, ext4", "RemoveUser", AT_LEAST, 4.5, 5),
    Goal("12b", "userdel, 25 users, ext4", "RemoveUser", AT_LEAST, 3.4, 3.7),
    Goal("13", "AuthUserBasic, everything allowed", "the hash and " + REFERENCE, AT_MOST, 1.08, 1.03),
    Goal("14", "Start to the name, 25 users", MINIMAL, AT_MOST, 1.25, 1.10),
    Goal("15", "Start to the name, 59,001 users", STOCK, AT_MOST, 0.45, 0.15),
    Goal("16a", "Resident memory at rest, 25 users", MINIMAL, AT_MOST, 1.20, 1.08),
    Goal("16b", "Resident memory at rest, 25 users", STOCK, AT_MOST, 1.00, 0.92),
    Goal("17", "Resident memory, 59,001 users", STOCK, AT_MOST, 0.80, 0.45),
    Goal("18", "Growth of resident memory, 20,000 mixed calls and 500 users added and removed",
         "nothing", AT_MOST, 256, 0, "KiB", slack=0),
    Goal("19a", "Growth exponent of loading, 1,000 to 59,001 users", "1,000 users", AT_MOST, 1.10, 1.03),
    Goal("19b", "Growth exponent of GetUserList, 1,000 to 59,001 users", "1,000 users", AT_MOST, 1.10, 1.03),
    Goal("19c", "Growth exponent of adding a user, tmpfs, less the hash and pidof, 1,000 to 59,001 users",
         "1,000 users", AT_MOST, 1.10, 1.03),
    Goal("20a", "Growth exponent of GetUser, 1,000 to 59,001 users", "1,000 users", AT_MOST, 0.05, 0.02),
    Goal("20b", "Growth exponent of CheckUser, 1,000 to 59,001 users", "1,000 users", AT_MOST, 0.05, 0.02),
    Goal("20c", "Growth exponent of GetGroup, 1,000 to 59,001 users", "1,000 users", AT_MOST, 0.05, 0.02),
    Goal("21", "GetUser, 1,010 groups", "20 groups", AT_MOST, 1.25, 1.05),
    Goal("22", "ModifyUser, 2,000 secondary names", "200 names", AT_MOST, 12, 10),
    Goal("23", "Spawning pidof, 59,001 users", "25 users", AT_MOST, 1.15, 1.05),
    Goal("24", "A refusal where polkitd is stopped", "the deadline", AT_MOST, 1.1),
    Goal("25a", "Stripped service with its libraries", "nothing", AT_MOST, 400, 250, "kB", slack=0),
    Goal("25b", "Shared libraries loaded, with polkit", "nothing", AT_MOST, 31, None, "files", slack=0),
    Goal("25c", "Shared libraries loaded, with the policy file", "nothing", AT_MOST, 24, None, "files",
         slack=0),
)
