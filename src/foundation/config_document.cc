// Building, reshaping and serialising configuration documents: host
// sections, clean-up, normalisation and auto-configuration patches.
#include <algorithm>
#include <cctype>
#include <string_view>
#include <vector>

#include <hoxcm/config_document.h>
#include <hoxcm/documents.h>

#include "foundation/json_parse.h"

namespace HoxConfigStore {
namespace {

using Allocator = rapidjson::MemoryPoolAllocator<>;
using rapidjson::Value;

namespace Shape = HoxConfigManager::DocumentShape;

constexpr const char* kHostSpecific = "hostSpecific";

std::string_view Name(const Value& name) { return {name.GetString(), name.GetStringLength()}; }

// The object member `name` of `parent`, created empty when missing; an
// existing member that is not an object is "Invalid JSON". Documents are
// built from rows ordered by component and group, so the member asked for
// is nearly always the last one: it is tried before the search, which
// would otherwise scan every component of a large host for every row.
Value& ObjectMember(Value& parent, std::string_view name, Allocator& allocator) {
  RAPIDJSON_ASSERT(parent.IsObject());
  if (!parent.ObjectEmpty()) {
    Value::Member& last = *(parent.MemberEnd() - 1);
    if (Name(last.name) == name) {
      RAPIDJSON_ASSERT(last.value.IsObject());
      return last.value;
    }
  }
  const Value key(rapidjson::StringRef(name.data(), name.size()));
  auto it = parent.FindMember(key);
  if (it == parent.MemberEnd()) {
    parent.AddMember(Value(name.data(), static_cast<rapidjson::SizeType>(name.size()), allocator),
                     Value(rapidjson::kObjectType), allocator);
    return (parent.MemberEnd() - 1)->value;
  }
  RAPIDJSON_ASSERT(it->value.IsObject());
  return it->value;
}

// Sets parent[name] to `value` (moved), replacing an existing member.
void SetMember(Value& parent, std::string_view name, Value& value, Allocator& allocator) {
  const Value key(rapidjson::StringRef(name.data(), name.size()));
  auto it = parent.FindMember(key);
  if (it != parent.MemberEnd()) {
    it->value = value;
  } else {
    parent.AddMember(Value(name.data(), static_cast<rapidjson::SizeType>(name.size()), allocator), value, allocator);
  }
}

// Copies every item (component, group, key) of `items` into `target`,
// replacing items that exist there; components and groups are created in
// `target` even when they hold no item.
void MergeItems(Value& target, const Value& items, Allocator& allocator) {
  struct Merge : Shape::LevelVisitor {
    Merge(Value& target, Allocator& allocator) : target(target), allocator(allocator) {}
    void EnterComponent(const Value& name, const Value&) { component = &ObjectMember(target, Name(name), allocator); }
    void EnterGroup(const Value&, const Value& name, const Value&) {
      group = &ObjectMember(*component, Name(name), allocator);
    }
    void Item(const Shape::Item<const Value>& item) {
      Value copy(item.value, allocator);
      SetMember(*group, Name(item.key), copy, allocator);
    }
    Value& target;
    Allocator& allocator;
    Value* component = nullptr;
    Value* group = nullptr;
  } merge(target, allocator);
  Shape::Walk(items, merge);
}

// The schema of an object's member `name`, or null when the schema does not
// list it among its "properties" (including those of its oneOf/anyOf/allOf
// branches).
const Value* PropertySchema(const Value& schema, const Value& name) {
  if (!schema.IsObject()) return nullptr;
  auto properties = schema.FindMember("properties");
  if (properties != schema.MemberEnd() && properties->value.IsObject()) {
    auto it = properties->value.FindMember(name);
    if (it != properties->value.MemberEnd()) return &it->value;
  }
  for (const char* combinator : {"allOf", "anyOf", "oneOf"}) {
    auto branches = schema.FindMember(combinator);
    if (branches == schema.MemberEnd() || !branches->value.IsArray()) continue;
    for (const Value& branch : branches->value.GetArray()) {
      if (const Value* found = PropertySchema(branch, name)) return found;
    }
  }
  return nullptr;
}

// The schema of the elements of an array described by `schema`.
const Value* ItemsSchema(const Value* schema) {
  if (schema == nullptr || !schema->IsObject()) return nullptr;
  auto items = schema->FindMember("items");
  return items != schema->MemberEnd() && items->value.IsObject() ? &items->value : nullptr;
}

bool IsRequired(const Value& schema, const Value& name) {
  if (!schema.IsObject()) return false;
  auto required = schema.FindMember("required");
  if (required == schema.MemberEnd() || !required->value.IsArray()) return false;
  for (const Value& entry : required->value.GetArray()) {
    if (entry.IsString() && entry == name) return true;
  }
  return false;
}

// Whether members the schema does not list are still described, by
// "patternProperties" or a true / schema "additionalProperties".
bool DescribesOtherMembers(const Value& schema) {
  if (!schema.IsObject()) return true;
  if (!schema.HasMember("properties")) return true;  // nothing listed: nothing judged
  if (schema.HasMember("patternProperties")) return true;
  auto additional = schema.FindMember("additionalProperties");
  return additional != schema.MemberEnd() && (additional->value.IsObject() || additional->value.IsTrue());
}

// Applies one clean-up action to `value` and everything below it.
void Clean(Value& value, const Value* schema, CLEANUP_ACTIONS action) {
  if (value.IsArray()) {
    const Value* items = ItemsSchema(schema);
    for (Value& element : value.GetArray()) Clean(element, items, action);
    return;
  }
  if (!value.IsObject()) return;
  static const Value kNoSchema;
  const Value& objectSchema = schema != nullptr ? *schema : kNoSchema;
  for (auto it = value.MemberBegin(); it != value.MemberEnd();) {
    const Value* memberSchema = PropertySchema(objectSchema, it->name);
    bool drop = false;
    switch (action) {
      case CLEANUP_REMOVE_GENERATED_ID:
        break;  // top level only, see CleanupObject
      case CLEANUP_REMOVE_NULLS:
        drop = it->value.IsNull();
        break;
      case CLEANUP_REMOVE_EMPTY_OBJECTS:
        Clean(it->value, memberSchema, action);
        drop = it->value.IsObject() && it->value.ObjectEmpty();
        break;
      case CLEANUP_REMOVE_DEFAULTS:
        if (memberSchema != nullptr && memberSchema->IsObject() && memberSchema->HasMember("default") &&
            (*memberSchema)["default"] == it->value && !IsRequired(objectSchema, it->name)) {
          drop = true;
        }
        break;
      case CLEANUP_REMOVE_UNKNOWN:
        drop = memberSchema == nullptr && Name(it->name) != Shape::kGeneratedId && !DescribesOtherMembers(objectSchema);
        break;
    }
    if (drop) {
      it = value.EraseMember(it);
      continue;
    }
    if (action != CLEANUP_REMOVE_EMPTY_OBJECTS) Clean(it->value, memberSchema, action);
    ++it;
  }
}

bool IsHostSpecificNode(const Value& node) {
  if (!node.IsObject()) return false;
  auto flag = node.FindMember(kHostSpecific);
  return flag != node.MemberEnd() && flag->value.IsTrue();
}

// Whether the schema document marks the item (or its group or component)
// host-specific.
bool IsHostSpecific(const Value& schemaDocument, const Value& component, const Value& group, const Value& key) {
  const Value* node = &schemaDocument;
  for (const Value* name : {&component, &group, &key}) {
    node = PropertySchema(*node, *name);
    if (node == nullptr) return false;
    if (IsHostSpecificNode(*node)) return true;
  }
  const Value* items = ItemsSchema(node);
  return items != nullptr && IsHostSpecificNode(*items);
}

// A JSON pointer from a validator field: "/a/b", or a bare member name.
rapidjson::Pointer FieldPointer(const std::string& field) {
  return rapidjson::Pointer(field.empty() || field.front() == '/' ? field : "/" + field);
}

// Whether `pointer` names a member of an object that exists in `value`.
// Setting through any other pointer would turn what stands in its way (a
// string, an array) into an object, or pad an array with nulls.
bool NamesMemberOfObject(const rapidjson::Pointer& pointer, Value& value) {
  if (!pointer.IsValid() || pointer.GetTokenCount() == 0) return false;
  const rapidjson::Pointer parent(pointer.GetTokens(), pointer.GetTokenCount() - 1);
  const Value* container = parent.Get(value);
  return container != nullptr && container->IsObject();
}

// The auto-configuration value of `field`; null when there is none.
const Value* AutoConfSource(const rapidjson::Pointer& pointer, const Value& autoConf) {
  return pointer.IsValid() ? pointer.Get(autoConf) : nullptr;
}

}  // namespace

std::string ConfigStoreDocument::NormalizeHostId(const std::string& hostId) {
  std::string digits;
  std::string trimmed;
  for (char c : hostId) {
    const auto u = static_cast<unsigned char>(c);
    if (std::isspace(u)) continue;
    trimmed.push_back(static_cast<char>(std::tolower(u)));
    if (c != '-' && c != '{' && c != '}') digits.push_back(static_cast<char>(std::tolower(u)));
  }
  const bool hex = digits.size() == 32 &&
                   std::all_of(digits.begin(), digits.end(), [](char c) { return std::isxdigit(c) != 0; });
  if (!hex) return trimmed;
  return digits.substr(0, 8) + "-" + digits.substr(8, 4) + "-" + digits.substr(12, 4) + "-" + digits.substr(16, 4) +
         "-" + digits.substr(20);
}

void ConfigStoreDocument::GetDocumentForHost(const rapidjson::Value& source, rapidjson::Document& result,
                                             const std::string& hostId) {
  RAPIDJSON_ASSERT(source.IsObject());
  result.CopyFrom(source, result.GetAllocator());
  ReduceToHost(result, hostId);
}

void ConfigStoreDocument::ReduceToHost(rapidjson::Document& document, const std::string& hostId) {
  RAPIDJSON_ASSERT(document.IsObject());
  auto found = document.FindMember(kHostSpecific);
  if (found == document.MemberEnd()) return;
  Value sections(std::move(found->value));
  document.EraseMember(found);
  RAPIDJSON_ASSERT(sections.IsObject());
  Allocator& allocator = document.GetAllocator();
  Value& target = Shape::Unwrap(document);
  const std::string host = NormalizeHostId(hostId);
  for (const auto& section : sections.GetObject()) {
    RAPIDJSON_ASSERT(section.value.IsObject());
    if (NormalizeHostId(section.name.GetString()) != host) continue;
    MergeItems(target, section.value, allocator);
  }
}

void ConfigStoreDocument::SplitDocument(const rapidjson::Value& profile, const rapidjson::Value& schemaDocument,
                                        const std::string& hostId, rapidjson::Document& out) {
  const Value& root = Shape::Unwrap(profile);
  out.SetObject();
  Allocator& allocator = out.GetAllocator();
  Value shared(rapidjson::kObjectType);
  Value specific(rapidjson::kObjectType);
  Shape::ForEachItem(root, [&](const Shape::Item<const Value>& item) {
    Value& target = IsHostSpecific(schemaDocument, item.component, item.group, item.key) ? specific : shared;
    Value& targetGroup =
        ObjectMember(ObjectMember(target, Name(item.component), allocator), Name(item.group), allocator);
    Value copy(item.value, allocator);
    SetMember(targetGroup, Name(item.key), copy, allocator);
  });
  out.AddMember(Shape::Ref(Shape::kProfile), shared, allocator);
  if (!specific.ObjectEmpty()) {
    Value sections(rapidjson::kObjectType);
    sections.AddMember(Value(NormalizeHostId(hostId), allocator), specific, allocator);
    out.AddMember(rapidjson::StringRef(kHostSpecific), sections, allocator);
  }
}

bool ConfigStoreDocument::ValueExists(const rapidjson::Value& object, const char* member) {
  return object.IsObject() && member != nullptr && object.HasMember(member);
}

void ConfigStoreDocument::AddObject(rapidjson::Document& doc, const std::string& component, const std::string& group,
                                    const std::string& key, const std::string& identifier, rapidjson::Value& value,
                                    rapidjson::MemoryPoolAllocator<>& allocator) {
  if (doc.IsNull()) doc.SetObject();
  RAPIDJSON_ASSERT(doc.IsObject());
  Value& root = Shape::Unwrap(doc);
  AddItem(root, component, group, key, identifier, value, allocator);
}

void ConfigStoreDocument::AddItem(rapidjson::Value& items, const std::string& component, const std::string& group,
                                  const std::string& key, const std::string& identifier, rapidjson::Value& value,
                                  rapidjson::MemoryPoolAllocator<>& allocator) {
  Value& groupValue = ObjectMember(ObjectMember(items, component, allocator), group, allocator);
  if (identifier.empty()) {
    SetMember(groupValue, key, value, allocator);
    return;
  }
  auto it = groupValue.FindMember(Value(rapidjson::StringRef(key.data(), key.size())));
  if (it == groupValue.MemberEnd()) {
    Value instances(rapidjson::kArrayType);
    instances.PushBack(value, allocator);
    groupValue.AddMember(Value(key, allocator), instances, allocator);
    return;
  }
  RAPIDJSON_ASSERT(it->value.IsArray());
  it->value.PushBack(value, allocator);
}

void ConfigStoreDocument::AddProfile(rapidjson::Document& doc) {
  if (!doc.IsObject()) doc.SetObject();
  if (!doc.HasMember(Value(Shape::Ref(Shape::kProfile)))) {
    doc.AddMember(Shape::Ref(Shape::kProfile), Value(rapidjson::kObjectType), doc.GetAllocator());
  }
}

void ConfigStoreDocument::CleanupObject(rapidjson::Value& value, const rapidjson::Value& schema,
                                        const std::vector<CLEANUP_ACTIONS>& actions,
                                        rapidjson::MemoryPoolAllocator<>& /*allocator*/) {
  // A multi-instance key's schema describes the array; its instances follow
  // its "items".
  const Value* instanceSchema = &schema;
  if (schema.IsObject() && value.IsObject()) {
    auto type = schema.FindMember("type");
    if (type != schema.MemberEnd() && type->value == "array") instanceSchema = ItemsSchema(&schema);
  }
  for (CLEANUP_ACTIONS action : actions) {
    if (action == CLEANUP_REMOVE_GENERATED_ID) {
      if (value.IsObject()) value.EraseMember(Value(Shape::Ref(Shape::kGeneratedId)));
      continue;
    }
    Clean(value, instanceSchema, action);
  }
}

void ConfigStoreDocument::NormalizeValue(rapidjson::Value& value, rapidjson::MemoryPoolAllocator<>& allocator) {
  if (value.IsArray()) {
    for (Value& element : value.GetArray()) NormalizeValue(element, allocator);
    return;
  }
  if (!value.IsObject()) return;
  std::vector<rapidjson::Value::Member*> members;
  members.reserve(value.MemberCount());
  for (auto& member : value.GetObject()) {
    NormalizeValue(member.value, allocator);
    members.push_back(&member);
  }
  std::stable_sort(members.begin(), members.end(),
                   [](const auto* a, const auto* b) { return Name(a->name) < Name(b->name); });
  Value sorted(rapidjson::kObjectType);
  for (auto* member : members) sorted.AddMember(member->name, member->value, allocator);
  value = sorted;
}

bool ConfigStoreDocument::PatchRequiredProperty(rapidjson::Value& value, const std::string& field,
                                                const rapidjson::Value& autoConf,
                                                rapidjson::MemoryPoolAllocator<>& allocator) {
  const rapidjson::Pointer pointer = FieldPointer(field);
  const Value* source = AutoConfSource(pointer, autoConf);
  if (source == nullptr) return false;
  Value* existing = pointer.Get(value);
  if (existing == nullptr) {
    if (NamesMemberOfObject(pointer, value)) pointer.Set(value, Value(*source, allocator), allocator);
    return true;
  }
  // The field names an object: fill the members it lacks.
  if (!existing->IsObject() || !source->IsObject()) return true;
  for (const auto& member : source->GetObject()) {
    if (!existing->HasMember(member.name)) {
      existing->AddMember(Value(member.name, allocator), Value(member.value, allocator), allocator);
    }
  }
  return true;
}

bool ConfigStoreDocument::PatchUnionTagProperty(rapidjson::Value& value, const std::string& field,
                                                const rapidjson::Value& autoConf,
                                                rapidjson::MemoryPoolAllocator<>& allocator) {
  const rapidjson::Pointer pointer = FieldPointer(field);
  const Value* source = AutoConfSource(pointer, autoConf);
  if (source == nullptr) return false;
  // The tag is missing or names no variant: the auto-configured tag wins.
  if (NamesMemberOfObject(pointer, value)) pointer.Set(value, Value(*source, allocator), allocator);
  return true;
}

rapidjson::Document ConfigStoreDocument::CreateDocument(const std::string& text) {
  rapidjson::Document doc;
  if (!HoxConfigManager::detail::ParseJson(text.data(), text.size(), doc)) {
    HoxConfigManager::ThrowException<HoxConfigManager::InvalidArgumentException>(
        HoxConfigManager::JsonParseFailed);
  }
  return doc;
}

void ConfigStoreDocument::SerializeValue(const rapidjson::Value& value, std::string& out) {
  rapidjson::StringBuffer buffer;
  rapidjson::Writer<rapidjson::StringBuffer> writer(buffer);
  value.Accept(writer);
  out.assign(buffer.GetString(), buffer.GetSize());
}

}  // namespace HoxConfigStore
