// The framework every hoxcfg command is built on, so that all commands
// behave alike (docs/cli.md is the user's side of these promises).
//
// A command is registered with AddCommand (its one-line summary and its exit
// statuses: the help text lives there and nowhere else; docs/cli.md is checked
// against it) and given its body with SetAction, which applies the global
// options, checks the host root when the command needs a host, runs the body
// and turns every failure into one error line and an exit status:
//
//   - Exit statuses: kExitOk (success, compliant, valid), kExitNegative
//     (drift, invalid, failed, "no"), kExitUsage (unusable input, no host,
//     refused), and the documented extras kExitStaged and kExitAborted.
//   - Errors: throw Failure(what, todo) with a Where for what is wrong where
//     and what to do, or let a library exception through: PrintCurrentError writes
//     "hoxcfg: WHERE: WHAT: TODO", where WHERE is FILE:LINE:COLUMN for a
//     parse fault and "FILE: /document/path" for a value in a document, and
//     library codes appear as "error 2080: <the library's text>". Usage
//     errors carry no code.
//   - Global options (--root, --json, --compact, -y/--yes, -q/--quiet,
//     -v/--verbose) are accepted anywhere on the line and listed under
//     "Global options" in every help text.
//   - Output: Print(options, Answer) prints text, or the documented JSON shape
//     with --json (lists: also when stdout is not a terminal); --quiet prints
//     nothing and lets the exit status answer. Tables align columns; an item
//     is always spelled ItemName(): "/component/group/key[identity]".
//   - Input: ReadJsonArgument / ReadConfigurationDocument read a file or
//     "-" (standard input) and report faults with their location; work on
//     the document runs inside InDocument(path, ...), so that the library's
//     faults in it are reported in that file.
//   - Changes of host state: Confirm() first (asks on a terminal, requires
//     --yes without one, exit 2 when refused), AuditChange() after, which
//     writes "WHAT by USER" to the host's system log.
//   - Long work: MakeTask() gives the library a TaskHandle that shows progress
//     and plugin notifications on a terminal's stderr (not with --json or
//     --quiet), or writes them as JSON lines to --events FILE
//     (AddEventsOption). A command whose work can be aborted holds an
//     InterruptWatch while it runs: Ctrl-C then makes the task report an
//     abort, and the command returns kExitAborted when Interrupted().
//
// A new command, for example:
//
//   auto* cmd = AddCommand(app, "validate", "Validate a desired document",
//                          {{kExitOk, "FILE is valid"}, {kExitNegative, "it is not: each finding is listed"},
//                           {kExitUsage, kUsageStatus}});
//   auto file = std::make_shared<std::string>();
//   cmd->add_option("FILE", *file, "Desired configuration document ('-': standard input)")->required();
//   SetAction(cmd, options, Needs::kHost, [&options, file] {
//     const rapidjson::Document desired = ReadConfigurationDocument(*file);
//     auto result = ...;  // the library call, inside InDocument(*file, [&] { ... })
//     Print(options, {[result] { return text; }, [result] { return CheckShape("findings", ...); }});
//     return valid ? kExitOk : kExitNegative;
//   });
//
// plus its section "## hoxcfg validate" in docs/cli.md (help block, JSON
// example), which the docs test requires.
//
// Everything here runs on the command's thread, except that the library may
// ask a task's IsAborted() from a plugin run's monitor thread.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <CLI/CLI.hpp>

#include <hoxcm/errors.h>
#include <hoxcm/json.h>
#include <hoxcm/operations.h>
#include <hoxcm/task.h>

namespace hoxcfg {

// ---- Exit statuses -------------------------------------------------------

constexpr int kExitOk = 0;          // success; compliant; valid; in maintenance mode
constexpr int kExitNegative = 1;    // drift found; invalid; failed; not in maintenance mode
constexpr int kExitUsage = 2;       // usage error, unusable input, no host, refused
constexpr int kExitStaged = 3;      // the change was staged for the next boot
constexpr int kExitAborted = 130;   // interrupted (128 + SIGINT)

// ---- Global options ------------------------------------------------------

struct GlobalOptions {
  std::string root;      // --root; empty: HOX_ROOT, then "/"
  bool json = false;     // --json: the documented JSON shape
  bool compact = false;  // --compact: JSON on one line
  bool yes = false;      // -y/--yes: confirm changes without asking
  bool quiet = false;    // -q/--quiet: errors only; the exit status answers
  int verbose = 0;       // -v/--verbose, repeatable: more of the library's log
  int exitCode = kExitOk;  // set by the command that ran
};

// ---- Errors --------------------------------------------------------------

// Where a fault lies: a file, a position in it, or a value of a document.
struct Where {
  std::string file;          // as the user named it; "-" is shown as <stdin>
  std::size_t line = 0;      // 1-based; 0 when not known
  std::size_t column = 0;    // 1-based, in characters
  std::string documentPath;  // "/network/dns/config"; empty when not known
};

// A fault in a whole file (missing, unreadable, of the wrong kind).
inline Where InFile(std::string file) {
  Where where;
  where.file = std::move(file);
  return where;
}

// A command's failure: what went wrong, where, and what to do about it.
class Failure : public std::runtime_error {
 public:
  explicit Failure(std::string what, std::string todo = {}, int exitCode = kExitUsage, Where where = {})
      : std::runtime_error(what), todo_(std::move(todo)), exitCode_(exitCode), where_(std::move(where)) {}
  const std::string& todo() const { return todo_; }
  int exitCode() const { return exitCode_; }
  const Where& where() const { return where_; }

 private:
  std::string todo_;
  int exitCode_;
  Where where_;
};

// Writes the error line(s) for the exception being handled (call it inside
// a catch block) and returns the exit status it stands for.
int PrintCurrentError();
// "FILE:LINE:COLUMN", "FILE: /path", "FILE", or "" when nothing is known.
std::string FormatWhere(const Where& where);
// A file name as shown to the user: "-" is "<stdin>".
std::string DisplayName(const std::string& path);

// ---- Commands ------------------------------------------------------------

// Exit statuses of a command, for its help: {{0, "compliant"}, {1, ...}}.
using ExitStatuses = std::vector<std::pair<int, std::string>>;
// The meaning of status 2 shared by every command.
extern const char* const kUsageStatus;

// A subcommand of `parent`; `exitStatuses` become the footer of its help.
CLI::App* AddCommand(CLI::App& parent, const std::string& name, const std::string& summary,
                     const ExitStatuses& exitStatuses = {});

enum class Needs { kNothing, kHost };
// What `command` does once the line is parsed: applies the global options,
// checks the root (Needs::kHost), runs `body` and records its exit status
// (or the failure's) in `options`.
void SetAction(CLI::App* command, GlobalOptions& options, Needs needs, std::function<int()> body);

// Throws Failure "no host at ROOT: run `hoxcfg init --root ROOT`" (exit 2)
// unless the root holds a host (its configuration store).
void RequireHost();
// True when the root holds a host: its configuration store exists.
bool HostExists();

// The whole tool: builds the application with `registrars` (each adds its
// commands), parses the line and runs the command. Returns the exit status.
using Registrar = void (*)(CLI::App& app, GlobalOptions& options);
int RunTool(int argc, char** argv, const std::vector<Registrar>& registrars);

// ---- Output --------------------------------------------------------------

bool StdinIsTerminal();
bool StdoutIsTerminal();
bool StderrIsTerminal();

// A command's answer in its two forms; each is built only when printed.
struct Answer {
  std::function<std::string()> text;          // the readable form, lines ending in '\n'
  std::function<rapidjson::Document()> json;  // the documented shape (docs/cli.md)
  bool list = false;                          // a list: JSON also when stdout is not a terminal
};
// JSON with --json (or for a list when stdout is not a terminal), else the
// text; nothing with --quiet.
void Print(const GlobalOptions& options, const Answer& answer);
// A copy of `value` as a document of its own (for Answer::json).
rapidjson::Document CopyOf(const rapidjson::Value& value);
// The shape of every check: {"valid": <`findings` is empty>, NAME: findings}.
rapidjson::Document CheckShape(const char* name, const rapidjson::Value& findings);
// The validator's findings about `document` (an array of {"field", "errId",
// "errArgs", "error"}) as a check's answer: "DOCUMENT: /field: what is
// wrong" one a line ("DOCUMENT: valid" without any), or CheckShape
// ("findings"). Returns kExitOk without findings, else kExitNegative.
int PrintFindings(const GlobalOptions& options, std::shared_ptr<rapidjson::Document> findings,
                  const std::string& document);
// JSON text, indented by two spaces unless --compact; ends with '\n'.
std::string JsonText(const rapidjson::Value& value, const GlobalOptions& options);
// Writes `text` to stdout, or to `path` (replaced atomically, mode 0600:
// documents carry secrets) when it is not empty or "-".
void WriteOutput(const std::string& text, const std::string& path);

// Columns aligned on the widest cell, two spaces apart.
class Table {
 public:
  explicit Table(std::vector<std::string> header) : rows_{std::move(header)} {}
  void Add(std::vector<std::string> row) { rows_.push_back(std::move(row)); }
  std::string Render() const;

 private:
  std::vector<std::vector<std::string>> rows_;
};

// The one spelling of an item: "/component/group/key", with "[identity]"
// for an instance of a multi-instance key.
std::string ItemName(std::string_view component, std::string_view group, std::string_view key,
                     std::string_view instance = {});
struct ItemRef {
  std::string component, group, key, instance;
};
// Parses ItemName's spelling; nullopt when `text` is not one.
std::optional<ItemRef> ParseItemName(std::string_view text);
// A path of the library's reports ("/c/g/k/2/member", instances by index)
// in the one spelling ("/c/g/k[identity]/member"). Instances are named from
// `desired` (the compared document's root) or, for instances only the host
// has, from the reported value (`hostValue`, JSON text); "[#N]" when neither
// names it.
std::string ReportPathToItemName(const std::string& path, const rapidjson::Value& desired,
                                 const char* hostValue);
// "a reboot", "maintenance mode" or "neither a reboot nor maintenance mode".
const char* Requirement(int impact);
// Adds an error's "id", "args" and "message" to `object`, as every command's
// JSON spells an ErrorInfo.
void AddErrorInfo(rapidjson::Value& object, const HoxConfigManager::ErrorInfo& error,
                  rapidjson::Document::AllocatorType& a);
// Why a document costs what it costs, one object a line and each of its
// reasons below it, paths in the one spelling (`root`: the compared
// document's root). Empty when nothing costs anything.
std::string ReasonsText(const HoxConfigManager::ImpactReasons& reasons, const rapidjson::Value& root);

// ---- Input ---------------------------------------------------------------

// The text of a file argument ("-": standard input), bounded as documents
// are; unreadable files fail with the system's reason.
std::string ReadTextArgument(const std::string& path);
// The parsed JSON of a file argument ("-": standard input). Unreadable files
// fail with the system's reason, malformed JSON with FILE:LINE:COLUMN.
rapidjson::Document ReadJsonArgument(const std::string& path);
// A configuration document: a JSON object that is not a JSON schema.
rapidjson::Document ReadConfigurationDocument(const std::string& path);
// A desired document as it applies to this host: a configuration document
// whose host-specific sections (as an export writes them) are reduced to
// this host's.
rapidjson::Document ReadDesiredDocument(const std::string& path);
// The help of a command's desired-document argument.
extern const char* const kDocumentFileHelp;
// Runs `work` on the document read from `path`: a library error about the
// document that names no file (a wrong type somewhere in it, a document
// path) is reported in that file.
void AttachDocumentFile(HoxConfigStore::ConfigStoreException& error, const std::string& path);
template <typename F>
auto InDocument(const std::string& path, F&& work) {
  try {
    return work();
  } catch (HoxConfigStore::ConfigStoreException& error) {
    AttachDocumentFile(error, path);
    throw;
  }
}
// True for a JSON schema rather than a document: "$schema", or a "type"
// that is a string or array (a document's top-level members are objects),
// or no member but schema keywords.
bool LooksLikeJsonSchema(const rapidjson::Value& value);

// ---- Changes of host state -----------------------------------------------

// Before changing the host: `plan` says what will be done. With --yes goes
// on; on a terminal shows the plan on stderr and asks; without a terminal
// refuses. Refusal throws Failure (exit kExitUsage).
void Confirm(const GlobalOptions& options, const std::string& plan);
// After changing the host: "WHAT [at root R] by USER" in the system log.
void AuditChange(const std::string& what);

// ---- Long work -------------------------------------------------------------

// Adds "--events FILE" to a command that runs long work: progress and
// plugin notifications as JSON lines, one event per line.
void AddEventsOption(CLI::App* command, std::string& eventsPath);
// The task to hand to the library: JSON lines to `eventsPath` when given
// ("-": standard output), else progress on stderr when it is a terminal (not
// with --json or --quiet), else only a line when it waits for another apply. IsAborted() answers whether Ctrl-C
// (SIGINT) or SIGTERM arrived while an InterruptWatch was alive.
std::shared_ptr<HoxConfigManager::TaskHandle> MakeTask(const GlobalOptions& options,
                                                       const std::string& eventsPath = {});

// Percentages of the whole work that a task's progress covers.
struct ProgressRange {
  float from = 0.0f;
  float to = 100.0f;
};
class Reporter;
// One display of progress (as MakeTask chooses it) for work that hands the
// library several tasks: each task covers its part of one bar or one
// stream of events.
class Progress {
 public:
  explicit Progress(const GlobalOptions& options, const std::string& eventsPath = {});
  // A task covering `range` of the whole; its child tasks cover `children`
  // of that range, in the order they are made (any further child: all of it).
  std::shared_ptr<HoxConfigManager::TaskHandle> Task(ProgressRange range = {},
                                                     std::vector<ProgressRange> children = {}) const;
  // Takes the bar off the terminal until the next progress, so that a
  // command's own lines do not run into it.
  void Hide() const;

 private:
  std::shared_ptr<Reporter> reporter_;  // null: silent
};

// While alive, SIGINT and SIGTERM request an abort instead of ending the
// process; a second one only says that the abort is under way (ending the
// process could leave a half-applied change). Not nestable.
class InterruptWatch {
 public:
  InterruptWatch();
  ~InterruptWatch();
  InterruptWatch(const InterruptWatch&) = delete;
  InterruptWatch& operator=(const InterruptWatch&) = delete;
  static bool Interrupted();
};

}  // namespace hoxcfg
