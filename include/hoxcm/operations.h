// Host operations: the workflow built on extraction, the drift engine and the
// plugin framework, as the host's daemons, boot scripts and tools call it.
// docs/architecture.md lists what lands here (validation, impact,
// check-apply and apply, boot-time apply, the single-item host API) and in
// which layer each piece lives.
//
// Impact (docs/impact.md) says what applying a desired document would cost:
// nothing, maintenance mode or a reboot, from the keys' schemas and the
// impact plugins' verdicts; on request it also says why, object by object.
// Validate (docs/validation.md) checks a desired document against the host
// document schema and through the validation plugins.
//
// Every operation runs on the caller's thread and blocks while its plugins
// run, one after another. Results are plain values owned by the caller.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <hoxcm/drift.h>
#include <hoxcm/errors.h>
#include <hoxcm/export.h>
#include <hoxcm/extraction.h>
#include <hoxcm/json.h>
#include <hoxcm/plugins.h>
#include <hoxcm/task.h>

namespace HoxConfigManager {

// ---- Impact ----------------------------------------------------------------

// What applying a document costs; impact plugins report in the same numbering.
enum IMPACT_TYPE : int32_t {
  IMPACT_NONE = 0,
  IMPACT_MAINTENANCE_MODE_REQUIRED = 1,
  IMPACT_REBOOT_REQUIRED = 2,
};

// One statement about the impact: a message id under
// "com.tarvik.settings.impact.info" and its arguments ("add", "set" and
// "delete" take component, key, group in that order; "reboot" and
// "maintenance-mode" take none).
struct HOXCM_API ImpactInfo {
  std::string id;
  std::vector<std::string> args;

  bool operator==(const ImpactInfo& o) const { return id == o.id && args == o.args; }
  bool operator!=(const ImpactInfo& o) const { return !(*this == o); }
};

// Hash of the whole statement, for sets of ImpactInfo.
struct HOXCM_API ImpactInfoHash {
  std::size_t operator()(const ImpactInfo& info) const;
};

struct HOXCM_API ImpactResult {
  // The walk found no drift at all. False until Impact says otherwise.
  bool compliant = false;
  IMPACT_TYPE impact = IMPACT_NONE;
  // The reboot or maintenance-mode statement first, then one statement per
  // changed object (no particular order among those).
  std::vector<ImpactInfo> impactInfo;
  // Empty unless a plugin failed or the task was aborted; then nothing else
  // of the result is meaningful.
  ErrorInfo error;
};

// Why an object requires maintenance mode or a reboot.
struct HOXCM_API ImpactReason {
  enum class Rule {
    kPropertyTrigger,  // a changed property's schema lists its new value (or any value) as a trigger
    kOperation,        // the key's schema lists the operation (ADD, SET, DELETE) itself
    kPlugin,           // the owning impact plugin said so
  };
  Rule rule = Rule::kOperation;
  IMPACT_TYPE impact = IMPACT_NONE;  // what this reason alone requires
  // The change behind a schema rule: the value's path in the walk's spelling
  // ("/system/kernel/boot_options/hugepages", instances by index:
  // "/network/interfaces/vnic/1/mtu"), and its host and desired values as
  // compact JSON with sensitive values masked ("" when absent).
  std::string path;
  std::string oldValue;
  std::string newValue;
  // kPlugin: the plugin's id and its own words.
  std::string plugin;
  std::string reason;
};

// One object that requires maintenance mode or a reboot, with its reasons.
struct HOXCM_API ObjectImpact {
  // The object; the instance id is empty for a singleton, and for a plugin
  // verdict that names only the key.
  HoxConfigStore::ConfigStoreObjectId id;
  // "ADD", "SET" or "DELETE" as the analysis took the change (a singleton
  // the host lacks is an "ADD"); empty for a plugin verdict that names no
  // object of its run.
  std::string action;
  IMPACT_TYPE impact = IMPACT_NONE;  // the highest of the reasons
  std::vector<ImpactReason> reasons;
};

// The reasons behind an ImpactResult: the objects that require maintenance
// mode or a reboot, in the order the walk met them, then those only a plugin
// named. Objects that change without cost are not listed (the result's
// statements name them).
struct HOXCM_API ImpactReasons {
  std::vector<ObjectImpact> objects;
};

// Computes the impact of applying `desiredDocument` (a document, or one
// wrapped as {"profile": ...}) to the host, into `result`:
//   - the drift walk against `currentDocument` (taken over) or, without it,
//     the host's configuration read from the store;
//   - per changed object, the reboot and maintenance-mode rules of its key's
//     schema;
//   - each impact plugin that owns a changed object is asked in turn, with
//     "started"/"finished" notifications, progress (20 after the walk, then
//     80 shared among the plugins) and an abort check before each; the first
//     failure or abort ends the run inside `result.error`.
// `taskId` is handed to every plugin. With `reasons` (null: not collected,
// and the walk pays nothing for them), it receives why (see ImpactReasons).
// Throws ConfigStoreException 2000 ("Invalid JSON") for a malformed document
// or schema, and what ComputeDrift throws.
HOXCM_API void Impact(Document& desiredDocument, const std::string& taskId, ImpactResult& result,
                      std::shared_ptr<TaskHandle> taskHandle = TaskHandle::Dummy(),
                      std::optional<Document> currentDocument = std::nullopt, ImpactReasons* reasons = nullptr);

// ---- Validation ----------------------------------------------------------

// Hash of an object id over its text form ("comp C grp G key K[ id I]").
struct HOXCM_API CsoIdHash {
  std::size_t operator()(const HoxConfigStore::ConfigStoreObjectId& id) const;
};

struct HOXCM_API ValidationResult {
  // One entry per faulty field, in the order of the fields in the document.
  std::vector<ValidationErrorInfo> errors;
  // Set when validation could not be completed (abort, plugin failure);
  // `errors` is then empty.
  ErrorInfo error;

  // Completed, and nothing found.
  bool IsValid() const { return errors.empty() && error.id.empty(); }
};

// Validates `desiredDocument` (wrapped in "profile" or not): with
// `checkSchema`, against `schemaDocument` (a host document schema, see
// GenerateHostDocumentSchema) first; then through every validation plugin,
// except those owning a key the schema stage found faulty. Per field, the
// first finding wins (the schema's before any plugin's). Progress: 20 after
// the schema stage, then 80 shared among the plugins. Throws
// ConfigStoreException 2000 ("Invalid JSON") when the document is not an
// object. docs/validation.md has the details.
HOXCM_API void Validate(const Document& desiredDocument, const Document& schemaDocument, const std::string& taskId,
                        ValidationResult& result, bool checkSchema,
                        std::shared_ptr<TaskHandle> taskHandle = TaskHandle::Dummy());

}  // namespace HoxConfigManager
