# The emulator launcher (tools/qor-emu) and the bus policy shipped for the real system bus.
add_executable(test-emu ${CMAKE_CURRENT_SOURCE_DIR}/test-emu.cpp)
target_link_libraries(test-emu PRIVATE test_support GTest::gtest_main)
target_compile_definitions(test-emu PRIVATE QOR_SOURCE_DIR="${PROJECT_SOURCE_DIR}")
add_dependencies(test-emu qor-server qor-devsim setstore qor-send)
gtest_discover_tests(test-emu DISCOVERY_TIMEOUT 60 PROPERTIES TIMEOUT 120)

add_executable(test-bus-policy ${CMAKE_CURRENT_SOURCE_DIR}/test-bus-policy.cpp)
target_link_libraries(test-bus-policy PRIVATE test_support PkgConfig::DBUS GTest::gtest_main)
target_compile_definitions(test-bus-policy PRIVATE QOR_SOURCE_DIR="${PROJECT_SOURCE_DIR}")
gtest_discover_tests(test-bus-policy DISCOVERY_TIMEOUT 60)
