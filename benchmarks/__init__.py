"""benchmarks: what ./bench measures, and how; started by it in the sandbox of the bus ring."""
