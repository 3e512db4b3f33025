// Shared fixture of the configuration store tests: a temporary host root
// with the sample schemas installed, and helpers to look at the store the
// way a reader outside the library would.
#pragma once

#include <sqlite3.h>

#include <fstream>
#include <sstream>
#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>
#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>

#include "support/temp_root.h"

namespace hoxcm_test {

inline constexpr const char* kStoreHostPath = "/var/lib/tarvik/configstore/configstore.db";

// (component, group, key, identifier, value) of a contents row.
using RowTuple = std::tuple<std::string, std::string, std::string, std::string, std::string>;

inline std::vector<RowTuple> Rows(const HoxConfigStore::ConfigMapList& rows) {
  std::vector<RowTuple> out;
  for (const auto& row : rows) {
    out.emplace_back(row->at("Component"), row->at("ConfigGroup"), row->at("Name"), row->at("Identifier"),
                     row->at("Value"));
  }
  return out;
}

inline std::vector<RowTuple> Rows(HoxConfigStore::ConfigKind kind) {
  return Rows(HoxConfigStore::GetConfigContents(HoxConfigStore::GetDBStore(), kind));
}

inline rapidjson::Document Json(const std::string& text) {
  rapidjson::Document doc;
  HoxConfigManager::ParseDocument(text, doc);
  return doc;
}

inline std::string FileBytes(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::stringstream ss;
  ss << in.rdbuf();
  return ss.str();
}

// Runs SQL on the store file through a connection of its own.
inline void RawSql(const std::string& path, const std::string& sql) {
  sqlite3* db = nullptr;
  ASSERT_EQ(sqlite3_open(path.c_str(), &db), SQLITE_OK);
  char* error = nullptr;
  const int rc = sqlite3_exec(db, sql.c_str(), nullptr, nullptr, &error);
  const std::string message = error != nullptr ? error : "";
  sqlite3_free(error);
  sqlite3_close(db);
  ASSERT_EQ(rc, SQLITE_OK) << message;
}

class StoreTest : public ::testing::Test {
 protected:
  void SetUp() override { root_.InstallSampleSchemas(); }
  std::string StorePath() const { return root_.Path(kStoreHostPath); }

  TempRoot root_;
};

}  // namespace hoxcm_test
