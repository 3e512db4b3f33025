// hoxcfg init, export, show and maintenance: setting up a host root,
// reading its configuration out of the store, and its maintenance mode.
#include <iostream>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/extraction.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/plugins.h>
#include <hoxcm/schema_store.h>

#include "hoxcfg/cli.h"
#include "hoxcfg/commands.h"
#include "hoxcfg/host_setup.h"

namespace hoxcfg {
namespace {


// Replaces every sensitive value of the items of `doc` (a host document,
// possibly under "profile") by the mask of the store, so that what is shown
// on a terminal never carries a secret.
void RedactDocument(rapidjson::Document& doc) {
  namespace Shape = HoxConfigManager::DocumentShape;
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  if (!store || !doc.IsObject()) return;
  Shape::ForEachItem(Shape::Unwrap(doc), [&](const Shape::Item<rapidjson::Value>& item) {
    auto schema = store->Find(item.component.GetString(), item.group.GetString(), item.key.GetString());
    if (!schema) return;
    const std::string text =
        HoxConfigStore::ConfigStoreDocument::RedactAndSerializeValue(schema->GetJsonSchema(), item.value);
    rapidjson::Document redacted(&doc.GetAllocator());
    HoxConfigManager::ParseDocument(text, redacted);
    item.value.Swap(redacted);
  });
}

void RegisterInit(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "init", "Create a host root: store, schemas, manifest schemas, runners, plugins",
                         {{kExitOk, "the host root is ready"},
                          {kExitNegative, "it is, but schema files were refused: each is listed"},
                          {kExitUsage, kUsageStatus}});
  auto request = std::make_shared<InitRequest>();
  auto force = std::make_shared<bool>(false);
  auto reset = std::make_shared<bool>(false);
  cmd->add_flag("--sample", request->sample, "Also load the sample host: configuration, host facts, SSH and auto-deployment files");
  cmd->add_option("--from", request->from,
                  "Load DOCUMENT, a host document (as export writes it), as the user configuration "
                  "('-': standard input)")
      ->type_name("DOCUMENT");
  cmd->add_option("--schemas", request->schemas, "Install the key schemas of DIR instead of the sample host's")
      ->type_name("DIR");
  cmd->add_flag("--force", *force, "Allow initialising the real root /");
  cmd->add_flag("--reset", *reset,
                "Replace the host already at the root: its installed files and, with --sample or --from, its "
                "configuration");
  SetAction(cmd, options, Needs::kNothing, [&options, request, force, reset] {
    const std::string root = HoxPlatform::HostRoot();
    if (root == "/" && !*force) {
      throw Failure("refusing to initialise the real root /", "pass --root DIR, or --force to mean it");
    }
    // A second init by mistake must not wipe the host's configuration.
    if (HostExists() && !*reset) {
      throw Failure("a host already exists at " + root + "; nothing was changed", "pass --reset to replace it");
    }
    // An apply, a boot-time run or a set running now reads the store and the
    // files being replaced: wait until it is done.
    std::shared_ptr<void> hold;
    if (HostExists()) {
      hold = HoxConfigManager::HoldHostRunLock([] { std::cerr << "hoxcfg: waiting for another apply to finish\n" << std::flush; });
    }
    auto report = std::make_shared<InitReport>(InitHostRoot(LocateProductFiles(), *request));
    AuditChange(request->sample          ? "host root initialised with the sample host"
                : !request->from.empty() ? "host root initialised from " + request->from
                                         : "host root initialised");
    Print(options, {[report] {
                      std::string text;
                      for (const std::string& line : report->steps) text += line + "\n";
                      return text;
                    },
                    [report, root] {
                      rapidjson::Document out(rapidjson::kObjectType);
                      auto& a = out.GetAllocator();
                      rapidjson::Value list(rapidjson::kArrayType);
                      for (const std::string& line : report->steps) list.PushBack(rapidjson::Value(line, a), a);
                      rapidjson::Value refused(rapidjson::kArrayType);
                      for (const std::string& e : report->refusedSchemas) refused.PushBack(rapidjson::Value(e, a), a);
                      out.AddMember("root", rapidjson::Value(root, a), a);
                      out.AddMember("steps", list, a);
                      out.AddMember("refusedSchemas", refused, a);
                      return out;
                    }});
    return report->refusedSchemas.empty() ? kExitOk : kExitNegative;
  });
}

void RegisterExport(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "export",
                         "Print the host's configuration as a document to apply to another host (secrets in clear)",
                         {{kExitOk, "exported"}, {kExitUsage, kUsageStatus}});
  auto output = std::make_shared<std::string>();
  cmd->add_option("--output,-o", *output, "Write the document to FILE (mode 0600, replaced atomically)")
      ->type_name("FILE");
  SetAction(cmd, options, Needs::kHost, [&options, output] {
    // Indented, to be read and edited; the export carries secrets in clear
    // (it must be applicable to another host), so a file is its owner's only.
    WriteOutput(JsonText(HoxConfigManager::ExportDocument(), options), *output);
    return kExitOk;
  });
}

void RegisterShow(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "show", "Print an extracted configuration (sensitive values masked)",
                         {{kExitOk, "shown"}, {kExitUsage, kUsageStatus}});
  auto which = std::make_shared<std::string>("current");
  cmd->add_option("what", *which, "current (default), user, desired or smartnic")
      ->check(CLI::IsMember({"current", "user", "desired", "smartnic"}));
  SetAction(cmd, options, Needs::kHost, [&options, which] {
    rapidjson::Document doc;
    if (*which == "current") {
      doc = HoxConfigManager::ExtractCurrentConfiguration();
    } else if (*which == "user") {
      doc = HoxConfigManager::ExtractUserConfiguration(true);
    } else if (*which == "desired") {
      doc = HoxConfigManager::ExtractDesiredConfiguration();
    } else {
      doc = HoxConfigManager::ExtractSmartnicConfiguration();
    }
    RedactDocument(doc);
    std::cout << JsonText(doc, options) << std::flush;
    return kExitOk;
  });
}

Answer MaintenanceAnswer(bool enabled, std::optional<bool> changed) {
  return {[enabled, changed] {
            return std::string("maintenance mode: ") + (enabled ? "on" : "off") +
                   (changed.has_value() && !*changed ? " (unchanged)" : "") + "\n";
          },
          [enabled, changed] {
            rapidjson::Document out(rapidjson::kObjectType);
            out.AddMember("maintenanceMode", enabled, out.GetAllocator());
            if (changed.has_value()) out.AddMember("changed", *changed, out.GetAllocator());
            return out;
          }};
}

void RegisterMaintenance(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "maintenance", "Enter, exit or show the host's maintenance mode");
  cmd->require_subcommand(1);
  for (const bool enter : {true, false}) {
    auto* change = AddCommand(*cmd, enter ? "enter" : "exit",
                              enter ? "Put the host into maintenance mode" : "Take the host out of maintenance mode",
                              {{kExitOk, enter ? "the host is in maintenance mode" : "the host is not in maintenance mode"},
                               {kExitUsage, kUsageStatus}});
    SetAction(change, options, Needs::kHost, [&options, enter] {
      const bool changed = HoxConfigManager::IsMaintenanceModeEnabled() != enter;
      if (changed) {
        Confirm(options, enter ? "put the host into maintenance mode" : "take the host out of maintenance mode");
        HoxConfigStore::SetMaintenanceMode(enter);
        AuditChange(enter ? "maintenance mode entered" : "maintenance mode exited");
      }
      Print(options, MaintenanceAnswer(HoxConfigManager::IsMaintenanceModeEnabled(), changed));
      return kExitOk;
    });
  }
  auto* status = AddCommand(*cmd, "status", "Tell whether the host is in maintenance mode",
                            {{kExitOk, "the host is in maintenance mode"},
                             {kExitNegative, "it is not"},
                             {kExitUsage, kUsageStatus}});
  SetAction(status, options, Needs::kHost, [&options] {
    const bool enabled = HoxConfigManager::IsMaintenanceModeEnabled();
    Print(options, MaintenanceAnswer(enabled, std::nullopt));
    return enabled ? kExitOk : kExitNegative;
  });
}

}  // namespace

void RegisterStoreCommands(CLI::App& app, GlobalOptions& options) {
  RegisterInit(app, options);
  RegisterExport(app, options);
  RegisterShow(app, options);
  RegisterMaintenance(app, options);
}

}  // namespace hoxcfg
