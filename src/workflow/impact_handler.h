// The impact handler: a drift visitor that derives, from the schema of every
// changed object and property, whether applying a document needs a reboot or
// maintenance mode, and groups the changed objects per owning impact plugin
// for Impact (impact.h) to ask. docs/impact.md gives the rules.
//
// Ownership: the handler owns its registry and the inputs it builds; the
// reasons it collects (when asked to) are moved out with TakeReasons.
// One handler serves one walk; it is not thread-safe.
#pragma once

#include <memory>
#include <string>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include <hoxcm/drift.h>
#include <hoxcm/operations.h>
#include <hoxcm/plugins.h>

#include "foundation/compare/value_compare.h"

namespace HoxConfigManager {

// True when `desired` matches the trigger list `triggers` of a property whose
// schema type is `type`: an empty list matches anything; "integer" (and
// "long") compare as signed 64-bit integers, "number" (and "double") as
// doubles, "boolean" and "string" exactly; a desired value of another kind,
// or another type, does not match. A list that is not an array, or whose
// elements are not of the type, is malformed: ConfigStoreException 2000.
bool ValueInImpactList(const Value& desired, const Value& triggers, const Value& type);

class ImpactHandler final : public DriftHandler {
 public:
  // Loads the impact plugins of the current root (what PluginManager
  // throws). With `collectReasons` the handler also keeps why each object
  // needs what it needs.
  explicit ImpactHandler(bool collectReasons = false);

  void Add(const Value& desired, const HoxConfigStore::ConfigStoreObjectId& id,
           const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path) override;
  void Set(const Value& desired, const Value& current, const HoxConfigStore::ConfigStoreObjectId& id,
           const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path,
           const Value& drift) override;
  void Delete(const Value& value, const HoxConfigStore::ConfigStoreObjectId& id,
              const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path) override;
  void PropertyDrift(const Value& desired, const Value& current, const Value& schemaNode, const std::string& path,
                     ACTION action) override;

  // Property level: marks the pending flags when a scalar below `value`
  // matches its schema's "SET" trigger list.
  void ComputePropImpact(const Value& value, const Value& schemaNode, const std::string& path);
  // Object level: the key's operation lists, refined by the pending flags for
  // a SET of a key that declares property triggers. Clears the pending flags.
  void ComputeObjImpact(ACTION action, const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema,
                        const std::string& path);
  // Records the object for the first impact plugin that owns it.
  void UpdatePluginMap(const HoxConfigStore::ConfigStoreObjectId& id, const Value& desired,
                       const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, ACTION action,
                       const Value& drift);

  bool GetCompliant() const { return compliant_; }
  bool GetRebootRequired() const { return rebootRequired_; }
  bool GetMaintenanceModeRequired() const { return maintenanceModeRequired_; }
  std::unordered_set<ImpactInfo, ImpactInfoHash> GetImpactInfo() const { return impactInfo_; }
  std::unordered_map<std::string, TaskMap> GetPluginMap() const { return pluginMap_; }
  // The plugins of the map in the order their first object was met.
  const std::vector<std::string>& GetPluginOrder() const { return pluginOrder_; }
  const std::unordered_map<std::string, TaskMap>& PluginMap() const { return pluginMap_; }
  // The schema reasons collected so far (empty unless collecting).
  ImpactReasons TakeReasons() { return std::move(reasons_); }

 private:
  // A changed value of the object being analysed, kept while collecting.
  struct Change {
    std::string path;
    std::string oldValue, newValue;
    bool drift = false;  // reported by the walk (not only found below an added value)
    bool rebootTrigger = false;
    bool maintenanceTrigger = false;
  };

  void PropImpact(const Value& value, const Value* current, const Value& schemaNode, const std::string& path);
  void Record(const char* infoId, ACTION action, const HoxConfigStore::ConfigStoreObjectId& id,
              const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path,
              const Value& object, const Value* before, const Value* after, const Value& drift);
  // Keeps why the object just analysed needs what it needs; `before` and
  // `after` are its host and desired values (null when absent).
  void KeepReasons(ACTION action, const HoxConfigStore::ConfigStoreObjectId& id,
                   const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path,
                   const Value* before, const Value* after);

  bool compliant_ = true;
  bool rebootRequired_ = false;
  bool maintenanceModeRequired_ = false;
  bool propertyRebootRequired_ = false;
  bool propertyMaintenanceModeRequired_ = false;
  std::unordered_set<ImpactInfo, ImpactInfoHash> impactInfo_;
  PluginManager registry_;
  std::unordered_map<std::string, TaskMap> pluginMap_;
  std::vector<std::string> pluginOrder_;
  compare::ValueComparer schemas_;  // finds the schema of a member as the walk does

  // What the last object analysis decided, for the reasons.
  struct ObjectVerdict {
    bool reboot = false, maintenance = false;
    bool byProperties = false;  // a SET decided by property triggers
  } verdict_;
  const bool collect_;
  std::vector<Change> changes_;  // of the object being analysed
  ImpactReasons reasons_;
};

}  // namespace HoxConfigManager
