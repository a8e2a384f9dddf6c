# qor-server under systemd-socket-activate on a temporary root.
add_executable(test-server ${CMAKE_CURRENT_LIST_DIR}/test-server.cpp)
target_link_libraries(test-server PRIVATE test_support GTest::gtest_main)
add_dependencies(test-server qor-server)
gtest_discover_tests(test-server DISCOVERY_TIMEOUT 60 PROPERTIES TIMEOUT 120)
