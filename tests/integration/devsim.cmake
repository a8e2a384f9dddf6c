# devsim tests
