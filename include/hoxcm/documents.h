// JSON document utilities of the configuration manager: create, parse,
// compare and serialise RapidJSON documents, and the one definition of the
// configuration document's shape. Pure JSON: the document functions that
// need files or the host are in <hoxcm/host_documents.h>, those that read the
// configuration store in <hoxcm/extraction.h>.
//
// Configuration documents have three levels, component → group → key, whose
// value is the item: an object for a singleton key, an array of instance
// objects for a multi-instance key. A desired document may wrap this shape
// in a top-level "profile" member.
//
// All functions are stateless and thread-safe. Parsers accept at most
// kMaxJsonDepth levels of nesting and only valid UTF-8.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include <hoxcm/export.h>
#include <hoxcm/json.h>

namespace HoxConfigManager {

// Deeper documents are refused as malformed: no configuration comes close,
// and the recursive walks over documents must not exhaust the stack.
constexpr unsigned kMaxJsonDepth = 512;

HOXCM_API std::shared_ptr<Document> CreateDocument();
HOXCM_API void AddMember(Document* doc, Value* object, const std::string& name, Value* value);
HOXCM_API bool IsEqualArray(const Value& a, const Value& b);

HOXCM_API void SerializeValue(const Value& value, std::string& out);
// Compact JSON text of a value, for messages and logs.
HOXCM_API std::string JsonToString(const Value& value);

// Parse errors: InvalidArgumentException 2080. The text is parsed by its
// length: anything after the document but white space is an error, a NUL
// byte included.
HOXCM_API void ParseDocument(const std::string& text, Document& doc);
HOXCM_API std::shared_ptr<Document> CreateDocumentFromString(const std::string& text);

// The shape of configuration documents: the member names the system gives
// meaning to, the "profile" wrapper, and the walk over the items.
namespace DocumentShape {

// The wrapper a desired document may put around its components.
inline constexpr std::string_view kProfile = "profile";
// The instance identity the configuration store generates; never compared.
inline constexpr std::string_view kGeneratedId = "cs_generated_id";
// The value the store keeps for a default configuration that was deleted.
inline constexpr std::string_view kDeleteDefault = "DELETE_DEFAULT";

// Whether `value` is the marker of a deleted default configuration.
inline bool IsDeleteDefault(const Value& value) {
  return value.IsString() &&
         std::string_view(value.GetString(), value.GetStringLength()) == kDeleteDefault;
}

// A string reference to one of the names above, for RapidJSON calls (no
// copy, no length count).
inline rapidjson::GenericStringRef<char> Ref(std::string_view name) {
  return rapidjson::StringRef(name.data(), static_cast<rapidjson::SizeType>(name.size()));
}

// The components of `document` (an object, "Invalid JSON" otherwise): its
// "profile" member when it has one, else the document itself.
inline const Value& Unwrap(const Value& document) {
  RAPIDJSON_ASSERT(document.IsObject());
  const auto profile = document.FindMember(Value(Ref(kProfile)));
  return profile != document.MemberEnd() ? profile->value : document;
}
inline Value& Unwrap(Value& document) {
  return const_cast<Value&>(Unwrap(static_cast<const Value&>(document)));
}

// "/component/group/key", the path of an item in reports and logs.
inline std::string ItemPath(std::string_view component, std::string_view group, std::string_view key) {
  std::string path;
  path.reserve(3 + component.size() + group.size() + key.size());
  path.append("/").append(component).append("/").append(group).append("/").append(key);
  return path;
}

// One item of a document: the names of its component, group and key, and
// its value. `V` is Value or const Value.
template <typename V>
struct Item {
  const Value& component;
  const Value& group;
  const Value& key;
  V& value;

  std::string Path() const {
    return ItemPath(std::string_view(component.GetString(), component.GetStringLength()),
                    std::string_view(group.GetString(), group.GetStringLength()),
                    std::string_view(key.GetString(), key.GetStringLength()));
  }
};

// A visitor of Walk that wants to know where it is: Walk calls
// EnterComponent(name, value) and EnterGroup(component, name, value) before
// the items below them (an empty component or group is entered too), and
// Item(const Item<V>&) for every item. Derive to inherit the levels' do-
// nothing defaults.
struct LevelVisitor {
  template <typename V>
  void EnterComponent(const Value& /*name*/, V& /*value*/) {}
  template <typename V>
  void EnterGroup(const Value& /*component*/, const Value& /*name*/, V& /*value*/) {}
};

namespace detail {

// "/component", "/component/group" or "/component/group/key": where a walk
// was when it failed.
HOXCM_API std::string LevelPath(const Value& component, const Value* group, const Value* key);

// A structural fault found below a component (its value, a group's, an
// item's, or one the visitor found in an item) leaves with the path of the
// deepest level reached; see LocateStructuralFault.
template <typename V, typename Visitor>
void WalkLevels(V& components, Visitor& visitor) {
  RAPIDJSON_ASSERT(components.IsObject());
  for (auto c = components.MemberBegin(); c != components.MemberEnd(); ++c) {
    const Value* group = nullptr;
    const Value* key = nullptr;
    try {
      RAPIDJSON_ASSERT(c->value.IsObject());
      visitor.EnterComponent(c->name, c->value);
      for (auto g = c->value.MemberBegin(); g != c->value.MemberEnd(); ++g) {
        group = &g->name;
        key = nullptr;
        RAPIDJSON_ASSERT(g->value.IsObject());
        visitor.EnterGroup(c->name, g->name, g->value);
        for (auto k = g->value.MemberBegin(); k != g->value.MemberEnd(); ++k) {
          key = &k->name;
          visitor.Item(Item<V>{c->name, g->name, k->name, k->value});
        }
      }
    } catch (HoxConfigStore::ConfigStoreException& error) {
      LocateStructuralFault(error, LevelPath(c->name, group, key));
      throw;
    }
  }
}

template <typename V, typename F>
struct ItemFunction : LevelVisitor {
  F& visit;
  explicit ItemFunction(F& f) : visit(f) {}
  void Item(const DocumentShape::Item<V>& item) { visit(item); }
};

}  // namespace detail

// Walks the items of `components` (an unwrapped document) in document
// order, component → group → key. The components and the groups must be
// objects (ConfigStoreException 2000 "Invalid JSON" otherwise, thrown on
// reaching the faulty level); an item may be any value.
template <typename Visitor>
void Walk(const Value& components, Visitor& visitor) {
  detail::WalkLevels<const Value>(components, visitor);
}
template <typename Visitor>
void Walk(Value& components, Visitor& visitor) {
  detail::WalkLevels<Value>(components, visitor);
}

// Walk with a function of the items alone: visit(const Item<V>&).
template <typename F>
void ForEachItem(const Value& components, F&& visit) {
  detail::ItemFunction<const Value, F> visitor(visit);
  Walk(components, visitor);
}
template <typename F>
void ForEachItem(Value& components, F&& visit) {
  detail::ItemFunction<Value, F> visitor(visit);
  Walk(components, visitor);
}

}  // namespace DocumentShape

}  // namespace HoxConfigManager
