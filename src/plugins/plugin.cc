// Plugin: identity and capabilities of one installed plugin, read from its
// manifest. Its runs (Apply, Impact, Validate) are in plugin_runner.cc.
#include <boost/algorithm/string.hpp>

#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/plugins.h>
#include <hoxcm/schema_store.h>

#include "platform/files/document_files.h"

namespace HoxConfigManager {
namespace {

// Member access of the query operations is strict: a missing member or one
// of the wrong type is the JSON error, never a default.
const Value& Member(const Value& object, const char* name) {
  RAPIDJSON_ASSERT(object.IsObject());
  const auto it = object.FindMember(name);
  RAPIDJSON_ASSERT(it != object.MemberEnd());
  return it->value;
}

bool BoolMember(const Value& object, const char* name) {
  const Value& v = Member(object, name);
  RAPIDJSON_ASSERT(v.IsBool());
  return v.GetBool();
}

std::string StringOf(const Value& v) {
  RAPIDJSON_ASSERT(v.IsString());
  return std::string(v.GetString(), v.GetStringLength());
}

// "supports" under an optional section: absence means false.
bool Supports(const Value& manifest, const char* section) {
  RAPIDJSON_ASSERT(manifest.IsObject());
  const auto it = manifest.FindMember(section);
  if (it == manifest.MemberEnd()) return false;
  return BoolMember(it->value, "supports");
}

HoxConfigStore::ConfigStoreObjectId IdFromTriple(const std::string& text) {
  std::vector<std::string> parts;
  boost::algorithm::split(parts, text, boost::algorithm::is_any_of(":"));
  // The manifest schema guarantees three parts; a shorter text still must
  // not read past the end.
  parts.resize(std::max<std::size_t>(parts.size(), 3));
  return HoxConfigStore::ConfigStoreObjectId(parts[0], parts[1], parts[2]);
}

}  // namespace

long GetPluginVersion(const Value& manifest) {
  if (!manifest.IsObject()) return 1;
  const auto it = manifest.FindMember("version");
  if (it == manifest.MemberEnd() || !it->value.IsInt64()) return 1;
  return static_cast<long>(it->value.GetInt64());
}

Plugin::Plugin(const char* path) {
  if (path == nullptr) {
    throw ConfigManagerException(kPluginFailureCode, "Cannot create Plugin from NULL filename");
  }
  path_ = path;
  CSLogger::Log(CSLogger::kInfo, "Processing file %s", path);
  HoxPlatform::detail::ReadDocumentFile(path, HoxPlatform::FileKind::Manifest, manifest);
  version = GetPluginVersion(manifest);
  validateFile(path);

  // Identity comes from the path as it stands on the host, below the root.
  const std::string hostPath = HoxPlatform::StripHostRoot(path);
  std::vector<std::string> tokens;
  boost::algorithm::split(tokens, hostPath, boost::algorithm::is_any_of("/"));
  type = StringOf(Member(manifest, "type"));

  std::vector<std::string> names;  // directories that name the plugin
  if (version >= 0 && version <= 2) {
    if (tokens.size() != 10 && tokens.size() != 11) {
      CSLogger::Log(CSLogger::kError, "Invalid filepath %s for this version %ld", path, version);
      ThrowException<ConfigManagerException>(PluginSchemaInvalid, path);
    }
    names.assign(tokens.begin() + 6, tokens.end() - 1);
    csoIds.emplace_back(tokens[6], tokens[7], tokens[8]);
  } else if (version == 3) {
    if (tokens.size() != 8 && tokens.size() != 9) {
      CSLogger::Log(CSLogger::kError, "Invalid filepath %s for this version %ld", path, version);
      ThrowException<ConfigManagerException>(PluginSchemaInvalid, path);
    }
    names.assign(tokens.begin() + 6, tokens.end() - 1);
  } else {
    CSLogger::Log(CSLogger::kError, "Invalid version found in: %s", path);
    ThrowException<ConfigManagerException>(PluginVersionNotSupported, path);
  }
  id = boost::algorithm::join(names, ":");
  if (type == "c++") module = "lib" + boost::algorithm::join(names, "_") + ".so";

  if (version == 3) {
    const Value& accepts = Member(manifest, "accepts");
    RAPIDJSON_ASSERT(accepts.IsArray());
    for (const Value& a : accepts.GetArray()) csoIds.push_back(IdFromTriple(StringOf(a)));
  }

  // A plugin that owns objects is not loaded without the schema store, nor
  // when its first object has no schema (the lookup throws); nothing keeps
  // the lookup's text.
  if (!csoIds.empty()) {
    const auto store = HoxSchemaStore::SchemaStore::GetStore();
    if (!store) ThrowException<ConfigManagerException>(SchemaStoreAccessFailed);
    const auto& first = csoIds.front();
    (void)store->GetSchemaInfo(first.component, first.group, first.key);
  }
}

bool Plugin::CheckType(PluginType t) const {
  switch (t) {
    case APPLY: return HasApplySupport();
    case APPLY_BOOT: return HasApplyBootSupport();
    case IMPACT: return HasImpactSupport();
    case VALIDATE: return HasValidateSupport();
  }
  return true;
}

bool Plugin::HasApplySupport() const {
  if (version == 2 || version == 3) {
    RAPIDJSON_ASSERT(manifest.IsObject());
    return manifest.HasMember("apply");
  }
  return true;
}

bool Plugin::HasApplyBootSupport() const {
  if (version == 0 || version == 1) return BoolMember(manifest, "boot");
  // A plugin that does not apply does not apply at boot either; without
  // this, one validation-only plugin would fail every boot-time registry.
  if (version == 2 || version == 3) return HasApplySupport() && BoolMember(Member(manifest, "apply"), "boot");
  return false;
}

bool Plugin::HasImpactSupport() const {
  return (version == 2 || version == 3) && Supports(manifest, "impact");
}

bool Plugin::HasValidateSupport() const {
  return (version == 2 || version == 3) && Supports(manifest, "validation");
}

std::string Plugin::GetApplyGroup() const {
  CSLogger::Log(CSLogger::kDetail, "Processing apply_group in version=%ld, module=%s,", version, module.c_str());
  if (version == 0 || version == 1) return StringOf(Member(manifest, "apply_group"));
  if (version == 2 || version == 3) return StringOf(Member(Member(manifest, "apply"), "apply_group"));
  return {};
}

std::vector<PluginApplyOperation> Plugin::GetOperations() const {
  CSLogger::Log(CSLogger::kDetail, "Processing apply_operations in version=%ld, module=%s,", version,
                module.c_str());
  const Value* section = nullptr;
  if (version == 0 || version == 1) {
    section = &manifest;
  } else if (version == 2 || version == 3) {
    section = &Member(manifest, "apply");
  } else {
    return {};
  }
  RAPIDJSON_ASSERT(section->IsObject());
  const auto it = section->FindMember("operations");
  if (it == section->MemberEnd()) return {};
  RAPIDJSON_ASSERT(it->value.IsObject());
  std::vector<PluginApplyOperation> result;
  for (const auto& m : it->value.GetObject()) {
    PluginApplyOperation op;
    op.operation = StringOf(m.name);
    op.provides = StringOf(Member(m.value, "provides"));
    const Value& depends = Member(m.value, "depends");
    RAPIDJSON_ASSERT(depends.IsArray());
    for (const Value& d : depends.GetArray()) op.depends.push_back(StringOf(d));
    result.push_back(std::move(op));
  }
  return result;
}

void Plugin::GetRemediateOperation(PluginApplyOperation& op) const {
  if (version != 3) return;
  const Value& remediate = Member(Member(manifest, "apply"), "REMEDIATE");
  op.operation = "REMEDIATE";
  op.provides = StringOf(Member(remediate, "provides"));
  const Value& depends = Member(remediate, "depends");
  RAPIDJSON_ASSERT(depends.IsArray());
  for (const Value& d : depends.GetArray()) op.depends.push_back(StringOf(d));
}

std::vector<HoxConfigStore::ConfigStoreObjectId> Plugin::GetReferences() const {
  if (!HasValidateSupport()) return {};
  const Value& validation = Member(manifest, "validation");
  const auto it = validation.FindMember("references");
  if (it == validation.MemberEnd() || !it->value.IsArray()) return {};
  std::vector<HoxConfigStore::ConfigStoreObjectId> result;
  for (const Value& r : it->value.GetArray()) result.push_back(IdFromTriple(StringOf(r)));
  return result;
}

}  // namespace HoxConfigManager
