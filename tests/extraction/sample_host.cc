#include "extraction/sample_host.h"

#include <sqlite3.h>

#include <memory>
#include <stdexcept>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/host.h>

namespace hoxcm_test {
namespace {

struct CloseDb {
  void operator()(sqlite3* db) const { sqlite3_close(db); }
};

std::unique_ptr<sqlite3, CloseDb> OpenStore() {
  sqlite3* db = nullptr;
  const int rc = sqlite3_open_v2(HoxPlatform::HostPath("/var/lib/tarvik/configstore/configstore.db").c_str(), &db,
                                 SQLITE_OPEN_READWRITE, nullptr);
  std::unique_ptr<sqlite3, CloseDb> owned(db);
  if (rc != SQLITE_OK) throw std::runtime_error("cannot open the store");
  sqlite3_busy_timeout(db, 5000);
  return owned;
}

}  // namespace

void ExecStoreSql(const std::string& sql, const std::vector<std::string>& args) {
  auto db = OpenStore();
  sqlite3_stmt* raw = nullptr;
  if (sqlite3_prepare_v2(db.get(), sql.c_str(), -1, &raw, nullptr) != SQLITE_OK) {
    throw std::runtime_error(sqlite3_errmsg(db.get()));
  }
  std::unique_ptr<sqlite3_stmt, int (*)(sqlite3_stmt*)> stmt(raw, sqlite3_finalize);
  for (std::size_t i = 0; i < args.size(); ++i) {
    sqlite3_bind_text(raw, static_cast<int>(i + 1), args[i].c_str(), -1, SQLITE_TRANSIENT);
  }
  if (sqlite3_step(raw) != SQLITE_DONE) throw std::runtime_error(sqlite3_errmsg(db.get()));
}

void SampleHostTest::SetUp() {
  root_.InstallSampleSchemas();
  HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::Default, SampleDocument("default-config.json"));
  HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::User, SampleDocument("user-config.json"));
}

rapidjson::Document SampleHostTest::SampleDocument(const std::string& name) {
  rapidjson::Document doc;
  HoxConfigManager::CreateDocumentFromFile(SourcePath("data/sample-host/" + name).c_str(), doc);
  return doc;
}

void SampleHostTest::SetFeatures(const std::string& featuresJson) const {
  root_.WriteFile("/etc/tarvik/host-facts.json", "{\"features\": " + featuresJson + "}");
}

void SampleHostTest::InsertRawRow(int kind, const std::string& component, const std::string& group,
                                  const std::string& key, const std::string& identifier,
                                  const std::string& value) const {
  ExecStoreSql(
      "INSERT OR REPLACE INTO config_item (kind, component, config_group, name, identifier, value) "
      "VALUES (?1, ?2, ?3, ?4, ?5, ?6)",
      {std::to_string(kind), component, group, key, identifier, value});
}

void SampleHostTest::DeleteRawRows(int kind, const std::string& component, const std::string& group,
                                   const std::string& key) const {
  ExecStoreSql("DELETE FROM config_item WHERE kind = ?1 AND component = ?2 AND config_group = ?3 AND name = ?4",
               {std::to_string(kind), component, group, key});
}

std::vector<std::string> SampleHostTest::DumpRows() const {
  auto db = OpenStore();
  std::vector<std::string> rows;
  auto collect = [](void* out, int columns, char** values, char**) {
    std::string line;
    for (int i = 0; i < columns; ++i) line += std::string(values[i] ? values[i] : "") + "|";
    static_cast<std::vector<std::string>*>(out)->push_back(line);
    return 0;
  };
  if (sqlite3_exec(db.get(), "SELECT * FROM config_item ORDER BY seq", collect, &rows, nullptr) != SQLITE_OK) {
    throw std::runtime_error(sqlite3_errmsg(db.get()));
  }
  return rows;
}

}  // namespace hoxcm_test
