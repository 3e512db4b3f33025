// One suite, run against both runners: the same plugin written for each
// interface must give the same results, failures included. (The sample
// plugins run end to end in the hoxcfg apply tests.)
#include <cerrno>

#include <hoxcm/host.h>

#include "platform/process/child_process.h"
#include "plugins/plugin_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;
using HoxConfigStore::ConfigStoreObjectId;

const ConfigStoreObjectId kDns("network", "dns", "config");
constexpr const char* kApplyUnexpected = "com.tarvik.hox.settings.apply.plugin.unexpected.error";

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
    moduleFile_ = root.Path(dir + (GetParam() == "c++" ? "libconformance.so" : "plugin.py"));
    std::filesystem::copy_file(GetParam() == "c++" ? BuildPath("tests/plugins/libconformance.so")
                                                   : SourcePath("tests/plugins/conformance_plugin.py"),
                               moduleFile_);
    plugin_ = std::make_shared<Plugin>(root.Path(dir + "plugin.json").c_str());
  }

  ErrorInfo Apply(const std::vector<DesiredConfigInput>& inputs) {
    return plugin_->Apply(inputs, "", PluginMonitor::Dummy());
  }
  std::vector<DesiredConfigInput> Dns(const std::string& json) { return {{Object(kDns, json), nullptr, "SET"}}; }

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

TEST_P(RunnerConformanceTest, FailuresComeBackAsReportedOrAsTheRunnersErrorNumber) {
  EXPECT_EQ(Apply(Dns(R"({"behaviour":"fail"})")), ErrorInfo("conformance.failed", {"a1"}, "failed on purpose"));
  // Nothing of a failed apply reaches the store.
  EXPECT_EQ(StoredUserConfig(kDns).find("behaviour"), std::string::npos);
  EXPECT_EQ(plugin_->Impact(Dns(R"({"behaviour":"fail"})"), "", PluginMonitor::Dummy()).error.id,
            "conformance.failed");

  // The module put in place of the plugin's ("" keeps it, "-" removes it),
  // the data, and the status text of the runner's exit.
  struct Case {
    std::string library, config, status;
  };
  std::vector<Case> all = {{"", R"({"behaviour":"throw"})", "status=State not recoverable"},
                           {"", R"({"behaviour":"garbage"})", "status=Bad message"}};
  // The interface version belongs to the C interface.
  if (GetParam() == "c++") {
    all.push_back({"libwrongabi.so", "{}", "status=Protocol error"});
    all.push_back({"libnodescribe.so", "{}", "status=Function not implemented"});
  }
  all.push_back({"-", "{}", "status=Can not access a needed shared library"});
  // What a crashing plugin had in hand stays out of the runner's messages.
  testing::internal::CaptureStderr();
  EXPECT_EQ(Apply(Dns(R"({"behaviour":"throw","secret":"hunter2-xyz"})")).id, kApplyUnexpected);
  const std::string stderrText = testing::internal::GetCapturedStderr();
  EXPECT_EQ(stderrText.find("hunter2-xyz"), std::string::npos) << stderrText;
  EXPECT_NE(stderrText.find("plugin"), std::string::npos) << stderrText;

  for (const Case& c : all) {
    if (c.library == "-") std::filesystem::remove(moduleFile_);
    if (c.library.size() > 1) {
      std::filesystem::copy_file(BuildPath("tests/plugins/" + c.library), moduleFile_,
                                 std::filesystem::copy_options::overwrite_existing);
    }
    const ErrorInfo error = Apply(Dns(c.config));
    EXPECT_EQ(error.id, kApplyUnexpected) << c.library << c.config;
    EXPECT_NE(error.message.find(c.status), std::string::npos) << error.message;
  }
}

TEST_P(RunnerConformanceTest, ImpactAndValidationResults) {
  const auto impact = plugin_->Impact(Dns(R"({"impact":2})"), "", PluginMonitor::Dummy());
  EXPECT_EQ(impact.error, ErrorInfo());
  ASSERT_EQ(impact.impacts.size(), 1u);
  EXPECT_EQ(impact.impacts[0].impact, 2);
  EXPECT_EQ(impact.impacts[0].key, "config");
  // A verdict that is not one of the three numbers is refused by the runner.
  for (const char* verdict : {"true", "1.0", "3"}) {
    const auto refused =
        plugin_->Impact(Dns(std::string(R"({"impact":)") + verdict + "}"), "", PluginMonitor::Dummy());
    EXPECT_EQ(refused.error.id, "com.tarvik.hox.settings.impact.plugin.unexpected.error");
    EXPECT_NE(refused.error.message.find("status=Bad message"), std::string::npos) << verdict << refused.error.message;
  }

  const auto validation =
      plugin_->Validate({Object(kDns, R"({"bad":true})"), Object(kDns, "{}")}, {}, "", PluginMonitor::Dummy());
  EXPECT_EQ(validation.error, ErrorInfo());
  ASSERT_EQ(validation.errors.size(), 1u);
  EXPECT_EQ(validation.errors[0].field, "/network/dns/config/bad");
  EXPECT_EQ(validation.errors[0].errors.at(0), ErrorInfo("conformance.bad", {"x"}, "bad"));
}

TEST_P(RunnerConformanceTest, ABadRequestEndsTheRunnerWithInvalidArgument) {
  namespace HostPaths = HoxPlatform::HostPaths;
  const std::string runner =
      root.Path(std::string(GetParam() == "c++" ? HostPaths::kCppRunner : HostPaths::kPythonRunner));
  const std::string requestFile(HostPaths::kRequestFile);
  const std::string module = R"(,"module":"libconformance.so")";
  for (const std::string& request :
       {std::string("-"), std::string("[]"), std::string("{\"type\":\"APPLY\""),
        R"({"type":["APPLY"],"key":"conformance")" + module + "}",
        R"({"type":"APPLY","key":"conformance/../../..")" + module + "}",
        R"({"type":"APPLY","key":7)" + module + "}"}) {
    std::filesystem::remove(root.Path(requestFile));
    if (request != "-") root.WriteFile(requestFile, request);
    int error = 0;
    HoxPlatform::ChildProcess child = HoxPlatform::ChildProcess::Spawn(runner, {runner}, &error);
    ASSERT_TRUE(child) << error;
    HoxPlatform::ExitStatus status;
    ASSERT_EQ(child.Wait(&status), 0);
    EXPECT_TRUE(!status.signalled && status.code == EINVAL) << request << " status " << status.code;
  }
}

INSTANTIATE_TEST_SUITE_P(BothRunners, RunnerConformanceTest, ::testing::Values("c++", "python"),
                         [](const auto& info) { return info.param == "c++" ? "Cpp" : "Python"; });

}  // namespace
}  // namespace hoxcm_test
