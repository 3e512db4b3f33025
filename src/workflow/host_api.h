// The single-item host API's shared pieces, and its operations with the
// plugin runner as a parameter: the production overloads in
// <hoxcm/host_api.h> run plugins through a LaunchingRunner on the host run
// lock they take; tests pass a FakePluginRunner. Both take the lock, as
// Apply does.
//
// Thread safety: as the operations; nothing here holds state.
#pragma once

#include <memory>
#include <string>

#include <hoxcm/config_store.h>
#include <hoxcm/host_api.h>
#include <hoxcm/schema_store.h>

#include "plugins/plugin_runner.h"

namespace HoxConfigManager {

// One item as the host API addresses it, with its key's schema.
struct HostItem {
  std::string component;
  std::string group;
  std::string key;
  std::shared_ptr<HoxSchemaStore::SchemaObject> schema;

  // "/component/group/key"
  std::string Path() const;
  HoxConfigStore::ConfigStoreObjectId Id() const { return {component, group, key}; }
};

// The item with its schema: ConfigManagerException 2180 without a schema
// store, InvalidArgumentException 2021 (naming "component:group:key")
// without a schema for the key.
HostItem ResolveItem(const std::string& component, const std::string& group, const std::string& key);

// ConfigManagerException 2181 when the item is not user configuration on
// this host: its rows are never extracted, so a value set through the API
// would never be seen by compliance, export or the next change.
void RequireUserConfiguration(const HostItem& item);

// The store's connection; any failure to open it is ConfigManagerException
// 2001, with the store's own reason as the location's reason.
std::shared_ptr<HoxConfigStore::DBStore> OpenStore();

// The host's current configuration of the item as the drift walk sees it
// (the key's user configuration rows, processed as ExtractCurrentConfiguration
// processes them, after the SSH synchronisation): {component: {group: {key:
// item}}}, or {} when the host has none.
Document CurrentDocumentOf(const HostItem& item, const std::shared_ptr<HoxConfigStore::DBStore>& db);

// Throws ConfigManagerException 2084 carrying `error` (see PluginErrorOf).
[[noreturn]] void ThrowPluginError(const ErrorInfo& error);

// The operations with their plugins run by `runner`.
ImpactResult CheckImpact(Document& desiredDocument, const Document& currentDocument,
                         std::shared_ptr<TaskHandle> taskHandle, ImpactReasons* reasons, PluginRunner& runner);
ApplyResult SetConfig(const Document& currentDocument, Document& desiredDocument, const Document& stagedValue,
                           const ImpactResult& impactResult, const std::string& component, const std::string& group,
                           const std::string& key, std::shared_ptr<TaskHandle> taskHandle, PluginRunner& runner);
ApplyResult DeleteConfig(const std::string& component, const std::string& group, const std::string& key,
                              std::shared_ptr<TaskHandle> taskHandle, PluginRunner& runner);

}  // namespace HoxConfigManager
