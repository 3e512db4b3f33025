list(APPEND HOXCM_SOURCES
  src/platform/compare/value_compare.cc
  src/platform/compare/redact.cc
)
