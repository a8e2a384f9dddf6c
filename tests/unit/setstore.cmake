# Settings store library and its command-line tool.
add_executable(test-setstore ${CMAKE_CURRENT_SOURCE_DIR}/test-setstore.cpp)
target_link_libraries(test-setstore PRIVATE qor_setstore test_support GTest::gtest_main)
# The tool tests run the built executable.
add_dependencies(test-setstore setstore)
gtest_discover_tests(test-setstore DISCOVERY_TIMEOUT 60 PROPERTIES LABELS "tsan")
