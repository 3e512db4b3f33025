// hoxcfg get, set and delete: one configuration item through the host API
// (docs/host-api.md), with the impact shown and confirmed before a change.
#include <unistd.h>

#include <algorithm>
#include <functional>
#include <iostream>
#include <memory>
#include <string>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/host_api.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

#include "hoxcfg/cli.h"
#include "hoxcfg/commands.h"

namespace hoxcfg {
namespace {

using HoxConfigManager::ApplyResult;
using HoxConfigManager::ImpactResult;

constexpr const char* kItemHelp = "The item: COMPONENT/GROUP/KEY (a singleton's object, or a key's instances)";

struct Item {
  std::string component, group, key;
  std::string Name() const { return ItemName(component, group, key); }
};

// COMPONENT/GROUP/KEY, with or without a leading "/", as item names are
// written (ParseItemName), without an instance.
Item ParseItem(const std::string& text) {
  const auto item = ParseItemName(!text.empty() && text.front() == '/' ? text : "/" + text);
  if (!item || !item->instance.empty()) {
    throw Failure("'" + text + "' is not an item", "name it COMPONENT/GROUP/KEY, for example network/dns/config");
  }
  return {item->component, item->group, item->key};
}

std::shared_ptr<HoxSchemaStore::SchemaObject> SchemaOf(const Item& item) {
  const auto store = HoxSchemaStore::SchemaStore::GetStore();
  return store ? store->Find(item.component, item.group, item.key) : nullptr;
}

// A value of the item as JSON, its sensitive members masked unless `clear`.
rapidjson::Document Shown(const Item& item, const std::string& json, bool clear) {
  rapidjson::Document value;
  HoxConfigManager::ParseDocument(json, value);
  const auto schema = SchemaOf(item);
  if (clear || value.IsNull() || !schema) return value;
  rapidjson::Document masked;
  HoxConfigManager::ParseDocument(
      HoxConfigStore::ConfigStoreDocument::RedactAndSerializeValue(schema->GetJsonSchema(), value), masked);
  return masked;
}

// The answer of set and delete: the item, what was decided and why.
struct Outcome {
  std::string item;
  std::string status;  // "unchanged", "applied", "applied in maintenance mode", "staged", "deleted", ...
  // set only: the impact (-1 for delete) and its reasons, in the shape of `hoxcfg impact --json`
  int impact = -1;
  rapidjson::Document reasons;
};

Answer OutcomeAnswer(const std::shared_ptr<Outcome>& o) {
  return {[o] {
            if (o->status == "staged") return o->item + ": staged for the next boot: reboot the host to apply it\n";
            return o->item + ": " + o->status + "\n";
          },
          [o] {
            rapidjson::Document out(rapidjson::kObjectType);
            auto& a = out.GetAllocator();
            out.AddMember("item", rapidjson::Value(o->item, a), a);
            out.AddMember("status", rapidjson::Value(o->status, a), a);
            if (o->impact >= 0) {
              out.AddMember("impact", o->impact, a);
              out.AddMember("reasons", rapidjson::Value(o->reasons, a), a);
            }
            return out;
          }};
}

// Runs a change of the host under the caller's InterruptWatch: an abort is
// exit 130, a plugin's failure exit 1; the audit line is written whatever
// happened once the change began.
int RunChange(const GlobalOptions& options, const Progress& progress, const std::shared_ptr<Outcome>& outcome,
              const std::string& what, const std::function<ApplyResult()>& change) {
  ApplyResult result;
  try {
    result = change();
  } catch (const HoxConfigStore::ConfigStoreException& e) {
    progress.Hide();
    const auto error = HoxConfigManager::PluginErrorOf(e);
    if (!error) throw;
    AuditChange(what + " " + outcome->item + " failed");
    throw Failure("plugin error " + error->id + (error->message.empty() ? "" : ": " + error->message),
                  "the item may be partly changed; `hoxcfg get " + outcome->item + "` shows it", kExitNegative);
  }
  progress.Hide();
  if (!result.errorInfo.id.empty()) {
    outcome->status = "aborted";
    AuditChange(what + " " + outcome->item + " aborted");
    Print(options, OutcomeAnswer(outcome));
    return kExitAborted;
  }
  if (outcome->status.empty()) {
    outcome->status = result.status == HoxConfigManager::APPLY_PENDING_REBOOT ? "staged"
                      : result.status == HoxConfigManager::APPLY_COMPLETED_IN_MAINTENANCE_MODE
                          ? "applied in maintenance mode"
                          : "applied";
  }
  AuditChange(what + " " + outcome->item + " " + outcome->status);
  Print(options, OutcomeAnswer(outcome));
  return result.status == HoxConfigManager::APPLY_PENDING_REBOOT ? kExitStaged : kExitOk;
}

// Asks as `hoxcfg apply` asks: Ctrl-C at the question is an abort (130).
void ConfirmChange(const GlobalOptions& options, const std::string& plan) {
  try {
    Confirm(options, plan);
  } catch (const Failure&) {
    if (InterruptWatch::Interrupted()) throw Failure("aborted: nothing was changed", "", kExitAborted);
    throw;
  }
}

void RegisterGet(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "get", "Print one item's configuration, its default, and whether it is the user's",
                         {{kExitOk, "printed"}, {kExitUsage, kUsageStatus}});
  auto item = std::make_shared<std::string>();
  auto secrets = std::make_shared<bool>(false);
  cmd->add_option("ITEM", *item, kItemHelp)->required();
  cmd->add_flag("--show-secrets", *secrets, "Show sensitive values in clear (root, on a terminal only)");
  SetAction(cmd, options, Needs::kHost, [&options, item, secrets] {
    const Item at = ParseItem(*item);
    if (*secrets && (::geteuid() != 0 || !StdoutIsTerminal() || options.json)) {
      throw Failure("--show-secrets shows secrets to root on a terminal only",
                    "run it as root on a terminal without --json, or leave --show-secrets out");
    }
    std::string current, defaults, user;
    HoxConfigManager::GetConfig(at.component, at.group, at.key, current, defaults, user);
    auto shownCurrent = std::make_shared<rapidjson::Document>(Shown(at, current, *secrets));
    auto shownDefault = std::make_shared<rapidjson::Document>(Shown(at, defaults, *secrets));
    const bool isUser = user == "true";
    Print(options, {[&options, at, shownCurrent, shownDefault, isUser] {
                      return at.Name() + (isUser ? ": user configuration\n" : ": not user configuration\n") +
                             "current: " + JsonText(*shownCurrent, options) +
                             "default: " + JsonText(*shownDefault, options);
                    },
                    [at, shownCurrent, shownDefault, isUser] {
                      rapidjson::Document out(rapidjson::kObjectType);
                      auto& a = out.GetAllocator();
                      out.AddMember("item", rapidjson::Value(at.Name(), a), a);
                      out.AddMember("current", rapidjson::Value(*shownCurrent, a), a);
                      out.AddMember("default", rapidjson::Value(*shownDefault, a), a);
                      out.AddMember("userConfiguration", isUser, a);
                      return out;
                    }});
    return kExitOk;
  });
}

// The findings of ValidateInput in schema-check's shape.
int ReportFindings(const GlobalOptions& options, const std::string& source,
                   const std::vector<HoxConfigManager::ValidationErrorInfo>& findings) {
  auto list = std::make_shared<rapidjson::Document>(rapidjson::kArrayType);
  auto& a = list->GetAllocator();
  for (const auto& finding : findings) {
    for (const auto& error : finding.errors) {
      const int code = JsonValidator::ConvertMsgIdToErrorCode(error.id);
      rapidjson::Value entry(rapidjson::kObjectType), args(rapidjson::kArrayType);
      for (const std::string& arg : error.args) args.PushBack(rapidjson::Value(arg, a), a);
      entry.AddMember("field", rapidjson::Value(finding.field, a), a);
      entry.AddMember("errId", code, a);
      entry.AddMember("errArgs", args, a);
      entry.AddMember("error", rapidjson::Value(JsonValidator::DescribeFinding(code, error.args), a), a);
      list->PushBack(entry, a);
    }
  }
  return PrintFindings(options, std::move(list), source);
}

void RegisterSet(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "set", "Set one item: applied now, or staged for the next boot when it needs a reboot",
                         {{kExitOk, "applied (or the item had the value already)"},
                          {kExitNegative, "the value is not valid (each finding is listed), or a plugin failed"},
                          {kExitUsage, kUsageStatus + std::string(" (maintenance mode is required and not entered, "
                                                                   "or a staged change waits for a reboot)")},
                          {kExitStaged, "the change needs a reboot: staged for the next boot"},
                          {kExitAborted, "interrupted (Ctrl-C): the running plugin was stopped"}});
  auto item = std::make_shared<std::string>();
  auto value = std::make_shared<std::string>();
  auto file = std::make_shared<std::string>();
  auto events = std::make_shared<std::string>();
  cmd->add_option("ITEM", *item, kItemHelp)->required();
  auto* valueOption = cmd->add_option("--value", *value, "The new item as JSON text")->type_name("JSON");
  auto* fileOption =
      cmd->add_option("--file", *file, "Read the new item from FILE ('-': standard input)")->type_name("FILE");
  AddEventsOption(cmd, *events);
  SetAction(cmd, options, Needs::kHost, [&options, item, value, file, events, valueOption, fileOption] {
    const Item at = ParseItem(*item);
    if (valueOption->count() + fileOption->count() != 1) {
      throw Failure("set needs the new item once", "give it with --value JSON or with --file FILE");
    }
    const std::string source = fileOption->count() ? *file : std::string("--value");
    const std::string text = fileOption->count() ? ReadTextArgument(*file) : *value;

    rapidjson::Document parsed;
    std::vector<HoxConfigManager::ValidationErrorInfo> findings;
    InDocument(source, [&] { HoxConfigManager::ValidateInput(at.component, at.group, at.key, text, parsed, findings); });
    if (!findings.empty()) return ReportFindings(options, source, findings);

    rapidjson::Document current, desired, staged;
    HoxConfigManager::GenerateSetDocuments(at.component, at.group, at.key, current, desired, staged, parsed);
    InterruptWatch watch;
    // One bar, as `hoxcfg apply` shows it: the impact, then the change.
    const Progress progress(options, *events);
    HoxConfigManager::ImpactReasons reasons;
    ImpactResult impact;
    auto outcome = std::make_shared<Outcome>();
    outcome->item = at.Name();
    try {
      impact = HoxConfigManager::CheckImpact(desired, current, progress.Task({0, 10}), &reasons);
    } catch (const HoxConfigStore::ConfigStoreException& e) {
      progress.Hide();
      const auto error = HoxConfigManager::PluginErrorOf(e);
      if (!error) throw;
      if (InterruptWatch::Interrupted()) throw Failure("aborted: nothing was changed", "", kExitAborted);
      throw Failure("impact plugin error " + error->id + (error->message.empty() ? "" : ": " + error->message), "",
                    kExitNegative);
    }
    progress.Hide();
    outcome->impact = impact.compliant ? HoxConfigManager::IMPACT_NONE : impact.impact;
    HoxConfigManager::ImpactReasonsToJson(reasons, outcome->reasons, outcome->reasons.GetAllocator());
    if (impact.compliant) {
      outcome->status = "unchanged";
      Print(options, OutcomeAnswer(outcome));
      return kExitOk;
    }
    // What will happen and why, as `hoxcfg plan` says it.
    if (!options.json && !options.quiet) {
      std::cout << outcome->item << ": needs " << Requirement(impact.impact) << "\n"
                << ReasonsText(reasons, desired) << std::flush;
    }
    ConfirmChange(options, impact.impact == HoxConfigManager::IMPACT_REBOOT_REQUIRED
                               ? "stage " + outcome->item + " for the next boot"
                               : "set " + outcome->item + " now");
    return RunChange(options, progress, outcome, "set", [&] {
      return HoxConfigManager::SetConfig(current, desired, staged, impact, at.component, at.group, at.key,
                                         progress.Task({10, 100}));
    });
  });
}

void RegisterDelete(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "delete", "Remove a singleton item's configuration through its plugin",
                         {{kExitOk, "deleted (or the host had no configuration for it)"},
                          {kExitNegative, "the plugin failed"},
                          {kExitUsage, kUsageStatus + std::string(" (maintenance mode is required and not entered, "
                                                                   "or a staged change waits for a reboot)")},
                          {kExitAborted, "interrupted (Ctrl-C): the running plugin was stopped"}});
  auto item = std::make_shared<std::string>();
  auto events = std::make_shared<std::string>();
  cmd->add_option("ITEM", *item, "The item: COMPONENT/GROUP/KEY of a singleton key")->required();
  AddEventsOption(cmd, *events);
  SetAction(cmd, options, Needs::kHost, [&options, item, events] {
    const Item at = ParseItem(*item);
    std::string current, defaults, user;
    HoxConfigManager::GetConfig(at.component, at.group, at.key, current, defaults, user);
    auto outcome = std::make_shared<Outcome>();
    outcome->item = at.Name();
    if (current == "null") {
      outcome->status = "nothing to delete";
      Print(options, OutcomeAnswer(outcome));
      return kExitOk;
    }
    std::string plan = "delete the configuration of " + outcome->item + ": " +
                       HoxConfigManager::JsonToString(Shown(at, current, false));
    const auto schema = SchemaOf(at);
    if (schema &&
        HoxSchemaStore::ListsOperation(*schema, &HoxSchemaStore::SchemaObject::GetRebootOperations, "DELETE")) {
      plan += "\n  it takes effect at the next boot";
    }
    InterruptWatch watch;
    ConfirmChange(options, plan);
    outcome->status = "deleted";
    const Progress progress(options, *events);
    return RunChange(options, progress, outcome, "delete", [&] {
      return HoxConfigManager::DeleteConfig(at.component, at.group, at.key, progress.Task());
    });
  });
}

}  // namespace

void RegisterItemCommands(CLI::App& app, GlobalOptions& options) {
  RegisterGet(app, options);
  RegisterSet(app, options);
  RegisterDelete(app, options);
}

}  // namespace hoxcfg
