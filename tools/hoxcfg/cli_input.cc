// Documents named on the command line: a file or "-" (standard input),
// read whole but bounded, parsed with the library's parser, faults located.
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <set>
#include <string_view>

#include <hoxcm/documents.h>
#include <hoxcm/errors.h>
#include <hoxcm/files.h>
#include <hoxcm/host_documents.h>

#include "hoxcfg/cli.h"

namespace hoxcfg {
namespace {

// A file through the file module (bounded, regular files only); standard
// input read here with the same bound.
std::string ReadArgument(const std::string& path) {
  if (path != "-") return HoxPlatform::ReadFile(path, HoxPlatform::FileKind::Document);
  std::string text;
  char buffer[65536];
  for (;;) {
    const ssize_t n = ::read(STDIN_FILENO, buffer, sizeof buffer);
    if (n < 0 && errno == EINTR) continue;  // a signal interrupted the read
    if (n < 0) throw Failure(std::strerror(errno), "", kExitUsage, InFile(path));
    if (n == 0) return text;
    const std::size_t limit = HoxPlatform::MaxFileSize(HoxPlatform::FileKind::Document);
    if (text.size() + static_cast<std::size_t>(n) > limit) {
      throw Failure("larger than " + std::to_string(limit >> 20) + " MiB",
                    "set HOX_MAX_DOCUMENT_MIB to read larger documents", kExitUsage, InFile(path));
    }
    text.append(buffer, static_cast<std::size_t>(n));
  }
}

const char* TypeName(const rapidjson::Value& value) {
  switch (value.GetType()) {
    case rapidjson::kNullType: return "null";
    case rapidjson::kFalseType:
    case rapidjson::kTrueType: return "a boolean";
    case rapidjson::kObjectType: return "an object";
    case rapidjson::kArrayType: return "an array";
    case rapidjson::kStringType: return "a string";
    default: return "a number";
  }
}

}  // namespace

std::string ReadTextArgument(const std::string& path) { return ReadArgument(path); }

rapidjson::Document ReadJsonArgument(const std::string& path) {
  const std::string text = ReadArgument(path);
  rapidjson::Document doc;
  try {
    HoxConfigManager::ParseDocument(text, doc);
  } catch (HoxConfigStore::ConfigStoreException& e) {
    AttachDocumentFile(e, path);  // the parser knows the position, the name of the file is ours
    throw;
  }
  return doc;
}

void AttachDocumentFile(HoxConfigStore::ConfigStoreException& error, const std::string& path) {
  HostCtl::Lib::ErrorLocation location = error.GetLocation() ? *error.GetLocation() : HostCtl::Lib::ErrorLocation{};
  if (!location.file.empty()) return;  // a fault in another file (a manifest, a schema)
  location.file = path;
  error.SetLocation(std::move(location));
}

bool LooksLikeJsonSchema(const rapidjson::Value& value) {
  static const std::set<std::string_view> kKeywords = {
      "$schema", "$id", "$ref", "definitions", "type", "properties", "patternProperties",
      "additionalProperties", "required", "items", "additionalItems", "enum", "allOf", "anyOf", "oneOf", "not",
      "minimum", "maximum", "exclusiveMinimum", "exclusiveMaximum", "minLength", "maxLength", "pattern", "format",
      "minItems", "maxItems", "uniqueItems", "minProperties", "maxProperties", "dependencies", "multipleOf",
      "title", "description", "default", "unionTag", "sensitive"};
  if (!value.IsObject() || value.ObjectEmpty()) return false;
  if (value.HasMember("$schema")) return true;
  const auto type = value.FindMember("type");
  if (type != value.MemberEnd() && (type->value.IsString() || type->value.IsArray())) return true;
  for (const auto& member : value.GetObject()) {
    if (kKeywords.count(std::string_view(member.name.GetString(), member.name.GetStringLength())) == 0) return false;
  }
  return true;
}

rapidjson::Document ReadConfigurationDocument(const std::string& path) {
  rapidjson::Document doc = ReadJsonArgument(path);
  if (!doc.IsObject()) {
    throw Failure(std::string("a configuration document is a JSON object, this is ") + TypeName(doc),
                  "its members are components, or one member \"profile\" holding them", kExitUsage, InFile(path));
  }
  if (LooksLikeJsonSchema(doc)) {
    throw Failure("this is a JSON schema, not a configuration document",
                  "check a document against it with `hoxcfg schema-check SCHEMA DOCUMENT`", kExitUsage, InFile(path));
  }
  return doc;
}

const char* const kDocumentFileHelp = "Desired configuration document ('-': standard input)";

rapidjson::Document ReadDesiredDocument(const std::string& path) {
  rapidjson::Document file = ReadConfigurationDocument(path);
  rapidjson::Document doc;
  InDocument(path, [&] { HoxConfigManager::CreateMergedDocument(std::move(file), doc); });
  return doc;
}

}  // namespace hoxcfg
