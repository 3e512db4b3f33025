list(APPEND HOXCM_SOURCES
  src/platform/schema/stubs.cc
)
