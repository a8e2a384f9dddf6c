# devsim benchmarks
add_executable(bench-devsim ${CMAKE_CURRENT_LIST_DIR}/bench-devsim.cpp)
target_compile_definitions(bench-devsim PRIVATE QOR_DEVSIM_PATH="$<TARGET_FILE:qor-devsim>")
add_dependencies(bench-devsim qor-devsim)
