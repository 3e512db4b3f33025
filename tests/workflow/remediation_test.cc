// Running a remediation plan with a scripted runner: order, progress,
// notifications, failures and aborts, without processes. The plugins are
// real (small manifests in a temporary root); their runs are not.
#include <algorithm>

#include "support/log_capture.h"
#include "workflow/remediation.h"
#include "workflow/workflow_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;

const std::string kStarted = "info com.tarvik.hox.settings.apply.plugin.started ";
const std::string kFinished = "info com.tarvik.hox.settings.apply.plugin.finished ";
constexpr const char* kAborted = "com.tarvik.hox.settings.apply.plugin.aborted";

std::string Progress(float value) { return "progress " + std::to_string(value); }

class RemediationTest : public WorkflowTest {
 protected:
  RemediationTest() {
    for (const char* id : {"a", "b", "c"}) {
      auto plugin = std::make_shared<Plugin>(
          Manifest(std::string(id) + "/plugin.json",
                   V3Manifest("python", {"network:dns:config"}, "network", std::string("REMEDIATE:") + id, {}))
              .c_str());
      plan_.groups.push_back({std::string("REMEDIATE:") + id, plugin, id, {Input(), Input()}});
    }
  }
  static DesiredConfigInput Input() { return {Object({"network", "dns", "config"}, "{}"), nullptr, "SET"}; }
  RemediationOutcome Run() { return RunRemediation(plan_, runner_, "ctx", task_); }

  RemediationPlan plan_;
};

TEST_F(RemediationTest, RunsEachGroupInOrderAndSharesEightyPercentAmongAllGroups) {
  // Given three groups of which the last never runs, the two that run
  // advance the progress by a third of 80 each.
  plan_.unscheduled.push_back(plan_.groups.back());
  plan_.groups.pop_back();
  plan_.groups[1].inputs.pop_back();
  RemediationOutcome outcome;
  const std::string log = LogOf("3", [&] { outcome = Run(); });

  EXPECT_EQ(outcome.error, ErrorInfo());
  const float step = 80.0f / 3;
  EXPECT_EQ(task_->Events(), (std::vector<std::string>{Progress(20), kStarted + "a", Progress(20 + step),
                                                        kFinished + "a", kStarted + "b", Progress(20 + step + step),
                                                        kFinished + "b"}));
  ASSERT_EQ(runner_.calls.size(), 2u);
  EXPECT_EQ(runner_.calls[1].inputs.size(), 1u);
  EXPECT_EQ(runner_.calls[1].context + " " + runner_.calls[1].taskId, "ctx task-1");
  ASSERT_EQ(outcome.runs.size(), 2u);
  EXPECT_EQ(outcome.runs[0].key + " " + outcome.runs[0].pluginId + " " + std::to_string(outcome.runs[0].inputCount) +
                " " + std::to_string(outcome.runs[1].inputCount),
            "REMEDIATE:a a 2 1");
  for (const char* line : {"detail: Found match for dependency REMEDIATE:a\n",
                           "detail: Found match for dependency REMEDIATE:b\n",
                           "detail: HOXi host remediated successfully.\n"}) {
    EXPECT_NE(log.find(line), std::string::npos) << line << log;
  }
}

TEST_F(RemediationTest, TheFirstFailingPluginStopsTheRunAndIsPosted) {
  const ErrorInfo failure("b.failed", {"b"}, "disk full");
  runner_.apply["b"] = failure;
  RemediationOutcome outcome;
  const std::string log = LogOf("0", [&] { outcome = Run(); });

  EXPECT_EQ(outcome.error, failure);
  EXPECT_EQ(runner_.CalledIds(), (std::vector<std::string>{"a", "b"}));
  const std::vector<std::string> events = task_->Events();
  EXPECT_EQ(std::vector<std::string>(events.end() - 2, events.end()),
            (std::vector<std::string>{kStarted + "b", "error b.failed b"}));
  ASSERT_EQ(outcome.runs.size(), 2u);
  EXPECT_EQ(outcome.runs[1].outcome, failure);
  EXPECT_NE(log.find("error: b plugin failed to execute.\n"), std::string::npos) << log;
}

TEST_F(RemediationTest, AnAbortIsSeenBeforeEachGroupAndAfterTheLastWhenTheOrderGoesOn) {
  struct Case {
    const char* abortDuring;  // "" aborts before the run
    bool checkAfterLast;
    std::vector<std::string> ran;
    bool aborted;
  } cases[] = {
      {"", false, {}, true},
      {"a", false, {"a"}, true},
      {"c", true, {"a", "b", "c"}, true},
      {"c", false, {"a", "b", "c"}, false},
  };
  for (const Case& c : cases) {
    runner_.calls.clear();
    task_->aborted = *c.abortDuring == '\0';
    runner_.during = [this, &c](const FakePluginRunner::Call& call) {
      if (call.pluginId == c.abortDuring) task_->aborted = true;
    };
    plan_.abortCheckAfterLast = c.checkAfterLast;
    const RemediationOutcome outcome = Run();
    EXPECT_EQ(runner_.CalledIds(), c.ran) << c.abortDuring;
    EXPECT_EQ(outcome.error, c.aborted ? ErrorInfo(kAborted, {}, "") : ErrorInfo()) << c.abortDuring;
  }
}

TEST_F(RemediationTest, RemediateHostPlansOverTheApplyRegistry) {
  // Given a plugin that cannot run at boot time beside one that can.
  Manifest("h/plugin.json", Replaced(V3Manifest("python", {"system:identity:hostname"}, "system", "REMEDIATE:h", {}),
                                     "\"boot\":true", "\"boot\":false"));
  Document boot;
  ParseDocument(R"({"network":{"dns":{"config":{"servers":[]}}},"system":{"identity":{"hostname":{}}}})", boot);
  EXPECT_EQ(RemediateHost(boot, "ctx", task_, true, runner_), ErrorInfo());
  std::vector<std::string> ran = runner_.CalledIds();
  std::sort(ran.begin(), ran.end());
  EXPECT_EQ(ran, (std::vector<std::string>{"a", "b", "c"}));

  // A document without tasks loads no plugin: a broken manifest stays unread.
  Manifest("broken/plugin.json", "{");
  runner_.calls.clear();
  Document empty;
  ParseDocument("{}", empty);
  EXPECT_EQ(RemediateHost(empty, "", task_, true, runner_), ErrorInfo());
  EXPECT_TRUE(runner_.calls.empty());
  EXPECT_ANY_THROW(RemediateHost(boot, "", task_, true, runner_));
}

// The same group and key under two components, each with its own plugin.
class RegistryOwnersTest : public WorkflowTest {
 protected:
  RegistryOwnersTest() {
    for (const std::string n : {"1", "2"}) {
      root.WriteFile(std::string(HoxPlatform::HostPaths::kSchemaDirectory) + "/storage_" + n + "/nfs/mounts.json",
                     R"({"formatVersion": 1, "multiInstance": false, "schema": {"type": "object"}})");
      Manifest("s" + n + "/plugin.json",
               V3Manifest("python", {"storage_" + n + ":nfs:mounts"}, "network", "REMEDIATE:s" + n, {}));
    }
  }
};

TEST_F(RegistryOwnersTest, OwnersFollowTheComponentAsWellAsTheKey) {
  // Looked up in turn, each object should get its component's owner, whether
  // detail lines are written or not.
  PluginManager registry(APPLY);
  for (const char* level : {"1", "3"}) {
    std::string owners;
    LogOf(level, [&] {
      const OwnerLookup lookup = RegistryOwners(registry);
      for (const char* component : {"storage_1", "storage_1", "storage_2", "storage_1", "network"}) {
        for (const PlanOwner& owner : lookup({component, "nfs", "mounts"})) owners += owner.id + " ";
        owners += "| ";
      }
    });
    EXPECT_EQ(owners, "s1 | s1 | s2 | s1 | | ") << level;
  }
}

}  // namespace
}  // namespace hoxcm_test
