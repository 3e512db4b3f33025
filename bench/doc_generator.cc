#include "doc_generator.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <random>
#include <stdexcept>
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

class Filler {
 public:
  Filler(std::mt19937_64& rng, Alloc& alloc) : rng_(rng), alloc_(alloc) {}

  std::uint64_t Next() { return rng_(); }
  bool Chance(double p) { return p > 0 && static_cast<double>(rng_() % 1000000) < p * 1e6; }

  Value Make(const Value& schema, const std::string& name) {
    const std::string type = schema.HasMember("type") && schema["type"].IsString() ? schema["type"].GetString() : "";
    if (schema.HasMember("enum") && schema["enum"].IsArray() && !schema["enum"].Empty()) {
      return Value(schema["enum"][static_cast<SizeType>(rng_() % schema["enum"].Size())], alloc_);
    }
    if (type == "object") {
      Value out(rapidjson::kObjectType);
      if (schema.HasMember("properties")) {
        for (auto& m : schema["properties"].GetObject()) {
          out.AddMember(Value(m.name, alloc_), Make(m.value, m.name.GetString()), alloc_);
        }
      } else {
        for (int i = 0; i < 3; ++i) {
          out.AddMember(Value("Keyword" + std::to_string(rng_() % 100), alloc_), Word(), alloc_);
        }
      }
      return out;
    }
    if (type == "array") {
      Value out(rapidjson::kArrayType);
      const Value& items = schema["items"];
      for (int i = 0; i < 2; ++i) out.PushBack(Make(items, name), alloc_);
      return out;
    }
    if (type == "integer" || type == "number") return Value(static_cast<int>(rng_() % 9000 + 100));
    if (type == "boolean") return Value((rng_() & 1) != 0);
    return Word();
  }

  Value Word() { return Value("v" + std::to_string(rng_() % 100000000), alloc_); }

  // A different value of the same kind.
  Value Change(const Value& v) {
    if (v.IsBool()) return Value(!v.GetBool());
    if (v.IsNumber()) return Value(v.GetInt() + 1);
    if (v.IsArray()) {
      Value out(v, alloc_);
      out.PushBack(Word(), alloc_);
      return out;
    }
    return Value((std::string(v.IsString() ? v.GetString() : "") + "-changed"), alloc_);
  }

  // Changes about `rate` of the leaf properties of `v`, never `keep`.
  void Mutate(Value& v, double rate, const char* keep) {
    if (!v.IsObject()) return;
    for (auto& m : v.GetObject()) {
      if (keep != nullptr && m.name == keep) continue;
      if (m.name == "cs_generated_id") continue;
      if (m.value.IsObject()) {
        Mutate(m.value, rate, nullptr);
      } else if (Chance(rate)) {
        m.value = Change(m.value);
      }
    }
  }

 private:
  std::mt19937_64& rng_;
  Alloc& alloc_;
};

Value Instance(Filler& fill, const SampleKey& k, int index, const std::string& keyPath, Alloc& alloc) {
  Value inst = fill.Make(k.file["schema"], "");
  if (k.identity == "cs_generated_id") {
    inst.AddMember("cs_generated_id", Value(keyPath + "#" + std::to_string(index), alloc), alloc);
  } else if (!k.identity.empty()) {
    inst[k.identity.c_str()].SetString(keyPath + "-" + std::to_string(index), alloc);
  }
  return inst;
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
  for (int r = 0; r < o.replicas; ++r) {
    for (const SampleKey& k : keys) {
      const std::string component = ReplicaName(k.component, r);
      const std::string keyPath = component + "/" + k.group + "/" + k.key;
      Value hostItem = k.multi ? Value(rapidjson::kArrayType) : hostFill.Make(k.file["schema"], "");
      if (k.multi) {
        for (int i = 0; i < o.instances; ++i) hostItem.PushBack(Instance(hostFill, k, i, keyPath, ha), ha);
      }
      Value desiredItem(hostItem, da);
      const char* identity = k.identity.empty() ? nullptr : k.identity.c_str();
      if (k.multi) {
        Value kept(rapidjson::kArrayType);
        for (auto& inst : desiredItem.GetArray()) {
          if (desiredFill.Chance(o.instanceChurn)) continue;  // removed
          // Generated identities match by content: a changed one is replaced.
          desiredFill.Mutate(inst, o.changeRate, identity);
          kept.PushBack(inst, da);
        }
        for (int i = 0; i < o.instances; ++i) {
          if (desiredFill.Chance(o.instanceChurn)) {
            kept.PushBack(Instance(desiredFill, k, o.instances + i, keyPath, da), da);
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
        desiredFill.Mutate(desiredItem, o.changeRate, nullptr);
      }
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
