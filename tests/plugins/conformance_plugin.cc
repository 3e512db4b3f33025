// The C++ half of the runner conformance suite: behaves exactly like
// conformance_plugin.py. The first data element's "behaviour" member picks
// what to do: "ok" (default), "fail" (an error result), "throw", "garbage"
// (a result that is not JSON).
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <stdexcept>
#include <string>

#include <hoxcm/documents.h>
#include <hoxcm/json.h>
#include <hoxcm/plugin_sdk.h>

namespace {

using HoxConfigManager::Document;
using HoxConfigManager::Value;

char* Copy(const std::string& text) {
  char* out = static_cast<char*>(std::malloc(text.size() + 1));
  std::memcpy(out, text.c_str(), text.size() + 1);
  return out;
}

struct Item {
  std::string operation, component, group, key;
  Document config;
};

std::vector<Item> Items(const char* text, std::string* behaviour) {
  Document request;
  HoxConfigManager::ParseDocument(text, request);
  std::vector<Item> items;
  for (const Value& e : request["data"].GetArray()) {
    Item item;
    if (e.HasMember("operation")) item.operation = e["operation"].GetString();
    item.component = e["component"].GetString();
    item.group = e["group"].GetString();
    item.key = e["key"].GetString();
    if (e["config"].IsString()) {
      HoxConfigManager::ParseDocument(e["config"].GetString(), item.config);
    } else {
      item.config.CopyFrom(e["config"], item.config.GetAllocator());
    }
    items.push_back(std::move(item));
  }
  *behaviour = "ok";
  if (!items.empty() && items[0].config.IsObject() && items[0].config.HasMember("behaviour")) {
    *behaviour = items[0].config["behaviour"].GetString();
  }
  if (*behaviour == "throw") throw std::runtime_error("thrown on purpose");
  return items;
}

char* Apply(const char* request, const char* root) {
  std::string behaviour;
  const auto items = Items(request, &behaviour);
  if (behaviour == "garbage") return Copy("not json");
  if (behaviour == "fail") return Copy(R"({"id":"conformance.failed","args":["a1"],"message":"failed on purpose"})");
  std::ofstream(std::string(root) + "/applied") << items.size() << "\n";
  return Copy(R"({"id":"","args":[],"message":""})");
}

char* Impact(const char* request, const char*) {
  std::string behaviour;
  const auto items = Items(request, &behaviour);
  if (behaviour == "garbage") return Copy("not json");
  if (behaviour == "fail") return Copy(R"({"error":{"id":"conformance.failed","args":[],"message":"m"}})");
  std::string out = "{\"impacts\":[";
  for (std::size_t i = 0; i < items.size(); ++i) {
    const int impact = items[i].config.HasMember("impact") ? items[i].config["impact"].GetInt() : 0;
    out += (i ? "," : "") + std::string("{\"impact\":") + std::to_string(impact) + ",\"component\":\"" +
           items[i].component + "\",\"group\":\"" + items[i].group + "\",\"key\":\"" + items[i].key +
           "\",\"reason\":\"r\"}";
  }
  return Copy(out + "]}");
}

char* Validate(const char* request, const char*) {
  std::string behaviour;
  const auto items = Items(request, &behaviour);
  if (behaviour == "garbage") return Copy("not json");
  std::string out = "{\"errors\":[";
  bool first = true;
  for (const Item& item : items) {
    if (!item.config.HasMember("bad")) continue;
    out += (first ? "" : ",") + std::string("{\"field\":\"/") + item.component + "/" + item.group + "/" + item.key +
           "/bad\",\"errors\":[{\"id\":\"conformance.bad\",\"args\":[\"x\"],\"message\":\"bad\"}]}";
    first = false;
  }
  return Copy(out + "]}");
}

void Free(char* p) { std::free(p); }

const hoxcm_plugin_table kTable = {HOXCM_PLUGIN_ABI_VERSION, "conformance", Apply, Impact, Validate, Free};

}  // namespace

extern "C" const hoxcm_plugin_table* hoxcm_plugin_describe(void) { return &kTable; }
