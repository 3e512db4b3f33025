// Store object values, namespace stores and transactions.
#include <unistd.h>

#include <algorithm>
#include <random>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/schema_store.h>

#include "platform/store/database.h"

namespace HoxConfigStore {

using detail::Database;

const char* const sGlobalNamespace = "global";

ConfigStoreObjectId::ConfigStoreObjectId(std::string c, std::string g, std::string k, std::string i)
    : component(std::move(c)), group(std::move(g)), key(std::move(k)), instanceId(std::move(i)) {}

std::string ConfigStoreObjectId::toString() const {
  std::string s = "comp " + component + " grp " + group + " key " + key;
  if (!instanceId.empty()) s += " id " + instanceId;
  return s;
}

DBStore::~DBStore() = default;

std::shared_ptr<DBStore> GetDBStore(int storeType, bool create) {
  if (storeType != 0) {
    const std::string text = "Failed to connect to ConfigStore: unknown store type " + std::to_string(storeType);
    throw ConfigStoreException(2001, text.c_str());
  }
  return detail::CurrentDatabase(create);
}

std::string GenerateInstanceId() {
  // One generator per thread, seeded from the system's random device; a
  // forked child seeds its own, so that it never repeats its parent's ids.
  thread_local std::mt19937_64 engine;
  thread_local pid_t seededBy = 0;
  if (seededBy != ::getpid()) {
    std::random_device device;
    std::seed_seq seed{device(), device(), device(), device(), device(), device(), device(), device()};
    engine.seed(seed);
    seededBy = ::getpid();
  }
  uint8_t bytes[16];
  for (int i = 0; i < 16; i += 8) {
    const uint64_t r = engine();
    for (int j = 0; j < 8; ++j) bytes[i + j] = static_cast<uint8_t>(r >> (8 * j));
  }
  bytes[6] = static_cast<uint8_t>((bytes[6] & 0x0f) | 0x40);  // version 4
  bytes[8] = static_cast<uint8_t>((bytes[8] & 0x3f) | 0x80);  // RFC 4122 variant
  static const char kHex[] = "0123456789abcdef";
  std::string id;
  id.reserve(36);
  for (int i = 0; i < 16; ++i) {
    if (i == 4 || i == 6 || i == 8 || i == 10) id.push_back('-');
    id.push_back(kHex[bytes[i] >> 4]);
    id.push_back(kHex[bytes[i] & 0x0f]);
  }
  return id;
}

// --- StoreObject and its kinds ---

StoreObject::StoreObject(ConfigStoreObjectId id) : id_(std::move(id)) {}
StoreObject::~StoreObject() = default;

const ConfigStoreObjectId& StoreObject::GetConfigStoreObjectId() const { return id_; }

bool StoreObject::GetValue(const std::string& name, std::string* value) const {
  auto it = values_.find(name);
  if (it == values_.end()) return false;
  if (value != nullptr) *value = it->second;
  return true;
}

void StoreObject::SetValue(const std::string& name, const std::string& value) { values_[name] = value; }

const std::map<std::string, std::string>& StoreObject::GetValues() const { return values_; }

ConfigStoreObject::ConfigStoreObject(ConfigStoreObjectId id)
    : StoreObject(std::move(id)), data_(std::make_shared<rapidjson::Document>()) {}

namespace {

// Bytes a copy of `value` takes in a memory pool: member and element arrays
// and the strings too long to be stored inside their value, each aligned.
std::size_t PoolBytes(const rapidjson::Value& value) {
  constexpr std::size_t kInlineString = sizeof(rapidjson::Value) - 3;
  auto string = [](const rapidjson::Value& s) {
    return s.GetStringLength() < kInlineString ? 0 : RAPIDJSON_ALIGN(s.GetStringLength() + 1);
  };
  switch (value.GetType()) {
    case rapidjson::kObjectType: {
      std::size_t bytes = RAPIDJSON_ALIGN(value.MemberCount() * sizeof(rapidjson::Value::Member));
      for (auto it = value.MemberBegin(); it != value.MemberEnd(); ++it) {
        bytes += string(it->name) + PoolBytes(it->value);
      }
      return bytes;
    }
    case rapidjson::kArrayType: {
      std::size_t bytes = RAPIDJSON_ALIGN(value.Size() * sizeof(rapidjson::Value));
      for (const rapidjson::Value& element : value.GetArray()) bytes += PoolBytes(element);
      return bytes;
    }
    case rapidjson::kStringType: return string(value);
    default: return 0;
  }
}

// A copy of a value in a document whose pool is sized to it. An apply run
// holds one per changed object, and a document's own pool would start with
// a 64 KB chunk, mostly empty.
struct SizedCopy {
  explicit SizedCopy(const rapidjson::Value& value)
      : pool(std::max<std::size_t>(PoolBytes(value), 64)), document(&pool) {
    document.CopyFrom(value, pool);
  }
  rapidjson::MemoryPoolAllocator<> pool;
  rapidjson::Document document;  // declared after its pool, destroyed before it
};

std::shared_ptr<rapidjson::Document> CopyOf(const rapidjson::Value& value) {
  auto copy = std::make_shared<SizedCopy>(value);
  return std::shared_ptr<rapidjson::Document>(copy, &copy->document);
}

}  // namespace

ConfigStoreObject::ConfigStoreObject(ConfigStoreObjectId id, const rapidjson::Value& data)
    : StoreObject(std::move(id)), data_(CopyOf(data)) {}

const rapidjson::Value& ConfigStoreObject::GetData() const { return *data_; }

std::string ConfigStoreObject::Serialize() const {
  std::string out;
  ConfigStoreDocument::SerializeValue(*data_, out);
  return out;
}

DriftObject::DriftObject(ConfigStoreObjectId id, std::string action, const rapidjson::Value& drift)
    : StoreObject(std::move(id)), action_(std::move(action)), drift_(CopyOf(drift)) {}

const std::string& DriftObject::GetAction() const { return action_; }
const rapidjson::Value& DriftObject::GetDrift() const { return *drift_; }

std::string DriftObject::Serialize() const {
  std::string out;
  ConfigStoreDocument::SerializeValue(*drift_, out);
  return out;
}

std::shared_ptr<ConfigStoreObject> CreateObject(const ConfigStoreObjectId& id, const rapidjson::Value& value,
                                                const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema,
                                                std::optional<int64_t> version) {
  ConfigStoreObjectId objectId = id;
  // An instance of a multi-instance key is known by its identity member
  // when the caller did not name it.
  if (objectId.instanceId.empty() && schema && schema->IsMultiInstance() && value.IsObject()) {
    const std::string& member = schema->GetIdentityMember();
    auto it = value.FindMember(member.c_str());
    if (!member.empty() && it != value.MemberEnd() && it->value.IsString()) {
      objectId.instanceId.assign(it->value.GetString(), it->value.GetStringLength());
    }
  }
  auto object = std::make_shared<ConfigStoreObject>(std::move(objectId), value);
  if (version) object->SetValue("version", std::to_string(*version));
  return object;
}

// --- Namespace stores ---

namespace {

class NamespaceStore final : public ConfigStore {
 public:
  NamespaceStore(std::string ns, std::shared_ptr<Database> db) : ns_(std::move(ns)), db_(std::move(db)) {}

  std::shared_ptr<ConfigStoreObject> GetObject(const ConfigStoreObjectId& id) override {
    std::map<std::string, std::string> values;
    db_->Read([&](Database& db) {
      auto select = db.Prepare(
          "SELECT value_name, value FROM namespace_object WHERE namespace = ? AND component = ? AND "
          "config_group = ? AND name = ? AND identifier = ? ORDER BY value_name");
      Bind(select, id);
      while (select.Step()) values.emplace(select.Text(0), select.Text(1));
    });
    if (values.empty()) return nullptr;
    rapidjson::Document data(rapidjson::kObjectType);
    for (const auto& [name, value] : values) {
      data.AddMember(rapidjson::Value(name, data.GetAllocator()), rapidjson::Value(value, data.GetAllocator()),
                     data.GetAllocator());
    }
    auto object = std::make_shared<ConfigStoreObject>(id, data);
    for (const auto& [name, value] : values) object->SetValue(name, value);
    return object;
  }

  // The object's values replace whatever the store held for its id.
  void SetObject(const StoreObject& object) override {
    const ConfigStoreObjectId& id = object.GetConfigStoreObjectId();
    db_->Write("set object", [&](Database& db) {
      DeleteRows(db, id);
      auto insert = db.Prepare(
          "INSERT INTO namespace_object (namespace, component, config_group, name, identifier, value_name, value) "
          "VALUES (?, ?, ?, ?, ?, ?, ?)");
      for (const auto& [name, value] : object.GetValues()) {
        Bind(insert, id);
        insert.Bind(6, name).Bind(7, value).Run();
      }
    });
  }

  void DeleteObject(const ConfigStoreObjectId& id) override {
    db_->Write("delete object", [&](Database& db) { DeleteRows(db, id); });
  }

  std::shared_ptr<DBStore> GetDB() const override { return db_; }

 private:
  void Bind(detail::Statement& stmt, const ConfigStoreObjectId& id) const {
    stmt.Bind(1, ns_).Bind(2, id.component).Bind(3, id.group).Bind(4, id.key).Bind(5, id.instanceId);
  }
  void DeleteRows(Database& db, const ConfigStoreObjectId& id) const {
    auto remove = db.Prepare(
        "DELETE FROM namespace_object WHERE namespace = ? AND component = ? AND config_group = ? AND name = ? "
        "AND identifier = ?");
    Bind(remove, id);
    remove.Run();
  }

  const std::string ns_;
  const std::shared_ptr<Database> db_;
};

}  // namespace

ConfigStore::~ConfigStore() = default;

std::shared_ptr<ConfigStore> ConfigStore::GetStore(const std::string& ns) {
  try {
    return std::make_shared<NamespaceStore>(ns, detail::CurrentDatabase(true));
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "ConfigStore namespace %s unavailable: %s", ns.c_str(), e.what());
    return nullptr;
  }
}

// --- Transactions ---

ConfigStoreTransaction::ConfigStoreTransaction(const std::shared_ptr<ConfigStore>& store) {
  const std::shared_ptr<DBStore> db = store ? store->GetDB() : nullptr;
  if (!db) throw ConfigStoreException(2001, "Failed to connect to ConfigStore");
  auto database = std::dynamic_pointer_cast<detail::Database>(db);
  if (!database) throw ConfigStoreException(2001, "Failed to connect to ConfigStore");
  transaction_ = std::make_unique<detail::Transaction>(std::move(database));
}

ConfigStoreTransaction::~ConfigStoreTransaction() = default;

void ConfigStoreTransaction::Commit() {
  if (!transaction_) throw ConfigStoreException(2000, "ConfigStore error: the transaction is no longer open");
  transaction_->Commit();
  transaction_.reset();
}

}  // namespace HoxConfigStore
