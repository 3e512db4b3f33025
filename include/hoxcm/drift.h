// The drift engine: the walk that compares a desired configuration document
// with the host's current configuration and reports every difference to a
// DriftHandler, and the handlers built on it (apply tasks, compliance).
// docs/drift.md gives the comparison rules and the report order.
//
// The walk runs on the caller's thread and calls the handler synchronously,
// in walk order. Handlers are not thread-safe; a handler and the result it
// fills belong to one walk at a time.
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
  // `schemaNode` is the JSON schema of the property (never null: a property
  // the key's schema does not describe gets a schema of its value's type).
  virtual void PropertyDrift(const Value& desired, const Value& current, const Value& schemaNode,
                             const std::string& path, ACTION action);

  bool IsConsolidatedActionRequired() const { return consolidatedActionRequired_; }
  bool IsCreateDriftObject() const { return createDriftObject_; }
  bool IsPerProperty() const { return perProperty_; }

 private:
  const bool consolidatedActionRequired_;
  const bool createDriftObject_;
  const bool perProperty_;
};

// Compares `desired` (a document, or one wrapped as {"profile": ...}) with the
// host's configuration and reports every difference to `handler`. Values the
// walk creates are allocated from `allocator`, the allocator of the document
// that owns `desired`. `current`, when given, is taken over and used as the
// host's configuration; otherwise the configuration is extracted from the
// store. Throws ConfigManagerException 2180 without a schema store, 2021 for a
// key without schema, ConfigStoreException 2000 ("Invalid JSON") for a
// malformed document; handler exceptions propagate unchanged.
HOXCM_API void ComputeDrift(Value& desired, Allocator& allocator, DriftHandler& handler,
                            std::optional<Document> current = std::nullopt);

// Turns the walk into apply tasks: one per object to add, change or remove,
// in walk order. Changes carry their drift record.
class HOXCM_API ApplyTaskGenerator final : public DriftHandler {
 public:
  ApplyTaskGenerator();

  void Add(const Value& desired, const HoxConfigStore::ConfigStoreObjectId& id,
           const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path) override;
  void Set(const Value& desired, const Value& current, const HoxConfigStore::ConfigStoreObjectId& id,
           const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path,
           const Value& drift) override;
  void Delete(const Value& current, const HoxConfigStore::ConfigStoreObjectId& id,
              const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path) override;

  void createTask(const HoxConfigStore::ConfigStoreObjectId& id, const Value& value,
                  const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, ACTION action,
                  std::shared_ptr<HoxConfigStore::DriftObject> drift);
  std::vector<DesiredConfigInput> getTasks() const;
  // The list itself, moved out: the generator is left empty.
  std::vector<DesiredConfigInput> takeTasks();

 private:
  std::vector<DesiredConfigInput> tasks_;
};

// The tasks that applying `desired` would run against the host's current
// configuration: additions and changes in document order, then removals in
// the order of the current document.
HOXCM_API std::vector<DesiredConfigInput> GenerateApplyTasks(Document& desired);
// The tasks of a boot-time apply, without comparison: one "SET" per singleton
// key and one "ADD" per instance, in document order.
HOXCM_API std::vector<DesiredConfigInput> GenerateBootTimeTasks(const Document& desired);

// Outcome of a compliance check. `document` is the report:
// {"ADDS": [...], "DELETES": [...], "SETS": [...]}, each entry {"path",
// "desiredValue" and/or "hostValue"} with values serialised and redacted.
struct HOXCM_API ComplianceResult {
  bool compliant = true;
  Document document;
};

// Turns the walk into a compliance report written into a caller's result,
// which must outlive the handler.
class HOXCM_API CheckComplianceHandler final : public DriftHandler {
 public:
  // Marks the result compliant and resets its report to three empty arrays.
  explicit CheckComplianceHandler(ComplianceResult* result);

  void Add(const Value& desired, const HoxConfigStore::ConfigStoreObjectId& id,
           const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path) override;
  void Set(const Value& desired, const Value& current, const HoxConfigStore::ConfigStoreObjectId& id,
           const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path,
           const Value& drift) override;
  void Delete(const Value& current, const HoxConfigStore::ConfigStoreObjectId& id,
              const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path) override;
  void PropertyDrift(const Value& desired, const Value& current, const Value& schemaNode,
                     const std::string& path, ACTION action) override;

  // Adds "path" (a copy) to `entry`, allocated from `document`.
  static void populateResult(Document& document, const std::string& path, Value& entry);

 private:
  void Append(const char* list, Value& entry);

  ComplianceResult* const result_;
};

// Checks the host against `desired` and fills `result` (see ComplianceResult).
// Reports progress 100 on `task` when done.
HOXCM_API void CheckCompliance(Document& desired, ComplianceResult& result,
                               std::shared_ptr<TaskHandle> task = TaskHandle::Dummy());

}  // namespace HoxConfigManager
