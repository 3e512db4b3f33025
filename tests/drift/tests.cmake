hoxcm_add_test(drift_test
  drift/compare_test.cc
  drift/drift_walk_test.cc)
