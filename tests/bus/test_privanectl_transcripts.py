"""tests/bus/test_privanectl_transcripts.py: what the documents show of the client is what it shows."""
import shlex

import pytest
from _pytest.mark import ParameterSet

from document_blocks import block
from harness.accounts import AccountFiles
from harness.bus import Bus
from harness.passwords import NEW, OLD_HASH
from harness.privanectl import PROGRAM, Terminal, as_user
from harness.service_fixtures import StartService

PROMPT = "privanectl "
ROOT, ALICE = "$ ", "alice$ "

PASSWD = """\
root:x:0:0:root:/root:/bin/sh
alice:x:1000:100:Alice Liddell:/home/alice:/bin/false
"""
SHADOW = f"root:{OLD_HASH}:19000:0:99999:7:0::\nalice:{OLD_HASH}:19000:0:99999:7:0::\n"
GROUP = "root:x:0:\nusers:x:100:alice\noperator:x:102:alice\n"


def transcripts(text: str) -> list[tuple[str, str]]:
    """The commands that are shown, with the prompt, each with what it prints: the whole block."""
    found: list[tuple[str, list[str]]] = []
    for line in text.splitlines():
        if line.startswith((ROOT + PROMPT, ALICE + PROMPT)):
            found.append((line, []))
        else:
            found[-1][1].append(line)
    return [(command, "\n".join(lines).rstrip()) for command, lines in found]


README = transcripts(block("README.md", "$ privanectl group list --no-legend"))
GUIDE = transcripts(block("docs/privanectl.md", "$ privanectl group list"))


def test_there_are_some() -> None:
    assert (len(README), len(GUIDE)) == (3, 4)


def with_the_libauthz_that_answers(command: str, shown: str) -> ParameterSet:
    """What explains a decision shows that of polkit."""
    mark = pytest.mark.polkit if " explain " in command else pytest.mark.real_authz
    return pytest.param(command, shown, marks=mark)


@pytest.mark.parametrize("command, shown", [
    with_the_libauthz_that_answers(*one) for one in README + GUIDE])
def test_transcript(command: str, shown: str, accounts: AccountFiles, start: StartService,
                    bus: Bus, privane_gid: int) -> None:
    accounts.write_exactly(PASSWD, SHADOW, GROUP)
    service = start()
    service.wait_registered(bus)
    who, words = command.split(PROMPT, 1)
    wrapper = as_user(1000, (privane_gid,)) if who == ALICE else []
    terminal = Terminal(*shlex.split(words), environment={"TERM": "dumb"},
                        program=(*wrapper, PROGRAM))
    try:
        seen = ""
        for question in ("New password: ", "Again: "):
            if question.strip() in shown:
                terminal.await_text(question)
                terminal.type(f"{NEW}\n")
                seen += terminal.passed + question
        terminal.wait()
        seen += terminal.shown
    finally:
        terminal.close()
    assert [line.rstrip() for line in seen.rstrip().split("\n")] == shown.split("\n")
