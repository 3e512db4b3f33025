// hoxcfg compliance and drift: what a desired document would change on the
// host, as a compliance report or as the apply tasks it would generate.
#include <memory>
#include <string>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/drift.h>

#include "hoxcfg/cli.h"
#include "hoxcfg/commands.h"

namespace hoxcfg {
namespace {

std::string Plural(std::size_t n, const char* word) {
  return std::to_string(n) + " " + word + (n == 1 ? "" : "s");
}

// One report list as text: every entry's item, then its values (already
// redacted by the report).
std::string FormatList(const char* title, const rapidjson::Value& entries, const rapidjson::Value& desired) {
  std::string out = std::string(title) + " (" + std::to_string(entries.Size()) + ")\n";
  for (const auto& entry : entries.GetArray()) {
    const char* host = entry.HasMember("hostValue") ? entry["hostValue"].GetString() : nullptr;
    out += "  " + ReportPathToItemName(entry["path"].GetString(), desired, host) + "\n";
    if (entry.HasMember("desiredValue")) out += "      desired: " + std::string(entry["desiredValue"].GetString()) + "\n";
    if (host != nullptr) out += "      host:    " + std::string(host) + "\n";
  }
  return out;
}

void RegisterCompliance(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "compliance", "Compare the host with a desired document",
                         {{kExitOk, "the host complies with FILE"},
                          {kExitNegative, "it does not: the differences are listed"},
                          {kExitUsage, kUsageStatus}});
  auto file = std::make_shared<std::string>();
  auto events = std::make_shared<std::string>();
  cmd->add_option("FILE", *file, kDocumentFileHelp)->required();
  AddEventsOption(cmd, *events);
  SetAction(cmd, options, Needs::kHost, [&options, file, events] {
    auto desired = std::make_shared<rapidjson::Document>(ReadDesiredDocument(*file));
    auto result = std::make_shared<HoxConfigManager::ComplianceResult>();
    InDocument(*file, [&] { HoxConfigManager::CheckCompliance(*desired, *result, MakeTask(options, *events)); });
    Print(options, {[result, desired] {
                      const auto& report = result->document;
                      const rapidjson::Value& compared = HoxConfigManager::DocumentShape::Unwrap(*desired);
                      if (result->compliant) return std::string("compliant\n");
                      const std::size_t count =
                          report["ADDS"].Size() + report["DELETES"].Size() + report["SETS"].Size();
                      return "not compliant: " + Plural(count, "difference") + "\n" +
                             FormatList("ADDS", report["ADDS"], compared) +
                             FormatList("DELETES", report["DELETES"], compared) +
                             FormatList("SETS", report["SETS"], compared);
                    },
                    [result] { return CopyOf(result->document); }});
    return result->compliant ? kExitOk : kExitNegative;
  });
}

void RegisterDrift(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "drift", "List the apply tasks a desired document would generate",
                         {{kExitOk, "no tasks: the host has no drift from FILE (with --boot: always)"},
                          {kExitNegative, "tasks were found"},
                          {kExitUsage, kUsageStatus}});
  auto file = std::make_shared<std::string>();
  auto boot = std::make_shared<bool>(false);
  cmd->add_option("FILE", *file, kDocumentFileHelp)->required();
  cmd->add_flag("--boot", *boot, "The tasks of a boot-time apply: every item, without comparison");
  SetAction(cmd, options, Needs::kHost, [&options, file, boot] {
    rapidjson::Document desired = ReadDesiredDocument(*file);
    auto tasks = std::make_shared<std::vector<HoxConfigManager::DesiredConfigInput>>(InDocument(*file, [&] {
      return *boot ? HoxConfigManager::GenerateBootTimeTasks(desired) : HoxConfigManager::GenerateApplyTasks(desired);
    }));
    Print(options, {[tasks] {
                      if (tasks->empty()) return std::string("no tasks\n");
                      Table table({"ACTION", "ITEM"});
                      for (const auto& task : *tasks) {
                        const auto& id = task.object->GetConfigStoreObjectId();
                        table.Add({task.action, ItemName(id.component, id.group, id.key, id.instanceId)});
                      }
                      return table.Render();
                    },
                    [tasks] {
                      rapidjson::Document out(rapidjson::kObjectType);
                      auto& a = out.GetAllocator();
                      rapidjson::Value list(rapidjson::kArrayType);
                      for (const auto& task : *tasks) {
                        const auto& id = task.object->GetConfigStoreObjectId();
                        rapidjson::Value entry(rapidjson::kObjectType);
                        entry.AddMember("action", rapidjson::Value(task.action, a), a);
                        entry.AddMember("item", rapidjson::Value(ItemName(id.component, id.group, id.key, id.instanceId), a), a);
                        entry.AddMember("path", rapidjson::Value(ItemName(id.component, id.group, id.key), a), a);
                        entry.AddMember("instance", rapidjson::Value(id.instanceId, a), a);
                        list.PushBack(entry, a);
                      }
                      out.AddMember("tasks", list, a);
                      return out;
                    }});
    return *boot || tasks->empty() ? kExitOk : kExitNegative;
  });
}

}  // namespace

void RegisterDriftCommands(CLI::App& app, GlobalOptions& options) {
  RegisterCompliance(app, options);
  RegisterDrift(app, options);
}

}  // namespace hoxcfg
