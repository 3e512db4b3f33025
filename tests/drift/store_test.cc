// Compliance and apply tasks against a real configuration store: the host's
// configuration is extracted by the walk itself, items only on the host are
// compared with their default configuration, and malformed documents leave
// the store as it was.
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/drift.h>
#include <hoxcm/operations.h>

#include "support/temp_root.h"

namespace {

using HoxConfigManager::Document;

std::string ReadSource(const std::string& relative) {
  std::ifstream in(hoxcm_test::SourcePath(relative));
  return std::string(std::istreambuf_iterator<char>(in), {});
}

Document Parse(const std::string& text) {
  Document doc;
  HoxConfigManager::ParseDocument(text, doc);
  return doc;
}

class DriftStoreTest : public ::testing::Test {
 protected:
  DriftStoreTest() {
    root_.InstallSampleSchemas();
    HoxConfigStore::GetDBStore(0, true);
    HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::Default,
                                        Parse(ReadSource("data/sample-host/default-config.json")));
    HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::User,
                                        Parse(ReadSource("data/sample-host/user-config.json")));
  }

  static std::string StoreText() {
    std::string out;
    for (const auto& row : HoxConfigStore::GetUserConfigContents(HoxConfigStore::GetDBStore())) {
      for (const auto& [column, value] : *row) out += column + "=" + value + ";";
      out += "\n";
    }
    return out;
  }

  hoxcm_test::TempRoot root_;
};

TEST_F(DriftStoreTest, TheHostsOwnConfigurationIsCompliantAndNeedsNoTasks) {
  // Given the configuration as extraction presents it, wrapped or bare.
  Document desired = HoxConfigManager::ExtractUserConfiguration(true);
  HoxConfigManager::ComplianceResult result;
  HoxConfigManager::CheckCompliance(desired, result);
  EXPECT_TRUE(result.compliant) << HoxConfigManager::JsonToString(result.document);
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
  const std::string before = StoreText();
  const std::vector<std::string> documents = {
      R"([1])",
      R"({"network":{"dns":{"config":"x"}}})",
      R"({"network":{"dns":{"config":{"servers":["1.1.1.1"]}}},"storage":{"nfs":{"mounts":[{"server":"s"}]}}})",
      R"({"profile":{"network":{"nope":{"x":{}}}}})",
      R"({"network":{"interfaces":{"vnic":[{"name":["vnic0"]}]}}})",
  };
  for (const std::string& text : documents) {
    Document desired = Parse(text);
    HoxConfigManager::ComplianceResult result;
    EXPECT_THROW(HoxConfigManager::CheckCompliance(desired, result), HoxConfigStore::ConfigStoreException) << text;
    EXPECT_THROW(HoxConfigManager::GenerateApplyTasks(desired), HoxConfigStore::ConfigStoreException) << text;
    EXPECT_EQ(StoreText(), before) << text;
  }
}

}  // namespace
