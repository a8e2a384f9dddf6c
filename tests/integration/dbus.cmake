# The thermal service on the emulated phone: qor-server, qor-devsim and a private bus; the broadcast
# and display-call helpers are driven in-process against the same bus.
add_executable(test-dbus ${CMAKE_CURRENT_LIST_DIR}/test-dbus.cpp)
target_link_libraries(test-dbus PRIVATE qor_vorn_dbus qor_platform test_support GTest::gtest_main)
target_compile_definitions(test-dbus PRIVATE
  QOR_PRIVATE_BUS_CONF="${PROJECT_SOURCE_DIR}/data/dbus/private-bus.conf")
add_dependencies(test-dbus qor-server qor-devsim)
gtest_discover_tests(test-dbus DISCOVERY_TIMEOUT 60 PROPERTIES TIMEOUT 120)
