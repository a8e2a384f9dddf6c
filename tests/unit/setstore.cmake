# setstore tests
