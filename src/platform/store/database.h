// The SQLite connection behind a DBStore: RAII handles for the database and
// its statements, the one place where SQLite result codes become
// ConfigStoreException, the table layout and its migration, and the
// process-wide registry of connections (one per root).
//
// Thread safety: a Database serialises its use with a recursive mutex. Every
// operation takes it through Read() or Write(); a Transaction (the engine of
// ConfigStoreTransaction) holds it for its whole life, so that other threads
// wait while the transaction is open and writers on the owning thread join it.
#pragma once

#include <sqlite3.h>
#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>

#include <hoxcm/config_store.h>

namespace HoxConfigStore::detail {

// The layout version this build creates and understands; a store with a
// higher version is refused.
constexpr int kSchemaVersion = 2;
// How long a statement waits for another process's write lock.
constexpr int kBusyTimeoutMs = 15000;

// Throws ConfigStoreException for a failed SQLite call: `code` is the
// exception's code, `what` names the operation. The only place where SQLite
// result codes are converted.
[[noreturn]] void ThrowSqliteError(sqlite3* db, int rc, std::string_view what, int code = 2000);

struct SqliteCloser {
  void operator()(sqlite3* db) const { sqlite3_close_v2(db); }
};
struct StatementFinalizer {
  void operator()(sqlite3_stmt* stmt) const { sqlite3_finalize(stmt); }
};
using SqliteHandle = std::unique_ptr<sqlite3, SqliteCloser>;

// A prepared statement of one connection. Column getters read the current
// row after Step() returned true.
class Statement {
 public:
  Statement(sqlite3* db, std::string_view sql);
  Statement(Statement&&) = default;
  Statement& operator=(Statement&&) = default;

  Statement& Bind(int index, std::string_view text);
  Statement& Bind(int index, int64_t value);
  Statement& BindNull(int index);
  // True when a row is available, false when the statement is done.
  bool Step();
  // Runs a statement that returns no rows, then resets it for reuse.
  void Run();
  void Reset();

  std::string Text(int column) const;
  std::string_view TextView(int column) const;
  bool IsNull(int column) const;
  int64_t Int(int column) const;

 private:
  sqlite3* db_;
  std::unique_ptr<sqlite3_stmt, StatementFinalizer> stmt_;
};

class Database;

// The explicit transaction of ConfigStoreTransaction: it holds the
// connection's lock from construction to destruction, so other threads wait
// while it is open, and it rolls back unless committed. Transactions do not
// nest. It must end on the thread that began it.
class Transaction {
 public:
  explicit Transaction(std::shared_ptr<Database> db);
  ~Transaction();
  Transaction(const Transaction&) = delete;
  Transaction& operator=(const Transaction&) = delete;
  // Throws when called from another thread.
  void Commit();

 private:
  const std::shared_ptr<Database> db_;
  std::unique_lock<std::recursive_mutex> lock_;
  const std::thread::id owner_;
  bool open_ = false;
};

class Database final : public DBStore {
 public:
  // Opens (and with `create`, creates) the store at `path`. Refuses, leaving
  // the file untouched, a file that is not a configuration store or whose
  // layout version is newer than kSchemaVersion.
  static std::shared_ptr<Database> Open(const std::string& path, bool create);
  ~Database() override;

  const std::string& GetPath() const override { return path_; }

  // Runs `body` with the connection locked. A single statement sees one
  // consistent snapshot; bodies that need several statements to agree wrap
  // them in ReadSnapshot.
  template <typename F>
  auto Read(F&& body) {
    std::lock_guard<std::recursive_mutex> lock(mutex_);
    return body(*this);
  }
  // Runs `body` atomically: in a transaction of its own, or, when this
  // thread holds an open transaction, in a savepoint of it. On an exception
  // everything `body` wrote is undone and the exception propagates.
  template <typename F>
  void Write(std::string_view what, F&& body) {
    std::lock_guard<std::recursive_mutex> lock(mutex_);
    WriteScope scope(*this, what);
    body(*this);
    scope.Commit();
  }

  Statement Prepare(std::string_view sql) { return Statement(handle_.get(), sql); }
  void Exec(std::string_view sql, std::string_view what);

  // Opened by this process (a forked child must open its own connection).
  pid_t OwnerPid() const { return pid_; }
  dev_t Device() const { return device_; }
  ino_t Inode() const { return inode_; }
  // Gives up the handle without closing it: a forked child must not close
  // its parent's connection.
  void Abandon() { (void)handle_.release(); }

 private:
  // A write transaction or savepoint that rolls back unless committed.
  // Also the migration's transaction, which runs before the connection is
  // shared.
  class WriteScope {
   public:
    WriteScope(Database& db, std::string_view what);
    ~WriteScope();
    void Commit();

   private:
    Database& db_;
    std::string what_;
    bool savepoint_;
    bool done_ = false;
  };

  friend class Transaction;

  Database(std::string path, SqliteHandle handle);
  void CheckAndMigrate(bool created);
  // The version row of the layout; refuses the store when it is damaged.
  int64_t ReadLayoutVersion();
  [[noreturn]] void RefuseUnreadable(const ConfigStoreException& e);

  const std::string path_;
  SqliteHandle handle_;
  const pid_t pid_;
  dev_t device_ = 0;
  ino_t inode_ = 0;
  std::recursive_mutex mutex_;  // guards handle_
};

// The connection of the current root (HOX_ROOT), shared per process and
// root; reopened when the file was removed or replaced. Throws on failure.
std::shared_ptr<Database> CurrentDatabase(bool create = true);
// The Database behind a DBStore handed out by GetDBStore (never null when
// `db` is not).
Database& AsDatabase(const std::shared_ptr<DBStore>& db);

}  // namespace HoxConfigStore::detail
