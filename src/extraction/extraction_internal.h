// Internal pieces of configuration extraction shared between its source
// files. Stateless and thread-safe.
#pragma once

#include <memory>
#include <set>
#include <string>

#include <hoxcm/config_store.h>
#include <hoxcm/extraction.h>
#include <hoxcm/schema_store.h>

namespace HoxConfigManager::detail {

// A column of a contents row; empty when the row lacks it.
inline const std::string& Column(const HoxConfigStore::ConfigMap& row, const char* name) {
  static const std::string kEmpty;
  auto it = row.find(name);
  return it == row.end() ? kEmpty : it->second;
}

// The quorlet object: its configuration is only extracted on hosts that are
// integrated with the desired-state platform.
const HoxSchemaStore::SchemaObjectId& QuorletObjectId();

// The objects left out of extraction because the host is not integrated with
// the desired-state platform: the quorlet object unless the host facts enable
// the feature switch "dspIntegrated", nothing otherwise.
std::set<HoxSchemaStore::SchemaObjectId> DspExcludedObjects();

// Turns configuration rows into the items of a host document, one row at a
// time, as ProcessConfigMapList does for a whole list: extractions feed it
// straight from the store, so that a large host's rows are never all held.
// Not thread-safe; `result` must outlive it.
class RowProcessor {
 public:
  // Throws 2180 when `schemaStore` is null.
  RowProcessor(Document& result, const std::shared_ptr<HoxSchemaStore::SchemaStore>& schemaStore, DocumentType type);
  RowProcessor(const RowProcessor&) = delete;
  RowProcessor& operator=(const RowProcessor&) = delete;
  ~RowProcessor();

  void Add(const HoxConfigStore::ConfigRow& row);
  void Add(const HoxConfigStore::ConfigMap& row);

  struct State;

 private:
  const std::shared_ptr<HoxSchemaStore::SchemaStore> schemaStore_;
  std::unique_ptr<State> state_;
};

// Copies the host's SSH configuration files into the store so that edits
// made outside the library are part of the user configuration. Never throws:
// every failure is logged and the extraction goes on.
void SyncSshConfiguration();

}  // namespace HoxConfigManager::detail
