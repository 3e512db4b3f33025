# Errors, the parser, task handles, pure document utilities and the value
# comparison: JSON and C++ only, nothing of the operating system.
list(APPEND HOXCM_SOURCES
  src/foundation/compare/redact.cc
  src/foundation/compare/schema_view.cc
  src/foundation/compare/value_compare.cc
  src/foundation/config_document.cc
  src/foundation/documents.cc
  src/foundation/errors.cc
  src/foundation/json_parse.cc
  src/foundation/pattern.cc
  src/foundation/schema_refs.cc
  src/foundation/strings.cc
  src/foundation/task.cc
)
