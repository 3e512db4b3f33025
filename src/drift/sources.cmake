list(APPEND HOXCM_SOURCES
  src/drift/drift_handler.cc
  src/drift/drift_walk.cc
  src/drift/reported_schema.cc
  src/drift/apply_tasks.cc
  src/drift/compliance.cc
)
