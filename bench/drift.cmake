# The drift engine's benchmarks: walk against parse, wide keys, memory.
add_library(hoxcm_bench_docs STATIC ${CMAKE_CURRENT_LIST_DIR}/doc_generator.cc)
target_link_libraries(hoxcm_bench_docs PUBLIC hoxcm)
target_include_directories(hoxcm_bench_docs PUBLIC ${CMAKE_CURRENT_LIST_DIR})
target_compile_definitions(hoxcm_bench_docs PRIVATE HOXCM_SOURCE_DIR="${CMAKE_SOURCE_DIR}")

add_executable(drift_bench ${CMAKE_CURRENT_LIST_DIR}/drift_bench.cc)
target_link_libraries(drift_bench PRIVATE hoxcm_bench_docs benchmark::benchmark)

add_executable(drift_memory ${CMAKE_CURRENT_LIST_DIR}/drift_memory.cc)
target_link_libraries(drift_memory PRIVATE hoxcm_bench_docs)
