list(APPEND HOXCM_SOURCES
  src/foundation/errors.cc
  src/foundation/documents.cc
  src/foundation/host_documents.cc
  src/foundation/json_parse.cc
  src/foundation/task.cc
)
