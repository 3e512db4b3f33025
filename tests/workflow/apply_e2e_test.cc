// Apply end to end on the sample host, with the sample plugins in real
// runner processes: what a failed or aborted run leaves in the store. (The
// CLI tests apply, refuse and stage documents end to end.)
#include <algorithm>
#include <chrono>
#include <thread>

#include <hoxcm/config_store.h>
#include <hoxcm/extraction.h>
#include <hoxcm/operations.h>

#include "plugins/plugin_fixture.h"
#include "support/fake_plugin_runner.h"
#include "support/json.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;

class ApplyEndToEndTest : public PluginTest {
 protected:
  ApplyEndToEndTest() {
    root.InstallRunners();
    root.InstallSamplePlugins();
    HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::Default, SampleDocument("default-config.json"));
    HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::User, SampleDocument("user-config.json"));
  }
  // The host's configuration with the values at JSON pointers replaced.
  static Document Desired(const std::vector<std::pair<const char*, const char*>>& changes) {
    Document doc = ExtractCurrentConfiguration();
    for (const auto& [pointer, json] : changes) {
      rapidjson::Pointer(pointer).Set(doc, Value(Parse(json), doc.GetAllocator()));
    }
    return doc;
  }
  // The items a desired document would still change.
  static std::vector<std::string> LeftToDo(Document& desired) {
    std::vector<std::string> items;
    for (const DesiredConfigInput& task : GenerateApplyTasks(desired)) {
      items.push_back(task.object->GetConfigStoreObjectId().key);
    }
    return items;
  }
  static std::vector<std::string> RecordedRuns() {
    std::vector<std::string> runs;
    const std::vector<ApplyHistoryRecord> history = GetApplyHistory();
    for (const ApplyHistoryRun& run : history.back().runs) {
      runs.push_back(run.pluginId + (run.outcome.id.empty() ? "" : " " + run.outcome.id));
    }
    return runs;
  }
};

TEST_F(ApplyEndToEndTest, AFailedOrAbortedRunStopsTheRestAndKeepsWhatEarlierRunsApplied) {
  // The hostname runs first, the storage plugin (replaced here) next, the
  // kernel plugin after it.
  struct Case {
    const char* storagePlugin;
    bool abort;  // while the storage plugin runs
    const char* error;
  } cases[] = {
      {"def apply(request, host):\n    return {'id': 'storage.failed', 'args': [], 'message': 'array offline'}\n",
       false, "storage.failed"},
      {"import time\n\ndef apply(request, host):\n    time.sleep(30)\n", true,
       "com.tarvik.hox.settings.apply.plugin.aborted"},
  };
  int n = 0;
  for (const Case& c : cases) {
    SCOPED_TRACE(c.error);
    root.WriteFile(kModules + "storage/plugin.py", c.storagePlugin);
    const std::string hostname = "\"host-" + std::to_string(++n) + "\"";
    Document desired = Desired({{"/system/identity/hostname/hostname", hostname.c_str()},
                                {"/storage/nfs/mounts/0/readOnly", "false"},
                                {"/system/kernel/boot_options/console", R"("ttyS1")"}});
    const auto check = CheckApply(desired, "", TaskHandle::Dummy());
    ASSERT_NE(check, nullptr);
    auto task = std::make_shared<RecordingTask>();
    std::thread aborter([&task, &c] {
      const std::string started = "info com.tarvik.hox.settings.apply.plugin.started storage";
      for (int i = 0; c.abort && i < 1000; ++i) {
        const std::vector<std::string> events = task->Events();
        if (std::find(events.begin(), events.end(), started) != events.end()) break;
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
      }
      std::this_thread::sleep_for(std::chrono::milliseconds(200));
      task->aborted = c.abort;
    });
    const auto start = std::chrono::steady_clock::now();
    const ApplyResult result = Apply(check, task);
    aborter.join();
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(10));
    EXPECT_EQ(result.errorInfo.id, c.error);
    EXPECT_EQ(RecordedRuns(), (std::vector<std::string>{"system:identity", std::string("storage ") + c.error}));
    EXPECT_EQ(LeftToDo(desired), (std::vector<std::string>{"mounts", "boot_options"}));
  }
}

}  // namespace
}  // namespace hoxcm_test
