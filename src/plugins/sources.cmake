list(APPEND HOXCM_SOURCES src/plugins/stubs.cc)
