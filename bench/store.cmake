# Configuration store: bulk import, contents read against a bare SELECT, and
# the latency of one committed change.
add_executable(store_bench store_bench.cc)
target_link_libraries(store_bench PRIVATE hoxcm_internal benchmark::benchmark)
