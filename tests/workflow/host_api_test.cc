// The single-item host API against the sample host in a real store with the
// sample plugins' manifests: with a scripted runner, what a value must look
// like, how store-generated identities follow the content and how a change
// or a removal ends; end to end with the real runners, how the impact
// decides between applying, staging and refusing, and how a value set here
// behaves in a whole document.
#include <filesystem>
#include <functional>

#include <hoxcm/host_api.h>

#include <hoxcm/boot.h>
#include <hoxcm/extraction.h>
#include <hoxcm/host_documents.h>

#include "extraction/extraction_internal.h"
#include "support/store_sql.h"
#include "workflow/host_api.h"
#include "workflow/remediation.h"
#include "workflow/workflow_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;
using HoxConfigStore::ConfigKind;

struct Address {
  std::string component, group, key;
};
Address Split(const std::string& path) {
  const std::size_t a = path.find('/', 1), b = path.find('/', a + 1);
  return {path.substr(1, a - 1), path.substr(a + 1, b - a - 1), path.substr(b + 1)};
}

class HostApiTest : public WorkflowTest {
 protected:
  HostApiTest() {
    // A key that no plugin applies.
    root.WriteFile(std::string(HoxPlatform::HostPaths::kSchemaDirectory) + "/services/extra/unowned.json",
                   R"({"multiInstance": false, "schema": {"type": "object"}})");
    root.InstallSamplePlugins();
    HoxConfigStore::ImportConfiguration(ConfigKind::Default, SampleDocument("default-config.json"));
    HoxConfigStore::ImportConfiguration(ConfigKind::User, SampleDocument("user-config.json"));
    // The root has no SSH files: let their (empty) state reach the store
    // now, not in the middle of a comparison.
    detail::SyncSshConfiguration();
  }

  // The documents of a change, built as a daemon builds them.
  struct Change {
    Address at;
    Document current, desired, staged;
  };
  Change Prepare(const std::string& path, const std::string& text) {
    Change c{Split(path), {}, {}, {}};
    Document value;
    std::vector<ValidationErrorInfo> findings;
    ValidateInput(c.at.component, c.at.group, c.at.key, text, value, findings);
    EXPECT_TRUE(findings.empty()) << path << ": " << findings.front().field;
    GenerateSetDocuments(c.at.component, c.at.group, c.at.key, c.current, c.desired, c.staged, value);
    return c;
  }
  ApplyResult Apply(Change& c) {
    const ImpactResult impact = CheckImpact(c.desired, c.current, task_, nullptr, runner_);
    return SetConfig(c.current, c.desired, c.staged, impact, c.at.component, c.at.group, c.at.key, task_, runner_);
  }
  ApplyResult Delete(const std::string& path) {
    const Address at = Split(path);
    return DeleteConfig(at.component, at.group, at.key, task_, runner_);
  }
  // Every configuration row and every host state value.
  static std::vector<std::string> StoreState() {
    std::vector<std::string> rows = StoreSql("SELECT kind, component, config_group, name, identifier, value "
                                             "FROM config_item ORDER BY kind, component, config_group, name, seq");
    for (std::string& row : StoreSql("SELECT name, value FROM host_state ORDER BY name")) rows.push_back(row);
    return rows;
  }
  // "ACTION instance" of each input of the apply runs.
  std::vector<std::string> AppliedInputs() const {
    std::vector<std::string> inputs;
    for (const auto& call : runner_.calls) {
      if (call.kind != "APPLY") continue;
      for (const DesiredConfigInput& input : call.inputs) {
        inputs.push_back(call.pluginId + " " + input.action + " " + input.object->GetConfigStoreObjectId().instanceId);
      }
    }
    return inputs;
  }
};

TEST_F(HostApiTest, MalformedValuesGetAClearErrorOrFindingsAndChangeNothing) {
  // Given values that cannot be set, ValidateInput should refuse them with
  // their code or report what the schema finds, field by field.
  const struct {
    const char* path;
    const char* input;
    const char* expected;  // a code, or "field kind" per finding
  } cases[] = {
      {"/network/dns/config", " \n", "2023"},
      {"/network/dns/config", R"({"servers": [)", "2080"},
      {"/network/dns/config", R"([{"servers": []}])", "2028"},  // an array for a singleton
      {"/network/firewall/rules", R"({"name": "web", "action": "allow", "protocol": "tcp"})", "2022"},
      {"/services/syslog/config", R"("DELETE_DEFAULT")", "2027"},
      {"/network/firewall/rules", R"([{"name": "a", "action": "allow", "protocol": "tcp"}, "DELETE_DEFAULT"])",
       "2027"},
      {"/security/accounts/users", R"([{"name": "mgmtagent", "shell": "/bin/sh"}])", "2181"},  // a solution's
      {"/quorlet/system/quorlet_daemon", R"({"enabled": true})", "2181"},  // not integrated: not user configuration
      {"/system/kernel/no_such_key", "{}", "2021"},
      {"/network/dns/config", "5", "/network/dns/config type"},
      {"/network/dns/config", R"({"servers": "10.0.0.1"})", "/network/dns/config/servers type"},
      {"/network/firewall/rules", R"([{"action": "allow", "protocol": "tcp"}])",  // an instance without identity
       "/network/firewall/rules/0/name required"},
      {"/network/firewall/rules",
       R"([{"name": "a", "action": "allow", "protocol": "tcp"}, {"name": "a", "action": "deny", "protocol": "udp"}])",
       "/network/firewall/rules unique.items"},
  };
  const std::vector<std::string> before = StoreState();
  for (const auto& c : cases) {
    const Address at = Split(c.path);
    std::string outcome;
    Document value;
    std::vector<ValidationErrorInfo> findings;
    const Thrown thrown = ThrownBy([&] { ValidateInput(at.component, at.group, at.key, c.input, value, findings); });
    if (thrown.code != 0) outcome = std::to_string(thrown.code);
    for (const ValidationErrorInfo& finding : findings) {
      for (const ErrorInfo& e : finding.errors) {
        outcome += (outcome.empty() ? "" : ", ") + finding.field + " " + e.id.substr(e.id.rfind("validation.") + 11);
      }
    }
    EXPECT_EQ(outcome, c.expected) << c.path << " " << c.input << ": " << thrown.message;
  }
  // A value of the wrong kind never becomes a document either.
  Document current, desired, staged;
  EXPECT_EQ(ThrownBy([&] { GenerateSetDocuments("network", "dns", "config", current, desired, staged, Parse("5")); })
                .code,
            2084);
  EXPECT_EQ(StoreState(), before);
}

TEST_F(HostApiTest, StoreGeneratedIdentitiesFollowTheContent) {
  // Given the two routes with one kept (under a made-up identity), one
  // changed and one added, the kept route should keep its identity and
  // never be touched, while the changed one is replaced by a new instance.
  Change c = Prepare("/network/routes/static", R"([
      {"cs_generated_id": "made-up", "destination": "10.30.0.0/16", "gateway": "10.20.1.1", "metric": 10},
      {"cs_generated_id": "a1b2c3d4-e5f6-4a7b-8c9d-0e1f2a3b4c5d", "destination": "192.168.50.0/24",
       "gateway": "10.20.8.1", "metric": 30},
      {"destination": "10.40.0.0/16", "gateway": "10.20.1.1"}])");
  EXPECT_EQ(JsonToString(c.staged[0]["cs_generated_id"]), R"("5f0c1c9e-6a3b-4b8e-9d7a-1e2f3a4b5c6d")");
  EXPECT_FALSE(c.staged[1].HasMember("cs_generated_id"));
  EXPECT_EQ(c.desired["network"]["routes"]["static"], c.staged);
  EXPECT_EQ(c.current["network"]["routes"]["static"].Size(), 2u);

  EXPECT_EQ(Apply(c).status, APPLY_COMPLETED);
  const std::vector<std::string> inputs = AppliedInputs();
  ASSERT_EQ(inputs.size(), 3u);
  EXPECT_EQ(inputs[0].substr(0, 12), "network ADD ");
  EXPECT_EQ(inputs[1].substr(0, 12), "network ADD ");
  EXPECT_EQ(inputs[2], "network DELETE a1b2c3d4-e5f6-4a7b-8c9d-0e1f2a3b4c5d");
  EXPECT_NE(inputs[0], "network ADD a1b2c3d4-e5f6-4a7b-8c9d-0e1f2a3b4c5d");
}

TEST_F(HostApiTest, AChangeEndsAppliedAbortedStaleOrWithThePluginsError) {
  // A failing plugin: 2084, whose ErrorInfo is the plugin's.
  const ErrorInfo failure("com.tarvik.hox.settings.network.failed", {"dns"}, "cannot write resolv.conf");
  runner_.apply["network"] = failure;
  Change dns = Prepare("/network/dns/config", R"({"servers": ["10.0.0.53"]})");
  try {
    Apply(dns);
    ADD_FAILURE() << "no exception";
  } catch (const ConfigManagerException& e) {
    EXPECT_EQ(e.GetErrorCode(), 2084);
    EXPECT_EQ(PluginErrorOf(e), std::optional<ErrorInfo>(failure));
  }
  EXPECT_EQ(PluginErrorOf(ConfigManagerException(2084, "Invalid value for key /network/dns/config")), std::nullopt);

  // An abort before the plugin ran: returned, with the plugin that did not run.
  runner_.apply.clear();
  runner_.calls.clear();
  task_->aborted = true;
  const ApplyResult aborted = SetConfig(dns.current, dns.desired, dns.staged, ImpactResult(), "network", "dns",
                                             "config", task_, runner_);
  EXPECT_EQ(aborted.errorInfo, ErrorInfo("com.tarvik.hox.settings.apply.plugin.aborted", {"network"}, ""));
  EXPECT_EQ(task_->Events().back(), "info com.tarvik.hox.settings.apply.plugin.aborted network");
  EXPECT_TRUE(runner_.calls.empty());
  task_->aborted = false;

  // The item changed since its documents were built: 2025, nothing runs.
  HoxConfigStore::ApplyUserConfigChanges({{"SET", {"network", "dns", "config"}, R"({"servers": ["10.9.9.9"]})"}});
  EXPECT_EQ(ThrownBy([&] { Apply(dns); }).code, 2025);
  EXPECT_TRUE(AppliedInputs().empty());

  // No plugin applies the item: 2084 naming the item and the operation.
  Change unowned = Prepare("/services/extra/unowned", R"({"on": true})");
  try {
    Apply(unowned);
    ADD_FAILURE() << "no exception";
  } catch (const ConfigManagerException& e) {
    EXPECT_EQ(PluginErrorOf(e).value_or(ErrorInfo()).message,
              "Couldn't find the plugin comp services grp extra key unowned for operation SET")
        << e.what();
  }
}

TEST_F(HostApiTest, DeleteRemovesASingletonThroughItsPluginOrSaysWhyNot) {
  const struct {
    const char* path;
    int code;
  } refusals[] = {
      {"/network/firewall/rules", 2022},         // instances are removed by setting the others
      {"/network/dns/nothing", 2021},
      {"/services/time/ntp", 2027},              // a default that may change but never go
      {"/quorlet/system/quorlet_daemon", 2181},  // not user configuration here
  };
  for (const auto& r : refusals) EXPECT_EQ(ThrownBy([&] { Delete(r.path); }).code, r.code) << r.path;
  EXPECT_TRUE(runner_.calls.empty());

  EXPECT_EQ(Delete("/services/syslog/config").status, APPLY_COMPLETED);
  EXPECT_EQ(AppliedInputs(), (std::vector<std::string>{"services:syslog DELETE "}));

  // Nothing to delete: no plugin runs.
  HoxConfigStore::DeleteConfigRows(HoxConfigStore::GetDBStore(), ConfigKind::User, {"services", "syslog", "config"});
  runner_.calls.clear();
  EXPECT_EQ(Delete("/services/syslog/config").status, APPLY_COMPLETED);
  EXPECT_TRUE(runner_.calls.empty());

  // While a staged change waits for a boot, no removal either.
  HoxConfigStore::SetBootMode(HoxConfigStore::BOOTMODE_DESIRED_STAGED);
  EXPECT_EQ(ThrownBy([&] { Delete("/system/identity/hostname"); }).code, 2029);
}

TEST_F(HostApiTest, GetConfigGivesTheCurrentTheDefaultAndWhetherTheUserChangedIt) {
  std::string current, defaults, user;
  GetConfig("network", "dns", "config", current, defaults, user);
  EXPECT_EQ(current, R"({"servers":["10.20.0.10","10.20.0.11"],"search":["lab.example.com","example.com"]})");
  EXPECT_EQ(defaults, R"({"servers":["10.20.0.10"],"search":[]})");
  EXPECT_EQ(user, "true");
  // Back at its default: not user configuration.
  HoxConfigStore::ApplyUserConfigChanges({{"SET", {"network", "dns", "config"}, R"({"search":[],"servers":["10.20.0.10"]})"}});
  GetConfig("network", "dns", "config", current, defaults, user);
  EXPECT_EQ(user, "false");
  GetConfig("system", "identity", "hostname", current, defaults, user);
  EXPECT_EQ(defaults + " " + user, "null true");
  // Solution instances are not the user's: the user key lists two users.
  GetConfig("security", "accounts", "users", current, defaults, user);
  EXPECT_EQ(Parse(current).Size(), 2u);
}

TEST_F(HostApiTest, AStoreThatCannotBeOpenedIs2001ForEveryOperation) {
  Change dns = Prepare("/network/dns/config", R"({"servers": ["10.0.0.53"]})");
  const std::string store = HoxPlatform::HostPath(kStoreHostPath);
  for (const char* suffix : {"", "-wal", "-shm"}) std::filesystem::remove(store + suffix);
  root.WriteFile(kStoreHostPath, "not a database, but long enough to be read as one by mistake......................");
  std::string a, b, c;
  Document current, desired, staged;
  const std::function<void()> calls[] = {
      [&] { GetConfig("network", "dns", "config", a, b, c); },
      [&] { GenerateSetDocuments("network", "dns", "config", current, desired, staged, Parse("{}")); },
      [&] { Apply(dns); },
      [&] { Delete("/services/syslog/config"); },
  };
  for (const auto& call : calls) EXPECT_EQ(ThrownBy(call).code, 2001);
}


// The public operations, as a management daemon calls them, with the
// sample plugins run by the real runners.
class HostApiEndToEndTest : public HostApiTest {
 protected:
  HostApiEndToEndTest() {
    root.InstallRunners();
    root.CopyTree("data/sample-host/product_uuid", "/sys/class/dmi/id");  // an export names its host
  }

  std::string Get(const std::string& path) {
    const Address at = Split(path);
    std::string current, defaults, user;
    GetConfig(at.component, at.group, at.key, current, defaults, user);
    return current;
  }
  // Validated, judged and set; the impact it was judged with.
  IMPACT_TYPE Set(const std::string& path, const std::string& text, ApplyResult* result = nullptr) {
    Change c = Prepare(path, text);
    const ImpactResult impact = CheckImpact(c.desired, c.current);
    const ApplyResult r = SetConfig(c.current, c.desired, c.staged, impact, c.at.component, c.at.group, c.at.key);
    if (result != nullptr) *result = r;
    return impact.impact;
  }
};

TEST_F(HostApiEndToEndTest, TheImpactDecidesWhetherAChangeIsAppliedStagedOrRefused) {
  // Unchanged: compliant, nothing to do.
  Change same = Prepare("/network/dns/config", Get("/network/dns/config"));
  EXPECT_TRUE(CheckImpact(same.desired, same.current).compliant);

  // No impact: the network plugin writes the resolver file, and the store
  // records the new value.
  ApplyResult result;
  EXPECT_EQ(Set("/network/dns/config", R"({"servers": ["10.0.0.53"]})", &result), IMPACT_NONE);
  EXPECT_EQ(result.status, APPLY_COMPLETED);
  EXPECT_NE(root.ReadFile("/etc/resolv.conf").find("nameserver 10.0.0.53"), std::string::npos);
  EXPECT_EQ(Get("/network/dns/config"), R"({"servers":["10.0.0.53"]})");

  // Maintenance mode outside it: refused, nothing stored.
  const std::vector<std::string> before = StoreState();
  const std::string jumbo = Replaced(Get("/network/interfaces/vnic"), "\"mtu\":1500", "\"mtu\":9000");
  EXPECT_EQ(ThrownBy([&] { Set("/network/interfaces/vnic", jumbo); }).code, 2026);
  EXPECT_EQ(StoreState(), before);

  // A reboot: staged for the next boot, the host untouched, boot mode 4; the
  // next change is refused until a boot.
  const std::string options = Get("/system/kernel/boot_options");
  EXPECT_EQ(Set("/system/kernel/boot_options", R"({"iommu": true, "hugepages": 4096, "console": "ttyS0"})", &result),
            IMPACT_REBOOT_REQUIRED);
  EXPECT_EQ(result.status, APPLY_PENDING_REBOOT);
  EXPECT_FALSE(std::filesystem::exists(root.Path("/etc/tarvik/boot-options.conf")));
  EXPECT_EQ(Get("/system/kernel/boot_options"), options);
  EXPECT_EQ(JsonToString(ExtractDesiredConfiguration()),
            R"({"system":{"kernel":{"boot_options":{"iommu":true,"hugepages":4096,"console":"ttyS0"}}}})");
  EXPECT_EQ(HoxConfigStore::GetBootMode(), HoxConfigStore::BOOTMODE_DESIRED_STAGED);
  EXPECT_EQ(ThrownBy([&] { Set("/network/dns/config", R"({"servers": ["10.0.0.54"]})"); }).code, 2029);
  EXPECT_EQ(Get("/network/dns/config"), R"({"servers":["10.0.0.53"]})");

  // The boot-time run applies the staged item and lets changes through again.
  EXPECT_FALSE(ExecuteBootPlugins());
  EXPECT_EQ(HoxConfigStore::GetBootMode(), HoxConfigStore::BOOTMODE_NORMAL);
  EXPECT_NE(Get("/system/kernel/boot_options").find(R"("hugepages":4096)"), std::string::npos);
  EXPECT_EQ(Set("/network/dns/config", R"({"servers": ["10.0.0.54"]})"), IMPACT_NONE);

  // Each change is in the apply history.
  std::vector<std::string> history;
  for (const ApplyHistoryRecord& r : GetApplyHistory()) history.push_back(r.kind + " " + r.outcome);
  EXPECT_EQ(history, (std::vector<std::string>{"set applied", "set refused", "set staged", "set refused",
                                               "boot applied", "set applied"}));
}

TEST_F(HostApiEndToEndTest, AValueSetHereBehavesTheSameInAnExportedDocument) {
  // Given a route added through the API (its identity made by the store)...
  std::string routes = Get("/network/routes/static");
  routes.insert(routes.size() - 1, R"(,{"destination": "10.40.0.0/16", "gateway": "10.20.1.1", "metric": 5})");
  EXPECT_EQ(Set("/network/routes/static", routes), IMPACT_NONE);
  ASSERT_EQ(Parse(Get("/network/routes/static")).Size(), 3u);

  // ...the exported document holds it and applies to this host as a no-op...
  Document exported = ExportDocument();
  Document desired;
  CreateMergedDocument(std::move(exported), desired);
  ImpactResult verdict;
  Impact(desired, "", verdict);
  EXPECT_TRUE(verdict.compliant);

  // ...and once changed there and applied as a document, the API reads the
  // change and finds setting it again a no-op.
  Value& added = DocumentShape::Unwrap(desired)["network"]["routes"]["static"][2];
  ASSERT_EQ(JsonToString(added["destination"]), R"("10.40.0.0/16")");
  added["metric"].SetInt(7);
  EXPECT_EQ(RemediateHost(desired, "", TaskHandle::Dummy(), false), ErrorInfo());
  const std::string changed = Get("/network/routes/static");
  EXPECT_NE(changed.find(R"("destination":"10.40.0.0/16","gateway":"10.20.1.1","metric":7)"), std::string::npos);
  Change again = Prepare("/network/routes/static", changed);
  EXPECT_TRUE(CheckImpact(again.desired, again.current).compliant);
}

}  // namespace
}  // namespace hoxcm_test
