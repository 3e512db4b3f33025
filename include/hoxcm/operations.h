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
// CheckApply and Apply (docs/apply.md) change the host in two steps: a
// verdict first, then the change, refused when the verdict no longer holds;
// every Apply leaves a record in the apply history.
// The single-item host API, built on these, is <hoxcm/host_api.h>.
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

// The reasons as JSON, for reports and records (docs/impact.md): an array
// with one object per ObjectImpact, {"component", "group", "key",
// "instance", "action", "impact", "reasons": [{"rule": "property" |
// "operation" | "plugin", "impact", then "path", "oldValue", "newValue" or
// "plugin", "reason"}]}. Values are allocated from `allocator`.
HOXCM_API void ImpactReasonsToJson(const ImpactReasons& reasons, Value& out, Allocator& allocator);

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

// ---- Check-apply and apply ------------------------------------------------

enum QUICK_BOOT_STATUS : int32_t {
  QUICK_BOOT_NOT_SUPPORTED = 0,
  QUICK_BOOT_SUPPORTED = 1,
  QUICK_BOOT_STM_SUPPORTED = 2,
};

// A verdict frozen with a private copy of its document. Made by CheckApply
// and never changed afterwards: Apply only reads it (so one result may be
// applied again; every Apply recomputes the verdict), and it may be shared
// between threads.
class HOXCM_API CheckApplyResult {
 public:
  // Fills the fields in order; `document` is deep-copied.
  CheckApplyResult(IMPACT_TYPE impact, const Document& document, QUICK_BOOT_STATUS quickBootStatus,
                   const std::string& operationContext);
  CheckApplyResult(const CheckApplyResult&) = delete;
  CheckApplyResult& operator=(const CheckApplyResult&) = delete;

  const IMPACT_TYPE impact;
  const Document document;
  const std::string checkApplyId;  // when it was made: seconds since the epoch, in decimal
  const QUICK_BOOT_STATUS quickBootStatus;
  const std::string operationContext;  // handed to Impact and to every plugin run
};

enum ApplyStatus : int32_t {
  APPLY_COMPLETED = 0,  // also: nothing had to be done, or a plugin failed (see errorInfo)
  APPLY_PENDING_REBOOT = 1,
  APPLY_COMPLETED_IN_MAINTENANCE_MODE = 2,
};

struct HOXCM_API ApplyResult {
  ApplyStatus status = APPLY_COMPLETED;
  // Empty on success; a plugin's failure, an abort
  // ("com.tarvik.hox.settings.apply.plugin.aborted") or the recomputed
  // impact's error.
  ErrorInfo errorInfo;
};

// Posted (PluginInfo, no arguments) when CheckApply or Apply finds the host
// taken by another apply and waits for it; an abort of the task ends the
// wait.
inline constexpr const char* kApplyWaitingForHost = "com.tarvik.hox.settings.apply.waiting";

// Whether the host complies with `desired` and, if not, what applying it
// costs: null when it complies, otherwise a result to hand to Apply. The
// impact plugins run on `taskHandle`; with `reasons`, it also says why (see
// ImpactReasons). Holds the host run lock while it judges, so that no other
// apply changes the host under the verdict (it waits, see
// kApplyWaitingForHost). Throws the impact's ErrorInfo itself when a plugin
// failed or the task was aborted, and what Impact throws.
HOXCM_API std::shared_ptr<CheckApplyResult> CheckApply(Document& desired, const std::string& operationContext,
                                                       std::shared_ptr<TaskHandle> taskHandle,
                                                       ImpactReasons* reasons = nullptr);

// Applies a CheckApply result: recomputes the verdict, then stages a
// reboot-requiring document for the next boot, or runs the plugins that own
// the drift in their dependency order, stopping at the first failure (what
// earlier plugins applied stays applied and recorded in the store). Holds the
// host run lock from the recomputation to the last plugin run. Throws
// ConfigManagerException 2024 for a null result, InvalidImpact 2025 when the
// verdict changed to anything but "no impact", HostNotInMM 2026 when
// maintenance mode is required and not entered. Appends one record to the
// apply history whatever happens.
HOXCM_API ApplyResult Apply(const std::shared_ptr<CheckApplyResult>& checkResult,
                            std::shared_ptr<TaskHandle> taskHandle);

// What Apply would run for `desired` against the host as it is now: the
// plugin runs in order, the ones no dependency entry names (which never
// run), and the changes no plugin owns. Nothing is changed and no plugin
// process runs.
struct HOXCM_API PlannedRun {
  std::string key;  // action word and plugin id: "REMEDIATE:network"
  std::string pluginId;
  std::vector<DesiredConfigInput> inputs;
};
struct HOXCM_API ApplyPlan {
  std::vector<PlannedRun> runs;
  std::vector<PlannedRun> neverRun;
  std::vector<DesiredConfigInput> unowned;
};
HOXCM_API ApplyPlan PlanApply(Document& desired);

// ---- Apply history ---------------------------------------------------------

// The history keeps the newest kApplyHistoryLimit records; each keeps at
// most kApplyHistoryListLimit statements and objects with reasons.
inline constexpr std::size_t kApplyHistoryLimit = 500;
inline constexpr std::size_t kApplyHistoryListLimit = 100;

// One plugin run of a recorded operation.
struct HOXCM_API ApplyHistoryRun {
  std::string key;
  std::string pluginId;
  std::size_t inputs = 0;  // objects handed to the plugin
  ErrorInfo outcome;       // empty id: success
  double seconds = 0;      // wall time
};

// What one apply (or boot-time run) did. Holds no configuration value: the
// document is named by its digest, and the reasons' values are masked as
// Impact masks them (and cut to 256 bytes).
struct HOXCM_API ApplyHistoryRecord {
  int64_t sequence = 0;  // given by the history; grows with every record
  std::string kind;      // "apply" or "boot"
  int64_t startedAt = 0;  // seconds since the epoch
  double seconds = 0;     // wall time of the whole operation
  std::string document;   // DocumentDigest of the applied document; empty without one
  // The verdict it went by (Apply: its recomputation), when one was reached.
  bool judged = false;
  bool compliant = false;
  IMPACT_TYPE impact = IMPACT_NONE;
  std::vector<ImpactInfo> statements;
  std::vector<ObjectImpact> reasons;
  std::size_t statementsOmitted = 0;  // beyond kApplyHistoryListLimit
  std::size_t reasonsOmitted = 0;
  std::vector<ApplyHistoryRun> runs;  // in the order they ran
  // "applied", "nothing to do", "staged" (for the next boot), "failed",
  // "aborted", "refused" (2024, 2025, 2026), "error" (another exception);
  // "unreadable" for a damaged record.
  std::string outcome;
  ApplyStatus status = APPLY_COMPLETED;
  ErrorInfo error;       // the returned error: plugin failure, abort, impact error
  int errorCode = 0;     // the exception's code when the operation threw (-1: an exception without one)
  std::string errorText;  // and its text
};

// "sha256:" and the 64 hexadecimal digits of the SHA-256 of `document`'s
// compact JSON.
HOXCM_API std::string DocumentDigest(const Value& document);
// Appends `record` (its sequence is ignored) and drops the oldest records
// beyond kApplyHistoryLimit. Returns the record's sequence.
HOXCM_API int64_t AppendApplyHistory(const ApplyHistoryRecord& record);
// Every record, oldest first. A damaged record reads as outcome "unreadable".
HOXCM_API std::vector<ApplyHistoryRecord> GetApplyHistory();
// The record as JSON, the shape the history stores and `hoxcfg history
// --json` prints (docs/apply-history.md).
HOXCM_API void ApplyHistoryRecordToJson(const ApplyHistoryRecord& record, Document& out);

}  // namespace HoxConfigManager
