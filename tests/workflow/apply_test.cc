// CheckApply and Apply against a host in a real store, with real manifests
// and scripted plugin runs: every verdict and failure case, the host lock
// and the apply history (real runners: tests/cli/hoxcfg_apply_test.cc).
#include <chrono>
#include <thread>

#include <hoxcm/config_store.h>
#include <hoxcm/extraction.h>

#include "support/log_capture.h"
#include "workflow/apply.h"
#include "workflow/apply_history.h"
#include "workflow/impact.h"
#include "workflow/workflow_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;

// The id of the ErrorInfo that `f` throws ("" when it throws none).
template <typename F>
std::string ThrownErrorId(F f) {
  try {
    f();
  } catch (const ErrorInfo& e) {
    return e.id;
  }
  return "";
}

class ApplyTest : public SmallHostTest {
 protected:
  ApplyTest() {
    // The network plugin also judges impact; the kernel plugin runs after it.
    Manifest("net/plugin.json", V3Manifest("python", {"network:dns:config", "network:firewall:rules"}, "network",
                                           "REMEDIATE:net", {}, R"(,"impact":{"supports":true})"));
    Manifest("kern/plugin.json",
             V3Manifest("python", {"system:kernel:boot_options"}, "system", "REMEDIATE:kern", {"REMEDIATE:net"}));
  }

  std::shared_ptr<CheckApplyResult> Check(const std::string& desired) {
    Document document = Parse(desired);
    return CheckApply(document, "ctx", task_, nullptr, runner_);
  }
  // A check result as CheckApply would have made it when the verdict was
  // `impact`.
  static std::shared_ptr<CheckApplyResult> Stale(IMPACT_TYPE impact, const std::string& desired) {
    return std::make_shared<CheckApplyResult>(impact, Parse(desired), QUICK_BOOT_NOT_SUPPORTED, "ctx");
  }
};

TEST_F(ApplyTest, CheckApplyFreezesTheVerdictWithACopyOfTheDocument) {
  EXPECT_EQ(Check(kSmallHost), nullptr);

  root.WriteFile(std::string(HoxPlatform::HostPaths::kHostFacts), R"({"quickBootSupported": true, "stmSupported": false})");
  Document desired = Parse(kMaintenance);
  const auto before = std::to_string(std::time(nullptr));
  const auto result = CheckApply(desired, "ctx", task_, nullptr, runner_);
  ASSERT_NE(result, nullptr);
  EXPECT_EQ(result->impact, IMPACT_MAINTENANCE_MODE_REQUIRED);
  EXPECT_EQ(JsonToString(result->document), JsonToString(Parse(kMaintenance)));
  EXPECT_NE(&result->document, &desired);
  EXPECT_EQ(result->operationContext, "ctx");
  EXPECT_GE(result->checkApplyId, before);
  EXPECT_EQ(result->quickBootStatus, QUICK_BOOT_SUPPORTED);

  // An impact plugin's failure is thrown as it is.
  runner_.impact["net"].error = ErrorInfo("net.failed", {"net"}, "no");
  EXPECT_EQ(ThrownErrorId([&] { Check(kFree); }), "net.failed");
}

TEST_F(ApplyTest, ApplyActsOnTheRecomputedVerdictOnlyWhenItStillHolds) {
  struct Case {
    const char* what;
    IMPACT_TYPE checked;
    const std::string& desired;
    bool maintenanceMode;
    // The outcome: "status N" or "throws CODE"; the runs; the log line.
    std::string outcome;
    std::vector<std::string> runs;
    const char* logLine;
    const char* recorded;
  } cases[] = {
      {"maintenance mode no longer needed: go on without it", IMPACT_MAINTENANCE_MODE_REQUIRED, kFree, false,
       "status 0", {"net 1"}, "continue. old_impact=1, new_impact=0", "applied"},
      {"a verdict that got heavier", IMPACT_NONE, kMaintenance, false, "throws 2025", {},
       "abort. old_impact=0, new_impact=1", "refused"},
      {"no verdict but a reboot is ever accepted", IMPACT_NONE, kReboot, false, "throws 2025", {},
       "abort. old_impact=0, new_impact=2", "refused"},
      {"a lighter verdict that still needs something", IMPACT_REBOOT_REQUIRED, kMaintenance, true, "throws 2025", {},
       "abort. old_impact=2, new_impact=1", "refused"},
      {"a reboot is staged, nothing runs", IMPACT_REBOOT_REQUIRED, kReboot, false, "status 1", {},
       "host must be rebooted for it to take effect.", "staged"},
      {"maintenance mode required and not entered", IMPACT_MAINTENANCE_MODE_REQUIRED, kMaintenance, false,
       "throws 2026", {}, "", "refused"},
      {"maintenance mode required and entered", IMPACT_MAINTENANCE_MODE_REQUIRED, kMaintenance, true, "status 2",
       {"net 1"}, "", "applied"},
      {"the drift went away meanwhile", IMPACT_MAINTENANCE_MODE_REQUIRED, kSmallHost, false, "status 0", {},
       "Drift reported by CheckApply() is resolved.", "nothing to do"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    runner_.calls.clear();
    HoxConfigStore::SetMaintenanceMode(c.maintenanceMode);
    HoxConfigStore::SetBootMode(HoxConfigStore::BOOTMODE_DESIRED_STAGED);
    const auto check = Stale(c.checked, c.desired);
    std::string outcome;
    const std::string log = LogOf("3", [&] {
      const Thrown thrown = ThrownBy([&] { outcome = "status " + std::to_string(Apply(check, task_, runner_).status); });
      if (thrown.code != 0) outcome = "throws " + std::to_string(thrown.code);
    });
    EXPECT_EQ(outcome, c.outcome);
    EXPECT_EQ(Runs(), c.runs);
    EXPECT_NE(log.find(c.logLine), std::string::npos) << log;
    EXPECT_EQ(LastHistory().outcome, c.recorded);
    // Remediation starts from the normal boot mode; a staged reboot keeps the
    // document for the next boot.
    EXPECT_EQ(HoxConfigStore::GetBootMode() == HoxConfigStore::BOOTMODE_NORMAL, !c.runs.empty());
    if (c.outcome == "status 1") {
      EXPECT_TRUE(ExtractDesiredConfiguration() == Parse(kReboot));
    }
  }
  EXPECT_EQ(ThrownBy([&] { Apply(nullptr, task_, runner_); }).code, 2024);
  EXPECT_EQ(LastHistory().outcome, "refused");
}

TEST_F(ApplyTest, TheImpactWalkYieldsTheTasksThatGenerateApplyTasksReturns) {
  // Given a change, an addition and a removal of instances, a reboot change
  // and a profile wrapper, Apply's single walk should hand the remediation
  // the very tasks of the separate call, in its order.
  const std::string text = Replaced(Replaced(kFree, "2048", "4096"),
                                    R"({"name": "ssh", "action": "allow", "protocol": "tcp"})",
                                    R"({"name": "web", "action": "allow"})");
  const std::string desiredText = R"({"profile": )" + text + "}";
  const auto Shown = [](const std::vector<DesiredConfigInput>& tasks) {
    std::vector<std::string> lines;
    for (const DesiredConfigInput& t : tasks) {
      lines.push_back(t.action + " " + t.object->GetConfigStoreObjectId().toString() + " " + t.object->Serialize() +
                      " " + (t.drift ? t.drift->Serialize() : "-"));
    }
    return lines;
  };
  Document reference = Parse(desiredText);
  const std::vector<std::string> expected = Shown(GenerateApplyTasks(reference));
  ASSERT_EQ(expected.size(), 4u);  // SET dns, SET kernel, ADD web, DELETE ssh

  Document desired = Parse(desiredText);
  ImpactResult impact;
  ImpactReasons reasons;
  std::vector<DesiredConfigInput> tasks;
  Impact(desired, "ctx", impact, task_, std::nullopt, &reasons, runner_, tasks);
  EXPECT_EQ(impact.impact, IMPACT_REBOOT_REQUIRED);
  EXPECT_EQ(Shown(tasks), expected);
}

TEST_F(ApplyTest, FailuresAndAbortsStopTheRunAndAreReturned) {
  HoxConfigStore::SetMaintenanceMode(true);
  const std::string netAndKern = R"({
    "system": {"kernel": {"boot_options": {"iommu": true, "hugepages": 2048, "console": "ttyS1"}}},
    "network": {"dns": {"config": {"servers": ["10.0.0.2"]}},
                "firewall": {"rules": [{"name": "web", "action": "allow"},
                                       {"name": "ssh", "action": "allow", "protocol": "tcp"}]}}})";
  const auto check = Check(netAndKern);
  ASSERT_NE(check, nullptr);
  ASSERT_EQ(check->impact, IMPACT_MAINTENANCE_MODE_REQUIRED);

  // Two tasks of the version-3 network plugin form one run; its failure
  // stops the run before the kernel plugin, and status 2 is not claimed.
  runner_.apply["net"] = ErrorInfo("net.failed", {"net"}, "link down");
  ApplyResult result = Apply(check, task_, runner_);
  EXPECT_EQ(result.status, APPLY_COMPLETED);
  EXPECT_EQ(result.errorInfo, runner_.apply["net"]);
  EXPECT_EQ(Runs(), std::vector<std::string>{"net 2"});
  ApplyHistoryRecord record = LastHistory();
  EXPECT_EQ(record.outcome, "failed");
  ASSERT_EQ(record.runs.size(), 1u);
  EXPECT_EQ(record.runs[0].key + " " + record.runs[0].outcome.id, "REMEDIATE:net net.failed");

  // An abort during the first run: the second never starts.
  runner_.apply.clear();
  runner_.calls.clear();
  runner_.during = [this](const FakePluginRunner::Call& call) {
    if (call.kind == "APPLY") task_->aborted = true;
  };
  result = Apply(check, task_, runner_);
  EXPECT_EQ(result.errorInfo.id, "com.tarvik.hox.settings.apply.plugin.aborted");
  EXPECT_EQ(Runs(), std::vector<std::string>{"net 2"});
  EXPECT_EQ(LastHistory().outcome, "aborted");

  // Both succeed: status 2, each run recorded with its inputs.
  task_->aborted = false;
  runner_.during = nullptr;
  runner_.calls.clear();
  result = Apply(check, task_, runner_);
  EXPECT_EQ(result.status, APPLY_COMPLETED_IN_MAINTENANCE_MODE);
  EXPECT_EQ(Runs(), (std::vector<std::string>{"net 2", "kern 1"}));
  record = LastHistory();
  EXPECT_EQ(record.outcome + " " + std::to_string(record.runs.size()) + " " + record.document,
            "applied 2 " + DocumentDigest(check->document));
  EXPECT_EQ(record.impact, IMPACT_MAINTENANCE_MODE_REQUIRED);
  ASSERT_FALSE(record.reasons.empty());
  EXPECT_EQ(record.reasons[0].id.key, "rules");
}

TEST_F(ApplyTest, AnApplyWaitsForTheHostThenJudgesWhatTheOtherChanged) {
  const auto check = Check(kFree);
  ASSERT_NE(check, nullptr);
  // Another apply holds the host: an abort ends the wait, without a run.
  auto other = LaunchingRunner::LockHost(HoxPlatform::HostRunLock::Waiting{});
  task_->aborted = true;
  EXPECT_EQ(Apply(check, task_, runner_).errorInfo.id, "com.tarvik.hox.settings.apply.plugin.aborted");
  Document desired = Parse(kFree);
  EXPECT_EQ(ThrownErrorId([&] { CheckApply(desired, "", task_, nullptr, runner_); }),
            "com.tarvik.hox.settings.impact.plugin.aborted");
  runner_.calls.clear();

  // Without an abort it waits, says so once, and judges the host the other
  // apply left: here it made the same change.
  const auto task = std::make_shared<RecordingTask>();
  std::thread apply([&] { EXPECT_EQ(Apply(check, task, runner_).status, APPLY_COMPLETED); });
  for (int i = 0; i < 500 && task->Events().empty(); ++i) std::this_thread::sleep_for(std::chrono::milliseconds(10));
  EXPECT_EQ(task->Events(), std::vector<std::string>{std::string("info ") + kApplyWaitingForHost});
  HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::User, Parse(kFree));
  other.reset();
  apply.join();
  EXPECT_TRUE(runner_.calls.empty());
  EXPECT_EQ(LastHistory().outcome, "nothing to do");
}

TEST_F(ApplyTest, HistoryRecordsReadBackAsWrittenBoundedAndDamagedOnesAreMarked) {
  // A record with every field, its verdict over the list bound.
  ImpactResult impact;
  impact.impact = IMPACT_REBOOT_REQUIRED;
  ImpactReasons reasons;
  for (std::size_t i = 0; i <= kApplyHistoryListLimit; ++i) {
    impact.impactInfo.push_back({"com.tarvik.settings.impact.info.set", {"c", "k" + std::to_string(i), "g"}});
    ImpactReason reason;
    reason.path = "/c/g/k";
    reason.oldValue = std::string(300, 'x');
    reasons.objects.push_back({{"c", "g", "k", "id"}, "SET", IMPACT_REBOOT_REQUIRED, {reason}});
  }
  reasons.objects[0].reasons.push_back({ImpactReason::Rule::kPlugin, IMPACT_REBOOT_REQUIRED, "", "", "", "p", "why"});
  ApplyHistoryRecord record;
  record.kind = "boot";
  record.document = DocumentDigest(Parse(kSmallHost));
  RecordVerdict(record, impact, reasons);
  record.runs = {{"REMEDIATE:net", "net", 2, ErrorInfo("net.failed", {"a"}, "m"), 0.25}};
  RecordResult(record, {APPLY_COMPLETED, ErrorInfo("net.failed", {"a"}, "m")}, false);
  RecordException(record, std::make_exception_ptr(InvalidImpact(2025, "stale")));
  EXPECT_EQ(record.statementsOmitted + record.reasonsOmitted, 2u);
  EXPECT_EQ(record.reasons[1].reasons[0].oldValue, std::string(256, 'x') + "...");

  for (int i = 0; i < 3; ++i) record.sequence = AppendApplyHistory(record, 2);
  HoxConfigStore::AppendApplyHistoryRow(R"({"kind":"apply"})", 4);
  HoxConfigStore::AppendApplyHistoryRow("{not json", 4);
  const std::vector<ApplyHistoryRecord> history = GetApplyHistory();
  ASSERT_EQ(history.size(), 4u);
  Document written, read;
  ApplyHistoryRecordToJson(record, written);
  ApplyHistoryRecordToJson(history[1], read);
  EXPECT_EQ(JsonToString(read), JsonToString(written));
  EXPECT_EQ(history[1].outcome + " " + std::to_string(history[1].errorCode), "refused 2025");
  EXPECT_EQ(history[2].outcome + history[3].outcome, "unreadableunreadable");
  EXPECT_EQ(history[3].sequence, 5);
}

}  // namespace
}  // namespace hoxcm_test
