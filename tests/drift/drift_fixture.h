// Helpers of the drift tests: a copy of a value, and a drift handler that
// records every call as one line of text (drift records aside).
#pragma once

#include <string>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/drift.h>

#include "support/json.h"
#include "support/temp_root.h"

namespace hoxcm_test {

using Calls = std::vector<std::string>;

inline HoxConfigManager::Document Copy(const HoxConfigManager::Value& value) {
  HoxConfigManager::Document out;
  out.CopyFrom(value, out.GetAllocator());
  return out;
}

class RecordingHandler final : public HoxConfigManager::DriftHandler {
  using Id = HoxConfigStore::ConfigStoreObjectId;
  using Schema = std::shared_ptr<HoxSchemaStore::SchemaObject>;
  using Value = HoxConfigManager::Value;

 public:
  RecordingHandler(bool consolidated = true, bool driftRecords = true, bool perProperty = false)
      : DriftHandler(consolidated, driftRecords, perProperty) {}

  void Add(const Value& desired, const Id& id, const Schema&, const std::string& path) override {
    calls.push_back("Add " + path + Text(id) + " " + Text(desired));
  }
  void Set(const Value& desired, const Value& current, const Id& id, const Schema&, const std::string& path,
           const Value&) override {
    calls.push_back("Set " + path + Text(id) + " " + Text(desired) + " " + Text(current));
  }
  void Delete(const Value& current, const Id& id, const Schema&, const std::string& path) override {
    calls.push_back("Delete " + path + Text(id) + " " + Text(current));
  }
  void PropertyDrift(const Value& desired, const Value& current, const Value&, const std::string& path,
                     HoxConfigManager::ACTION action) override {
    calls.push_back(std::string("Property ") + HoxConfigManager::ActionName(action) + " " + path + " " +
                    Text(desired) + " " + Text(current));
  }

  Calls calls;

 private:
  static std::string Text(const Id& id) { return id.instanceId.empty() ? "" : " [" + id.instanceId + "]"; }
  static std::string Text(const Value& v) { return HoxConfigManager::JsonToString(v); }
};

// The calls of the walk of `desired` against a copy of `current`.
inline Calls Walk(HoxConfigManager::Document& desired, const HoxConfigManager::Value& current,
                  RecordingHandler handler = {}) {
  HoxConfigManager::ComputeDrift(desired, desired.GetAllocator(), handler, Copy(current));
  return handler.calls;
}

}  // namespace hoxcm_test
