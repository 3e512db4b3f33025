hoxcm_add_test(foundation_test
  foundation/errors_test.cc
  foundation/documents_test.cc
  foundation/task_test.cc
  foundation/logger_test.cc)
