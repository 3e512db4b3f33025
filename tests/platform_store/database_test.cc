// Opening, refusing and transacting on the configuration store file.
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <limits>
#include <thread>

#include "platform/store/database.h"
#include "platform_store/store_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigStore;

TEST_F(StoreTest, MissingStoreIsCreatedPrivatelyInWalModeUnlessCreationIsRefused) {
  EXPECT_EQ(ThrownBy([] { GetDBStore(0, false); }).code, 2001);
  EXPECT_FALSE(std::filesystem::exists(StorePath()));

  EXPECT_EQ(GetDBStore()->GetPath(), StorePath());
  EXPECT_EQ(StoreSql("SELECT version FROM schema_version; PRAGMA journal_mode"),
            (std::vector<std::string>{std::to_string(detail::kSchemaVersion) + "|", "wal|"}));
  // The store holds sensitive values in clear: nobody else may read it.
  SetBootMode(BOOTMODE_NORMAL);
  for (const char* suffix : {"", "-wal"}) {
    struct stat st {};
    ASSERT_EQ(stat((StorePath() + suffix).c_str(), &st), 0) << suffix;
    EXPECT_EQ(st.st_mode & 077, 0u) << suffix;
  }
}

// Files that are not a store of this version must be refused as they are.
TEST_F(StoreTest, CorruptForeignOrNewerStoresAreRefusedAndLeftUntouched) {
  std::string header("SQLite format 3", 16);
  header += std::string(84, '\x7f') + std::string(4000, 'x');
  // (file contents, or empty for a fresh store changed by SQL; SQL; reason)
  const std::vector<std::tuple<std::string, std::string, const char*>> cases = {
      {std::string(8192, '\xa5'), "", "not a readable"},
      {header, "", "not a readable"},
      {"", "DROP TABLE schema_version; CREATE TABLE other (x)", "not a configuration store"},
      {"", "UPDATE schema_version SET version = " + std::to_string(detail::kSchemaVersion + 1), "newer"},
      // Damaged version rows: never taken as a step of the migration.
      {"", "UPDATE schema_version SET version = -3", "layout version \"-3\" is not valid"},
      {"", "UPDATE schema_version SET version = 0", "layout version \"0\" is not valid"},
      {"", "UPDATE schema_version SET version = 'one'", "layout version \"one\" is not valid"},
      {"", "INSERT INTO schema_version VALUES (1)", "more than one layout version"},
  };
  for (const auto& [contents, sql, reason] : cases) {
    SCOPED_TRACE(reason + (" " + sql));
    TempRoot root;
    if (contents.empty()) {
      // A valid store made by another process, then changed behind its back.
      const pid_t child = fork();
      if (child == 0) {
        GetDBStore();
        _exit(0);
      }
      ExitCodeOf(child);
      StoreSql("PRAGMA journal_mode = DELETE; " + sql);
    } else {
      root.WriteFile(kStoreHostPath, contents);
    }
    const std::string before = root.ReadFile(kStoreHostPath);
    const Thrown f = ThrownBy([] { GetDBStore(); });
    EXPECT_EQ(f.code, 2001);
    EXPECT_NE(f.message.find(reason), std::string::npos) << f.message;
    EXPECT_TRUE(root.ReadFile(kStoreHostPath) == before) << "the refused file was changed";
    EXPECT_EQ(ConfigStore::GetStore(sGlobalNamespace), nullptr);
  }
}

TEST_F(StoreTest, AnOlderStoreIsMigratedKeepingItsContentsAndGainsABoundedApplyHistory) {
  // Given a store of the first layout, with configuration in it.
  const pid_t child = fork();
  if (child == 0) {
    ApplyUserConfigChanges({{"SET", {"system", "identity", "hostname"}, R"({"hostname":"a"})"}});
    _exit(0);
  }
  ExitCodeOf(child);
  StoreSql("DROP TABLE apply_history; UPDATE schema_version SET version = 1");
  const auto before = StoreSql("SELECT component, name, value FROM config_item");

  EXPECT_EQ(AppendApplyHistoryRow("r1", 2), 1);
  EXPECT_EQ(StoreSql("SELECT version FROM schema_version"),
            std::vector<std::string>{std::to_string(detail::kSchemaVersion) + "|"});
  EXPECT_EQ(StoreSql("SELECT component, name, value FROM config_item"), before);
  // Sequences keep growing after the oldest rows are dropped.
  for (const char* record : {"r2", "r3"}) AppendApplyHistoryRow(record, 2);
  std::vector<std::string> rows;
  for (const ApplyHistoryRow& row : GetApplyHistoryRows()) rows.push_back(std::to_string(row.sequence) + row.record);
  EXPECT_EQ(rows, (std::vector<std::string>{"2r2", "3r3"}));
}

TEST_F(StoreTest, TransactionCommitsOnlyWhenCommittedAndOthersWaitOrSeeNothingUntilThen) {
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
    ConfigStoreTransaction transaction(global);
    writeAll();
    EXPECT_EQ(GetBootMode(), BOOTMODE_DESIRED_STAGED);  // visible inside
  }
  EXPECT_EQ(global->GetObject(id), nullptr);
  EXPECT_EQ(GetBootMode(), BOOTMODE_NORMAL);
  EXPECT_TRUE(Rows(ConfigKind::User).empty());

  ConfigStoreTransaction transaction(global);
  EXPECT_THROW(ConfigStoreTransaction inner(global), ConfigStoreException);  // no nesting
  writeAll();
  const pid_t child = fork();
  if (child == 0) _exit(GetBootMode() == BOOTMODE_NORMAL && Rows(ConfigKind::User).empty() ? 0 : 1);
  EXPECT_EQ(ExitCodeOf(child), 0) << "another process saw uncommitted writes";
  // A writer on another thread is serialised after the transaction.
  std::thread other([] { SetBootMode(BOOTMODE_BOOTSTRAP); });
  std::this_thread::sleep_for(std::chrono::milliseconds(50));
  EXPECT_EQ(GetBootMode(), BOOTMODE_DESIRED_STAGED);
  transaction.Commit();
  other.join();
  EXPECT_NE(global->GetObject(id), nullptr);
  EXPECT_EQ(GetBootMode(), BOOTMODE_BOOTSTRAP);
  EXPECT_EQ(Rows(ConfigKind::User).size(), 1u);
  EXPECT_THROW(transaction.Commit(), ConfigStoreException);
}

TEST_F(StoreTest, FailedWritersLeaveTheStoreAsItWas) {
  ApplyUserConfigChanges({{"SET", {"system", "identity", "hostname"}, R"({"hostname":"a"})"}});
  const auto before = Rows(ConfigKind::User);
  // A malformed value in the middle of a batch, an unknown operation: nothing
  // of the batch lands.
  EXPECT_EQ(ThrownBy([] {
              ApplyUserConfigChanges({{"SET", {"system", "identity", "hostname"}, R"({"hostname":"b"})"},
                                      {"ADD", {"storage", "nfs", "mounts", "x"}, "{not json"}});
            }).code,
            2080);
  EXPECT_EQ(ThrownBy([] { ApplyUserConfigChanges({{"RENAME", {"system", "identity", "hostname"}, "{}"}}); }).code,
            2000);
  // Two instances with one identity, a named instance without identity, a
  // singleton given as an array.
  for (const auto& [text, code] : std::vector<std::pair<const char*, int>>{
           {R"({"storage":{"nfs":{"mounts":[{"name":"a","export":"/a"},{"name":"a","export":"/b"}]}}})", 2084},
           {R"({"storage":{"nfs":{"mounts":[{"server":"s"}]}}})", 2084},
           {R"({"system":{"identity":{"hostname":[]}}})", 2000}}) {
    EXPECT_EQ(ThrownBy([&] { ImportConfiguration(ConfigKind::User, Parse(text)); }).code, code) << text;
  }
  EXPECT_EQ(Rows(ConfigKind::User), before);

  // Values built in code that no JSON text can hold (a string that is not
  // UTF-8, a NaN) are refused instead of stored where they would break
  // every later reader.
  for (const bool nan : {false, true}) {
    rapidjson::Document doc = Parse(R"({"system":{"identity":{"hostname":{"hostname":"x"}}}})");
    rapidjson::Value& object = doc["system"]["identity"]["hostname"];
    if (nan) {
      object["hostname"].SetDouble(std::numeric_limits<double>::quiet_NaN());
    } else {
      object["hostname"].SetString("caf\xe9", doc.GetAllocator());
    }
    EXPECT_THROW(ImportConfiguration(ConfigKind::User, doc), ConfigStoreException);
    EXPECT_THROW(SetDesiredUserConfig(doc), ConfigStoreException);
    EXPECT_THROW(ProcessDesiredObject(doc.GetAllocator(), GetDBStore(), "system", "identity", "hostname", nullptr,
                                      object),
                 ConfigStoreException);
  }
  EXPECT_EQ(Rows(ConfigKind::User), before);
  EXPECT_TRUE(Rows(ConfigKind::Desired).empty());

  // SQLite itself fails in the middle of a batch (a trigger stands in for a
  // full disk): the statements already run are undone.
  StoreSql("CREATE TRIGGER boom BEFORE INSERT ON config_item WHEN NEW.name = 'boom' "
                      "BEGIN SELECT RAISE(ABORT, 'disk full'); END");
  const std::vector<UserConfigChange> failing = {{"DELETE", {"system", "identity", "hostname"}, ""},
                                                 {"SET", {"x", "y", "boom"}, "{}"}};
  EXPECT_THROW(ApplyUserConfigChanges(failing), ConfigStoreException);
  EXPECT_EQ(Rows(ConfigKind::User), before);

  // Inside a transaction a failed writer undoes only its own part.
  ConfigStoreTransaction transaction(ConfigStore::GetStore(sGlobalNamespace));
  SetBootMode(BOOTMODE_BOOTSTRAP);
  EXPECT_THROW(ApplyUserConfigChanges(failing), ConfigStoreException);
  transaction.Commit();
  EXPECT_EQ(GetBootMode(), BOOTMODE_BOOTSTRAP);
  EXPECT_EQ(Rows(ConfigKind::User), before);
}

}  // namespace
}  // namespace hoxcm_test
