#include "workflow/remediation.h"

#include <hoxcm/drift.h>
#include <hoxcm/host.h>

namespace HoxConfigManager {
namespace {

constexpr const char* kStarted = "com.tarvik.hox.settings.apply.plugin.started";
constexpr const char* kFinished = "com.tarvik.hox.settings.apply.plugin.finished";
constexpr const char* kAborted = "com.tarvik.hox.settings.apply.plugin.aborted";

}  // namespace

RemediationOutcome RunRemediation(const RemediationPlan& plan, PluginRunner& runner,
                                  const std::string& operationContext, std::shared_ptr<TaskHandle> task) {
  if (!task) task = TaskHandle::Dummy();
  RemediationOutcome outcome;
  task->UpdateProgress(20.0f);
  const std::size_t count = plan.GroupCount();
  const float step = count == 0 ? 100.0f : 80.0f / static_cast<float>(count);
  float progress = 20.0f;
  const auto monitor = std::make_shared<TaskPluginMonitor>(task);
  const auto aborted = [&task, &outcome] {
    if (!task->IsAborted()) return false;
    CSLogger::Log(CSLogger::kInfo, "Apply aborted, returning...");
    outcome.error.id = kAborted;
    return true;
  };

  for (const RemediationGroup& group : plan.groups) {
    if (aborted()) return outcome;
    CSLogger::Log(CSLogger::kDetail, "Found match for dependency %s", group.key.c_str());
    task->AddNotification()->PluginInfo(kStarted, {group.pluginId});
    const auto start = std::chrono::steady_clock::now();
    ErrorInfo result = runner.Apply(*group.plugin, group.inputs, operationContext, monitor);
    outcome.runs.push_back(
        {group.key, group.pluginId, group.inputs.size(), result, std::chrono::steady_clock::now() - start});
    if (!result.id.empty()) {
      CSLogger::Log(CSLogger::kError, "%s plugin failed to execute.", group.pluginId.c_str());
      task->AddNotification()->PluginError(result);
      outcome.error = std::move(result);
      return outcome;
    }
    progress += step;
    task->UpdateProgress(progress);
    task->AddNotification()->PluginInfo(kFinished, {group.pluginId});
  }
  if (plan.abortCheckAfterLast && aborted()) return outcome;
  CSLogger::Log(CSLogger::kDetail, "HOXi host remediated successfully.");
  return outcome;
}

namespace {

void LogRemediating(bool boot) {
  CSLogger::Log(CSLogger::kDetail, "Remediating HOXi host to desired configuration (boot=%d).", boot ? 1 : 0);
}

// What follows the tasks: an empty list loads no plugin.
RemediationOutcome RemediateTasks(const std::vector<DesiredConfigInput>& tasks, const std::string& operationContext,
                                  std::shared_ptr<TaskHandle> task, bool boot, PluginRunner& runner) {
  if (tasks.empty()) {
    CSLogger::Log(CSLogger::kWarning, "No tasks generated for the desired configuration.");
    return {};
  }
  PluginManager registry(APPLY);
  const RemediationPlan plan = PlanRemediation(tasks, RegistryOwners(registry), registry.GetDependencies(), boot);
  return RunRemediation(plan, runner, operationContext, std::move(task));
}

}  // namespace

RemediationOutcome RemediateHostRuns(Document& desired, std::string operationContext,
                                     std::shared_ptr<TaskHandle> task, bool boot, PluginRunner& runner) {
  LogRemediating(boot);
  const std::vector<DesiredConfigInput> tasks = boot ? GenerateBootTimeTasks(desired) : GenerateApplyTasks(desired);
  return RemediateTasks(tasks, operationContext, std::move(task), boot, runner);
}

RemediationOutcome RemediateHostRuns(const std::vector<DesiredConfigInput>& applyTasks, std::string operationContext,
                                     std::shared_ptr<TaskHandle> task, PluginRunner& runner) {
  LogRemediating(false);
  return RemediateTasks(applyTasks, operationContext, std::move(task), false, runner);
}

ErrorInfo RemediateHost(Document& desired, std::string operationContext, std::shared_ptr<TaskHandle> task,
                        bool boot, PluginRunner& runner) {
  return RemediateHostRuns(desired, std::move(operationContext), std::move(task), boot, runner).error;
}

}  // namespace HoxConfigManager
