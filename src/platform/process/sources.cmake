# Runner processes, the host run lock, request files and result readers.
list(APPEND HOXCM_SOURCES
  src/platform/process/process.cc
  src/platform/process/result_readers.cc
)
