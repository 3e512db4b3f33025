// One suite, run against both runners: the same plugin written for each
// interface must give the same results, failures included. Then the sample
// plugins, end to end.
#include <filesystem>

#include "plugins/plugin_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;
using HoxConfigStore::ConfigStoreObjectId;

const ConfigStoreObjectId kDns("network", "dns", "config");

std::shared_ptr<HoxConfigStore::ConfigStoreObject> Object(const ConfigStoreObjectId& id, const std::string& json) {
  Document value;
  ParseDocument(json, value);
  return std::make_shared<HoxConfigStore::ConfigStoreObject>(id, value);
}

std::string StoredUserConfig(const ConfigStoreObjectId& id) {
  return JsonToString(HoxConfigStore::GetCurrentConfigInternal(HoxConfigStore::GetDBStore(), id.component, id.group,
                                                               id.key));
}

class RunnerConformanceTest : public PluginTest, public ::testing::WithParamInterface<std::string> {
 protected:
  RunnerConformanceTest() {
    root.InstallRunners();
    const std::string dir = kModules + "conformance/";
    root.WriteFile(dir + "plugin.json",
                   V3Manifest(GetParam(), {"network:dns:config"}, "network", "REMEDIATE:conformance", {},
                              R"(,"impact":{"supports":true},"validation":{"supports":true})"));
    if (GetParam() == "c++") {
      std::filesystem::copy_file(BuildPath("tests/plugins/libconformance.so"), root.Path(dir + "libconformance.so"));
      moduleFile_ = root.Path(dir + "libconformance.so");
    } else {
      std::filesystem::copy_file(SourcePath("tests/plugins/conformance_plugin.py"), root.Path(dir + "plugin.py"));
      moduleFile_ = root.Path(dir + "plugin.py");
    }
    plugin_ = std::make_shared<Plugin>(root.Path(dir + "plugin.json").c_str());
  }

  ErrorInfo Apply(const std::vector<DesiredConfigInput>& inputs) {
    return plugin_->Apply(inputs, "", PluginMonitor::Dummy());
  }
  std::vector<DesiredConfigInput> Dns(const std::string& json, const std::string& action = "SET") {
    return {{Object(kDns, json), nullptr, action}};
  }

  std::shared_ptr<Plugin> plugin_;
  std::string moduleFile_;
};

TEST_P(RunnerConformanceTest, ASuccessfulApplyIsStoredInOneGo) {
  // Given an apply of one singleton and one new instance, the plugin runs
  // and the store then holds exactly what was applied.
  const ConfigStoreObjectId vnic("network", "interfaces", "vnic", "vnic1");
  std::vector<DesiredConfigInput> inputs = Dns(R"({"servers":["10.0.0.2"],"search":[]})");
  inputs.push_back({Object(vnic, R"({"name":"vnic1","portgroup":"pg","mtu":1500})"), nullptr, "ADD"});
  EXPECT_EQ(Apply(inputs), ErrorInfo());
  EXPECT_EQ(root.ReadFile("/applied"), "2\n");
  EXPECT_EQ(StoredUserConfig(kDns), R"({"servers":["10.0.0.2"],"search":[]})");
  EXPECT_NE(StoredUserConfig(vnic).find("vnic1"), std::string::npos);

  // Deletions are stored too.
  EXPECT_EQ(Apply({{Object(vnic, R"({"name":"vnic1"})"), nullptr, "DELETE"}}), ErrorInfo());
  EXPECT_EQ(StoredUserConfig(vnic).find("vnic1"), std::string::npos);
}

TEST_P(RunnerConformanceTest, PluginErrorsComeBackAsTheyWereReported) {
  EXPECT_EQ(Apply(Dns(R"({"behaviour":"fail"})")), ErrorInfo("conformance.failed", {"a1"}, "failed on purpose"));
  // Nothing of a failed apply reaches the store.
  EXPECT_EQ(StoredUserConfig(kDns).find("behaviour"), std::string::npos);
  EXPECT_EQ(plugin_->Impact(Dns(R"({"behaviour":"fail"})"), "", PluginMonitor::Dummy()).error.id,
            "conformance.failed");
}

TEST_P(RunnerConformanceTest, RunnerFailuresExitWithTheirErrorNumber) {
  const struct {
    const char* config;
    const char* status;
  } cases[] = {
      {R"({"behaviour":"throw"})", "status=State not recoverable"},
      {R"({"behaviour":"garbage"})", "status=Bad message"},
  };
  for (const auto& c : cases) {
    const ErrorInfo error = Apply(Dns(c.config));
    EXPECT_EQ(error.id, "com.tarvik.hox.settings.apply.plugin.unexpected.error") << c.config;
    EXPECT_NE(error.message.find(c.status), std::string::npos) << error.message;
  }
  std::filesystem::remove(moduleFile_);
  EXPECT_NE(Apply(Dns("{}")).message.find("status=Can not access a needed shared library"), std::string::npos);
}

TEST_P(RunnerConformanceTest, ImpactAndValidationResults) {
  const auto impact = plugin_->Impact(Dns(R"({"impact":2})"), "", PluginMonitor::Dummy());
  EXPECT_EQ(impact.error, ErrorInfo());
  ASSERT_EQ(impact.impacts.size(), 1u);
  EXPECT_EQ(impact.impacts[0].impact, 2);
  EXPECT_EQ(impact.impacts[0].key, "config");

  const auto validation =
      plugin_->Validate({Object(kDns, R"({"bad":true})"), Object(kDns, "{}")}, {}, "", PluginMonitor::Dummy());
  EXPECT_EQ(validation.error, ErrorInfo());
  ASSERT_EQ(validation.errors.size(), 1u);
  EXPECT_EQ(validation.errors[0].field, "/network/dns/config/bad");
  EXPECT_EQ(validation.errors[0].errors.at(0), ErrorInfo("conformance.bad", {"x"}, "bad"));
}

// Shared objects only: the interface version belongs to the C interface.
class SharedObjectRunnerTest : public RunnerConformanceTest {};

TEST_P(SharedObjectRunnerTest, RefusesSharedObjectsOfAnotherInterface) {
  const struct {
    const char* library;
    const char* status;
  } cases[] = {
      {"libwrongabi.so", "status=Protocol error"},
      {"libnodescribe.so", "status=Function not implemented"},
  };
  for (const auto& c : cases) {
    std::filesystem::copy_file(BuildPath(std::string("tests/plugins/") + c.library), moduleFile_,
                               std::filesystem::copy_options::overwrite_existing);
    const ErrorInfo error = Apply(Dns("{}"));
    EXPECT_EQ(error.id, "com.tarvik.hox.settings.apply.plugin.unexpected.error") << c.library;
    EXPECT_NE(error.message.find(c.status), std::string::npos) << error.message;
  }
}

INSTANTIATE_TEST_SUITE_P(BothRunners, RunnerConformanceTest, ::testing::Values("c++", "python"),
                         [](const auto& info) { return info.param == "c++" ? "Cpp" : "Python"; });
INSTANTIATE_TEST_SUITE_P(CppRunner, SharedObjectRunnerTest, ::testing::Values("c++"),
                         [](const auto&) { return "Cpp"; });

class SamplePluginsTest : public PluginTest {
 protected:
  SamplePluginsTest() {
    root.InstallRunners();
    root.InstallSamplePlugins();
  }
  std::shared_ptr<Plugin> Owner(PluginType type, const ConfigStoreObjectId& id) {
    PluginManager manager(type);
    const auto owners = manager.Find(id);
    EXPECT_EQ(owners.size(), 1u);
    return owners.empty() ? nullptr : owners[0];
  }
};

TEST_F(SamplePluginsTest, ApplyWritesTheHostFiles) {
  const struct {
    ConfigStoreObjectId id;
    std::string value;
    std::string file;
    std::string content;
  } cases[] = {
      {kDns, R"({"servers":["10.0.0.1","10.0.0.2"],"search":["example.org"]})", "/etc/resolv.conf",
       "# written by the network plugin\nsearch example.org\nnameserver 10.0.0.1\nnameserver 10.0.0.2\n"},
      {{"system", "identity", "hostname"}, R"({"hostname":"esx1","domain":"example.org"})", "/etc/hostname",
       "esx1.example.org\n"},
      {{"services", "time", "ntp"}, R"({"enabled":true,"servers":["ntp1"]})", "/etc/ntp.conf",
       "# written by the ntp plugin\nserver ntp1 iburst\n"},
  };
  for (const auto& c : cases) {
    const auto plugin = Owner(APPLY, c.id);
    ASSERT_TRUE(plugin);
    EXPECT_EQ(plugin->Apply({{Object(c.id, c.value), nullptr, "SET"}}, "", PluginMonitor::Dummy()), ErrorInfo());
    EXPECT_EQ(root.ReadFile(c.file), c.content);
  }
}

TEST_F(SamplePluginsTest, ImpactAndValidationVerdicts) {
  const ConfigStoreObjectId rule("network", "firewall", "rules", "ssh");
  const auto impact = Owner(IMPACT, rule)->Impact({{Object(rule, R"({"name":"ssh"})"), nullptr, "ADD"}}, "",
                                                  PluginMonitor::Dummy());
  ASSERT_EQ(impact.impacts.size(), 1u);
  EXPECT_EQ(impact.impacts[0].impact, 1);

  const auto dns = Owner(VALIDATE, kDns)->Validate({Object(kDns, R"({"servers":["10.0.0.1","fe80::1"]})")}, {}, "",
                                                   PluginMonitor::Dummy());
  ASSERT_EQ(dns.errors.size(), 1u);
  EXPECT_EQ(dns.errors[0].field, "/network/dns/config/servers/1");

  const ConfigStoreObjectId host("system", "identity", "hostname");
  const auto name = Owner(VALIDATE, host)->Validate({Object(host, R"({"hostname":"-bad_name"})")}, {}, "",
                                                    PluginMonitor::Dummy());
  ASSERT_EQ(name.errors.size(), 1u);
  EXPECT_EQ(name.errors[0].field, "/system/identity/hostname/hostname");
}

}  // namespace
}  // namespace hoxcm_test
