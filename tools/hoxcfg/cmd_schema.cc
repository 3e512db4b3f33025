// hoxcfg schema-check and schemas: checking documents against JSON schemas
// and listing the installed key schemas.
#include <memory>
#include <string>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

#include "hoxcfg/cli.h"
#include "hoxcfg/commands.h"

namespace hoxcfg {
namespace {

// The validator's findings as the answer: exit 0 when there are none, 1
// when there are; a schema the validator cannot use is unusable input.
int Report(const GlobalOptions& options, std::shared_ptr<rapidjson::Document> findings, const std::string& document,
           const std::string& schema) {
  for (const auto& f : findings->GetArray()) {
    if (f["errId"].GetInt() == JsonValidator::VALIDATION_ERR_SCHEMA_INVALID) {
      throw Failure(f["error"].GetString(), "", kExitUsage, InFile(schema));
    }
  }
  return PrintFindings(options, std::move(findings), document);
}

void RegisterSchemaCheck(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "schema-check",
                         "Check DOCUMENT against the JSON schema SCHEMA, or with --host against the installed key "
                         "schemas",
                         {{kExitOk, "DOCUMENT is valid"},
                          {kExitNegative, "it is not: each finding is listed"},
                          {kExitUsage, kUsageStatus + std::string(" (also: an unusable schema)")}});
  auto files = std::make_shared<std::vector<std::string>>();
  auto host = std::make_shared<bool>(false);
  cmd->add_flag("--host", *host, "DOCUMENT is a configuration document: check it against the installed schemas");
  cmd->add_option("FILES", *files, "SCHEMA DOCUMENT, or DOCUMENT with --host ('-': standard input)")
      ->required()
      ->expected(1, 2)
      ->option_text("[SCHEMA] DOCUMENT");
  SetAction(cmd, options, Needs::kNothing, [&options, files, host] {
    if (files->size() != (*host ? 1u : 2u)) {
      throw Failure(*host ? "--host takes one DOCUMENT" : "expected SCHEMA DOCUMENT",
                    "see `hoxcfg schema-check --help`");
    }
    const std::string& documentPath = files->back();
    auto findings = std::make_shared<rapidjson::Document>();
    if (*host) {
      RequireHost();
      const rapidjson::Document document = ReadConfigurationDocument(documentPath);
      rapidjson::Document schema;
      if (!InDocument(documentPath, [&] { return HoxConfigManager::GenerateHostDocumentSchema(document, schema); })) {
        findings->Swap(schema);  // the keys without schema
        return Report(options, findings, documentPath, "");
      }
      const rapidjson::Value& root = HoxConfigManager::DocumentShape::Unwrap(document);
      JsonValidator::ValidateCMDocument(schema, root, *findings, {}, "");
      return Report(options, findings, documentPath, "");
    }
    const std::string& schemaPath = files->front();
    const rapidjson::Document schema = ReadJsonArgument(schemaPath);
    const rapidjson::Document document = ReadJsonArgument(documentPath);
    // A schema holds keywords; a configuration document holds components,
    // which the validator would ignore as unknown keywords and call valid.
    if (!schema.IsObject() || (!schema.ObjectEmpty() && !LooksLikeJsonSchema(schema))) {
      if (LooksLikeJsonSchema(document)) {
        throw Failure("the schema comes first: " + DisplayName(documentPath) + " is the schema", 
                      "run `hoxcfg schema-check SCHEMA DOCUMENT`");
      }
      throw Failure("this is not a JSON schema: it holds no schema keyword", "", kExitUsage, InFile(schemaPath));
    }
    JsonValidator::Validate(schema, document, *findings, {}, "");
    return Report(options, findings, documentPath, schemaPath);
  });
}

void RegisterSchemas(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "schemas", "List the installed key schemas and the schema files that failed to load",
                         {{kExitOk, "every schema file loaded"},
                          {kExitNegative, "some failed to load: they are listed"},
                          {kExitUsage, kUsageStatus}});
  auto check = std::make_shared<bool>(false);
  cmd->add_flag("--check", *check, "Only check every schema file: list the ones that fail to load");
  SetAction(cmd, options, Needs::kHost, [&options, check] {
    auto store = HoxSchemaStore::SchemaStore::GetStore();
    if (!store) {
      HoxConfigManager::ThrowException<HoxConfigManager::ConfigManagerException>(
          HoxConfigManager::SchemaStoreAccessFailed);
    }
    // Every file is read and checked here, as a lookup of its key would.
    const std::vector<std::string> errors = store->GetLoadErrors();
    if (*check) {
      const std::size_t loaded = store->ListKeys().size();
      Print(options, {[loaded, errors] {
                        std::string text = std::to_string(loaded) + " keys loaded, " +
                                           (errors.empty() ? "no" : std::to_string(errors.size())) +
                                           " schema files refused\n";
                        for (const std::string& e : errors) text += "  " + e + "\n";
                        return text;
                      },
                      [errors] {
                        rapidjson::Document list(rapidjson::kArrayType);
                        for (const std::string& e : errors) list.PushBack(rapidjson::Value(e, list.GetAllocator()), list.GetAllocator());
                        return CheckShape("errors", list);
                      }});
      return errors.empty() ? kExitOk : kExitNegative;
    }
    Print(options, {[store, errors] {
                      Table table({"ITEM", "INSTANCES", "IDENTITY"});
                      for (const auto& id : store->ListKeys()) {
                        const auto schema = store->Find(id.component, id.group, id.key);
                        const bool multi = schema && schema->IsMultiInstance();
                        table.Add({ItemName(id.component, id.group, id.key), multi ? "many" : "one",
                                   multi ? schema->GetIdentityMember() : "-"});
                      }
                      std::string text = table.Render();
                      if (!errors.empty()) text += "\nschema files that failed to load:\n";
                      for (const std::string& e : errors) text += "  " + e + "\n";
                      return text;
                    },
                    [store, errors] {
                      rapidjson::Document out(rapidjson::kObjectType);
                      auto& a = out.GetAllocator();
                      rapidjson::Value keys(rapidjson::kArrayType);
                      for (const auto& id : store->ListKeys()) {
                        const auto schema = store->Find(id.component, id.group, id.key);
                        rapidjson::Value key(rapidjson::kObjectType);
                        key.AddMember("item", rapidjson::Value(ItemName(id.component, id.group, id.key), a), a);
                        key.AddMember("multiInstance", schema && schema->IsMultiInstance(), a);
                        key.AddMember("identity", rapidjson::Value(schema ? schema->GetIdentityMember() : "", a), a);
                        keys.PushBack(key, a);
                      }
                      rapidjson::Value failed(rapidjson::kArrayType);
                      for (const std::string& e : errors) failed.PushBack(rapidjson::Value(e, a), a);
                      out.AddMember("keys", keys, a);
                      out.AddMember("errors", failed, a);
                      return out;
                    },
                    /*list=*/true});
    return errors.empty() ? kExitOk : kExitNegative;
  });
}

}  // namespace

void RegisterSchemaCommands(CLI::App& app, GlobalOptions& options) {
  RegisterSchemaCheck(app, options);
  RegisterSchemas(app, options);
}

}  // namespace hoxcfg
