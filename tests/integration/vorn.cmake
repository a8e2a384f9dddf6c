# The thermal thread of the real daemon on the emulated phone (tools/qor-emu).
add_executable(test-vorn-phone ${CMAKE_CURRENT_SOURCE_DIR}/test-vorn.cpp)
target_link_libraries(test-vorn-phone PRIVATE test_support GTest::gtest_main)
add_dependencies(test-vorn-phone qor-server qor-devsim qor-send)
gtest_discover_tests(test-vorn-phone DISCOVERY_TIMEOUT 60 PROPERTIES TIMEOUT 120)
