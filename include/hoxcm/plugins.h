// The plugin framework: manifests of installed plugins (Plugin), the registry
// with the dependency order of apply operations (PluginManager), the request
// document sent to a runner (PluginRequest), the runner process of one run
// (PluginLauncher), the records a run returns, and the checking of manifests
// against the versioned manifest schemas.
//
// Ownership: plugins are immutable after construction and shared through
// std::shared_ptr between the registry and the runs that use them. A
// PluginManager lives for one operation. Request and result records are
// plain values.
//
// Thread safety: a constructed Plugin may be queried from any thread. A
// loaded PluginManager may be read concurrently, except that Find inserts
// into its table when a registered path is missing. Plugin runs on one host
// are serialised by a host-wide lock (see docs/plugin-protocol.md); a run
// blocks its caller until the runner process has been reaped.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include <hoxcm/config_store.h>
#include <hoxcm/drift.h>
#include <hoxcm/errors.h>
#include <hoxcm/export.h>
#include <hoxcm/json.h>
#include <hoxcm/task.h>

namespace HoxConfigManager {

// The kinds of run the system asks of a plugin.
enum PluginType : int { APPLY = 0, APPLY_BOOT = 1, IMPACT = 2, VALIDATE = 3 };

// One apply operation of a plugin: its name, the name it makes available to
// others and the names that must be available before it runs.
struct HOXCM_API PluginApplyOperation {
  std::string operation;
  std::string provides;
  std::vector<std::string> depends;
};

// The manifest version: 1 when `manifest` is not an object, has no
// "version", or its "version" is not a signed 64-bit integer.
HOXCM_API long GetPluginVersion(const Value& manifest);

// One verdict of an impact plugin. `impact` uses the IMPACT_TYPE numbering
// (0 none, 1 maintenance mode, 2 reboot); the strings are only logged.
struct HOXCM_API ImpactPluginInfo {
  int32_t impact = 0;
  std::string component;
  std::string group;
  std::string key;
  std::string reason;
};

// What an impact run returns: the verdicts, or an error (non-empty id).
struct HOXCM_API ImpactPluginResult {
  std::vector<ImpactPluginInfo> impacts;
  ErrorInfo error;
  // Reads a result file (docs/plugin-protocol.md). Throws
  // std::runtime_error when the file cannot be read and
  // ConfigStoreException(2000, "Invalid JSON") when it is malformed.
  static ImpactPluginResult Load(const std::string& path);
};

// What a validation run returns: findings per field, or an error (non-empty
// id and message).
struct HOXCM_API ValidationPluginResult {
  std::vector<ValidationErrorInfo> errors;
  ErrorInfo error;
  static ValidationPluginResult Load(const std::string& path);  // as ImpactPluginResult::Load
};

// One installed plugin, built from its manifest file. Immutable.
class HOXCM_API Plugin {
 public:
  // Parses and checks the manifest; throws on every failure.
  explicit Plugin(const char* path);
  Plugin(const Plugin&) = delete;
  Plugin& operator=(const Plugin&) = delete;

  long GetVersion() const { return version; }
  std::string GetId() const { return id; }
  const std::string& GetType() const { return type; }
  const std::string& GetModule() const { return module; }
  // The manifest's path as given to the constructor.
  const std::string& GetPath() const { return path_; }
  std::vector<HoxConfigStore::ConfigStoreObjectId> GetCSOIdList() const { return csoIds; }

  bool CheckType(PluginType t) const;
  bool HasApplySupport() const;
  bool HasApplyBootSupport() const;
  bool HasImpactSupport() const;
  bool HasValidateSupport() const;
  std::string GetApplyGroup() const;
  std::vector<PluginApplyOperation> GetOperations() const;
  void GetRemediateOperation(PluginApplyOperation& op) const;
  std::vector<HoxConfigStore::ConfigStoreObjectId> GetReferences() const;

  // Checks a manifest file against the manifest schema of its version;
  // throws ConfigManagerException(3000) with the reason.
  void validateFile(const char* path) const;

  // One run each; failures and aborts come back inside the result.
  ErrorInfo Apply(const std::vector<DesiredConfigInput>& inputs, const std::string& clusterContext,
                  std::shared_ptr<PluginMonitor> monitor) const;
  ImpactPluginResult Impact(const std::vector<DesiredConfigInput>& inputs, const std::string& clusterContext,
                            std::shared_ptr<PluginMonitor> monitor) const;
  ValidationPluginResult Validate(const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& data,
                                  const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& references,
                                  const std::string& clusterContext, std::shared_ptr<PluginMonitor> monitor) const;

 private:
  long version = 0;
  std::string type;
  std::string module;
  std::string id;
  Document manifest;
  std::vector<HoxConfigStore::ConfigStoreObjectId> csoIds;
  std::string path_;
};

// One plugin with the inputs destined for it, in order.
struct HOXCM_API TaskMap {
  std::shared_ptr<Plugin> plugin;
  std::vector<DesiredConfigInput> inputs;
};

// A fault in the apply order that the manifests declare: an apply group that
// does not exist, a "depends" name that nothing provides, or a cycle.
struct HOXCM_API ApplyOrderFault {
  std::string text;                    // what is wrong, naming the plugins by id and the names involved
  std::vector<std::string> manifests;  // the manifests of the plugins involved
};

// The faults that keep `plugins` (one registry's plugins, in path order) from
// having an apply order; empty when BuildDependencies can order them. Cycles
// are given with their names in order, each running after the next.
HOXCM_API std::vector<ApplyOrderFault> FindApplyOrderFaults(const std::vector<std::shared_ptr<Plugin>>& plugins);

// The same for the installed plugins of `type` (APPLY or APPLY_BOOT), without
// building a registry that would refuse them. Throws what reading a manifest
// throws.
HOXCM_API std::vector<ApplyOrderFault> CheckApplyOrder(PluginType type);

// The registry of installed plugins for one kind of run.
class HOXCM_API PluginManager {
 public:
  // Scans <root>/usr/lib/tarvik/configmanager/apply_modules/. Throws what
  // Load throws.
  explicit PluginManager(PluginType type);
  PluginManager(const PluginManager&) = delete;
  PluginManager& operator=(const PluginManager&) = delete;

  void Load(PluginType type);
  void ProcessJson(const char* path, PluginType type);
  std::vector<std::shared_ptr<Plugin>> Find(const HoxConfigStore::ConfigStoreObjectId& id);
  // "object key:manifest path", one per extension-table entry.
  std::vector<std::string> List();
  // In manifest path order.
  std::vector<std::shared_ptr<Plugin>> GetPlugins();
  std::vector<std::string> GetDependencies();
  void BuildDependencies();
  void ProcessOperation(const PluginApplyOperation& op, const std::string& group,
                        std::unordered_map<std::string, std::vector<std::string>>& table);

 private:
  std::string directory;
  std::unordered_map<std::string, std::shared_ptr<Plugin>> plugins;
  std::unordered_multimap<std::string, std::string> extensions;
  std::vector<std::string> dependencies;
};

// The request document of one run: the wire format between the library and
// the runners (docs/plugin-protocol.md). Both sides use this class.
class HOXCM_API PluginRequest {
 public:
  // Empty request (for Load).
  PluginRequest();
  // Validation form: "data" and "references" from store objects.
  PluginRequest(const std::string& id, const std::string& operation, const std::string& module, int version,
                const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& data,
                const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& references);
  // Apply and impact form.
  PluginRequest(const std::string& id, const std::string& operation, const std::string& module, int version,
                const std::vector<DesiredConfigInput>& inputs);

  void PopulateMetadata(const std::string& id, const std::string& operation, const std::string& module,
                        int version, Allocator& allocator);
  void PopulateCSOId(Value& element, const std::shared_ptr<HoxConfigStore::ConfigStoreObject>& object,
                     Allocator& allocator);
  void PopulateCSOList(const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& objects,
                       const std::string& name, Allocator& allocator);
  void PopulateTaskId(const std::string& taskId, Allocator& allocator);
  void PopulateClusterContext(const std::string& context, Allocator& allocator);

  // Adds "taskId" and "clusterContext" and writes the compact document to
  // `path`: mode 0600, written beside it and renamed into place, so that no
  // reader ever sees half a request.
  void Dump(const std::string& path, const std::string& taskId, const std::string& clusterContext);
  void Load(const std::string& path);

  int GetVersion() const;
  std::string GetType() const;
  std::string GetModule() const;
  std::string GetId() const;
  std::string GetTaskId() const;
  std::string GetClusterContext() const;

  // One element of "data" as a runner reads it. For the validation form
  // `operation`, `drift` are empty and `config` is the compact JSON text of
  // the value.
  struct DataItem {
    std::string operation;
    HoxConfigStore::ConfigStoreObjectId id;
    std::string config;
    std::string drift;
    bool hasDrift = false;
  };
  std::vector<DataItem> GetData() const;
  std::vector<HoxConfigStore::ConfigStoreObjectId> GetReferences() const;

  const Document& GetDocument() const { return document_; }

 private:
  Document document_;
};

// Starts, watches and reaps the runner process of one run.
class HOXCM_API PluginLauncher {
 public:
  PluginLauncher(const std::string& id, int version, const std::string& operation,
                 const std::vector<DesiredConfigInput>& inputs, const std::string& type, std::string module);
  // Apply and impact form whose caller writes the request itself
  // (WriteInputsRequest in the library), so that no request document is
  // built: GetRequest() is then empty.
  PluginLauncher(const std::string& id, int version, const std::string& operation, const std::string& type,
                 std::string module);
  // Validation form: the request is built from store objects.
  PluginLauncher(const std::string& id, int version,
                 const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& data,
                 const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& references,
                 const std::string& type, std::string module);
  ~PluginLauncher();
  PluginLauncher(const PluginLauncher&) = delete;
  PluginLauncher& operator=(const PluginLauncher&) = delete;

  PluginRequest& GetRequest() { return request; }
  // Throws ConfigManagerException(3000) on spawn failure, abort, non-zero
  // exit or death by signal.
  void ForkPlugin(std::shared_ptr<PluginMonitor> monitor);

 private:
  PluginRequest request;
  std::string id;
  std::string operation;
  std::string type;
  int version;
  std::chrono::steady_clock::time_point start_;
};

// Takes the host run lock that every apply, boot-time run and single-item
// change holds from its checks to its last plugin run, for a caller that
// replaces what they read (hoxcfg init --reset). Blocks until the lock is
// free, calling `waiting` once if another holder has it first; held until
// the returned handle is released. Throws std::system_error when the lock
// file cannot be opened or locked.
HOXCM_API std::shared_ptr<void> HoldHostRunLock(const std::function<void()>& waiting);

// Fixed paths of the plugin framework, resolved under the root.
HOXCM_API std::string PluginDirectory();        // ".../apply_modules/"
HOXCM_API std::string PluginSchemaDirectory();  // ".../plugin_schemas/"
HOXCM_API std::string PluginRequestPath();
HOXCM_API std::string PluginResultPath();

// Manifest schema checking.
HOXCM_API long CreatePluginSchemaFromFile(const std::string& path, Document& schema, std::string& error);
HOXCM_API std::unordered_map<long, Document> CreatePluginSchemas(std::string_view directory, std::string& error);
// Checks every ".json" file below `pluginDirectory`; `report` becomes an
// array of {"file", "validation_errors"} entries (empty when all pass).
HOXCM_API void ValidateAllPlugins(std::string_view pluginDirectory, std::string_view schemaDirectory,
                                  Document& report);
HOXCM_API void AddValidationError(Document& report, std::string_view file, Value& errors);

}  // namespace HoxConfigManager
