// Remediation planning: which plugin run receives which apply tasks, and in
// which order the runs come. PlanRemediation is a function of its inputs
// alone (the tasks, who owns each object, the registry's dependency order),
// so every grouping and ordering rule is tested with tables, without
// manifests or processes; RunRemediation (remediation.h) executes the plan.
//
// Thread safety: a plan is a value; planning touches nothing shared except
// the log.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include <hoxcm/drift.h>
#include <hoxcm/plugins.h>

namespace HoxConfigManager {

// One plugin owning an object, as planning sees it. `plugin` is what the
// run executes; planning reads only the other fields, which are the
// plugin's id, manifest version and boot-time support.
struct PlanOwner {
  std::shared_ptr<Plugin> plugin;
  std::string id;
  long version = 0;
  bool bootCapable = false;
};

// The owners of an object, in the registry's order.
using OwnerLookup = std::function<std::vector<PlanOwner>(const HoxConfigStore::ConfigStoreObjectId&)>;

// The apply owners of the registry `registry` (which must outlive the lookup).
OwnerLookup RegistryOwners(PluginManager& registry);

// The tasks given to one plugin run. The key joins the action word and the
// plugin id with ":"; the action word is the tasks' own for plugins of
// manifest versions 0 to 2 and "REMEDIATE" for version 3, whose plugins thus
// receive all their tasks in one run whatever the tasks' actions.
struct RemediationGroup {
  std::string key;
  std::shared_ptr<Plugin> plugin;
  std::string pluginId;
  std::vector<DesiredConfigInput> inputs;  // in task order
};

// A task that an owning plugin does not receive because the plugin cannot
// run at boot time.
struct BootSkip {
  std::string pluginId;
  DesiredConfigInput task;
};

struct RemediationPlan {
  // The groups that run, in the dependency order.
  std::vector<RemediationGroup> groups;
  // Groups whose key no entry of the dependency order names: they never
  // run. In the order of their first task.
  std::vector<RemediationGroup> unscheduled;
  // Tasks that no plugin owns, in task order.
  std::vector<DesiredConfigInput> unowned;
  // Boot runs only: tasks held back from plugins without boot support.
  std::vector<BootSkip> bootSkipped;
  // The dependency order names entries after the last group that runs. An
  // abort is looked for before every entry of the order, so a run checks
  // once more after its last group.
  bool abortCheckAfterLast = false;

  // Every group, run or not: the runs share the progress between them all.
  std::size_t GroupCount() const { return groups.size() + unscheduled.size(); }
};

// Groups `tasks` per plugin apply key and orders the groups by `order` (the
// registry's dependency order), whose entries are matched literally against
// the keys: a group runs only when some entry is exactly its key, and runs
// once, at the first such entry. A task owned by several plugins goes to
// each of them. With `boot`, plugins without boot-time support are left out
// (logged as errors). Logs each finding as remediation does.
RemediationPlan PlanRemediation(const std::vector<DesiredConfigInput>& tasks, const OwnerLookup& owners,
                                const std::vector<std::string>& order, bool boot);

}  // namespace HoxConfigManager
