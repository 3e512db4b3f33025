// A reboot through the built tool on a sandbox copy of the sample host: one
// hoxcfg process bootstraps "before" the reboot, others stand for the boot
// service "after" it, with the real runners and sample plugins.
#include <gtest/gtest.h>

#include <signal.h>

#include <filesystem>
#include <fstream>
#include <string>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>

#include "support/run_hoxcfg.h"

namespace hoxcm_test {
namespace {

const std::string kWaiter = "/etc/tarvik/autodeploy/waiterNotify.json";
const std::string kFirewall = "/etc/tarvik/firewall/autodeploy.xml";
const std::string kKernelPlugin = "/usr/lib/tarvik/configmanager/apply_modules/system/kernel/plugin.py";

std::string DataFile(const std::string& path) {
  std::ifstream in(SourcePath("data/" + path), std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}
std::string SampleFile(const std::string& path) { return DataFile("sample-host" + path); }
const std::string kSampleKernelPlugin = DataFile("sample-plugins/system/kernel/plugin.py");

class HoxcfgBootTest : public HoxcfgTest {
 protected:
  void SetUp() override { InitSample(); }
  HoxcfgOutcome Run(const std::string& args) { return RunHoxcfg(root_, "--yes " + args); }
  // The sample host's export with the value at `pointer` (below "/profile")
  // replaced by `json`; by default a change that needs a reboot.
  std::string Document(const std::string& pointer = "/system/kernel/boot_options/hugepages",
                       const std::string& json = "4096") {
    return ExportWith(root_, "boot.json", {{pointer, json}});
  }
  bool Exists(const std::string& path) const { return std::filesystem::exists(root_.Path(path)); }
  std::string Staged() { return Run("show desired").out; }
  // The "status" of `boot status --json`, with the id of every error.
  std::string Status() {
    const HoxcfgOutcome o = Run("boot status --json");
    HoxConfigManager::Document doc;
    HoxConfigManager::ParseDocument(o.out, doc);
    std::string status = doc["status"].GetString();
    for (const auto& e : doc["errors"].GetArray()) status += std::string(" ") + e["id"].GetString();
    return status + " (" + std::to_string(o.exitCode) + ")";
  }
};

TEST_F(HoxcfgBootTest, ABootstrapThatNeedsARebootIsAppliedByTheNextBoot) {
  // Before the reboot: staged, both files moved into the store.
  RunSteps(root_, {{"--yes bootstrap " + Document(), 3, "reboot the host"}});
  EXPECT_FALSE(Exists(kWaiter));
  EXPECT_FALSE(Exists(kFirewall));
  EXPECT_TRUE(Has(Staged(), R"("hugepages": 4096)"));

  // After it: the boot service's two steps.
  RunSteps(root_, {{"--yes boot run", 0, ""}});
  EXPECT_EQ(Status(), "in progress (4)");
  EXPECT_EQ(Run("boot complete").exitCode, 0);
  EXPECT_EQ(Status(), "succeeded (0)");

  EXPECT_EQ(root_.ReadFile(kFirewall), SampleFile(kFirewall));  // byte for byte
  HoxConfigManager::Document waiter, sample;
  HoxConfigManager::ParseDocument(root_.ReadFile(kWaiter), waiter);
  HoxConfigManager::ParseDocument(SampleFile(kWaiter), sample);
  EXPECT_EQ(waiter, sample);
  EXPECT_TRUE(Has(root_.ReadFile("/etc/tarvik/boot-options.conf"), "hugepages=4096"));
  EXPECT_FALSE(Has(Staged(), "hugepages"));  // consumed
  RunSteps(root_, {{"plan " + root_.Path("/boot.json"), 0, "compliant"},
                   {"history --json", 0, R"("kind": "bootstrap")"},
                   {"history --json", 0, R"("kind": "boot")"}});

  // A later boot finds nothing preserved and leaves the files alone.
  std::filesystem::remove(root_.Path(kFirewall));
  EXPECT_EQ(Run("boot run").exitCode, 0);
  EXPECT_FALSE(Exists(kFirewall));
}

TEST_F(HoxcfgBootTest, AKilledBootRunLosesNothingAndTheNextBootAppliesTheStagedConfiguration) {
  ASSERT_EQ(Run("bootstrap " + Document()).exitCode, 3);
  root_.WriteFile(kKernelPlugin,
                  "import os, time\n\ndef apply(request, host):\n"
                  "    open(os.path.join(host.root, 'started'), 'w').close()\n    time.sleep(2)\n");
  const pid_t boot = StartHoxcfg(root_, "--yes boot run", "boot");
  // Killed while the slow plugin runs; its runner finishes on its own.
  ASSERT_TRUE(WaitFor(root_, "/started", ""));
  ::kill(boot, SIGKILL);
  ExitStatusOf(boot);

  EXPECT_EQ(root_.ReadFile(kFirewall), SampleFile(kFirewall));
  EXPECT_TRUE(Has(Staged(), R"("hugepages": 4096)"));
  root_.WriteFile(kKernelPlugin, kSampleKernelPlugin);
  EXPECT_EQ(Run("boot run").exitCode, 0);
  EXPECT_EQ(Run("boot complete").exitCode, 0);
  EXPECT_EQ(Status(), "succeeded (0)");
  EXPECT_TRUE(Has(root_.ReadFile("/etc/tarvik/boot-options.conf"), "hugepages=4096"));
}

TEST_F(HoxcfgBootTest, AFirstBootDocumentIsConsumedAndADamagedRecordReported) {
  // A first-boot document applied at once is renamed, so it runs once.
  RunSteps(root_, {{"--yes bootstrap --consume " + Document("/network/dns/config/servers", R"(["10.20.0.12"])"), 0, ""}});
  EXPECT_FALSE(Exists("/boot.json"));
  EXPECT_TRUE(Exists("/boot.json.applied"));

  // A damaged record is reported as such.
  HoxConfigStore::setBootApplyRecord("{");
  HoxConfigStore::SetBootComplete(true);
  RunSteps(root_, {{"boot status", 2, "the boot-apply record is damaged: error 2000"}});
}

}  // namespace
}  // namespace hoxcm_test
