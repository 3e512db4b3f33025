// End to end through the sample plugins: the apply tasks of a changed
// document, grouped per plugin and run in the registry's order, leave the
// host compliant with that document and its files rewritten.
#include <unordered_map>

#include <hoxcm/drift.h>
#include <hoxcm/operations.h>

#include "plugins/plugin_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;

class ApplyComplianceTest : public PluginTest {
 protected:
  ApplyComplianceTest() {
    root.InstallRunners();
    root.InstallSamplePlugins();
    for (const auto& [kind, file] : {std::pair{HoxConfigStore::ConfigKind::Default, "default-config.json"},
                                     std::pair{HoxConfigStore::ConfigKind::User, "user-config.json"}}) {
      Document doc;
      CreateDocumentFromFile(SourcePath(std::string("data/sample-host/") + file).c_str(), doc);
      HoxConfigStore::ImportConfiguration(kind, doc);
    }
  }

  // What the apply operation does with its tasks, reduced to the plugin
  // framework's part: one group per "<action>:<plugin id>", run in the
  // registry's order.
  void Remediate(Document& desired) {
    PluginManager manager(APPLY);
    std::unordered_map<std::string, TaskMap> groups;
    for (const DesiredConfigInput& task : GenerateApplyTasks(desired)) {
      const auto owners = manager.Find(task.object->GetConfigStoreObjectId());
      ASSERT_EQ(owners.size(), 1u) << task.object->GetConfigStoreObjectId().toString();
      const auto& plugin = owners[0];
      const std::string key = (plugin->GetVersion() == 3 ? "REMEDIATE" : task.action) + ":" + plugin->GetId();
      groups.try_emplace(key, TaskMap{plugin, {}}).first->second.inputs.push_back(task);
    }
    std::size_t ran = 0;
    for (const std::string& name : manager.GetDependencies()) {
      const auto group = groups.find(name);
      if (group == groups.end()) continue;
      EXPECT_EQ(group->second.plugin->Apply(group->second.inputs, "", PluginMonitor::Dummy()), ErrorInfo()) << name;
      ++ran;
    }
    EXPECT_EQ(ran, groups.size()) << "a group is missing from the order";
  }
};

TEST_F(ApplyComplianceTest, ApplyingADocumentMakesTheHostCompliant) {
  Document desired = ExtractCurrentConfiguration();
  Allocator& a = desired.GetAllocator();
  Value& profile = desired.HasMember("profile") ? desired["profile"] : desired;
  Value& dns = profile["network"]["dns"]["config"]["servers"];
  dns.Clear();
  dns.PushBack("192.0.2.53", a);
  profile["system"]["identity"]["hostname"]["hostname"].SetString("renamed", a);
  profile["services"]["time"]["ntp"]["servers"].SetArray().PushBack("ntp.example.org", a);
  profile["services"]["time"]["ntp"]["enabled"].SetBool(true);
  Value& users = profile["security"]["accounts"]["users"];
  users.Erase(users.End() - 1);  // a deletion

  Document check;
  check.CopyFrom(desired, check.GetAllocator());
  ComplianceResult before;
  CheckCompliance(check, before);
  ASSERT_FALSE(before.compliant);

  Remediate(desired);
  ComplianceResult after;
  check.CopyFrom(desired, check.GetAllocator());
  CheckCompliance(check, after);
  EXPECT_TRUE(after.compliant) << JsonToString(after.document);
  EXPECT_NE(root.ReadFile("/etc/resolv.conf").find("nameserver 192.0.2.53\n"), std::string::npos);
  EXPECT_EQ(root.ReadFile("/etc/hostname").rfind("renamed", 0), 0u);
  EXPECT_NE(root.ReadFile("/etc/ntp.conf").find("server ntp.example.org iburst"), std::string::npos);
}

}  // namespace
}  // namespace hoxcm_test
