# devsim benchmarks
