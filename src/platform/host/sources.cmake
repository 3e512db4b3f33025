list(APPEND HOXCM_SOURCES
  src/platform/host/stubs.cc
)
