#include "workflow/remediation_plan.h"

#include <memory>
#include <unordered_map>

#include <hoxcm/host.h>

namespace HoxConfigManager {

OwnerLookup RegistryOwners(PluginManager& registry) {
  // The registry knows owners per key, not per instance, and a plan's tasks
  // come key by key: the last key's owners serve its next instances. Not
  // while detail lines are written, since the registry logs every object it
  // is asked about.
  struct LastKey {
    HoxConfigStore::ConfigStoreObjectId id;
    std::vector<PlanOwner> owners;
    bool known = false;
  };
  auto last = std::make_shared<LastKey>();
  const bool remember = !CSLogger::IsEnabled(CSLogger::kDetail);
  return [&registry, last, remember](const HoxConfigStore::ConfigStoreObjectId& id) {
    if (remember && last->known && last->id.key == id.key && last->id.group == id.group &&
        last->id.component == id.component) {
      return last->owners;
    }
    std::vector<PlanOwner> owners;
    for (const std::shared_ptr<Plugin>& plugin : registry.Find(id)) {
      if (!plugin) continue;
      owners.push_back({plugin, plugin->GetId(), plugin->GetVersion(), plugin->CheckType(APPLY_BOOT)});
    }
    if (remember) *last = {id, owners, true};
    return owners;
  };
}

RemediationPlan PlanRemediation(const std::vector<DesiredConfigInput>& tasks, const OwnerLookup& owners,
                                const std::vector<std::string>& order, bool boot) {
  RemediationPlan plan;
  std::vector<RemediationGroup> groups;  // in the order of their first task
  std::unordered_map<std::string, std::size_t> byKey;
  // The per-task detail lines are built only when they are written: an
  // apply of thousands of objects would spend more on their texts than on
  // the plan.
  const bool detail = CSLogger::IsEnabled(CSLogger::kDetail);
  for (const DesiredConfigInput& task : tasks) {
    const HoxConfigStore::ConfigStoreObjectId& id = task.object->GetConfigStoreObjectId();
    const std::vector<PlanOwner> found = owners(id);
    if (found.empty()) {
      CSLogger::Log(CSLogger::kWarning, "Plugin not present for %s", id.toString().c_str());
      plan.unowned.push_back(task);
      continue;
    }
    for (const PlanOwner& owner : found) {
      if (boot && !owner.bootCapable) {
        CSLogger::Log(CSLogger::kError, "Plugin=%s does not support boot-time remediation for csoid=%s",
                      owner.id.c_str(), id.toString().c_str());
        plan.bootSkipped.push_back({owner.id, task});
        continue;
      }
      if (detail) {
        CSLogger::Log(CSLogger::kDetail, "Found plugin=%s for cso=%s", owner.id.c_str(), id.toString().c_str());
      }
      const std::string key = (owner.version == 3 ? std::string("REMEDIATE") : task.action) + ":" + owner.id;
      CSLogger::Log(CSLogger::kDetail, "Adding key=%s for plugin=%s", key.c_str(), owner.id.c_str());
      const auto [it, added] = byKey.try_emplace(key, groups.size());
      // A later plugin with the same id joins the first one's group.
      if (added) groups.push_back({key, owner.plugin, owner.id, {}});
      groups[it->second].inputs.push_back(task);
    }
  }

  std::vector<bool> scheduled(groups.size(), false);
  std::size_t afterLast = 0;  // entries of the order after the last group
  for (const std::string& entry : order) {
    ++afterLast;
    const auto it = byKey.find(entry);
    if (it == byKey.end() || scheduled[it->second]) continue;
    scheduled[it->second] = true;
    plan.groups.push_back(std::move(groups[it->second]));
    afterLast = 0;
  }
  plan.abortCheckAfterLast = afterLast > 0;
  for (std::size_t i = 0; i < groups.size(); ++i) {
    if (!scheduled[i]) plan.unscheduled.push_back(std::move(groups[i]));
  }
  return plan;
}

}  // namespace HoxConfigManager
