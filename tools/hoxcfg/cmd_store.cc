// hoxcfg init, export, show and maintenance: setting up a host root and
// reading its configuration out of the store.
#include <cstdlib>
#include <iostream>
#include <string>
#include <vector>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/extraction.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

#include "hoxcfg/commands.h"
#include "hoxcfg/common.h"
#include "hoxcfg/host_setup.h"

namespace hoxcfg {
namespace {


// Reading commands must not create a store as a side effect: a mistyped
// root is an error, not a new empty host.
void RequireHostRoot() {
  const std::string store = HoxPlatform::HostPath(HoxPlatform::HostPaths::kStore);
  if (!HoxConfigManager::fileExists(store)) {
    throw CommandError{HoxConfigManager::ConfigStoreConnectFailed,
                       "Failed to connect to ConfigStore: no store at " + store + " (run hoxcfg init)"};
  }
}

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
  auto* cmd = app.add_subcommand("init", "Create a host root: store, schemas, manifest schemas, runners, plugins")
                  ->fallthrough();
  auto sample = std::make_shared<bool>(false);
  auto force = std::make_shared<bool>(false);
  cmd->add_flag("--sample", *sample, "Also load the sample host: configuration, host facts, SSH files");
  cmd->add_flag("--force", *force, "Allow initialising the real root /");
  cmd->callback([&options, sample, force] {
    Run(options, [&] {
      const std::string root = HoxPlatform::HostRoot();
      if ((root == "/" || root.empty()) && !*force) {
        throw CommandError{kExitError, "refusing to initialise the real root /; pass --root DIR (or --force)"};
      }
      const std::vector<std::string> report = InitHostRoot(LocateProductFiles(), *sample);
      std::string text;
      for (const std::string& line : report) text += line + "\n";
      std::cout << text << std::flush;
      return kExitOk;
    });
  });
}

void RegisterExport(CLI::App& app, GlobalOptions& options) {
  auto* cmd = app.add_subcommand("export", "Print the exported host document")->fallthrough();
  auto output = std::make_shared<std::string>();
  cmd->add_option("--output,-o", *output, "Write the document to FILE (mode 0600) instead of stdout");
  cmd->callback([&options, output] {
    Run(options, [&] {
      RequireHostRoot();
      const rapidjson::Document doc = HoxConfigManager::ExportDocument();
      // The export carries secrets in clear (it must be applicable to another
      // host), so a file is readable by its owner only.
      WritePrivateOutput(FormatJson(doc, options), *output);
      return kExitOk;
    });
  });
}

void RegisterShow(CLI::App& app, GlobalOptions& options) {
  auto* cmd =
      app.add_subcommand("show", "Print an extracted configuration (sensitive values masked)")->fallthrough();
  auto which = std::make_shared<std::string>("current");
  cmd->add_option("what", *which, "current (default), user, desired or smartnic")
      ->check(CLI::IsMember({"current", "user", "desired", "smartnic"}));
  cmd->callback([&options, which] {
    Run(options, [&] {
      RequireHostRoot();
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
      std::cout << FormatJson(doc, options) << std::flush;
      return kExitOk;
    });
  });
}

void RegisterMaintenance(CLI::App& app, GlobalOptions& options) {
  auto* cmd = app.add_subcommand("maintenance", "Enter, exit or show the host's maintenance mode")->fallthrough();
  cmd->require_subcommand(1);
  auto add = [&](const char* name, const char* help, int action) {
    cmd->add_subcommand(name, help)->fallthrough()->callback([&options, action] {
      Run(options, [&] {
        RequireHostRoot();
        if (action >= 0) HoxConfigStore::SetMaintenanceMode(action == 1);
        const bool enabled = HoxConfigManager::IsMaintenanceModeEnabled();
        std::cout << (enabled ? "maintenance mode: entered\n" : "maintenance mode: not entered\n") << std::flush;
        return kExitOk;
      });
    });
  };
  add("enter", "Put the host into maintenance mode", 1);
  add("exit", "Take the host out of maintenance mode", 0);
  add("status", "Print whether the host is in maintenance mode", -1);
}

}  // namespace

void RegisterStoreCommands(CLI::App& app, GlobalOptions& options) {
  RegisterInit(app, options);
  RegisterExport(app, options);
  RegisterShow(app, options);
  RegisterMaintenance(app, options);
}

}  // namespace hoxcfg
