# D-Bus module of the thermal side against a private dbus-daemon; the thermal record comes from
# the test itself.
add_executable(test-vorn-dbus ${CMAKE_CURRENT_LIST_DIR}/test-vorn-dbus.cpp)
target_link_libraries(test-vorn-dbus PRIVATE qor_vorn_dbus fake_jotlog test_support GTest::gtest_main)
target_compile_definitions(test-vorn-dbus PRIVATE
  QOR_PRIVATE_BUS_CONF="${PROJECT_SOURCE_DIR}/data/dbus/private-bus.conf")
gtest_discover_tests(test-vorn-dbus DISCOVERY_TIMEOUT 60 PROPERTIES TIMEOUT 60)
