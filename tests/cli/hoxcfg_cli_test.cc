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

class HoxcfgCliTest : public HoxcfgTest {
 protected:
  // The sample host's export, changed: a user added, an NFS mount removed,
  // a CHAP secret changed.
  std::string ChangedDocument() {
    return ExportWith(root_, "changed.json",
                      {{"/security/accounts/users/-", R"({"name": "alice", "password": "pw-of-alice", "shell": "/bin/sh"})"},
                       {"/storage/nfs/mounts/1", ""},
                       {"/storage/iscsi/targets/0/chapSecret", R"("changed-secret")"}});
  }
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
  RunSteps(root_, {{"maintenance status", 1, "maintenance mode: off\n"},
                   {"maintenance enter", 2, "hoxcfg: refusing to put the host into maintenance mode without a "
                                            "terminal to ask: pass --yes to confirm\n"},
                   {"maintenance status", 1, "off"}});
  EXPECT_EQ(Run("maintenance status -q").out, "");
  EXPECT_TRUE(log.Received().empty());

  RunSteps(root_, {{"maintenance enter --yes", 0, "maintenance mode: on\n"}, {"-q maintenance status", 0, ""}});
  const std::vector<std::string> lines = log.Received();
  ASSERT_EQ(lines.size(), 1u);
  EXPECT_EQ(lines[0].rfind("<85>", 0), 0u) << lines[0];  // authpriv.notice
  EXPECT_TRUE(Has(lines[0], " hoxcfg[")) << lines[0];
  EXPECT_TRUE(Has(lines[0], "]: maintenance mode entered at root " + root_.path() + " by user ")) << lines[0];
  EXPECT_EQ(Run("maintenance enter -y").out, "maintenance mode: on (unchanged)\n");
  EXPECT_TRUE(log.Received().empty());
}

TEST_F(HoxcfgCliTest, DriftAndComplianceAnswerByExitStatusAndSpellItemsOneWay) {
  InitSample();
  const std::string same = ExportWith(root_, "same.json"), changed = ChangedDocument();
  RunSteps(root_, {{"drift " + same, 0, ""},
                   {"compliance " + same, 0, "compliant\n"},
                   {"drift " + changed, 1,
                    "ACTION  ITEM\n"
                    "ADD     /security/accounts/users[alice]\n"
                    "SET     /storage/iscsi/targets[iqn.2024-03.com.example.san:array1]\n"
                    "DELETE  /storage/nfs/mounts[templates]\n"},
                   {"drift --boot " + changed, 0, ""}});
  const HoxcfgOutcome compliance = Run("compliance " + changed);
  EXPECT_EQ(compliance.exitCode, 1);
  for (const char* item : {"\n  /security/accounts/users[alice]\n", "\n  /storage/nfs/mounts[templates]\n",
                           "\n  /storage/iscsi/targets[iqn.2024-03.com.example.san:array1]/chapSecret\n"}) {
    EXPECT_TRUE(Has(compliance.out, item)) << item << compliance.out;
  }
  EXPECT_FALSE(Has(compliance.out, "changed-secret") || Has(compliance.out, "pw-of-alice")) << compliance.out;
}

TEST_F(HoxcfgCliTest, JsonOutputIsOneObjectOnOneLineWhenCompact) {
  // Given --json --compact, each command should print one JSON object on one
  // line (the members of each: docs_and_help_pages_test.py).
  InitSample();
  const std::string doc = ChangedDocument();
  for (const std::string& args : std::vector<std::string>{"init --sample --reset", "maintenance status", "maintenance exit", "schemas", "plugins list", "plugins check",
        "compliance " + doc, "compliance --events " + root_.Path("/events") + " " + doc, "drift " + doc,
        "schema-check --host " + doc, "show user", "export"}) {
    const HoxcfgOutcome o = Run("--json --compact " + args);
    ASSERT_LE(o.exitCode, 1) << args << ": " << o.err;
    EXPECT_EQ(o.out.find('\n'), o.out.size() - 1) << args << ": one line";
    HoxConfigManager::Document out;
    ASSERT_NO_THROW(HoxConfigManager::ParseDocument(o.out, out)) << args << ": " << o.out;
    EXPECT_TRUE(args != "export" || (out.HasMember("profile") && out.HasMember("hostSpecific"))) << o.out;
  }
  EXPECT_EQ(root_.ReadFile("/events"), "{\"event\":\"progress\",\"percent\":100.0}\n");
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
  EXPECT_TRUE(Has(list.out, "\r\napply order: REMEDIATE:hox -> ")) << list.out;
  const HoxcfgOutcome compliance = RunHoxcfgOnTerminal(root_, "compliance " + ExportWith(root_, "same.json"));
  EXPECT_TRUE(Has(compliance.out, "] 100%\r\033[Kcompliant\r\n")) << compliance.out;

  const HoxcfgOutcome declined = RunHoxcfgOnTerminal(root_, "maintenance enter", "n\n");
  EXPECT_EQ(declined.exitCode, 2);
  EXPECT_TRUE(Has(declined.out, "hoxcfg will put the host into maintenance mode.\r\nProceed? [y/N] ")) << declined.out;
  EXPECT_TRUE(Has(declined.out, "hoxcfg: not confirmed: nothing was changed")) << declined.out;
  EXPECT_EQ(Run("maintenance status").exitCode, 1);
  EXPECT_EQ(RunHoxcfgOnTerminal(root_, "maintenance enter", "y\n").exitCode, 0);
  EXPECT_EQ(Run("maintenance status").exitCode, 0);
}

TEST_F(HoxcfgCliTest, LibraryLogIsQuietUnlessAskedAndRunnersExplainThemselves) {
  InitSample();
  EXPECT_EQ(Run("show user").err, "");
  EXPECT_TRUE(Has(Run("-v show user").err, " info: "));
  ::setenv("HOX_LOG_LEVEL", "error", 1);
  EXPECT_TRUE(Has(Run("show user").err, " error: "));
  ::unsetenv("HOX_LOG_LEVEL");
  for (const std::string runner : {"cpp_plugin_runner", "py_plugin_runner"}) {
    const std::string program = root_.Path("/usr/lib/tarvik/configmanager/bin/" + runner);
    EXPECT_EQ(std::system((program + " --help >" + root_.Path("/usage")).c_str()), 0) << runner;
    EXPECT_EQ(root_.ReadFile("/usage").rfind("Usage: " + runner, 0), 0u) << runner;
  }
}

TEST_F(HoxcfgCliTest, ValidateAndImpactAnswerWithExitStatusFindingsAndReasons) {
  // Given the sample host's export with its boot options changed, a rule
  // added and a vNIC's MTU below its minimum.
  InitSample();
  const std::string same = ExportWith(root_, "same.json");
  const std::string changed = ExportWith(root_, "changed.json",
                                         {{"/system/kernel/boot_options/hugepages", "4096"},
                                          {"/network/firewall/rules/-", R"({"name": "web", "action": "allow", "protocol": "tcp"})"},
                                          {"/hostSpecific/4c4c4544-0042-3510-8053-b4c04f4e3132/network/interfaces/vnic/0/mtu", "100"}});
  RunSteps(root_, {{"impact " + same, 0, ""},
                   {"validate " + same, 0, same + ": valid\n"},
                   {"validate --no-schema " + changed, 0, ""},
                   {"validate " + changed, 1, changed + ": /network/interfaces/vnic[vnic0]/mtu: must be at least 1280 "
                                              "[com.tarvik.hox.settings.validation.minimum: mtu, 1280]\n"}});
  const HoxcfgOutcome impact = Run("impact " + changed);
  EXPECT_EQ(impact.exitCode, 1);
  EXPECT_EQ(impact.err, "");  // no progress without a terminal
  for (const char* line : {"needs a reboot\n", "  /system/kernel/boot_options (SET): needs a reboot\n",
                           "/system/kernel/boot_options/hugepages: 2048 -> 4096", "plugin network: firewall rules"}) {
    EXPECT_TRUE(Has(impact.out, line)) << line << impact.out;
  }
  HoxConfigManager::Document json;
  HoxConfigManager::ParseDocument(Run("--json impact " + changed).out, json);
  EXPECT_EQ(json["impact"].GetInt(), 2);
  EXPECT_EQ(json["reasons"].Size(), 3u);  // the boot options, the rule, the vNIC
  const HoxcfgOutcome terminal = RunHoxcfgOnTerminal(root_, "impact " + changed);
  EXPECT_TRUE(Has(terminal.out, "hoxcfg: impact: plugin network started")) << terminal.out;
}

}  // namespace
}  // namespace hoxcm_test
