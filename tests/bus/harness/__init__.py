"""tests/bus/harness: what the tests of the bus ring are written with."""
