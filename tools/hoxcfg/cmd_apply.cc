// hoxcfg plan, apply and history: what applying a desired document would
// do, doing it, and what earlier applies did.
#include <algorithm>
#include <ctime>
#include <memory>
#include <string>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/operations.h>

#include "hoxcfg/cli.h"
#include "hoxcfg/commands.h"

namespace hoxcfg {
namespace {

using HoxConfigManager::ApplyResult;
using HoxConfigManager::CheckApplyResult;
using HoxConfigManager::DesiredConfigInput;
using HoxConfigManager::ErrorInfo;
using HoxConfigManager::IMPACT_TYPE;
using HoxConfigManager::PlannedRun;
using rapidjson::Value;

constexpr const char* kAbortedId = "com.tarvik.hox.settings.apply.plugin.aborted";

const char* ImpactName(IMPACT_TYPE impact) {
  switch (impact) {
    case HoxConfigManager::IMPACT_MAINTENANCE_MODE_REQUIRED: return "maintenance-mode";
    case HoxConfigManager::IMPACT_REBOOT_REQUIRED: return "reboot";
    default: return "none";
  }
}

std::string ItemOf(const HoxConfigStore::ConfigStoreObjectId& id) {
  return ItemName(id.component, id.group, id.key, id.instanceId);
}
// What plan and apply show before anything changes: the verdict with its
// reasons and the plugin runs, for the document as it applies to this host.
struct Preview {
  std::string file;
  rapidjson::Document desired;
  std::shared_ptr<CheckApplyResult> check;  // null: the host complies
  HoxConfigManager::ImpactReasons reasons;
  HoxConfigManager::ApplyPlan plan;
  std::string digest;

};

std::shared_ptr<Preview> Prepare(const std::string& file, const std::shared_ptr<HoxConfigManager::TaskHandle>& task) {
  auto p = std::make_shared<Preview>();
  p->file = file;
  p->desired = ReadDesiredDocument(file);
  InDocument(file, [&] {
    p->check = HoxConfigManager::CheckApply(p->desired, "", task, &p->reasons);
    if (p->check) p->plan = HoxConfigManager::PlanApply(p->desired);
  });
  p->digest = HoxConfigManager::DocumentDigest(p->check ? p->check->document : p->desired);
  return p;
}

// "      ADD     /network/firewall/rules[web]", one line per change.
std::string ChangesText(const std::vector<DesiredConfigInput>& inputs) {
  std::string out;
  for (const DesiredConfigInput& input : inputs) {
    std::string action = input.action;
    action.resize(std::max<std::size_t>(action.size(), 8), ' ');
    out += "      " + action + ItemOf(input.object->GetConfigStoreObjectId()) + "\n";
  }
  return out;
}

std::string RunsText(const std::vector<PlannedRun>& runs, bool numbered) {
  std::string out;
  for (std::size_t i = 0; i < runs.size(); ++i) {
    out += "  " + (numbered ? std::to_string(i + 1) + ". " : std::string()) + runs[i].pluginId + "  (" +
           runs[i].key + ")\n";
    out += ChangesText(runs[i].inputs);
  }
  return out;
}

std::string PreviewText(const Preview& p) {
  if (!p.check) return "compliant: the host already has " + DisplayName(p.file) + "\n";
  static const char* const kVerdicts[] = {"applies now, nothing else needed", "maintenance mode required",
                                          "reboot required: staged for the next boot"};
  std::string out = "not compliant with " + DisplayName(p.file) + "\nverdict: " + kVerdicts[p.check->impact] +
                    "\ndocument " + p.digest + "\n";
  out += ReasonsText(p.reasons, HoxConfigManager::DocumentShape::Unwrap(p.desired));
  out += p.check->impact == HoxConfigManager::IMPACT_REBOOT_REQUIRED
             ? "apply stages the document for the next boot; no plugin runs now. The changes:\n"
             : "plugin runs, in order:\n";
  out += RunsText(p.plan.runs, true);
  if (p.plan.runs.empty()) out += "  (none)\n";
  if (!p.plan.neverRun.empty()) {
    out += "never run (no entry of the plugins' dependency order names them):\n" + RunsText(p.plan.neverRun, false);
  }
  if (!p.plan.unowned.empty()) {
    out += "owned by no plugin (left as they are):\n" + ChangesText(p.plan.unowned);
  }
  return out;
}

Value RunsJson(const std::vector<PlannedRun>& runs, rapidjson::Document::AllocatorType& a) {
  Value list(rapidjson::kArrayType);
  for (const PlannedRun& run : runs) {
    Value entry(rapidjson::kObjectType);
    entry.AddMember("plugin", Value(run.pluginId, a), a);
    entry.AddMember("key", Value(run.key, a), a);
    Value changes(rapidjson::kArrayType);
    for (const DesiredConfigInput& input : run.inputs) {
      Value change(rapidjson::kObjectType);
      change.AddMember("action", Value(input.action, a), a);
      change.AddMember("item", Value(ItemOf(input.object->GetConfigStoreObjectId()), a), a);
      changes.PushBack(change, a);
    }
    entry.AddMember("changes", changes, a);
    list.PushBack(entry, a);
  }
  return list;
}

rapidjson::Document PreviewJson(const Preview& p) {
  rapidjson::Document out(rapidjson::kObjectType);
  auto& a = out.GetAllocator();
  out.AddMember("compliant", !p.check, a);
  out.AddMember("document", Value(p.digest, a), a);
  if (!p.check) return out;
  out.AddMember("impact", static_cast<int>(p.check->impact), a);
  Value reasons;
  HoxConfigManager::ImpactReasonsToJson(p.reasons, reasons, a);
  out.AddMember("reasons", reasons, a);
  out.AddMember("runs", RunsJson(p.plan.runs, a), a);
  out.AddMember("neverRun", RunsJson(p.plan.neverRun, a), a);
  Value unowned(rapidjson::kArrayType);
  for (const DesiredConfigInput& input : p.plan.unowned) {
    Value change(rapidjson::kObjectType);
    change.AddMember("action", Value(input.action, a), a);
    change.AddMember("item", Value(ItemOf(input.object->GetConfigStoreObjectId()), a), a);
    unowned.PushBack(change, a);
  }
  out.AddMember("unowned", unowned, a);
  return out;
}

// One line of the JSON event stream on standard output: {"event": ..., body}.
void PrintEvent(const char* event, const rapidjson::Document& body) {
  rapidjson::Document line(rapidjson::kObjectType);
  auto& a = line.GetAllocator();
  line.AddMember("event", rapidjson::StringRef(event), a);
  for (const auto& member : body.GetObject()) line.AddMember(Value(member.name, a), Value(member.value, a), a);
  std::cout << HoxConfigManager::JsonToString(line) << '\n' << std::flush;
}

// An abort while the verdict was computed or the host was waited for.
bool AbortedCheck(const ErrorInfo& e) {
  return InterruptWatch::Interrupted() && e.id.size() > 8 && e.id.compare(e.id.size() - 8, 8, ".aborted") == 0;
}

void RegisterPlan(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "plan", "Show what applying a desired document would do, without doing it",
                         {{kExitOk, "the host complies with FILE: nothing to do"},
                          {kExitNegative, "it does not: the verdict, its reasons and the plugin runs are listed"},
                          {kExitUsage, kUsageStatus},
                          {kExitAborted, "interrupted (Ctrl-C)"}});
  auto file = std::make_shared<std::string>();
  auto events = std::make_shared<std::string>();
  cmd->add_option("FILE", *file, kDocumentFileHelp)->required();
  AddEventsOption(cmd, *events);
  SetAction(cmd, options, Needs::kHost, [&options, file, events] {
    InterruptWatch watch;
    std::shared_ptr<Preview> preview;
    try {
      preview = Prepare(*file, MakeTask(options, *events));
    } catch (const ErrorInfo& e) {
      if (!AbortedCheck(e)) throw;
      throw Failure("aborted: nothing was changed", "", kExitAborted);
    }
    Print(options, {[preview] { return PreviewText(*preview); }, [preview] { return PreviewJson(*preview); }});
    return preview->check ? kExitNegative : kExitOk;
  });
}

// What became of an apply, in words, and its exit status.
struct Outcome {
  std::string word;  // as the apply history says it
  std::string text;
  int exitCode;
};

Outcome OutcomeOf(const Preview& p, const ApplyResult& result) {
  const std::string file = DisplayName(p.file);
  if (result.status == HoxConfigManager::APPLY_PENDING_REBOOT) {
    return {"staged", "staged for the next boot: " + file + " takes effect when the host reboots", kExitStaged};
  }
  const ErrorInfo& e = result.errorInfo;
  if (e.id == kAbortedId || (InterruptWatch::Interrupted() && !e.id.empty())) {
    return {"aborted", "aborted: plugins that finished before the abort keep their changes", kExitAborted};
  }
  if (!e.id.empty()) {
    std::string what = "failed: error " + e.id;
    for (const std::string& arg : e.args) what += " " + arg;
    if (!e.message.empty()) what += ": " + e.message;
    return {"failed", what + "\nplugins that ran before it keep their changes; `hoxcfg plan " + file +
                          "` shows what is left",
            kExitNegative};
  }
  const std::string mm = result.status == HoxConfigManager::APPLY_COMPLETED_IN_MAINTENANCE_MODE
                             ? " (in maintenance mode)"
                             : "";
  return {"applied", "applied " + file + mm, kExitOk};
}

void RegisterApply(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "apply", "Apply a desired document to the host, after showing what it will do",
                         {{kExitOk, "applied, or nothing to do"},
                          {kExitNegative, "a plugin failed: its error is printed; earlier plugins' changes stay"},
                          {kExitUsage, kUsageStatus + std::string(" (the verdict changed, or maintenance mode is "
                                                                   "required and not entered)")},
                          {kExitStaged, "the change needs a reboot: staged for the next boot"},
                          {kExitAborted, "interrupted (Ctrl-C): the running plugin was stopped"}});
  auto file = std::make_shared<std::string>();
  auto events = std::make_shared<std::string>();
  cmd->add_option("FILE", *file, kDocumentFileHelp)->required();
  AddEventsOption(cmd, *events);
  SetAction(cmd, options, Needs::kHost, [&options, file, events] {
    InterruptWatch watch;
    // With --json, standard output is the event stream: the plan, the
    // progress and notifications, the result.
    const Progress progress(options, events->empty() && options.json ? "-" : *events);
    std::shared_ptr<Preview> preview;
    try {
      preview = Prepare(*file, progress.Task({0, 10}));
    } catch (const ErrorInfo& e) {
      if (!AbortedCheck(e)) throw;
      throw Failure("aborted: nothing was changed", "", kExitAborted);
    }
    progress.Hide();
    if (options.json) {
      PrintEvent("plan", PreviewJson(*preview));
    } else if (!options.quiet) {
      std::cout << PreviewText(*preview) << std::flush;
    }
    const auto finish = [&options, &progress](const Outcome& outcome, const ApplyResult* result) {
      progress.Hide();
      if (options.json) {
        rapidjson::Document body(rapidjson::kObjectType);
        auto& a = body.GetAllocator();
        body.AddMember("outcome", Value(outcome.word, a), a);
        body.AddMember("status", result ? static_cast<int>(result->status) : 0, a);
        body.AddMember("exitCode", outcome.exitCode, a);
        if (result && !result->errorInfo.id.empty()) {
          Value error(rapidjson::kObjectType);
          AddErrorInfo(error, result->errorInfo, a);
          body.AddMember("error", error, a);
        }
        PrintEvent("result", body);
      } else if (outcome.exitCode == kExitNegative) {
        std::cerr << "hoxcfg: " << outcome.text << '\n' << std::flush;
      } else if (!options.quiet) {
        std::cout << outcome.text << '\n' << std::flush;
      }
      return outcome.exitCode;
    };
    if (!preview->check) return finish({"nothing to do", "nothing to do", kExitOk}, nullptr);

    try {
      const std::size_t runs = preview->plan.runs.size();
      const IMPACT_TYPE impact = preview->check->impact;
      Confirm(options, "apply " + DisplayName(*file) + ": " +
                           (impact == HoxConfigManager::IMPACT_REBOOT_REQUIRED
                                ? "staged for the next boot"
                                : std::to_string(runs) + (runs == 1 ? " plugin run" : " plugin runs") +
                                      (impact == HoxConfigManager::IMPACT_MAINTENANCE_MODE_REQUIRED
                                           ? " in maintenance mode"
                                           : "")));
    } catch (const Failure&) {
      if (InterruptWatch::Interrupted()) throw Failure("aborted: nothing was changed", "", kExitAborted);
      throw;
    }
    // The verdict is computed again under the host lock: the host may have
    // changed while the plan was read.
    const ApplyResult result =
        HoxConfigManager::Apply(preview->check, progress.Task({10, 100}, {{0, 15}, {15, 100}}));
    const Outcome outcome = OutcomeOf(*preview, result);
    AuditChange("apply of " + DisplayName(*file) + " (" + preview->digest + "): " + outcome.word);
    return finish(outcome, &result);
  });
}

std::string TimeText(int64_t seconds) {
  const std::time_t t = static_cast<std::time_t>(seconds);
  std::tm utc{};
  char text[32] = "?";
  if (::gmtime_r(&t, &utc) != nullptr) std::strftime(text, sizeof text, "%Y-%m-%d %H:%M:%SZ", &utc);
  return text;
}

std::string HistoryText(const std::vector<HoxConfigManager::ApplyHistoryRecord>& records) {
  if (records.empty()) return "no apply recorded yet\n";
  Table table({"#", "STARTED (UTC)", "KIND", "OUTCOME", "VERDICT", "RUNS", "SECONDS", "DOCUMENT"});
  std::string details;
  for (const auto& r : records) {
    char seconds[32];
    std::snprintf(seconds, sizeof seconds, "%.2f", r.seconds);
    table.Add({std::to_string(r.sequence), TimeText(r.startedAt), r.kind, r.outcome,
               r.judged ? (r.compliant ? "compliant" : ImpactName(r.impact)) : "-", std::to_string(r.runs.size()),
               seconds, r.document.substr(0, 19)});
  }
  std::string out = table.Render();
  for (const auto& r : records) {
    std::string lines;
    for (const auto& run : r.runs) {
      if (!run.outcome.id.empty()) lines += "    plugin " + run.pluginId + ": " + run.outcome.id + "\n";
    }
    if (r.errorCode != 0) lines += "    error " + std::to_string(r.errorCode) + ": " + r.errorText + "\n";
    if (!lines.empty()) out += "#" + std::to_string(r.sequence) + ":\n" + lines;
  }
  return out;
}

void RegisterHistory(CLI::App& app, GlobalOptions& options) {
  auto* cmd = AddCommand(app, "history", "List the applies and boot-time runs recorded on this host, oldest first",
                         {{kExitOk, "listed"}, {kExitUsage, kUsageStatus}});
  SetAction(cmd, options, Needs::kHost, [&options] {
    auto records = std::make_shared<std::vector<HoxConfigManager::ApplyHistoryRecord>>(
        HoxConfigManager::GetApplyHistory());
    Print(options, {[records] { return HistoryText(*records); },
                    [records] {
                      rapidjson::Document out(rapidjson::kObjectType);
                      auto& a = out.GetAllocator();
                      Value list(rapidjson::kArrayType);
                      for (const auto& record : *records) {
                        rapidjson::Document one;
                        HoxConfigManager::ApplyHistoryRecordToJson(record, one);
                        list.PushBack(Value(one, a), a);
                      }
                      out.AddMember("records", list, a);
                      return out;
                    },
                    true});
    return kExitOk;
  });
}

}  // namespace

void RegisterApplyCommands(CLI::App& app, GlobalOptions& options) {
  RegisterPlan(app, options);
  RegisterApply(app, options);
  RegisterHistory(app, options);
}

}  // namespace hoxcfg
