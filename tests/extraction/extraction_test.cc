// Extraction of host documents from a real store in a temporary root.
#include <algorithm>
#include <functional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/operations.h>
#include <hoxcm/schema_store.h>

#include "extraction/sample_host.h"

namespace hoxcm_test {
namespace {

using HoxConfigManager::Document;
using HoxConfigManager::Value;

std::string Json(const Value& value) { return HoxConfigManager::JsonToString(value); }

// Compact text of a value with its members sorted, for comparisons that
// must not depend on member order.
std::string Canonical(const Value& value) {
  Document copy;
  copy.CopyFrom(value, copy.GetAllocator());
  HoxConfigStore::ConfigStoreDocument::NormalizeValue(copy, copy.GetAllocator());
  return Json(copy);
}

// The sample user configuration as extraction should return it: the quorlet
// daemon is left out on a host not integrated with the desired-state
// platform, and the instance a solution created is never extracted.
Document ExpectedCurrent() {
  Document doc;
  HoxConfigManager::CreateDocumentFromFile(SourcePath("data/sample-host/user-config.json").c_str(), doc);
  doc.RemoveMember("quorlet");
  Value& users = doc["security"]["accounts"]["users"];
  for (auto it = users.Begin(); it != users.End();) {
    it = std::string((*it)["name"].GetString()) == "mgmtagent" ? users.Erase(it) : it + 1;
  }
  return doc;
}

class ExtractionTest : public SampleHostTest {};

TEST_F(ExtractionTest, CurrentConfigurationIsTheStoredUserConfiguration) {
  // Given the imported sample host, the current configuration should hold
  // every stored item, store-generated identities included.
  const Document current = HoxConfigManager::ExtractCurrentConfiguration();
  EXPECT_EQ(Canonical(current), Canonical(ExpectedCurrent()));
  EXPECT_TRUE(current["network"]["routes"]["static"][0].HasMember("cs_generated_id"));
  // Instances keep the order in which they were stored.
  EXPECT_STREQ(current["network"]["interfaces"]["vnic"][2]["name"].GetString(), "vnic2");
}

TEST_F(ExtractionTest, UserConfigurationWithProfileIsPortable) {
  // The profile drops store-generated identities and solution instances but
  // keeps solution users that the host's administrator configured.
  const Document user = HoxConfigManager::ExtractUserConfiguration(true);
  ASSERT_TRUE(user.IsObject());
  ASSERT_EQ(user.MemberCount(), 1u);
  const Value& profile = user["profile"];
  for (const Value& route : profile["network"]["routes"]["static"].GetArray()) {
    EXPECT_FALSE(route.HasMember("cs_generated_id")) << Json(route);
  }
  std::vector<std::string> users;
  for (const Value& u : profile["security"]["accounts"]["users"].GetArray()) users.push_back(u["name"].GetString());
  EXPECT_EQ(users, (std::vector<std::string>{"root", "ops"}));
  EXPECT_FALSE(profile.HasMember("quorlet"));

  const Document plain = HoxConfigManager::ExtractUserConfiguration(false);
  EXPECT_FALSE(plain.HasMember("profile"));
  EXPECT_TRUE(plain.HasMember("network"));
}

TEST_F(ExtractionTest, QuorletIsExtractedOnlyOnIntegratedHosts) {
  SetFeatures(R"({"dspIntegrated": false})");
  EXPECT_FALSE(HoxConfigManager::ExtractCurrentConfiguration().HasMember("quorlet"));
  SetFeatures(R"({"dspIntegrated": true})");
  const Document current = HoxConfigManager::ExtractCurrentConfiguration();
  ASSERT_TRUE(current.HasMember("quorlet"));
  EXPECT_EQ(Json(current["quorlet"]["system"]["quorlet_daemon"]), R"({"enabled":false})");
}

TEST_F(ExtractionTest, DesiredConfigurationIsWhatWasStaged) {
  EXPECT_EQ(Json(HoxConfigManager::ExtractDesiredConfiguration()), "{}");

  // A staged profile comes back without its wrapper, as the boot path needs it.
  Document staged;
  staged.SetObject();
  Document user = SampleDocument("user-config.json");
  Value network(user["network"], staged.GetAllocator());
  Value profile(rapidjson::kObjectType);
  profile.AddMember("network", network, staged.GetAllocator());
  staged.AddMember("profile", profile, staged.GetAllocator());
  HoxConfigStore::SetDesiredUserConfig(staged);

  const Document desired = HoxConfigManager::ExtractDesiredConfiguration();
  ASSERT_TRUE(desired.HasMember("network"));
  EXPECT_FALSE(desired.HasMember("profile"));
  EXPECT_FALSE(desired.HasMember("security"));
  EXPECT_EQ(Canonical(desired["network"]["dns"]), Canonical(user["network"]["dns"]));
  EXPECT_EQ(desired["network"]["interfaces"]["vnic"].Size(), 3u);
}

TEST_F(ExtractionTest, EmptyContentsGiveAnEmptyDocument) {
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  for (auto [type, expected] : std::vector<std::pair<HoxConfigManager::DocumentType, std::string>>{
           {HoxConfigManager::DOCUMENT_CURRENT, "{}"},
           {HoxConfigManager::DOCUMENT_PROFILE, R"({"profile":{}})"},
           {HoxConfigManager::DOCUMENT_DESIRED, "{}"}}) {
    Document result;
    result.SetObject();
    HoxConfigManager::ProcessConfigMapList(result, {}, store, type);
    EXPECT_EQ(Json(result), expected) << "type " << type;
  }
}

TEST_F(ExtractionTest, DeletedMutableDefaultIsRefusedByTheCurrentExtractionOnly) {
  // Given a host whose NTP configuration (a default that may be changed but
  // never deleted) was removed, the current configuration cannot be stated.
  DeleteRawRows(0, "services", "time", "ntp");
  try {
    HoxConfigManager::ExtractCurrentConfiguration();
    FAIL() << "expected 2027";
  } catch (const HoxConfigManager::ConfigManagerException& e) {
    EXPECT_EQ(e.GetErrorCode(), 2027);
    EXPECT_STREQ(e.what(), "Deleting default configuration for services:time:ntp is not supported.");
  }
  // The user configuration (export) does not run the delete check.
  EXPECT_NO_THROW(HoxConfigManager::ExtractUserConfiguration(true));
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

TEST_F(TwoMutableDefaultsTest, EveryDeletedDefaultIsNamedInOneError) {
  // chrony has no user configuration at all, and ntp's is removed: one error
  // names both.
  DeleteRawRows(0, "services", "time", "ntp");
  auto expectRefused = [](const char* message) {
    try {
      HoxConfigManager::ExtractCurrentConfiguration();
      ADD_FAILURE() << "expected 2027";
    } catch (const HoxConfigManager::ConfigManagerException& e) {
      EXPECT_EQ(e.GetErrorCode(), 2027);
      EXPECT_STREQ(e.what(), message);
    }
  };
  expectRefused("Deleting default configuration for services:time:chrony,services:time:ntp is not supported.");
  // A mutable default present in the user configuration passes the check.
  InsertRawRow(0, "services", "time", "chrony", "", R"({"enabled":true})");
  expectRefused("Deleting default configuration for services:time:ntp is not supported.");
}

// A row the store holds but cannot be turned into a document.
struct BadRow {
  const char* name;
  std::string component, group, key, value;
  int code;
  std::string identifier = {};
};

const std::vector<BadRow>& BadRows() {
  static const std::vector<BadRow> kRows = {
      {"value that is not JSON", "services", "syslog", "config", R"({"remoteHost": "x")", 2080},
      {"deleted default marker", "services", "syslog", "config", "DELETE_DEFAULT", 2027},
      {"value that is not an object", "services", "syslog", "config", R"(["x"])", 2000},
      {"value with invalid UTF-8", "services", "syslog", "config", "{\"remoteHost\": \"\xff\"}", 2080},
      {"key without schema", "services", "syslog", "retired_key", R"({"a": 1})", 2021},
      {"instance of a singleton key", "services", "syslog", "config", R"({"port": 1})", 2084, "second"},
      {"instance without identifier", "storage", "nfs", "mounts", R"({"name": "x"})", 2084},
  };
  return kRows;
}

TEST_F(ExtractionTest, BadUserRowsFailWithTheirCodeAndLeaveTheStoreUntouched) {
  const std::vector<std::pair<const char*, std::function<void()>>> extractions = {
      {"current", [] { HoxConfigManager::ExtractCurrentConfiguration(); }},
      {"user", [] { HoxConfigManager::ExtractUserConfiguration(false); }},
      {"profile", [] { HoxConfigManager::ExtractUserConfiguration(true); }},
      {"export", [] { HoxConfigManager::ExportDocument(); }},
  };
  for (const BadRow& bad : BadRows()) {
    InsertRawRow(0, bad.component, bad.group, bad.key, bad.identifier, bad.value);
    const std::vector<std::string> before = DumpRows();
    for (const auto& [name, extract] : extractions) {
      try {
        extract();
        ADD_FAILURE() << bad.name << ": " << name << " succeeded";
      } catch (const HoxConfigStore::ConfigStoreException& e) {
        EXPECT_EQ(e.GetErrorCode(), bad.code) << bad.name << ": " << name << ": " << e.what();
      }
    }
    EXPECT_EQ(DumpRows(), before) << bad.name;
    DeleteRawRows(0, bad.component, bad.group, bad.key);
  }
}

TEST_F(ExtractionTest, BadDesiredAndSmartnicRowsFailWithTheirCode) {
  for (const BadRow& bad : BadRows()) {
    InsertRawRow(2, bad.component, bad.group, bad.key, bad.identifier, bad.value);
    try {
      HoxConfigManager::ExtractDesiredConfiguration();
      ADD_FAILURE() << bad.name << " succeeded";
    } catch (const HoxConfigStore::ConfigStoreException& e) {
      EXPECT_EQ(e.GetErrorCode(), bad.code) << bad.name << ": " << e.what();
    }
    DeleteRawRows(2, bad.component, bad.group, bad.key);
  }
  // SmartNIC items are not checked against schemas; the other faults count.
  for (const BadRow& bad : BadRows()) {
    if (bad.code == 2021 || bad.code == 2084) continue;
    InsertRawRow(3, bad.component, bad.group, bad.key, bad.identifier, bad.value);
    try {
      HoxConfigManager::ExtractSmartnicConfiguration();
      ADD_FAILURE() << bad.name << " succeeded";
    } catch (const HoxConfigStore::ConfigStoreException& e) {
      EXPECT_EQ(e.GetErrorCode(), bad.code) << bad.name << ": " << e.what();
    }
    DeleteRawRows(3, bad.component, bad.group, bad.key);
  }
}

TEST_F(ExtractionTest, SmartnicItemsAreNormalised) {
  InsertRawRow(3, "network", "dpu", "uplinks", "p0", R"({"speed": 100, "name": "p0"})");
  InsertRawRow(3, "network", "dpu", "uplinks", "p1", R"({"name": "p1", "speed": 25})");
  InsertRawRow(3, "network", "dpu", "mode", "", R"({"offload": true})");
  const Document nic = HoxConfigManager::ExtractSmartnicConfiguration();
  EXPECT_EQ(Json(nic), R"({"network":{"dpu":{"mode":{"offload":true},)"
                       R"("uplinks":[{"name":"p0","speed":100},{"name":"p1","speed":25}]}}})");
}

TEST_F(ExtractionTest, ExportCarriesTheReferenceHost) {
  root_.WriteFile("/sys/class/dmi/id/product_uuid", "4C4C4544-0042-3510-8053-B4C04F4E3132\n");
  const Document exported = HoxConfigManager::ExportDocument();
  const Value* host = rapidjson::Pointer("/metadata/reference_host").Get(exported);
  ASSERT_NE(host, nullptr) << Json(exported);
  const auto version = QmkCtl::System::SystemInfoImpl::GetQmkVersion();
  EXPECT_STREQ((*host)["uuid"].GetString(), "4c4c4544-0042-3510-8053-b4c04f4e3132");
  EXPECT_EQ((*host)["uuid"].GetString(), HoxConfigManager::GetBIOSUUID());
  EXPECT_EQ((*host)["build"].GetString(), version.build);
  EXPECT_EQ((*host)["version"].GetString(), version.version);
  EXPECT_EQ((*host)["patch"].GetString(), version.patch);
  EXPECT_EQ((*host)["update"].GetString(), version.update);
  // Normalised: members sorted at every level, so two exports of one host
  // compare as text.
  std::vector<std::string> names;
  for (const auto& m : exported.GetObject()) names.push_back(m.name.GetString());
  EXPECT_TRUE(std::is_sorted(names.begin(), names.end()));
  EXPECT_EQ(Json(exported), Json(HoxConfigManager::ExportDocument()));
  // The host-independent part keeps the sample's DNS configuration.
  const std::string text = Json(exported);
  EXPECT_NE(text.find("lab.example.com"), std::string::npos);
}

TEST_F(ExtractionTest, SshFilesEditedOutsideTheLibraryAreExtracted) {
  root_.WriteFile("/etc/ssh/sshd_config", "Port 2222\nPermitRootLogin no\n");
  root_.WriteFile("/etc/ssh/ssh_config", "ServerAliveInterval 30\n");
  root_.WriteFile("/root/.ssh/authorized_keys", "ssh-ed25519 AAAAC3NzaC1lZDI1NTE5AAAAIOnlyKey only@test\n");

  // With file edits blocked only the authorised keys are synchronised.
  SetFeatures(R"({"Qmkapps_BlockSshFileEdits": true})");
  Document current = HoxConfigManager::ExtractCurrentConfiguration();
  EXPECT_STREQ(current["security"]["ssh"]["server"]["options"]["Port"].GetString(), "22");
  ASSERT_EQ(current["security"]["ssh"]["authorized_keys"].Size(), 1u);
  EXPECT_STREQ(current["security"]["ssh"]["authorized_keys"][0]["comment"].GetString(), "only@test");

  SetFeatures("{}");
  current = HoxConfigManager::ExtractCurrentConfiguration();
  EXPECT_STREQ(current["security"]["ssh"]["server"]["options"]["Port"].GetString(), "2222");
  EXPECT_STREQ(current["security"]["ssh"]["client"]["options"]["ServerAliveInterval"].GetString(), "30");
}

TEST_F(ExtractionTest, UnreadableSshFileDoesNotStopExtraction) {
  // A directory where the server configuration should be cannot be read.
  root_.WriteFile("/etc/ssh/sshd_config/placeholder", "");
  Document current;
  ASSERT_NO_THROW(current = HoxConfigManager::ExtractCurrentConfiguration());
  EXPECT_STREQ(current["security"]["ssh"]["server"]["options"]["Port"].GetString(), "22");
}

}  // namespace
}  // namespace hoxcm_test
