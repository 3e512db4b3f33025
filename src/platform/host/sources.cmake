list(APPEND HOXCM_SOURCES
  src/platform/host/host_documents.cc
  src/platform/host/host_facts.cc
  src/platform/host/ssh_sync.cc
)
