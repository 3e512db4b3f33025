list(APPEND HOXCM_SOURCES
  src/drift/drift_handler.cc
  src/drift/stubs.cc
)
