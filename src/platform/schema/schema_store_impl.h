// The schema store of one schema directory, and the process-wide stores per
// host root.
//
// A DirectorySchemaStore lists its directory once, at construction: that
// index knows which keys have a file. A key's file is read, checked and
// compiled the first time the key is looked up, and the result (the schema,
// or why the file was refused) is kept for the life of the store. Lookups
// may come from any thread: threads asking for the same key at once wait for
// one load, and a key once loaded is read without a lock. Queries over every key (ListKeys, GetLoadErrors,
// GetMutableDefaultIds, CheckAll) load every key that is not loaded yet.
#pragma once

#include <array>
#include <atomic>
#include <cstddef>
#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>
#include <vector>

#include <hoxcm/schema_store.h>

#include "platform/schema/schema_file.h"

namespace HoxSchemaStore::detail {

class DirectorySchemaStore final : public SchemaStore {
 public:
  // Indexes <directory>/<component>/<group>/<key>.json. Files at any other
  // place, and names that cannot be keys, are load errors from the start.
  explicit DirectorySchemaStore(const std::string& directory);
  DirectorySchemaStore(const DirectorySchemaStore&) = delete;
  DirectorySchemaStore& operator=(const DirectorySchemaStore&) = delete;

  std::shared_ptr<SchemaObject> Find(const std::string& component, const std::string& group,
                                     const std::string& key) const override;
  std::string GetSchemaInfo(const std::string& component, const std::string& group,
                            const std::string& key) const override;
  std::set<SchemaObjectId> GetMutableDefaultIds() const override;
  std::vector<SchemaObjectId> ListKeys() const override;
  std::vector<std::string> GetLoadErrors() const override;
  bool GetLoadError(const SchemaObjectId& id, std::string& file, std::string& reason) const override;

  // Null when the key has no file or its file was refused (the refusal is
  // logged with the file's path when the key is first looked up).
  std::shared_ptr<KeySchema> FindKey(const SchemaObjectId& id) const;
  // Loads every key not loaded yet; true when no file was refused.
  bool CheckAll() const;
  // Keys that have a file in the index, loaded or not.
  std::size_t IndexedKeys() const { return index_.size(); }

 private:
  // One key of the index. `schema` and `error` are written once, under the
  // entry's lock, before `loaded` is set; they are read only after `loaded`
  // is seen set.
  struct Entry {
    mutable std::atomic<bool> loaded{false};
    mutable std::shared_ptr<KeySchema> schema;  // null when the file was refused
    mutable std::string error;                  // why it was
  };

  const Entry& Loaded(const SchemaObjectId& id, const Entry& entry) const;
  std::string FilePath(const SchemaObjectId& id) const;

  const std::string directory_;
  // Built by the constructor and never changed: its entries are.
  std::unordered_map<SchemaObjectId, Entry, SchemaObjectIdHash> index_;
  std::vector<std::string> layoutErrors_;
  // Loads take the lock of their entry's stripe: a mutex per key would cost
  // more than the rest of the entry, and two keys rarely load at once.
  static constexpr std::size_t kLockStripes = 64;
  mutable std::array<std::mutex, kLockStripes> loadLocks_;
};

// The schema directory of the current root.
std::string SchemaDirectory();

// A store of `directory`, outside the per-root cache; null when the
// directory cannot be read.
std::shared_ptr<DirectorySchemaStore> LoadStore(const std::string& directory);

}  // namespace HoxSchemaStore::detail
