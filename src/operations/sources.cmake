list(APPEND HOXCM_SOURCES
  src/operations/extraction.cc
  src/operations/map_list.cc
  src/operations/ssh_sync.cc
)
