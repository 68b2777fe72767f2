"""tests/kit/test_testkit.py: tools/sandbox runs a command beside the service, and changes nothing else."""
import os
import re
import subprocess
import tempfile
from pathlib import Path

import pytest
from document_blocks import block

from kit import (BUILD, CALL, EXAMPLES, NO_SANDBOX, OWN_TESTS, SECONDS, TREE, as_user, output_of,
                 sandbox)


@pytest.mark.parametrize("script, status", [("exit 0", 0), ("exit 7", 7), ("kill -TERM $$", 143)])
def test_status_is_passed_on(script: str, status: int) -> None:
    assert sandbox("--", "sh", "-c", script).returncode == status


def test_streams_are_the_commands() -> None:
    ended = sandbox("--", "sh", "-c", "cat; echo bad >&2", stdin="some words")

    assert (ended.returncode, ended.stdout, ended.stderr) == (0, "some words", "bad\n")


def test_command_that_is_not_there() -> None:
    ended = sandbox("--", "/no/such/command")

    assert ended.returncode == 127
    assert ended.stderr == "tools/sandbox: /no/such/command: No such file or directory\n"


def host_files() -> dict[str, tuple[bytes, tuple[int, ...]]]:
    """What the service rewrites, of this machine, with what would tell of a new file."""
    found = {}
    for name in ("passwd", "shadow", "group", "privane/parameters.conf",
                 "apache2/digest_auth_passwd"):
        path = Path("/etc") / name
        if path.exists() and os.access(path, os.R_OK):
            seen = path.stat()
            found[name] = (path.read_bytes(), (seen.st_ino, seen.st_mtime_ns, seen.st_ctime_ns))
    return found


def test_this_machine_stays_as_it_was() -> None:
    before, folder = host_files(), sorted(os.listdir("/etc"))
    assert {"passwd", "group"} <= set(before)

    shown = output_of("--", "sh", "-euc", f"""
        touch /etc/testkit-was-here /usr/bin/testkit-was-here /testkit-was-here
        {CALL}AddUser alice Geheim users '' Alice
        {CALL}ChpasswdUser root Geheim
        cat /etc/passwd /etc/apache2/digest_auth_passwd /etc/privane/parameters.conf
        ls /etc/testkit-was-here""")

    assert re.search(r"^alice:x:\d+:\d+:Alice:", shown, re.MULTILINE)
    assert re.search(r"^alice:PRIVANE:[0-9a-f]{32}$", shown, re.MULTILINE)
    assert "root.System.RootPwdSet=yes\n/etc/testkit-was-here\n" in shown
    assert host_files() == before
    assert sorted(os.listdir("/etc")) == folder
    assert not [path for path in ("/usr/bin", "/") if (Path(path) / "testkit-was-here").exists()]


def test_service_is_called_by_both_clients() -> None:
    assert output_of("--", "privanectl", "user", "check", "root", "--json=short") == (
        '{"exists":true}\n')
    assert output_of("--", "sh", "-c", f"{CALL}CheckUser alice") == "(false,)\n"


def test_what_the_service_calls_is_recorded(tmp_path: Path) -> None:
    calls, log = tmp_path / "calls", tmp_path / "log"
    shown = output_of(f"--calls={calls}", f"--log={log}", "--", "sh", "-euc", f"""
        {CALL}CheckUser root >/dev/null
        {CALL}SetTimeOfDay 7 8
        {CALL}AdjTime 1 0
        testkit-calls
        testkit-calls --forget
        {CALL}Reboot
        {CALL}RestartService sshd
        {CALL}AddBootblockParam 'TWO WORDS' x
        [ $(date +%s) -gt 1000000000 ]""")

    assert shown == ("(0,)\n()\nsettimeofday 7 8\nrtc_write_time 7 8\nadjtime 1 0\n"
                     "(0,)\n()\n()\n")
    lines = calls.read_text().splitlines()
    assert lines[0] == "/sbin/sysflash reboot"
    assert "RestartUnit ss sshd.service replace" in lines
    assert "bootparam_write 'TWO WORDS' x 0" in lines
    assert "message: Starting privane_system" in log.read_text().splitlines()


def test_answers_of_stand_ins_are_chosen() -> None:
    shown = output_of("--", "sh", "-euc", f"""
        echo 3 >/run/stand-ins/sysflash/status
        printf neighbour >/run/stand-ins/lldpcli/output
        printf 4711 >/run/testkit/boot/value
        echo 1 >/run/testkit/clock/errno
        {CALL}Reboot
        {CALL}ExecuteLldpcli show-neighbors
        {CALL}ReadSerno
        {CALL}SetTimeOfDay 7 8""")

    assert shown == "(768,)\n('neighbour',)\n('4711',)\n(-1,)\n"


def test_rules_decide_for_users() -> None:
    rules = f"--rules={EXAMPLES / '60-privane-viewer.rules'}"
    script = f"{{}} {CALL}CheckUser root"

    assert output_of(rules, "--", "sh", "-c", script.format(as_user("viewer"))) == "(true,)\n"
    refused = sandbox(rules, "--", "sh", "-c", script.format(as_user("clerk")))
    assert refused.returncode == 1 and "is refused to uid 701" in refused.stderr
    without = sandbox("--", "sh", "-c", script.format(as_user("viewer")))
    assert without.returncode == 1 and "is refused to uid 703" in without.stderr
    stranger = sandbox(rules, "--", "sh", "-c", script.format(as_user("stranger")))
    assert stranger.returncode == 1 and "AccessDenied" in stranger.stderr


def test_policy_file_decides_for_users() -> None:
    policy = f"--policy={EXAMPLES / 'privane-authz-roles.conf'}"
    script = f"{{}} {CALL}CheckUser root"

    assert output_of(policy, "--", "sh", "-c", script.format(as_user("viewer"))) == "(true,)\n"
    refused = sandbox(policy, "--", "sh", "-c", script.format(as_user("clerk")))
    assert refused.returncode == 1 and "is refused to uid 701" in refused.stderr


def test_policy_file_decides_for_root_without_polkit(tmp_path: Path) -> None:
    """Which polkit would never refuse a thing, and which goes on without it."""
    policy = tmp_path / "some.conf"
    policy.write_text("[role some]\nusers=root\nactions=com.zintor.privane-system.checkuser\n")
    script = f"""
        kill -KILL $(cat /run/bus-sandbox/polkitd.pid)
        cat /etc/privane/authz.conf
        {CALL}CheckUser root
        {CALL}CheckGroup root"""
    ended = sandbox(f"--policy={policy}", "--", "sh", "-c", script)

    assert ended.stdout == f"{policy.read_text()}(true,)\n"
    assert "checkgroup is refused to uid 0" in ended.stderr


def test_library_takes_the_place_of_ours() -> None:
    library = BUILD / "docs" / "examples" / "library"

    assert output_of(f"--library={library}", "--", "sh", "-euc", f"""
        {CALL}ChpasswdUser root Geheim
        ls /etc/camera/parameters""") == "()\nroot.System.RootPwdSet\n"


def test_folder_is_laid_over_the_root(tmp_path: Path) -> None:
    (tmp_path / "etc").mkdir()
    (tmp_path / "etc" / "camera.conf").write_text("laid\n")

    assert output_of(f"--lay={tmp_path}", "--", "cat", "/etc/camera.conf") == "laid\n"


def test_current_folder_is_seen_and_written_only_when_allowed(tmp_path: Path) -> None:
    (tmp_path / "words").write_text("some words\n")
    write = ("sh", "-c", "cat words; echo new >result")

    assert sandbox("--", *write, folder=tmp_path).returncode != 0
    assert not (tmp_path / "result").exists()
    assert output_of(f"--write={tmp_path}", "--", *write, folder=tmp_path) == "some words\n"
    assert (tmp_path / "result").read_text() == "new\n"


def test_folder_in_a_private_one_is_found_by_all_users() -> None:
    """As a clone in somebody's home folder is."""
    with tempfile.TemporaryDirectory(dir="/var/tmp") as private:
        assert Path(private).stat().st_mode & 0o777 == 0o700
        shown = Path(private, "shown")
        shown.mkdir()
        (shown / "words").write_text("some words\n")

        ended = subprocess.run(
            [TREE / "tests/bus/sandbox.sh", "-r", shown, "--", "setpriv", "--reuid=nobody",
             "--regid=nogroup", "--clear-groups", "--", "cat", shown / "words"],
            text=True, capture_output=True, timeout=SECONDS, check=False)
        assert (ended.returncode, ended.stdout) == (0, "some words\n"), ended
        assert Path(private).stat().st_mode & 0o777 == 0o700


@pytest.mark.parametrize("folder", ["/", "/etc", "/home", "/usr/local", "/proc/self/root/etc/.."])
def test_folder_of_the_system_is_not_written(folder: str) -> None:
    ended = sandbox(f"--write={folder}", "--", "true")

    assert ended.returncode == NO_SANDBOX
    assert ended.stderr.endswith("is the system's; --write is for a folder of yours\n")


@pytest.mark.parametrize("folder", ["/etc", "/"])
def test_folder_of_the_system_is_shown_read_only(folder: str) -> None:
    """Where it stands in the way of the sandbox, there is none."""
    before = host_files()

    assert sandbox(f"--library={folder}", "--", "true").returncode == NO_SANDBOX
    assert host_files() == before


@pytest.mark.parametrize("command", [
    block("docs/testkit.md", "tools/sandbox -- "), block("docs/testkit.md", "tools/sandbox --rules="),
    block("docs/testkit.md", "tools/sandbox --policy="),
    block("docs/testkit.md", "tools/sandbox --calls=")])
def test_guide_is_right(command: str) -> None:
    """As it stands there, in the folder that it is said to be started in."""
    written = [BUILD / "calls.txt", BUILD / "log.txt"]
    for file in written:
        file.unlink(missing_ok=True)
    ended = subprocess.run(["bash", "-euc", command], cwd=TREE, text=True, capture_output=True,
                           timeout=SECONDS, check=False)

    assert (ended.returncode, "tools/sandbox" in ended.stderr) == (0, False), ended
    if "--calls=" in command:
        assert written[0].read_text() == "/sbin/sysflash reboot\n"
        assert "Starting privane_system" in written[1].read_text()


def test_example_fails_without_the_role(tmp_path: Path) -> None:
    ended = sandbox("--", OWN_TESTS, folder=tmp_path)

    assert ended.returncode != 0 and "is refused to uid 704" in ended.stderr
