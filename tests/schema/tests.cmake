hoxcm_add_test(schema_test
  schema/schema_store_test.cc
  schema/validator_test.cc
  schema/host_document_validation_test.cc
  schema/references_test.cc
  schema/test_suite_test.cc)

# Runs the built hoxcfg as a process.
hoxcm_add_test(hoxcfg_schema_test
  schema/hoxcfg_schema_test.cc)
if(TARGET hoxcfg)
  add_dependencies(hoxcfg_schema_test hoxcfg)
endif()
