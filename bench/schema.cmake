# Schema store loading and validation of the sample host.
add_executable(schema_bench schema_bench.cc)
target_link_libraries(schema_bench PRIVATE hoxcm_internal benchmark::benchmark)
target_compile_definitions(schema_bench PRIVATE HOXCM_SOURCE_DIR="${CMAKE_SOURCE_DIR}")
target_include_directories(schema_bench PRIVATE ${CMAKE_SOURCE_DIR}/src)
