// Validation with a scripted runner: the schema stage, the plugins' objects
// and references, the merge of findings per field, skips, aborts and
// failures (real runners: verdicts_e2e_test.cc).
#include <hoxcm/host_documents.h>

#include "plugins/plugin_fixture.h"
#include "support/fake_plugin_runner.h"
#include "support/json.h"
#include "workflow/validation.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;

constexpr const char* kDesired = R"({
  "network": {"dns": {"config": {"servers": ["10.0.0.1"]}},
              "interfaces": {"vnic": [{"name": "vnic0", "portgroup": "pg", "mtu": 1500},
                                      {"name": "vnic1", "portgroup": "pg", "mtu": 1500}]}},
  "system": {"identity": {"hostname": {"hostname": "h1"}}}})";

std::string Progress(float value) { return "progress " + std::to_string(value); }

ValidationErrorInfo Finding(const std::string& field, const std::string& id) { return {field, {ErrorInfo(id, {"a"}, "m")}}; }

// "field: id(args) id(args)", one per entry.
std::vector<std::string> Lines(const ValidationResult& result) {
  std::vector<std::string> lines;
  for (const ValidationErrorInfo& entry : result.errors) {
    std::string line = entry.field + ":";
    for (const ErrorInfo& e : entry.errors) {
      line += " " + e.id.substr(e.id.rfind('.') + 1) + "(";
      for (std::size_t i = 0; i < e.args.size(); ++i) line += (i ? "," : "") + e.args[i];
      line += ")";
    }
    lines.push_back(line);
  }
  return lines;
}

std::vector<std::string> Ids(const StoreObjects& objects) {
  std::vector<std::string> ids;
  for (const auto& o : objects) ids.push_back(o->GetConfigStoreObjectId().toString());
  return ids;
}

class ValidationTest : public PluginTest {
 protected:
  ValidationTest() : task_(std::make_shared<RecordingTask>()) {
    Manifest("net/plugin.json",
             V3Manifest("python", {"network:dns:config", "network:interfaces:vnic"}, "network", "REMEDIATE:net", {},
                        R"(,"validation":{"supports":true,"references":["system:identity:hostname"]})"));
    Manifest("sys/plugin.json", V3Manifest("python", {"system:identity:hostname"}, "system", "REMEDIATE:sys", {},
                                           R"(,"validation":{"supports":true})"));
  }

  // With the schema stage against the host document schema of `schemaOf`
  // (the document itself by default).
  ValidationResult Run(const std::string& text, bool checkSchema, const std::string& schemaOf = "") {
    const Document desired = Parse(text);
    Document schema;
    if (checkSchema) {
      EXPECT_TRUE(GenerateHostDocumentSchema(Parse(schemaOf.empty() ? text : schemaOf), schema));
    }
    ValidationResult result;
    Validate(desired, schema, "task-1", result, checkSchema, task_, runner_);
    return result;
  }

  FakePluginRunner runner_;
  std::shared_ptr<RecordingTask> task_;
};

TEST_F(ValidationTest, PluginsValidateTheirObjectsWithReferencesAndFindingsComeInDocumentOrder) {
  // Given a profile-wrapped document without the schema stage, whose last
  // vNIC is the marker of a deleted default (no configuration to check).
  std::string text = kDesired;
  text.insert(text.find("]}},"), R"(, "DELETE_DEFAULT")");
  runner_.validate["net"].errors = {Finding("/network/interfaces/vnic/1/mtu", "x.mtu"),
                                    Finding("/network/dns/config/servers/0", "x.server")};
  runner_.validate["sys"].errors = {Finding("/system/identity/hostname/hostname", "x.name")};
  const ValidationResult result = Run("{\"profile\": " + text + "}", false);

  EXPECT_EQ(Lines(result), (std::vector<std::string>{"/network/dns/config/servers/0: server(a)",
                                                      "/network/interfaces/vnic/1/mtu: mtu(a)",
                                                      "/system/identity/hostname/hostname: name(a)"}));
  EXPECT_FALSE(result.IsValid());
  ASSERT_EQ(runner_.CalledIds(), (std::vector<std::string>{"net", "sys"}));
  EXPECT_EQ(Ids(runner_.calls[0].data),
            (std::vector<std::string>{"comp network grp dns key config", "comp network grp interfaces key vnic id vnic0",
                                      "comp network grp interfaces key vnic id vnic1"}));
  EXPECT_EQ(Ids(runner_.calls[0].references), std::vector<std::string>{"comp system grp identity key hostname"});
  EXPECT_EQ(runner_.calls[0].context + " " + runner_.calls[0].taskId, "task-1 task-1");
  const std::string started = "info com.tarvik.hox.settings.validation.plugin.started ";
  const std::string finished = "info com.tarvik.hox.settings.validation.plugin.finished ";
  EXPECT_EQ(task_->Events(), (std::vector<std::string>{Progress(20), started + "net", finished + "net", Progress(60),
                                                        started + "sys", finished + "sys", Progress(100)}));
}

TEST_F(ValidationTest, AKeyFailingTheSchemaSkipsItsPluginAndTheFirstFindingPerFieldWins) {
  // Given vnic0's MTU below its minimum: the schema flags the vNIC key, so
  // its plugin is skipped; the other plugin repeats fields.
  std::string text = kDesired;
  text.replace(text.find("1500"), 4, "100");
  runner_.validate["sys"].errors = {Finding("/system/identity/hostname/hostname", "x.first"),
                                    Finding("/system/identity/hostname/hostname", "x.second"),
                                    Finding("/network/interfaces/vnic/0/mtu", "x.late")};
  ValidationResult result = Run(text, true);
  EXPECT_EQ(Lines(result), (std::vector<std::string>{"/network/interfaces/vnic/0/mtu: minimum(mtu,1280)",
                                                      "/system/identity/hostname/hostname: first(a)"}));
  EXPECT_EQ(runner_.CalledIds(), std::vector<std::string>{"sys"});
  EXPECT_EQ(task_->Events()[1], Progress(60));  // the skipped plugin's share is counted

  // A fault above the keys (a group that is not an object) skips the
  // plugins of every key below it.
  runner_.calls.clear();
  result = Run(R"({"network": {"dns": 5}, "system": {"identity": {"hostname": {"hostname": "h1"}}}})", true, kDesired);
  EXPECT_EQ(Lines(result)[0], "/network/dns: type(dns,object)");
  EXPECT_EQ(runner_.CalledIds(), std::vector<std::string>{"sys"});

  // Without findings the document is valid.
  runner_.validate.clear();
  EXPECT_TRUE(Run(kDesired, true).IsValid());
}

TEST_F(ValidationTest, AnAbortOrAPluginFailureEndsValidationWithItsErrorOnly) {
  // Given a schema finding collected before the failure.
  std::string text = kDesired;
  text.replace(text.find("\"h1\""), 4, "\"-bad-\"");
  const ErrorInfo failure("com.tarvik.hox.settings.validation.plugin.unexpected.error", {"net"}, "runner died");
  runner_.validate["net"].error = failure;
  ValidationResult result = Run(text, true);
  EXPECT_EQ(result.error, failure);
  EXPECT_TRUE(result.errors.empty());

  task_->aborted = true;
  runner_.calls.clear();
  result = Run(text, true);
  EXPECT_EQ(result.error, ErrorInfo("com.tarvik.hox.settings.validation.plugin.aborted", {"net"}, ""));
  EXPECT_TRUE(result.errors.empty());
  EXPECT_TRUE(runner_.calls.empty());
}

}  // namespace
}  // namespace hoxcm_test
