// hoxcfg compliance and drift: what a desired document would change on the
// host, as a compliance report or as the apply tasks it would generate.
#include <cstdlib>
#include <iostream>
#include <memory>
#include <string>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/drift.h>
#include <hoxcm/host_documents.h>

#include "hoxcfg/commands.h"
#include "hoxcfg/common.h"

namespace hoxcfg {
namespace {


// The document as it applies to this host: host-specific sections (as an
// export writes them) are reduced to this host's.
rapidjson::Document LoadDocument(const std::string& path) {
  rapidjson::Document file;
  HoxConfigManager::CreateDocumentFromFile(path.c_str(), file);
  rapidjson::Document doc;
  HoxConfigManager::CreateMergedDocument(file, doc);
  return doc;
}

// One report list as text: every entry's path, then its values (already
// redacted by the report).
std::string FormatList(const char* title, const rapidjson::Value& entries) {
  std::string out = std::string(title) + " (" + std::to_string(entries.Size()) + ")\n";
  for (const auto& entry : entries.GetArray()) {
    out += "  " + std::string(entry["path"].GetString()) + "\n";
    if (entry.HasMember("desiredValue")) out += "      desired: " + std::string(entry["desiredValue"].GetString()) + "\n";
    if (entry.HasMember("hostValue")) out += "      host:    " + std::string(entry["hostValue"].GetString()) + "\n";
  }
  return out;
}

void RegisterCompliance(CLI::App& app, GlobalOptions& options) {
  auto* cmd = app.add_subcommand("compliance", "Compare the host with a desired document (exit 1 when it differs)")
                  ->fallthrough();
  auto file = std::make_shared<std::string>();
  auto json = std::make_shared<bool>(false);
  cmd->add_option("FILE", *file, "Desired configuration document")->required();
  cmd->add_flag("--json", *json, "Print the report document itself");
  cmd->callback([&options, file, json] {
    Run(options, [&] {
      rapidjson::Document desired = LoadDocument(*file);
      HoxConfigManager::ComplianceResult result;
      HoxConfigManager::CheckCompliance(desired, result);
      std::string text;
      if (*json) {
        text = FormatJson(result.document, options);
      } else {
        const auto& report = result.document;
        const unsigned count = report["ADDS"].Size() + report["DELETES"].Size() + report["SETS"].Size();
        text = result.compliant ? "compliant\n"
                                : "not compliant: " + std::to_string(count) + " difference(s)\n";
        if (!result.compliant) {
          text += FormatList("ADDS", report["ADDS"]) + FormatList("DELETES", report["DELETES"]) +
                  FormatList("SETS", report["SETS"]);
        }
      }
      std::cout << text << std::flush;
      return result.compliant ? kExitOk : kExitNegative;
    });
  });
}

void RegisterDrift(CLI::App& app, GlobalOptions& options) {
  auto* cmd = app.add_subcommand("drift", "List the apply tasks a desired document would generate")->fallthrough();
  auto file = std::make_shared<std::string>();
  auto boot = std::make_shared<bool>(false);
  auto json = std::make_shared<bool>(false);
  cmd->add_option("FILE", *file, "Desired configuration document")->required();
  cmd->add_flag("--boot", *boot, "The tasks of a boot-time apply (no comparison)");
  cmd->add_flag("--json", *json, "Print the tasks as a JSON array");
  cmd->callback([&options, file, boot, json] {
    Run(options, [&] {
      rapidjson::Document desired = LoadDocument(*file);
      const std::vector<HoxConfigManager::DesiredConfigInput> tasks =
          *boot ? HoxConfigManager::GenerateBootTimeTasks(desired) : HoxConfigManager::GenerateApplyTasks(desired);
      rapidjson::Document out(rapidjson::kArrayType);
      auto& alloc = out.GetAllocator();
      std::string text;
      for (const auto& task : tasks) {
        const auto& id = task.object->GetConfigStoreObjectId();
        const std::string path = "/" + id.component + "/" + id.group + "/" + id.key;
        if (*json) {
          rapidjson::Value entry(rapidjson::kObjectType);
          entry.AddMember("action", rapidjson::Value(task.action, alloc), alloc);
          entry.AddMember("object", rapidjson::Value(id.toString(), alloc), alloc);
          entry.AddMember("instance", rapidjson::Value(id.instanceId, alloc), alloc);
          entry.AddMember("path", rapidjson::Value(path, alloc), alloc);
          out.PushBack(entry, alloc);
        } else {
          std::string action = task.action;
          action.resize(7, ' ');
          text += action + path + (id.instanceId.empty() ? "" : "  [" + id.instanceId + "]") + "\n";
        }
      }
      if (*json) {
        text = FormatJson(out, options);
      } else if (tasks.empty()) {
        text = "no tasks\n";
      }
      std::cout << text << std::flush;
      return kExitOk;
    });
  });
}

}  // namespace

void RegisterDriftCommands(CLI::App& app, GlobalOptions& options) {
  RegisterCompliance(app, options);
  RegisterDrift(app, options);
}

}  // namespace hoxcfg
