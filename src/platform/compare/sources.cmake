list(APPEND HOXCM_SOURCES
  src/platform/compare/stubs.cc
)
