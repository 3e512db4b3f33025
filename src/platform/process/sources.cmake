# Runner processes and the host run lock.
list(APPEND HOXCM_SOURCES
  src/platform/process/process.cc
)
