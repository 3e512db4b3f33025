// The plugin registry: scanning, lookup by object and the order of apply
// operations.
#include <algorithm>
#include <set>

#include "plugins/plugin_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;
using HoxConfigStore::ConfigStoreObjectId;

std::size_t Position(const std::vector<std::string>& order, const std::string& name) {
  const auto it = std::find(order.begin(), order.end(), name);
  EXPECT_NE(it, order.end()) << name;
  return static_cast<std::size_t>(it - order.begin());
}

// Each name of `chain` comes before the next in `order`.
void ExpectChain(const std::vector<std::string>& order, const std::vector<std::string>& chain) {
  for (std::size_t i = 1; i < chain.size(); ++i) {
    EXPECT_LT(Position(order, chain[i - 1]), Position(order, chain[i])) << chain[i - 1] << " before " << chain[i];
  }
}

using PluginManagerTest = PluginTest;

TEST_F(PluginManagerTest, OperationsRunInsideTheirGroupAfterWhatTheyDependOn) {
  // Files that only look like manifests are not read at all.
  Manifest("a/plugin.JSON", "{");
  Manifest("a/plugin.json.bak", "{");
  std::filesystem::create_directories(root.Path(kModules + "d.json/e"));  // a directory, not a manifest
  EXPECT_TRUE(PluginManager(APPLY).GetPlugins().empty());
  EXPECT_EQ(PluginManager(APPLY).GetDependencies(),
            (std::vector<std::string>{"system-early", "network", "storage", "system"}));
  EXPECT_TRUE(PluginManager(IMPACT).GetDependencies().empty());

  // Versions 3 and 1 (version 2 in the sample plugins below).
  Manifest("b/plugin.json", V3Manifest("python", {"network:dns:config"}, "network", "B", {"C"}));
  Manifest("c/plugin.json", V3Manifest("python", {"network:routes:static"}, "network", "C", {}));
  Manifest("services/time/ntp/p.json",
           R"({"type":"python","boot":false,"apply_group":"system",
               "operations":{"SET":{"provides":"SET:ntp","depends":["B"]}}})");
  const auto order = PluginManager(APPLY).GetDependencies();
  EXPECT_EQ(order.size(), 7u);
  ExpectChain(order, {"system-early", "C", "B", "network", "storage", "SET:ntp", "system"});
}

TEST_F(PluginManagerTest, OrderFailuresBecomeTheGraphErrorNamingTheirManifests) {
  // Given manifests that declare no usable order, the apply and boot
  // registries should fail with the graph error located in the faulty
  // manifest, and the check should name every plugin involved (a cycle with
  // its names in order).
  const std::string a = "a/plugin.json", b = "b/plugin.json";
  const struct {
    const char* what;
    std::vector<std::pair<std::string, std::string>> manifests;
    std::vector<std::string> faults;  // the text of each fault, its first manifest after a '@'
  } cases[] = {
      {"unknown group",
       {{a, V3Manifest("python", {"network:dns:config"}, "late", "A", {})}},
       {"plugin \"a\" names the apply group \"late\", which is not one of system-early, network, "
        "storage, system@" + a}},
      {"dangling name",
       {{a, V3Manifest("python", {"network:dns:config"}, "network", "A", {"Z"})}},
       {"plugin \"a\": \"A\" depends on \"Z\", which no plugin provides and which is not an apply "
        "group@" + a}},
      {"cycle",
       {{a, V3Manifest("python", {"network:dns:config"}, "network", "A", {"B"})},
        {b, V3Manifest("python", {"network:routes:static"}, "network", "B", {"A"})}},
       {"the apply order has a cycle: A -> B -> A (each runs after the next), declared by the plugins "
        "\"a\", \"b\"@" + a}},
      {"cycle through a group",
       {{a, V3Manifest("python", {"network:dns:config"}, "network", "A", {"storage"})}},
       {"the apply order has a cycle: A -> storage -> network -> A (each runs after the next), declared by the "
        "plugins \"a\"@" + a}},
  };
  for (const auto& c : cases) {
    std::filesystem::remove_all(root.Path(kModules));
    for (const auto& [path, text] : c.manifests) Manifest(path, text);
    for (PluginType type : {APPLY, APPLY_BOOT}) {
      try {
        PluginManager m(type);
        ADD_FAILURE() << c.what;
      } catch (const ConfigManagerException& e) {
        EXPECT_EQ(e.GetErrorCode(), PluginDependencyGraphFailed) << c.what;
        ASSERT_NE(e.GetLocation(), nullptr) << c.what;
        EXPECT_EQ(e.GetLocation()->reason + "@" + e.GetLocation()->file,
                  c.faults.front().substr(0, c.faults.front().find('@')) + "@" + root.Path(kModules + a))
            << c.what;
      }
      std::vector<std::string> found;
      for (const auto& fault : CheckApplyOrder(type)) {
        found.push_back(fault.text + "@" + fault.manifests.front().substr(root.Path(kModules).size()));
      }
      EXPECT_EQ(found, c.faults) << c.what;
    }
    // Managers that never order apply operations do not care.
    EXPECT_EQ(ThrownBy([] { PluginManager m(IMPACT); }).code, 0) << c.what;
  }
}

TEST_F(PluginManagerTest, FindReturnsEveryOwnerAndKeepsOnlyPluginsOfTheKind) {
  Manifest("a/plugin.json",
           V3Manifest("python", {"network:dns:config"}, "network", "A", {}, R"(,"impact":{"supports":true})"));
  Manifest("b/plugin.json", V3Manifest("python", {"network:dns:config", "network:routes:static"}, "network", "B", {}));
  PluginManager apply(APPLY);
  const auto owners = apply.Find(ConfigStoreObjectId("network", "dns", "config", "ignored"));
  ASSERT_EQ(owners.size(), 2u);
  EXPECT_EQ((std::set<std::string>{owners[0]->GetId(), owners[1]->GetId()}), (std::set<std::string>{"a", "b"}));
  EXPECT_EQ(apply.List().size(), 3u);
  EXPECT_TRUE(apply.Find(ConfigStoreObjectId("storage", "nfs", "mounts")).empty());

  PluginManager impact(IMPACT);
  ASSERT_EQ(impact.GetPlugins().size(), 1u);
  EXPECT_EQ(impact.GetPlugins()[0]->GetId(), "a");
  EXPECT_TRUE(impact.Find(ConfigStoreObjectId("network", "routes", "static")).empty());
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
  ExpectChain(order, {"REMEDIATE:hox", "REMEDIATE:system:identity", "REMEDIATE:network", "REMEDIATE:storage",
                      "REMEDIATE:system:kernel"});
  ExpectChain(order, {"REMEDIATE:network", "SET:services:time:ntp"});
  ExpectChain(order, {"REMEDIATE:services:syslog", "REMEDIATE:quorlet"});
}

}  // namespace
}  // namespace hoxcm_test
