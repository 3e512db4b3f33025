#include <algorithm>
#include <cstdint>
#include <mutex>
#include <string_view>
#include <tuple>
#include <unordered_map>

#include <hoxcm/errors.h>
#include <hoxcm/files.h>
#include <hoxcm/host.h>
#include <hoxcm/json.h>

#include "platform/schema/schema_store_impl.h"

namespace HoxSchemaStore {

SchemaObjectId::SchemaObjectId(std::string c, std::string g, std::string k)
    : component(std::move(c)), group(std::move(g)), key(std::move(k)) {}

std::string SchemaObjectId::toString() const { return component + ":" + group + ":" + key; }

bool SchemaObjectId::operator<(const SchemaObjectId& other) const {
  return std::tie(component, group, key) < std::tie(other.component, other.group, other.key);
}

std::size_t SchemaObjectIdHash::operator()(const SchemaObjectId& id) const {
  std::hash<std::string> h;
  std::size_t seed = h(id.component);
  for (const std::string* part : {&id.group, &id.key})
    seed ^= h(*part) + 0x9e3779b97f4a7c15ULL + (seed << 6) + (seed >> 2);
  return seed;
}

SchemaObject::~SchemaObject() = default;
bool SchemaObject::IsHostSpecific() const { return false; }
SchemaStore::~SchemaStore() = default;
bool SchemaStore::GetLoadError(const SchemaObjectId&, std::string&, std::string&) const { return false; }
SchemaCache::~SchemaCache() = default;

namespace detail {
namespace {


class StoreCache final : public SchemaCache {
 public:
  explicit StoreCache(std::shared_ptr<SchemaStore> store) : store_(std::move(store)) {}
  std::shared_ptr<SchemaStore> GetStore() const override { return store_; }

 private:
  const std::shared_ptr<SchemaStore> store_;
};

struct RootEntry {
  std::shared_ptr<DirectorySchemaStore> store;
  std::shared_ptr<SchemaCache> cache;
};

// One loaded store per root for the life of the process. A root whose
// directory cannot be read is not remembered, so that schemas installed
// later are found.
RootEntry GetRootEntry() {
  static std::mutex mutex;
  static std::unordered_map<std::string, RootEntry> roots;
  const std::string directory = SchemaDirectory();
  std::lock_guard<std::mutex> lock(mutex);
  auto it = roots.find(directory);
  if (it != roots.end()) return it->second;
  RootEntry entry;
  entry.store = LoadStore(directory);
  if (!entry.store) return entry;
  entry.cache = std::make_shared<StoreCache>(entry.store);
  roots.emplace(directory, entry);
  return entry;
}

constexpr std::string_view kSchemaSuffix = ".json";

bool ValidName(const std::string& name) { return !name.empty() && name.front() != '.'; }

}  // namespace

std::string SchemaDirectory() { return HoxPlatform::HostPath(HoxPlatform::HostPaths::kSchemaDirectory); }

std::shared_ptr<DirectorySchemaStore> LoadStore(const std::string& directory) {
  if (!HoxPlatform::IsDirectory(directory)) {
    CSLogger::Log(CSLogger::kError, "Schema directory %s cannot be read", directory.c_str());
    return nullptr;
  }
  return std::make_shared<DirectorySchemaStore>(directory);
}

DirectorySchemaStore::DirectorySchemaStore(const std::string& directory) : directory_(directory) {
  HoxPlatform::ListOptions options;
  options.suffix = std::string(kSchemaSuffix);
  options.followDirectoryLinks = true;
  // Keys are files of a group directory (<component>/<group>/<key>.json):
  // nothing deeper is a schema.
  options.maxDepth = 3;
  const HoxPlatform::DirectoryListing listing = HoxPlatform::ListFiles(directory, options);
  for (const std::string& deeper : listing.notEntered) {
    layoutErrors_.push_back(deeper + ": not at <component>/<group>/<key>.json");
  }
  for (const auto& problem : listing.problems) layoutErrors_.push_back(problem.path + ": " + problem.reason);
  index_.reserve(listing.files.size());
  const std::size_t prefix = directory.size() + (directory.empty() || directory.back() != '/' ? 1 : 0);
  for (const std::string& name : listing.files) {
    // The listing's paths are <directory>/<relative path>; the key's names
    // are the parts of the relative path, the file name without ".json".
    std::vector<std::string_view> parts;
    std::string_view rest = std::string_view(name).substr(std::min(prefix, name.size()));
    for (std::size_t slash; (slash = rest.find('/')) != std::string_view::npos; rest.remove_prefix(slash + 1)) {
      parts.push_back(rest.substr(0, slash));
    }
    parts.push_back(rest.substr(0, rest.size() - kSchemaSuffix.size()));
    std::string error;
    if (parts.size() != 3) {
      error = "not at <component>/<group>/<key>.json";
    } else {
      SchemaObjectId id{std::string(parts[0]), std::string(parts[1]), std::string(parts[2])};
      if (ValidName(id.component) && ValidName(id.group) && ValidName(id.key)) {
        index_.try_emplace(std::move(id));
        continue;
      }
      error = "component, group and key names must not be empty or start with '.'";
    }
    CSLogger::Log(CSLogger::kError, "Schema file %s was not loaded: %s", name.c_str(), error.c_str());
    layoutErrors_.push_back(name + ": " + error);
  }
  CSLogger::Log(CSLogger::kDetail, "Indexed %zu schema files in %s", index_.size(), directory.c_str());
}

std::string DirectorySchemaStore::FilePath(const SchemaObjectId& id) const {
  return directory_ + "/" + id.component + "/" + id.group + "/" + id.key + std::string(kSchemaSuffix);
}

const DirectorySchemaStore::Entry& DirectorySchemaStore::Loaded(const SchemaObjectId& id, const Entry& entry) const {
  if (entry.loaded.load(std::memory_order_acquire)) return entry;
  const auto stripe = reinterpret_cast<std::uintptr_t>(&entry) / alignof(Entry) % kLockStripes;
  std::lock_guard<std::mutex> lock(loadLocks_[stripe]);
  if (entry.loaded.load(std::memory_order_relaxed)) return entry;
  const std::string path = FilePath(id);
  std::string reason;
  entry.schema = LoadSchemaFile(path, id, reason);
  if (!entry.schema) {
    CSLogger::Log(CSLogger::kError, "Schema file %s was not loaded: %s", path.c_str(), reason.c_str());
    entry.error = std::move(reason);
  }
  entry.loaded.store(true, std::memory_order_release);
  return entry;
}

std::shared_ptr<KeySchema> DirectorySchemaStore::FindKey(const SchemaObjectId& id) const {
  auto it = index_.find(id);
  return it == index_.end() ? nullptr : Loaded(it->first, it->second).schema;
}

std::shared_ptr<SchemaObject> DirectorySchemaStore::Find(const std::string& component, const std::string& group,
                                                         const std::string& key) const {
  return FindKey(SchemaObjectId(component, group, key));
}

bool DirectorySchemaStore::CheckAll() const {
  bool clean = layoutErrors_.empty();
  for (const auto& [id, entry] : index_) clean = Loaded(id, entry).schema != nullptr && clean;
  return clean;
}

std::vector<std::string> DirectorySchemaStore::GetLoadErrors() const {
  CheckAll();
  std::vector<std::string> errors = layoutErrors_;
  for (const auto& [id, entry] : index_) {
    if (!entry.error.empty()) errors.push_back(FilePath(id) + ": " + entry.error);
  }
  std::sort(errors.begin(), errors.end());
  return errors;
}

bool DirectorySchemaStore::GetLoadError(const SchemaObjectId& id, std::string& file, std::string& reason) const {
  auto it = index_.find(id);
  if (it == index_.end() || !it->second.loaded.load(std::memory_order_acquire) || it->second.error.empty()) {
    return false;
  }
  file = FilePath(id);
  reason = it->second.error;
  return true;
}

std::string DirectorySchemaStore::GetSchemaInfo(const std::string& component, const std::string& group,
                                                const std::string& key) const {
  const SchemaObjectId id(component, group, key);
  auto schema = FindKey(id);
  if (!schema) ThrowSchemaNotFound(this, id, id.toString());
  rapidjson::StringBuffer buffer;
  rapidjson::Writer<rapidjson::StringBuffer> writer(buffer);
  writer.StartObject();
  writer.Key("id");
  writer.String(id.toString());
  writer.Key("file");
  writer.String(HoxPlatform::StripHostRoot(FilePath(id)));
  writer.Key("multiInstance");
  writer.Bool(schema->IsMultiInstance());
  writer.Key("identity");
  writer.String(schema->GetIdentityMember());
  writer.EndObject();
  return buffer.GetString();
}

std::set<SchemaObjectId> DirectorySchemaStore::GetMutableDefaultIds() const {
  std::set<SchemaObjectId> ids;
  for (const auto& [id, entry] : index_) {
    const auto& schema = Loaded(id, entry).schema;
    if (schema && schema->IsMutableDefault()) ids.insert(id);
  }
  return ids;
}

std::vector<SchemaObjectId> DirectorySchemaStore::ListKeys() const {
  std::vector<SchemaObjectId> ids;
  ids.reserve(index_.size());
  for (const auto& [id, entry] : index_) {
    if (Loaded(id, entry).schema) ids.push_back(id);
  }
  std::sort(ids.begin(), ids.end());
  return ids;
}

}  // namespace detail

std::shared_ptr<SchemaStore> SchemaStore::GetStore() { return detail::GetRootEntry().store; }

std::shared_ptr<SchemaCache> SchemaStore::GetCache() { return detail::GetRootEntry().cache; }

void ThrowSchemaNotFound(const SchemaStore* store, const SchemaObjectId& id, const std::string& what) {
  HoxConfigManager::ErrorLocation where;
  if (store != nullptr && store->GetLoadError(id, where.file, where.reason)) {
    HoxConfigManager::ThrowExceptionAt<HoxConfigManager::SchemaNotFound>(std::move(where),
                                                                         HoxConfigManager::SchemaObjectNotFound, what);
  }
  HoxConfigManager::ThrowException<HoxConfigManager::SchemaNotFound>(HoxConfigManager::SchemaObjectNotFound, what);
}

bool ListsOperation(const SchemaObject& schema, int (SchemaObject::*query)(std::vector<std::string>&, bool&) const,
                    std::string_view operation) {
  std::vector<std::string> operations;
  bool propertyLevel = false;
  return (schema.*query)(operations, propertyLevel) == 0 &&
         std::find(operations.begin(), operations.end(), operation) != operations.end();
}

std::shared_ptr<SchemaObject> GetSchema(const std::string& component, const std::string& group, const std::string& key,
                                        const std::shared_ptr<SchemaStore>& store) {
  return store ? store->Find(component, group, key) : nullptr;
}

}  // namespace HoxSchemaStore
