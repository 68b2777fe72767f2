"""tools/reference: what documents tell of the interface, read from the files that decide it."""
