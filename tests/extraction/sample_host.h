// A temporary host root holding the sample host's schemas and configuration
// in a real store, and raw access to the store's rows for planting rows the
// library itself would never write.
#pragma once

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <hoxcm/json.h>

#include "support/temp_root.h"
#include "support/thrown.h"

namespace hoxcm_test {

// Runs one SQL statement with text arguments on the store of the current
// root, outside the library.
void ExecStoreSql(const std::string& sql, const std::vector<std::string>& args = {});

class SampleHostTest : public ::testing::Test {
 protected:
  // Schemas installed; user and default configuration imported.
  void SetUp() override;

  // A sample file parsed ("user-config.json", ...).
  static rapidjson::Document SampleDocument(const std::string& name);
  // Sets the feature switches of the host facts file.
  void SetFeatures(const std::string& featuresJson) const;
  // Inserts a row as the store keeps it (kind 0 user, 1 default, 2 desired,
  // 3 SmartNIC), bypassing every check of the library.
  void InsertRawRow(int kind, const std::string& component, const std::string& group, const std::string& key,
                    const std::string& identifier, const std::string& value) const;
  void DeleteRawRows(int kind, const std::string& component, const std::string& group,
                     const std::string& key) const;
  // Every row of the store, every column, in a stable order, as text.
  std::vector<std::string> DumpRows() const;

  TempRoot root_;
};

}  // namespace hoxcm_test
