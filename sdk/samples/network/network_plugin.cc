// The sample "network" plugin: owns DNS, vNICs, static routes and firewall
// rules. Apply writes <root>/etc/resolv.conf and one file per vNIC under
// <root>/etc/tarvik/network/; impact asks for maintenance mode when firewall
// rules are added or removed; validate requires IPv4 DNS servers and vNICs
// attached to port groups that the document defines (the port groups come
// as references: the network:vswitch plugin owns them).
#include <arpa/inet.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <set>
#include <string>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/files.h>
#include <hoxcm/json.h>
#include <hoxcm/plugin_sdk.h>

namespace {

using HoxConfigManager::Document;
using HoxConfigManager::Value;

std::string HostFile(const std::string& root, const std::string& path) {
  return root == "/" ? path : root + path;
}

// Replaces a host file atomically and durably (the host reads it at boot).
void WriteHostFile(const std::string& path, const std::string& text) {
  HoxPlatform::CreateDirectories(std::filesystem::path(path).parent_path().string());
  HoxPlatform::WriteFileAtomically(path, text, 0644, HoxPlatform::Durability::kDurable);
}

const Value& Member(const Value& object, const char* name) {
  RAPIDJSON_ASSERT(object.IsObject() && object.HasMember(name));
  return object[name];
}

std::string Str(const Value& object, const char* name) {
  const Value& v = Member(object, name);
  RAPIDJSON_ASSERT(v.IsString());
  return v.GetString();
}

// A request element's configuration: a JSON text for apply and impact, a
// JSON value for validation.
Document ConfigOf(const Value& item) {
  Document doc;
  const Value& config = Member(item, "config");
  if (config.IsString()) {
    HoxConfigManager::ParseDocument(config.GetString(), doc);
  } else {
    doc.CopyFrom(config, doc.GetAllocator());
  }
  return doc;
}

char* Copy(const std::string& text) {
  char* out = static_cast<char*>(std::malloc(text.size() + 1));
  if (out != nullptr) std::memcpy(out, text.c_str(), text.size() + 1);
  return out;
}

std::string ErrorResult(const char* id, const std::string& message) {
  Document doc(rapidjson::kObjectType);
  auto& a = doc.GetAllocator();
  doc.AddMember("id", Value(id, a), a);
  doc.AddMember("args", Value(rapidjson::kArrayType), a);
  doc.AddMember("message", Value(message, a), a);
  return HoxConfigManager::JsonToString(doc);
}

void WriteResolvConf(const std::string& root, const Value& config) {
  std::string text = "# written by the network plugin\n";
  if (config.IsObject() && config.HasMember("search") && config["search"].IsArray() && !config["search"].Empty()) {
    text += "search";
    for (const Value& s : config["search"].GetArray()) text += std::string(" ") + s.GetString();
    text += "\n";
  }
  if (config.IsObject() && config.HasMember("servers") && config["servers"].IsArray()) {
    for (const Value& s : config["servers"].GetArray()) text += std::string("nameserver ") + s.GetString() + "\n";
  }
  WriteHostFile(HostFile(root, "/etc/resolv.conf"), text);
}

char* Apply(const char* requestText, const char* root) {
  try {
    Document request;
    HoxConfigManager::ParseDocument(requestText, request);
    for (const Value& item : Member(request, "data").GetArray()) {
      const std::string key = Str(item, "key");
      const std::string operation = Str(item, "operation");
      const Document config = ConfigOf(item);
      if (key == "config") {
        if (operation == "DELETE") {
          std::filesystem::remove(HostFile(root, "/etc/resolv.conf"));
        } else {
          WriteResolvConf(root, config);
        }
      } else if (key == "vnic") {
        const std::string file = HostFile(root, "/etc/tarvik/network/vnic-" + Str(item, "instanceId") + ".json");
        if (operation == "DELETE") {
          std::filesystem::remove(file);
        } else {
          WriteHostFile(file, HoxConfigManager::JsonToString(config) + "\n");
        }
      }
      // Routes and firewall rules live in the configuration store only.
    }
    return Copy(ErrorResult("", ""));
  } catch (const std::exception& e) {
    return Copy(ErrorResult("com.tarvik.hox.settings.network.apply.failed", e.what()));
  }
}

char* Impact(const char* requestText, const char*) {
  try {
    Document request;
    HoxConfigManager::ParseDocument(requestText, request);
    Document result(rapidjson::kObjectType);
    auto& a = result.GetAllocator();
    Value impacts(rapidjson::kArrayType);
    for (const Value& item : Member(request, "data").GetArray()) {
      const std::string key = Str(item, "key");
      const std::string operation = Str(item, "operation");
      const bool maintenance = key == "rules" && (operation == "ADD" || operation == "DELETE");
      Value verdict(rapidjson::kObjectType);
      verdict.AddMember("impact", maintenance ? 1 : 0, a);
      verdict.AddMember("component", Value(Str(item, "component"), a), a);
      verdict.AddMember("group", Value(Str(item, "group"), a), a);
      verdict.AddMember("key", Value(key, a), a);
      verdict.AddMember("reason", Value(maintenance ? "firewall rules change" : "", a), a);
      impacts.PushBack(verdict, a);
    }
    result.AddMember("impacts", impacts, a);
    return Copy(HoxConfigManager::JsonToString(result));
  } catch (const std::exception& e) {
    return Copy("{\"error\":" + ErrorResult("com.tarvik.hox.settings.network.impact.failed", e.what()) + "}");
  }
}

// One finding of a validation result: `field` and one error.
void AddFinding(Value& findings, const std::string& field, const char* id, const std::vector<std::string>& args,
                const std::string& message, Document::AllocatorType& a) {
  Value error(rapidjson::kObjectType);
  error.AddMember("id", Value(id, a), a);
  Value list(rapidjson::kArrayType);
  for (const std::string& arg : args) list.PushBack(Value(arg, a), a);
  error.AddMember("args", list, a);
  error.AddMember("message", Value(message, a), a);
  Value errors(rapidjson::kArrayType);
  errors.PushBack(error, a);
  Value finding(rapidjson::kObjectType);
  finding.AddMember("field", Value(field, a), a);
  finding.AddMember("errors", errors, a);
  findings.PushBack(finding, a);
}

std::string Text(const Value& v) { return v.IsString() ? v.GetString() : HoxConfigManager::JsonToString(v); }

// The port groups the document defines: the plugin's references.
std::set<std::string> PortGroups(const Value& request) {
  std::set<std::string> names;
  if (!request.HasMember("references")) return names;
  for (const Value& ref : Member(request, "references").GetArray()) {
    if (Str(ref, "group") != "vswitch" || Str(ref, "key") != "portgroups") continue;
    const Document config = ConfigOf(ref);
    if (config.IsObject() && config.HasMember("name") && config["name"].IsString()) {
      names.insert(config["name"].GetString());
    }
  }
  return names;
}

char* Validate(const char* requestText, const char*) {
  try {
    Document request;
    HoxConfigManager::ParseDocument(requestText, request);
    Document result(rapidjson::kObjectType);
    auto& a = result.GetAllocator();
    Value findings(rapidjson::kArrayType);
    const std::set<std::string> portGroups = PortGroups(request);
    int vnicIndex = 0;
    for (const Value& item : Member(request, "data").GetArray()) {
      const Document config = ConfigOf(item);
      if (Str(item, "group") == "interfaces" && Str(item, "key") == "vnic") {
        // A vNIC attaches to a port group by name: the port group must exist.
        const int index = vnicIndex++;
        if (!config.IsObject() || !config.HasMember("portgroup") || !config["portgroup"].IsString()) continue;
        const std::string portGroup = config["portgroup"].GetString();
        if (portGroups.count(portGroup) != 0) continue;
        const std::string vnic = config.HasMember("name") ? Text(config["name"]) : "#" + std::to_string(index);
        AddFinding(findings, "/network/interfaces/vnic/" + std::to_string(index) + "/portgroup",
                   "com.tarvik.hox.settings.network.vnic.unknown-portgroup", {vnic, portGroup},
                   "vNIC " + vnic + " attaches to port group \"" + portGroup + "\", which the document does not define",
                   a);
        continue;
      }
      if (Str(item, "group") != "dns" || Str(item, "key") != "config") continue;
      if (!config.IsObject() || !config.HasMember("servers") || !config["servers"].IsArray()) continue;
      int index = 0;
      for (const Value& server : config["servers"].GetArray()) {
        in_addr address;
        const bool ok = server.IsString() && ::inet_pton(AF_INET, server.GetString(), &address) == 1;
        if (!ok) {
          const std::string text = Text(server);
          AddFinding(findings, "/network/dns/config/servers/" + std::to_string(index),
                     "com.tarvik.hox.settings.network.dns.invalid-server", {text}, "not an IPv4 address: " + text, a);
        }
        ++index;
      }
    }
    result.AddMember("errors", findings, a);
    return Copy(HoxConfigManager::JsonToString(result));
  } catch (const std::exception& e) {
    return Copy("{\"error\":" + ErrorResult("com.tarvik.hox.settings.network.validation.failed", e.what()) + "}");
  }
}

void FreeResult(char* result) { std::free(result); }

const hoxcm_plugin_table kTable = {HOXCM_PLUGIN_ABI_VERSION, "network", Apply, Impact, Validate, FreeResult};

}  // namespace

extern "C" const hoxcm_plugin_table* hoxcm_plugin_describe(void) { return &kTable; }
