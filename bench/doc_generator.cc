#include "doc_generator.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <memory>
#include <random>
#include <stdexcept>
#include <string_view>
#include <unordered_set>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/host_documents.h>

namespace hoxcm_bench {

namespace fs = std::filesystem;
using rapidjson::Document;
using rapidjson::SizeType;
using rapidjson::Value;
using Alloc = rapidjson::MemoryPoolAllocator<>;

namespace {

const char* kSchemaDir = "/usr/lib/tarvik/configmanager/schemas";

std::string SampleSchemaDir() { return std::string(HOXCM_SOURCE_DIR) + "/data/sample-host/schemas"; }

struct SampleKey {
  std::string component, group, key;
  Document file;  // the schema file
  bool multi = false;
  bool defaults = false;
  std::string identity;
};

std::vector<SampleKey> LoadSampleKeys() {
  std::vector<SampleKey> keys;
  std::vector<fs::path> files;
  for (const auto& entry : fs::recursive_directory_iterator(SampleSchemaDir())) {
    if (entry.is_regular_file() && entry.path().extension() == ".json") files.push_back(entry.path());
  }
  std::sort(files.begin(), files.end());
  for (const fs::path& file : files) {
    SampleKey k;
    const fs::path rel = fs::relative(file, SampleSchemaDir());
    auto it = rel.begin();
    k.component = (it++)->string();
    k.group = (it++)->string();
    k.key = it->stem().string();
    HoxConfigManager::CreateDocumentFromFile(file.c_str(), k.file);
    k.multi = k.file.HasMember("multiInstance") && k.file["multiInstance"].GetBool();
    k.defaults = k.file.HasMember("defaultUserConfig") && k.file["defaultUserConfig"].GetBool();
    if (k.file.HasMember("identity")) k.identity = k.file["identity"].GetString();
    keys.push_back(std::move(k));
  }
  return keys;
}

std::string ReplicaName(const std::string& component, int replica) {
  return replica == 0 ? component : component + "_" + std::to_string(replica);
}

// Strings that match a regular expression, for the patterns schemas use:
// groups, alternatives, character classes, escapes and repetition.
// Unbounded or wide repetition is held to a few repeats, so that values stay
// the size of real ones.
class PatternSampler {
 public:
  explicit PatternSampler(std::string_view pattern) : p_(pattern) { root_ = Alternatives(); }

  std::string Sample(std::mt19937_64& rng) const {
    std::string out;
    Emit(root_, rng, out);
    return out;
  }

 private:
  struct Node;
  using Sequence = std::vector<Node>;
  struct Node {
    std::vector<Sequence> group;  // alternatives, for a group
    std::string chars;            // the characters it may be, for one character
    int min = 1, max = 1;
  };

  static constexpr int kMaxExtraRepeats = 8;

  std::vector<Sequence> Alternatives() {
    std::vector<Sequence> alternatives(1);
    while (pos_ < p_.size() && p_[pos_] != ')') {
      const char c = p_[pos_++];
      Node node;
      if (c == '|') {
        alternatives.emplace_back();
        continue;
      } else if (c == '^' || c == '$') {
        continue;
      } else if (c == '(') {
        if (p_.substr(pos_, 2) == "?:") pos_ += 2;
        node.group = Alternatives();
        ++pos_;  // ')'
      } else if (c == '[') {
        node.chars = Class();
      } else if (c == '\\') {
        node.chars = Escape(p_[pos_++]);
      } else if (c == '.') {
        node.chars = kWord;
      } else {
        node.chars.assign(1, c);
      }
      Quantifier(node);
      alternatives.back().push_back(std::move(node));
    }
    return alternatives;
  }

  void Quantifier(Node& node) {
    if (pos_ >= p_.size()) return;
    const char c = p_[pos_];
    if (c == '?' || c == '*' || c == '+') {
      ++pos_;
      node.min = c == '+' ? 1 : 0;
      node.max = c == '?' ? 1 : node.min + 3;
    } else if (c == '{') {
      const std::size_t close = p_.find('}', pos_);
      const std::string_view body = p_.substr(pos_ + 1, close - pos_ - 1);
      pos_ = close + 1;
      const std::size_t comma = body.find(',');
      node.min = std::stoi(std::string(body.substr(0, comma)));
      node.max = comma == std::string_view::npos ? node.min
                 : comma + 1 == body.size()     ? node.min + kMaxExtraRepeats
                                                : std::stoi(std::string(body.substr(comma + 1)));
    } else {
      return;
    }
    node.max = std::min(node.max, node.min + kMaxExtraRepeats);
    if (pos_ < p_.size() && p_[pos_] == '?') ++pos_;  // lazy: the same strings
  }

  std::string Class() {
    const bool negated = p_[pos_] == '^';
    if (negated) ++pos_;
    std::string set;
    for (bool first = true; pos_ < p_.size() && (p_[pos_] != ']' || first); first = false) {
      char c = p_[pos_++];
      if (c == '\\') {
        set += Escape(p_[pos_++]);
      } else if (pos_ + 1 < p_.size() && p_[pos_] == '-' && p_[pos_ + 1] != ']') {
        for (char to = p_[pos_ + 1]; c <= to; ++c) set += c;
        pos_ += 2;
      } else {
        set += c;
      }
    }
    ++pos_;  // ']'
    if (!negated) return set;
    std::string out;
    for (char c = '!'; c <= '~'; ++c) {
      if (set.find(c) == std::string::npos) out += c;
    }
    return out;
  }

  static std::string Escape(char c) {
    switch (c) {
      case 'd': return "0123456789";
      case 'w': return kWord + std::string("_");
      case 's': return " ";
      case 'D': case 'W': case 'S': return "-";
      default: return std::string(1, c);
    }
  }

  static void Emit(const std::vector<Sequence>& alternatives, std::mt19937_64& rng, std::string& out) {
    for (const Node& node : alternatives[rng() % alternatives.size()]) {
      const int count = node.min + static_cast<int>(rng() % static_cast<std::uint64_t>(node.max - node.min + 1));
      for (int i = 0; i < count; ++i) {
        if (node.group.empty()) {
          out += node.chars[rng() % node.chars.size()];
        } else {
          Emit(node.group, rng, out);
        }
      }
    }
  }

  static constexpr const char* kWord = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789";

  const std::string_view p_;
  std::size_t pos_ = 0;
  std::vector<Sequence> root_;
};

// Values that satisfy their schema: enumerations, bounds, lengths, patterns,
// formats, required and dependent members (every property is filled in).
class Filler {
 public:
  Filler(std::mt19937_64& rng, Alloc& alloc) : rng_(rng), alloc_(alloc) {}

  std::uint64_t Next() { return rng_(); }
  bool Chance(double p) { return p > 0 && static_cast<double>(rng_() % 1000000) < p * 1e6; }

  Value Make(const Value& schema) {
    const std::string type = schema.HasMember("type") && schema["type"].IsString() ? schema["type"].GetString() : "";
    if (schema.HasMember("enum") && schema["enum"].IsArray() && !schema["enum"].Empty()) {
      return Value(schema["enum"][static_cast<SizeType>(rng_() % schema["enum"].Size())], alloc_);
    }
    if (type == "object") {
      Value out(rapidjson::kObjectType);
      if (schema.HasMember("properties")) {
        for (auto& m : schema["properties"].GetObject()) out.AddMember(Value(m.name, alloc_), Make(m.value), alloc_);
      }
      if (schema.HasMember("patternProperties")) {
        for (auto& m : schema["patternProperties"].GetObject()) {
          for (int i = 0; i < 3; ++i) {
            Value name(Sampler(m.name.GetString()).Sample(rng_), alloc_);
            if (!out.HasMember(name)) out.AddMember(name, Make(m.value), alloc_);
          }
        }
      }
      return out;
    }
    if (type == "array") {
      Value out(rapidjson::kArrayType);
      const auto max = schema.FindMember("maxItems");
      const int count = std::min(2, max == schema.MemberEnd() ? 2 : max->value.GetInt());
      const bool unique = schema.HasMember("uniqueItems") && schema["uniqueItems"].IsTrue();
      for (int i = 0; i < count; ++i) {
        Value item = Make(schema["items"]);
        for (int tries = 0; unique && tries < 10 && std::find(out.Begin(), out.End(), item) != out.End(); ++tries) {
          item = Make(schema["items"]);
        }
        out.PushBack(item, alloc_);
      }
      return out;
    }
    if (type == "integer" || type == "number") {
      const auto min = schema.FindMember("minimum");
      const auto max = schema.FindMember("maximum");
      const std::int64_t lo = min != schema.MemberEnd() ? min->value.GetInt64() : 100;
      const std::int64_t hi = max != schema.MemberEnd() ? max->value.GetInt64() : lo + 9000;
      return Value(static_cast<std::int64_t>(lo + static_cast<std::int64_t>(rng_() % (hi - lo + 1))));
    }
    if (type == "boolean") return Value((rng_() & 1) != 0);
    return Value(Text(schema), alloc_);
  }

  // A string of the schema's pattern, format and lengths.
  std::string Text(const Value& schema) {
    const auto min = schema.FindMember("minLength");
    const auto max = schema.FindMember("maxLength");
    const std::size_t shortest = min != schema.MemberEnd() ? min->value.GetUint() : 0;
    const std::size_t longest = max != schema.MemberEnd() ? max->value.GetUint() : SIZE_MAX;
    const auto pattern = schema.FindMember("pattern");
    const auto format = schema.FindMember("format");
    std::string out;
    if (pattern != schema.MemberEnd()) {
      const PatternSampler& sampler = Sampler(pattern->value.GetString());
      for (int tries = 0; tries < 100 && (tries == 0 || out.size() < shortest || out.size() > longest); ++tries) {
        out = sampler.Sample(rng_);
      }
      return out;
    }
    if (format != schema.MemberEnd()) {
      const std::string f = format->value.GetString();
      const std::string date = "2026-" + TwoDigits(rng_() % 12 + 1) + "-" + TwoDigits(rng_() % 28 + 1);
      const std::string time = TwoDigits(rng_() % 24) + ":" + TwoDigits(rng_() % 60) + ":00Z";
      if (f == "date") return date;
      if (f == "time") return time;
      if (f == "date-time") return date + "T" + time;
    }
    out = "v" + std::to_string(rng_() % 100000000);
    if (out.size() < shortest) out.append(shortest - out.size(), 'x');
    if (out.size() > longest) out.resize(longest);
    return out;
  }

  // A different value that the same schema allows, when there is one.
  Value Change(const Value& v, const Value& schema) {
    if (v.IsBool()) return Value(!v.GetBool());
    for (int tries = 0; tries < 10; ++tries) {
      Value out = Make(schema);
      if (out != v) return out;
    }
    return Value(v, alloc_);
  }

  // Changes about `rate` of the leaf properties of `v`, never `keep`.
  void Mutate(Value& v, const Value& schema, double rate, const char* keep) {
    if (!v.IsObject()) return;
    for (auto& m : v.GetObject()) {
      if (keep != nullptr && m.name == keep) continue;
      if (m.name == "cs_generated_id") continue;
      const Value* property = PropertySchema(schema, m.name);
      if (property == nullptr) continue;
      if (m.value.IsObject()) {
        Mutate(m.value, *property, rate, nullptr);
      } else if (Chance(rate)) {
        m.value = Change(m.value, *property);
      }
    }
  }

 private:
  static std::string TwoDigits(std::uint64_t n) { return (n < 10 ? "0" : "") + std::to_string(n); }

  // The schema of the member `name` of an object of `schema`.
  static const Value* PropertySchema(const Value& schema, const Value& name) {
    const auto properties = schema.FindMember("properties");
    if (properties != schema.MemberEnd() && properties->value.HasMember(name)) return &properties->value[name];
    const auto patterns = schema.FindMember("patternProperties");
    if (patterns != schema.MemberEnd() && patterns->value.MemberCount() > 0) {
      return &patterns->value.MemberBegin()->value;
    }
    return nullptr;
  }

  const PatternSampler& Sampler(const std::string& pattern) {
    auto it = samplers_.find(pattern);
    if (it == samplers_.end()) it = samplers_.emplace(pattern, std::make_unique<PatternSampler>(pattern)).first;
    return *it->second;
  }

  std::mt19937_64& rng_;
  Alloc& alloc_;
  // Keyed by the pattern, which each sampler's view refers to.
  std::map<std::string, std::unique_ptr<PatternSampler>> samplers_;
};

// An instance with an identity not yet used in its key: `used` holds those.
Value Instance(Filler& fill, const SampleKey& k, int index, const std::string& keyPath,
               std::unordered_set<std::string>& used, Alloc& alloc) {
  const Value& schema = k.file["schema"];
  Value inst = fill.Make(schema);
  if (k.identity == "cs_generated_id") {
    inst.AddMember("cs_generated_id", Value(keyPath + "#" + std::to_string(index), alloc), alloc);
  } else if (!k.identity.empty()) {
    const Value& property = schema["properties"][k.identity.c_str()];
    std::string identity = fill.Text(property);
    while (!used.insert(identity).second) identity = fill.Text(property);
    inst[k.identity.c_str()].SetString(identity, alloc);
  }
  return inst;
}

// Makes one property of `item` (an object, or the first instance of a
// list), not its identity, invalid: a value of a type no sample schema
// allows there.
void Break(Value& item, const std::string& identity, Alloc& alloc) {
  Value* object = item.IsArray() && !item.Empty() ? &item[0] : &item;
  if (!object->IsObject()) return;
  auto m = object->MemberBegin();
  while (m != object->MemberEnd() && (m->name == identity.c_str() || m->name == "cs_generated_id")) ++m;
  if (m == object->MemberEnd()) return;
  Value& victim = m->value;
  if (victim.IsObject() || victim.IsArray()) {
    victim.SetNull();
  } else {
    victim.SetObject();
    victim.AddMember("planted", true, alloc);
  }
}

Value& Slot(Document& doc, const std::string& c, const std::string& g) {
  Alloc& a = doc.GetAllocator();
  if (!doc.HasMember(c.c_str())) doc.AddMember(Value(c, a), Value(rapidjson::kObjectType), a);
  Value& comp = doc[c.c_str()];
  if (!comp.HasMember(g.c_str())) comp.AddMember(Value(g, a), Value(rapidjson::kObjectType), a);
  return comp[g.c_str()];
}

}  // namespace

void InstallReplicatedSchemas(int replicas) {
  const std::string dir = HoxPlatform::HostPath(kSchemaDir);
  for (const auto& entry : fs::recursive_directory_iterator(SampleSchemaDir())) {
    if (!entry.is_regular_file()) continue;
    const fs::path rel = fs::relative(entry.path(), SampleSchemaDir());
    auto it = rel.begin();
    const std::string component = (it++)->string();
    const fs::path rest = fs::relative(rel, component);
    for (int r = 0; r < replicas; ++r) {
      const fs::path dest = fs::path(dir) / ReplicaName(component, r) / rest;
      fs::create_directories(dest.parent_path());
      fs::copy_file(entry.path(), dest, fs::copy_options::overwrite_existing);
    }
  }
}

void GeneratePair(const GeneratorOptions& o, Document& host, Document& desired) {
  std::mt19937_64 rng(o.seed);
  host.SetObject();
  desired.SetObject();
  Alloc& ha = host.GetAllocator();
  Alloc& da = desired.GetAllocator();
  Filler hostFill(rng, ha), desiredFill(rng, da);
  const std::vector<SampleKey> keys = LoadSampleKeys();
  const std::size_t totalKeys = keys.size() * static_cast<std::size_t>(o.replicas);
  const std::size_t faultEvery = o.faults > 0 ? std::max<std::size_t>(1, totalKeys / o.faults) : 0;
  std::size_t keyIndex = 0;
  for (int r = 0; r < o.replicas; ++r) {
    for (const SampleKey& k : keys) {
      const std::string component = ReplicaName(k.component, r);
      const std::string keyPath = component + "/" + k.group + "/" + k.key;
      const Value& schema = k.file["schema"];
      std::unordered_set<std::string> identities;
      Value hostItem = k.multi ? Value(rapidjson::kArrayType) : hostFill.Make(schema);
      if (k.multi) {
        for (int i = 0; i < o.instances; ++i) {
          hostItem.PushBack(Instance(hostFill, k, i, keyPath, identities, ha), ha);
        }
      }
      Value desiredItem(hostItem, da);
      const char* identity = k.identity.empty() ? nullptr : k.identity.c_str();
      if (k.multi) {
        Value kept(rapidjson::kArrayType);
        for (auto& inst : desiredItem.GetArray()) {
          if (desiredFill.Chance(o.instanceChurn)) continue;  // removed
          // Generated identities match by content: a changed one is replaced.
          desiredFill.Mutate(inst, schema, o.changeRate, identity);
          kept.PushBack(inst, da);
        }
        for (int i = 0; i < o.instances; ++i) {
          if (desiredFill.Chance(o.instanceChurn)) {
            kept.PushBack(Instance(desiredFill, k, o.instances + i, keyPath, identities, da), da);
          }
        }
        desiredItem = kept;
        if (hostFill.Chance(o.shuffledKeys)) {
          std::vector<Value> items;
          for (auto& inst : hostItem.GetArray()) items.emplace_back(std::move(inst));
          std::shuffle(items.begin(), items.end(), rng);
          hostItem.Clear();
          for (Value& inst : items) hostItem.PushBack(inst, ha);
        }
      } else {
        desiredFill.Mutate(desiredItem, schema, o.changeRate, nullptr);
      }
      if (faultEvery > 0 && keyIndex % faultEvery == faultEvery / 2) Break(desiredItem, k.identity, da);
      ++keyIndex;
      const bool oneSided = desiredFill.Chance(o.oneSidedKeys);
      const bool hostOnly = oneSided && !k.defaults && (rng() & 1) != 0;
      // A host never lacks a key with a default configuration: one whose
      // default may not be deleted would make the host unreadable.
      const bool desiredOnly = oneSided && !k.defaults && !hostOnly;
      if (!desiredOnly) Slot(host, component, k.group).AddMember(Value(k.key, ha), hostItem, ha);
      if (!hostOnly) Slot(desired, component, k.group).AddMember(Value(k.key, da), desiredItem, da);
    }
  }
}

void GenerateWideKey(std::uint64_t seed, int count, bool shuffled, Document& host, Document& desired) {
  std::mt19937_64 rng(seed);
  host.SetObject();
  desired.SetObject();
  Alloc& ha = host.GetAllocator();
  Value instances(rapidjson::kArrayType);
  for (int i = 0; i < count; ++i) {
    Value inst(rapidjson::kObjectType);
    inst.AddMember("name", Value("mount-" + std::to_string(i), ha), ha);
    inst.AddMember("server", Value("nfs" + std::to_string(rng() % 100), ha), ha);
    inst.AddMember("export", Value("/export/" + std::to_string(i), ha), ha);
    inst.AddMember("readOnly", (rng() & 1) != 0, ha);
    instances.PushBack(inst, ha);
  }
  Value desiredInstances(instances, desired.GetAllocator());
  // One in a hundred desired instances changes, so both handlers do work.
  for (SizeType i = 0; i < desiredInstances.Size(); i += 100) {
    desiredInstances[i]["server"].SetString("changed", desired.GetAllocator());
  }
  if (shuffled) {
    std::vector<Value> items;
    for (auto& inst : instances.GetArray()) items.emplace_back(std::move(inst));
    std::shuffle(items.begin(), items.end(), rng);
    instances.Clear();
    for (Value& inst : items) instances.PushBack(inst, ha);
  }
  Slot(host, "storage", "nfs").AddMember("mounts", instances, ha);
  Slot(desired, "storage", "nfs").AddMember("mounts", desiredInstances, desired.GetAllocator());
}

}  // namespace hoxcm_bench
