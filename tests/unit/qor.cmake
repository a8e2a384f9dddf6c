# Request side: grammar, lock engine, application tracking, sysfs primitives.
add_executable(test-qor
  ${CMAKE_CURRENT_LIST_DIR}/qor_test_root.cpp
  ${CMAKE_CURRENT_LIST_DIR}/test-qor-server.cpp
  ${CMAKE_CURRENT_LIST_DIR}/test-qor-main.cpp
  ${CMAKE_CURRENT_LIST_DIR}/test-qor-appinfo.cpp
  ${CMAKE_CURRENT_LIST_DIR}/test-device-info.cpp
)
target_link_libraries(test-qor PRIVATE qor_core fake_jotlog test_support GTest::gtest_main)
gtest_discover_tests(test-qor DISCOVERY_TIMEOUT 60)

# Concurrency: meant for the ThreadSanitizer build.
add_executable(test-qor-race ${CMAKE_CURRENT_LIST_DIR}/qor_test_root.cpp ${CMAKE_CURRENT_LIST_DIR}/test-qor-race.cpp)
target_link_libraries(test-qor-race PRIVATE qor_core fake_jotlog test_support GTest::gtest_main)
gtest_discover_tests(test-qor-race DISCOVERY_TIMEOUT 60 PROPERTIES LABELS tsan)
