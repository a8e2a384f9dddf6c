# Thermal side: records and sensors, device layer, diagnostics writers, status and gate logging,
# and the core; the real alarm, settings and build services on a temporary root, fakes for the
# log and the D-Bus module.
add_executable(test-vorn
  ${CMAKE_CURRENT_LIST_DIR}/test-vorn-root.cpp
  ${CMAKE_CURRENT_LIST_DIR}/test-vorn-sensor.cpp
  ${CMAKE_CURRENT_LIST_DIR}/test-vorn-device.cpp
  ${CMAKE_CURRENT_LIST_DIR}/test-vorn-util.cpp
  ${CMAKE_CURRENT_LIST_DIR}/test-vorn-status.cpp
  ${CMAKE_CURRENT_LIST_DIR}/test-vorn-core.cpp
  ${CMAKE_CURRENT_LIST_DIR}/test-vorn-cooldown.cpp
  ${CMAKE_CURRENT_LIST_DIR}/test-vorn-tuning.cpp
)
target_link_libraries(test-vorn PRIVATE qor_vorn qor_tollmgr qor_setstore qor_bldcfg fake_jotlog fake_vorn_dbus
  test_support GTest::gtest_main)
gtest_discover_tests(test-vorn DISCOVERY_TIMEOUT 60)
