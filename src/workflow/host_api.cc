// The host API's changing side: the impact of a change (CheckImpact), the
// change applied at once or staged for the next boot (SetConfig), and the
// removal of a singleton's configuration (DeleteConfig). Live changes are
// planned and run as remediation plans, with remediation's log lines,
// notifications and progress.
#include <algorithm>
#include <list>
#include <optional>
#include <string>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/drift.h>
#include <hoxcm/host.h>
#include <hoxcm/host_documents.h>

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

// Runs a plan that changes one item. A plan in which no plugin runs would
// change nothing, which the caller asked for by name: that is the plugin
// error "not found". A failing plugin is thrown; an abort is returned.
HostConfigResult RunItemPlan(const RemediationPlan& plan, const std::vector<DesiredConfigInput>& tasks,
                             PluginRunner& runner, const std::shared_ptr<TaskHandle>& task) {
  if (plan.groups.empty()) {
    const std::string id = tasks.front().object->GetConfigStoreObjectId().toString();
    const std::string& action = tasks.front().action;
    CSLogger::Log(CSLogger::kError, "Couldn't find the plugin %s for operation %s", id.c_str(), action.c_str());
    ThrowPluginError(ErrorInfo(kPluginNotFound, {id, action}, "Couldn't find the plugin " + id + " for operation " + action));
  }
  RemediationOutcome outcome = RunRemediation(plan, runner, "", task);
  HostConfigResult result;
  if (outcome.error.id == kAborted) {
    // Named after the plugin that did not run (none when every one ran).
    std::list<std::string> next;
    if (outcome.runs.size() < plan.groups.size()) next.push_back(plan.groups[outcome.runs.size()].pluginId);
    task->AddNotification()->PluginInfo(kAborted, next);
    result.errorInfo = ErrorInfo(kAborted, {next.begin(), next.end()}, "");
    return result;
  }
  if (!outcome.error.id.empty()) ThrowPluginError(outcome.error);
  return result;
}

RemediationPlan PlanItem(const std::vector<DesiredConfigInput>& tasks) {
  PluginManager registry(APPLY);
  return PlanRemediation(tasks, RegistryOwners(registry), registry.GetDependencies(), false);
}

HostConfigResult ApplyNow(const Document& currentDocument, Document& desiredDocument, PluginRunner& runner,
                          const std::shared_ptr<TaskHandle>& task) {
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
    return {};
  }
  return RunItemPlan(PlanItem(tasks), tasks, runner, task);
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

bool Lists(int (HoxSchemaStore::SchemaObject::*query)(std::vector<std::string>&, bool&) const,
           const HoxSchemaStore::SchemaObject& schema, const char* operation) {
  std::vector<std::string> operations;
  bool propertyLevel = false;
  return (schema.*query)(operations, propertyLevel) == 0 &&
         std::find(operations.begin(), operations.end(), operation) != operations.end();
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

HostConfigResult SetConfig(const Document& currentDocument, Document& desiredDocument, const Document& stagedValue,
                           const ImpactResult& impactResult, const std::string& component, const std::string& group,
                           const std::string& key, std::shared_ptr<TaskHandle> taskHandle) {
  const HoxPlatform::HostRunLock lock = LaunchingRunner::LockHost();
  LaunchingRunner runner(lock);
  return SetConfig(currentDocument, desiredDocument, stagedValue, impactResult, component, group, key,
                   std::move(taskHandle), runner);
}

HostConfigResult SetConfig(const Document& currentDocument, Document& desiredDocument, const Document& stagedValue,
                           const ImpactResult& impactResult, const std::string& component, const std::string& group,
                           const std::string& key, std::shared_ptr<TaskHandle> taskHandle, PluginRunner& runner) {
  CSLogger::Log(CSLogger::kInfo, "Running SET Config Host API");
  const std::shared_ptr<TaskHandle> task = taskHandle ? std::move(taskHandle) : TaskHandle::Dummy();
  const HostItem item = ResolveItem(component, group, key);
  RequireUserConfiguration(item);
  const auto db = OpenStore();
  RequireNormalBootMode();
  if (!impactResult.error.id.empty()) ThrowPluginError(impactResult.error);
  // The verdict holds for the item as it was when the documents were built.
  const Document now = CurrentDocumentOf(item, db);
  const Value* was = ItemOf(currentDocument, item.Id());
  const Value* is = ItemOf(now, item.Id());
  if ((was == nullptr) != (is == nullptr) || (was != nullptr && *was != *is)) {
    CSLogger::Log(CSLogger::kError, "The configuration of %s changed since its documents were generated",
                  item.Path().c_str());
    ThrowException<InvalidImpact>(ImpactResultNotApplicable);
  }

  HostConfigResult result;
  switch (impactResult.impact) {
    case IMPACT_REBOOT_REQUIRED:
      Stage(item, db, stagedValue);
      result.status = HOST_CONFIG_PENDING_REBOOT;
      break;
    case IMPACT_MAINTENANCE_MODE_REQUIRED:
      if (!IsMaintenanceModeEnabled()) ThrowNotInMaintenanceMode();
      result = ApplyNow(currentDocument, desiredDocument, runner, task);
      if (result.errorInfo.id.empty()) result.status = HOST_CONFIG_COMPLETED_IN_MAINTENANCE_MODE;
      break;
    case IMPACT_NONE:
      result = ApplyNow(currentDocument, desiredDocument, runner, task);
      break;
    default:
      ThrowNotInMaintenanceMode();
  }
  if (result.errorInfo.id.empty()) CSLogger::Log(CSLogger::kInfo, "Setting configuration Successful");
  return result;
}

HostConfigResult DeleteConfig(const std::string& component, const std::string& group, const std::string& key,
                              std::shared_ptr<TaskHandle> taskHandle) {
  const HoxPlatform::HostRunLock lock = LaunchingRunner::LockHost();
  LaunchingRunner runner(lock);
  return DeleteConfig(component, group, key, std::move(taskHandle), runner);
}

HostConfigResult DeleteConfig(const std::string& component, const std::string& group, const std::string& key,
                              std::shared_ptr<TaskHandle> taskHandle, PluginRunner& runner) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "DeleteConfig");
  const std::shared_ptr<TaskHandle> task = taskHandle ? std::move(taskHandle) : TaskHandle::Dummy();
  const HostItem item = ResolveItem(component, group, key);
  // Instances are removed by setting the key's instances without them.
  if (item.schema->IsMultiInstance()) ThrowException<InvalidArgumentException>(NotSingletonObject, item.Path());
  const auto db = OpenStore();
  RequireUserConfiguration(item);
  if (item.schema->IsMutableDefault()) {
    ThrowException<ConfigManagerException>(DeleteDefaultNotSupported, item.schema->GetId().toString());
  }
  RequireNormalBootMode();
  const bool maintenance = Lists(&HoxSchemaStore::SchemaObject::GetMaintenanceModeOperations, *item.schema, "DELETE");
  if (maintenance && !IsMaintenanceModeEnabled()) ThrowNotInMaintenanceMode();
  if (Lists(&HoxSchemaStore::SchemaObject::GetRebootOperations, *item.schema, "DELETE")) {
    // A removal cannot be staged: the boot-time apply only adds and sets.
    CSLogger::Log(CSLogger::kWarning, "The removal of %s takes effect at the next boot", item.Path().c_str());
  }

  const Document current = CurrentDocumentOf(item, db);
  const Value* now = ItemOf(current, item.Id());
  if (now == nullptr) {
    CSLogger::Log(CSLogger::kInfo, "No configuration to delete for %s", item.Path().c_str());
    return {};
  }
  const std::vector<DesiredConfigInput> tasks{
      {HoxConfigStore::CreateObject(item.Id(), *now, item.schema), nullptr, ActionName(DELETE)}};
  HostConfigResult result = RunItemPlan(PlanItem(tasks), tasks, runner, task);
  if (result.errorInfo.id.empty()) {
    if (maintenance) result.status = HOST_CONFIG_COMPLETED_IN_MAINTENANCE_MODE;
    CSLogger::Log(CSLogger::kInfo, "Deleting configuration Successful");
  }
  return result;
}

}  // namespace HoxConfigManager
