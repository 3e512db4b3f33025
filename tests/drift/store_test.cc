// Compliance and apply tasks against a real configuration store: the host's
// configuration is extracted by the walk itself, items only on the host are
// compared with their default configuration, and malformed documents leave
// the store as it was.
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <hoxcm/config_store.h>
#include <hoxcm/extraction.h>

#include "drift/drift_fixture.h"
#include "support/thrown.h"

namespace {

using HoxConfigManager::Document;
using hoxcm_test::Parse;

class DriftStoreTest : public ::testing::Test {
 protected:
  DriftStoreTest() {
    root_.InstallSampleSchemas();
    HoxConfigStore::GetDBStore(0, true);
    for (const auto& [kind, file] : {std::pair{HoxConfigStore::ConfigKind::Default, "default-config.json"},
                                     std::pair{HoxConfigStore::ConfigKind::User, "user-config.json"}}) {
      HoxConfigStore::ImportConfiguration(kind, hoxcm_test::SampleDocument(file));
    }
  }

  hoxcm_test::TempRoot root_;
};

TEST_F(DriftStoreTest, OwnConfigurationIsCompliantAndMissingItemsRevertToTheirDefault) {
  // Given the configuration as extraction presents it, nothing is reported.
  Document desired = HoxConfigManager::ExtractUserConfiguration(true);
  HoxConfigManager::ComplianceResult result;
  HoxConfigManager::CheckCompliance(desired, result);
  EXPECT_TRUE(result.compliant);
  EXPECT_EQ(HoxConfigManager::JsonToString(result.document), R"({"ADDS":[],"DELETES":[],"SETS":[]})");
  EXPECT_TRUE(HoxConfigManager::GenerateApplyTasks(desired).empty());
  // Without the DNS configuration (which has a default) and the NFS mounts
  // (which have none), the DNS item is compared with its default and the
  // mounts are deleted.
  desired = HoxConfigManager::ExtractCurrentConfiguration();
  desired["network"].RemoveMember("dns");
  desired["storage"].RemoveMember("nfs");
  hoxcm_test::Calls seen;
  for (const auto& task : HoxConfigManager::GenerateApplyTasks(desired)) {
    seen.push_back(task.action + " " + task.object->GetConfigStoreObjectId().toString());
  }
  EXPECT_EQ(seen, (hoxcm_test::Calls{"SET comp network grp dns key config",
                                      "DELETE comp storage grp nfs key mounts id iso-library",
                                      "DELETE comp storage grp nfs key mounts id templates"}));
}

TEST_F(DriftStoreTest, MalformedDocumentsThrowBeforeAnyReportAndLeaveTheStoreUntouched) {
  // Structural faults keep their code and text and say where they are: the
  // deepest level of the document the walk reached.
  struct Case {
    const char* what;
    const char* desired;
    std::string place;
    std::string failure = "2000 Invalid JSON";
  };
  const std::vector<Case> cases = {
      {"document is an array", "[1]", ""},
      {"component is a string", R"({"network":"x"})", "/network"},
      {"group is an array", R"({"network":{"dns":[]}})", "/network/dns"},
      {"singleton is an array", R"({"network":{"dns":{"config":[]}}})", "/network/dns/config"},
      {"instances are an object", R"({"storage":{"nfs":{"mounts":{}}}})", "/storage/nfs/mounts"},
      {"instance is a string", R"({"storage":{"nfs":{"mounts":["a"]}}})", "/storage/nfs/mounts/0"},
      {"instance without identity after a valid one",
       R"({"storage":{"nfs":{"mounts":[{"name":"a"},{"server":"s"}]}}})", "/storage/nfs/mounts/1"},
      {"identity is not a string", R"({"network":{"interfaces":{"vnic":[{"name":["vnic0"]}]}}})",
       "/network/interfaces/vnic/0"},
      {"key without schema", R"({"no":{"such":{"key":{}}}})", "", "2021 Schema object not found: /no/such/key"},
      {"key without schema in a profile", R"({"profile":{"network":{"nope":{"x":{}}}}})", "",
       "2021 Schema object not found: /network/nope/x"},
  };
  const auto storeText = [] {
    std::string out;
    for (const auto& row : HoxConfigStore::GetUserConfigContents(HoxConfigStore::GetDBStore())) {
      for (const auto& [column, value] : *row) out += column + "=" + value + ";\n";
    }
    return out;
  };
  const std::string before = storeText();
  for (const Case& c : cases) {
    Document desired = Parse(c.desired);
    hoxcm_test::RecordingHandler handler;
    const auto walk = [&] { ComputeDrift(desired, desired.GetAllocator(), handler, Parse("{}")); };
    EXPECT_EQ(hoxcm_test::Failure(walk), c.failure) << c.what;
    EXPECT_EQ(hoxcm_test::FaultPlace(walk), c.place) << c.what;
    EXPECT_EQ(handler.calls, hoxcm_test::Calls{}) << c.what;
    HoxConfigManager::ComplianceResult result;
    const auto compliance = [&] { HoxConfigManager::CheckCompliance(desired, result); };
    EXPECT_EQ(hoxcm_test::Failure(compliance), c.failure) << c.what;
    EXPECT_EQ(hoxcm_test::FaultPlace(compliance), c.place) << c.what;
    const auto tasks = [&] { HoxConfigManager::GenerateApplyTasks(desired); };
    EXPECT_EQ(hoxcm_test::Failure(tasks), c.failure) << c.what;
    EXPECT_EQ(hoxcm_test::FaultPlace(tasks), c.place) << c.what;
    EXPECT_EQ(storeText(), before) << c.what;
  }
}

}  // namespace
