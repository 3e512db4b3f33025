// Extraction of host documents from a real store in a temporary root.
#include <filesystem>
#include <tuple>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/extraction.h>

#include "extraction/sample_host.h"
#include "support/json.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;

// Compact text of a value with its members sorted, for comparisons that
// must not depend on member order.
std::string Canonical(const Value& value) {
  Document copy;
  copy.CopyFrom(value, copy.GetAllocator());
  HoxConfigStore::ConfigStoreDocument::NormalizeValue(copy, copy.GetAllocator());
  return JsonToString(copy);
}

using ExtractionTest = SampleHostTest;

TEST_F(ExtractionTest, CurrentAndUserConfigurationsFromTheStore) {
  // Given the imported sample host, the current configuration holds every
  // stored item, store-generated identities included, but not the quorlet
  // daemon on a host not integrated with the desired-state platform, nor
  // the instance a solution created.
  Document expected = SampleDocument("user-config.json");
  expected.RemoveMember("quorlet");
  Value& users = expected["security"]["accounts"]["users"];
  for (auto it = users.Begin(); it != users.End();) {
    it = std::string((*it)["name"].GetString()) == "mgmtagent" ? users.Erase(it) : it + 1;
  }
  const Document current = ExtractCurrentConfiguration();
  // Canonical keeps array order: instances keep the order they were stored in.
  EXPECT_EQ(Canonical(current), Canonical(expected));

  // The portable profile drops store-generated identities and solution
  // instances but keeps solution users that the administrator configured.
  const Document user = ExtractUserConfiguration(true);
  ASSERT_EQ(user.MemberCount(), 1u);
  const Value& profile = user["profile"];
  for (const Value& route : profile["network"]["routes"]["static"].GetArray()) {
    EXPECT_FALSE(route.HasMember("cs_generated_id")) << JsonToString(route);
  }
  std::vector<std::string> names;
  for (const Value& u : profile["security"]["accounts"]["users"].GetArray()) names.push_back(u["name"].GetString());
  EXPECT_EQ(names, (std::vector<std::string>{"root", "ops"}));
  EXPECT_FALSE(profile.HasMember("quorlet"));

  const Document plain = ExtractUserConfiguration(false);
  EXPECT_FALSE(plain.HasMember("profile"));
  EXPECT_TRUE(plain.HasMember("network"));

  SetFeatures(R"({"dspIntegrated": false})");
  EXPECT_FALSE(ExtractCurrentConfiguration().HasMember("quorlet"));
  SetFeatures(R"({"dspIntegrated": true})");
  EXPECT_EQ(JsonToString(ExtractCurrentConfiguration()["quorlet"]["system"]["quorlet_daemon"]), R"({"enabled":false})");
}

TEST_F(ExtractionTest, DesiredConfigurationIsWhatWasStaged) {
  EXPECT_EQ(JsonToString(ExtractDesiredConfiguration()), "{}");
  // A staged profile comes back without its wrapper, as the boot path needs it.
  const Document user = SampleDocument("user-config.json");
  Document staged = Parse(R"({"profile":{"network":)" + JsonToString(user["network"]) + "}}");
  HoxConfigStore::SetDesiredUserConfig(staged);
  const Document desired = ExtractDesiredConfiguration();
  EXPECT_EQ(desired.MemberCount(), 1u);
  EXPECT_EQ(Canonical(desired["network"]["dns"]), Canonical(user["network"]["dns"]));
}

// A second key whose default is mutable, installed before the store loads.
class TwoMutableDefaultsTest : public SampleHostTest {
 protected:
  void SetUp() override {
    root_.InstallSampleSchemas();
    root_.WriteFile("/usr/lib/tarvik/configmanager/schemas/services/time/chrony.json",
                    root_.ReadFile("/usr/lib/tarvik/configmanager/schemas/services/time/ntp.json"));
    SampleHostTest::SetUp();
  }
};

TEST_F(TwoMutableDefaultsTest, DeletedMutableDefaultsAreRefusedByTheCurrentExtractionOnly) {
  // Defaults that may be changed but never deleted: chrony has no user
  // configuration at all, and ntp's is removed; one error names both. Once
  // chrony is configured it passes the check and only ntp is named.
  DeleteRawRows(0, "services", "time", "ntp");
  for (const char* deleted : {"services:time:chrony,services:time:ntp", "services:time:ntp"}) {
    const Thrown thrown = ThrownBy([] { ExtractCurrentConfiguration(); });
    EXPECT_EQ(thrown.code, 2027);
    EXPECT_EQ(thrown.message, "Deleting default configuration for " + std::string(deleted) + " is not supported.");
    InsertRawRow(0, "services", "time", "chrony", "", R"({"enabled":true})");
  }
  // The user configuration (export) does not run the delete check.
  EXPECT_NO_THROW(ExtractUserConfiguration(true));
}

TEST_F(ExtractionTest, BadRowsFailWithTheirCodeAndLeaveTheStoreUntouched) {
  const struct {
    const char* name;
    std::string component, group, key, value;
    int code;
    std::string identifier = {};
  } rows[] = {
      {"value that is not JSON", "services", "syslog", "config", R"({"remoteHost": "x")", 2080},
      {"deleted default marker", "services", "syslog", "config", "DELETE_DEFAULT", 2027},
      {"value that is not an object", "services", "syslog", "config", R"(["x"])", 2000},
      {"value with invalid UTF-8", "services", "syslog", "config", "{\"remoteHost\": \"\xff\"}", 2080},
      {"key without schema", "services", "syslog", "retired_key", R"({"a": 1})", 2021},
      {"instance of a singleton key", "services", "syslog", "config", R"({"port": 1})", 2084, "second"},
      {"instance without identifier", "storage", "nfs", "mounts", R"({"name": "x"})", 2084},
  };
  // The kind of row each extraction reads.
  const std::tuple<int, const char*, std::function<void()>> extractions[] = {
      {0, "current", [] { ExtractCurrentConfiguration(); }},
      {0, "user", [] { ExtractUserConfiguration(false); }},
      {0, "profile", [] { ExtractUserConfiguration(true); }},
      {0, "export", [] { ExportDocument(); }},
      {2, "desired", [] { ExtractDesiredConfiguration(); }},
      {3, "smartnic", [] { ExtractSmartnicConfiguration(); }},
  };
  for (const auto& bad : rows) {
    for (int kind : {0, 2, 3}) {
      // SmartNIC items are not checked against schemas; the other faults count.
      if (kind == 3 && (bad.code == 2021 || bad.code == 2084)) continue;
      InsertRawRow(kind, bad.component, bad.group, bad.key, bad.identifier, bad.value);
      const std::vector<std::string> before = DumpRows();
      for (const auto& [rowKind, name, extract] : extractions) {
        if (rowKind != kind) continue;
        const Thrown thrown = ThrownBy(extract);
        EXPECT_EQ(thrown.code, bad.code) << bad.name << ": " << name << ": " << thrown.message;
      }
      EXPECT_EQ(DumpRows(), before) << bad.name;
      DeleteRawRows(kind, bad.component, bad.group, bad.key);
    }
  }
}

TEST_F(ExtractionTest, SmartnicItemsAreNormalised) {
  InsertRawRow(3, "network", "dpu", "uplinks", "p0", R"({"speed": 100, "name": "p0"})");
  InsertRawRow(3, "network", "dpu", "uplinks", "p1", R"({"name": "p1", "speed": 25})");
  InsertRawRow(3, "network", "dpu", "mode", "", R"({"offload": true})");
  EXPECT_EQ(JsonToString(ExtractSmartnicConfiguration()),
            R"({"network":{"dpu":{"mode":{"offload":true},)"
            R"("uplinks":[{"name":"p0","speed":100},{"name":"p1","speed":25}]}}})");
}

TEST_F(ExtractionTest, ExportIsNormalisedAndCarriesTheReferenceHost) {
  // The host's identity in the export is checked through hoxcfg; here the
  // normalisation: members sorted at every level, so that two exports of
  // one host compare as text.
  root_.WriteFile("/sys/class/dmi/id/product_uuid", "4C4C4544-0042-3510-8053-B4C04F4E3132\n");
  const Document exported = ExportDocument();
  const std::string text = JsonToString(exported);
  EXPECT_EQ(Canonical(exported), text);
  EXPECT_EQ(text, JsonToString(ExportDocument()));
  EXPECT_NE(JsonToString(exported["metadata"]["reference_host"]).find(R"("build":)"), std::string::npos) << text;
  EXPECT_NE(text.find("lab.example.com"), std::string::npos);
}

TEST_F(ExtractionTest, SshFilesEditedOutsideTheLibraryAreExtracted) {
  // A directory where the server configuration should be cannot be read;
  // extraction goes on with the stored options.
  root_.WriteFile("/etc/ssh/sshd_config/placeholder", "");
  Document current;
  ASSERT_NO_THROW(current = ExtractCurrentConfiguration());
  EXPECT_STREQ(current["security"]["ssh"]["server"]["options"]["Port"].GetString(), "22");

  std::filesystem::remove_all(root_.Path("/etc/ssh/sshd_config"));
  root_.WriteFile("/etc/ssh/sshd_config", "Port 2222\nPermitRootLogin no\n");
  root_.WriteFile("/root/.ssh/authorized_keys", "ssh-ed25519 AAAAC3NzaC1lZDI1NTE5AAAAIOnlyKey only@test\n");
  // With file edits blocked only the authorised keys are synchronised.
  SetFeatures(R"({"Qmkapps_BlockSshFileEdits": true})");
  current = ExtractCurrentConfiguration();
  const Value& ssh = current["security"]["ssh"];
  EXPECT_STREQ(ssh["server"]["options"]["Port"].GetString(), "22");
  ASSERT_EQ(ssh["authorized_keys"].Size(), 1u);
  EXPECT_STREQ(ssh["authorized_keys"][0]["comment"].GetString(), "only@test");

  SetFeatures("{}");
  current = ExtractCurrentConfiguration();
  EXPECT_STREQ(current["security"]["ssh"]["server"]["options"]["Port"].GetString(), "2222");
}

}  // namespace
}  // namespace hoxcm_test
