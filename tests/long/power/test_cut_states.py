"""tests/long/power/test_cut_states.py: the states that are tried are those a power cut may
leave."""
from cut_states import METADATA, choose, epochs, prefixes, subsets
from made_logs import made_log, marked, written
from write_log import FLUSH, FUA, Entry, read_log

BLOCK = b"x" * 4096


def entries() -> list[Entry]:
    return read_log(memoryview(made_log(
        marked("start-0"),                          # 0
        written(0, BLOCK), written(4096, BLOCK),    # 1, 2
        written(8192, BLOCK, METADATA),             # 3
        written(0, b"", FLUSH),                     # 4
        written(12288, BLOCK, FUA | METADATA),      # 5
        marked("answer-1"),                         # 6
        written(0, BLOCK), written(4096, BLOCK),    # 7, 8
        written(0, b"", FLUSH))))                   # 9


def test_a_prefix_for_each_write_with_what_happened_until_the_next() -> None:
    found = prefixes(entries(), 0)
    assert [(state.base, state.demand, state.newest) for state in found] == [
        (2, 2, 1), (3, 3, 2), (4, 5, 3), (6, 7, 5), (8, 8, 7), (9, 10, 8)]
    assert not any(state.extra or state.bytes for state in found)


def test_epochs_end_at_a_flush_and_at_a_write_past_the_cache() -> None:
    assert epochs(entries(), 0) == [[1, 2, 3], [5], [7, 8]]


def test_subsets_stay_within_their_epoch() -> None:
    found = subsets(entries(), 0, 1000, "seed")
    assert len(found) == len(set(found)) > 20
    for state in found:
        (epoch,) = (epoch for epoch in ([1, 2, 3], [5], [7, 8]) if epoch[0] == state.base)
        assert set(state.extra) <= set(epoch)
        assert state.demand == state.base and state.newest == state.extra[-1]
    # All that are no prefixes, and not torn.
    whole = {state.extra for state in found if not state.bytes}
    assert whole == {(2,), (3,), (1, 3), (2, 3), (8,)}


def test_every_epoch_that_has_subsets_is_in_the_smallest_choice() -> None:
    for seed in range(20):
        assert {state.base for state in subsets(entries(), 0, 0, str(seed))} == {1, 7}


def test_only_what_is_not_the_file_systems_own_is_torn_within_a_block() -> None:
    found = [state for state in subsets(entries(), 0, 1000, "seed") if state.bytes]
    assert {state.torn for state in found} == {1, 2, 7, 8}
    assert all(state.torn in state.extra for state in found)
    assert {state.bytes for state in found} == {512 * sectors for sectors in range(1, 8)}


def test_the_same_seed_chooses_the_same() -> None:
    chosen = choose(entries(), 0, 15, "1")
    assert chosen == choose(entries(), 0, 15, "1") != choose(entries(), 0, 15, "2")
    assert len(chosen) == 15
    assert set(prefixes(entries(), 0)) <= set(chosen)
    assert [state.base for state in chosen] == sorted(state.base for state in chosen)


def test_no_prefix_is_left_out_of_a_small_amount() -> None:
    every = set(prefixes(entries(), 0))
    assert len(every) == 6
    # The epoch of one write past the cache has no subset.
    for amount, subsets_of_it in ((1, 2), (5, 2), (6, 2), (8, 2), (10, 4)):
        chosen = choose(entries(), 0, amount, "1")
        assert every <= set(chosen)
        assert len(chosen) == 6 + subsets_of_it
