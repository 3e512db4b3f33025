# The file module: bounded reads, atomic writes, sorted listings.
list(APPEND HOXCM_SOURCES
  src/platform/files/document_files.cc
  src/platform/files/files.cc
)
