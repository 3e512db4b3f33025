# One plugin run against a bare spawn of the same do-nothing runner, and the
# load of a 1,000-plugin manifest tree.
add_executable(hoxcm_noop_runner ${CMAKE_CURRENT_LIST_DIR}/noop_runner.cc)
add_executable(plugins_bench ${CMAKE_CURRENT_LIST_DIR}/plugins_bench.cc)
target_link_libraries(plugins_bench PRIVATE hoxcm benchmark::benchmark)
target_compile_definitions(plugins_bench PRIVATE
  HOXCM_SOURCE_DIR="${CMAKE_SOURCE_DIR}"
  HOXCM_NOOP_RUNNER="$<TARGET_FILE:hoxcm_noop_runner>")
add_dependencies(plugins_bench hoxcm_noop_runner)

# CheckApply and Apply of 10,000 changes over 10 do-nothing plugins, against
# the bare runner processes (bench/apply_ratios.sh).
add_executable(apply_bench ${CMAKE_CURRENT_LIST_DIR}/apply_bench.cc)
target_link_libraries(apply_bench PRIVATE hoxcm SQLite::SQLite3 benchmark::benchmark)
target_compile_definitions(apply_bench PRIVATE
  HOXCM_SOURCE_DIR="${CMAKE_SOURCE_DIR}"
  HOXCM_NOOP_RUNNER="$<TARGET_FILE:hoxcm_noop_runner>")
add_dependencies(apply_bench hoxcm_noop_runner)
