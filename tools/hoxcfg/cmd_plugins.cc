// hoxcfg plugins list | check: the installed plugins, the order in which
// their apply operations run, and the check of every manifest against its
// manifest schema.
#include <algorithm>
#include <cstdlib>
#include <iostream>
#include <memory>

#include <hoxcm/host.h>
#include <hoxcm/plugins.h>

#include "hoxcfg/commands.h"
#include "hoxcfg/common.h"

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
    for (const auto& id : p->GetCSOIdList()) owns.push_back(id.component + ":" + id.group + ":" + id.key);
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

}  // namespace

void RegisterPluginCommands(CLI::App& app, GlobalOptions& options) {
  auto* plugins = app.add_subcommand("plugins", "Installed plugins")->require_subcommand(1);
  plugins->add_subcommand("list", "Show the registry and the order of apply operations")
      ->fallthrough()
      ->callback([&options] {
        Run(options, [&] {
          std::cout << FormatJson(ListPlugins(), options) << std::flush;
          return kExitOk;
        });
      });
  plugins->add_subcommand("check", "Check every manifest against its manifest schema")
      ->fallthrough()
      ->callback([&options] {
        Run(options, [&] {
          rapidjson::Document report;
          ValidateAllPlugins(PluginDirectory(), PluginSchemaDirectory(), report);
          std::cout << FormatJson(report, options) << std::flush;
          return report.Empty() ? kExitOk : kExitNegative;
        });
      });
}

}  // namespace hoxcfg
