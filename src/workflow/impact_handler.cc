#include "workflow/impact_handler.h"

#include <algorithm>
#include <cstdint>
#include <string_view>

#include <hoxcm/documents.h>
#include <hoxcm/host.h>

namespace HoxConfigManager {
namespace {

using HoxConfigStore::ConfigStoreDocument;
using compare::FindByName;
using compare::IsGeneratedId;
using compare::NameOf;

constexpr const char* kInfoAdd = "com.tarvik.settings.impact.info.add";
constexpr const char* kInfoSet = "com.tarvik.settings.impact.info.set";
constexpr const char* kInfoDelete = "com.tarvik.settings.impact.info.delete";

const Value& NullValue() {
  static const Value null;
  return null;
}

// The compact text of a value for a reason, sensitive members masked; ""
// for an absent value.
std::string Shown(const Value& schema, const Value* value) {
  if (value == nullptr || value->IsNull()) return {};
  return ConfigStoreDocument::RedactAndSerializeValue(schema, *value);
}

bool Lists(const std::vector<std::string>& operations, const char* action) {
  return std::find(operations.begin(), operations.end(), action) != operations.end();
}

// A singleton the host holds no configuration for: an absent value, an
// empty object, or the marker of a deleted default configuration.
bool Unconfigured(const Value& host) {
  return host.IsNull() || (host.IsObject() && host.ObjectEmpty()) || DocumentShape::IsDeleteDefault(host);
}

}  // namespace

bool ValueInImpactList(const Value& desired, const Value& triggers, const Value& type) {
  RAPIDJSON_ASSERT(triggers.IsArray());
  // Deliberately: an empty list means that any change triggers.
  if (triggers.Empty()) return true;
  RAPIDJSON_ASSERT(type.IsString());
  const std::string_view kind = NameOf(type);
  const bool detail = CSLogger::IsEnabled(CSLogger::kDetail);
  if (kind == "integer" || kind == "long") {
    if (!desired.IsInt64()) return false;
    const std::int64_t value = desired.GetInt64();
    if (detail) CSLogger::Log(CSLogger::kDetail, ">>> DesiredLong: %ld", static_cast<long>(value));
    for (const Value& t : triggers.GetArray()) {
      RAPIDJSON_ASSERT(t.IsInt64());
      if (detail) CSLogger::Log(CSLogger::kDetail, ">>> ImpactLong: %ld", static_cast<long>(t.GetInt64()));
      if (t.GetInt64() == value) return true;
    }
    return false;
  }
  if (kind == "number" || kind == "double") {
    // JSON does not tell 4096 from 4096.0: any number is a "number".
    if (!desired.IsNumber()) return false;
    const double value = desired.GetDouble();
    if (detail) CSLogger::Log(CSLogger::kDetail, ">>> DesiredDouble: %lf", value);
    for (const Value& t : triggers.GetArray()) {
      RAPIDJSON_ASSERT(t.IsNumber());
      if (detail) CSLogger::Log(CSLogger::kDetail, ">>> ImpactDouble: %lf", t.GetDouble());
      if (t.GetDouble() == value) return true;
    }
    return false;
  }
  if (kind == "boolean") {
    if (!desired.IsBool()) return false;
    if (detail) CSLogger::Log(CSLogger::kDetail, ">>> DesiredBool: %ld", desired.GetBool() ? 1L : 0L);
    for (const Value& t : triggers.GetArray()) {
      RAPIDJSON_ASSERT(t.IsBool());
      if (detail) CSLogger::Log(CSLogger::kDetail, ">>> ImpactBool: %ld", t.GetBool() ? 1L : 0L);
      if (t.GetBool() == desired.GetBool()) return true;
    }
    return false;
  }
  if (kind == "string") {
    if (!desired.IsString()) return false;
    if (detail) CSLogger::Log(CSLogger::kDetail, ">>> DesiredStr: %s", desired.GetString());
    for (const Value& t : triggers.GetArray()) {
      RAPIDJSON_ASSERT(t.IsString());
      if (detail) CSLogger::Log(CSLogger::kDetail, ">>> ImpactStr: %s", t.GetString());
      if (NameOf(t) == NameOf(desired)) return true;
    }
    return false;
  }
  return false;
}

ImpactHandler::ImpactHandler(bool collectReasons)
    : DriftHandler(true, true, false), registry_(IMPACT), collect_(collectReasons) {}

void ImpactHandler::Add(const Value& desired, const HoxConfigStore::ConfigStoreObjectId& id,
                        const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path) {
  Record(kInfoAdd, ADD, id, schema, path, desired, nullptr, &desired, NullValue());
}

void ImpactHandler::Delete(const Value& value, const HoxConfigStore::ConfigStoreObjectId& id,
                           const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path) {
  Record(kInfoDelete, DELETE, id, schema, path, value, &value, nullptr, NullValue());
}

void ImpactHandler::Set(const Value& desired, const Value& current, const HoxConfigStore::ConfigStoreObjectId& id,
                        const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path,
                        const Value& drift) {
  // Configuring a singleton the host has no configuration for adds it.
  const bool addition = !schema->IsMultiInstance() && Unconfigured(current);
  Record(addition ? kInfoAdd : kInfoSet, addition ? ADD : SET, id, schema, path, desired,
         addition ? nullptr : &current, &desired, drift);
}

void ImpactHandler::Record(const char* infoId, ACTION action, const HoxConfigStore::ConfigStoreObjectId& id,
                           const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path,
                           const Value& object, const Value* before, const Value* after, const Value& drift) {
  // The arguments are component, key, group: the order the statement's
  // message expects.
  impactInfo_.insert(ImpactInfo{infoId, {id.component, id.key, id.group}});
  ComputeObjImpact(action, schema, path);
  if (collect_) KeepReasons(action, id, schema, path, before, after);
  UpdatePluginMap(id, object, schema, action, drift);
}

void ImpactHandler::PropertyDrift(const Value& desired, const Value& current, const Value& schemaNode,
                                  const std::string& path, ACTION action) {
  compliant_ = false;
  if (collect_) {
    changes_.push_back({path, Shown(schemaNode, &current), Shown(schemaNode, &desired), true, false, false});
  }
  if (action == DELETE) return;
  PropImpact(desired, &current, schemaNode, path);
}

void ImpactHandler::ComputePropImpact(const Value& value, const Value& schemaNode, const std::string& path) {
  PropImpact(value, nullptr, schemaNode, path);
}

void ImpactHandler::PropImpact(const Value& value, const Value* current, const Value& schemaNode,
                               const std::string& path) {
  RAPIDJSON_ASSERT(schemaNode.IsObject());
  if (value.IsObject()) {
    for (auto it = value.MemberBegin(); it != value.MemberEnd(); ++it) {
      // The store's generated identity is never configuration.
      if (IsGeneratedId(it->name)) continue;
      const std::string_view name = NameOf(it->name);
      // A member no schema describes gets a schema of its value's type,
      // which declares no triggers (as in the walk).
      const Value& child = schemas_.Child(schemaNode, name, it->value);
      const Value* before = current != nullptr && current->IsObject() ? FindByName(*current, name) : nullptr;
      PropImpact(it->value, before, child, path + "/" + std::string(name));
    }
    return;
  }
  if (value.IsArray()) {
    // Only elements that are objects can hold triggers; arrays of scalars
    // are judged as a whole by the key's operation lists.
    const auto items = schemaNode.FindMember("items");
    if (items == schemaNode.MemberEnd() || !items->value.IsObject()) return;
    const auto type = items->value.FindMember("type");
    if (type == items->value.MemberEnd() || !type->value.IsString() || NameOf(type->value) != "object") return;
    for (rapidjson::SizeType i = 0; i < value.Size(); ++i) {
      PropImpact(value[i], nullptr, items->value, path + "/" + std::to_string(i));
    }
    return;
  }
  bool matched[2] = {false, false};
  const char* const keywords[2] = {"rebootRequired", "maintenanceModeRequired"};
  for (int k = 0; k < 2; ++k) {
    const auto rule = schemaNode.FindMember(keywords[k]);
    if (rule == schemaNode.MemberEnd()) continue;
    RAPIDJSON_ASSERT(rule->value.IsObject());
    const auto set = rule->value.FindMember("SET");
    RAPIDJSON_ASSERT(set != rule->value.MemberEnd());
    const auto type = schemaNode.FindMember("type");
    RAPIDJSON_ASSERT(type != schemaNode.MemberEnd() && type->value.IsString());
    matched[k] = ValueInImpactList(value, set->value, type->value);
  }
  if (matched[0]) {
    CSLogger::Log(CSLogger::kInfo, "RebootRequired for path: %s", path.c_str());
    propertyRebootRequired_ = true;
  }
  if (matched[1]) {
    CSLogger::Log(CSLogger::kInfo, "MaintenanceMode for path: %s", path.c_str());
    propertyMaintenanceModeRequired_ = true;
  }
  if (!collect_ || (!matched[0] && !matched[1])) return;
  // The change the walk reported, or a value found below an added one.
  if (changes_.empty() || changes_.back().path != path) {
    changes_.push_back({path, Shown(schemaNode, current), Shown(schemaNode, &value), false, false, false});
  }
  changes_.back().rebootTrigger |= matched[0];
  changes_.back().maintenanceTrigger |= matched[1];
}

void ImpactHandler::ComputeObjImpact(ACTION action, const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema,
                                     const std::string& path) {
  compliant_ = false;
  const char* name = ActionName(action);
  std::vector<std::string> operations;
  bool propReboot = false, propMaint = false;
  const bool opReboot = schema->GetRebootOperations(operations, propReboot) == 0 && Lists(operations, name);
  operations.clear();
  const bool opMaint = schema->GetMaintenanceModeOperations(operations, propMaint) == 0 && Lists(operations, name);
  verdict_ = ObjectVerdict();
  if (opReboot || opMaint) {
    if (action == SET && (propReboot || propMaint)) {
      // The key names the properties whose change counts: the operation
      // alone is not enough.
      verdict_.byProperties = true;
      if (propertyRebootRequired_ && opReboot) {
        rebootRequired_ = verdict_.reboot = true;
        CSLogger::Log(CSLogger::kInfo, "Impact: rebootRequired, Op: %s for path: %s", name, path.c_str());
      }
      if (propertyMaintenanceModeRequired_ && opMaint) {
        maintenanceModeRequired_ = verdict_.maintenance = true;
        CSLogger::Log(CSLogger::kInfo, "Impact: maintenanceModeRequired, Op: %s for path: %s", name, path.c_str());
      }
    } else {
      rebootRequired_ = rebootRequired_ || opReboot;
      maintenanceModeRequired_ = maintenanceModeRequired_ || opMaint;
      verdict_.reboot = opReboot;
      verdict_.maintenance = opMaint;
      CSLogger::Log(CSLogger::kInfo, "Impact: maintenanceModeRequired=%d, rebootRequired=%d Op: %s for path: %s",
                    opMaint ? 1 : 0, opReboot ? 1 : 0, name, path.c_str());
    }
  }
  // A property finding belongs to this object only.
  propertyRebootRequired_ = false;
  propertyMaintenanceModeRequired_ = false;
}

void ImpactHandler::KeepReasons(ACTION action, const HoxConfigStore::ConfigStoreObjectId& id,
                                const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path,
                                const Value* before, const Value* after) {
  std::vector<Change> changes;
  changes.swap(changes_);
  if (!verdict_.reboot && !verdict_.maintenance) return;
  ObjectImpact object;
  object.id = id;
  object.action = ActionName(action);
  object.impact = verdict_.reboot ? IMPACT_REBOOT_REQUIRED : IMPACT_MAINTENANCE_MODE_REQUIRED;
  const bool anyDrift = std::any_of(changes.begin(), changes.end(), [](const Change& c) { return c.drift; });
  for (const IMPACT_TYPE level : {IMPACT_REBOOT_REQUIRED, IMPACT_MAINTENANCE_MODE_REQUIRED}) {
    if (!(level == IMPACT_REBOOT_REQUIRED ? verdict_.reboot : verdict_.maintenance)) continue;
    auto add = [&](ImpactReason::Rule rule, const std::string& where, const std::string& before,
                   const std::string& after) {
      ImpactReason reason;
      reason.rule = rule;
      reason.impact = level;
      reason.path = where;
      reason.oldValue = before;
      reason.newValue = after;
      object.reasons.push_back(std::move(reason));
    };
    if (verdict_.byProperties) {
      for (const Change& c : changes) {
        if (level == IMPACT_REBOOT_REQUIRED ? c.rebootTrigger : c.maintenanceTrigger) {
          add(ImpactReason::Rule::kPropertyTrigger, c.path, c.oldValue, c.newValue);
        }
      }
    } else if (action == SET && anyDrift) {
      // The operation itself: every change that makes up the SET.
      for (const Change& c : changes) {
        if (c.drift) add(ImpactReason::Rule::kOperation, c.path, c.oldValue, c.newValue);
      }
    } else {
      const Value& node = schema->GetInstanceSchema();
      add(ImpactReason::Rule::kOperation, path, Shown(node, before), Shown(node, after));
    }
  }
  reasons_.objects.push_back(std::move(object));
}

void ImpactHandler::UpdatePluginMap(const HoxConfigStore::ConfigStoreObjectId& id, const Value& desired,
                                    const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, ACTION action,
                                    const Value& drift) {
  const std::vector<std::shared_ptr<Plugin>> owners = registry_.Find(id);
  if (owners.empty()) {
    if (CSLogger::IsEnabled(CSLogger::kError)) {
      CSLogger::Log(CSLogger::kError, "Plugin not present for %s", id.toString().c_str());
    }
    return;
  }
  // Only the first owner is asked.
  const std::shared_ptr<Plugin>& plugin = owners.front();
  if (CSLogger::IsEnabled(CSLogger::kInfo)) {
    CSLogger::Log(CSLogger::kInfo, "Found plugin=%s for cso=%s, version: %d", plugin->GetId().c_str(),
                  id.toString().c_str(), static_cast<int>(plugin->GetVersion()));
  }
  RAPIDJSON_ASSERT(drift.IsNull() || drift.IsObject());
  std::shared_ptr<HoxConfigStore::DriftObject> driftObject;
  if (drift.IsObject() && !drift.ObjectEmpty()) {
    driftObject = std::make_shared<HoxConfigStore::DriftObject>(id, ActionName(action), drift);
  }
  auto object = HoxConfigStore::CreateObject(id, desired, schema);
  auto [entry, inserted] = pluginMap_.try_emplace(plugin->GetId());
  if (inserted) {
    entry->second.plugin = plugin;
    pluginOrder_.push_back(plugin->GetId());
  }
  entry->second.inputs.push_back(DesiredConfigInput{std::move(object), std::move(driftObject), ActionName(action)});
}

}  // namespace HoxConfigManager
