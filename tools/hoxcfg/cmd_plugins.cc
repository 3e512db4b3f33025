// hoxcfg plugins list | check: the installed plugins, the order in which
// their apply operations run, and the check of every manifest against its
// manifest schema.
#include <algorithm>
#include <cstdlib>
#include <iostream>
#include <memory>

#include <hoxcm/host.h>
#include <hoxcm/documents.h>
#include <hoxcm/plugins.h>

#include "hoxcfg/commands.h"
#include "hoxcfg/cli.h"

namespace hoxcfg {
namespace {

using namespace HoxConfigManager;

rapidjson::Value Strings(const std::vector<std::string>& items, rapidjson::Document::AllocatorType& a) {
  rapidjson::Value list(rapidjson::kArrayType);
  for (const std::string& s : items) list.PushBack(rapidjson::Value(s, a), a);
  return list;
}

// {"plugins": [...], "order": [...]}: each plugin with what it owns, the
// kinds of run it supports and its apply operations.
rapidjson::Document ListPlugins() {
  PluginManager manager(APPLY);
  rapidjson::Document out(rapidjson::kObjectType);
  auto& a = out.GetAllocator();
  rapidjson::Value plugins(rapidjson::kArrayType);
  auto all = manager.GetPlugins();
  // Plugins without apply support are not in the apply registry; list them
  // from the other registries too.
  for (PluginType type : {IMPACT, VALIDATE}) {
    for (const auto& p : PluginManager(type).GetPlugins()) {
      bool known = false;
      for (const auto& q : all) known = known || q->GetPath() == p->GetPath();
      if (!known) all.push_back(p);
    }
  }
  std::sort(all.begin(), all.end(), [](const auto& x, const auto& y) { return x->GetId() < y->GetId(); });
  for (const auto& p : all) {
    rapidjson::Value entry(rapidjson::kObjectType);
    entry.AddMember("id", rapidjson::Value(p->GetId(), a), a);
    entry.AddMember("version", static_cast<int64_t>(p->GetVersion()), a);
    entry.AddMember("type", rapidjson::Value(p->GetType(), a), a);
    if (!p->GetModule().empty()) entry.AddMember("module", rapidjson::Value(p->GetModule(), a), a);
    entry.AddMember("manifest", rapidjson::Value(HoxPlatform::StripHostRoot(p->GetPath()), a), a);
    std::vector<std::string> owns;
    for (const auto& id : p->GetCSOIdList()) owns.push_back(ItemName(id.component, id.group, id.key));
    entry.AddMember("accepts", Strings(owns, a), a);
    std::vector<std::string> kinds;
    if (p->HasApplySupport()) kinds.push_back("apply");
    if (p->HasApplyBootSupport()) kinds.push_back("boot");
    if (p->HasImpactSupport()) kinds.push_back("impact");
    if (p->HasValidateSupport()) kinds.push_back("validate");
    entry.AddMember("supports", Strings(kinds, a), a);
    if (p->HasApplySupport()) {
      entry.AddMember("applyGroup", rapidjson::Value(p->GetApplyGroup(), a), a);
      std::vector<PluginApplyOperation> ops = p->GetOperations();
      if (p->GetVersion() == 3) {
        ops.clear();
        ops.emplace_back();
        p->GetRemediateOperation(ops.back());
      }
      rapidjson::Value operations(rapidjson::kArrayType);
      for (const auto& op : ops) {
        rapidjson::Value o(rapidjson::kObjectType);
        o.AddMember("operation", rapidjson::Value(op.operation, a), a);
        o.AddMember("provides", rapidjson::Value(op.provides, a), a);
        o.AddMember("depends", Strings(op.depends, a), a);
        operations.PushBack(o, a);
      }
      entry.AddMember("operations", operations, a);
    }
    plugins.PushBack(entry, a);
  }
  out.AddMember("plugins", plugins, a);
  out.AddMember("order", Strings(manager.GetDependencies(), a), a);
  return out;
}

std::string Joined(const rapidjson::Value& list, const char* separator) {
  std::string text;
  for (const auto& item : list.GetArray()) text += (text.empty() ? "" : separator) + std::string(item.GetString());
  return text;
}

std::string PluginTable(const rapidjson::Document& registry) {
  Table table({"PLUGIN", "VERSION", "RUNNER", "RUNS", "APPLY GROUP", "ITEMS"});
  for (const auto& p : registry["plugins"].GetArray()) {
    table.Add({p["id"].GetString(), std::to_string(p["version"].GetInt64()), p["type"].GetString(),
               Joined(p["supports"], ","), p.HasMember("applyGroup") ? p["applyGroup"].GetString() : "-",
               Joined(p["accepts"], " ")});
  }
  return table.Render() + "\napply order: " + Joined(registry["order"], " -> ") + "\n";
}

// A finding of the manifest check: a text, or a validator finding.
std::string ManifestFinding(const rapidjson::Value& finding) {
  if (finding.IsString()) return finding.GetString();
  if (finding.IsObject() && finding.HasMember("field") && finding.HasMember("error")) {
    const std::string field = finding["field"].GetString();
    return (field.empty() ? "" : field + ": ") + finding["error"].GetString();
  }
  return HoxConfigManager::JsonToString(finding);
}

// Adds to `report` each fault of the apply order the manifests declare, under
// its first manifest; a fault of both the apply and the boot-time order is
// listed once.
void AddOrderFaults(rapidjson::Document& report) {
  auto& a = report.GetAllocator();
  std::vector<std::string> seen;
  for (PluginType type : {APPLY, APPLY_BOOT}) {
    for (const ApplyOrderFault& fault : CheckApplyOrder(type)) {
      if (std::find(seen.begin(), seen.end(), fault.text) != seen.end()) continue;
      seen.push_back(fault.text);
      std::string text = (type == APPLY_BOOT ? "in the boot-time order: " : "") + fault.text;
      for (std::size_t i = 1; i < fault.manifests.size(); ++i) {
        text += (i == 1 ? "; see also " : ", ") + HoxPlatform::StripHostRoot(fault.manifests[i]);
      }
      rapidjson::Value errors(rapidjson::kArrayType);
      errors.PushBack(rapidjson::Value(text, a), a);
      AddValidationError(report, fault.manifests.empty() ? std::string() : fault.manifests.front(), errors);
    }
  }
}

}  // namespace

void RegisterPluginCommands(CLI::App& app, GlobalOptions& options) {
  auto* plugins = AddCommand(app, "plugins", "Installed plugins: their registry and the check of their manifests");
  plugins->require_subcommand(1);
  auto* list = AddCommand(*plugins, "list", "Show the installed plugins and the order of their apply operations",
                          {{kExitOk, "listed"}, {kExitUsage, kUsageStatus}});
  SetAction(list, options, Needs::kHost, [&options] {
    auto registry = std::make_shared<rapidjson::Document>(ListPlugins());
    Print(options, {[registry] { return PluginTable(*registry); }, [registry] { return CopyOf(*registry); },
                    /*list=*/true});
    return kExitOk;
  });
  auto* check = AddCommand(*plugins, "check",
                           "Check every manifest against the manifest schema of its version, and the apply order "
                           "they declare",
                           {{kExitOk, "every manifest is valid"},
                            {kExitNegative, "some are not: each finding is listed"},
                            {kExitUsage, kUsageStatus}});
  SetAction(check, options, Needs::kHost, [&options] {
    auto report = std::make_shared<rapidjson::Document>();
    ValidateAllPlugins(PluginDirectory(), PluginSchemaDirectory(), *report);
    // A manifest its schema refuses may not load at all; its findings say
    // enough until it is fixed.
    if (report->Empty()) AddOrderFaults(*report);
    // Host paths, as everywhere else in the output.
    for (auto& entry : report->GetArray()) {
      entry["file"].SetString(HoxPlatform::StripHostRoot(entry["file"].GetString()), report->GetAllocator());
    }
    Print(options, {[report] {
                      if (report->Empty()) return std::string("every manifest agrees with its manifest schema\n");
                      std::string text;
                      for (const auto& entry : report->GetArray()) {
                        const std::string file = entry["file"].GetString();
                        for (const auto& finding : entry["validation_errors"].GetArray()) {
                          text += file + ": " + ManifestFinding(finding) + "\n";
                        }
                      }
                      return text;
                    },
                    [report] { return CheckShape("failures", *report); }});
    return report->Empty() ? kExitOk : kExitNegative;
  });
}

}  // namespace hoxcfg
