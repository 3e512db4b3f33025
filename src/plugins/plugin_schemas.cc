// Checking manifests against the manifest schema of their version, and the
// fixed paths of the framework.
#include <algorithm>
#include <map>
#include <mutex>
#include <set>

#include <hoxcm/documents.h>
#include <hoxcm/files.h>
#include <hoxcm/host.h>
#include <hoxcm/plugins.h>
#include <hoxcm/schema_store.h>

#include "foundation/json_parse.h"

namespace HoxConfigManager {
namespace {

std::string Quoted(std::string_view s) { return "\"" + std::string(s) + "\""; }

// The file's text; false when it cannot be read (the reason is logged: the
// texts of the manifest checks name the file only).
bool ReadFile(const std::string& path, HoxPlatform::FileKind kind, std::string& text) {
  try {
    text = HoxPlatform::ReadFile(path, kind);
    return true;
  } catch (const HoxPlatform::FileError& e) {
    CSLogger::Log(CSLogger::kError, "%s", e.what());
    return false;
  }
}

// A schema set (or the reason it could not be built) for one directory.
struct SchemaSet {
  std::unordered_map<long, Document> schemas;
  std::string error;
};

// The schema sets of this process, one per schema directory: each is built
// once and kept until the process ends. The directory is the key because
// the root may differ between callers of one process (tests, tools).
const SchemaSet& SchemaSetFor(const std::string& directory) {
  static std::mutex mutex;
  static std::map<std::string, std::unique_ptr<SchemaSet>> sets;
  std::lock_guard<std::mutex> lock(mutex);
  auto& slot = sets[directory];
  if (!slot) {
    slot = std::make_unique<SchemaSet>();
    slot->schemas = CreatePluginSchemas(directory, slot->error);
  }
  return *slot;
}

const std::set<int>& NoIgnoredErrors() {
  static const std::set<int> none;
  return none;
}

}  // namespace

std::string PluginDirectory() { return HoxPlatform::HostPath(HoxPlatform::HostPaths::kManifestDirectory) + "/"; }
std::string PluginSchemaDirectory() {
  return HoxPlatform::HostPath(HoxPlatform::HostPaths::kManifestSchemaDirectory) + "/";
}
std::string PluginRequestPath() { return HoxPlatform::HostPath(HoxPlatform::HostPaths::kRequestFile); }
std::string PluginResultPath() { return HoxPlatform::HostPath(HoxPlatform::HostPaths::kResultFile); }

long CreatePluginSchemaFromFile(const std::string& path, Document& schema, std::string& error) {
  std::string text;
  if (!ReadFile(path, HoxPlatform::FileKind::ManifestSchema, text)) {
    // The text is fixed by the manifest check's contract: the path, no reason.
    error = "Failed to open the schema file " + Quoted(path);
    return 0;
  }
  if (!detail::ParseJson(text.data(), text.size(), schema)) {
    error = "Failed to parse the schema file " + Quoted(path);
    return 0;
  }
  if (!schema.IsObject()) {
    error = "The schema " + path + " is not a JSON object";
    return 0;
  }
  const auto properties = schema.FindMember("properties");
  if (properties == schema.MemberEnd()) {
    error = "The schema " + path + " does not have a property called " + Quoted("properties");
    return 0;
  }
  if (!properties->value.IsObject()) {
    error = "The schema " + path + "'s property \"properties\" is not a JSON object";
    return 0;
  }
  const auto version = properties->value.FindMember("version");
  if (version == properties->value.MemberEnd()) {
    error = "The property " + Quoted("version") + " of the property " + Quoted("properties") +
            " from  the schema " + path + " does not exist";
    return 0;
  }
  long minimum = 0;
  for (const char* name : {"minimum", "maximum"}) {
    const auto member = version->value.IsObject() ? version->value.FindMember(name) : version->value.MemberEnd();
    if (!version->value.IsObject() || member == version->value.MemberEnd()) {
      error = "The property " + Quoted("version") + " of the property " + Quoted("properties") +
              " from the schema " + path + " does not have a property called " + Quoted(name);
      return 0;
    }
    const std::string opening = "The property " + Quoted(name) + " of the property " + Quoted("version") +
                                " of the property " + Quoted("properties") + " from the schema " + path;
    if (!member->value.IsInt64()) {
      error = opening + " has a value whose type is not Int64";
      return 0;
    }
    if (std::string_view(name) == "minimum") {
      minimum = static_cast<long>(member->value.GetInt64());
      if (minimum < 1 || minimum > 3) {
        error = opening + " has a value whose type is Int64, but the value is not 1, 2 or 3";
        return 0;
      }
    }
  }
  return minimum;
}

std::unordered_map<long, Document> CreatePluginSchemas(std::string_view directory, std::string& error) {
  std::unordered_map<long, Document> result;
  for (const char* name :
       {"plugin_version_1_schema.json", "plugin_version_2_schema.json", "plugin_version_3_schema.json"}) {
    Document schema;
    const long version = CreatePluginSchemaFromFile(std::string(directory) + name, schema, error);
    if (!error.empty()) return {};
    result[version] = std::move(schema);
  }
  return result;
}

void Plugin::validateFile(const char* path) const {
  const SchemaSet& set = SchemaSetFor(PluginSchemaDirectory());
  if (!set.error.empty()) throw ConfigManagerException(kPluginFailureCode, set.error.c_str());
  const auto schema = set.schemas.find(version);
  if (schema == set.schemas.end()) {
    const std::string text = "The version of the plugin defined in '" + std::string(path) + "' which is " +
                             std::to_string(version) +
                             " does not have a matching hardcoded schema to use for validation";
    throw ConfigManagerException(kPluginFailureCode, text.c_str());
  }
  Document result;
  JsonValidator::Validate(schema->second, manifest, result, NoIgnoredErrors(), "");
  if (!result.IsArray()) throw ConfigManagerException(kPluginFailureCode, "The validation result is not an array");
  if (!result.Empty()) {
    const std::string text = "Failed to validate the plugin defined in '" + std::string(path) + "' , version " +
                             std::to_string(version) + ", errors: " + JsonToString(result);
    throw ConfigManagerException(kPluginFailureCode, text.c_str());
  }
}

void AddValidationError(Document& report, std::string_view file, Value& errors) {
  if (!report.IsArray()) report.SetArray();
  Allocator& a = report.GetAllocator();
  Value entry(rapidjson::kObjectType);
  entry.AddMember("file", Value(file.data(), static_cast<rapidjson::SizeType>(file.size()), a), a);
  entry.AddMember("validation_errors", Value(errors, a), a);
  report.PushBack(entry, a);
}

void ValidateAllPlugins(std::string_view pluginDirectory, std::string_view schemaDirectory, Document& report) {
  report.SetArray();
  Allocator& a = report.GetAllocator();
  auto record = [&](const std::string& file, const std::string& message) {
    Value errors(rapidjson::kArrayType);
    errors.PushBack(Value(message, a), a);
    AddValidationError(report, file, errors);
  };
  std::string schemaError;
  std::string directory(schemaDirectory);
  if (!directory.empty() && directory.back() != '/') directory += '/';
  const auto schemas = CreatePluginSchemas(directory, schemaError);

  HoxPlatform::ListOptions options;
  options.suffix = ".json";
  const HoxPlatform::DirectoryListing listing = HoxPlatform::ListFiles(std::string(pluginDirectory), options);
  for (const auto& problem : listing.problems) {
    record(problem.path, "Failed to read the plugin directory: " + problem.reason);
  }

  for (const std::string& file : listing.files) {
    std::string text;
    if (!ReadFile(file, HoxPlatform::FileKind::Manifest, text)) {
      record(file, "Failed to open the plugin file " + Quoted(file));
      continue;
    }
    Document manifest;
    std::string reason;
    if (!detail::ParseJson(text.data(), text.size(), manifest, &reason)) {
      // The finding's text is fixed (the path only); the reason goes to the log.
      CSLogger::Log(CSLogger::kError, "Plugin manifest %s: %s", file.c_str(), reason.c_str());
      record(file, "Failed to parse the data from file " + Quoted(file));
      continue;
    }
    if (!schemaError.empty()) {
      record(file, schemaError);
      continue;
    }
    const long version = GetPluginVersion(manifest);
    const auto schema = schemas.find(version);
    if (schema == schemas.end()) {
      record(file, "The plugin version " + std::to_string(version) + " does not have a schema");
      continue;
    }
    Document result;
    JsonValidator::Validate(schema->second, manifest, result, NoIgnoredErrors(), "");
    if (!result.IsArray()) {
      record(file, "Validate did not return a JSON array");
    } else if (!result.Empty()) {
      AddValidationError(report, file, result);
    }
  }
}

}  // namespace HoxConfigManager
