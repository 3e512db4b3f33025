// hoxcfg schema-check and schemas: checking documents against JSON schemas
// and listing the installed key schemas.
#include <memory>
#include <string>

#include <hoxcm/documents.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

#include "hoxcfg/commands.h"
#include "hoxcfg/common.h"

namespace hoxcfg {
namespace {

// Findings of the validator: exit 0 when there are none, 1 when there are;
// a schema the validator cannot use is unusable input.
int Report(const rapidjson::Document& errors, const GlobalOptions& options) {
  for (const auto& e : errors.GetArray()) {
    if (e["errId"].GetInt() == JsonValidator::VALIDATION_ERR_SCHEMA_INVALID) {
      throw CommandError{JsonValidator::VALIDATION_ERR_SCHEMA_INVALID, e["error"].GetString()};
    }
  }
  WriteOutput(FormatJson(errors, options), "");
  return errors.Empty() ? kExitOk : kExitNegative;
}

void RegisterSchemaCheck(CLI::App& app, GlobalOptions& options) {
  auto* cmd = app.add_subcommand("schema-check",
                                 "Validate DOCUMENT against the JSON schema SCHEMA, or with --host against the "
                                 "installed key schemas; prints the errors as JSON")
                  ->fallthrough();
  auto files = std::make_shared<std::vector<std::string>>();
  auto host = std::make_shared<bool>(false);
  cmd->add_flag("--host", *host, "DOCUMENT is a host document: check it against the installed schemas");
  cmd->add_option("files", *files, "SCHEMA DOCUMENT, or DOCUMENT with --host")->required()->expected(1, 2);
  cmd->callback([&options, files, host] {
    Run(options, [&] {
      if (files->size() != (*host ? 1u : 2u)) {
        throw CommandError{kExitError, *host ? "--host takes one DOCUMENT" : "expected SCHEMA DOCUMENT"};
      }
      rapidjson::Document document;
      HoxConfigManager::CreateDocumentFromFile(files->back().c_str(), document);
      rapidjson::Document schema;
      rapidjson::Document errors;
      if (!*host) {
        HoxConfigManager::CreateDocumentFromFile(files->front().c_str(), schema);
        JsonValidator::Validate(schema, document, errors, {}, "");
        return Report(errors, options);
      }
      if (!document.IsObject()) throw CommandError{kExitError, "a host document must be a JSON object"};
      if (!HoxConfigManager::GenerateHostDocumentSchema(document, schema)) return Report(schema, options);
      const rapidjson::Value& root = HoxConfigManager::DocumentShape::Unwrap(document);
      JsonValidator::ValidateCMDocument(schema, root, errors, {}, "");
      return Report(errors, options);
    });
  });
}

void RegisterSchemas(CLI::App& app, GlobalOptions& options) {
  auto* cmd =
      app.add_subcommand("schemas", "List the installed key schemas and the files that failed to load")->fallthrough();
  cmd->callback([&options] {
    Run(options, [&] {
      auto store = HoxSchemaStore::SchemaStore::GetStore();
      if (!store) {
        HoxConfigManager::ThrowException<HoxConfigManager::ConfigManagerException>(
            HoxConfigManager::SchemaStoreAccessFailed);
      }
      rapidjson::Document out(rapidjson::kObjectType);
      auto& a = out.GetAllocator();
      rapidjson::Value keys(rapidjson::kArrayType);
      for (const auto& id : store->ListKeys()) keys.PushBack(rapidjson::Value(id.toString(), a), a);
      rapidjson::Value errors(rapidjson::kArrayType);
      for (const auto& e : store->GetLoadErrors()) errors.PushBack(rapidjson::Value(e, a), a);
      const bool clean = errors.Empty();
      out.AddMember("keys", keys, a);
      out.AddMember("errors", errors, a);
      WriteOutput(FormatJson(out, options), "");
      return clean ? kExitOk : kExitNegative;
    });
  });
}

}  // namespace

void RegisterSchemaCommands(CLI::App& app, GlobalOptions& options) {
  RegisterSchemaCheck(app, options);
  RegisterSchemas(app, options);
}

}  // namespace hoxcfg
