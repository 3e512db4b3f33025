#include "drift/drift_walk.h"

#include <cstdint>
#include <string_view>
#include <unordered_map>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/operations.h>

#include "platform/compare/value_compare.h"

namespace HoxConfigManager {

namespace {

using HoxConfigStore::ConfigStoreObjectId;
using HoxConfigStore::detail::IsGeneratedId;
using HoxConfigStore::detail::MemberIndex;
using HoxConfigStore::detail::NameOf;
using HoxSchemaStore::SchemaObject;
using rapidjson::SizeType;

// A singleton whose configuration was deleted holds this marker on the host.
constexpr std::string_view kDeletedDefault = "DELETE_DEFAULT";
constexpr SizeType kNone = static_cast<SizeType>(-1);

const Value& NullValue() {
  static const Value null;
  return null;
}
const Value& EmptyObject() {
  static const Value empty(rapidjson::kObjectType);
  return empty;
}

std::string Join(const std::string& path, std::string_view name) {
  std::string out;
  out.reserve(path.size() + 1 + name.size());
  out.append(path).push_back('/');
  out.append(name);
  return out;
}
std::string Join(const std::string& path, SizeType index) { return Join(path, std::to_string(index)); }

// Host positions grouped by a key, each group in ascending host order; the
// first unmatched position of a key is found without scanning the others.
template <typename Key>
class PositionIndex {
 public:
  explicit PositionIndex(SizeType size) : next_(size, kNone) { heads_.reserve(size); }
  void Insert(const Key& key, SizeType position) {
    auto [it, fresh] = heads_.try_emplace(key, Chain{position, position});
    if (!fresh) {
      next_[it->second.tail] = position;
      it->second.tail = position;
    }
  }
  // Calls `accept(position)` on the unmatched positions of `key` in host
  // order until it returns true; that position is then matched.
  template <typename Accept>
  SizeType TakeFirst(const Key& key, std::vector<bool>& matched, Accept&& accept) {
    auto it = heads_.find(key);
    if (it == heads_.end()) return kNone;
    SizeType& head = it->second.head;
    while (head != kNone && matched[head]) head = next_[head];  // skip what is taken
    for (SizeType p = head; p != kNone; p = next_[p]) {
      if (!matched[p] && accept(p)) {
        matched[p] = true;
        return p;
      }
    }
    return kNone;
  }

 private:
  struct Chain {
    SizeType head, tail;
  };
  std::unordered_map<Key, Chain> heads_;
  std::vector<SizeType> next_;
};

class DriftWalk {
 public:
  DriftWalk(Allocator& allocator, DriftHandler& handler)
      : allocator_(allocator),
        handler_(handler),
        consolidated_(handler.IsConsolidatedActionRequired()),
        driftRecords_(handler.IsCreateDriftObject()),
        perProperty_(handler.IsPerProperty()) {}

  void CompareItem(const Value& desired, const Value& host, ConfigStoreObjectId& id,
                   const std::shared_ptr<SchemaObject>& schema, const std::string& path) {
    if (schema->IsMultiInstance()) {
      CompareInstances(desired, host, id, schema, path);
    } else {
      CompareSingle(desired, host, id, schema, path);
    }
  }

 private:
  Value NewRecord(const std::string& instanceId, ACTION action) {
    Value marker(rapidjson::kObjectType);
    marker.AddMember("INSTANCEID", Value(instanceId, allocator_), allocator_);
    marker.AddMember("DRIFTOP", rapidjson::StringRef(ActionName(action)), allocator_);
    Value record(rapidjson::kObjectType);
    record.AddMember("DRIFTOBJ", marker, allocator_);
    return record;
  }

  void Report(const Value& desired, const Value& host, const Value& schemaNode, const std::string& path,
              ACTION action, Value* record, std::string_view name, const std::string& instanceId) {
    handler_.PropertyDrift(desired, host, schemaNode, path, action);
    if (record != nullptr) {
      record->AddMember(Value(name.data(), static_cast<SizeType>(name.size()), allocator_),
                        NewRecord(instanceId, action), allocator_);
    }
  }

  void CompareSingle(const Value& desired, const Value& host, ConfigStoreObjectId& id,
                     const std::shared_ptr<SchemaObject>& schema, const std::string& path) {
    const bool deletedDefault = host.IsString() && NameOf(host) == kDeletedDefault;
    RAPIDJSON_ASSERT(desired.IsNull() || desired.IsObject());
    RAPIDJSON_ASSERT(host.IsNull() || host.IsObject() || deletedDefault);
    const Value& node = schema->GetInstanceSchema();
    const bool desiredAbsent = desired.IsNull() || cmp_.IsUnset(desired, node);
    const bool hostAbsent = host.IsNull() || deletedDefault || cmp_.IsUnset(host, node);
    if (desiredAbsent && hostAbsent) return;
    if (!perProperty_) {
      if (desiredAbsent) {
        handler_.Delete(host, id, schema, path);
        return;
      }
      if (hostAbsent) {
        const Value record = driftRecords_ ? NewRecord(id.instanceId, SET) : Value();
        handler_.Set(desired, host, id, schema, path, record);
        return;
      }
    }
    const Value& d = desiredAbsent ? EmptyObject() : desired;
    const Value& h = host.IsObject() ? host : EmptyObject();
    Value record = driftRecords_ ? NewRecord(id.instanceId, SET) : Value();
    if (CompareMembers(d, h, node, path, driftRecords_ ? &record : nullptr, id.instanceId) && consolidated_) {
      handler_.Set(desired, host, id, schema, path, record);
    }
  }

  // Reports the differing members of two objects: first those of `d` in its
  // order (additions and changes, nested objects depth first), then those
  // only `h` holds, in its order. True when anything differed.
  bool CompareMembers(const Value& d, const Value& h, const Value& schema, const std::string& path,
                      Value* record, const std::string& instanceId) {
    MemberIndex hostIndex(h);
    bool differed = false;
    SizeType found = 0;
    for (auto it = d.MemberBegin(); it != d.MemberEnd(); ++it) {
      if (IsGeneratedId(it->name)) continue;
      const std::string_view name = NameOf(it->name);
      const Value& dv = it->value;
      const Value& childSchema = cmp_.Child(schema, name, dv);
      const Value* hv = hostIndex.Find(name);
      if (hv != nullptr) ++found;
      const bool hostUnset = hv == nullptr || cmp_.IsUnset(*hv, childSchema);
      const bool desiredUnset = cmp_.IsUnset(dv, childSchema);
      if (hostUnset || desiredUnset) {
        if (hostUnset && desiredUnset) continue;
        Report(dv, hv != nullptr ? *hv : NullValue(), childSchema, Join(path, name), hostUnset ? ADD : DELETE,
               record, name, instanceId);
        differed = true;
      } else if (dv.IsObject() && hv->IsObject()) {
        Value sub = record != nullptr ? NewRecord(instanceId, SET) : Value();
        if (CompareMembers(dv, *hv, childSchema, Join(path, name), record != nullptr ? &sub : nullptr,
                           instanceId)) {
          differed = true;
          if (record != nullptr) {
            record->AddMember(Value(name.data(), static_cast<SizeType>(name.size()), allocator_), sub, allocator_);
          }
        }
      } else if (dv.IsArray() && hv->IsArray() && cmp_.HoldsObjects(childSchema, dv, *hv)) {
        if (CompareObjectArrays(dv, *hv, childSchema, Join(path, name))) {
          differed = true;
          if (record != nullptr) {
            record->AddMember(Value(name.data(), static_cast<SizeType>(name.size()), allocator_),
                              NewRecord(instanceId, SET), allocator_);
          }
        }
      } else if (!cmp_.Equal(dv, *hv, childSchema)) {
        Report(dv, *hv, childSchema, Join(path, name), SET, record, name, instanceId);
        differed = true;
      }
    }
    if (found == h.MemberCount()) return differed;
    MemberIndex desiredIndex(d);
    for (auto it = h.MemberBegin(); it != h.MemberEnd(); ++it) {
      if (IsGeneratedId(it->name)) continue;
      const std::string_view name = NameOf(it->name);
      if (desiredIndex.Find(name) != nullptr) continue;
      const Value& childSchema = cmp_.Child(schema, name, it->value);
      if (cmp_.IsUnset(it->value, childSchema)) continue;
      Report(NullValue(), it->value, childSchema, Join(path, name), DELETE, record, name, instanceId);
      differed = true;
    }
    return differed;
  }

  // Elements of arrays of objects are matched, not compared by position: an
  // unmatched desired element is an addition at its own index, an unmatched
  // host element a removal numbered after the desired elements.
  bool CompareObjectArrays(const Value& d, const Value& h, const Value& schema, const std::string& path) {
    std::vector<bool> matched(h.Size(), false);
    PositionIndex<std::uint64_t> index(h.Size());
    for (SizeType j = 0; j < h.Size(); ++j) index.Insert(cmp_.Hash(h[j], cmp_.Items(schema, h[j])), j);
    bool differed = false;
    for (SizeType i = 0; i < d.Size(); ++i) {
      const Value& items = cmp_.Items(schema, d[i]);
      const SizeType j = index.TakeFirst(cmp_.Hash(d[i], items), matched,
                                         [&](SizeType p) { return cmp_.Equal(d[i], h[p], items); });
      if (j == kNone) {
        handler_.PropertyDrift(d[i], NullValue(), items, Join(path, i), ADD);
        differed = true;
      }
    }
    SizeType next = d.Size();
    for (SizeType j = 0; j < h.Size(); ++j) {
      if (matched[j]) continue;
      handler_.PropertyDrift(NullValue(), h[j], cmp_.Items(schema, h[j]), Join(path, next++), DELETE);
      differed = true;
    }
    return differed;
  }

  void CompareInstances(const Value& desiredIn, const Value& hostIn, ConfigStoreObjectId& id,
                        const std::shared_ptr<SchemaObject>& schema, const std::string& path) {
    static const Value emptyArray(rapidjson::kArrayType);
    RAPIDJSON_ASSERT(desiredIn.IsNull() || desiredIn.IsArray());
    RAPIDJSON_ASSERT(hostIn.IsNull() || hostIn.IsArray());
    const Value& d = desiredIn.IsNull() ? emptyArray : desiredIn;
    const Value& h = hostIn.IsNull() ? emptyArray : hostIn;
    const std::string& identity = schema->GetIdentityMember();
    const bool generated = identity.empty() || identity == HoxConfigStore::detail::kGeneratedIdMember;
    // Every instance is checked before anything is reported, so a malformed
    // item reports nothing.
    for (const Value* side : {&d, &h}) {
      for (const Value& instance : side->GetArray()) {
        RAPIDJSON_ASSERT(instance.IsObject());
        if (!generated) {
          auto member = instance.FindMember(identity);
          RAPIDJSON_ASSERT(member != instance.MemberEnd() && member->value.IsString());
        }
      }
    }
    const Value& node = schema->GetInstanceSchema();
    std::vector<bool> matched(h.Size(), false);
    if (generated) {
      PositionIndex<std::uint64_t> index(h.Size());
      for (SizeType j = 0; j < h.Size(); ++j) index.Insert(cmp_.Hash(h[j], node), j);
      for (SizeType i = 0; i < d.Size(); ++i) {
        const SizeType j = index.TakeFirst(cmp_.Hash(d[i], node), matched,
                                           [&](SizeType p) { return cmp_.Equal(d[i], h[p], node); });
        if (j != kNone) continue;
        id.instanceId = GeneratedIdOf(d[i]);
        handler_.Add(d[i], id, schema, Join(path, i));
      }
    } else {
      PositionIndex<std::string_view> index(h.Size());
      for (SizeType j = 0; j < h.Size(); ++j) index.Insert(NameOf(h[j][identity]), j);
      for (SizeType i = 0; i < d.Size(); ++i) {
        const Value& name = d[i][identity];
        id.instanceId.assign(name.GetString(), name.GetStringLength());
        const std::string instancePath = Join(path, i);
        const SizeType j = index.TakeFirst(NameOf(name), matched, [](SizeType) { return true; });
        if (j == kNone) {
          handler_.Add(d[i], id, schema, instancePath);
          continue;
        }
        Value record = driftRecords_ ? NewRecord(id.instanceId, SET) : Value();
        if (CompareMembers(d[i], h[j], node, instancePath, driftRecords_ ? &record : nullptr, id.instanceId) &&
            consolidated_) {
          handler_.Set(d[i], h[j], id, schema, instancePath, record);
        }
      }
    }
    SizeType next = d.Size();
    for (SizeType j = 0; j < h.Size(); ++j) {
      if (matched[j]) continue;
      if (generated) {
        id.instanceId = GeneratedIdOf(h[j]);
      } else {
        const Value& name = h[j][identity];
        id.instanceId.assign(name.GetString(), name.GetStringLength());
      }
      handler_.Delete(h[j], id, schema, Join(path, next++));
    }
  }

  static std::string GeneratedIdOf(const Value& instance) {
    auto member = instance.FindMember(HoxConfigStore::detail::kGeneratedIdMember);
    if (member != instance.MemberEnd() && member->value.IsString()) {
      return std::string(member->value.GetString(), member->value.GetStringLength());
    }
    return HoxConfigStore::GenerateInstanceId();
  }

  Allocator& allocator_;
  DriftHandler& handler_;
  const bool consolidated_;
  const bool driftRecords_;
  const bool perProperty_;
  HoxConfigStore::detail::ValueComparer cmp_;
};

const Value* FindIn(const Value* object, const Value& name) {
  if (object == nullptr || !object->IsObject()) return nullptr;
  auto it = object->FindMember(name);
  return it == object->MemberEnd() ? nullptr : &it->value;
}

// Lookups in the other document: wide levels (many components, groups or
// keys) go through a name index built once per object.
class OtherLevel {
 public:
  explicit OtherLevel(const Value* object) : object_(object) {
    if (object != nullptr && object->IsObject() && object->MemberCount() > HoxConfigStore::detail::kWideObject) {
      index_ = std::make_unique<MemberIndex>(*object);
    }
  }
  const Value* Find(const Value& name) const {
    if (index_) return index_->Find(NameOf(name));
    return FindIn(object_, name);
  }

 private:
  const Value* object_;
  std::unique_ptr<MemberIndex> index_;
};

}  // namespace

void computeComponents(const Value& source, const Value& other, Allocator& allocator,
                       const std::shared_ptr<HoxSchemaStore::SchemaStore>& store, DriftHandler& handler,
                       std::shared_ptr<HoxConfigStore::DBStore>& connection, bool reverse) {
  RAPIDJSON_ASSERT(source.IsObject());
  RAPIDJSON_ASSERT(other.IsNull() || other.IsObject());
  DriftWalk walk(allocator, handler);
  const OtherLevel components(&other);
  for (auto c = source.MemberBegin(); c != source.MemberEnd(); ++c) {
    RAPIDJSON_ASSERT(c->value.IsObject());
    const OtherLevel groups(components.Find(c->name));
    for (auto g = c->value.MemberBegin(); g != c->value.MemberEnd(); ++g) {
      RAPIDJSON_ASSERT(g->value.IsObject());
      const Value* otherGroup = groups.Find(g->name);
      const OtherLevel keys(otherGroup);
      for (auto k = g->value.MemberBegin(); k != g->value.MemberEnd(); ++k) {
        ConfigStoreObjectId id(std::string(NameOf(c->name)), std::string(NameOf(g->name)),
                               std::string(NameOf(k->name)));
        std::string path;
        path.reserve(3 + id.component.size() + id.group.size() + id.key.size());
        path.append("/").append(id.component).append("/").append(id.group).append("/").append(id.key);
        auto schema = HoxSchemaStore::GetSchema(id.component, id.group, id.key, store);
        if (!schema) {
          CSLogger::Log(CSLogger::kError, "Schema not found for %s:%s:%s", id.component.c_str(), id.group.c_str(),
                        id.key.c_str());
          ThrowException<SchemaNotFound>(SchemaObjectNotFound, path);
        }
        const Value* otherItem = keys.Find(k->name);
        if (!reverse) {
          walk.CompareItem(k->value, otherItem != nullptr ? *otherItem : NullValue(), id, schema, path);
        } else if (otherItem == nullptr) {
          // The host holds an item the desired document lacks: it drifts only
          // when it differs from the key's default user configuration.
          Document defaults;
          if (schema->HasDefaultUserConfig()) {
            if (!connection) connection = HoxConfigStore::GetDBStore(0, false);
            GetExternalDefaultUserConfig(id, connection, schema, defaults);
          }
          walk.CompareItem(defaults, k->value, id, schema, path);
        }
      }
    }
  }
}

void ComputeDrift(Value& desired, Allocator& allocator, DriftHandler& handler, std::optional<Document> current) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "ComputeDrift");
  Document host = current ? std::move(*current) : ExtractCurrentConfiguration();
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  if (!store) ThrowException<ConfigManagerException>(SchemaStoreAccessFailed);
  CSLogger::Log(CSLogger::kInfo, "DriftHandler: consolidated action required - %d",
                handler.IsConsolidatedActionRequired() ? 1 : 0);
  CSLogger::Log(CSLogger::kInfo, "DriftHandler: create drift object - %d", handler.IsCreateDriftObject() ? 1 : 0);
  RAPIDJSON_ASSERT(desired.IsObject());
  auto profile = desired.FindMember("profile");
  const Value& root = profile != desired.MemberEnd() ? profile->value : desired;
  std::shared_ptr<HoxConfigStore::DBStore> connection;
  computeComponents(root, host, allocator, store, handler, connection, false);
  computeComponents(host, root, allocator, store, handler, connection, true);
}

}  // namespace HoxConfigManager
