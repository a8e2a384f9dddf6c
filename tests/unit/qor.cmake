# qor tests
