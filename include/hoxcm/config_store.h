// The configuration store: an SQLite database under the host root
// (<root>/var/lib/tarvik/configstore/configstore.db) holding the user, default,
// desired and SmartNIC configuration of the host, the global namespace
// objects, boot mode, the boot-apply record, boot-time restore failures,
// the maintenance-mode state and the apply history. docs/platform.md describes tables and semantics.
//
// Thread safety: a DBStore connection serialises its own use with a mutex, so
// it may be shared between threads. Every writer is atomic: it runs in its own
// transaction, or inside the open ConfigStoreTransaction of its connection.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <hoxcm/config_document.h>
#include <hoxcm/export.h>
#include <hoxcm/json.h>

namespace HoxSchemaStore {
class SchemaObject;
}

namespace HoxConfigStore {
namespace detail {
class Transaction;
}

// Identity of one configuration object; `instanceId` is empty for a
// singleton.
struct HOXCM_API ConfigStoreObjectId {
  std::string component;
  std::string group;
  std::string key;
  std::string instanceId;

  ConfigStoreObjectId() = default;
  ConfigStoreObjectId(std::string component, std::string group, std::string key,
                      std::string instanceId = {});
  // "comp C grp G key K", followed by " id I" when the instance id is set.
  std::string toString() const;
  bool operator==(const ConfigStoreObjectId& o) const {
    return component == o.component && group == o.group && key == o.key && instanceId == o.instanceId;
  }
  bool operator!=(const ConfigStoreObjectId& o) const { return !(*this == o); }
};

// One row of configuration contents, by the column names below.
using ConfigMap = std::map<std::string, std::string>;
namespace RowColumn {
inline constexpr char kComponent[] = "Component";
inline constexpr char kGroup[] = "ConfigGroup";
inline constexpr char kKey[] = "Name";
inline constexpr char kIdentifier[] = "Identifier";  // empty for a singleton
inline constexpr char kValue[] = "Value";            // the item's JSON text
inline constexpr char kAutoConfValue[] = "AutoConfValue";  // only when set
}  // namespace RowColumn
using ConfigMapList = std::vector<std::shared_ptr<ConfigMap>>;

enum BOOTMODE : int {
  BOOTMODE_NORMAL = 0,           // host API changes allowed
  BOOTMODE_BOOTSTRAP = 1,
  BOOTMODE_DESIRED_STAGED = 4,   // staged desired configuration awaits a boot
};

// Which configuration a row set belongs to.
enum class ConfigKind : int { User = 0, Default = 1, Desired = 2, Smartnic = 3, DesiredSmartnic = 4 };

// A connection to the store of the current root.
class HOXCM_API DBStore {
 public:
  virtual ~DBStore();
  DBStore() = default;
  DBStore(const DBStore&) = delete;
  DBStore& operator=(const DBStore&) = delete;
  // Path of the database file.
  virtual const std::string& GetPath() const = 0;
};

// The process's connection to the store of the current root (HOX_ROOT),
// opened on first use and shared afterwards. `storeType` 0 is the host store.
// With `create` a missing store is created. Throws ConfigStoreException when
// the store is corrupt, of a newer schema version, or cannot be opened.
HOXCM_API std::shared_ptr<DBStore> GetDBStore(int storeType = 0, bool create = true);

// Contents readers: one row per configuration object, ordered by component,
// group, key, then instance insertion order.
HOXCM_API ConfigMapList GetUserConfigContents(const std::shared_ptr<DBStore>& db);
HOXCM_API ConfigMapList GetDesiredUserConfigContents(const std::shared_ptr<DBStore>& db);
HOXCM_API ConfigMapList GetDefaultUserConfigContents(const std::shared_ptr<DBStore>& db);
HOXCM_API ConfigMapList GetSmartnicConfiguration(const std::shared_ptr<DBStore>& db);
HOXCM_API ConfigMapList GetDesiredSmartnicConfiguration(const std::shared_ptr<DBStore>& db);
// The rows of any configuration kind, in the same order.
HOXCM_API ConfigMapList GetConfigContents(const std::shared_ptr<DBStore>& db, ConfigKind kind);
// One row of configuration contents as ForEachConfigRow hands it over: the
// columns of a ConfigMap. The visitor gets the same object for every row.
struct HOXCM_API ConfigRow {
  std::string component;
  std::string group;
  std::string key;
  std::string identifier;
  std::string value;
  bool hasAutoConfValue = false;
  std::string autoConfValue;
};
// Visits the rows of `kind` one at a time, in the order of the contents
// lists, so that a large host's rows need not all be held at once. An
// exception of the visitor ends the visit and propagates.
HOXCM_API void ForEachConfigRow(const std::shared_ptr<DBStore>& db, ConfigKind kind,
                                const std::function<void(const ConfigRow&)>& visit);
// The rows of one key (the id's component, group and key) of `kind`.
HOXCM_API ConfigMapList GetConfigMapList(const std::shared_ptr<DBStore>& db, ConfigKind kind,
                                         const ConfigStoreObjectId& id);
// Default user configuration rows of one object (all instances of the key
// when the id has no instance).
HOXCM_API ConfigMapList GetDefaultUserConfigMapList(const ConfigStoreObjectId& id,
                                                    const std::shared_ptr<DBStore>& db);

// Replace the desired (staged) configuration by the items of a host document
// (components, groups, keys; a "profile" wrapper is unwrapped).
HOXCM_API void SetDesiredUserConfig(rapidjson::Document& document);
HOXCM_API void SetDesiredSmartnicConfiguration(rapidjson::Document& document);
// Replace the user (or default) configuration by the items of a host document.
HOXCM_API void ImportConfiguration(ConfigKind kind, const rapidjson::Value& document);

// One change of the user configuration, as a plugin run applies it.
struct HOXCM_API UserConfigChange {
  std::string action;  // "ADD", "SET" or "DELETE"
  ConfigStoreObjectId id;
  std::string value;   // JSON text of the object; unused for "DELETE"
};
// Applies all changes in one transaction: all or nothing.
HOXCM_API void ApplyUserConfigChanges(const std::vector<UserConfigChange>& changes);
// Sets (or, with an empty text, clears) the auto-configuration value (JSON
// object text, "AutoConfValue") of an existing row; no row, no change.
HOXCM_API void SetAutoConfValue(ConfigKind kind, const ConfigStoreObjectId& id, const std::string& autoConfValue);

HOXCM_API BOOTMODE GetBootMode();
HOXCM_API void SetBootMode(BOOTMODE mode);

// {"isBootComplete": bool, "bootApplyRecord": string}
HOXCM_API rapidjson::Document getBootApplyRecord();
HOXCM_API void setBootApplyRecord(const std::string& record);
HOXCM_API void SetBootComplete(bool complete);

struct HOXCM_API FailureRecord {
  std::string component;
  std::string group;
  std::string key;
};
HOXCM_API std::vector<FailureRecord> GetBootTimeRestoreFailures();
HOXCM_API void AddBootTimeRestoreFailure(const FailureRecord& failure);
HOXCM_API void ClearBootTimeRestoreFailures();

HOXCM_API bool GetMaintenanceMode();
HOXCM_API void SetMaintenanceMode(bool enabled);

// The apply history: one record (JSON text, written and read by the
// workflow) per apply or boot-time run, numbered by a sequence that only
// grows, even after the oldest records are dropped.
struct HOXCM_API ApplyHistoryRow {
  int64_t sequence = 0;
  std::string record;
};
// Appends `record` and drops the oldest rows beyond the `keep` newest (at
// least the new one is kept), in one transaction. Returns its sequence.
HOXCM_API int64_t AppendApplyHistoryRow(const std::string& record, std::size_t keep);
// Every row, oldest first.
HOXCM_API std::vector<ApplyHistoryRow> GetApplyHistoryRows();

// A fresh instance identifier for "cs_generated_id" keys (a random UUID).
HOXCM_API std::string GenerateInstanceId();

// Named string values attached to a store object id.
class HOXCM_API StoreObject {
 public:
  explicit StoreObject(ConfigStoreObjectId id);
  virtual ~StoreObject();
  const ConfigStoreObjectId& GetConfigStoreObjectId() const;
  // False (and `value` untouched) when the name has no value.
  bool GetValue(const std::string& name, std::string* value) const;
  void SetValue(const std::string& name, const std::string& value);
  const std::map<std::string, std::string>& GetValues() const;

 private:
  ConfigStoreObjectId id_;
  std::map<std::string, std::string> values_;
};

// A configuration object: its id and its JSON data (an owned copy).
class HOXCM_API ConfigStoreObject : public StoreObject {
 public:
  explicit ConfigStoreObject(ConfigStoreObjectId id);
  ConfigStoreObject(ConfigStoreObjectId id, const rapidjson::Value& data);
  const rapidjson::Value& GetData() const;
  // Compact JSON text of the data.
  std::string Serialize() const;

 private:
  std::shared_ptr<rapidjson::Document> data_;
};

// The drift record of a change: id, action name and an owned copy of the
// drift value.
class HOXCM_API DriftObject : public StoreObject {
 public:
  DriftObject(ConfigStoreObjectId id, std::string action, const rapidjson::Value& drift);
  const std::string& GetAction() const;
  const rapidjson::Value& GetDrift() const;
  std::string Serialize() const;

 private:
  std::string action_;
  std::shared_ptr<rapidjson::Document> drift_;
};

// Builds a configuration object from an id, a value and the key's schema.
HOXCM_API std::shared_ptr<ConfigStoreObject> CreateObject(
    const ConfigStoreObjectId& id, const rapidjson::Value& value,
    const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, std::optional<int64_t> version = std::nullopt);

extern HOXCM_API const char* const sGlobalNamespace;

// Objects of one namespace (the global namespace holds objects outside the
// host configuration, such as the preserved auto-deployment files).
class HOXCM_API ConfigStore {
 public:
  virtual ~ConfigStore();
  // Null when the store cannot be opened.
  static std::shared_ptr<ConfigStore> GetStore(const std::string& ns);
  // Null when absent.
  virtual std::shared_ptr<ConfigStoreObject> GetObject(const ConfigStoreObjectId& id) = 0;
  virtual void SetObject(const StoreObject& object) = 0;
  virtual void DeleteObject(const ConfigStoreObjectId& id) = 0;
  virtual std::shared_ptr<DBStore> GetDB() const = 0;
};

// A transaction over the process's connection: every store write made until
// Commit() (on this thread) belongs to it; destroyed uncommitted, it rolls
// back. Transactions do not nest. Other threads' store calls wait until it
// ends, so it must be committed or destroyed on the thread that began it.
class HOXCM_API ConfigStoreTransaction {
 public:
  explicit ConfigStoreTransaction(const std::shared_ptr<ConfigStore>& store);
  ~ConfigStoreTransaction();
  ConfigStoreTransaction(const ConfigStoreTransaction&) = delete;
  ConfigStoreTransaction& operator=(const ConfigStoreTransaction&) = delete;
  void Commit();

 private:
  std::unique_ptr<detail::Transaction> transaction_;
};

// Stages one desired object (an instance or a singleton value) of a key.
HOXCM_API void ProcessDesiredObject(rapidjson::MemoryPoolAllocator<>& allocator,
                                    const std::shared_ptr<DBStore>& db, const std::string& component,
                                    const std::string& group, const std::string& key,
                                    const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema,
                                    const rapidjson::Value& value);

// Removes the rows of `kind` of one key (of one instance when the id has
// one); a key without rows is left as it is.
HOXCM_API void DeleteConfigRows(const std::shared_ptr<DBStore>& db, ConfigKind kind, const ConfigStoreObjectId& id);

// The current / default configuration of one key: an object for a
// singleton, an array of instances for a multi-instance key; null when none.
HOXCM_API rapidjson::Document GetCurrentConfigInternal(const std::shared_ptr<DBStore>& db,
                                                       const std::string& component, const std::string& group,
                                                       const std::string& key);
HOXCM_API rapidjson::Document GetDefaultUserConfigInternal(const std::shared_ptr<DBStore>& db,
                                                           const std::string& component,
                                                           const std::string& group, const std::string& key);
HOXCM_API rapidjson::Document GetDefaultUserConfigInstancesInternal(const std::shared_ptr<DBStore>& db,
                                                                    const std::string& component,
                                                                    const std::string& group,
                                                                    const std::string& key);

}  // namespace HoxConfigStore
