// hoxcfg bootstrap, boot run|complete|status and smartnic set: a host's
// first boot, the boot service's steps (docs/boot.md) and the SmartNIC's
// desired configuration.
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <ctime>
#include <memory>
#include <string>

#include <hoxcm/boot.h>
#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/extraction.h>
#include <hoxcm/files.h>
#include <hoxcm/host.h>
#include <hoxcm/operations.h>

#include "hoxcfg/cli.h"
#include "hoxcfg/commands.h"

namespace hoxcfg {
namespace {

namespace Boot = HoxConfigManager;

// boot status: the boot is not marked complete yet.
constexpr int kExitBootInProgress = 4;

// The boot service's commands leave the library's errors and warnings on
// stderr, which is the journal under systemd, unless -q or -v (or
// HOX_LOG_LEVEL) say otherwise: a boot has nobody watching but the log.
void LogForTheJournal(const GlobalOptions& options) {
  if (!options.quiet && options.verbose == 0 && std::getenv("HOX_LOG_LEVEL") == nullptr) {
    CSLogger::SetThreshold(CSLogger::kWarning);
  }
}

int64_t LastHistorySequence() {
  const auto history = Boot::GetApplyHistory();
  return history.empty() ? 0 : history.back().sequence;
}

// The record the bootstrap just appended; outcome "" when there is none.
Boot::ApplyHistoryRecord BootstrapRecordAfter(int64_t sequence) {
  const auto history = Boot::GetApplyHistory();
  for (auto it = history.rbegin(); it != history.rend() && it->sequence > sequence; ++it) {
    if (it->kind == "bootstrap") return *it;
  }
  return {};
}

// Removes a file when it goes out of scope.
class Scratch {
 public:
  explicit Scratch(std::string path) : path_(std::move(path)) {}
  ~Scratch() {
    if (!path_.empty()) HoxPlatform::RemoveFile(path_);
  }
  Scratch(const Scratch&) = delete;
  Scratch& operator=(const Scratch&) = delete;

 private:
  std::string path_;
};

// A first-boot document is renamed FILE.applied once it is applied or
// staged, so that the bootstrap unit's condition no longer holds.
void Consume(const std::string& path) {
  try {
    HoxPlatform::WriteFileAtomically(path + ".applied", HoxPlatform::ReadFile(path, HoxPlatform::FileKind::Document),
                                     0600, HoxPlatform::Durability::kDurable);
    if (const int rc = HoxPlatform::RemoveFile(path); rc != 0) {
      throw HoxPlatform::FileError("remove", path, rc, std::strerror(rc));
    }
  } catch (const HoxPlatform::FileError& e) {
    throw Failure(e.reason(), "remove FILE by hand, or the next boot bootstraps from it again", kExitNegative,
                  InFile(e.path()));
  }
}

void RegisterBootstrap(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "bootstrap",
                         "Set up the host from a document: apply it now, or stage it for the next boot if it needs a reboot",
                         {{kExitOk, "FILE was applied (or the host already complied with it)"},
                          {kExitNegative, "the bootstrap failed: the log lines on stderr say why"},
                          {kExitUsage, kUsageStatus},
                          {kExitStaged, "FILE needs a reboot: it is staged, the auto-deployment files are kept in the "
                                        "store until the next boot; reboot the host"}});
  auto file = std::make_shared<std::string>();
  auto consume = std::make_shared<bool>(false);
  cmd->add_option("FILE", *file, "Host configuration document")->required();
  cmd->add_flag("--consume", *consume, "Rename FILE to FILE.applied once it is applied or staged (first-boot service)");
  SetAction(cmd, options, Needs::kHost, [&options, file, consume] {
    LogForTheJournal(options);
    const rapidjson::Document doc = ReadConfigurationDocument(*file);
    Confirm(options, "bootstrap the host from " + *file +
                         ": apply it now or, when it needs a reboot, stage it for the next boot and move the "
                         "auto-deployment files into the store");
    // A document with sections per host (an export) is reduced to this
    // host first, into a private file of its own.
    std::string bootPath = *file;
    std::unique_ptr<Scratch> scratch;
    if (doc.IsObject() && doc.HasMember("hostSpecific")) {
      const std::string directory = HoxPlatform::HostPath(HoxPlatform::HostPaths::kLifecycleDirectory);
      HoxPlatform::CreateDirectories(directory);
      bootPath = directory + "/boot-document." + std::to_string(::getpid()) + ".json";
      scratch = std::make_unique<Scratch>(bootPath);
      InDocument(*file, [&] { Boot::CreateMergedBootDocument(*file, bootPath); });
    }
    const int64_t before = LastHistorySequence();
    const int rc = Boot::ApplyBootDocument(bootPath);
    AuditChange("host bootstrapped from " + *file + (rc == 0 ? "" : " (failed)"));
    if (rc != 0) {
      throw Failure("bootstrap from " + *file + " failed", "the log lines above say why", kExitNegative);
    }
    auto record = std::make_shared<Boot::ApplyHistoryRecord>(BootstrapRecordAfter(before));
    if (*consume) Consume(*file);
    Print(options, {[record] {
                      if (record->outcome == "staged") {
                        return std::string("staged for the next boot (it needs a reboot); the auto-deployment files "
                                           "are kept in the store until then\nreboot the host to apply it\n");
                      }
                      if (record->outcome == "nothing to do") return std::string("nothing to do: the host complies\n");
                      return "applied: " + std::to_string(record->runs.size()) + " plugin run(s)\n";
                    },
                    [record] {
                      rapidjson::Document out;
                      Boot::ApplyHistoryRecordToJson(*record, out);
                      return out;
                    }});
    return record->outcome == "staged" ? kExitStaged : kExitOk;
  });
}

const char* StatusName(Boot::BootApplyStatus status) {
  switch (status) {
    case Boot::BOOT_APPLY_SUCCEEDED: return "succeeded";
    case Boot::BOOT_APPLY_FAILED: return "failed";
    case Boot::BOOT_APPLY_IN_PROGRESS: return "in progress";
  }
  return "unknown";
}

// "2024-05-01 12:00:00 +0200": local time, as the boot recorded it.
std::string LocalTime(std::time_t time, const char* format) {
  struct tm local {};
  char text[64] = "";
  if (::localtime_r(&time, &local) != nullptr) std::strftime(text, sizeof text, format, &local);
  return text;
}

Answer BootStatusAnswer(std::shared_ptr<const Boot::BootApplyInfo> info) {
  return {[info] {
            std::string text = std::string("boot-time apply: ") + StatusName(info->status) +
                               (info->status == Boot::BOOT_APPLY_IN_PROGRESS ? " (the boot is not complete)" : "") +
                               "\n";
            for (const Boot::BootApplyErrorInfo& e : info->errors) {
              std::string args;
              for (const std::string& a : e.errorInfo.args) args += (args.empty() ? "" : " ") + a;
              text += "  " + LocalTime(e.time, "%Y-%m-%d %H:%M:%S") + "  " + e.errorInfo.id + " [" + args + "]" +
                      (e.errorInfo.message.empty() ? "" : ": " + e.errorInfo.message) + "\n";
            }
            return text;
          },
          [info] {
            rapidjson::Document out(rapidjson::kObjectType);
            auto& a = out.GetAllocator();
            out.AddMember("status", rapidjson::StringRef(StatusName(info->status)), a);
            out.AddMember("code", static_cast<int>(info->status), a);
            rapidjson::Value errors(rapidjson::kArrayType);
            for (const Boot::BootApplyErrorInfo& e : info->errors) {
              rapidjson::Value entry(rapidjson::kObjectType);
              entry.AddMember("time", static_cast<int64_t>(e.time), a);
              entry.AddMember("localTime", rapidjson::Value(LocalTime(e.time, "%Y-%m-%dT%H:%M:%S%z"), a), a);
              AddErrorInfo(entry, e.errorInfo, a);
              errors.PushBack(entry, a);
            }
            out.AddMember("errors", errors, a);
            return out;
          }};
}

void RegisterBoot(CLI::App& app, GlobalOptions& options) {
  auto* boot = AddCommand(app, "boot", "The boot-time apply: run it, mark the boot complete, show its outcome");
  boot->require_subcommand(1);

  auto* run = AddCommand(*boot, "run",
                         "Apply the configuration staged for the next boot now, as the boot service does; the boot "
                         "is in progress until `boot complete`",
                         {{kExitOk, "the boot-time apply succeeded"},
                          {kExitNegative, "it failed: the log lines on stderr say why, `boot status` lists it"},
                          {kExitUsage, kUsageStatus}});
  SetAction(run, options, Needs::kHost, [&options] {
    LogForTheJournal(options);
    Confirm(options, "apply the configuration staged for the next boot");
    HoxConfigStore::SetBootComplete(false);
    const bool failed = Boot::ExecuteBootPlugins();
    AuditChange(failed ? "boot-time apply run (failed)" : "boot-time apply run");
    Print(options, {[failed] { return std::string("boot-time apply ") + (failed ? "failed\n" : "succeeded\n"); },
                    [failed] {
                      rapidjson::Document out(rapidjson::kObjectType);
                      out.AddMember("succeeded", !failed, out.GetAllocator());
                      return out;
                    }});
    return failed ? kExitNegative : kExitOk;
  });

  auto* complete = AddCommand(*boot, "complete", "Mark the boot complete, so that `boot status` reports its outcome",
                              {{kExitOk, "the boot is marked complete"}, {kExitUsage, kUsageStatus}});
  SetAction(complete, options, Needs::kHost, [&options] {
    HoxConfigStore::SetBootComplete(true);
    AuditChange("boot marked complete");
    Print(options, {[] { return std::string("boot marked complete\n"); },
                    [] {
                      rapidjson::Document out(rapidjson::kObjectType);
                      out.AddMember("bootComplete", true, out.GetAllocator());
                      return out;
                    }});
    return kExitOk;
  });

  auto* status = AddCommand(*boot, "status", "Show the outcome of the last boot-time apply with each failure",
                            {{kExitOk, "it succeeded"},
                             {kExitNegative, "it failed: each failure is listed with its time"},
                             {kExitUsage, kUsageStatus},
                             {kExitBootInProgress, "the boot is not marked complete yet"}});
  SetAction(status, options, Needs::kHost, [&options] {
    const rapidjson::Document record = HoxConfigStore::getBootApplyRecord();
    if (record["isBootComplete"].GetBool() && record["bootApplyRecord"].GetStringLength() == 0) {
      throw Failure("no boot-time apply has been recorded on this host",
                    "run `hoxcfg boot run` (the boot service runs it at every boot)");
    }
    std::shared_ptr<const Boot::BootApplyInfo> info;
    try {
      info = std::make_shared<const Boot::BootApplyInfo>(Boot::GetBootApplyInfo());
    } catch (const HoxConfigStore::ConfigStoreException& e) {
      throw Failure("the boot-apply record is damaged: error " + std::to_string(e.GetErrorCode()) + ": " + e.what(),
                    "the next `hoxcfg boot run` replaces it");
    }
    Print(options, BootStatusAnswer(info));
    switch (info->status) {
      case Boot::BOOT_APPLY_SUCCEEDED: return kExitOk;
      case Boot::BOOT_APPLY_IN_PROGRESS: return kExitBootInProgress;
      default: return kExitNegative;
    }
  });
}

void RegisterSmartnic(CLI::App& app, GlobalOptions& options) {
  auto* smartnic = AddCommand(app, "smartnic", "The desired configuration of the host's SmartNIC");
  smartnic->require_subcommand(1);
  auto* set = AddCommand(*smartnic, "set", "Replace the desired SmartNIC configuration by a document",
                         {{kExitOk, "stored"}, {kExitUsage, kUsageStatus}});
  auto file = std::make_shared<std::string>();
  set->add_option("FILE", *file, "SmartNIC configuration document ('-': standard input)")->required();
  SetAction(set, options, Needs::kHost, [&options, file] {
    const rapidjson::Document doc = ReadConfigurationDocument(*file);
    auto items = std::make_shared<std::size_t>(0);
    HoxConfigManager::DocumentShape::ForEachItem(HoxConfigManager::DocumentShape::Unwrap(doc),
                                                 [&items](const auto&) { ++*items; });
    Confirm(options, "replace the desired SmartNIC configuration with " + DisplayName(*file) + " (" +
                         std::to_string(*items) + " items)");
    InDocument(*file, [&] { Boot::SetSmartnicConfiguration(HoxConfigManager::JsonToString(doc)); });
    AuditChange("desired SmartNIC configuration replaced from " + DisplayName(*file));
    Print(options, {[items] {
                      return "desired SmartNIC configuration replaced: " + std::to_string(*items) +
                             (*items == 1 ? " item\n" : " items\n");
                    },
                    [items] {
                      rapidjson::Document out(rapidjson::kObjectType);
                      out.AddMember("items", static_cast<uint64_t>(*items), out.GetAllocator());
                      return out;
                    }});
    return kExitOk;
  });
}

}  // namespace

void RegisterBootCommands(CLI::App& app, GlobalOptions& options) {
  RegisterBootstrap(app, options);
  RegisterBoot(app, options);
  RegisterSmartnic(app, options);
}

}  // namespace hoxcfg
