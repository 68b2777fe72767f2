"""tests/long/power/cut_states.py: which states of the disk a power cut may leave, as the log has
it, and a choice of them."""
import random
from collections.abc import Iterator, Sequence
from dataclasses import dataclass

from write_log import FUA, FLUSH, Entry

METADATA = 16
SECTOR, BLOCK = 512, 4096
IN_VAIN = 30
# This part of the amount.
LEAST_SUBSETS = 5


@dataclass(frozen=True)
class State:
    """All before `base` is on the disk, and of what follows the `extra` entries; of the entry
    `torn` only that many bytes. Whatever was answered before `demand` must be there; nothing is
    there that was begun after `newest`."""

    base: int
    demand: int
    newest: int
    extra: tuple[int, ...] = ()
    torn: int = -1
    bytes: int = 0


def prefixes(entries: Sequence[Entry], start: int) -> list[State]:
    """The disk after each write. What is in the log between it and the next has happened, too."""
    writes = [number for number in range(start, len(entries)) if entries[number].length]
    ends = [*writes[1:], len(entries)]
    return [State(write + 1, end, write) for write, end in zip(writes, ends, strict=True)]


def epochs(entries: Sequence[Entry], start: int) -> list[list[int]]:
    """The writes that no flush, and no write past the cache, tells apart."""
    found: list[list[int]] = []
    writes: list[int] = []
    for number in range(start, len(entries)):
        if entries[number].length:
            writes.append(number)
        if writes and entries[number].flags & (FLUSH | FUA):
            found.append(writes)
            writes = []
    return found + [writes] if writes else found


def subsets(entries: Sequence[Entry], start: int, amount: int, seed: str) -> list[State]:
    """Different ones: one of every epoch that has any, also where these are more than the amount,
    and then in turn of all epochs; fewer than asked for where there are no more."""
    chance = random.Random(seed)
    drawn: dict[State, None] = {}
    left = [epoch for epoch in epochs(entries, start)
            if _draw_new(entries, epoch, chance, drawn)]
    while left and len(drawn) < amount:
        chance.shuffle(left)
        # A small epoch's states are soon all drawn.
        left = [epoch for epoch in left
                if len(drawn) >= amount or _draw_new(entries, epoch, chance, drawn)]
    return list(drawn)


def _draw_new(entries: Sequence[Entry], epoch: list[int], chance: random.Random,
              drawn: dict[State, None]) -> bool:
    """Adds a state that was not drawn yet; False where none was found."""
    for _ in range(IN_VAIN):
        state = _draw(entries, epoch, chance)
        if state is not None and state not in drawn:
            drawn[state] = None
            return True
    return False


def _draw(entries: Sequence[Entry], epoch: list[int], chance: random.Random) -> State | None:
    """None for a state that is a prefix, which is there anyway."""
    share = chance.choice((0.5, 0.5, chance.random()))
    extra = tuple(number for number in epoch if chance.random() < share)
    if not extra:
        return None
    tearable = [number for number in extra if entries[number].length > _unit(entries[number])]
    if tearable and chance.random() < 0.5:
        torn = chance.choice(tearable)
        unit = _unit(entries[torn])
        length = unit * chance.randrange(1, entries[torn].length // unit)
        return State(epoch[0], epoch[0], extra[-1], extra, torn, length)
    if extra == tuple(epoch[:len(extra)]):
        return None
    return State(epoch[0], epoch[0], extra[-1], extra)


def _unit(entry: Entry) -> int:
    """A disk writes sectors, but what a file system keeps for itself it trusts to be written in
    blocks."""
    return BLOCK if entry.flags & METADATA else SECTOR


def choose(entries: Sequence[Entry], start: int, amount: int, seed: str) -> list[State]:
    """Every prefix, also where they are more than the amount, and subsets for the rest, which is a
    fifth of the amount at least and one of each epoch; ordered by where they begin."""
    chosen = prefixes(entries, start)
    rest = max(amount - len(chosen), amount // LEAST_SUBSETS)
    chosen += subsets(entries, start, rest, seed)
    return sorted(chosen, key=lambda state: state.base)


def in_pieces(states: Sequence[State], size: int) -> Iterator[Sequence[State]]:
    for start in range(0, len(states), size):
        yield states[start:start + size]
