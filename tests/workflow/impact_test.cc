// Impact analysis against the sample host's schemas: the trigger
// comparison, the verdict of each kind of change, the reasons, and the
// impact plugins asked through a scripted runner (real runners:
// verdicts_e2e_test.cc).
#include <algorithm>

#include "workflow/impact.h"
#include "workflow/impact_handler.h"
#include "workflow/workflow_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;

constexpr const char* kHost = R"({
  "system": {"kernel": {"boot_options": {"iommu": true, "hugepages": 2048, "console": "ttyS0"}}},
  "network": {"interfaces": {"vnic": [{"name": "vnic0", "portgroup": "pg", "mtu": 1500}]},
              "firewall": {"rules": [{"name": "ssh", "action": "allow", "protocol": "tcp"}]}}})";

const std::string kStarted = "info com.tarvik.hox.settings.impact.plugin.started ";
const std::string kFinished = "info com.tarvik.hox.settings.impact.plugin.finished ";
std::string Progress(float value) { return "progress " + std::to_string(value); }

// "impact=2 | reboot | set system boot_options kernel", or "compliant".
std::string Summary(const ImpactResult& r) {
  std::string s = r.compliant ? "compliant" : "impact=" + std::to_string(r.impact);
  for (const ImpactInfo& info : r.impactInfo) {
    s += " | " + info.id.substr(info.id.rfind('.') + 1);
    for (const std::string& arg : info.args) s += " " + arg;
  }
  if (!r.error.id.empty()) s += " error=" + r.error.id;
  return s;
}

// "reboot property /path: old -> new", "maintenance plugin net: words".
std::string Text(const ImpactReason& r) {
  std::string s = r.impact == IMPACT_REBOOT_REQUIRED ? "reboot " : "maintenance ";
  switch (r.rule) {
    case ImpactReason::Rule::kPropertyTrigger: s += "property "; break;
    case ImpactReason::Rule::kOperation: s += "operation "; break;
    case ImpactReason::Rule::kPlugin: return s + "plugin " + r.plugin + ": " + r.reason;
  }
  return s + r.path + ": " + r.oldValue + " -> " + r.newValue;
}

class ImpactTest : public WorkflowTest {
 protected:
  ImpactTest() {
    // Two impact plugins, in path order: net before net2, which is never
    // asked (only an object's first owner is).
    const std::string impact = R"(,"impact":{"supports":true})";
    Manifest("kern/plugin.json", V3Manifest("python", {"system:kernel:boot_options"}, "system", "REMEDIATE:kern", {}, impact));
    for (const char* id : {"net", "net2"}) {
      Manifest(std::string(id) + "/plugin.json",
               V3Manifest("python", {"network:firewall:rules", "network:interfaces:vnic"}, "network",
                          std::string("REMEDIATE:") + id, {}, impact));
    }
    // A key whose every change needs maintenance mode, with a secret.
    root.WriteFile(std::string(HoxPlatform::HostPaths::kSchemaDirectory) + "/test/secure/vault.json",
                   R"({"multiInstance": false, "maintenanceModeRequired": ["SET"], "schema": {"type": "object",
                       "properties": {"secret": {"type": "string", "sensitive": true}, "note": {"type": "string"}}}})");
  }

  ImpactResult Run(const std::string& desiredText, const std::string& hostText = kHost,
                   ImpactReasons* reasons = nullptr) {
    Document desired = Parse(desiredText);
    ImpactResult result;
    Impact(desired, "task-1", result, task_, Parse(hostText), reasons, runner_);
    return result;
  }
  static std::string Changed(const std::string& from, const std::string& to) { return Replaced(kHost, from, to); }
};

TEST_F(ImpactTest, TriggerValuesCompareByThePropertysType) {
  struct Case {
    const char* desired;
    const char* triggers;
    const char* type;
    const char* expected;  // "1", "0" or the failure
  } cases[] = {
      {"5", "[]", "integer", "1"},  // an empty list: any change triggers
      {"4096", "[0, 4096]", "integer", "1"},
      {"2048", "[0, 4096]", "integer", "0"},
      {"4096", "[4096]", "long", "1"},
      {"4096.0", "[4096]", "integer", "0"},  // not an integer
      {"9223372036854775807", "[9223372036854775807]", "integer", "1"},
      {"1.5", "[1.5]", "number", "1"},
      {"2", "[2.0]", "number", "1"},  // JSON does not tell 2 from 2.0
      {"true", "[true]", "boolean", "1"},
      {"\"tty0\"", "[\"tty0\"]", "string", "1"},
      {"5", "[\"5\"]", "string", "0"},  // the desired value is not of the type
      {"5", "[5]", "object", "0"},      // not a type with triggers
      {"5", "[\"5\"]", "integer", "2000 Invalid JSON"},
      {"true", "[1]", "boolean", "2000 Invalid JSON"},
      {"\"a\"", "[1]", "string", "2000 Invalid JSON"},
      {"5", "{\"SET\": 5}", "integer", "2000 Invalid JSON"},
  };
  for (const Case& c : cases) {
    const Document desired = Parse(c.desired), triggers = Parse(c.triggers);
    const Value type(rapidjson::StringRef(c.type));
    bool match = false;
    const std::string failure = Failure([&] { match = ValueInImpactList(desired, triggers, type); });
    EXPECT_EQ(failure == "0 " ? (match ? "1" : "0") : failure, c.expected) << c.desired << " in " << c.triggers;
  }
}

TEST_F(ImpactTest, EachKindOfChangeGetsTheImpactItsSchemaDeclares) {
  struct Case {
    std::string desired;
    std::string host;
    std::string expected;
  } cases[] = {
      {kHost, kHost, "compliant"},
      // Reboot on SET, declared at property level: only trigger values count.
      {Changed("2048", "4096"), kHost, "impact=2 | reboot | set system boot_options kernel"},
      {Changed("2048", "1024"), kHost, "impact=0 | set system boot_options kernel"},
      {Changed("\"iommu\": true", "\"iommu\": false"), kHost, "impact=2 | reboot | set system boot_options kernel"},
      {Changed("ttyS0", "ttyS1"), kHost, "impact=0 | set system boot_options kernel"},
      // Reboot on ADD and DELETE, whatever the properties; a singleton whose
      // default configuration was deleted is added.
      {Changed("2048", "1024"), Changed("{\"iommu\": true, \"hugepages\": 2048, \"console\": \"ttyS0\"}", "\"DELETE_DEFAULT\""),
       "impact=2 | reboot | add system boot_options kernel"},
      {Changed("\"boot_options\": {\"iommu\": true, \"hugepages\": 2048, \"console\": \"ttyS0\"}", ""), kHost,
       "impact=2 | reboot | delete system boot_options kernel"},
      // Maintenance mode on SET of "mtu" (any value), on ADD of a rule.
      {Changed("1500", "9000"), kHost, "impact=1 | maintenance-mode | set network vnic interfaces"},
      {Changed("\"pg\"", "\"other\""), kHost, "impact=0 | set network vnic interfaces"},
      {Changed("\"protocol\": \"tcp\"}", "\"protocol\": \"tcp\"}, {\"name\": \"web\", \"action\": \"allow\", \"protocol\": \"tcp\"}"),
       kHost, "impact=1 | maintenance-mode | add network rules firewall"},
      {Changed("\"allow\"", "\"deny\""), kHost, "impact=0 | set network rules firewall"},
      // Reboot wins over maintenance mode: one statement.
      {Replaced(Changed("1500", "9000"), "2048", "0"), kHost,
       "impact=2 | reboot | set network vnic interfaces | set system boot_options kernel"},
  };
  for (const Case& c : cases) {
    runner_.calls.clear();
    EXPECT_EQ(Summary(Run(c.desired, c.host)), c.expected) << c.desired;
  }
  // Nothing changed: no plugin is asked, and progress stops at 20.
  runner_.calls.clear();
  task_ = std::make_shared<RecordingTask>();
  Run(kHost);
  EXPECT_TRUE(runner_.calls.empty());
  EXPECT_EQ(task_->Events(), std::vector<std::string>{Progress(20)});
}

TEST_F(ImpactTest, PropertyAnalysisFollowsObjectsAndArraysAndRefusesMalformedTriggers) {
  const auto kernel = HoxSchemaStore::SchemaStore::GetStore()->Find("system", "kernel", "boot_options");
  struct Case {
    const char* value;
    const char* schema;
    const char* expected;  // "reboot", "none" or the failure
  } cases[] = {
      {R"({"a":[{"b":1}]})",
       R"({"type":"object","properties":{"a":{"type":"array","items":{"type":"object",
           "properties":{"b":{"type":"integer","rebootRequired":{"SET":[]}}}}}}})",
       "reboot"},
      {R"({"a":[1]})", R"({"type":"object","properties":{"a":{"type":"array","items":{"type":"integer",
           "rebootRequired":{"SET":[]}}}}})",
       "none"},  // arrays of scalars are not looked into
      {R"({"x":{"y":1}})", R"({"type":"object"})", "none"},  // nothing describes "x": it holds no trigger
      {"1", R"({"type":"integer","rebootRequired":{}})", "2000 Invalid JSON"},
      {"1", R"({"type":["integer","null"],"rebootRequired":{"SET":[1]}})", "2000 Invalid JSON"},
      {"1", R"({"type":"integer","maintenanceModeRequired":{"SET":"1"}})", "2000 Invalid JSON"},
      {"1", R"({"type":"integer","rebootRequired":{"SET":["1"]}})", "2000 Invalid JSON"},
  };
  for (const Case& c : cases) {
    ImpactHandler handler;
    const Document value = Parse(c.value), schema = Parse(c.schema);
    const std::string failure = Failure([&] {
      handler.ComputePropImpact(value, schema, "/p");
      // The pending property flag decides a SET of a key with triggers.
      handler.ComputeObjImpact(SET, kernel, "/system/kernel/boot_options");
    });
    EXPECT_EQ(failure == "0 " ? (handler.GetRebootRequired() ? "reboot" : "none") : failure, c.expected) << c.value;
  }
}

TEST_F(ImpactTest, PluginVerdictsJoinTheSchemasAndTheHighestLevelWins) {
  // Given a reboot by schema and maintenance mode by both plugins.
  runner_.impact["kern"].impacts = {{1, "system", "kernel", "boot_options", "k"}};
  runner_.impact["net"].impacts = {{1, "network", "interfaces", "vnic", "n"}};
  const ImpactResult result = Run(Replaced(Changed("1500", "9000"), "2048", "4096"));

  EXPECT_EQ(Summary(result), "impact=2 | reboot | set network vnic interfaces | set system boot_options kernel");
  EXPECT_EQ(runner_.CalledIds(), (std::vector<std::string>{"kern", "net"}));
  const float half = 20 + 80.0f / 2;
  EXPECT_EQ(task_->Events(), (std::vector<std::string>{Progress(20), kStarted + "kern", Progress(half),
                                                        kFinished + "kern", kStarted + "net", Progress(100),
                                                        kFinished + "net"}));
  // What the plugin was given: the changed object with its drift record.
  ASSERT_EQ(runner_.calls[1].inputs.size(), 1u);
  const DesiredConfigInput& input = runner_.calls[1].inputs[0];
  EXPECT_EQ(input.action, "SET");
  EXPECT_EQ(input.object->GetConfigStoreObjectId().toString(), "comp network grp interfaces key vnic id vnic0");
  ASSERT_NE(input.drift, nullptr);
  EXPECT_TRUE(input.drift->GetDrift().HasMember("mtu"));
  EXPECT_EQ(runner_.calls[1].context + " " + runner_.calls[1].taskId, "task-1 task-1");

  // A plugin verdict alone: maintenance mode.
  runner_.calls.clear();
  EXPECT_EQ(Summary(Run(Changed("\"pg\"", "\"other\""))), "impact=1 | maintenance-mode | set network vnic interfaces");
}

TEST_F(ImpactTest, AFailedOrAbortedPluginRunLeavesOnlyTheError) {
  const std::string desired = Replaced(Changed("1500", "9000"), "2048", "4096");
  const ErrorInfo failure("com.tarvik.hox.settings.impact.plugin.unexpected.error", {"kern"}, "runner died");
  runner_.impact["kern"].error = failure;
  ImpactResult result = Run(desired);
  EXPECT_EQ(result.error, failure);
  EXPECT_EQ(Summary(result), "impact=0 error=" + failure.id);  // neither compliance nor statements were set
  EXPECT_EQ(runner_.CalledIds(), std::vector<std::string>{"kern"});
  EXPECT_EQ(task_->Events().back(), "error " + failure.id + " kern");

  runner_.calls.clear();
  task_->aborted = true;
  result = Run(desired);
  EXPECT_EQ(result.error, ErrorInfo("com.tarvik.hox.settings.impact.plugin.aborted", {"kern"}, ""));
  EXPECT_TRUE(runner_.calls.empty());
  EXPECT_TRUE(result.impactInfo.empty());
}

TEST_F(ImpactTest, ReasonsSayWhichChangeOrPluginCostsWhatWithSecretsMasked) {
  runner_.impact["net"].impacts = {{1, "network", "firewall", "rules", "rule change"}, {0, "network", "x", "y", ""}};
  std::string host = kHost;
  host.insert(host.rfind('}'), R"(,"test":{"secure":{"vault":{"secret":"s3cret-1","note":"a"}}})");
  std::string desired = Replaced(Changed("2048", "4096"), "\"iommu\": true", "\"iommu\": false");
  desired = Replaced(desired, "\"pg\"", "\"other\"");  // costs nothing: not listed
  desired = Replaced(desired, "\"protocol\": \"tcp\"}",
                 R"("protocol": "tcp"}, {"name": "web", "action": "allow", "protocol": "udp"})");
  desired.insert(desired.rfind('}'), R"(,"test":{"secure":{"vault":{"secret":"s3cret-2","note":"a"}}})");
  ImpactReasons reasons;
  const ImpactResult result = Run(desired, host, &reasons);
  ASSERT_EQ(result.impact, IMPACT_REBOOT_REQUIRED);

  std::vector<std::string> lines;
  for (const ObjectImpact& object : reasons.objects) {
    lines.push_back(object.id.toString() + " " + object.action + " " + std::to_string(object.impact));
    for (const ImpactReason& r : object.reasons) lines.push_back("  " + Text(r));
  }
  EXPECT_EQ(lines, (std::vector<std::string>{
                       "comp system grp kernel key boot_options SET 2",
                       "  reboot property /system/kernel/boot_options/iommu: true -> false",
                       "  reboot property /system/kernel/boot_options/hugepages: 2048 -> 4096",
                       "comp network grp firewall key rules id web ADD 1",
                       R"(  maintenance operation /network/firewall/rules/1:  -> {"name":"web","action":"allow","protocol":"udp"})",
                       "  maintenance plugin net: rule change",
                       "comp test grp secure key vault SET 1",
                       R"(  maintenance operation /test/secure/vault/secret: "******" -> "******")",
                   }));
}

}  // namespace
}  // namespace hoxcm_test
