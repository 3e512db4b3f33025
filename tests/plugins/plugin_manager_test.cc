// The plugin registry: scanning, lookup by object and the order of apply
// operations.
#include <algorithm>

#include "plugins/plugin_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;

std::size_t Position(const std::vector<std::string>& order, const std::string& name) {
  const auto it = std::find(order.begin(), order.end(), name);
  EXPECT_NE(it, order.end()) << name;
  return static_cast<std::size_t>(it - order.begin());
}

int LoadCode(PluginType type) {
  try {
    PluginManager manager(type);
  } catch (const HoxConfigStore::ConfigStoreException& e) {
    return e.GetErrorCode();
  }
  return 0;
}

using PluginManagerTest = PluginTest;

TEST_F(PluginManagerTest, NoManifestsGiveAnEmptyRegistryAndTheGroupOrder) {
  // Files that only look like manifests are not read at all.
  Manifest("a/plugin.JSON", "{");
  Manifest("a/plugin.json.bak", "{");
  PluginManager manager(APPLY);
  EXPECT_TRUE(manager.GetPlugins().empty());
  EXPECT_TRUE(manager.List().empty());
  EXPECT_EQ(manager.GetDependencies(), (std::vector<std::string>{"system-early", "network", "storage", "system"}));
  EXPECT_TRUE(PluginManager(IMPACT).GetDependencies().empty());
}

TEST_F(PluginManagerTest, AnOperationRunsInsideItsGroup) {
  // Given a "network" plugin providing A, A comes after "system-early" and
  // before "network"; "storage" and "system" follow.
  Manifest("a/plugin.json", V3Manifest("python", {"network:dns:config"}, "network", "A", {}));
  const auto order = PluginManager(APPLY).GetDependencies();
  ASSERT_EQ(order.size(), 5u);
  EXPECT_LT(Position(order, "system-early"), Position(order, "A"));
  EXPECT_LT(Position(order, "A"), Position(order, "network"));
  EXPECT_LT(Position(order, "network"), Position(order, "storage"));
  EXPECT_LT(Position(order, "storage"), Position(order, "system"));
}

TEST_F(PluginManagerTest, DependsChainsAcrossPluginsAndVersions) {
  Manifest("b/plugin.json", V3Manifest("python", {"network:dns:config"}, "network", "B", {"C"}));
  Manifest("c/plugin.json", V3Manifest("python", {"network:routes:static"}, "network", "C", {}));
  Manifest("services/time/ntp/p.json",
           R"({"version":2,"type":"python","apply":{"boot":false,"apply_group":"system",
               "operations":{"SET":{"provides":"SET:ntp","depends":["B"]}}}})");
  const auto order = PluginManager(APPLY).GetDependencies();
  EXPECT_LT(Position(order, "C"), Position(order, "B"));
  EXPECT_LT(Position(order, "B"), Position(order, "network"));
  EXPECT_LT(Position(order, "storage"), Position(order, "SET:ntp"));
  EXPECT_LT(Position(order, "SET:ntp"), Position(order, "system"));
}

TEST_F(PluginManagerTest, OrderFailuresBecomeTheGraphError) {
  const struct {
    const char* what;
    std::vector<std::pair<std::string, std::string>> manifests;
  } cases[] = {
      {"unknown group", {{"a/plugin.json", V3Manifest("python", {"network:dns:config"}, "late", "A", {})}}},
      {"dangling name", {{"a/plugin.json", V3Manifest("python", {"network:dns:config"}, "network", "A", {"Z"})}}},
      {"cycle",
       {{"a/plugin.json", V3Manifest("python", {"network:dns:config"}, "network", "A", {"B"})},
        {"b/plugin.json", V3Manifest("python", {"network:routes:static"}, "network", "B", {"A"})}}},
  };
  for (const auto& c : cases) {
    std::filesystem::remove_all(root.Path(kModules));
    for (const auto& [path, text] : c.manifests) Manifest(path, text);
    EXPECT_EQ(LoadCode(APPLY), PluginDependencyGraphFailed) << c.what;
    EXPECT_EQ(LoadCode(APPLY_BOOT), PluginDependencyGraphFailed) << c.what;
    // Managers that never order apply operations do not care.
    EXPECT_EQ(LoadCode(IMPACT), 0) << c.what;
  }
}

TEST_F(PluginManagerTest, FindReturnsEveryOwnerAndKeepsOnlyPluginsOfTheKind) {
  const std::string impact = R"(,"impact":{"supports":true})";
  const std::string a = Manifest("a/plugin.json", V3Manifest("python", {"network:dns:config"}, "network", "A", {}, impact));
  const std::string b = Manifest("b/plugin.json",
                                 V3Manifest("python", {"network:dns:config", "network:routes:static"}, "network", "B", {}));
  PluginManager apply(APPLY);
  const auto owners = apply.Find(HoxConfigStore::ConfigStoreObjectId("network", "dns", "config", "ignored"));
  ASSERT_EQ(owners.size(), 2u);
  std::vector<std::string> ids = {owners[0]->GetId(), owners[1]->GetId()};
  std::sort(ids.begin(), ids.end());
  EXPECT_EQ(ids, (std::vector<std::string>{"a", "b"}));
  EXPECT_EQ(apply.List().size(), 3u);
  EXPECT_TRUE(apply.Find(HoxConfigStore::ConfigStoreObjectId("storage", "nfs", "mounts")).empty());

  PluginManager impactManager(IMPACT);
  ASSERT_EQ(impactManager.GetPlugins().size(), 1u);
  EXPECT_EQ(impactManager.GetPlugins()[0]->GetId(), "a");
  EXPECT_TRUE(impactManager.Find(HoxConfigStore::ConfigStoreObjectId("network", "routes", "static")).empty());
}

TEST_F(PluginManagerTest, SamplePluginsChainEveryApplyKey) {
  // Every apply key of the sample plugins must appear in the order, and
  // the declared chains must hold, or their groups would never run.
  root.CopyTree("data/sample-plugins", kModules);
  PluginManager manager(APPLY);
  const auto order = manager.GetDependencies();
  for (const auto& plugin : manager.GetPlugins()) {
    if (plugin->GetVersion() == 3) {
      Position(order, "REMEDIATE:" + plugin->GetId());
    } else {
      for (const char* action : {"SET", "ADD", "DELETE"}) Position(order, std::string(action) + ":" + plugin->GetId());
    }
  }
  EXPECT_LT(Position(order, "REMEDIATE:hox"), Position(order, "REMEDIATE:system:identity"));
  EXPECT_LT(Position(order, "REMEDIATE:system:identity"), Position(order, "REMEDIATE:network"));
  EXPECT_LT(Position(order, "REMEDIATE:network"), Position(order, "REMEDIATE:storage"));
  EXPECT_LT(Position(order, "REMEDIATE:storage"), Position(order, "REMEDIATE:system:kernel"));
  EXPECT_LT(Position(order, "REMEDIATE:network"), Position(order, "SET:services:time:ntp"));
  EXPECT_LT(Position(order, "REMEDIATE:services:syslog"), Position(order, "REMEDIATE:quorlet"));
}

TEST_F(PluginManagerTest, AThousandPluginsLoadAndOrder) {
  // Given 1,000 plugins in one group, each depending on the one before.
  for (int i = 0; i < 1000; ++i) {
    const std::string name = "p" + std::to_string(i);
    std::vector<std::string> depends;
    if (i > 0) depends.push_back("P" + std::to_string(i - 1));
    Manifest(name + "/plugin.json",
             V3Manifest("python", {"storage:nfs:mounts"}, "storage", "P" + std::to_string(i), depends));
  }
  PluginManager manager(APPLY);
  EXPECT_EQ(manager.GetPlugins().size(), 1000u);
  EXPECT_EQ(manager.Find(HoxConfigStore::ConfigStoreObjectId("storage", "nfs", "mounts")).size(), 1000u);
  const auto order = manager.GetDependencies();
  ASSERT_EQ(order.size(), 1004u);
  for (int i = 1; i < 1000; ++i) {
    EXPECT_LT(Position(order, "P" + std::to_string(i - 1)), Position(order, "P" + std::to_string(i)));
  }
  EXPECT_LT(Position(order, "P999"), Position(order, "storage"));
}

}  // namespace
}  // namespace hoxcm_test
