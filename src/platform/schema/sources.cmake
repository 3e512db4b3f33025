# The schema store, the host document schema and the JSON validator.
list(APPEND HOXCM_SOURCES
  src/platform/schema/host_document_schema.cc
  src/platform/schema/patterns.cc
  src/platform/schema/schema_file.cc
  src/platform/schema/schema_store.cc
  src/platform/schema/validator.cc
  src/platform/schema/validator_errors.cc
)
