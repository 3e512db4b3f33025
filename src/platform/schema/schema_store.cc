#include <algorithm>
#include <filesystem>
#include <mutex>
#include <tuple>
#include <unordered_map>

#include <hoxcm/errors.h>
#include <hoxcm/files.h>
#include <hoxcm/host.h>
#include <hoxcm/json.h>

#include "platform/schema/schema_store_impl.h"

namespace fs = std::filesystem;

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

DirectorySchemaStore::DirectorySchemaStore(const std::string& directory) {
  HoxPlatform::ListOptions options;
  options.suffix = ".json";
  options.followDirectoryLinks = true;
  // Keys are files of a group directory (<component>/<group>/<key>.json):
  // nothing deeper is a schema.
  options.maxDepth = 3;
  const HoxPlatform::DirectoryListing listing = HoxPlatform::ListFiles(directory, options);
  for (const std::string& deeper : listing.notEntered) {
    loadErrors_.push_back(deeper + ": not at <component>/<group>/<key>.json");
  }
  for (const auto& problem : listing.problems) loadErrors_.push_back(problem.path + ": " + problem.reason);
  for (const std::string& name : listing.files) {
    const fs::path file(name);
    const fs::path relative = file.lexically_relative(directory);
    std::vector<std::string> parts;
    for (const auto& part : relative) parts.push_back(part.string());
    std::string error;
    std::shared_ptr<KeySchema> key;
    if (parts.size() != 3) {
      error = "not at <component>/<group>/<key>.json";
    } else {
      SchemaObjectId id(parts[0], parts[1], fs::path(parts[2]).stem().string());
      if (!ValidName(id.component) || !ValidName(id.group) || !ValidName(id.key)) {
        error = "component, group and key names must not be empty or start with '.'";
      } else {
        key = LoadSchemaFile(file.string(), id, error);
      }
    }
    if (key) {
      keys_.emplace(key->GetId(), key);
    } else {
      CSLogger::Log(CSLogger::kError, "Schema file %s was not loaded: %s", file.c_str(), error.c_str());
      loadErrors_.push_back(file.string() + ": " + error);
    }
  }
  CSLogger::Log(CSLogger::kDetail, "Loaded %zu schemas from %s", keys_.size(), directory.c_str());
}

std::shared_ptr<KeySchema> DirectorySchemaStore::FindKey(const SchemaObjectId& id) const {
  auto it = keys_.find(id);
  return it == keys_.end() ? nullptr : it->second;
}

std::shared_ptr<SchemaObject> DirectorySchemaStore::Find(const std::string& component, const std::string& group,
                                                         const std::string& key) const {
  return FindKey(SchemaObjectId(component, group, key));
}

std::string DirectorySchemaStore::GetSchemaInfo(const std::string& component, const std::string& group,
                                                const std::string& key) const {
  const SchemaObjectId id(component, group, key);
  auto schema = FindKey(id);
  if (!schema) {
    HoxConfigManager::ThrowException<HoxConfigManager::SchemaNotFound>(HoxConfigManager::SchemaObjectNotFound,
                                                                       id.toString());
  }
  const auto& def = schema->definition();
  rapidjson::StringBuffer buffer;
  rapidjson::Writer<rapidjson::StringBuffer> writer(buffer);
  writer.StartObject();
  writer.Key("id");
  writer.String(id.toString());
  writer.Key("file");
  writer.String(HoxPlatform::StripHostRoot(def.file));
  writer.Key("multiInstance");
  writer.Bool(def.multiInstance);
  writer.Key("identity");
  writer.String(def.identity);
  writer.EndObject();
  return buffer.GetString();
}

std::set<SchemaObjectId> DirectorySchemaStore::GetMutableDefaultIds() const {
  std::set<SchemaObjectId> ids;
  for (const auto& [id, schema] : keys_) {
    if (schema->IsMutableDefault()) ids.insert(id);
  }
  return ids;
}

std::vector<SchemaObjectId> DirectorySchemaStore::ListKeys() const {
  std::vector<SchemaObjectId> ids;
  ids.reserve(keys_.size());
  for (const auto& entry : keys_) ids.push_back(entry.first);
  return ids;
}

}  // namespace detail

std::shared_ptr<SchemaStore> SchemaStore::GetStore() { return detail::GetRootEntry().store; }

std::shared_ptr<SchemaCache> SchemaStore::GetCache() { return detail::GetRootEntry().cache; }

std::shared_ptr<SchemaObject> GetSchema(const std::string& component, const std::string& group, const std::string& key,
                                        const std::shared_ptr<SchemaStore>& store) {
  return store ? store->Find(component, group, key) : nullptr;
}

}  // namespace HoxSchemaStore
