# Child processes and the host run lock.
list(APPEND HOXCM_SOURCES
  src/platform/process/child_process.cc
  src/platform/process/process.cc
)
