list(APPEND HOXCM_SOURCES
  src/platform/store/config_store_document.cc
  src/platform/store/stubs.cc
)
