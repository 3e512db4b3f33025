list(APPEND HOXCM_SOURCES
  src/platform/store/contents.cc
  src/platform/store/database.cc
  src/platform/store/history.cc
  src/platform/store/host_state.cc
  src/platform/store/objects.cc
)
