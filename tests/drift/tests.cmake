hoxcm_add_test(drift_test
  drift/compare_test.cc
  drift/drift_walk_test.cc
  drift/handlers_test.cc
  drift/sensitivity_test.cc
  drift/store_test.cc
  ${CMAKE_SOURCE_DIR}/bench/doc_generator.cc)
target_include_directories(drift_test PRIVATE ${CMAKE_SOURCE_DIR}/bench)
# The generator finds the sample schemas in the source tree; only it sees
# that path.
set_property(SOURCE ${CMAKE_SOURCE_DIR}/bench/doc_generator.cc APPEND PROPERTY COMPILE_DEFINITIONS
  HOXCM_SOURCE_DIR="${CMAKE_SOURCE_DIR}")
