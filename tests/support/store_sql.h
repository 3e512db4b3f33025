// Raw SQL on the store file of the current root, outside the library: for
// planting rows and damage the library never writes, and for looking at the
// file as another reader would. Header-only; not thread-safe.
#pragma once

#include <sqlite3.h>

#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include <hoxcm/host.h>

namespace hoxcm_test {

inline const std::string kStoreHostPath(HoxPlatform::HostPaths::kStore);

// Runs the statements of `sql`, binding `args` as text to those that take
// parameters; returns every row they yield as "column|column|...|". Throws
// std::runtime_error on any SQLite failure.
inline std::vector<std::string> StoreSql(const std::string& sql, const std::vector<std::string>& args = {}) {
  sqlite3* raw = nullptr;
  const int rc = sqlite3_open_v2(HoxPlatform::HostPath(kStoreHostPath).c_str(), &raw, SQLITE_OPEN_READWRITE, nullptr);
  const std::unique_ptr<sqlite3, int (*)(sqlite3*)> db(raw, sqlite3_close);
  if (rc != SQLITE_OK) throw std::runtime_error(sqlite3_errmsg(raw));
  std::vector<std::string> rows;
  for (const char* next = sql.c_str(); *next != '\0';) {
    sqlite3_stmt* stmt = nullptr;
    if (sqlite3_prepare_v2(raw, next, -1, &stmt, &next) != SQLITE_OK) throw std::runtime_error(sqlite3_errmsg(raw));
    if (stmt == nullptr) continue;  // trailing blanks
    const std::unique_ptr<sqlite3_stmt, int (*)(sqlite3_stmt*)> finalize(stmt, sqlite3_finalize);
    for (int i = 0; i < sqlite3_bind_parameter_count(stmt); ++i) {
      sqlite3_bind_text(stmt, i + 1, args.at(i).c_str(), -1, SQLITE_TRANSIENT);
    }
    int step;
    while ((step = sqlite3_step(stmt)) == SQLITE_ROW) {
      std::string line;
      for (int i = 0; i < sqlite3_column_count(stmt); ++i) {
        const unsigned char* text = sqlite3_column_text(stmt, i);
        line += std::string(text ? reinterpret_cast<const char*>(text) : "") + "|";
      }
      rows.push_back(line);
    }
    if (step != SQLITE_DONE) throw std::runtime_error(sqlite3_errmsg(raw));
  }
  return rows;
}

}  // namespace hoxcm_test
