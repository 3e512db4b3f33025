# Whole processes on generated hosts: the generator of the files and the
# parse-only baseline that bench/e2e_ratios.sh times against hoxcfg.
add_executable(host_generate ${CMAKE_CURRENT_LIST_DIR}/host_generate.cc)
target_link_libraries(host_generate PRIVATE hoxcm_bench_docs)

add_executable(parse_documents ${CMAKE_CURRENT_LIST_DIR}/parse_documents.cc)
target_link_libraries(parse_documents PRIVATE hoxcm)

add_executable(compliance_phases ${CMAKE_CURRENT_LIST_DIR}/compliance_phases.cc)
target_link_libraries(compliance_phases PRIVATE hoxcm)
