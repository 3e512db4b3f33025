// Schema-aware comparison and hashing of configuration values: the one rule
// of equality, used by the configuration store's static helpers
// (ConfigStoreDocument::IsEqualValue, HashValue) and by the drift walk, which
// reports differences through the same member pass (Members) that equality
// uses. The names here are the module's interface to the walk.
//
// Two values are equal when they agree after "unset" members are dropped: a
// member is unset when it is absent, null, the empty string, an object whose
// members are all unset, or a scalar or array equal to its schema "default"
// (arrays compared as multisets). The store's
// generated identity "cs_generated_id" is never compared. Arrays compare as
// multisets: arrays of scalars by JSON type and value, arrays of objects
// element by element under this equality. Hash() agrees with Equal(): equal
// values under one schema hash alike. docs/drift.md has examples.
//
// A ValueComparer caches name indexes of wide schema nodes; it is not
// thread-safe and must not outlive the schema documents it has seen.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <optional>
#include <string_view>
#include <unordered_map>

#include <hoxcm/documents.h>
#include <hoxcm/json.h>

#include "foundation/pattern.h"

namespace HoxConfigManager::compare {

// Objects with more members than this are searched through a hash index.
constexpr rapidjson::SizeType kWideObject = 16;

inline std::string_view NameOf(const rapidjson::Value& name) {
  return std::string_view(name.GetString(), name.GetStringLength());
}
// Byte equality of two short strings (member names, most values) without a
// library call for the common lengths.
inline bool SameBytes(std::string_view a, std::string_view b) {
  const std::size_t n = a.size();
  if (n != b.size()) return false;
  if (n > 24) return std::memcmp(a.data(), b.data(), n) == 0;
  for (std::size_t i = 0; i < n; ++i) {
    if (a[i] != b[i]) return false;
  }
  return true;
}
inline bool IsGeneratedId(const rapidjson::Value& name) {
  return NameOf(name) == DocumentShape::kGeneratedId;
}

inline std::uint64_t Mix(std::uint64_t x) {
  x += 0x9e3779b97f4a7c15ULL;
  x = (x ^ (x >> 30)) * 0xbf58476d1ce4e5b9ULL;
  x = (x ^ (x >> 27)) * 0x94d049bb133111ebULL;
  return x ^ (x >> 31);
}

// A hash of bytes, eight at a time: names and identities are short, and the
// library's general-purpose string hash costs several times more on them.
inline std::uint64_t HashBytes(std::string_view s) {
  const char* p = s.data();
  std::size_t n = s.size();
  std::uint64_t h = n * 0x9e3779b97f4a7c15ULL;
  for (; n >= 8; p += 8, n -= 8) {
    std::uint64_t word;
    std::memcpy(&word, p, 8);
    h = (h ^ word) * 0xbf58476d1ce4e5b9ULL;
    h ^= h >> 29;
  }
  if (n > 0) {
    std::uint64_t word = 0;
    std::memcpy(&word, p, n);
    h = (h ^ word) * 0x94d049bb133111ebULL;
  }
  return Mix(h);
}
struct BytesHash {
  std::size_t operator()(std::string_view s) const { return HashBytes(s); }
};
struct SameBytesEqual {
  bool operator()(std::string_view a, std::string_view b) const { return SameBytes(a, b); }
};

// The first member of `object` named `name`, or null; FindMember without
// building a name value or calling memcmp for short names.
inline const rapidjson::Value* FindByName(const rapidjson::Value& object, std::string_view name) {
  for (auto it = object.MemberBegin(); it != object.MemberEnd(); ++it) {
    if (SameBytes(NameOf(it->name), name)) return &it->value;
  }
  return nullptr;
}

// Name → member lookup of one object, indexed when the object is wide. With
// duplicate names (malformed input) any one of them may be found. Narrow objects
// are searched from just after the previous hit, so that looking up the
// members of an object that lists them in the same order costs one
// comparison each.
class MemberIndex {
 public:
  explicit MemberIndex(const rapidjson::Value& object) : object_(object), count_(object.MemberCount()) {
    if (count_ > kWideObject) BuildIndex();
  }
  const rapidjson::Value* Find(std::string_view name) {
    // The member after the previous hit, tried first without a call.
    if (index_.empty() && next_ < count_) {
      const auto& member = object_.MemberBegin()[next_];
      if (SameBytes(NameOf(member.name), name)) {
        ++next_;
        return &member.value;
      }
    }
    return FindSlow(name);
  }

 private:
  void BuildIndex();
  const rapidjson::Value* FindSlow(std::string_view name);

  const rapidjson::Value& object_;
  const rapidjson::SizeType count_;
  rapidjson::SizeType next_ = 0;
  std::unordered_map<std::string_view, rapidjson::SizeType, BytesHash, SameBytesEqual> index_;
};

// The schema that a "patternProperties" entry of `schema` gives member
// `name`, or null. A sensitive entry wins over others, and a sensitive entry
// whose pattern cannot be compiled is taken to match, so that a secret is
// never shown for want of a usable pattern.
// `cache`, when given, keeps the compiled patterns, keyed by their text so
// that keys sharing a pattern look it up once (the keys view the schemas'
// names: the cache must not outlive them).
using PatternCache = std::unordered_map<std::string_view, std::shared_ptr<const HoxConfigManager::detail::SchemaPattern>>;
const rapidjson::Value* PatternPropertySchema(const rapidjson::Value& schema, std::string_view name,
                                              PatternCache* cache = nullptr);

// A schema to use for a value the schema does not describe: {"type": T} with
// T the value's JSON type ("array" schemas describe their first element).
const rapidjson::Value& SchemaForValue(const rapidjson::Value& value);
// The kind a schema node declares: its "type", or the first non-"null" entry
// of a type list; empty when it declares none.
std::string_view SchemaType(const rapidjson::Value& schema);

class ValueComparer {
 public:
  ValueComparer() = default;
  ValueComparer(const ValueComparer&) = delete;
  ValueComparer& operator=(const ValueComparer&) = delete;

  bool Equal(const rapidjson::Value& desired, const rapidjson::Value& host, const rapidjson::Value& schema);
  std::size_t Hash(const rapidjson::Value& value, const rapidjson::Value& schema);
  bool IsUnset(const rapidjson::Value& value, const rapidjson::Value& schema);

  // The schema of member `name` below `schema` ("properties", then
  // "additionalProperties"); SchemaForValue(value) when none describes it.
  const rapidjson::Value& Child(const rapidjson::Value& schema, std::string_view name,
                                const rapidjson::Value& value);

  // Child() for the members of one object, in turn.
  class Children {
   public:
    Children(ValueComparer& comparer, const rapidjson::Value& schema);
    const rapidjson::Value& Of(std::string_view name, const rapidjson::Value& value);

   private:
    const rapidjson::Value* extra_ = nullptr;
    const rapidjson::Value* patterns_ = nullptr;  // the schema, when it has "patternProperties"
    PatternCache* compiled_ = nullptr;
    std::optional<MemberIndex> narrow_;
    MemberIndex* wide_ = nullptr;
  };
  // The member pass of two objects, the one place that decides which members
  // of `d` (desired) and `h` (host) are compared, and under which schema:
  // - every member of `d`, in its order, that `h` lacks or holds with
  //   another value (equal scalars are passed over):
  //     onPair(name, desired value, host value or null, member schema);
  // - then, unless `h` has no member that `d` lacks, every member only `h`
  //   holds whose value is set, in host order:
  //     onHostOnly(name, host value, member schema).
  // "cs_generated_id" is passed over on both sides. A callback that returns
  // false ends the pass, which then returns false; otherwise true.
  template <typename OnPair, typename OnHostOnly>
  bool Members(const rapidjson::Value& d, const rapidjson::Value& h, const rapidjson::Value& schema,
               OnPair&& onPair, OnHostOnly&& onHostOnly);

  // The element schema of an array schema; SchemaForValue(element) otherwise.
  const rapidjson::Value& Items(const rapidjson::Value& schema, const rapidjson::Value& element);
  // True when arrays under `schema` hold objects (by schema, else by content).
  bool HoldsObjects(const rapidjson::Value& schema, const rapidjson::Value& a, const rapidjson::Value& b);

 private:
  bool Same(const rapidjson::Value& d, const rapidjson::Value& h, const rapidjson::Value& schema);
  bool EqualObjects(const rapidjson::Value& d, const rapidjson::Value& h, const rapidjson::Value& schema);
  bool EqualObjectArrays(const rapidjson::Value& d, const rapidjson::Value& h, const rapidjson::Value& schema);
  // What the comparison reads of one schema node.
  struct SchemaInfo {
    const rapidjson::Value* schema = nullptr;
    const rapidjson::Value* properties = nullptr;
    const rapidjson::Value* additional = nullptr;
    bool patterns = false;  // the node has "patternProperties"
    const rapidjson::Value* defaultValue = nullptr;
    MemberIndex* wide = nullptr;  // of "properties", when wide
  };
  // Valid until the next call.
  const SchemaInfo& Info(const rapidjson::Value& schema);

  // A direct-mapped cache: the nodes of the key being compared are asked for
  // again and again, and a miss costs only three member lookups.
  static constexpr std::size_t kInfoSlots = 256;
  SchemaInfo info_[kInfoSlots];
  // Name indexes of wide "properties", kept for the comparer's lifetime.
  std::unordered_map<const rapidjson::Value*, std::unique_ptr<MemberIndex>> wideIndexes_;
  PatternCache patterns_;
};

// Equality of two scalars: numbers by value, anything else by JSON type and
// value.
inline bool SameScalar(const rapidjson::Value& a, const rapidjson::Value& b) {
  if (a.IsString()) return b.IsString() && SameBytes(NameOf(a), NameOf(b));
  if (a.IsNumber() && b.IsNumber()) {
    if (a.IsInt() && b.IsInt()) return a.GetInt() == b.GetInt();
    return a == b;
  }
  return a.GetType() == b.GetType() && a == b;
}
inline bool IsContainer(const rapidjson::Value& v) { return v.IsObject() || v.IsArray(); }

// Order-insensitive equality of two arrays of scalars: each element of `b`
// matches at most one element of `a`, by JSON type, then value.
bool EqualPrimitiveArrays(const rapidjson::Value& a, const rapidjson::Value& b);

template <typename OnPair, typename OnHostOnly>
bool ValueComparer::Members(const rapidjson::Value& d, const rapidjson::Value& h, const rapidjson::Value& schema,
                            OnPair&& onPair, OnHostOnly&& onHostOnly) {
  MemberIndex hostIndex(h);
  Children children(*this, schema);
  rapidjson::SizeType found = 0;
  for (auto it = d.MemberBegin(); it != d.MemberEnd(); ++it) {
    const std::string_view name = NameOf(it->name);
    const rapidjson::Value* hv = hostIndex.Find(name);
    // Counted even when not compared, so that equal members on both sides
    // spare the search for members only the host holds.
    if (IsGeneratedId(it->name)) {
      found += hv != nullptr;
      continue;
    }
    if (hv != nullptr) {
      ++found;
      // The common case, an unchanged scalar, needs no schema.
      if (!IsContainer(it->value) && !IsContainer(*hv) && SameScalar(it->value, *hv)) continue;
    }
    if (!onPair(name, it->value, hv, children.Of(name, it->value))) return false;
  }
  if (found == h.MemberCount()) return true;
  MemberIndex desiredIndex(d);
  Children hostChildren(*this, schema);
  for (auto it = h.MemberBegin(); it != h.MemberEnd(); ++it) {
    if (IsGeneratedId(it->name)) continue;
    const std::string_view name = NameOf(it->name);
    if (desiredIndex.Find(name) != nullptr) continue;
    const rapidjson::Value& memberSchema = hostChildren.Of(name, it->value);
    if (IsUnset(it->value, memberSchema)) continue;
    if (!onHostOnly(name, it->value, memberSchema)) return false;
  }
  return true;
}

}  // namespace HoxConfigManager::compare
