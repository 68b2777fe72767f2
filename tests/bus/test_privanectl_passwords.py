"""tests/bus/test_privanectl_passwords.py: where the client takes passwords from, and where it
leaves none."""
import os
import signal
import subprocess
import time
from pathlib import Path
from typing import Iterator

import pytest

from harness.changing_accounts import stored_hash
from harness.passwords import MARK, NEW, OLD, is_hash_of
from harness.privanectl import (DONE, PROGRAM, USAGE, Run, Terminal, failed, privanectl,
                                surroundings, with_password)
from harness.stage import Stage

NOTHING = Run(DONE, "", "")
PASSWD = ("user", "passwd", "bob")


@pytest.fixture
def prompt(stage: Stage) -> Iterator[Terminal]:
    """privanectl user passwd bob, which has asked for the password."""
    terminal = Terminal(*PASSWD)
    terminal.await_text("New password: ")
    yield terminal
    terminal.close()


def test_password_is_asked_for_twice_and_not_shown(prompt: Terminal) -> None:
    assert not prompt.echoes()
    prompt.type(f"{NEW}\n")
    prompt.await_text("Again: ")
    prompt.type(f"{NEW}\n")

    assert prompt.wait() == 0
    assert prompt.shown == "\n"
    assert prompt.echoes()
    assert is_hash_of(stored_hash("bob"), NEW)


def test_passwords_that_differ_are_not_used(prompt: Terminal) -> None:
    prompt.type(f"{NEW}\n")
    prompt.await_text("Again: ")
    prompt.type(f"{OLD}x\n")

    assert prompt.wait() == 1
    assert prompt.shown == "\nprivanectl: The passwords differ\n"
    assert is_hash_of(stored_hash("bob"), OLD)


def test_password_may_be_corrected(prompt: Terminal) -> None:
    prompt.type(2 * f"wrong\x15{NEW}x\x7f\n")
    assert prompt.wait() == 0
    assert is_hash_of(stored_hash("bob"), NEW)


@pytest.mark.parametrize("descriptor", [0, 1, 2])
@pytest.mark.parametrize("words", [PASSWD, ("user", "authenticate", "bob"),
                                   ("user", "modify", "bob"), ("digest", "set", "bob")],
                         ids=" ".join)
def test_terminal_is_no_descriptor_of_a_password(words: tuple[str, ...], descriptor: int,
                                                 stage: Stage) -> None:
    """It would show what is typed: nobody is asked to type there."""
    terminal = Terminal(*words, f"--password-fd={descriptor}")
    try:
        assert terminal.wait() == USAGE
        assert terminal.shown == (
            f"privanectl: descriptor {descriptor} is a terminal, which would show the password; "
            "let privanectl ask for it\n")
        assert terminal.echoes()
    finally:
        terminal.close()
    assert stage.calls() == []
    assert is_hash_of(stored_hash("bob"), OLD)


@pytest.mark.parametrize("number", [signal.SIGINT, signal.SIGTERM, signal.SIGHUP])
def test_signal_ends_the_question_and_brings_the_echo_back(number: signal.Signals,
                                                           prompt: Terminal) -> None:
    if number == signal.SIGINT:
        prompt.type("half\x03")
    else:
        prompt.process.send_signal(number)

    assert prompt.wait() == -number
    assert prompt.echoes()
    assert is_hash_of(stored_hash("bob"), OLD)


def test_terminal_stop_is_no_way_out_without_echo(stage: Stage) -> None:
    # Only what a shell with job control has started can be stopped at all.
    shell = Terminal("--norc", "-i", program=("/bin/bash",), environment={"PS1": "ready> "})
    try:
        shell.await_text("ready> ")
        shell.type(" ".join([PROGRAM, *PASSWD]) + "\n")
        shell.await_text("New password: ")
        shell.type(f"\x1a{NEW}\n")
        shell.await_text("Again: ")
        shell.type(f"{NEW}\n")
        shell.await_text("ready> ")
        assert is_hash_of(stored_hash("bob"), NEW)
    finally:
        shell.close()


@pytest.mark.parametrize("typed", ["\x04", "\n"])
def test_empty_password_is_no_new_one(typed: str, prompt: Terminal) -> None:
    prompt.type(typed)

    assert prompt.wait() == 1
    assert prompt.shown.strip() == "privanectl: The password is empty"
    assert is_hash_of(stored_hash("bob"), OLD)


def test_question_for_an_old_password_comes_once(stage: Stage) -> None:
    terminal = Terminal("user", "authenticate", "bob")
    try:
        terminal.await_text("Password: ")
        terminal.type(f"{OLD}\n")
        assert terminal.wait() == 0
        assert terminal.shown == "\n"
    finally:
        terminal.close()


def test_question_goes_to_the_terminal_whatever_the_output_is(stage: Stage, tmp_path: Path) -> None:
    file = tmp_path / "output"
    terminal = Terminal("-c", f"{PROGRAM} user passwd bob </dev/null >{file} 2>&1",
                        program=("/bin/bash",))
    try:
        for text in ("New password: ", "Again: "):
            terminal.await_text(text)
            terminal.type(f"{NEW}\n")
        assert terminal.wait() == 0
        assert file.read_text() == ""
        assert is_hash_of(stored_hash("bob"), NEW)
    finally:
        terminal.close()


def test_optional_password_is_asked_for_on_demand(stage: Stage) -> None:
    terminal = Terminal("user", "modify", "bob", "--ask-password")
    try:
        for text in ("New password: ", "Again: "):
            terminal.await_text(text)
            terminal.type(f"{NEW}\n")
        assert terminal.wait() == 0
        assert is_hash_of(stored_hash("bob"), NEW)
    finally:
        terminal.close()


def test_no_terminal(stage: Stage) -> None:
    assert privanectl(*PASSWD) == failed(
        "No terminal to ask for the password on; see --password-fd")
    assert privanectl(*PASSWD, stdin=f"{NEW}\n") == failed(
        "No terminal to ask for the password on; see --password-fd")


def test_password_from_standard_input(stage: Stage) -> None:
    assert privanectl(*PASSWD, "--password-fd=0", stdin=f"{NEW}\n") == NOTHING
    assert is_hash_of(stored_hash("bob"), NEW)


@pytest.mark.parametrize("password, text", [
    ("x" * 1024, "The password is too long, or has a NUL byte"),
    (f"{NEW}\0", "The password is too long, or has a NUL byte"),
    (b"\xff\xfe", "The password is no UTF-8"),
    ("", "The password is empty"),
    ("\n", "The password is empty"),
])
def test_password_that_cannot_be_one(password: str | bytes, text: str, stage: Stage) -> None:
    assert with_password(password, *PASSWD) == failed(text)
    assert is_hash_of(stored_hash("bob"), OLD)


def test_descriptor_that_is_none(stage: Stage) -> None:
    assert privanectl(*PASSWD, "--password-fd=99") == failed(
        "Cannot read the password: Bad file descriptor")


def test_what_stands_behind_the_line_is_left_to_others(stage: Stage) -> None:
    reading, writing = os.pipe()
    os.write(writing, f"{NEW}\nnext\n".encode())
    os.close(writing)
    try:
        assert privanectl(*PASSWD, f"--password-fd={reading}", descriptors=(reading,)) == NOTHING
        assert os.read(reading, 100) == b"next\n"
    finally:
        os.close(reading)


def test_no_option_takes_a_password(stage: Stage) -> None:
    assert privanectl(*PASSWD, NEW).status == 2
    assert privanectl(*PASSWD, f"--password={NEW}").status == 2


def test_no_password_shows_in_the_process_list(stage: Stage) -> None:
    reading, writing = os.pipe()
    os.write(writing, f"{NEW}\n".encode())
    # A service that does not answer keeps the client as it is when the password is on its way.
    os.kill(stage.service.pid, signal.SIGSTOP)
    client = subprocess.Popen([PROGRAM, *PASSWD, f"--password-fd={reading}"], pass_fds=(reading,),
                              env=surroundings())
    try:
        end = time.monotonic() + 30
        while "poll" not in Path(f"/proc/{client.pid}/wchan").read_text():
            assert time.monotonic() < end
            time.sleep(0.01)
        seen = [Path(f"/proc/{client.pid}/{name}").read_bytes() for name in ("cmdline", "environ")]
    finally:
        os.kill(stage.service.pid, signal.SIGCONT)
    assert client.wait(60) == 0
    assert is_hash_of(stored_hash("bob"), NEW)
    assert PROGRAM.encode() in seen[0] and b"TERM=" in seen[1]
    assert not [text for text in seen if MARK.encode() in text]
    os.close(reading)
    os.close(writing)
