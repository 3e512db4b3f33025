// A temporary host root holding the sample host's schemas and configuration
// in a real store, and raw access to the store's rows for planting rows the
// library itself would never write. Not thread-safe (see TempRoot).
#pragma once

#include <sqlite3.h>

#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/host.h>

#include "support/temp_root.h"
#include "support/thrown.h"

namespace hoxcm_test {

// Runs one SQL statement with text arguments on the store of the current
// root, outside the library; `rows`, when given, receives each result row as
// "column|column|...|".
inline void ExecStoreSql(const std::string& sql, const std::vector<std::string>& args = {},
                         std::vector<std::string>* rows = nullptr) {
  sqlite3* raw = nullptr;
  const int rc = sqlite3_open_v2(HoxPlatform::HostPath("/var/lib/tarvik/configstore/configstore.db").c_str(), &raw,
                                 SQLITE_OPEN_READWRITE, nullptr);
  const std::unique_ptr<sqlite3, int (*)(sqlite3*)> db(raw, sqlite3_close);
  sqlite3_stmt* stmt = nullptr;
  if (rc != SQLITE_OK || sqlite3_prepare_v2(raw, sql.c_str(), -1, &stmt, nullptr) != SQLITE_OK) {
    throw std::runtime_error(sqlite3_errmsg(raw));
  }
  const std::unique_ptr<sqlite3_stmt, int (*)(sqlite3_stmt*)> finalize(stmt, sqlite3_finalize);
  for (std::size_t i = 0; i < args.size(); ++i) {
    sqlite3_bind_text(stmt, static_cast<int>(i + 1), args[i].c_str(), -1, SQLITE_TRANSIENT);
  }
  int step;
  while ((step = sqlite3_step(stmt)) == SQLITE_ROW) {
    std::string line;
    for (int i = 0; i < sqlite3_column_count(stmt); ++i) {
      const unsigned char* text = sqlite3_column_text(stmt, i);
      line += std::string(text ? reinterpret_cast<const char*>(text) : "") + "|";
    }
    if (rows != nullptr) rows->push_back(line);
  }
  if (step != SQLITE_DONE) throw std::runtime_error(sqlite3_errmsg(raw));
}

class SampleHostTest : public ::testing::Test {
 protected:
  // Schemas installed; user and default configuration imported.
  void SetUp() override {
    root_.InstallSampleSchemas();
    HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::Default, SampleDocument("default-config.json"));
    HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::User, SampleDocument("user-config.json"));
  }

  // A sample file parsed ("user-config.json", ...).
  static rapidjson::Document SampleDocument(const std::string& name) {
    rapidjson::Document doc;
    HoxConfigManager::CreateDocumentFromFile(SourcePath("data/sample-host/" + name).c_str(), doc);
    return doc;
  }
  // Sets the feature switches of the host facts file.
  void SetFeatures(const std::string& featuresJson) const {
    root_.WriteFile("/etc/tarvik/host-facts.json", "{\"features\": " + featuresJson + "}");
  }
  // Inserts a row as the store keeps it (kind 0 user, 1 default, 2 desired,
  // 3 SmartNIC), bypassing every check of the library.
  void InsertRawRow(int kind, const std::string& component, const std::string& group, const std::string& key,
                    const std::string& identifier, const std::string& value) const {
    ExecStoreSql("INSERT OR REPLACE INTO config_item (kind, component, config_group, name, identifier, value) "
                 "VALUES (?1, ?2, ?3, ?4, ?5, ?6)",
                 {std::to_string(kind), component, group, key, identifier, value});
  }
  void DeleteRawRows(int kind, const std::string& component, const std::string& group, const std::string& key) const {
    ExecStoreSql("DELETE FROM config_item WHERE kind = ?1 AND component = ?2 AND config_group = ?3 AND name = ?4",
                 {std::to_string(kind), component, group, key});
  }
  // Every row of the store, every column, in a stable order, as text.
  std::vector<std::string> DumpRows() const {
    std::vector<std::string> rows;
    ExecStoreSql("SELECT * FROM config_item ORDER BY seq", {}, &rows);
    return rows;
  }

  TempRoot root_;
};

}  // namespace hoxcm_test
