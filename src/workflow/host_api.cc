// The host API's changing side: the impact of a change (CheckImpact), the
// change applied at once or staged for the next boot (SetConfig), and the
// removal of a singleton's configuration (DeleteConfig). Live changes are
// planned and run as remediation plans, with remediation's log lines,
// notifications and progress, under the host run lock (waiting for another
// apply as Apply does); every change leaves a record in the apply history.
#include <algorithm>
#include <functional>
#include <list>
#include <optional>
#include <string>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/drift.h>
#include <hoxcm/host.h>
#include <hoxcm/host_documents.h>

#include "workflow/apply.h"
#include "workflow/apply_history.h"
#include "workflow/host_api.h"
#include "workflow/impact.h"
#include "workflow/remediation.h"
#include "workflow/validation.h"

namespace HoxConfigManager {
namespace {

constexpr const char* kAborted = "com.tarvik.hox.settings.apply.plugin.aborted";
constexpr const char* kPluginNotFound = "com.tarvik.hox.settings.apply.plugin.not-found";

void RequireNormalBootMode() {
  if (HoxConfigStore::GetBootMode() == HoxConfigStore::BOOTMODE_NORMAL) return;
  CSLogger::Log(CSLogger::kError, "A staged desired configuration waits for a reboot; no change is accepted");
  ThrowException<HostNotInNBM>(PendingDesiredConfiguration);
}

[[noreturn]] void ThrowNotInMaintenanceMode() {
  CSLogger::Log(CSLogger::kError, "The change requires maintenance mode and the host is not in it");
  ThrowException<HostNotInMM>(HostNotInMaintenanceMode);
}

ApplyResult Aborted(std::vector<std::string> args) {
  ApplyResult result;
  result.errorInfo = ErrorInfo(kAborted, std::move(args), "");
  return result;
}

// Runs a plan that changes one item; its runs go into `record`. A plan in
// which no plugin runs would change nothing, which the caller asked for by
// name: that is the plugin error "not found". A plugin's error or an abort
// is returned.
ApplyResult RunItemPlan(const std::vector<DesiredConfigInput>& tasks, PluginRunner& runner,
                             const std::shared_ptr<TaskHandle>& task, ApplyHistoryRecord& record) {
  PluginManager registry(APPLY);
  const RemediationPlan plan = PlanRemediation(tasks, RegistryOwners(registry), registry.GetDependencies(), false);
  if (plan.groups.empty()) {
    const std::string id = tasks.front().object->GetConfigStoreObjectId().toString();
    const std::string& action = tasks.front().action;
    CSLogger::Log(CSLogger::kError, "Couldn't find the plugin %s for operation %s", id.c_str(), action.c_str());
    ApplyResult missing;
    missing.errorInfo = ErrorInfo(kPluginNotFound, {id, action}, "Couldn't find the plugin " + id + " for operation " + action);
    return missing;
  }
  RemediationOutcome outcome = RunRemediation(plan, runner, "", task);
  record.runs = HistoryRuns(outcome.runs);
  if (outcome.error.id == kAborted) {
    // Named after the plugin that did not run (none when every one ran).
    std::list<std::string> next;
    if (outcome.runs.size() < plan.groups.size()) next.push_back(plan.groups[outcome.runs.size()].pluginId);
    task->AddNotification()->PluginInfo(kAborted, next);
    return Aborted({next.begin(), next.end()});
  }
  ApplyResult result;
  result.errorInfo = std::move(outcome.error);
  return result;
}

ApplyResult ApplyNow(const Document& currentDocument, Document& desiredDocument, PluginRunner& runner,
                          const std::shared_ptr<TaskHandle>& task, ApplyHistoryRecord& record, bool& nothingToDo) {
  HoxConfigStore::SetBootMode(HoxConfigStore::BOOTMODE_NORMAL);
  CSLogger::Log(CSLogger::kInfo, "Remediating HOXi host to desired configuration ");
  CSLogger::Log(CSLogger::kInfo, "Generating Apply Tasks");
  ApplyTaskGenerator generator;
  Document host;
  host.CopyFrom(currentDocument, host.GetAllocator());
  ComputeDrift(desiredDocument, desiredDocument.GetAllocator(), generator, std::move(host));
  CSLogger::Log(CSLogger::kInfo, "Done with Generate Apply Tasks");
  const std::vector<DesiredConfigInput> tasks = generator.getTasks();
  if (tasks.empty()) {
    CSLogger::Log(CSLogger::kWarning, "No tasks generated for the desired configuration.");
    nothingToDo = true;
    return {};
  }
  return RunItemPlan(tasks, runner, task, record);
}

// The staged value replaces the item in the desired configuration, and boot
// mode 4 marks it, both or neither.
void Stage(const HostItem& item, const std::shared_ptr<HoxConfigStore::DBStore>& db, const Value& stagedValue) {
  CSLogger::Log(CSLogger::kInfo, "Staging the configuration of %s for the next boot", item.Path().c_str());
  const bool multi = item.schema->IsMultiInstance();
  const bool shaped = multi ? stagedValue.IsArray() : stagedValue.IsObject();
  if (!shaped) ThrowException<ConfigManagerException>(InvalidKeyValue, item.Path());
  const auto store = HoxConfigStore::ConfigStore::GetStore(HoxConfigStore::sGlobalNamespace);
  if (!store) ThrowException<ConfigManagerException>(ConfigStoreConnectFailed);
  HoxConfigStore::ConfigStoreTransaction transaction(store);
  HoxConfigStore::DeleteConfigRows(db, HoxConfigStore::ConfigKind::Desired, item.Id());
  Document scratch;
  if (multi) {
    for (const Value& instance : stagedValue.GetArray()) {
      HoxConfigStore::ProcessDesiredObject(scratch.GetAllocator(), db, item.component, item.group, item.key,
                                           item.schema, instance);
    }
  } else {
    HoxConfigStore::ProcessDesiredObject(scratch.GetAllocator(), db, item.component, item.group, item.key,
                                         item.schema, stagedValue);
  }
  HoxConfigStore::SetBootMode(HoxConfigStore::BOOTMODE_DESIRED_STAGED);
  transaction.Commit();
}

// Records one change in the apply history, as Apply is recorded (the host
// API's changes are listed beside the applies), then throws a plugin's
// error as the host API's 2084; an abort is returned.
ApplyResult Recorded(const char* kind, ApplyHistoryRecord& record,
                     const std::function<ApplyResult(bool& nothingToDo)>& change) {
  ApplyResult result = RecordOperation(kind, record, change);
  if (!result.errorInfo.id.empty() && result.errorInfo.id != kAborted) ThrowPluginError(result.errorInfo);
  return result;
}

ApplyResult SetConfigWith(const Document& currentDocument, Document& desiredDocument,
                               const Document& stagedValue, const ImpactResult& impactResult,
                               const std::string& component, const std::string& group, const std::string& key,
                               std::shared_ptr<TaskHandle> taskHandle, LockingSource source) {
  CSLogger::Log(CSLogger::kInfo, "Running SET Config Host API");
  const std::shared_ptr<TaskHandle> task = taskHandle ? std::move(taskHandle) : TaskHandle::Dummy();
  ApplyHistoryRecord record;
  record.document = DocumentDigest(desiredDocument);
  return Recorded("set", record, [&](bool& nothingToDo) {
    PluginRunner* runner = source(*task);
    if (runner == nullptr) {
      CSLogger::Log(CSLogger::kInfo, "Apply aborted, returning...");
      return Aborted({});
    }
    const HostItem item = ResolveItem(component, group, key);
    RequireUserConfiguration(item);
    const auto db = OpenStore();
    RequireNormalBootMode();
    if (!impactResult.error.id.empty()) {
      ApplyResult failed;
      failed.errorInfo = impactResult.error;
      return failed;
    }
    RecordVerdict(record, impactResult, ImpactReasons());
    // The verdict holds for the item as it was when the documents were built.
    const Document now = CurrentDocumentOf(item, db);
    const Value* was = ItemOf(currentDocument, item.Id());
    const Value* is = ItemOf(now, item.Id());
    if ((was == nullptr) != (is == nullptr) || (was != nullptr && *was != *is)) {
      CSLogger::Log(CSLogger::kError, "The configuration of %s changed since its documents were generated",
                    item.Path().c_str());
      ThrowException<InvalidImpact>(ImpactResultNotApplicable);
    }

    ApplyResult result;
    switch (impactResult.impact) {
      case IMPACT_REBOOT_REQUIRED:
        Stage(item, db, stagedValue);
        result.status = APPLY_PENDING_REBOOT;
        break;
      case IMPACT_MAINTENANCE_MODE_REQUIRED:
        if (!IsMaintenanceModeEnabled()) ThrowNotInMaintenanceMode();
        result = ApplyNow(currentDocument, desiredDocument, *runner, task, record, nothingToDo);
        if (result.errorInfo.id.empty()) result.status = APPLY_COMPLETED_IN_MAINTENANCE_MODE;
        break;
      case IMPACT_NONE:
        result = ApplyNow(currentDocument, desiredDocument, *runner, task, record, nothingToDo);
        break;
      default:
        ThrowNotInMaintenanceMode();
    }
    if (result.errorInfo.id.empty()) CSLogger::Log(CSLogger::kInfo, "Setting configuration Successful");
    return result;
  });
}

ApplyResult DeleteConfigWith(const std::string& component, const std::string& group, const std::string& key,
                                  std::shared_ptr<TaskHandle> taskHandle, LockingSource source) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "DeleteConfig");
  const std::shared_ptr<TaskHandle> task = taskHandle ? std::move(taskHandle) : TaskHandle::Dummy();
  ApplyHistoryRecord record;
  return Recorded("delete", record, [&](bool& nothingToDo) {
    const HostItem item = ResolveItem(component, group, key);
    // Instances are removed by setting the key's instances without them.
    if (item.schema->IsMultiInstance()) ThrowException<InvalidArgumentException>(NotSingletonObject, item.Path());
    const auto db = OpenStore();
    RequireUserConfiguration(item);
    if (item.schema->IsMutableDefault()) {
      ThrowException<ConfigManagerException>(DeleteDefaultNotSupported, item.schema->GetId().toString());
    }
    PluginRunner* runner = source(*task);
    if (runner == nullptr) {
      CSLogger::Log(CSLogger::kInfo, "Apply aborted, returning...");
      return Aborted({});
    }
    RequireNormalBootMode();
    using HoxSchemaStore::SchemaObject;
    const bool maintenance =
        HoxSchemaStore::ListsOperation(*item.schema, &SchemaObject::GetMaintenanceModeOperations, "DELETE");
    if (maintenance && !IsMaintenanceModeEnabled()) ThrowNotInMaintenanceMode();
    if (HoxSchemaStore::ListsOperation(*item.schema, &SchemaObject::GetRebootOperations, "DELETE")) {
      // A removal cannot be staged: the boot-time apply only adds and sets.
      CSLogger::Log(CSLogger::kWarning, "The removal of %s takes effect at the next boot", item.Path().c_str());
    }

    const Document current = CurrentDocumentOf(item, db);
    const Value* now = ItemOf(current, item.Id());
    if (now == nullptr) {
      CSLogger::Log(CSLogger::kInfo, "No configuration to delete for %s", item.Path().c_str());
      nothingToDo = true;
      return ApplyResult();
    }
    const std::vector<DesiredConfigInput> tasks{
        {HoxConfigStore::CreateObject(item.Id(), *now, item.schema), nullptr, ActionName(DELETE)}};
    ApplyResult result = RunItemPlan(tasks, *runner, task, record);
    if (result.errorInfo.id.empty()) {
      if (maintenance) result.status = APPLY_COMPLETED_IN_MAINTENANCE_MODE;
      CSLogger::Log(CSLogger::kInfo, "Deleting configuration Successful");
    }
    return result;
  });
}

}  // namespace

void ThrowPluginError(const ErrorInfo& error) {
  ThrowException<ConfigManagerException>(InvalidKeyValue, error.Serialize());
}

std::optional<ErrorInfo> PluginErrorOf(const HoxConfigStore::ConfigStoreException& error) {
  if (error.GetErrorCode() != InvalidKeyValue) return std::nullopt;
  const std::string format = ErrorMessageTable().at(InvalidKeyValue);
  const std::string prefix = format.substr(0, format.find("%s"));
  const std::string text = error.what();
  if (text.compare(0, prefix.size(), prefix) != 0) return std::nullopt;
  ErrorInfo info;
  try {
    info.Deserialize(text.substr(prefix.size()));
  } catch (const HoxConfigStore::ConfigStoreException&) {
    return std::nullopt;  // a 2084 about a value, not a plugin's
  }
  return info;
}

ImpactResult CheckImpact(Document& desiredDocument, const Document& currentDocument,
                         std::shared_ptr<TaskHandle> taskHandle, ImpactReasons* reasons) {
  return CheckImpact(desiredDocument, currentDocument, std::move(taskHandle), reasons, PluginRunner::Default());
}

ImpactResult CheckImpact(Document& desiredDocument, const Document& currentDocument,
                         std::shared_ptr<TaskHandle> taskHandle, ImpactReasons* reasons, PluginRunner& runner) {
  CSLogger::Log(CSLogger::kInfo, "Checking Impact for HostAPIs");
  ImpactResult result;
  result.compliant = true;
  Document host;
  host.CopyFrom(currentDocument, host.GetAllocator());
  Impact(desiredDocument, "", result, std::move(taskHandle), std::optional<Document>(std::move(host)), reasons,
         runner);
  if (!result.error.id.empty()) ThrowPluginError(result.error);
  if (result.compliant) CSLogger::Log(CSLogger::kInfo, "Host is already compliant. Nothing needs to be changed.");
  return result;
}

ApplyResult SetConfig(const Document& currentDocument, Document& desiredDocument, const Document& stagedValue,
                           const ImpactResult& impactResult, const std::string& component, const std::string& group,
                           const std::string& key, std::shared_ptr<TaskHandle> taskHandle) {
  return SetConfigWith(currentDocument, desiredDocument, stagedValue, impactResult, component, group, key,
                       std::move(taskHandle), LockingSource(nullptr));
}

ApplyResult SetConfig(const Document& currentDocument, Document& desiredDocument, const Document& stagedValue,
                           const ImpactResult& impactResult, const std::string& component, const std::string& group,
                           const std::string& key, std::shared_ptr<TaskHandle> taskHandle, PluginRunner& runner) {
  return SetConfigWith(currentDocument, desiredDocument, stagedValue, impactResult, component, group, key,
                       std::move(taskHandle), LockingSource(&runner));
}

ApplyResult DeleteConfig(const std::string& component, const std::string& group, const std::string& key,
                              std::shared_ptr<TaskHandle> taskHandle) {
  return DeleteConfigWith(component, group, key, std::move(taskHandle), LockingSource(nullptr));
}

ApplyResult DeleteConfig(const std::string& component, const std::string& group, const std::string& key,
                              std::shared_ptr<TaskHandle> taskHandle, PluginRunner& runner) {
  return DeleteConfigWith(component, group, key, std::move(taskHandle), LockingSource(&runner));
}

}  // namespace HoxConfigManager
