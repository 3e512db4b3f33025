#include "drift/drift_walk.h"

#include <charconv>
#include <cstdint>
#include <functional>
#include <optional>
#include <string_view>
#include <unordered_map>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/extraction.h>
#include <hoxcm/host.h>

#include "drift/host_matcher.h"
#include "drift/reported_schema.h"
#include "foundation/compare/schema_view.h"
#include "foundation/compare/value_compare.h"

namespace HoxConfigManager {

namespace {

using detail::HostMatcher;
using detail::kNone;
using compare::MemberIndex;
using compare::NameOf;
using compare::SameBytes;
using compare::SchemaView;
using HoxConfigStore::ConfigStoreObjectId;
using HoxSchemaStore::SchemaObject;
using rapidjson::SizeType;

const Value& NullValue() {
  static const Value null;
  return null;
}
const Value& EmptyObject() {
  static const Value empty(rapidjson::kObjectType);
  return empty;
}

// Appends "/segment" to the walk's path for the lifetime of the object.
class PathSegment {
 public:
  PathSegment(std::string& path, std::string_view segment) : path_(path), size_(path.size()) {
    path_.push_back('/');
    path_.append(segment);
  }
  PathSegment(std::string& path, SizeType index) : path_(path), size_(path.size()) {
    char digits[16];
    auto end = std::to_chars(digits, digits + sizeof digits, index).ptr;
    path_.push_back('/');
    path_.append(digits, end);
  }
  ~PathSegment() { path_.resize(size_); }
  PathSegment(const PathSegment&) = delete;
  PathSegment& operator=(const PathSegment&) = delete;

 private:
  std::string& path_;
  const std::string::size_type size_;
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
                   const std::shared_ptr<SchemaObject>& schema, const std::string& itemPath) {
    path_ = itemPath;
    instanceId_ = &id.instanceId;
    // Where a bare schema node shows whether a value is sensitive, handlers
    // get the comparison's nodes as they are; otherwise schemas that carry
    // what decides masking (reported_schema.h).
    auto known = secretKeys_.find(schema.get());
    if (known == secretKeys_.end()) {
      known = secretKeys_.emplace(schema.get(), compare::NeedsRootToTellSecrets(schema->GetJsonSchema())).first;
    }
    view_.reset();
    if (known->second) view_.emplace(schema->GetJsonSchema(), schema->GetInstanceSchema());
    if (schema->IsMultiInstance()) {
      CompareInstances(desired, host, id, schema);
    } else {
      CompareSingle(desired, host, id, schema);
    }
  }

 private:
  Value NewRecord(ACTION action) {
    Value marker(rapidjson::kObjectType);
    marker.AddMember("INSTANCEID", Value(*instanceId_, allocator_), allocator_);
    marker.AddMember("DRIFTOP", rapidjson::StringRef(ActionName(action)), allocator_);
    Value record(rapidjson::kObjectType);
    record.AddMember("DRIFTOBJ", marker, allocator_);
    return record;
  }

  // Records a drifted member in a drift record, creating the record on the
  // first difference (no record is built for what does not drift).
  void Mark(Value* record, std::string_view name, Value marker) {
    if (record == nullptr) return;
    if (record->IsNull()) *record = NewRecord(SET);
    record->AddMember(Value(name.data(), static_cast<SizeType>(name.size()), allocator_), marker, allocator_);
  }

  // The schema node handed to the handler with a drifted property.
  const Value& Reported(const Value& schemaNode, const SchemaView* view, const Value& desired, const Value& host) {
    if (view == nullptr) return schemaNode;
    return detail::ReportedSchema(*view, schemaNode, desired, host, reported_);
  }

  void Report(const Value& desired, const Value& host, const Value& schemaNode, const SchemaView* view, ACTION action,
              Value* record, std::string_view name) {
    handler_.PropertyDrift(desired, host, Reported(schemaNode, view, desired, host), path_, action);
    if (record != nullptr) Mark(record, name, NewRecord(action));
  }

  const SchemaView* ViewOrNull() const { return view_ ? &*view_ : nullptr; }

  void CompareSingle(const Value& desired, const Value& host, ConfigStoreObjectId& id,
                     const std::shared_ptr<SchemaObject>& schema) {
    // A singleton whose configuration was deleted holds this marker on the host.
    const bool deletedDefault = DocumentShape::IsDeleteDefault(host);
    RAPIDJSON_ASSERT(desired.IsNull() || desired.IsObject());
    RAPIDJSON_ASSERT(host.IsNull() || host.IsObject() || deletedDefault);
    const Value& node = schema->GetInstanceSchema();
    const bool desiredAbsent = desired.IsNull() || cmp_.IsUnset(desired, node);
    const bool hostAbsent = host.IsNull() || deletedDefault || cmp_.IsUnset(host, node);
    if (desiredAbsent && hostAbsent) return;
    if (!perProperty_) {
      if (desiredAbsent) {
        handler_.Delete(host, id, schema, path_);
        return;
      }
      if (hostAbsent) {
        const Value record = driftRecords_ ? NewRecord(SET) : Value();
        handler_.Set(desired, host, id, schema, path_, record);
        return;
      }
    }
    const Value& d = desiredAbsent ? EmptyObject() : desired;
    const Value& h = host.IsObject() ? host : EmptyObject();
    Value record;
    if (CompareMembers(d, h, node, driftRecords_ ? &record : nullptr, ViewOrNull()) && consolidated_) {
      handler_.Set(desired, host, id, schema, path_, record);
    }
  }

  // Reports the differing members of two objects: first those of `d` in its
  // order (additions and changes, nested objects depth first), then those
  // only `h` holds, in its order. True when anything differed. Which members
  // count, and under which schema, is the comparer's member pass: the rule
  // of equality itself.
  bool CompareMembers(const Value& d, const Value& h, const Value& schema, Value* record, const SchemaView* view) {
    bool differed = false;
    // The view of a member, when the key needs views.
    const auto member = [&](std::string_view name) {
      return view != nullptr ? std::optional<SchemaView>(view->Member(name)) : std::nullopt;
    };
    cmp_.Members(
        d, h, schema,
        [&](std::string_view name, const Value& dv, const Value* hv, const Value& childSchema) {
          const bool hostUnset = hv == nullptr || cmp_.IsUnset(*hv, childSchema);
          const bool desiredUnset = cmp_.IsUnset(dv, childSchema);
          if (hostUnset && desiredUnset) return true;
          const PathSegment segment(path_, name);
          const std::optional<SchemaView> childView = member(name);
          const SchemaView* cv = childView ? &*childView : nullptr;
          if (hostUnset || desiredUnset) {
            Report(dv, hv != nullptr ? *hv : NullValue(), childSchema, cv, hostUnset ? ADD : DELETE, record, name);
            differed = true;
          } else if (dv.IsObject() && hv->IsObject()) {
            Value sub;
            if (CompareMembers(dv, *hv, childSchema, record != nullptr ? &sub : nullptr, cv)) {
              differed = true;
              if (record != nullptr) Mark(record, name, sub.IsNull() ? NewRecord(SET) : std::move(sub));
            }
          } else if (dv.IsArray() && hv->IsArray() && cmp_.HoldsObjects(childSchema, dv, *hv)) {
            if (CompareObjectArrays(dv, *hv, childSchema, cv)) {
              differed = true;
              Mark(record, name, NewRecord(SET));
            }
          } else if (!cmp_.Equal(dv, *hv, childSchema)) {
            Report(dv, *hv, childSchema, cv, SET, record, name);
            differed = true;
          }
          return true;
        },
        [&](std::string_view name, const Value& hv, const Value& childSchema) {
          const PathSegment segment(path_, name);
          const std::optional<SchemaView> childView = member(name);
          Report(NullValue(), hv, childSchema, childView ? &*childView : nullptr, DELETE, record, name);
          differed = true;
          return true;
        });
    return differed;
  }

  // Elements of arrays of objects are matched, not compared by position: an
  // unmatched desired element is an addition at its own index, an unmatched
  // host element a removal numbered after the desired elements.
  bool CompareObjectArrays(const Value& d, const Value& h, const Value& schema, const SchemaView* view) {
    const auto element = [&](SizeType index) {
      return view != nullptr ? std::optional<SchemaView>(view->Element(index)) : std::nullopt;
    };
    HostMatcher<std::uint64_t, std::function<std::uint64_t(SizeType)>> matcher(
        h.Size(), [&](SizeType j) { return cmp_.Hash(h[j], cmp_.Items(schema, h[j])); });
    bool differed = false;
    for (SizeType i = 0; i < d.Size(); ++i) {
      const Value& items = cmp_.Items(schema, d[i]);
      const SizeType j = matcher.Take([&](SizeType p) { return cmp_.Equal(d[i], h[p], items); },
                                      [&] { return cmp_.Hash(d[i], items); });
      if (j == kNone) {
        const PathSegment segment(path_, i);
        const std::optional<SchemaView> elementView = element(i);
        handler_.PropertyDrift(d[i], NullValue(),
                               Reported(items, elementView ? &*elementView : nullptr, d[i], NullValue()), path_, ADD);
        differed = true;
      }
    }
    SizeType next = d.Size();
    for (SizeType j = 0; j < h.Size(); ++j) {
      if (matcher.matched()[j]) continue;
      const PathSegment segment(path_, next++);
      const std::optional<SchemaView> elementView = element(j);
      handler_.PropertyDrift(NullValue(), h[j],
                             Reported(cmp_.Items(schema, h[j]), elementView ? &*elementView : nullptr, NullValue(), h[j]),
                             path_, DELETE);
      differed = true;
    }
    return differed;
  }

  void CompareInstances(const Value& desiredIn, const Value& hostIn, ConfigStoreObjectId& id,
                        const std::shared_ptr<SchemaObject>& schema) {
    static const Value emptyArray(rapidjson::kArrayType);
    RAPIDJSON_ASSERT(desiredIn.IsNull() || desiredIn.IsArray());
    RAPIDJSON_ASSERT(hostIn.IsNull() || hostIn.IsArray());
    const Value& d = desiredIn.IsNull() ? emptyArray : desiredIn;
    const Value& h = hostIn.IsNull() ? emptyArray : hostIn;
    const std::string& identity = schema->GetIdentityMember();
    const bool generated = identity.empty() || identity == DocumentShape::kGeneratedId;
    // Every instance is checked, and its identity found, before anything is
    // reported, so a malformed item reports nothing.
    std::vector<const Value*> desiredIds, hostIds;
    if (!generated) {
      desiredIds.reserve(d.Size());
      hostIds.reserve(h.Size());
    }
    for (auto [side, ids] : {std::pair{&d, &desiredIds}, std::pair{&h, &hostIds}}) {
      for (SizeType i = 0; i < side->Size(); ++i) {
        const Value& instance = (*side)[i];
        if (!instance.IsObject()) InstanceFault(i);
        if (generated) continue;
        const Value* member = compare::FindByName(instance, identity);
        if (member == nullptr || !member->IsString()) InstanceFault(i);
        ids->push_back(member);
      }
    }
    const Value& node = schema->GetInstanceSchema();
    std::vector<bool> matched;
    if (generated) {
      HostMatcher<std::uint64_t, std::function<std::uint64_t(SizeType)>> matcher(
          h.Size(), [&](SizeType j) { return cmp_.Hash(h[j], node); });
      for (SizeType i = 0; i < d.Size(); ++i) {
        const SizeType j = matcher.Take([&](SizeType p) { return cmp_.Equal(d[i], h[p], node); },
                                        [&] { return cmp_.Hash(d[i], node); });
        if (j != kNone) continue;
        id.instanceId = GeneratedIdOf(d[i]);
        const PathSegment segment(path_, i);
        AtInstance([&] { handler_.Add(d[i], id, schema, path_); });
      }
      matched = matcher.matched();
    } else {
      HostMatcher<std::string_view, std::function<std::string_view(SizeType)>> matcher(
          h.Size(), [&](SizeType j) { return NameOf(*hostIds[j]); });
      for (SizeType i = 0; i < d.Size(); ++i) {
        if (const auto* index = matcher.IndexOnly()) {
          // Instances in random order: fetch the index slot of a later
          // instance, then the host instance it leads to, then its members.
          constexpr SizeType kSlot = 12, kValue = 8, kMembers = 4;
          if (i + kSlot < d.Size()) index->PrefetchSlot(NameOf(*desiredIds[i + kSlot]));
          if (i + kValue < d.Size()) {
            const SizeType p = index->Peek(NameOf(*desiredIds[i + kValue]));
            if (p != kNone) __builtin_prefetch(&h[p]);
          }
          if (i + kMembers < d.Size()) {
            const SizeType p = index->Peek(NameOf(*desiredIds[i + kMembers]));
            if (p != kNone && h[p].MemberCount() > 0) __builtin_prefetch(&*h[p].MemberBegin());
          }
        }
        const Value& name = *desiredIds[i];
        const std::string_view key = NameOf(name);
        const SizeType j =
            matcher.Take([&](SizeType p) { return SameBytes(NameOf(*hostIds[p]), key); }, [&] { return key; });
        id.instanceId.assign(name.GetString(), name.GetStringLength());
        const PathSegment segment(path_, i);
        AtInstance([&] {
          if (j == kNone) {
            handler_.Add(d[i], id, schema, path_);
            return;
          }
          Value record;
          if (CompareMembers(d[i], h[j], node, driftRecords_ ? &record : nullptr, ViewOrNull()) && consolidated_) {
            handler_.Set(d[i], h[j], id, schema, path_, record);
          }
        });
      }
      matched = matcher.matched();
    }
    SizeType next = d.Size();
    for (SizeType j = 0; j < h.Size(); ++j) {
      if (matched[j]) continue;
      if (generated) {
        id.instanceId = GeneratedIdOf(h[j]);
      } else {
        id.instanceId.assign(hostIds[j]->GetString(), hostIds[j]->GetStringLength());
      }
      const PathSegment segment(path_, next++);
      AtInstance([&] { handler_.Delete(h[j], id, schema, path_); });
    }
  }

  // Runs `body` on the instance whose path is in path_: a structural fault
  // found in it leaves with that path (deeper members' segments are gone
  // by then).
  template <typename Body>
  void AtInstance(Body&& body) {
    try {
      body();
    } catch (HoxConfigStore::ConfigStoreException& error) {
      LocateStructuralFault(error, path_);
      throw;
    }
  }

  // An instance that is not an object, or lacks its identity.
  [[noreturn]] void InstanceFault(SizeType index) {
    const PathSegment segment(path_, index);
    detail::ThrowInvalidJsonAt(path_);
  }

  static std::string GeneratedIdOf(const Value& instance) {
    auto member = instance.FindMember(Value(DocumentShape::Ref(DocumentShape::kGeneratedId)));
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
  compare::ValueComparer cmp_;
  // Whether each key met needs views to tell its secrets, and the view of
  // the item being compared when it does.
  std::unordered_map<const SchemaObject*, bool> secretKeys_;
  std::optional<SchemaView> view_;
  Document reported_;
  // The path of what is being compared, grown and shrunk as the walk descends.
  std::string path_;
  const std::string* instanceId_ = nullptr;
};

const Value* FindIn(const Value* object, const Value& name) {
  if (object == nullptr || !object->IsObject()) return nullptr;
  return compare::FindByName(*object, NameOf(name));
}

// Lookups in the other document: wide levels (many components, groups or
// keys) go through a name index built once per object.
class OtherLevel {
 public:
  explicit OtherLevel(const Value* object) : object_(object) {
    if (object != nullptr && object->IsObject() && object->MemberCount() > compare::kWideObject) {
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
  // Walks `source` and looks each level up in `other` as it goes.
  class Pass : public DocumentShape::LevelVisitor {
   public:
    Pass(const Value& other, Allocator& allocator, const std::shared_ptr<HoxSchemaStore::SchemaStore>& store,
         DriftHandler& handler, std::shared_ptr<HoxConfigStore::DBStore>& connection, bool reverse)
        : components_(&other), store_(store), connection_(connection), reverse_(reverse), walk_(allocator, handler) {}

    void EnterComponent(const Value& name, const Value&) { groups_.emplace(components_.Find(name)); }
    void EnterGroup(const Value&, const Value& name, const Value&) { keys_.emplace(groups_->Find(name)); }

    void Item(const DocumentShape::Item<const Value>& item) {
      const Value* otherItem = keys_->Find(item.key);
      // The forward pass has compared this item, and found its schema.
      if (reverse_ && otherItem != nullptr) return;
      ConfigStoreObjectId id(std::string(NameOf(item.component)), std::string(NameOf(item.group)),
                             std::string(NameOf(item.key)));
      const std::string path = DocumentShape::ItemPath(id.component, id.group, id.key);
      const HoxPlatform::LogContext object(HoxPlatform::LogContext::Field::kObject, path);
      auto schema = HoxSchemaStore::GetSchema(id.component, id.group, id.key, store_);
      if (!schema) {
        CSLogger::Log(CSLogger::kError, "Schema not found for %s:%s:%s", id.component.c_str(), id.group.c_str(),
                      id.key.c_str());
        HoxSchemaStore::ThrowSchemaNotFound(store_.get(), {id.component, id.group, id.key}, path);
      }
      if (!reverse_) {
        walk_.CompareItem(item.value, otherItem != nullptr ? *otherItem : NullValue(), id, schema, path);
        return;
      }
      // The host holds an item the desired document lacks: it drifts only
      // when it differs from the key's default user configuration.
      Document defaults;
      if (schema->HasDefaultUserConfig()) {
        if (!connection_) connection_ = HoxConfigStore::GetDBStore(0, false);
        GetExternalDefaultUserConfig(id, connection_, schema, defaults);
      }
      walk_.CompareItem(defaults, item.value, id, schema, path);
    }

   private:
    const OtherLevel components_;
    std::optional<OtherLevel> groups_;
    std::optional<OtherLevel> keys_;
    const std::shared_ptr<HoxSchemaStore::SchemaStore>& store_;
    std::shared_ptr<HoxConfigStore::DBStore>& connection_;
    const bool reverse_;
    DriftWalk walk_;
  } pass(other, allocator, store, handler, connection, reverse);
  DocumentShape::Walk(source, pass);
}

void ComputeDrift(Value& desired, Allocator& allocator, DriftHandler& handler, std::optional<Document> current) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "ComputeDrift");
  Document host = current ? std::move(*current) : ExtractCurrentConfiguration();
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  if (!store) ThrowException<ConfigManagerException>(SchemaStoreAccessFailed);
  CSLogger::Log(CSLogger::kInfo, "DriftHandler: consolidated action required - %d",
                handler.IsConsolidatedActionRequired() ? 1 : 0);
  CSLogger::Log(CSLogger::kInfo, "DriftHandler: create drift object - %d", handler.IsCreateDriftObject() ? 1 : 0);
  const Value& root = DocumentShape::Unwrap(desired);
  std::shared_ptr<HoxConfigStore::DBStore> connection;
  computeComponents(root, host, allocator, store, handler, connection, false);
  computeComponents(host, root, allocator, store, handler, connection, true);
}

}  // namespace HoxConfigManager
