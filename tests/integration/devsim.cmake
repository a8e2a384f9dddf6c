# devsim tests: the node model and journal alone, then qor-devsim as a process on real mounts.
add_executable(test-devsim-unit
  ${PROJECT_SOURCE_DIR}/tests/unit/test-devsim-nodes.cpp
  ${PROJECT_SOURCE_DIR}/tests/unit/test-devsim-journal.cpp
)
target_link_libraries(test-devsim-unit PRIVATE qor_devsim_core GTest::gtest_main)
gtest_discover_tests(test-devsim-unit DISCOVERY_TIMEOUT 60)

add_executable(test-devsim ${CMAKE_CURRENT_LIST_DIR}/test-devsim.cpp)
target_link_libraries(test-devsim PRIVATE test_support GTest::gtest_main)
target_compile_definitions(test-devsim PRIVATE
  QOR_PRIVATE_BUS_CONF="${PROJECT_SOURCE_DIR}/data/dbus/private-bus.conf")
add_dependencies(test-devsim qor-devsim)
gtest_discover_tests(test-devsim DISCOVERY_TIMEOUT 60 TEST_FILTER "-*Concurrent*")
# The concurrent-writers case is also meant for the ThreadSanitizer run.
gtest_discover_tests(test-devsim DISCOVERY_TIMEOUT 60 TEST_FILTER "*Concurrent*" TEST_PREFIX "tsan."
  PROPERTIES LABELS tsan)
