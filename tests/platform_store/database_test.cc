// Opening, refusing and transacting on the configuration store file.
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <limits>
#include <thread>

#include "platform_store/store_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigStore;

int QueryInt(const std::string& path, const std::string& sql) {
  sqlite3* db = nullptr;
  sqlite3_open(path.c_str(), &db);
  sqlite3_stmt* stmt = nullptr;
  sqlite3_prepare_v2(db, sql.c_str(), -1, &stmt, nullptr);
  const int value = sqlite3_step(stmt) == SQLITE_ROW ? sqlite3_column_int(stmt, 0) : -1;
  sqlite3_finalize(stmt);
  sqlite3_close(db);
  return value;
}

TEST_F(StoreTest, MissingStoreIsCreatedWithLayoutVersionInWalMode) {
  // Given an empty root, the first connection creates the store below it.
  auto db = GetDBStore();
  EXPECT_EQ(db->GetPath(), StorePath());
  EXPECT_TRUE(std::filesystem::exists(StorePath()));
  EXPECT_EQ(QueryInt(StorePath(), "SELECT version FROM schema_version"), 1);
  sqlite3* raw = nullptr;
  sqlite3_open(StorePath().c_str(), &raw);
  sqlite3_stmt* stmt = nullptr;
  sqlite3_prepare_v2(raw, "PRAGMA journal_mode", -1, &stmt, nullptr);
  ASSERT_EQ(sqlite3_step(stmt), SQLITE_ROW);
  EXPECT_STREQ(reinterpret_cast<const char*>(sqlite3_column_text(stmt, 0)), "wal");
  sqlite3_finalize(stmt);
  sqlite3_close(raw);
  // The connection is shared per root.
  EXPECT_EQ(GetDBStore().get(), db.get());
  // The store holds sensitive values in clear: nobody else may read it.
  SetBootMode(BOOTMODE_NORMAL);
  for (const char* suffix : {"", "-wal"}) {
    struct stat st {};
    ASSERT_EQ(stat((StorePath() + suffix).c_str(), &st), 0) << suffix;
    EXPECT_EQ(st.st_mode & 077, 0u) << suffix;
  }
}

TEST_F(StoreTest, MissingStoreIsNotCreatedWhenCreationIsNotAllowed) {
  try {
    GetDBStore(0, false);
    FAIL() << "expected ConfigStoreException";
  } catch (const ConfigStoreException& e) {
    EXPECT_EQ(e.GetErrorCode(), 2001);
  }
  EXPECT_FALSE(std::filesystem::exists(StorePath()));
}

// Files that are not a store of this version must be refused as they are.
TEST_F(StoreTest, CorruptForeignOrNewerStoresAreRefusedAndLeftUntouched) {
  struct Case {
    const char* name;
    std::string contents;  // empty: made by `sql` on a fresh store
    std::string sql;
    const char* reason;
  };
  std::string header("SQLite format 3", 16);
  header += std::string(84, '\x7f') + std::string(4000, 'x');
  const std::vector<Case> cases = {
      {"garbage", std::string(8192, '\xa5'), "", "not a readable"},
      {"damaged header", header, "", "not a readable"},
      {"foreign database", "", "DROP TABLE schema_version; CREATE TABLE other (x)", "not a configuration store"},
      {"newer layout", "", "UPDATE schema_version SET version = 2", "newer"},
      // Damaged version rows: never taken as a step of the migration.
      {"negative layout", "", "UPDATE schema_version SET version = -3", "layout version \"-3\" is not valid"},
      {"zero layout", "", "UPDATE schema_version SET version = 0", "layout version \"0\" is not valid"},
      {"text layout", "", "UPDATE schema_version SET version = 'one'", "layout version \"one\" is not valid"},
      {"two layout rows", "", "INSERT INTO schema_version VALUES (1)", "more than one layout version"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    TempRoot root;
    const std::string path = root.Path(kStoreHostPath);
    if (c.contents.empty()) {
      // A valid store made by another process, then changed behind its back.
      const pid_t child = fork();
      if (child == 0) {
        GetDBStore();
        _exit(0);
      }
      waitpid(child, nullptr, 0);
      RawSql(path, "PRAGMA journal_mode = DELETE; " + c.sql);
    } else {
      root.WriteFile(kStoreHostPath, c.contents);
    }
    const std::string before = FileBytes(path);
    try {
      GetDBStore();
      FAIL() << "expected the store to be refused";
    } catch (const ConfigStoreException& e) {
      EXPECT_EQ(e.GetErrorCode(), 2001);
      EXPECT_NE(std::string(e.what()).find(c.reason), std::string::npos) << e.what();
    }
    EXPECT_TRUE(FileBytes(path) == before) << "the refused file was changed";
    EXPECT_EQ(ConfigStore::GetStore(sGlobalNamespace), nullptr);
  }
}

TEST_F(StoreTest, TransactionCommitsOnlyWhenCommitted) {
  auto global = ConfigStore::GetStore(sGlobalNamespace);
  ASSERT_NE(global, nullptr);
  const ConfigStoreObjectId id("autodeploy", "bootstrap", "hox");
  auto writeAll = [&] {
    ConfigStoreObject object(id);
    object.SetValue("firewall", "<rules/>");
    global->SetObject(object);
    SetBootMode(BOOTMODE_DESIRED_STAGED);
    ApplyUserConfigChanges({{"SET", {"system", "identity", "hostname"}, R"({"hostname":"a"})"}});
  };
  {
    // Given writers inside a transaction that is destroyed uncommitted,
    // nothing they wrote should remain.
    ConfigStoreTransaction transaction(global);
    writeAll();
    EXPECT_EQ(GetBootMode(), BOOTMODE_DESIRED_STAGED);  // visible inside
  }
  EXPECT_EQ(global->GetObject(id), nullptr);
  EXPECT_EQ(GetBootMode(), BOOTMODE_NORMAL);
  EXPECT_TRUE(Rows(ConfigKind::User).empty());

  ConfigStoreTransaction transaction(global);
  writeAll();
  // Another process does not see the open transaction's writes.
  const pid_t child = fork();
  if (child == 0) _exit(GetBootMode() == BOOTMODE_NORMAL && Rows(ConfigKind::User).empty() ? 0 : 1);
  int status = 0;
  waitpid(child, &status, 0);
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
  transaction.Commit();
  EXPECT_NE(global->GetObject(id), nullptr);
  EXPECT_EQ(GetBootMode(), BOOTMODE_DESIRED_STAGED);
  EXPECT_EQ(Rows(ConfigKind::User).size(), 1u);
  EXPECT_THROW(transaction.Commit(), ConfigStoreException);
}

TEST_F(StoreTest, TransactionsDoNotNestAndOtherThreadsWaitForThem) {
  auto global = ConfigStore::GetStore(sGlobalNamespace);
  ConfigStoreTransaction outer(global);
  EXPECT_THROW(ConfigStoreTransaction inner(global), ConfigStoreException);
  SetMaintenanceMode(true);
  // A writer on another thread is serialised after the transaction.
  std::thread other([] { SetMaintenanceMode(false); });
  std::this_thread::sleep_for(std::chrono::milliseconds(50));
  EXPECT_TRUE(GetMaintenanceMode());
  outer.Commit();
  other.join();
  EXPECT_FALSE(GetMaintenanceMode());
}

TEST_F(StoreTest, FailedWritersLeaveTheStoreAsItWas) {
  ApplyUserConfigChanges({{"SET", {"system", "identity", "hostname"}, R"({"hostname":"a"})"}});
  const auto before = Rows(ConfigKind::User);

  // A malformed value in the middle of a batch: nothing of the batch lands.
  try {
    ApplyUserConfigChanges({{"SET", {"system", "identity", "hostname"}, R"({"hostname":"b"})"},
                            {"ADD", {"storage", "nfs", "mounts", "x"}, "{not json"}});
    FAIL() << "expected 2080";
  } catch (const HoxConfigManager::InvalidArgumentException& e) {
    EXPECT_EQ(e.GetErrorCode(), 2080);
  }
  EXPECT_THROW(ApplyUserConfigChanges({{"RENAME", {"system", "identity", "hostname"}, "{}"}}), ConfigStoreException);
  // Two instances with one identity, and a named instance without identity.
  EXPECT_THROW(ImportConfiguration(ConfigKind::User, Json(R"({"storage":{"nfs":{"mounts":[
      {"name":"a","server":"s","export":"/a"},{"name":"a","server":"t","export":"/b"}]}}})")),
               HoxConfigManager::ConfigManagerException);
  EXPECT_THROW(ImportConfiguration(ConfigKind::User, Json(R"({"storage":{"nfs":{"mounts":[{"server":"s"}]}}})")),
               HoxConfigManager::ConfigManagerException);
  // A singleton given as an array.
  EXPECT_THROW(ImportConfiguration(ConfigKind::User, Json(R"({"system":{"identity":{"hostname":[]}}})")),
               ConfigStoreException);
  EXPECT_EQ(Rows(ConfigKind::User), before);

  // Values built in code that no JSON text can hold (a string that is not
  // UTF-8, a NaN) are refused instead of stored where they would break
  // every later reader.
  for (const bool nan : {false, true}) {
    rapidjson::Document doc = Json(R"({"system":{"identity":{"hostname":{"hostname":"x"}}}})");
    rapidjson::Value& host = doc["system"]["identity"]["hostname"]["hostname"];
    if (nan) {
      host.SetDouble(std::numeric_limits<double>::quiet_NaN());
    } else {
      host.SetString("caf\xe9", doc.GetAllocator());
    }
    EXPECT_THROW(ImportConfiguration(ConfigKind::User, doc), ConfigStoreException);
    EXPECT_THROW(SetDesiredUserConfig(doc), ConfigStoreException);
    EXPECT_THROW(ProcessDesiredObject(doc.GetAllocator(), GetDBStore(), "system", "identity", "hostname", nullptr,
                                      doc["system"]["identity"]["hostname"]),
                 ConfigStoreException);
  }
  EXPECT_EQ(Rows(ConfigKind::User), before);
  EXPECT_TRUE(Rows(ConfigKind::Desired).empty());

  // SQLite itself fails in the middle of a batch (a trigger stands in for a
  // full disk): the statements already run are undone.
  RawSql(StorePath(), "CREATE TRIGGER boom BEFORE INSERT ON config_item WHEN NEW.name = 'boom' "
                      "BEGIN SELECT RAISE(ABORT, 'disk full'); END");
  const std::vector<UserConfigChange> failing = {{"DELETE", {"system", "identity", "hostname"}, ""},
                                                 {"SET", {"x", "y", "boom"}, "{}"}};
  EXPECT_THROW(ApplyUserConfigChanges(failing), ConfigStoreException);
  EXPECT_EQ(Rows(ConfigKind::User), before);

  // Inside a transaction a failed writer undoes only its own part.
  auto global = ConfigStore::GetStore(sGlobalNamespace);
  ConfigStoreTransaction transaction(global);
  SetBootMode(BOOTMODE_BOOTSTRAP);
  EXPECT_THROW(ApplyUserConfigChanges(failing), ConfigStoreException);
  transaction.Commit();
  EXPECT_EQ(GetBootMode(), BOOTMODE_BOOTSTRAP);
  EXPECT_EQ(Rows(ConfigKind::User), before);
}

}  // namespace
}  // namespace hoxcm_test
