// The command-line conventions every hoxcfg command follows, driven through
// the built tool against real sandbox hosts.
#include <gtest/gtest.h>

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/host_documents.h>

#include "support/datagram_socket.h"
#include "support/run_hoxcfg.h"

namespace hoxcm_test {
namespace {

class HoxcfgCliTest : public ::testing::Test {
 protected:
  HoxcfgOutcome Run(const std::string& args) { return RunHoxcfg(root_, args); }
  void InitSample() { ASSERT_EQ(Run("init --sample").exitCode, 0); }
  // The sample host's export, changed: a user added, an NFS mount removed,
  // a CHAP secret changed.
  std::string ChangedDocument() {
    const std::string path = root_.Path("/changed.json");
    EXPECT_EQ(Run("export -o " + path).exitCode, 0);
    HoxConfigManager::Document doc;
    HoxConfigManager::ParseDocument(root_.ReadFile("/changed.json"), doc);
    auto& a = doc.GetAllocator();
    auto& profile = doc["profile"];
    HoxConfigManager::Document alice;
    HoxConfigManager::ParseDocument(R"({"name": "alice", "password": "pw-of-alice", "shell": "/bin/sh"})", alice);
    profile["security"]["accounts"]["users"].PushBack(rapidjson::Value(alice, a), a);
    profile["storage"]["nfs"]["mounts"].PopBack();
    profile["storage"]["iscsi"]["targets"][0]["chapSecret"].SetString("changed-secret", a);
    root_.WriteFile("/changed.json", HoxConfigManager::JsonToString(doc));
    return path;
  }
  TempRoot root_;
};

TEST_F(HoxcfgCliTest, FileProblemsNameTheFileTheReasonAndThePosition) {
  // Given unusable documents, stderr should say which file, what is wrong
  // and where, nothing should reach stdout, and the exit status is 2.
  InitSample();
  const std::string r = root_.path();
  root_.WriteFile("/broken.json", "{\n  \"a\" 1}");
  root_.WriteFile("/array.json", "[]");
  root_.WriteFile("/schema.json", R"({"type": "object", "properties": {}})");
  root_.WriteFile("/mistyped.json", R"({"network": {"dns": []}})");
  root_.WriteFile("/nameless.json", R"({"network": {"interfaces": {"vnic": [{"name": "vnic0"}, {"mtu": 1500}]}}})");
  const std::string wrongType = ": error 2000: Invalid JSON: a value has the wrong type; `hoxcfg schema-check --host` "
                                "on the document says which\n";
  const std::string parseFault = ":2:7: error 2080: Failed to parse JSON String: missing a colon after a name of object member\n";
  const struct {
    std::string args, err;
  } cases[] = {
      {"compliance " + r + "/broken.json", "hoxcfg: " + r + "/broken.json" + parseFault},
      {"drift - < " + r + "/broken.json", "hoxcfg: <stdin>" + parseFault},
      {"compliance " + r + "/missing.json", "hoxcfg: " + r + "/missing.json: No such file or directory\n"},
      {"drift " + r, "hoxcfg: " + r + ": not a regular file (a directory)\n"},
      {"compliance " + r + "/array.json", "hoxcfg: " + r + "/array.json: a configuration document is a JSON object, "
                                          "this is an array: its members are components, or one member \"profile\" "
                                          "holding them\n"},
      {"drift " + r + "/schema.json", "hoxcfg: " + r + "/schema.json: this is a JSON schema, not a configuration "
                                      "document: check a document against it with `hoxcfg schema-check SCHEMA "
                                      "DOCUMENT`\n"},
      {"compliance /dev/zero", "hoxcfg: /dev/zero: not a regular file (a character device)\n"},
      {"compliance " + r + "/mistyped.json", "hoxcfg: " + r + "/mistyped.json: /network/dns" + wrongType},
      {"drift " + r + "/nameless.json", "hoxcfg: " + r + "/nameless.json: /network/interfaces/vnic/1" + wrongType},
  };
  for (const auto& c : cases) {
    const HoxcfgOutcome o = Run(c.args);
    EXPECT_EQ(o.exitCode, 2) << c.args;
    EXPECT_EQ(o.out, "") << c.args;
    EXPECT_EQ(o.err, c.err) << c.args;
  }
}

TEST_F(HoxcfgCliTest, EveryHostCommandChecksTheRootAndTakesGlobalOptionsAnywhere) {
  // Given a root that holds no host, every command that needs one should
  // say so the same way, with --root after the command, and create nothing.
  const std::string empty = root_.Path("/nohost");
  root_.WriteFile("/nohost/doc.json", "{}");
  const std::string expected = "hoxcfg: no host at " + empty + ": run `hoxcfg init --root " + empty + "`\n";
  for (const std::string command :
       {"export", "show", "maintenance status", "maintenance enter --yes", "schemas", "plugins list", "plugins check",
        "compliance DOC", "drift DOC", "schema-check --host DOC", "plan DOC", "apply --yes DOC", "history"}) {
    std::string args = command;
    if (const auto at = args.find("DOC"); at != std::string::npos) args.replace(at, 3, empty + "/doc.json");
    const HoxcfgOutcome o = Run(args + " --root " + empty);
    EXPECT_EQ(o.exitCode, 2) << command;
    EXPECT_EQ(o.err, expected) << command;
    EXPECT_EQ(o.out, "") << command;
  }
  EXPECT_FALSE(HoxConfigManager::fileExists(empty + "/var/lib/tarvik/configstore/configstore.db"));
}

TEST_F(HoxcfgCliTest, UsageErrorsNameTheClosestCommandAndCarryNoCode) {
  const struct {
    const char* args;
    const char* err;
  } cases[] = {
      {"complaince x.json", "hoxcfg: unknown command 'complaince': did you mean 'compliance'?\n"},
      {"--json plugin list", "hoxcfg: unknown command 'plugin': did you mean 'plugins'?\n"},
      {"--root /x maintenance stauts", "hoxcfg: unknown command 'stauts' for 'hoxcfg maintenance': did you mean 'status'?\n"},
      {"frobnicate", "hoxcfg: unknown command 'frobnicate': run 'hoxcfg --help' for the commands\n"},
      {"schema-check", "hoxcfg schema-check: FILES is required: run 'hoxcfg schema-check --help'\n"},
      {"", "hoxcfg: a command is required: run 'hoxcfg --help'\n"},
  };
  for (const auto& c : cases) {
    const HoxcfgOutcome o = Run(c.args);
    EXPECT_EQ(o.exitCode, 2) << c.args;
    EXPECT_EQ(o.err, c.err) << c.args;
  }
  const HoxcfgOutcome version = Run("--version");
  EXPECT_EQ(version.exitCode, 0);
  EXPECT_EQ(version.out.rfind("hoxcfg ", 0), 0u) << version.out;
}

TEST_F(HoxcfgCliTest, MaintenanceModeIsScriptableConfirmedAndAudited) {
  // Given a host out of maintenance mode, status should answer with its exit
  // status, a change should need --yes without a terminal, and each change
  // (not a repeated one) should leave one line in the host's system log.
  InitSample();
  DatagramSocket log(root_, "/dev/log");
  EXPECT_EQ(Run("maintenance status").out, "maintenance mode: off\n");
  const HoxcfgOutcome quiet = Run("maintenance status -q");
  EXPECT_EQ(quiet.exitCode, 1);
  EXPECT_EQ(quiet.out, "");
  const HoxcfgOutcome refused = Run("maintenance enter");
  EXPECT_EQ(refused.exitCode, 2);
  EXPECT_EQ(refused.err,
            "hoxcfg: refusing to put the host into maintenance mode without a terminal to ask: pass --yes to confirm\n");
  EXPECT_EQ(Run("maintenance status").exitCode, 1);
  EXPECT_TRUE(log.Received().empty());

  const HoxcfgOutcome entered = Run("maintenance enter --yes");
  EXPECT_EQ(entered.exitCode, 0) << entered.err;
  EXPECT_EQ(entered.out, "maintenance mode: on\n");
  EXPECT_EQ(Run("-q maintenance status").exitCode, 0);
  const std::vector<std::string> lines = log.Received();
  ASSERT_EQ(lines.size(), 1u);
  EXPECT_EQ(lines[0].rfind("<85>", 0), 0u) << lines[0];  // authpriv.notice
  EXPECT_NE(lines[0].find(" hoxcfg["), std::string::npos) << lines[0];
  EXPECT_NE(lines[0].find("]: maintenance mode entered at root " + root_.path() + " by user "), std::string::npos)
      << lines[0];
  EXPECT_EQ(Run("maintenance enter -y").out, "maintenance mode: on (unchanged)\n");
  EXPECT_TRUE(log.Received().empty());
}

TEST_F(HoxcfgCliTest, DriftAndComplianceAnswerByExitStatusAndSpellItemsOneWay) {
  InitSample();
  const std::string same = root_.Path("/same.json");
  ASSERT_EQ(Run("export -o " + same).exitCode, 0);
  EXPECT_EQ(Run("drift " + same).exitCode, 0);
  EXPECT_EQ(Run("compliance " + same).out, "compliant\n");
  const std::string changed = ChangedDocument();
  const HoxcfgOutcome drift = Run("drift " + changed);
  EXPECT_EQ(drift.exitCode, 1);
  EXPECT_EQ(drift.out,
            "ACTION  ITEM\n"
            "ADD     /security/accounts/users[alice]\n"
            "SET     /storage/iscsi/targets[iqn.2024-03.com.example.san:array1]\n"
            "DELETE  /storage/nfs/mounts[templates]\n");
  EXPECT_EQ(Run("drift --boot " + changed).exitCode, 0);
  const HoxcfgOutcome compliance = Run("compliance " + changed);
  EXPECT_EQ(compliance.exitCode, 1);
  for (const char* item : {"\n  /security/accounts/users[alice]\n", "\n  /storage/nfs/mounts[templates]\n",
                           "\n  /storage/iscsi/targets[iqn.2024-03.com.example.san:array1]/chapSecret\n"}) {
    EXPECT_NE(compliance.out.find(item), std::string::npos) << item << compliance.out;
  }
  EXPECT_EQ(compliance.out.find("changed-secret"), std::string::npos);
  EXPECT_EQ(compliance.out.find("pw-of-alice"), std::string::npos);
}

TEST_F(HoxcfgCliTest, EveryCommandThatPrintsHasItsJsonShape) {
  // Given --json, each command should print one JSON object with the
  // members docs/cli.md documents; lists print JSON when not on a terminal.
  InitSample();
  const std::string doc = ChangedDocument();
  const struct {
    std::string args;
    std::vector<const char*> members;
  } cases[] = {
      {"init --sample --reset", {"root", "steps"}},
      {"maintenance status", {"maintenanceMode"}},
      {"maintenance exit", {"maintenanceMode", "changed"}},
      {"schemas", {"keys", "errors"}},
      {"plugins list", {"plugins", "order"}},
      {"plugins check", {"valid", "failures"}},
      {"compliance " + doc, {"ADDS", "DELETES", "SETS"}},
      {"compliance --events " + root_.Path("/events") + " " + doc, {"ADDS"}},
      {"drift " + doc, {"tasks"}},
      {"schema-check --host " + doc, {"valid", "findings"}},
      {"show user", {"profile"}},
      {"export", {"profile", "hostSpecific"}},
  };
  for (const auto& c : cases) {
    const HoxcfgOutcome o = Run("--json --compact " + c.args);
    ASSERT_LE(o.exitCode, 1) << c.args << ": " << o.err;
    EXPECT_EQ(o.out.find('\n'), o.out.size() - 1) << c.args << ": one line";
    HoxConfigManager::Document out;
    ASSERT_NO_THROW(HoxConfigManager::ParseDocument(o.out, out)) << c.args << ": " << o.out;
    for (const char* member : c.members) EXPECT_TRUE(out.HasMember(member)) << c.args << ": " << member;
  }
  EXPECT_EQ(root_.ReadFile("/events"), "{\"event\":\"progress\",\"percent\":100.0}\n");
  EXPECT_EQ(Run("plugins list").out.rfind("{\n  \"plugins\": [", 0), 0u);
  // An export written to a file is indented for editing, unless --compact.
  const std::string file = root_.Path("/export.json");
  ASSERT_EQ(Run("export --output " + file).exitCode, 0);
  const std::string indented = root_.ReadFile("/export.json");
  EXPECT_GT(std::count(indented.begin(), indented.end(), '\n'), 100);
  ASSERT_EQ(Run("export --compact --output " + file).exitCode, 0);
  const std::string compact = root_.ReadFile("/export.json");
  EXPECT_EQ(compact.find('\n'), compact.size() - 1);
}

TEST_F(HoxcfgCliTest, OnATerminalListsAreTablesProgressIsShownAndChangesAsk) {
  InitSample();
  const HoxcfgOutcome list = RunHoxcfgOnTerminal(root_, "plugins list");
  EXPECT_EQ(list.exitCode, 0);
  EXPECT_EQ(list.out.rfind("PLUGIN             VERSION  RUNNER  RUNS", 0), 0u) << list.out;
  EXPECT_NE(list.out.find("\r\napply order: REMEDIATE:hox -> "), std::string::npos) << list.out;
  const std::string same = root_.Path("/same.json");
  ASSERT_EQ(Run("export -o " + same).exitCode, 0);
  const HoxcfgOutcome compliance = RunHoxcfgOnTerminal(root_, "compliance " + same);
  EXPECT_NE(compliance.out.find("] 100%\r\033[Kcompliant\r\n"), std::string::npos) << compliance.out;

  const HoxcfgOutcome declined = RunHoxcfgOnTerminal(root_, "maintenance enter", "n\n");
  EXPECT_EQ(declined.exitCode, 2);
  EXPECT_NE(declined.out.find("hoxcfg will put the host into maintenance mode.\r\nProceed? [y/N] "), std::string::npos)
      << declined.out;
  EXPECT_NE(declined.out.find("hoxcfg: not confirmed: nothing was changed"), std::string::npos) << declined.out;
  EXPECT_EQ(Run("maintenance status").exitCode, 1);
  const HoxcfgOutcome accepted = RunHoxcfgOnTerminal(root_, "maintenance enter", "y\n");
  EXPECT_EQ(accepted.exitCode, 0) << accepted.out;
  EXPECT_EQ(Run("maintenance status").exitCode, 0);
}

TEST_F(HoxcfgCliTest, LibraryLogIsQuietUnlessAskedAndRunnersExplainThemselves) {
  InitSample();
  EXPECT_EQ(Run("show user").err, "");
  EXPECT_NE(Run("-v show user").err.find(" info: "), std::string::npos);
  ::setenv("HOX_LOG_LEVEL", "error", 1);
  EXPECT_NE(Run("show user").err.find(" error: "), std::string::npos);
  ::unsetenv("HOX_LOG_LEVEL");
  for (const char* runner : {"cpp_plugin_runner", "py_plugin_runner"}) {
    const std::string program = root_.Path(std::string("/usr/lib/tarvik/configmanager/bin/") + runner);
    const std::string out = root_.Path("/usage");
    EXPECT_EQ(std::system((program + " --help >" + out).c_str()), 0) << runner;
    EXPECT_EQ(root_.ReadFile("/usage").rfind(std::string("Usage: ") + runner, 0), 0u) << runner;
  }
}

TEST_F(HoxcfgCliTest, ValidateAndImpactAnswerWithExitStatusFindingsAndReasons) {
  // Given the sample host's export with its boot options changed, a rule
  // added and a vNIC's MTU below its minimum.
  InitSample();
  const std::string same = root_.Path("/same.json"), changed = root_.Path("/changed.json");
  ASSERT_EQ(Run("export -o " + same).exitCode, 0);
  std::string text = root_.ReadFile("/same.json");
  const auto replace = [&text](const std::string& from, const std::string& to) {
    text.replace(text.find(from), from.size(), to);
  };
  replace(R"("hugepages": 2048)", R"("hugepages": 4096)");
  replace(R"("rules": [)", R"("rules": [{"name": "web", "action": "allow", "protocol": "tcp"},)");
  replace(R"("mtu": 1500)", R"("mtu": 100)");
  root_.WriteFile("/changed.json", text);

  EXPECT_EQ(Run("impact " + same).exitCode, 0);
  EXPECT_EQ(Run("validate " + same).out, same + ": valid\n");
  const HoxcfgOutcome impact = Run("impact " + changed);
  EXPECT_EQ(impact.exitCode, 1);
  EXPECT_EQ(impact.err, "");  // no progress without a terminal
  for (const char* line : {"needs a reboot\n", "  /system/kernel/boot_options (SET): needs a reboot\n",
                           "/system/kernel/boot_options/hugepages: 2048 -> 4096", "plugin network: firewall rules"}) {
    EXPECT_NE(impact.out.find(line), std::string::npos) << line << impact.out;
  }
  HoxConfigManager::Document json;
  HoxConfigManager::ParseDocument(Run("--json impact " + changed).out, json);
  EXPECT_EQ(json["impact"].GetInt(), 2);
  EXPECT_EQ(json["reasons"].Size(), 3u);  // the boot options, the rule, the vNIC
  const HoxcfgOutcome terminal = RunHoxcfgOnTerminal(root_, "impact " + changed);
  EXPECT_NE(terminal.out.find("hoxcfg: impact: plugin network started"), std::string::npos) << terminal.out;

  const HoxcfgOutcome invalid = Run("validate " + changed);
  EXPECT_EQ(invalid.exitCode, 1);
  EXPECT_EQ(invalid.out, changed + ": /network/interfaces/vnic[vnic0]/mtu: must be at least 1280 "
                                   "[com.tarvik.hox.settings.validation.minimum: mtu, 1280]\n");
  EXPECT_EQ(Run("validate --no-schema " + changed).exitCode, 0);
}

}  // namespace
}  // namespace hoxcm_test
