// Host state kept in the store: boot mode, the boot-apply record, boot-time
// restore failures and maintenance mode.
#include <hoxcm/config_store.h>

#include "platform/store/database.h"

namespace HoxConfigStore {

using detail::Database;

namespace {

constexpr const char* kBootMode = "bootMode";
constexpr const char* kBootApplyRecord = "bootApplyRecord";
constexpr const char* kBootComplete = "isBootComplete";
constexpr const char* kMaintenanceMode = "maintenanceMode";

// The stored text of a state value; `fallback` when it was never set.
std::string ReadState(const char* name, const std::string& fallback) {
  return detail::CurrentDatabase(true)->Read([&](Database& db) {
    auto select = db.Prepare("SELECT value FROM host_state WHERE name = ?");
    select.Bind(1, name);
    return select.Step() ? select.Text(0) : fallback;
  });
}

void WriteState(Database& db, const char* name, const std::string& value) {
  db.Prepare("INSERT INTO host_state (name, value) VALUES (?, ?) ON CONFLICT (name) DO UPDATE SET value = excluded.value")
      .Bind(1, name)
      .Bind(2, value)
      .Run();
}

void WriteState(const char* name, const std::string& value) {
  detail::CurrentDatabase(true)->Write("set host state", [&](Database& db) { WriteState(db, name, value); });
}

}  // namespace

BOOTMODE GetBootMode() {
  const std::string text = ReadState(kBootMode, "0");
  // A damaged row must not become a mode nobody handles (or "normal" by
  // accident, which would allow host changes during a staged boot).
  for (BOOTMODE mode : {BOOTMODE_NORMAL, BOOTMODE_BOOTSTRAP, BOOTMODE_DESIRED_STAGED}) {
    if (text == std::to_string(static_cast<int>(mode))) return mode;
  }
  const std::string error = "ConfigStore error: the stored boot mode \"" + text + "\" is not a boot mode";
  throw ConfigStoreException(2000, error.c_str());
}

void SetBootMode(BOOTMODE mode) { WriteState(kBootMode, std::to_string(static_cast<int>(mode))); }

rapidjson::Document getBootApplyRecord() {
  std::string record;
  bool complete = false;
  // Both values from one snapshot.
  detail::CurrentDatabase(true)->Read([&](Database& db) {
    auto select = db.Prepare("SELECT name, value FROM host_state WHERE name IN (?, ?)");
    select.Bind(1, kBootApplyRecord).Bind(2, kBootComplete);
    while (select.Step()) {
      if (select.TextView(0) == kBootApplyRecord) {
        record = select.Text(1);
      } else {
        complete = select.TextView(1) == "1";
      }
    }
  });
  rapidjson::Document doc(rapidjson::kObjectType);
  doc.AddMember(rapidjson::StringRef(kBootComplete), complete, doc.GetAllocator());
  doc.AddMember(rapidjson::StringRef(kBootApplyRecord), rapidjson::Value(record, doc.GetAllocator()),
                doc.GetAllocator());
  return doc;
}

void setBootApplyRecord(const std::string& record) { WriteState(kBootApplyRecord, record); }

void SetBootComplete(bool complete) { WriteState(kBootComplete, complete ? "1" : "0"); }

std::vector<FailureRecord> GetBootTimeRestoreFailures() {
  return detail::CurrentDatabase(true)->Read([](Database& db) {
    std::vector<FailureRecord> failures;
    auto select = db.Prepare("SELECT component, config_group, name FROM restore_failure ORDER BY seq");
    while (select.Step()) failures.push_back({select.Text(0), select.Text(1), select.Text(2)});
    return failures;
  });
}

void AddBootTimeRestoreFailure(const FailureRecord& failure) {
  detail::CurrentDatabase(true)->Write("add restore failure", [&](Database& db) {
    db.Prepare("INSERT INTO restore_failure (component, config_group, name) VALUES (?, ?, ?)")
        .Bind(1, failure.component)
        .Bind(2, failure.group)
        .Bind(3, failure.key)
        .Run();
  });
}

void ClearBootTimeRestoreFailures() {
  detail::CurrentDatabase(true)->Write("clear restore failures",
                                       [](Database& db) { db.Exec("DELETE FROM restore_failure", "clear"); });
}

bool GetMaintenanceMode() { return ReadState(kMaintenanceMode, "0") == "1"; }

void SetMaintenanceMode(bool enabled) { WriteState(kMaintenanceMode, enabled ? "1" : "0"); }

}  // namespace HoxConfigStore
