"""What the benchmarks of whole programs share: running, watching and describing them."""
