// Remediation: running a plan's plugin groups one after another on behalf of
// the caller's task, and RemediateHost, which brings the host to a desired
// document (apply tasks, plan, run) and is shared by apply and boot-time
// apply.
//
// Runs happen on the caller's thread, strictly one at a time, through the
// PluginRunner given (the production runner unless a test passes a fake).
// The task may be aborted from another thread; the abort is seen between
// groups.
#pragma once

#include <chrono>
#include <memory>
#include <string>
#include <vector>

#include <hoxcm/errors.h>
#include <hoxcm/json.h>
#include <hoxcm/task.h>

#include "plugins/plugin_runner.h"
#include "workflow/remediation_plan.h"

namespace HoxConfigManager {

// What became of one group that was run.
struct GroupRun {
  std::string key;
  std::string pluginId;
  std::size_t inputCount = 0;
  ErrorInfo outcome;  // empty id: success
  std::chrono::steady_clock::duration wall{};
};

struct RemediationOutcome {
  // Empty on success; the first failing plugin's error, or the aborted
  // error ("com.tarvik.hox.settings.apply.plugin.aborted", no argument).
  ErrorInfo error;
  // The groups that ran, in order, the failing one included.
  std::vector<GroupRun> runs;
};

// Runs the plan's groups in order: progress 20 first, then each group's
// equal share of 80 as it finishes (the share counts the unscheduled groups
// too, whose part is never added); "started" and "finished" notifications
// around each run; an abort looked for before each group (and once more
// after the last when the order goes on); the first plugin error stops the
// run and is posted as a plugin error. One monitor over `task` serves every
// run. A null task is taken as TaskHandle::Dummy().
RemediationOutcome RunRemediation(const RemediationPlan& plan, PluginRunner& runner,
                                  const std::string& operationContext, std::shared_ptr<TaskHandle> task);

// Brings the host to `desired`: its apply tasks (with `boot`, the boot-time
// tasks, given only to boot-capable plugins), planned over the apply
// registry and run. No tasks: an empty error, and no plugin is loaded.
// Returns the run's error; configuration errors (a malformed document, a
// registry that cannot be ordered) are thrown.
ErrorInfo RemediateHost(Document& desired, std::string operationContext, std::shared_ptr<TaskHandle> task,
                        bool boot, PluginRunner& runner = PluginRunner::Default());
// RemediateHost with every run it made: what Apply and boot-time apply
// record in the apply history.
RemediationOutcome RemediateHostRuns(Document& desired, std::string operationContext,
                                     std::shared_ptr<TaskHandle> task, bool boot, PluginRunner& runner);
// RemediateHostRuns without boot, given the apply tasks that
// GenerateApplyTasks would return now (Apply has them from its impact walk,
// made under the host run lock it still holds). Logs, plans and runs exactly
// as the other form.
RemediationOutcome RemediateHostRuns(const std::vector<DesiredConfigInput>& applyTasks, std::string operationContext,
                                     std::shared_ptr<TaskHandle> task, PluginRunner& runner);

}  // namespace HoxConfigManager
