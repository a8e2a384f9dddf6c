# request benchmarks
