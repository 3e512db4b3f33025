// Bootstrap, the boot-time run and the boot-apply record against a real
// store and real manifests, with scripted plugin runs (the reboot cycle in
// separate processes with real runners: tests/cli/hoxcfg_boot_test.cc).
#include <sys/stat.h>

#include <cstdlib>
#include <ctime>
#include <filesystem>

#include <hoxcm/boot.h>
#include <hoxcm/config_store.h>
#include <hoxcm/extraction.h>
#include <hoxcm/operations.h>

#include "support/log_capture.h"
#include "workflow/boot.h"
#include "workflow/workflow_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;
namespace HostPaths = HoxPlatform::HostPaths;

const std::string kWaiter(HostPaths::kAutodeployWaiterNotify);
const std::string kFirewall(HostPaths::kAutodeployFirewall);
constexpr const char* kWaiterText = "{ \"url\": \"http://10.0.0.9/notify\",\n  \"token\": 7 }\n";
// Line ends of both kinds and a tab: the file comes back byte for byte.
constexpr const char* kXml = "<?xml version=\"1.0\"?>\r\n<rules>\n\t<rule id=\"1\"/>\n</rules>";

class BootTest : public SmallHostTest {
 protected:
  BootTest() {
    // DNS and boot options are applied at boot; firewall rules are not.
    Manifest("net/plugin.json", V3Manifest("python", {"network:dns:config"}, "network", "REMEDIATE:net", {},
                                           R"(,"impact":{"supports":true})"));
    Manifest("fw/plugin.json", Replaced(V3Manifest("python", {"network:firewall:rules"}, "network", "REMEDIATE:fw", {}),
                                        "\"boot\":true", "\"boot\":false"));
    Manifest("kern/plugin.json",
             V3Manifest("python", {"system:kernel:boot_options"}, "system", "REMEDIATE:kern", {"REMEDIATE:net"}));
  }

  // Each case starts from the host as the fixture made it.
  void Reset(bool waiterFile, bool firewallFile) {
    runner_.calls.clear();
    runner_.apply.clear();
    runner_.impact.clear();
    runner_.during = nullptr;
    Document nothing(rapidjson::kObjectType);
    HoxConfigStore::SetDesiredUserConfig(nothing);
    HoxConfigStore::SetBootMode(HoxConfigStore::BOOTMODE_NORMAL);
    Store()->DeleteObject(AutodeployObjectId());
    std::filesystem::remove(root.Path(kWaiter));
    std::filesystem::remove(root.Path(kFirewall));
    if (waiterFile) root.WriteFile(kWaiter, kWaiterText);
    if (firewallFile) root.WriteFile(kFirewall, kXml);
  }
  int Bootstrap(const std::string& document) {
    root.WriteFile("/tmp/boot.json", document);
    return ApplyBootDocument(root.Path("/tmp/boot.json"), runner_);
  }
  static std::shared_ptr<HoxConfigStore::ConfigStore> Store() {
    return HoxConfigStore::ConfigStore::GetStore(HoxConfigStore::sGlobalNamespace);
  }
  static std::string Preserved(const char* name) {
    const auto object = Store()->GetObject(AutodeployObjectId());
    std::string value = "(none)";
    if (object) object->GetValue(name, &value);
    return value;
  }
  static std::string Staged() { return JsonToString(ExtractDesiredConfiguration()); }
  // Plugins that record what they applied, as the runners do.
  void RecordApplied() {
    runner_.during = [this](const FakePluginRunner::Call& call) {
      const auto result = runner_.apply.find(call.pluginId);
      if (call.kind != "APPLY" || (result != runner_.apply.end() && !result->second.id.empty())) return;
      std::vector<HoxConfigStore::UserConfigChange> changes;
      for (const DesiredConfigInput& input : call.inputs) {
        changes.push_back({input.action == "DELETE" ? "DELETE" : "SET", input.object->GetConfigStoreObjectId(),
                           input.object->Serialize()});
      }
      HoxConfigStore::ApplyUserConfigChanges(changes);
    };
  }
  static BootApplyErrorInfo Recorded() {
    BootApplyErrorInfo record;
    record.Deserialize(HoxConfigStore::getBootApplyRecord()["bootApplyRecord"].GetString());
    return record;
  }
  static std::vector<std::string> RestoreFailures() {
    std::vector<std::string> keys;
    for (const auto& f : HoxConfigStore::GetBootTimeRestoreFailures()) keys.push_back(f.component + "/" + f.group + "/" + f.key);
    return keys;
  }
};

TEST_F(BootTest, BootstrapAppliesAtOnceOrStagesWhatNeedsARebootAndStoresNothingWhenItFails) {
  const std::string kMissingKey = R"({"nowhere": {"to": {"be": {}}}})";
  struct Case {
    const char* what;
    std::string document;
    bool waiterFile, firewallFile;
    std::function<void(FakePluginRunner&)> script;
    int rc;
    const char* logLine;
    std::vector<std::string> runs;
    bool staged;  // the document, and both files moved into the store
  } cases[] = {
      {"no impact: applied at once", kFree, true, true, nullptr, 0, "Host boostrap with configuration successful.",
       {"net 1"}, false},
      {"maintenance mode: applied at once without asking for it", kMaintenance, true, true, nullptr, 0,
       "Remediating with host configuration document.", {"fw 1"}, false},
      {"reboot: staged", kReboot, true, true, nullptr, 0, "host must be rebooted for it to take effect", {}, true},
      {"reboot, only the JSON file", kReboot, true, false, nullptr, 1,
       "error=autodeploy.xml firewall config does not exists.", {}, false},
      {"reboot, no file", kReboot, false, false, nullptr, 1, "error=waiterNotify.json file does not exists.", {}, false},
      {"a key without schema", kMissingKey, true, true, nullptr, 1, "Failed to generate schema for boot document", {},
       false},
      {"a value the schema refuses", SmallHostWith(R"(["10.0.0.1"])", "5"), true, true, nullptr, 1,
       "Failed to validate boot configuration document", {}, false},
      {"an impact plugin fails", kFree, true, true,
       [](FakePluginRunner& r) { r.impact["net"].error = ErrorInfo("net.down", {"net"}, "down"); }, 1,
       "Failed to compute impact for host configuration document", {}, false},
      {"a plugin fails", kFree, true, true,
       [](FakePluginRunner& r) { r.apply["net"] = ErrorInfo("net.down", {"net"}, "down"); }, 1,
       "Failed to boostrap host with configuration.", {"net 1"}, false},
      {"not JSON", "{", true, true, nullptr, 1, "Failed to bootstrap host error=Failed to parse JSON String", {}, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    Reset(c.waiterFile, c.firewallFile);
    if (c.script) c.script(runner_);
    int rc = -1;
    const std::string log = LogOf("2", [&] { rc = Bootstrap(c.document); });
    EXPECT_EQ(rc, c.rc);
    EXPECT_NE(log.find(c.logLine), std::string::npos) << log;
    EXPECT_EQ(Runs(), c.runs);
    EXPECT_EQ(Staged() != "{}", c.staged);
    EXPECT_EQ(Preserved(kWaiterNotifyValue), c.staged ? R"({"url":"http://10.0.0.9/notify","token":7})" : "(none)");
    EXPECT_EQ(Preserved(kFirewallValue), c.staged ? kXml : "(none)");
    EXPECT_EQ(HoxConfigStore::GetBootMode(),
              c.staged ? HoxConfigStore::BOOTMODE_BOOTSTRAP : HoxConfigStore::BOOTMODE_NORMAL);
    // A bootstrap that failed leaves the files where they were.
    EXPECT_EQ(std::filesystem::exists(root.Path(kWaiter)), c.waiterFile && !c.staged);
    EXPECT_EQ(std::filesystem::exists(root.Path(kFirewall)), c.firewallFile && !c.staged);
  }
}

TEST_F(BootTest, TheNextBootRegeneratesThePreservedFilesOnceAndAppliesWhatWasStaged) {
  Reset(true, true);
  ASSERT_EQ(Bootstrap(kReboot), 0);
  RecordApplied();
  runner_.calls.clear();

  EXPECT_FALSE(ExecuteBootPlugins(runner_));
  EXPECT_EQ(root.ReadFile(kFirewall), kXml);
  struct stat st {};
  ASSERT_EQ(::stat(root.Path(kFirewall).c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 0777, 0600u);
  // Every staged item goes to a plugin that runs at boot; the firewall
  // plugin does not, and its rules were already in effect.
  EXPECT_EQ(Runs(), (std::vector<std::string>{"net 1", "kern 1"}));
  EXPECT_EQ(HoxConfigStore::GetBootMode(), HoxConfigStore::BOOTMODE_NORMAL);
  EXPECT_EQ(LastHistory().runs.size(), 2u);

  // The next boot has nothing to apply, and leaves no history.
  const std::size_t records = GetApplyHistory().size();
  runner_.calls.clear();
  EXPECT_FALSE(ExecuteBootPlugins(runner_));
  EXPECT_EQ(Runs(), std::vector<std::string>{});
  EXPECT_EQ(GetApplyHistory().size(), records);
}

TEST_F(BootTest, ABootRunRecordsEachFailureAndKeepsWhatItCouldNotUse) {
  struct Case {
    const char* what;
    std::function<void()> arrange;
    bool failed;
    const char* recordedId;
    std::vector<std::string> restoreFailures;
    bool consumed;     // staged configuration cleared, boot mode normal
    bool preserved;    // the auto-deployment files still in the store
    const char* history;
  } cases[] = {
      {"a plugin fails",
       [this] {
         runner_.apply["kern"] = ErrorInfo("kern.failed", {"kern"}, "no");
         ASSERT_EQ(Bootstrap(kReboot), 0);
       },
       true, "kern.failed", {"system/kernel/boot_options"}, true, false, "failed"},
      {"a staged key no boot-time plugin applies",
       [] {
         Document staged = Parse(kMaintenance);
         HoxConfigStore::SetDesiredUserConfig(staged);
       },
       false, "", {"network/firewall/rules"}, true, false, "applied"},
      {"a preserved file cannot be written",
       [this] {
         ASSERT_EQ(Bootstrap(kReboot), 0);
         std::filesystem::create_directories(root.Path(kFirewall));
       },
       true, kBootApplyFailed, {}, false, true, "error"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    Reset(true, true);
    c.arrange();
    RecordApplied();
    EXPECT_EQ(ExecuteBootPlugins(runner_), c.failed);
    EXPECT_EQ(Recorded().errorInfo.id, c.recordedId);
    EXPECT_EQ(RestoreFailures(), c.restoreFailures);
    EXPECT_EQ(Staged() == "{}", c.consumed);
    EXPECT_EQ(HoxConfigStore::GetBootMode() == HoxConfigStore::BOOTMODE_NORMAL, c.consumed);
    EXPECT_EQ(Preserved(kFirewallValue) == kXml, c.preserved);
    EXPECT_EQ(LastHistory().outcome, c.history);
    std::filesystem::remove_all(root.Path(kFirewall));
  }
}

TEST_F(BootTest, BootApplyInfoReportsTheRecordOnceTheBootIsComplete) {
  const std::time_t then = std::time(nullptr) - 3600;
  struct Case {
    bool complete;
    const char* recordedId;
    std::vector<HoxConfigStore::FailureRecord> failures;
    BootApplyStatus status;
    std::vector<std::string> errors;  // ids, with the arguments of restore failures
  } cases[] = {
      {false, "kern.failed", {{"a", "b", "c"}}, BOOT_APPLY_IN_PROGRESS, {}},
      {true, "", {}, BOOT_APPLY_SUCCEEDED, {}},
      {true, "kern.failed", {}, BOOT_APPLY_FAILED, {"kern.failed"}},
      {true, "", {{"a", "b", "c"}, {"d", "e", "f"}}, BOOT_APPLY_FAILED,
       {std::string(kBootRestoreFailed) + " a b c", std::string(kBootRestoreFailed) + " d e f"}},
      {true, "kern.failed", {{"a", "b", "c"}}, BOOT_APPLY_FAILED,
       {"kern.failed", std::string(kBootRestoreFailed) + " a b c"}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(std::string(c.recordedId) + " " + std::to_string(c.failures.size()));
    HoxConfigStore::SetBootComplete(c.complete);
    HoxConfigStore::setBootApplyRecord(BootApplyErrorInfo(then, ErrorInfo(c.recordedId, {"kern"})).Serialize());
    HoxConfigStore::ClearBootTimeRestoreFailures();
    for (const auto& f : c.failures) HoxConfigStore::AddBootTimeRestoreFailure(f);
    const BootApplyInfo info = GetBootApplyInfo();
    EXPECT_EQ(info.status, c.status);
    std::vector<std::string> errors;
    for (const BootApplyErrorInfo& e : info.errors) {
      std::string text = e.errorInfo.id;
      if (e.errorInfo.id == kBootRestoreFailed) {
        for (const std::string& arg : e.errorInfo.args) text += " " + arg;
        EXPECT_GE(e.time, then + 3600);  // stamped when asked
      } else {
        EXPECT_EQ(e.time, then);
      }
      errors.push_back(text);
    }
    EXPECT_EQ(errors, c.errors);
  }

  for (const char* damaged : {"", "{", "[]", R"({"time": "01-05-2024 10-00-00"})",
                              R"({"errorInfo": {"id": ""}, "time": "01-05-2024 10-00-00"})",
                              R"({"errorInfo": "{\"id\": \"\"}", "time": "2024-05-01 10:00:00"})",
                              R"({"errorInfo": "{", "time": "01-05-2024 10-00-00"})"}) {
    SCOPED_TRACE(damaged);
    HoxConfigStore::setBootApplyRecord(damaged);
    EXPECT_EQ(Failure([] { GetBootApplyInfo(); }), "2000 Invalid JSON");
  }
}

TEST_F(BootTest, TheRecordedTimeSurvivesARoundTripToTheSecondInLocalTime) {
  const char* previous = std::getenv("TZ");
  const std::string saved = previous ? previous : "";
  for (const char* zone : {"UTC0", "EST5EDT,M3.2.0,M11.1.0", "CET-1CEST,M3.5.0,M10.5.0/3"}) {
    ::setenv("TZ", zone, 1);
    ::tzset();
    for (const std::time_t t : {std::time(nullptr), std::time_t{1719835200} /* summer */, std::time_t{1704110400}}) {
      const BootApplyErrorInfo written(t, ErrorInfo("x.failed", {"a", "b"}, "why"));
      BootApplyErrorInfo read;
      read.Deserialize(written.Serialize());
      EXPECT_EQ(read.time, t) << zone;
      EXPECT_EQ(read.errorInfo, written.errorInfo);
    }
  }
  // The error as text, not as an object; the time as the boot records have it.
  ::setenv("TZ", "UTC0", 1);
  ::tzset();
  const Document text = Parse(BootApplyErrorInfo(1714557600, {}).Serialize());
  EXPECT_TRUE(text["errorInfo"].IsString());
  EXPECT_STREQ(text["time"].GetString(), "01-05-2024 10-00-00");
  previous ? ::setenv("TZ", saved.c_str(), 1) : ::unsetenv("TZ");
  ::tzset();
}

TEST_F(BootTest, SetSmartnicConfigurationReplacesTheDesiredDeviceConfiguration) {
  SetSmartnicConfiguration(R"({"dpu": {"ports": {"uplink": {"mtu": 9000}}}})");
  SetSmartnicConfiguration(R"({"dpu": {"ports": {"mgmt": {"mtu": 1500}}}})");
  const auto rows = HoxConfigStore::GetDesiredSmartnicConfiguration(HoxConfigStore::GetDBStore());
  ASSERT_EQ(rows.size(), 1u);
  EXPECT_EQ(rows[0]->at("Name"), "mgmt");
  EXPECT_EQ(ThrownBy([] { SetSmartnicConfiguration("{"); }).code, 2080);
  EXPECT_EQ(HoxConfigStore::GetDesiredSmartnicConfiguration(HoxConfigStore::GetDBStore()).size(), 1u);
}

}  // namespace
}  // namespace hoxcm_test
