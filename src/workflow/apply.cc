// CheckApply, Apply and the plan of an apply. Both operations hold the host
// run lock while they judge (and Apply while it changes the host), so that
// another process's apply never runs between a verdict and the change it
// allows.
#include "workflow/apply.h"

#include <ctime>
#include <functional>
#include <optional>
#include <string_view>

#include <hoxcm/config_store.h>
#include <hoxcm/host.h>
#include <hoxcm/host_documents.h>

#include "workflow/apply_history.h"
#include "workflow/impact.h"
#include "workflow/remediation.h"

namespace HoxConfigManager {
namespace {

constexpr const char* kApplyAborted = "com.tarvik.hox.settings.apply.plugin.aborted";
constexpr const char* kImpactAborted = "com.tarvik.hox.settings.impact.plugin.aborted";

QUICK_BOOT_STATUS QuickBootStatus() {
  if (HostCtl::System::LoadHox::IsSTMSupported()) return QUICK_BOOT_STM_SUPPORTED;
  return HostCtl::System::LoadHox::IsSupported() ? QUICK_BOOT_SUPPORTED : QUICK_BOOT_NOT_SUPPORTED;
}

Document CopyOf(const Document& source) {
  Document copy;
  copy.CopyFrom(source, copy.GetAllocator());
  return copy;
}

std::shared_ptr<CheckApplyResult> CheckApplyWith(Document& desired, const std::string& operationContext,
                                                 std::shared_ptr<TaskHandle> task, ImpactReasons* reasons,
                                                 LockingSource source) {
  const HoxPlatform::LogContext operation(HoxPlatform::LogContext::Field::kOperation, "CheckApply");
  CSLogger::Log(CSLogger::kDetail, "CheckApply operation invoked.");
  if (!task) task = TaskHandle::Dummy();
  PluginRunner* runner = source(*task);
  if (runner == nullptr) {
    CSLogger::Log(CSLogger::kInfo, "Impact aborted, returning...");
    throw ErrorInfo(kImpactAborted, {});
  }
  ImpactResult impact;
  Impact(desired, operationContext, impact, task, std::nullopt, reasons, *runner);
  if (!impact.error.id.empty()) throw ErrorInfo(impact.error);
  std::shared_ptr<CheckApplyResult> result;
  if (!impact.compliant) {
    result = std::make_shared<CheckApplyResult>(impact.impact, desired, QuickBootStatus(), operationContext);
  }
  CSLogger::Log(CSLogger::kDetail, "CheckApply operation completed.");
  return result;
}

// Apply's steps after the entry line; what it learns goes into `record`.
ApplyResult ApplySteps(const std::shared_ptr<CheckApplyResult>& check, const std::shared_ptr<TaskHandle>& task,
                       LockingSource& source, ApplyHistoryRecord& record, bool& compliant) {
  if (!check) {
    CSLogger::Log(CSLogger::kError, "Apply invoked with empty check apply result.");
    ThrowException<ConfigManagerException>(InvalidApplyInput);
  }
  record.document = DocumentDigest(check->document);
  ApplyResult result;
  PluginRunner* runner = source(*task);
  if (runner == nullptr) {
    CSLogger::Log(CSLogger::kInfo, "Apply aborted, returning...");
    result.errorInfo.id = kApplyAborted;
    return result;
  }

  // The result is shared and immutable; the walks write drift records into
  // the allocator of the document they are given.
  Document desired = CopyOf(check->document);
  ImpactResult impact;
  ImpactReasons reasons;
  // One walk gives the verdict and the apply tasks: the host cannot change
  // between the two while this apply holds the host run lock.
  std::vector<DesiredConfigInput> tasks;
  Impact(desired, check->operationContext, impact, task->ChildTask(2), std::nullopt, &reasons, *runner, tasks);
  if (!impact.error.id.empty()) {
    result.errorInfo = impact.error;
    return result;
  }
  RecordVerdict(record, impact, reasons);
  if (impact.compliant) {
    CSLogger::Log(CSLogger::kInfo, "Drift reported by CheckApply() is resolved.");
    compliant = true;
    return result;
  }

  IMPACT_TYPE effective = check->impact;
  if (impact.impact != check->impact) {
    // A lighter verdict is accepted only when it needs nothing at all.
    if (impact.impact != IMPACT_NONE) {
      CSLogger::Log(CSLogger::kError,
                    "Impact reported by CheckApply() is no longer applicable, abort. old_impact=%d, new_impact=%d",
                    check->impact, impact.impact);
      ThrowException<InvalidImpact>(ImpactResultNotApplicable);
    }
    CSLogger::Log(CSLogger::kError,
                  "Impact reported by CheckApply() is no longer applicable, continue. old_impact=%d, new_impact=%d",
                  check->impact, impact.impact);
    effective = IMPACT_NONE;
  }

  if (effective == IMPACT_REBOOT_REQUIRED) {
    Document staged = CopyOf(check->document);
    HoxConfigStore::SetDesiredUserConfig(staged);
    CSLogger::Log(CSLogger::kError,
                  "ApplyConfig updated the host with the new desired configuration document, host must be rebooted "
                  "for it to take effect.");
    result.status = APPLY_PENDING_REBOOT;
    return result;
  }
  const bool maintenanceMode = effective == IMPACT_MAINTENANCE_MODE_REQUIRED;
  if (maintenanceMode && !IsMaintenanceModeEnabled()) {
    ThrowException<HostNotInMM>(HostNotInMaintenanceMode);
  }
  HoxConfigStore::SetBootMode(HoxConfigStore::BOOTMODE_NORMAL);
  RemediationOutcome outcome =
      RemediateHostRuns(tasks, std::string(check->operationContext), task->ChildTask(2), *runner);
  record.runs = HistoryRuns(outcome.runs);
  result.errorInfo = std::move(outcome.error);
  if (result.errorInfo.id.empty() && maintenanceMode) result.status = APPLY_COMPLETED_IN_MAINTENANCE_MODE;
  return result;
}

ApplyResult ApplyWith(const std::shared_ptr<CheckApplyResult>& check, std::shared_ptr<TaskHandle> task,
                      LockingSource source) {
  const HoxPlatform::LogContext operation(HoxPlatform::LogContext::Field::kOperation, "Apply");
  // The line says "completed" at entry; callers and their log readers
  // match it as it is.
  CSLogger::Log(CSLogger::kDetail, "Apply operation completed.");
  if (!task) task = TaskHandle::Dummy();
  ApplyHistoryRecord record;
  return RecordOperation("apply", record, [&](bool& compliant) {
    return ApplySteps(check, task, source, record, compliant);
  });
}

}  // namespace

CheckApplyResult::CheckApplyResult(IMPACT_TYPE impact, const Document& document, QUICK_BOOT_STATUS quickBootStatus,
                                   const std::string& operationContext)
    : impact(impact),
      document(CopyOf(document)),
      checkApplyId(std::to_string(static_cast<unsigned long long>(std::time(nullptr)))),
      quickBootStatus(quickBootStatus),
      operationContext(operationContext) {}

std::shared_ptr<CheckApplyResult> CheckApply(Document& desired, const std::string& operationContext,
                                             std::shared_ptr<TaskHandle> taskHandle, ImpactReasons* reasons) {
  return CheckApplyWith(desired, operationContext, std::move(taskHandle), reasons, LockingSource(nullptr));
}

std::shared_ptr<CheckApplyResult> CheckApply(Document& desired, const std::string& operationContext,
                                             std::shared_ptr<TaskHandle> taskHandle, ImpactReasons* reasons,
                                             PluginRunner& runner) {
  return CheckApplyWith(desired, operationContext, std::move(taskHandle), reasons, LockingSource(&runner));
}

ApplyResult Apply(const std::shared_ptr<CheckApplyResult>& checkResult, std::shared_ptr<TaskHandle> taskHandle) {
  return ApplyWith(checkResult, std::move(taskHandle), LockingSource(nullptr));
}

ApplyResult Apply(const std::shared_ptr<CheckApplyResult>& checkResult, std::shared_ptr<TaskHandle> taskHandle,
                  PluginRunner& runner) {
  return ApplyWith(checkResult, std::move(taskHandle), LockingSource(&runner));
}

ApplyPlan PlanApply(Document& desired) {
  ApplyPlan result;
  const std::vector<DesiredConfigInput> tasks = GenerateApplyTasks(desired);
  if (tasks.empty()) return result;
  PluginManager registry(APPLY);
  RemediationPlan plan = PlanRemediation(tasks, RegistryOwners(registry), registry.GetDependencies(), false);
  for (RemediationGroup& group : plan.groups) {
    result.runs.push_back({std::move(group.key), std::move(group.pluginId), std::move(group.inputs)});
  }
  for (RemediationGroup& group : plan.unscheduled) {
    result.neverRun.push_back({std::move(group.key), std::move(group.pluginId), std::move(group.inputs)});
  }
  result.unowned = std::move(plan.unowned);
  return result;
}

}  // namespace HoxConfigManager
