// Remediation planning as a function of tasks, owners and order: no
// manifest, no process.
#include <map>

#include <gtest/gtest.h>

#include <hoxcm/documents.h>

#include "workflow/remediation_plan.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;
using HoxConfigStore::ConfigStoreObjectId;

// "component/group/key ACTION"
DesiredConfigInput Task(const std::string& text) {
  const auto space = text.find(' ');
  const std::string path = text.substr(0, space);
  const auto a = path.find('/'), b = path.rfind('/');
  Document value;
  ParseDocument("{}", value);
  return {std::make_shared<HoxConfigStore::ConfigStoreObject>(
              ConfigStoreObjectId(path.substr(0, a), path.substr(a + 1, b - a - 1), path.substr(b + 1)), value),
          nullptr, text.substr(space + 1)};
}

// Owners by object key: plugin id, manifest version, boot support.
std::vector<PlanOwner> Owners(const ConfigStoreObjectId& id) {
  static const std::map<std::string, std::vector<PlanOwner>> table = {
      {"net/dns/config", {{nullptr, "net", 3, true}}},
      {"net/vnic/item", {{nullptr, "net", 3, true}}},
      {"sys/host/name", {{nullptr, "host", 2, false}}},
      {"sys/ntp/cfg", {{nullptr, "ntp", 1, true}, {nullptr, "audit", 3, false}}},
  };
  const auto it = table.find(id.component + "/" + id.group + "/" + id.key);
  return it == table.end() ? std::vector<PlanOwner>() : it->second;
}

// Groups as "KEY[key/ACTION,...]", then what does not run.
std::string Render(const RemediationPlan& plan) {
  const auto groups = [](const std::vector<RemediationGroup>& list) {
    std::string s;
    for (const RemediationGroup& g : list) {
      s += (s.empty() ? "" : " ") + g.key + "[";
      for (const DesiredConfigInput& in : g.inputs) s += in.object->GetConfigStoreObjectId().key + "/" + in.action + ",";
      s.back() = ']';
    }
    return s;
  };
  std::string s = groups(plan.groups);
  if (!plan.unscheduled.empty()) s += " | never " + groups(plan.unscheduled);
  if (!plan.unowned.empty()) s += " | unowned " + std::to_string(plan.unowned.size());
  for (const BootSkip& skip : plan.bootSkipped) s += " | boot skips " + skip.pluginId;
  if (plan.abortCheckAfterLast) s += " | check after last";
  return s;
}

const std::vector<std::string> kOrder = {"system-early", "SET:host", "REMEDIATE:net", "ADD:host", "SET:ntp",
                                         "REMEDIATE:audit"};

TEST(RemediationPlanTest, GroupsPerPluginKeyInTheRegistrysOrder) {
  struct Case {
    const char* what;
    std::vector<std::string> tasks;
    bool boot;
    std::vector<std::string> order;
    std::string plan;
  } cases[] = {
      {"a version-3 plugin takes all its tasks in one run", {"net/dns/config SET", "net/vnic/item ADD"}, false, kOrder,
       "REMEDIATE:net[config/SET,item/ADD] | check after last"},
      {"other versions run once per action, in the order's sequence, not the tasks'",
       {"sys/host/name ADD", "sys/host/name DELETE", "sys/host/name SET"}, false, kOrder,
       "SET:host[name/SET] ADD:host[name/ADD] | never DELETE:host[name/DELETE] | check after last"},
      {"an object with two owners feeds both", {"sys/ntp/cfg SET"}, false, kOrder,
       "SET:ntp[cfg/SET] REMEDIATE:audit[cfg/SET]"},
      {"at boot, plugins without boot support are left out", {"sys/ntp/cfg SET", "sys/host/name SET"}, true, kOrder,
       "SET:ntp[cfg/SET] | boot skips audit | boot skips host | check after last"},
      {"a task nobody owns is set aside", {"x/y/z SET", "net/dns/config DELETE"}, false, kOrder,
       "REMEDIATE:net[config/DELETE] | unowned 1 | check after last"},
      {"no tasks, no groups", {}, false, kOrder, " | check after last"},
      {"order entries after the last group", {"net/dns/config SET"}, false, {"REMEDIATE:net", "network", "system"},
       "REMEDIATE:net[config/SET] | check after last"},
      {"an order that names no group", {"net/dns/config SET"}, false, {"network"},
       " | never REMEDIATE:net[config/SET] | check after last"},
      {"an empty order runs nothing", {"net/dns/config SET"}, false, {}, " | never REMEDIATE:net[config/SET]"},
      {"a key named twice runs once", {"net/dns/config SET"}, false, {"REMEDIATE:net", "REMEDIATE:net"},
       "REMEDIATE:net[config/SET] | check after last"},
  };
  for (const Case& c : cases) {
    std::vector<DesiredConfigInput> tasks;
    for (const std::string& t : c.tasks) tasks.push_back(Task(t));
    EXPECT_EQ(Render(PlanRemediation(tasks, Owners, c.order, c.boot)), c.plan) << c.what;
  }
}

}  // namespace
}  // namespace hoxcm_test
