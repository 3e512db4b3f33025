# Manifests, registry and order, requests, runs, manifest schema checking.
list(APPEND HOXCM_SOURCES
  src/plugins/abort_watcher.cc
  src/plugins/plugin.cc
  src/plugins/plugin_launcher.cc
  src/plugins/plugin_manager.cc
  src/plugins/plugin_request.cc
  src/plugins/plugin_runner.cc
  src/plugins/plugin_schemas.cc
  src/plugins/result_readers.cc
)
