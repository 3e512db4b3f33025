// Shared fixture of the configuration store tests: a temporary host root
// with the sample schemas installed, and helpers to look at the store the
// way a reader outside the library would.
#pragma once

#include <sys/wait.h>

#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>
#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>

#include "support/store_sql.h"
#include "support/temp_root.h"
#include "support/thrown.h"

#include "support/json.h"

namespace hoxcm_test {

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

inline std::string Compact(const rapidjson::Value& value) { return HoxConfigManager::JsonToString(value); }

// Waits for a child process: its exit code, or -1 when it did not exit.
inline int ExitCodeOf(pid_t child) {
  int status = 0;
  waitpid(child, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

class StoreTest : public ::testing::Test {
 protected:
  void SetUp() override { root_.InstallSampleSchemas(); }
  std::string StorePath() const { return root_.Path(kStoreHostPath); }

  TempRoot root_;
};

}  // namespace hoxcm_test
