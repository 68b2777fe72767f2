"""tests/long/seeded/defects.py: the defects, which proof has to notice each, and how.

A defect is a patch of this folder. Its proof is started with a seed and for an amount that is enough
for it; the same start has to pass without the defect. What the proof prints of its failure has to
match a pattern, in which ^ and $ stand for the ends of a line, so that nothing else passes for having
noticed.
"""
from dataclasses import dataclass


@dataclass(frozen=True)
class Start:
    """A start of a proof, by the name of its row, with what stands behind its command."""

    proof: str
    amount: int
    words: tuple[str, ...] = ()


@dataclass(frozen=True)
class Defect:
    patch: str
    noticed_by: Start
    shown: str


KILLS = Start("kill_points", 4_000)
FAILING = Start("failing_calls", 1_500)

# Those that ./test proof has the time for come first.
DEFECTS = (
    Defect("no-file-fsync.patch",
           Start("power_cuts", 300, ("--file-system", "ext4-writeback")),
           r"^power_cuts: +\w+ is neither old nor new: 0 bytes, "),
    Defect("no-directory-fsync.patch", KILLS,
           r"^FAILURE .*: renamed etc/\w+\.tmp before the folder was synced$"),
    Defect("rename-before-fsync.patch", KILLS,
           r"^FAILURE .*: renamed etc/\w+\.tmp before etc/\w+\.tmp was synced$"),
    Defect("temporary-file-readable.patch", KILLS,
           r"^FAILURE .* etc/shadow\.tmp: shadow\.tmp has another mode than was set$"),
    Defect("last-wins-shadow-index.patch", KILLS,
           r"^FAILURE .*: not stopped: user 'root' is now 'root' password '' "),
    Defect("ignored-read-error.patch", FAILING,
           r"^FAILURE .*, read etc/\w+: Input/output error, .*: the error is\n *\ninstead of$"),
    Defect("missing-utf8-check.patch", Start("fuzzing", 5, ("--target", "tool_arguments")),
           r"^ +This does not hold: the text of an error is UTF-8$"),
    # One of the eight columns of all methods.
    Defect("forgotten-authorization.patch",
           Start("authorization_matrix", 46, ("-k", "test_refused")),
           r"^E +assert None == BusError\(.*reboot is refused to uid "),
    # Of an array; of a single string another row tells.
    Defect("missing-utf8-check-of-lists.patch", Start("fuzzing", 5, ("--target", "replies")),
           r"^ +g_variant_new_string: assertion 'g_utf8_validate "),
    # The content is the same, and so is its time.
    Defect("unheeded-policy-mode.patch",
           Start("policy_matrix", 46, ("-k", "test_other_mode")),
           r"^E +assert None == BusError\(.*/authz\.conf: others than root may write it"),
    Defect("unheeded-policy-folder.patch",
           Start("policy_matrix", 46, ("-k", "test_other_mode")),
           r"^E +AssertionError: assert None == BusError\(.*/privane: others than root may write"),
    # The caller who was asked about first is root.
    Defect("credentials-of-another.patch",
           Start("policy_matrix", 46, ("-k", "test_refused")),
           r"^expected = BusError\(.* is refused to uid "),
    # The last of the files is new, and those before it are not.
    Defect("reversed-renames.patch", Start("daemon_kills", 60),
           r"^E +against version \d+:\nE +/etc/group: "),
    Defect("unheeded-digest-error.patch", Start("daemon_faults", 60),
           r"^E +AssertionError: Fault\(.*\): \(\(\), BusError\(.* digest info for "),
    Defect("missing-argument-check.patch", Start("bus_fuzzing", 2_760),
           r"^E +SUMMARY: AddressSanitizer: heap-buffer-overflow .* in handle_digest\("),
    Defect("vanished-caller-allowed.patch", Start("races", 250),
           r"^E +assert World\(.*\) == World\("),
    Defect("leaked-descriptor.patch", Start("soak", 60), r"^> +assert .*descriptors"),
    # Of who was asked about long ago, and of who is gone.
    Defect("kept-watch.patch", Start("soak_policy_file", 25), r"^> +assert .*match_rules"),
    Defect("kept-credentials.patch", Start("soak_policy_file", 25), r"^> +assert growth < "),
    # How long anybody waits depends on the machine; how much is held does not.
    Defect("no-intake-limit.patch", Start("flood", 2, ("-k", "[lists]")), r"^> +assert peak <= "),
    Defect("no-intake-limit.patch", Start("flood_limited", 2, ("-k", "[lists]")), r"^> +assert peak <= "),
    # With the sender's name before it: what GDBus read from its socket.
    Defect("no-zeros.patch", Start("daemon_secrets", 60),
           r"^E .*: memory at 0x\w+: b'.*:1\.\d+\\x00"),
)
