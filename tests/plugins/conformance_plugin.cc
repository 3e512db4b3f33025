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

enum Kind { kApply, kImpact, kValidate };

char* Copy(const std::string& text) {
  char* out = static_cast<char*>(std::malloc(text.size() + 1));
  std::memcpy(out, text.c_str(), text.size() + 1);
  return out;
}

char* Run(Kind kind, const char* text, const char* root) {
  Document request;
  HoxConfigManager::ParseDocument(text, request);
  const auto& data = request["data"];
  std::string behaviour = "ok", impacts, errors;
  for (rapidjson::SizeType i = 0; i < data.Size(); ++i) {
    Document config;
    if (data[i]["config"].IsString()) {
      HoxConfigManager::ParseDocument(data[i]["config"].GetString(), config);
    } else {
      config.CopyFrom(data[i]["config"], config.GetAllocator());
    }
    if (i == 0 && config.IsObject() && config.HasMember("behaviour")) behaviour = config["behaviour"].GetString();
    const std::string c = data[i]["component"].GetString(), g = data[i]["group"].GetString(),
                      k = data[i]["key"].GetString();
    // The verdict is passed on as given, well-formed or not.
    const std::string impact = config.HasMember("impact") ? HoxConfigManager::JsonToString(config["impact"]) : "0";
    impacts += std::string(impacts.empty() ? "" : ",") + "{\"impact\":" + impact +
               ",\"component\":\"" + c + "\",\"group\":\"" + g + "\",\"key\":\"" + k + "\",\"reason\":\"r\"}";
    if (!config.HasMember("bad")) continue;
    errors += std::string(errors.empty() ? "" : ",") + "{\"field\":\"/" + c + "/" + g + "/" + k +
              "/bad\",\"errors\":[{\"id\":\"conformance.bad\",\"args\":[\"x\"],\"message\":\"bad\"}]}";
  }
  if (behaviour == "throw") throw std::runtime_error("thrown on purpose");
  if (behaviour == "garbage") return Copy("not json");
  if (kind == kValidate) return Copy("{\"errors\":[" + errors + "]}");
  if (kind == kImpact) {
    return Copy(behaviour == "fail" ? R"({"error":{"id":"conformance.failed","args":[],"message":"m"}})"
                                    : "{\"impacts\":[" + impacts + "]}");
  }
  if (behaviour == "fail") return Copy(R"({"id":"conformance.failed","args":["a1"],"message":"failed on purpose"})");
  std::ofstream(std::string(root) + "/applied") << data.Size() << "\n";
  return Copy(R"({"id":"","args":[],"message":""})");
}

char* Apply(const char* request, const char* root) { return Run(kApply, request, root); }
char* Impact(const char* request, const char* root) { return Run(kImpact, request, root); }
char* Validate(const char* request, const char* root) { return Run(kValidate, request, root); }
void Free(char* p) { std::free(p); }

const hoxcm_plugin_table kTable = {HOXCM_PLUGIN_ABI_VERSION, "conformance", Apply, Impact, Validate, Free};

}  // namespace

extern "C" const hoxcm_plugin_table* hoxcm_plugin_describe(void) { return &kTable; }
