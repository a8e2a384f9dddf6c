# vorn tests
