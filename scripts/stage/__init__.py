"""A device to try the built programs on: tests, demos and benchmarks stand on it."""
