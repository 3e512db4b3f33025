list(APPEND HOXCM_SOURCES
  src/operations/extraction.cc
)
