#include "platform/store/database.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include <chrono>
#include <filesystem>
#include <map>
#include <system_error>

#include <hoxcm/errors.h>
#include <hoxcm/files.h>
#include <hoxcm/host.h>

#include "platform/failpoint.h"
#include "platform/file_descriptor.h"

namespace HoxConfigStore::detail {
namespace {

constexpr int kConnectFailed = 2001;

// Layout changes, one per version: kMigrations[n] takes a store from version
// n to n + 1. Applied in one transaction, so a store is never half migrated.
constexpr const char* kMigrations[] = {
    // 0 -> 1: the first layout.
    R"sql(
CREATE TABLE schema_version (version INTEGER NOT NULL);
INSERT INTO schema_version (version) VALUES (0);
CREATE TABLE config_item (
  seq INTEGER PRIMARY KEY,
  kind INTEGER NOT NULL,
  component TEXT NOT NULL,
  config_group TEXT NOT NULL,
  name TEXT NOT NULL,
  identifier TEXT NOT NULL DEFAULT '',
  value TEXT NOT NULL,
  auto_conf_value TEXT,
  UNIQUE (kind, component, config_group, name, identifier)
);
CREATE INDEX config_item_order ON config_item (kind, component, config_group, name, seq);
CREATE TABLE namespace_object (
  namespace TEXT NOT NULL,
  component TEXT NOT NULL,
  config_group TEXT NOT NULL,
  name TEXT NOT NULL,
  identifier TEXT NOT NULL DEFAULT '',
  value_name TEXT NOT NULL,
  value TEXT NOT NULL,
  PRIMARY KEY (namespace, component, config_group, name, identifier, value_name)
);
CREATE TABLE host_state (name TEXT PRIMARY KEY, value TEXT NOT NULL);
CREATE TABLE restore_failure (
  seq INTEGER PRIMARY KEY,
  component TEXT NOT NULL,
  config_group TEXT NOT NULL,
  name TEXT NOT NULL
);
)sql",
    // 1 -> 2: the apply history, one JSON record per apply or boot-time
    // run; AUTOINCREMENT, so that a sequence is never reused once the
    // oldest records are dropped.
    R"sql(
CREATE TABLE apply_history (
  seq INTEGER PRIMARY KEY AUTOINCREMENT,
  record TEXT NOT NULL
);
)sql",
};
static_assert(sizeof(kMigrations) / sizeof(kMigrations[0]) == kSchemaVersion);

[[noreturn]] void Refuse(const std::string& path, const std::string& reason) {
  const std::string text = "Failed to connect to ConfigStore: " + path + ": " + reason;
  throw ConfigStoreException(kConnectFailed, text.c_str());
}

struct Registry {
  std::mutex mutex;
  std::map<std::string, std::shared_ptr<Database>> connections;  // by path
};

Registry& TheRegistry() {
  static Registry registry;
  return registry;
}

bool SameFile(const Database& db, const std::string& path) {
  struct stat st {};
  return ::stat(path.c_str(), &st) == 0 && st.st_dev == db.Device() && st.st_ino == db.Inode();
}

// A store readable by others (made by an older tool, restored from a
// backup) is made private once it is known to be a valid store.
void MakePrivate(const std::string& path) {
  for (const char* suffix : {"", "-wal", "-shm"}) {
    const std::string file = path + suffix;
    struct stat st {};
    if (::stat(file.c_str(), &st) == 0 && (st.st_mode & 077) != 0) ::chmod(file.c_str(), st.st_mode & 0700);
  }
}

// Switches the store to write-ahead logging and returns the journal mode in
// effect. The switch needs an exclusive lock, and SQLite answers "busy"
// without calling the busy handler while another process holds a lock, so
// the switch is retried here for as long as any statement would wait.
std::string SetWalMode(sqlite3* db) {
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(kBusyTimeoutMs);
  for (;;) {
    std::string mode;
    const int rc = sqlite3_exec(
        db, "PRAGMA journal_mode = WAL",
        [](void* out, int columns, char** values, char**) {
          if (columns > 0 && values[0] != nullptr) *static_cast<std::string*>(out) = values[0];
          return 0;
        },
        &mode, nullptr);
    if (rc == SQLITE_OK) return mode;
    if ((rc & 0xff) != SQLITE_BUSY && (rc & 0xff) != SQLITE_LOCKED) ThrowSqliteError(db, rc, "set journal mode");
    if (std::chrono::steady_clock::now() >= deadline) ThrowSqliteError(db, rc, "set journal mode");
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
}

}  // namespace

void ThrowSqliteError(sqlite3* db, int rc, std::string_view what, int code) {
  std::string text = code == kConnectFailed ? "Failed to connect to ConfigStore: " : "ConfigStore error: ";
  text.append(what);
  text += ": ";
  text += db != nullptr && sqlite3_errcode(db) == (rc & 0xff) ? sqlite3_errmsg(db) : sqlite3_errstr(rc);
  throw ConfigStoreException(code, text.c_str());
}

// --- Statement ---

Statement::Statement(sqlite3* db, std::string_view sql) : db_(db) {
  sqlite3_stmt* raw = nullptr;
  const int rc = sqlite3_prepare_v2(db, sql.data(), static_cast<int>(sql.size()), &raw, nullptr);
  stmt_.reset(raw);
  if (rc != SQLITE_OK) ThrowSqliteError(db, rc, "prepare");
}

Statement& Statement::Bind(int index, std::string_view text) {
  // A null pointer would bind SQL NULL; an empty text is still a text.
  const char* data = text.data() != nullptr ? text.data() : "";
  const int rc = sqlite3_bind_text(stmt_.get(), index, data, static_cast<int>(text.size()), SQLITE_TRANSIENT);
  if (rc != SQLITE_OK) ThrowSqliteError(db_, rc, "bind");
  return *this;
}

Statement& Statement::Bind(int index, int64_t value) {
  const int rc = sqlite3_bind_int64(stmt_.get(), index, value);
  if (rc != SQLITE_OK) ThrowSqliteError(db_, rc, "bind");
  return *this;
}

Statement& Statement::BindNull(int index) {
  const int rc = sqlite3_bind_null(stmt_.get(), index);
  if (rc != SQLITE_OK) ThrowSqliteError(db_, rc, "bind");
  return *this;
}

bool Statement::Step() {
  const int rc = sqlite3_step(stmt_.get());
  if (rc == SQLITE_ROW) return true;
  if (rc == SQLITE_DONE) return false;
  // The text names the statement (values are bound, never part of it).
  std::string what = "statement \"";
  what += sqlite3_sql(stmt_.get());
  what += "\"";
  ThrowSqliteError(db_, rc, what);
}

void Statement::Run() {
  while (Step()) {
  }
  Reset();
}

void Statement::Reset() {
  sqlite3_reset(stmt_.get());
  sqlite3_clear_bindings(stmt_.get());
}

std::string_view Statement::TextView(int column) const {
  const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(stmt_.get(), column));
  if (text == nullptr) return {};
  return {text, static_cast<std::size_t>(sqlite3_column_bytes(stmt_.get(), column))};
}

std::string Statement::Text(int column) const { return std::string(TextView(column)); }

bool Statement::IsNull(int column) const { return sqlite3_column_type(stmt_.get(), column) == SQLITE_NULL; }

int64_t Statement::Int(int column) const { return sqlite3_column_int64(stmt_.get(), column); }

// --- Database ---

Database::Database(std::string path, SqliteHandle handle)
    : path_(std::move(path)), handle_(std::move(handle)), pid_(::getpid()) {}

Database::~Database() {
  if (::getpid() != pid_) Abandon();
}

std::shared_ptr<Database> Database::Open(const std::string& path, bool create) {
  struct stat st {};
  const bool exists = ::stat(path.c_str(), &st) == 0;
  if (!exists && !create) Refuse(path, "the store does not exist");
  if (!exists) {
    // The store holds sensitive values in clear: only its owner may read it.
    // SQLite gives its journal files the mode of the database file.
    const std::string directory = std::filesystem::path(path).parent_path().string();
    try {
      HoxPlatform::CreateDirectories(directory);
    } catch (const HoxPlatform::FileError& e) {
      Refuse(path, std::string("cannot create its directory: ") + e.what());
    }
    ::chmod(directory.c_str(), 0700);
    const HoxPlatform::FileDescriptor fd(::open(path.c_str(), O_CREAT | O_EXCL | O_WRONLY | O_CLOEXEC, 0600));
    if (fd.get() < 0 && errno != EEXIST) Refuse(path, std::string("cannot create the store: ") + std::strerror(errno));
  }
  sqlite3* raw = nullptr;
  const int flags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX | (exists ? 0 : SQLITE_OPEN_CREATE);
  const int rc = sqlite3_open_v2(path.c_str(), &raw, flags, nullptr);
  SqliteHandle handle(raw);
  if (rc != SQLITE_OK) ThrowSqliteError(raw, rc, "open " + path, kConnectFailed);
  sqlite3_busy_timeout(raw, kBusyTimeoutMs);

  std::shared_ptr<Database> db(new Database(path, std::move(handle)));
  db->CheckAndMigrate(!exists);
  MakePrivate(path);
  if (::stat(path.c_str(), &st) == 0) {
    db->device_ = st.st_dev;
    db->inode_ = st.st_ino;
  }
  return db;
}

void Database::RefuseUnreadable(const ConfigStoreException& e) {
  const int rc = sqlite3_errcode(handle_.get());
  // Only a damaged or foreign file is "not readable"; a lock held past the
  // busy timeout or an I/O error is reported as what it is.
  if (rc == SQLITE_NOTADB || rc == SQLITE_CORRUPT) {
    Refuse(path_, std::string("not a readable configuration store (") + e.what() + ")");
  }
  Refuse(path_, e.what());
}

void Database::CheckAndMigrate(bool created) {
  sqlite3* db = handle_.get();
  // Everything is read before anything is written: a foreign, corrupt or
  // newer store is refused as it is, never converted or repaired.
  int64_t tables = 0;
  int64_t versionTables = 0;
  try {
    Statement count(db, "SELECT count(*), count(CASE WHEN name = 'schema_version' THEN 1 END) "
                        "FROM sqlite_master WHERE type = 'table'");
    count.Step();
    tables = count.Int(0);
    versionTables = count.Int(1);
  } catch (const ConfigStoreException& e) {
    RefuseUnreadable(e);
  }
  int64_t version = 0;
  if (versionTables == 0 && tables > 0) Refuse(path_, "not a configuration store");
  if (versionTables == 1) {
    try {
      version = ReadLayoutVersion();
    } catch (const ConfigStoreException& e) {
      if (e.GetErrorCode() == kConnectFailed) throw;
      RefuseUnreadable(e);
    }
  }
  if (version > kSchemaVersion) {
    Refuse(path_, "layout version " + std::to_string(version) + " is newer than the supported version " +
                      std::to_string(kSchemaVersion));
  }

  // WAL: readers in other processes keep their snapshot while a writer
  // replaces a set, and a killed writer leaves only an uncommitted tail.
  if (SetWalMode(db) != "wal") {
    CSLogger::Log(CSLogger::kWarning, "ConfigStore %s: write-ahead logging unavailable", path_.c_str());
  }
  Exec("PRAGMA synchronous = FULL", "configure");
  if (version == kSchemaVersion) return;

  // Another process may create or migrate the store at the same moment: the
  // version is read again under the write lock. A failed step rolls the
  // whole migration back.
  {
    WriteScope migration(*this, "migrate");
    int64_t current = 0;
    Statement again(db, "SELECT count(*) FROM sqlite_master WHERE type = 'table' AND name = 'schema_version'");
    again.Step();
    if (again.Int(0) == 1) current = ReadLayoutVersion();
    for (int64_t v = current; v < kSchemaVersion; ++v) {
      Exec(kMigrations[v], "migrate");
      Statement set(db, "UPDATE schema_version SET version = ?");
      set.Bind(1, v + 1).Run();
    }
    migration.Commit();
  }
  if (created || version < kSchemaVersion) {
    CSLogger::Log(CSLogger::kDetail, "ConfigStore %s at layout version %d", path_.c_str(), kSchemaVersion);
  }
}

int64_t Database::ReadLayoutVersion() {
  Statement read(handle_.get(), "SELECT version, typeof(version) = 'integer' FROM schema_version");
  if (!read.Step()) Refuse(path_, "the store has no layout version");
  // A damaged row must never pick a step of the migration. Version 0 is
  // never stored: the first migration creates the table and leaves it at 1.
  if (read.Int(1) == 0 || read.Int(0) < 1) {
    Refuse(path_, "layout version \"" + read.Text(0) + "\" is not valid");
  }
  const int64_t version = read.Int(0);
  if (read.Step()) Refuse(path_, "the store has more than one layout version");
  return version;
}

void Database::Exec(std::string_view sql, std::string_view what) {
  const std::string text(sql);
  const int rc = sqlite3_exec(handle_.get(), text.c_str(), nullptr, nullptr, nullptr);
  if (rc != SQLITE_OK) ThrowSqliteError(handle_.get(), rc, what);
}

Database::WriteScope::WriteScope(Database& db, std::string_view what)
    : db_(db), what_(what), savepoint_(sqlite3_get_autocommit(db.handle_.get()) == 0) {
  db_.Exec(savepoint_ ? "SAVEPOINT hox_write" : "BEGIN IMMEDIATE", what_);
}

Database::WriteScope::~WriteScope() {
  if (done_) return;
  sqlite3_exec(db_.handle_.get(), savepoint_ ? "ROLLBACK TO hox_write; RELEASE hox_write" : "ROLLBACK", nullptr,
               nullptr, nullptr);
}

void Database::WriteScope::Commit() {
  if (HoxPlatform::Failpoint("store.commit")) ThrowSqliteError(db_.handle_.get(), SQLITE_IOERR, what_);
  db_.Exec(savepoint_ ? "RELEASE hox_write" : "COMMIT", what_);
  done_ = true;
}

Transaction::Transaction(std::shared_ptr<Database> db)
    : db_(std::move(db)), lock_(db_->mutex_), owner_(std::this_thread::get_id()) {
  // The lock is recursive: this thread may already hold it, in an open
  // transaction of its own.
  if (sqlite3_get_autocommit(db_->handle_.get()) == 0) {
    throw ConfigStoreException(2000, "ConfigStore error: transactions do not nest");
  }
  db_->Exec("BEGIN IMMEDIATE", "begin transaction");
  open_ = true;
}

Transaction::~Transaction() {
  if (open_) sqlite3_exec(db_->handle_.get(), "ROLLBACK", nullptr, nullptr, nullptr);
}

void Transaction::Commit() {
  if (!open_ || owner_ != std::this_thread::get_id()) {
    throw ConfigStoreException(2000, "ConfigStore error: no open transaction on this thread");
  }
  if (HoxPlatform::Failpoint("store.commit")) ThrowSqliteError(db_->handle_.get(), SQLITE_IOERR, "commit");
  db_->Exec("COMMIT", "commit");
  open_ = false;
}

std::shared_ptr<Database> CurrentDatabase(bool create) {
  const std::string path = HoxPlatform::HostPath(HoxPlatform::HostPaths::kStore);
  Registry& registry = TheRegistry();
  std::lock_guard<std::mutex> lock(registry.mutex);
  // Drop connections inherited through fork and connections whose file is
  // gone or was replaced (a removed root, a restored backup).
  for (auto it = registry.connections.begin(); it != registry.connections.end();) {
    if (it->second->OwnerPid() != ::getpid() || !SameFile(*it->second, it->first)) {
      it = registry.connections.erase(it);
    } else {
      ++it;
    }
  }
  auto found = registry.connections.find(path);
  if (found != registry.connections.end()) return found->second;
  auto db = Database::Open(path, create);
  registry.connections.emplace(path, db);
  return db;
}

Database& AsDatabase(const std::shared_ptr<DBStore>& db) {
  auto* database = dynamic_cast<Database*>(db.get());
  if (database == nullptr) throw ConfigStoreException(kConnectFailed, "Failed to connect to ConfigStore");
  return *database;
}

}  // namespace HoxConfigStore::detail
