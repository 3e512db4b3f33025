# Process-wide services shared by everything.
list(APPEND HOXCM_SOURCES
  src/platform/failpoint.cc
  src/platform/logger.cc
  src/platform/journal.cc
  src/platform/system_log.cc
  src/platform/paths.cc
)
# Each area of the platform keeps its own list.
include(${CMAKE_CURRENT_LIST_DIR}/files/sources.cmake OPTIONAL)
include(${CMAKE_CURRENT_LIST_DIR}/store/sources.cmake OPTIONAL)
include(${CMAKE_CURRENT_LIST_DIR}/host/sources.cmake OPTIONAL)
include(${CMAKE_CURRENT_LIST_DIR}/schema/sources.cmake OPTIONAL)
include(${CMAKE_CURRENT_LIST_DIR}/process/sources.cmake OPTIONAL)
