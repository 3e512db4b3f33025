// Compliance and apply tasks against a real configuration store: the host's
// configuration is extracted by the walk itself, items only on the host are
// compared with their default configuration, and malformed documents leave
// the store as it was.
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <hoxcm/config_store.h>
#include <hoxcm/operations.h>

#include "drift/drift_fixture.h"

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
      HoxConfigStore::ImportConfiguration(kind, Parse(hoxcm_test::ReadSource(std::string("data/sample-host/") + file)));
    }
  }

  hoxcm_test::TempRoot root_;
};

TEST_F(DriftStoreTest, TheHostsOwnConfigurationIsCompliantAndNeedsNoTasks) {
  Document desired = HoxConfigManager::ExtractUserConfiguration(true);
  HoxConfigManager::ComplianceResult result;
  HoxConfigManager::CheckCompliance(desired, result);
  EXPECT_TRUE(result.compliant);
  EXPECT_EQ(HoxConfigManager::JsonToString(result.document), R"({"ADDS":[],"DELETES":[],"SETS":[]})");
  EXPECT_TRUE(HoxConfigManager::GenerateApplyTasks(desired).empty());
}

TEST_F(DriftStoreTest, ItemsMissingFromTheDesiredDocumentRevertToTheirDefault) {
  // Given a desired document without the DNS configuration (which has a
  // default) and without the NFS mounts (which have none), the DNS item is
  // compared with its default and the mounts are deleted.
  Document desired = HoxConfigManager::ExtractCurrentConfiguration();
  desired["network"].RemoveMember("dns");
  desired["storage"].RemoveMember("nfs");
  std::vector<std::string> seen;
  for (const auto& task : HoxConfigManager::GenerateApplyTasks(desired)) {
    seen.push_back(task.action + " " + task.object->GetConfigStoreObjectId().toString());
  }
  ASSERT_EQ(seen.size(), 3u) << ::testing::PrintToString(seen);
  EXPECT_EQ(seen[0], "SET comp network grp dns key config");
  EXPECT_EQ(seen[1].rfind("DELETE comp storage grp nfs key mounts id ", 0), 0u);
  EXPECT_EQ(seen[2].rfind("DELETE comp storage grp nfs key mounts id ", 0), 0u);
}

TEST_F(DriftStoreTest, MalformedDocumentsThrowAndLeaveTheStoreUntouched) {
  const auto storeText = [] {
    std::string out;
    for (const auto& row : HoxConfigStore::GetUserConfigContents(HoxConfigStore::GetDBStore())) {
      for (const auto& [column, value] : *row) out += column + "=" + value + ";";
      out += "\n";
    }
    return out;
  };
  const std::string before = storeText();
  for (const char* text : {
           R"([1])",
           R"({"network":{"dns":{"config":"x"}}})",
           R"({"network":{"dns":{"config":{"servers":["1.1.1.1"]}}},"storage":{"nfs":{"mounts":[{"server":"s"}]}}})",
           R"({"profile":{"network":{"nope":{"x":{}}}}})",
           R"({"network":{"interfaces":{"vnic":[{"name":["vnic0"]}]}}})",
       }) {
    Document desired = Parse(text);
    HoxConfigManager::ComplianceResult result;
    EXPECT_THROW(HoxConfigManager::CheckCompliance(desired, result), HoxConfigStore::ConfigStoreException) << text;
    EXPECT_THROW(HoxConfigManager::GenerateApplyTasks(desired), HoxConfigStore::ConfigStoreException) << text;
    EXPECT_EQ(storeText(), before) << text;
  }
}

}  // namespace
