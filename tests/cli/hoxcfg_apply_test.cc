// hoxcfg plan, apply and history through the built tool on a sandbox copy
// of the sample host: exit statuses, the JSON event stream, two applies at
// once, Ctrl-C on a terminal, and no secret in anything they show.
#include <gtest/gtest.h>

#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>
#include <vector>

#include <hoxcm/documents.h>

#include "support/run_hoxcfg.h"

namespace hoxcm_test {
namespace {

using HoxConfigManager::Document;

const std::string kModules = "/usr/lib/tarvik/configmanager/apply_modules/";

// A storage plugin that notes when each run starts and ends, and sleeps
// `seconds` in between.
std::string SlowStorage(double seconds) {
  return "import os, time\n\ndef apply(request, host):\n"
         "    with open(os.path.join(host.root, 'runs.log'), 'a') as f:\n"
         "        f.write('start %d\\n' % os.getppid())\n"
         "    time.sleep(" + std::to_string(seconds) + ")\n"
         "    with open(os.path.join(host.root, 'runs.log'), 'a') as f:\n"
         "        f.write('end %d\\n' % os.getppid())\n";
}

class HoxcfgApplyTest : public HoxcfgTest {
 protected:
  void SetUp() override { InitSample(); }
  // The "outcome" of every history record, in order.
  std::vector<std::string> Outcomes() {
    const HoxcfgOutcome o = Run("history --json");
    HoxConfigManager::Document doc;
    HoxConfigManager::ParseDocument(o.out, doc);
    std::vector<std::string> outcomes;
    for (const auto& record : doc["records"].GetArray()) outcomes.push_back(record["outcome"].GetString());
    return outcomes;
  }
};

TEST_F(HoxcfgApplyTest, PlanAndApplyAnswerWithTheDocumentedExitStatuses) {
  const std::string same = ExportWith(root_, "same.json");
  // DNS servers (the C++ network plugin) and NTP servers (a version-1 plugin);
  // each later document keeps the changes of those applied before it.
  using Change = std::pair<std::string, std::string>;
  const Change server{"/network/dns/config/servers", R"(["10.20.0.12"])"};
  const Change ntp{"/services/time/ntp/servers", R"(["ntp.example.org"])"};
  const Change web{"/network/firewall/rules/-", R"({"name":"web","action":"allow"})"};
  const std::string dns = ExportWith(root_, "dns.json", {server, ntp});
  const std::string rule = ExportWith(root_, "rule.json", {server, ntp, web});
  const std::string pages = ExportWith(root_, "pages.json", {server, ntp, web, {"/system/kernel/boot_options/hugepages", "4096"}});
  // Another DNS server (its plugin runs before the storage plugin, which fails).
  const std::string mount = ExportWith(root_, "mount.json", {{server.first, R"(["10.20.0.99"])"}, ntp, web,
                                                              {"/storage/nfs/mounts/0/readOnly", "false"}});
  RunSteps(root_, {
      {"plan " + same, 0, "compliant: the host already has"},
      {"plan " + dns, 1, "1. network  (REMEDIATE:network)\n      SET     /network/dns/config\n"},
      {"apply " + dns, 2, "refusing to apply " + dns + ": 2 plugin runs without a terminal"},
      {"apply --yes " + dns, 0, "applied " + dns + "\n"},
      {"plan " + dns, 0, "compliant"},
      {"apply --yes " + rule, 2, "error 2026: The host must be in maintenance mode for apply to proceed.: run "
                                 "`hoxcfg maintenance enter` first"},
      {"maintenance enter --yes", 0, ""},
      {"apply --yes " + rule, 0, "applied " + rule + " (in maintenance mode)"},
      {"apply --yes " + pages, 3, "staged for the next boot"},
  });
  root_.WriteFile(kModules + "storage/plugin.py",
                  "def apply(request, host):\n    return {'id': 'storage.failed', 'args': [], 'message': 'array offline'}\n");
  RunSteps(root_, {
      {"apply --yes " + mount, 1, "hoxcfg: failed: error storage.failed: array offline\n"},
      // What the network plugin applied before the failure is recorded.
      {"plan " + mount, 1, "plugin runs, in order:\n  1. storage  (REMEDIATE:storage)\n"},
  });
  EXPECT_TRUE(Has(root_.ReadFile("/etc/resolv.conf"), "nameserver 10.20.0.99"));
  EXPECT_EQ(root_.ReadFile("/etc/ntp.conf"), "# written by the ntp plugin\nserver ntp.example.org iburst\n");
  EXPECT_TRUE(Has(Run("show desired").out, R"("hugepages": 4096)"));
  EXPECT_EQ(Outcomes(), (std::vector<std::string>{"applied", "refused", "applied", "staged", "failed"}));
}

TEST_F(HoxcfgApplyTest, TwoAppliesAtOnceTakeTurnsAndTheSecondJudgesWhatTheFirstLeft) {
  root_.WriteFile(kModules + "storage/plugin.py", SlowStorage(1));
  // Both change the first mount; the second also the second mount and DNS.
  const std::string first = ExportWith(root_, "first.json", {{"/storage/nfs/mounts/0/readOnly", "false"}});
  const std::string second = ExportWith(root_, "second.json", {{"/storage/nfs/mounts/0/readOnly", "false"},
                                                      {"/storage/nfs/mounts/1/readOnly", "true"},
                                                      {"/network/dns/config/servers", R"(["10.20.0.12"])"}});
  const pid_t a = StartHoxcfg(root_, "apply --yes " + first, "a");
  ASSERT_TRUE(WaitFor(root_, "/runs.log", "start"));
  const pid_t b = StartHoxcfg(root_, "apply --yes " + second, "b");
  EXPECT_TRUE(WaitFor(root_, "/b.err", "hoxcfg: waiting for another apply to finish\n"));
  EXPECT_EQ(ExitStatusOf(a), 0) << root_.ReadFile("/a.err");
  EXPECT_EQ(ExitStatusOf(b), 0) << root_.ReadFile("/b.err");

  // The runs came one after the other; the second plan no longer held the
  // first mount, which the first apply had done.
  std::vector<std::string> order;
  for (const std::string& line : Lines(root_.ReadFile("/runs.log"))) order.push_back(line.substr(0, line.find(' ')));
  EXPECT_EQ(order, (std::vector<std::string>{"start", "end", "start", "end"}));
  EXPECT_FALSE(Has(root_.ReadFile("/b.out"), "/storage/nfs/mounts[iso-library]")) << root_.ReadFile("/b.out");
  EXPECT_EQ(Run("plan " + second).exitCode, 0);
  EXPECT_EQ(Outcomes(), (std::vector<std::string>{"applied", "applied"}));
}

TEST_F(HoxcfgApplyTest, InitReplacingTheHostWaitsForARunningApply) {
  root_.WriteFile(kModules + "storage/plugin.py", SlowStorage(1));
  const std::string mount = ExportWith(root_, "mount.json", {{"/storage/nfs/mounts/0/readOnly", "false"}});
  const pid_t apply = StartHoxcfg(root_, "apply --yes " + mount, "a");
  ASSERT_TRUE(WaitFor(root_, "/runs.log", "start"));
  const pid_t init = StartHoxcfg(root_, "init --reset --sample", "init");
  EXPECT_TRUE(WaitFor(root_, "/init.err", "hoxcfg: waiting for another apply to finish\n"));
  EXPECT_EQ(ExitStatusOf(apply), 0) << root_.ReadFile("/a.err");
  EXPECT_EQ(ExitStatusOf(init), 0) << root_.ReadFile("/init.err");
  // The apply ran to its end on the host it started with; the sample host
  // replaced it afterwards.
  EXPECT_EQ(Lines(root_.ReadFile("/runs.log")).size(), 2u);
  EXPECT_EQ(Run("plan " + mount).exitCode, 1);
}

TEST_F(HoxcfgApplyTest, OnATerminalItAsksShowsProgressAndCtrlCStopsTheRunningPlugin) {
  root_.WriteFile(kModules + "storage/plugin.py", SlowStorage(30));
  const std::string mount = ExportWith(root_, "mount.json", {{"/storage/nfs/mounts/0/readOnly", "false"}});
  const auto start = std::chrono::steady_clock::now();
  const HoxcfgOutcome o = RunHoxcfgOnTerminal(root_, "apply " + mount, "y\n", [this](int terminal) {
    ASSERT_TRUE(WaitFor(root_, "/runs.log", "start"));
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    for (int i = 0; i < 2; ++i) {
      ASSERT_EQ(::write(terminal, "\x03", 1), 1);
      std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
  });
  EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(20));
  EXPECT_EQ(o.exitCode, 130) << o.out;
  for (const char* shown : {"Proceed? [y/N]", "%  storage", "already stopping", "aborted: plugins that finished"}) {
    EXPECT_TRUE(Has(o.out, shown)) << shown << "\n" << o.out;
  }
  EXPECT_FALSE(Has(o.out, "KeyboardInterrupt")) << "the runner got the terminal's signal";
  EXPECT_FALSE(Has(root_.ReadFile("/runs.log"), "end"));
  EXPECT_EQ(Outcomes(), std::vector<std::string>{"aborted"});
}

TEST_F(HoxcfgApplyTest, NoSecretIsShownInThePlanTheProgressTheEventsTheHistoryOrTheLog) {
  const std::string secrets[] = {"new-root-password", "new-chap-secret"};
  const std::string password = ExportWith(root_, "password.json", {{"/security/accounts/users/0/password", "\"" + secrets[0] + "\""}});
  const std::string chap = ExportWith(root_, "chap.json", {{"/storage/iscsi/targets/0/chapSecret", "\"" + secrets[1] + "\""}});
  const HoxcfgOutcome outputs[] = {
      Run("plan -vv " + password), Run("plan --json " + chap),
      Run("apply --yes --json -vv " + password),
      RunHoxcfgOnTerminal(root_, "apply -vv " + chap, "y\n"),
      Run("history"), Run("history --json"),
  };
  for (const HoxcfgOutcome& o : outputs) {
    for (const std::string& secret : secrets) EXPECT_FALSE(Has(o.out + o.err, secret)) << o.out << o.err;
  }
  // With --json, standard output is one event per line, the result last.
  const std::string& stream = outputs[2].out;
  std::vector<std::string> events;
  for (const std::string& text : Lines(stream)) {
    HoxConfigManager::Document event;
    HoxConfigManager::ParseDocument(text, event);
    std::string line = event["event"].GetString();
    if (event.HasMember("id")) line += " " + std::string(event["id"].GetString()) + " " + event["args"][0].GetString();
    if (line != "progress") events.push_back(line);
  }
  EXPECT_EQ(events, (std::vector<std::string>{"plan", "info com.tarvik.hox.settings.apply.plugin.started security",
                                               "info com.tarvik.hox.settings.apply.plugin.finished security",
                                               "result"}));
  EXPECT_TRUE(Has(stream, R"({"event":"progress","percent":100.0})"));
  EXPECT_EQ(Outcomes(), (std::vector<std::string>{"applied", "applied"}));
}

}  // namespace
}  // namespace hoxcm_test
