# Scenario request throughput and latency against a bare socket loop.
add_executable(bench-request ${CMAKE_CURRENT_LIST_DIR}/bench-request.cpp)
target_compile_definitions(bench-request PRIVATE QOR_BUILD_DIR="${CMAKE_BINARY_DIR}")
target_link_libraries(bench-request PRIVATE Threads::Threads)
add_dependencies(bench-request qor-server)
