hoxcm_add_test(schema_test
  schema/schema_store_test.cc
  schema/validator_test.cc
  schema/test_suite_test.cc)
