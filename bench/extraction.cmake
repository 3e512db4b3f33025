# Extraction of a 100,000-item store against a bare SELECT of its rows.
add_executable(extraction_bench extraction_bench.cc)
target_link_libraries(extraction_bench PRIVATE hoxcm_internal benchmark::benchmark)
target_compile_definitions(extraction_bench PRIVATE HOXCM_SOURCE_DIR="${CMAKE_SOURCE_DIR}")
