// A temporary host root holding the sample host's schemas and configuration
// in a real store, with rows planted as the library itself would never write
// them. Not thread-safe (see TempRoot).
#pragma once

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>

#include "support/json.h"
#include "support/store_sql.h"
#include "support/temp_root.h"
#include "support/thrown.h"

namespace hoxcm_test {

class SampleHostTest : public ::testing::Test {
 protected:
  // Schemas installed; user and default configuration imported.
  void SetUp() override {
    root_.InstallSampleSchemas();
    HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::Default, SampleDocument("default-config.json"));
    HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::User, SampleDocument("user-config.json"));
  }

  // Sets the feature switches of the host facts file.
  void SetFeatures(const std::string& featuresJson) const {
    root_.WriteFile("/etc/tarvik/host-facts.json", "{\"features\": " + featuresJson + "}");
  }
  // Inserts a row as the store keeps it (kind 0 user, 1 default, 2 desired,
  // 3 SmartNIC), bypassing every check of the library.
  void InsertRawRow(int kind, const std::string& component, const std::string& group, const std::string& key,
                    const std::string& identifier, const std::string& value) const {
    StoreSql("INSERT OR REPLACE INTO config_item (kind, component, config_group, name, identifier, value) "
                 "VALUES (?1, ?2, ?3, ?4, ?5, ?6)",
                 {std::to_string(kind), component, group, key, identifier, value});
  }
  void DeleteRawRows(int kind, const std::string& component, const std::string& group, const std::string& key) const {
    StoreSql("DELETE FROM config_item WHERE kind = ?1 AND component = ?2 AND config_group = ?3 AND name = ?4",
                 {std::to_string(kind), component, group, key});
  }
  // Every row of the store, every column, in a stable order, as text.
  std::vector<std::string> DumpRows() const { return StoreSql("SELECT * FROM config_item ORDER BY seq"); }

  TempRoot root_;
};

}  // namespace hoxcm_test
