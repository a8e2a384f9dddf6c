# qor-server under systemd-socket-activate on a temporary root.
add_executable(test-server ${CMAKE_CURRENT_LIST_DIR}/test-server.cpp)
target_link_libraries(test-server PRIVATE test_support GTest::gtest_main)
add_dependencies(test-server qor-server)
gtest_discover_tests(test-server DISCOVERY_TIMEOUT 60 PROPERTIES TIMEOUT 120)

# The same daemon on the emulated phone, where the kernel combines the identities.
add_executable(test-server-emu ${CMAKE_CURRENT_LIST_DIR}/test-server-emu.cpp)
target_link_libraries(test-server-emu PRIVATE test_support GTest::gtest_main)
add_dependencies(test-server-emu qor-server qor-devsim qor-send)
gtest_discover_tests(test-server-emu DISCOVERY_TIMEOUT 60 PROPERTIES TIMEOUT 120)
# The daemon's three threads meet at its signals: the TSan stage runs these.
gtest_discover_tests(test-server-emu DISCOVERY_TIMEOUT 60 TEST_FILTER "ServerSignals.*" TEST_PREFIX "tsan."
  PROPERTIES TIMEOUT 120 LABELS tsan)
