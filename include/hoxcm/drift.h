// The drift engine: the walk that compares a desired configuration document
// with the host's current configuration and reports every difference to a
// DriftHandler, and the handlers built on it (apply tasks, compliance).
//
// The walk runs on the caller's thread and calls the handler synchronously,
// in walk order. Handlers are not thread-safe.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <hoxcm/config_store.h>
#include <hoxcm/export.h>
#include <hoxcm/json.h>
#include <hoxcm/schema_store.h>
#include <hoxcm/task.h>

namespace HoxConfigManager {

enum ACTION : int { SET = 0, ADD = 1, DELETE = 2 };
// "SET", "ADD", "DELETE"
HOXCM_API const char* ActionName(ACTION action);

// One unit of work handed to a plugin: the object, the drift record of a
// change (null for additions and removals) and the action name.
struct HOXCM_API DesiredConfigInput {
  std::shared_ptr<HoxConfigStore::ConfigStoreObject> object;
  std::shared_ptr<HoxConfigStore::DriftObject> drift;
  std::string action;
};

// Visitor of the drift walk. Every callback defaults to doing nothing.
class HOXCM_API DriftHandler {
 public:
  DriftHandler(bool consolidatedActionRequired, bool createDriftObject, bool perProperty);
  virtual ~DriftHandler();

  virtual void Add(const Value& desired, const HoxConfigStore::ConfigStoreObjectId& id,
                   const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path);
  virtual void Set(const Value& desired, const Value& current, const HoxConfigStore::ConfigStoreObjectId& id,
                   const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path,
                   const Value& drift);
  virtual void Delete(const Value& current, const HoxConfigStore::ConfigStoreObjectId& id,
                      const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path);
  virtual void PropertyDrift(const Value& desired, const Value& current, const Value& drift,
                             const std::string& path, ACTION action);

  bool IsConsolidatedActionRequired() const { return consolidatedActionRequired_; }
  bool IsCreateDriftObject() const { return createDriftObject_; }
  bool IsPerProperty() const { return perProperty_; }

 private:
  const bool consolidatedActionRequired_;
  const bool createDriftObject_;
  const bool perProperty_;
};

}  // namespace HoxConfigManager
