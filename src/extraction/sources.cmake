# Host documents built from the configuration store.
list(APPEND HOXCM_SOURCES
  src/extraction/documents_from_rows.cc
  src/extraction/extraction.cc
  src/extraction/map_list.cc
  src/extraction/ssh_sync.cc
)
