"""tests/kit/test_failures.py: what tools/sandbox says where it cannot run the command, with status 125."""
import shutil
import subprocess
from pathlib import Path

import pytest

from kit import BUILD, EXAMPLES, NO_SANDBOX, TREE, sandbox
from path import programs, stand_in

HOW = "run: tools/install_dependencies build test && tools/build build\n"


def refusal(*words: str | Path, environment: dict[str, str] | None = None) -> str:
    """The one line that is said instead of running a command."""
    ended = sandbox(*words, "--", "echo", "ran", environment=environment)
    assert (ended.returncode, ended.stdout) == (NO_SANDBOX, ""), ended
    assert ended.stderr.count("\n") == 1, ended
    return ended.stderr


@pytest.mark.parametrize("words", [(), ("--nothing",), ("--library=/no/such", "--", "true")])
def test_wrong_usage_runs_nothing(words: tuple[str, ...]) -> None:
    ended = sandbox(*words)

    assert ended.returncode == NO_SANDBOX and ended.stderr.startswith("tools/sandbox: ")


@pytest.mark.parametrize("option", ["--lay", "--library", "--rules", "--policy", "--write"])
def test_path_that_is_not_there(option: str) -> None:
    assert refusal(f"{option}=no/such") == f"tools/sandbox: {option}: no/such is not there\n"


@pytest.mark.parametrize("option", ["--rules", "--policy"])
def test_folder_in_the_place_of_a_file(option: str, tmp_path: Path) -> None:
    assert refusal(f"{option}={tmp_path}") == f"tools/sandbox: {option}: {tmp_path} is no file\n"


def test_rules_beside_a_policy_file() -> None:
    words = [f"--rules={EXAMPLES}/60-privane-viewer.rules", f"--policy={TREE}/data/authz.conf"]

    assert refusal(*words) == (
        "tools/sandbox: --rules are polkit's; with --policy it is not asked\n")


def test_build_without_the_libauthz_of_the_policy_file(tmp_path: Path) -> None:
    for folder in (".", "platform", "platform/authz"):
        (tmp_path / folder).mkdir(exist_ok=True)
        for entry in (BUILD / folder).iterdir():
            if entry.name not in ("platform", "authz", "policy"):
                (tmp_path / folder / entry.name).symlink_to(entry)

    assert refusal(f"--build={tmp_path}", f"--policy={TREE}/data/authz.conf") == (
        f"policy_library.sh: {tmp_path} lacks the libauthz of the policy file; "
        "build it with -Dtests=true\n")


@pytest.mark.parametrize("option", ["--calls", "--log"])
@pytest.mark.parametrize("path", ["/no/such/file", "/usr"])
def test_file_that_cannot_be_made(option: str, path: str) -> None:
    assert refusal(f"{option}={path}") == f"tools/sandbox: {option}: {path} cannot be written\n"


def test_folder_without_a_build(tmp_path: Path) -> None:
    assert refusal(f"--build={tmp_path}").startswith(
        f"tools/sandbox: {tmp_path} is no build directory; ")
    assert refusal(f"--build={tmp_path}/none").startswith(
        f"tools/sandbox: {tmp_path}/none is no build directory; ")


@pytest.fixture(name="clone")
def fixture_clone(tmp_path: Path) -> Path:
    """Another tree, which has no build."""
    (tmp_path / "tools").mkdir()
    shutil.copy(TREE / "tools" / "sandbox", tmp_path / "tools")
    return tmp_path


def refusal_in(clone: Path) -> str:
    ended = subprocess.run([clone / "tools" / "sandbox", "--", "true"], capture_output=True,
                           text=True, timeout=60, check=False)
    assert ended.returncode == NO_SANDBOX and ended.stderr.count("\n") == 1, ended
    return ended.stderr


def test_tree_without_a_build(clone: Path) -> None:
    assert refusal_in(clone) == f"tools/sandbox: {clone}/build is no build directory; {HOW}"


def test_build_without_the_tests(clone: Path) -> None:
    """As Meson makes it unless told otherwise."""
    build = clone / "build"
    subprocess.run(["meson", "setup", build, TREE], check=True, capture_output=True, timeout=300)

    assert refusal_in(clone) == (
        f"tools/sandbox: {build} lacks the stand-ins of the tests; {HOW}")


@pytest.mark.parametrize("program", ["meson", "gdbus", "pivot_root", "dbus-daemon", "mount"])
def test_program_that_is_missing(program: str, tmp_path: Path) -> None:
    said = refusal(environment={"PATH": programs(tmp_path, without=program)})

    assert f" needs {program}; run: tools/install_dependencies " in said


def test_build_that_is_not_finished(tmp_path: Path) -> None:
    """It has the stand-ins, and not what is installed."""
    shutil.copytree(BUILD / "meson-private", tmp_path / "meson-private")
    for name in ("build.ninja", "tests"):
        (tmp_path / name).symlink_to(BUILD / name)
    ended = sandbox(f"--build={tmp_path}", "--", "echo", "ran")

    assert (ended.returncode, ended.stdout) == (NO_SANDBOX, "")
    assert ended.stderr.endswith(f"tools/sandbox: cannot install {tmp_path} into a temporary folder; "
                                 "make it with -Dtests=true, as tools/build build does\n")


def test_service_that_does_not_start(tmp_path: Path) -> None:
    stand_in(tmp_path, "libparamcli.so.1", "")
    said = refusal(f"--library={tmp_path}")

    assert said.startswith("tools/sandbox: the service did not start; the last that it said: ")
    assert "libparamcli.so.1" in said


def test_log_tells_why_the_service_did_not_start(tmp_path: Path) -> None:
    stand_in(tmp_path, "libparamcli.so.1", "")
    refusal(f"--library={tmp_path}", f"--log={tmp_path}/log")

    assert "libparamcli.so.1" in (tmp_path / "log").read_text()


def test_service_that_ends_is_told() -> None:
    ended = sandbox("--", "sh", "-c", """
        pid=$(gdbus call --system --dest org.freedesktop.DBus --object-path / --method \
              org.freedesktop.DBus.GetConnectionUnixProcessID com.zintor.PrivaneSystem |
              sed 's/[^0-9]*32 \\([0-9]*\\).*/\\1/')
        kill -KILL $pid
        while [ -d /proc/$pid ] && ! grep -q '^State:.Z' /proc/$pid/status; do sleep 0.01; done""")

    assert ended.returncode == NO_SANDBOX
    assert ended.stderr == "tools/sandbox: the service ended, with status -9\n"


def test_sandbox_that_ends_is_told() -> None:
    """The kit's own program is ended by the command that it runs."""
    ended = sandbox("--", "sh", "-c", "kill -KILL $PPID; sleep 60")

    assert ended.returncode == NO_SANDBOX
    assert ended.stderr.endswith(
        "tools/sandbox: the sandbox ended before the command did, with status 137\n")


def test_status_125_of_the_command_is_the_commands() -> None:
    ended = sandbox("--", "sh", "-c", "exit 125")

    assert (ended.returncode, ended.stderr) == (NO_SANDBOX, "")
