// hoxcfg plan, apply and history through the built tool on a sandbox copy
// of the sample host: exit statuses, the JSON event stream, two applies at
// once, Ctrl-C on a terminal, and no secret in anything they show.
#include <gtest/gtest.h>

#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include <hoxcm/documents.h>

#include "support/run_hoxcfg.h"

extern char** environ;

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

class HoxcfgApplyTest : public ::testing::Test {
 protected:
  HoxcfgApplyTest() { EXPECT_EQ(Run("init --sample").exitCode, 0); }
  HoxcfgOutcome Run(const std::string& args) { return RunHoxcfg(root_, args); }
  // The sample host's export with the values at JSON pointers (below
  // "/profile") replaced, written to `name` under the root; its path.
  std::string Changed(const std::string& name, const std::vector<std::pair<std::string, std::string>>& changes) {
    const std::string path = root_.Path("/" + name);
    EXPECT_EQ(Run("export -o " + path).exitCode, 0);
    HoxConfigManager::Document doc;
    HoxConfigManager::ParseDocument(root_.ReadFile("/" + name), doc);
    for (const auto& [pointer, json] : changes) {
      HoxConfigManager::Document value;
      HoxConfigManager::ParseDocument(json, value);
      rapidjson::Pointer(("/profile" + pointer).c_str()).Set(doc, rapidjson::Value(value, doc.GetAllocator()));
    }
    root_.WriteFile("/" + name, HoxConfigManager::JsonToString(doc));
    return path;
  }
  // The "outcome" of every history record, in order.
  std::vector<std::string> Outcomes() {
    const HoxcfgOutcome o = Run("history --json");
    HoxConfigManager::Document doc;
    HoxConfigManager::ParseDocument(o.out, doc);
    std::vector<std::string> outcomes;
    for (const auto& record : doc["records"].GetArray()) outcomes.push_back(record["outcome"].GetString());
    return outcomes;
  }

  TempRoot root_;
};

TEST_F(HoxcfgApplyTest, PlanAndApplyAnswerWithTheDocumentedExitStatuses) {
  const std::string same = Changed("same.json", {});
  // DNS servers (the C++ network plugin) and NTP servers (a version-1 plugin).
  const std::pair<std::string, std::string> server{"/network/dns/config/servers", R"(["10.20.0.12"])"};
  const std::string dns = Changed("dns.json", {server, {"/services/time/ntp/servers", R"(["ntp.example.org"])"}});
  // Each later document keeps the changes of those applied before it.
  const std::pair<std::string, std::string> ntp{"/services/time/ntp/servers", R"(["ntp.example.org"])"};
  const std::pair<std::string, std::string> web{"/network/firewall/rules/-", R"({"name":"web","action":"allow"})"};
  const std::string rule = Changed("rule.json", {server, ntp, web});
  const std::string pages = Changed("pages.json", {server, ntp, web, {"/system/kernel/boot_options/hugepages", "4096"}});
  // Another DNS server (its plugin runs before the storage plugin, which fails).
  const std::string mount = Changed("mount.json", {{"/network/dns/config/servers", R"(["10.20.0.99"])"}, ntp, web,
                                                  {"/storage/nfs/mounts/0/readOnly", "false"}});
  const struct {
    std::string args;
    int exitCode;
    std::string says;  // in stdout or stderr
  } steps[] = {
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
      {"FAIL apply --yes " + mount, 1, "hoxcfg: failed: error storage.failed: array offline\n"},
      // What the network plugin applied before the failure is recorded.
      {"plan " + mount, 1, "plugin runs, in order:\n  1. storage  (REMEDIATE:storage)\n"},
  };
  for (const auto& step : steps) {
    std::string args = step.args;
    if (args.rfind("FAIL ", 0) == 0) {
      args = args.substr(5);
      root_.WriteFile(kModules + "storage/plugin.py",
                      "def apply(request, host):\n    return {'id': 'storage.failed', 'args': [], "
                      "'message': 'array offline'}\n");
    }
    const HoxcfgOutcome o = Run(args);
    EXPECT_EQ(o.exitCode, step.exitCode) << args << "\n" << o.out << o.err;
    EXPECT_NE((o.out + o.err).find(step.says), std::string::npos) << args << "\n" << o.out << o.err;
  }
  EXPECT_NE(root_.ReadFile("/etc/resolv.conf").find("nameserver 10.20.0.99"), std::string::npos);
  EXPECT_EQ(root_.ReadFile("/etc/ntp.conf"), "# written by the ntp plugin\nserver ntp.example.org iburst\n");
  EXPECT_NE(Run("show desired").out.find(R"("hugepages": 4096)"), std::string::npos);
  EXPECT_EQ(Outcomes(), (std::vector<std::string>{"applied", "refused", "applied", "staged", "failed"}));
}

// Starts hoxcfg with `args` in the background, its output in files under
// the root named after `name`.
pid_t Start(const TempRoot& root, const std::string& args, const std::string& name) {
  const std::string command = "HOX_ROOT=" + root.path() + " " + BuildPath("tools/hoxcfg") + " " + args + " >" +
                              root.Path("/" + name + ".out") + " 2>" + root.Path("/" + name + ".err");
  const char* argv[] = {"/bin/sh", "-c", command.c_str(), nullptr};
  pid_t pid = -1;
  EXPECT_EQ(posix_spawn(&pid, "/bin/sh", nullptr, nullptr, const_cast<char**>(argv), environ), 0);
  return pid;
}
int ExitCodeOf(pid_t pid) {
  int status = 0;
  ::waitpid(pid, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}
// Waits (at most 20 s) until the file under the root holds `text`.
bool WaitFor(const TempRoot& root, const std::string& file, const std::string& text) {
  for (int i = 0; i < 2000; ++i) {
    if (std::filesystem::exists(root.Path(file)) && root.ReadFile(file).find(text) != std::string::npos) return true;
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  return false;
}

TEST_F(HoxcfgApplyTest, TwoAppliesAtOnceTakeTurnsAndTheSecondJudgesWhatTheFirstLeft) {
  root_.WriteFile(kModules + "storage/plugin.py", SlowStorage(1));
  // Both change the first mount; the second also the second mount and DNS.
  const std::string first = Changed("first.json", {{"/storage/nfs/mounts/0/readOnly", "false"}});
  const std::string second = Changed("second.json", {{"/storage/nfs/mounts/0/readOnly", "false"},
                                                      {"/storage/nfs/mounts/1/readOnly", "true"},
                                                      {"/network/dns/config/servers", R"(["10.20.0.12"])"}});
  const pid_t a = Start(root_, "apply --yes " + first, "a");
  ASSERT_TRUE(WaitFor(root_, "/runs.log", "start"));
  const pid_t b = Start(root_, "apply --yes " + second, "b");
  EXPECT_TRUE(WaitFor(root_, "/b.err", "hoxcfg: waiting for another apply to finish\n"));
  EXPECT_EQ(ExitCodeOf(a), 0) << root_.ReadFile("/a.err");
  EXPECT_EQ(ExitCodeOf(b), 0) << root_.ReadFile("/b.err");

  // The runs came one after the other; the second plan no longer held the
  // first mount, which the first apply had done.
  const std::string runs = root_.ReadFile("/runs.log");
  std::vector<std::string> order;
  for (std::size_t at = 0, end; (end = runs.find('\n', at)) != std::string::npos; at = end + 1) {
    order.push_back(runs.substr(at, runs.find(' ', at) - at));
  }
  EXPECT_EQ(order, (std::vector<std::string>{"start", "end", "start", "end"})) << runs;
  EXPECT_EQ(root_.ReadFile("/b.out").find("/storage/nfs/mounts[iso-library]"), std::string::npos)
      << root_.ReadFile("/b.out");
  EXPECT_EQ(Run("plan " + second).exitCode, 0);
  EXPECT_EQ(Outcomes(), (std::vector<std::string>{"applied", "applied"}));
}

TEST_F(HoxcfgApplyTest, OnATerminalItAsksShowsProgressAndCtrlCStopsTheRunningPlugin) {
  root_.WriteFile(kModules + "storage/plugin.py", SlowStorage(30));
  const std::string mount = Changed("mount.json", {{"/storage/nfs/mounts/0/readOnly", "false"}});
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
    EXPECT_NE(o.out.find(shown), std::string::npos) << shown << "\n" << o.out;
  }
  EXPECT_EQ(o.out.find("KeyboardInterrupt"), std::string::npos) << "the runner got the terminal's signal";
  EXPECT_EQ(root_.ReadFile("/runs.log").find("end"), std::string::npos);
  EXPECT_EQ(Outcomes(), std::vector<std::string>{"aborted"});
}

TEST_F(HoxcfgApplyTest, NoSecretIsShownInThePlanTheProgressTheEventsTheHistoryOrTheLog) {
  const std::string secrets[] = {"new-root-password", "new-chap-secret"};
  const std::string password = Changed("password.json", {{"/security/accounts/users/0/password", "\"" + secrets[0] + "\""}});
  const std::string chap = Changed("chap.json", {{"/storage/iscsi/targets/0/chapSecret", "\"" + secrets[1] + "\""}});
  const HoxcfgOutcome outputs[] = {
      Run("plan -vv " + password), Run("plan --json " + chap),
      Run("apply --yes --json -vv " + password),
      RunHoxcfgOnTerminal(root_, "apply -vv " + chap, "y\n"),
      Run("history"), Run("history --json"),
  };
  for (const HoxcfgOutcome& o : outputs) {
    for (const std::string& secret : secrets) {
      EXPECT_EQ((o.out + o.err).find(secret), std::string::npos) << o.out << o.err;
    }
  }
  // With --json, standard output is one event per line, the result last.
  const std::string& stream = outputs[2].out;
  std::vector<std::string> events;
  for (std::size_t at = 0, end; (end = stream.find('\n', at)) != std::string::npos; at = end + 1) {
    HoxConfigManager::Document event;
    HoxConfigManager::ParseDocument(stream.substr(at, end - at), event);
    std::string line = event["event"].GetString();
    if (event.HasMember("id")) line += " " + std::string(event["id"].GetString()) + " " + event["args"][0].GetString();
    if (line != "progress") events.push_back(line);
  }
  EXPECT_EQ(events, (std::vector<std::string>{"plan", "info com.tarvik.hox.settings.apply.plugin.started security",
                                               "info com.tarvik.hox.settings.apply.plugin.finished security",
                                               "result"}));
  EXPECT_NE(stream.find(R"({"event":"progress","percent":100.0})"), std::string::npos);
  EXPECT_EQ(Outcomes(), (std::vector<std::string>{"applied", "applied"}));
}

}  // namespace
}  // namespace hoxcm_test
