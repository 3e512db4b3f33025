// Shared setup of the workflow tests: plugins in a temporary root, run by a
// scripted runner for a task that records its events; and a small host of
// three keys in the store, with a change of each cost.
#pragma once

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include <hoxcm/config_store.h>

#include "plugins/plugin_fixture.h"
#include "support/fake_plugin_runner.h"
#include "support/json.h"
#include <hoxcm/operations.h>

namespace hoxcm_test {

class WorkflowTest : public PluginTest {
 protected:
  // "net 2": the plugin and the input count of each apply run.
  std::vector<std::string> Runs() const {
    std::vector<std::string> runs;
    for (const auto& call : runner_.calls) {
      if (call.kind == "APPLY") runs.push_back(call.pluginId + " " + std::to_string(call.inputs.size()));
    }
    return runs;
  }

  FakePluginRunner runner_;
  std::shared_ptr<RecordingTask> task_ = std::make_shared<RecordingTask>();
};

inline const std::string kSmallHost = R"({
  "system": {"kernel": {"boot_options": {"iommu": true, "hugepages": 2048, "console": "ttyS0"}}},
  "network": {"dns": {"config": {"servers": ["10.0.0.1"]}},
              "firewall": {"rules": [{"name": "ssh", "action": "allow", "protocol": "tcp"}]}}})";
inline std::string SmallHostWith(const std::string& from, const std::string& to) {
  return Replaced(kSmallHost, from, to);
}
// One change of each cost.
inline const std::string kFree = SmallHostWith("10.0.0.1", "10.0.0.2");
inline const std::string kMaintenance =
    SmallHostWith(R"("rules": [)", R"("rules": [{"name": "web", "action": "allow", "protocol": "tcp"},)");
inline const std::string kReboot = SmallHostWith("2048", "4096");

// The small host as the user configuration; the one key whose default must
// always have an item (NTP) is not installed.
class SmallHostTest : public WorkflowTest {
 protected:
  SmallHostTest() {
    std::filesystem::remove(root.Path(std::string(HoxPlatform::HostPaths::kSchemaDirectory) + "/services/time/ntp.json"));
    HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::User, Parse(kSmallHost));
  }
  static HoxConfigManager::ApplyHistoryRecord LastHistory() {
    const auto history = HoxConfigManager::GetApplyHistory();
    return history.empty() ? HoxConfigManager::ApplyHistoryRecord() : history.back();
  }
};

}  // namespace hoxcm_test
