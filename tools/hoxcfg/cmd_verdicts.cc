// hoxcfg validate and impact: the read-only verdicts on a desired document,
// whether it is valid and what applying it would cost, and why.
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/operations.h>
#include <hoxcm/schema_store.h>

#include "hoxcfg/cli.h"
#include "hoxcfg/commands.h"

namespace hoxcfg {
namespace {

using HoxConfigManager::ErrorInfo;

// A run that could not be completed: exit 130 when Ctrl-C asked for it,
// else a failure (exit 2) naming the plugin.
int Unfinished(const ErrorInfo& error, const char* what) {
  if (InterruptWatch::Interrupted()) {
    std::fprintf(stderr, "hoxcfg: %s aborted: nothing was changed\n", what);
    return kExitAborted;
  }
  const std::string plugin = error.args.empty() ? "" : " " + error.args.front();
  throw Failure(std::string(what) + " plugin" + plugin + " failed: " + (error.message.empty() ? error.id : error.message),
                "run again with -v to see the library's log");
}

// ---- validate ------------------------------------------------------------

// The schema of every key of `document` that has one: keys without schema
// are left to the validator, which reports each as unknown.
rapidjson::Document HostSchemaFor(const rapidjson::Document& document) {
  rapidjson::Document schema;
  if (HoxConfigManager::GenerateHostDocumentSchema(document, schema)) return schema;
  rapidjson::Document known;
  known.CopyFrom(document, known.GetAllocator());
  rapidjson::Value& root = HoxConfigManager::DocumentShape::Unwrap(known);
  for (const auto& unknown : schema.GetArray()) {
    const auto item = ParseItemName(unknown["field"].GetString());
    if (item) root[item->component.c_str()][item->group.c_str()].RemoveMember(item->key.c_str());
  }
  rapidjson::Document rest;
  HoxConfigManager::GenerateHostDocumentSchema(known, rest);
  return rest;
}

// What a finding says: the plugin's text, or the validator's sentence for
// a schema finding.
std::string Readable(const ErrorInfo& e) {
  if (!e.message.empty()) return e.message;
  const int code = JsonValidator::ConvertMsgIdToErrorCode(e.id);
  return code == JsonValidator::VALIDATION_ERR_GENERIC && e.id.rfind("com.tarvik.hox.settings.validation.", 0) != 0
             ? e.id
             : JsonValidator::DescribeFinding(code, e.args);
}

void RegisterValidate(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "validate",
                         "Validate a desired document: against the installed key schemas, then by the validation "
                         "plugins",
                         {{kExitOk, "FILE is valid"},
                          {kExitNegative, "it is not: each finding is listed"},
                          {kExitUsage, kUsageStatus + std::string(" (also: a validation plugin failed)")},
                          {kExitAborted, "interrupted: the running plugin was stopped"}});
  auto file = std::make_shared<std::string>();
  auto noSchema = std::make_shared<bool>(false);
  auto events = std::make_shared<std::string>();
  cmd->add_option("FILE", *file, kDocumentFileHelp)->required();
  cmd->add_flag("--no-schema", *noSchema, "Skip the schema check: only the validation plugins judge FILE");
  AddEventsOption(cmd, *events);
  SetAction(cmd, options, Needs::kHost, [&options, file, noSchema, events] {
    const rapidjson::Document desired = ReadDesiredDocument(*file);
    auto result = std::make_shared<HoxConfigManager::ValidationResult>();
    {
      InterruptWatch watch;
      InDocument(*file, [&] {
        const rapidjson::Document schema = *noSchema ? rapidjson::Document() : HostSchemaFor(desired);
        HoxConfigManager::Validate(desired, schema, "", *result, !*noSchema, MakeTask(options, *events));
      });
      if (!result->error.id.empty()) return Unfinished(result->error, "validation");
    }
    const rapidjson::Value& root = HoxConfigManager::DocumentShape::Unwrap(desired);
    auto findings = std::make_shared<rapidjson::Document>(rapidjson::kArrayType);
    auto& a = findings->GetAllocator();
    std::string text;
    for (const auto& entry : result->errors) {
      const std::string item = ReportPathToItemName(entry.field, root, nullptr);
      rapidjson::Value errors(rapidjson::kArrayType);
      for (const ErrorInfo& e : entry.errors) {
        rapidjson::Value error(rapidjson::kObjectType);
        std::string shown;
        for (const std::string& arg : e.args) shown += (shown.empty() ? "" : ", ") + arg;
        AddErrorInfo(error, e, a);
        error.AddMember("text", rapidjson::Value(Readable(e), a), a);
        errors.PushBack(error, a);
        text += FormatWhere(Where{*file, 0, 0, item}) + ": " + Readable(e) + " [" + e.id +
                (shown.empty() ? "" : ": " + shown) + "]\n";
      }
      rapidjson::Value finding(rapidjson::kObjectType);
      finding.AddMember("field", rapidjson::Value(entry.field, a), a);
      finding.AddMember("item", rapidjson::Value(item, a), a);
      finding.AddMember("errors", errors, a);
      findings->PushBack(finding, a);
    }
    const std::string name = DisplayName(*file);
    Print(options, {[text, name] { return text.empty() ? name + ": valid\n" : text; },
                    [findings] { return CheckShape("findings", *findings); }});
    return result->errors.empty() ? kExitOk : kExitNegative;
  });
}

// ---- impact --------------------------------------------------------------

// A statement in words: "add /c/g/k" (its arguments are component, key,
// group), "a reboot is required".
std::string Statement(const HoxConfigManager::ImpactInfo& info) {
  const std::string kind = info.id.substr(info.id.rfind('.') + 1);
  if (kind == "reboot") return "a reboot is required";
  if (kind == "maintenance-mode") return "maintenance mode is required";
  if (info.args.size() == 3) return kind + " " + ItemName(info.args[0], info.args[2], info.args[1]);
  return info.id;
}

void RegisterImpact(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "impact",
                         "Say what applying a desired document would cost: nothing, maintenance mode or a reboot, "
                         "and why",
                         {{kExitOk, "the host complies with FILE: applying it changes nothing"},
                          {kExitNegative, "it does not: the impact, the changes and their reasons are listed"},
                          {kExitUsage, kUsageStatus + std::string(" (also: an impact plugin failed)")},
                          {kExitAborted, "interrupted: the running plugin was stopped"}});
  auto file = std::make_shared<std::string>();
  auto events = std::make_shared<std::string>();
  cmd->add_option("FILE", *file, kDocumentFileHelp)->required();
  AddEventsOption(cmd, *events);
  SetAction(cmd, options, Needs::kHost, [&options, file, events] {
    auto desired = std::make_shared<rapidjson::Document>(ReadDesiredDocument(*file));
    auto result = std::make_shared<HoxConfigManager::ImpactResult>();
    auto reasons = std::make_shared<HoxConfigManager::ImpactReasons>();
    {
      InterruptWatch watch;
      InDocument(*file, [&] {
        HoxConfigManager::Impact(*desired, "", *result, MakeTask(options, *events), std::nullopt, reasons.get());
      });
      if (!result->error.id.empty()) return Unfinished(result->error, "impact");
    }
    const std::string name = DisplayName(*file);
    Print(options, {[result, reasons, desired, name] {
                      if (result->compliant) return "compliant: applying " + name + " changes nothing\n";
                      const rapidjson::Value& root = HoxConfigManager::DocumentShape::Unwrap(*desired);
                      std::string text = "not compliant: applying " + name + " needs " + Requirement(result->impact) +
                                         "\nchanges:\n";
                      for (const auto& info : result->impactInfo) {
                        if (info.args.empty()) continue;  // the overall statement, said above
                        text += "  " + Statement(info) + "\n";
                      }
                      return text + ReasonsText(*reasons, root);
                    },
                    [result, reasons] {
                      rapidjson::Document out(rapidjson::kObjectType);
                      auto& a = out.GetAllocator();
                      out.AddMember("compliant", result->compliant, a);
                      out.AddMember("impact", static_cast<int>(result->impact), a);
                      rapidjson::Value statements(rapidjson::kArrayType);
                      for (const auto& info : result->impactInfo) {
                        rapidjson::Value statement(rapidjson::kObjectType), args(rapidjson::kArrayType);
                        for (const std::string& arg : info.args) args.PushBack(rapidjson::Value(arg, a), a);
                        statement.AddMember("id", rapidjson::Value(info.id, a), a);
                        statement.AddMember("args", args, a);
                        statements.PushBack(statement, a);
                      }
                      out.AddMember("impactInfo", statements, a);
                      rapidjson::Value why;
                      HoxConfigManager::ImpactReasonsToJson(*reasons, why, a);
                      out.AddMember("reasons", why, a);
                      return out;
                    }});
    return result->compliant ? kExitOk : kExitNegative;
  });
}

}  // namespace

void RegisterVerdictCommands(CLI::App& app, GlobalOptions& options) {
  RegisterValidate(app, options);
  RegisterImpact(app, options);
}

}  // namespace hoxcfg
