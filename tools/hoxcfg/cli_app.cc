// The application: global options, help layout, usage errors with the
// closest command, the root check and the error printer.
#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <iostream>
#include <sstream>

#include <hoxcm/errors.h>
#include <hoxcm/files.h>
#include <hoxcm/host.h>

#include "hoxcfg/cli.h"

namespace hoxcfg {

const char* const kUsageStatus = "usage error, unusable input, no host at the root, or refused";

namespace {

constexpr const char* kGlobalGroup = "Global options";
constexpr const char* kCommandGroup = "Commands";

const CLI::App* RootOf(const CLI::App* app) {
  while (app->get_parent() != nullptr) app = app->get_parent();
  return app;
}

// The default layout, plus the root's global options on every subcommand's
// help: they are accepted anywhere on the line.
class HelpFormatter final : public CLI::Formatter {
 public:
  // A positional whose option text is set shows that text in the usage
  // line ("[SCHEMA] DOCUMENT" rather than "FILES(1x)").
  std::string make_option_usage(const CLI::Option* opt) const override {
    return opt->get_option_text().empty() ? CLI::Formatter::make_option_usage(opt) : opt->get_option_text();
  }
  std::string make_help(const CLI::App* app, std::string name, CLI::AppFormatMode mode) const override {
    if (mode == CLI::AppFormatMode::Sub) return make_expanded(app);
    std::ostringstream out;
    out << make_description(app) << make_usage(app, name) << make_positionals(app) << make_groups(app, mode)
        << make_subcommands(app, mode);
    if (app->get_parent() != nullptr) {
      // Named here, described once in the help of hoxcfg itself.
      const CLI::App* root = RootOf(app);
      std::string names;
      for (const CLI::Option* o : root->get_options([](const CLI::Option* o) { return o->get_group() == kGlobalGroup; })) {
        if (o == root->get_help_ptr() || o->check_name("--version")) continue;
        names += (names.empty() ? "" : ", ") + o->get_name(false, true) +
                 (o->get_expected_min() > 0 ? " " + o->get_type_name() : std::string());
      }
      out << "\n" << kGlobalGroup << " (see hoxcfg --help):\n  " << names << "\n";
    }
    out << '\n' << make_footer(app);
    return out.str();
  }
};

// Optimal string alignment distance: "complaince" is one step from
// "compliance".
std::size_t EditDistance(const std::string& a, const std::string& b) {
  std::vector<std::vector<std::size_t>> d(a.size() + 1, std::vector<std::size_t>(b.size() + 1));
  for (std::size_t i = 0; i <= a.size(); ++i) d[i][0] = i;
  for (std::size_t j = 0; j <= b.size(); ++j) d[0][j] = j;
  for (std::size_t i = 1; i <= a.size(); ++i) {
    for (std::size_t j = 1; j <= b.size(); ++j) {
      d[i][j] = std::min({d[i - 1][j] + 1, d[i][j - 1] + 1, d[i - 1][j - 1] + (a[i - 1] == b[j - 1] ? 0 : 1)});
      if (i > 1 && j > 1 && a[i - 1] == b[j - 2] && a[i - 2] == b[j - 1]) d[i][j] = std::min(d[i][j], d[i - 2][j - 2] + 1);
    }
  }
  return d[a.size()][b.size()];
}

std::string CommandPath(const CLI::App* app) {
  std::string path;
  for (; app != nullptr; app = app->get_parent()) path = app->get_name() + (path.empty() ? "" : " " + path);
  return path;
}

const CLI::Option* FindOption(const CLI::App* level, const std::string& name) {
  for (; level != nullptr; level = level->get_parent()) {
    if (const CLI::Option* o = level->get_option_no_throw(name)) return o;
  }
  return nullptr;
}

// Walks the line as the parser would and finds the first word that stands
// where a command is expected but names none. Returns its level, or null.
const CLI::App* FindUnknownCommand(const CLI::App& app, int argc, char** argv, std::string& word) {
  const CLI::App* level = &app;
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    if (arg == "--") return nullptr;
    if (arg.size() > 1 && arg[0] == '-') {
      const CLI::Option* option = FindOption(level, arg.substr(0, arg.find('=')));
      if (option != nullptr && option->get_expected_min() > 0 && arg.find('=') == std::string::npos) ++i;
      continue;
    }
    const auto subs = level->get_subcommands([&arg](const CLI::App* s) { return s->check_name(arg); });
    if (!subs.empty()) {
      level = subs.front();
      continue;
    }
    const bool takesPositionals = !level->get_options([](const CLI::Option* o) { return o->get_positional(); }).empty();
    if (level->get_subcommands({}).empty() || takesPositionals) return nullptr;
    word = arg;
    return level;
  }
  return nullptr;
}

void PrintUsageError(const CLI::App& app, const CLI::ParseError& error, int argc, char** argv) {
  std::string word;
  if (const CLI::App* level = FindUnknownCommand(app, argc, argv, word)) {
    std::string best;
    std::size_t bestDistance = std::string::npos;
    for (const CLI::App* sub : level->get_subcommands({})) {
      const std::string& name = sub->get_name();
      const std::size_t d = name.rfind(word, 0) == 0 || word.rfind(name, 0) == 0 ? 1 : EditDistance(word, name);
      if (d < bestDistance) {
        bestDistance = d;
        best = name;
      }
    }
    const std::string where = CommandPath(level);
    std::cerr << "hoxcfg: unknown command '" << word << "'"
              << (level != &app ? " for '" + where + "'" : std::string())
              << (bestDistance <= std::max<std::size_t>(2, word.size() / 3) ? ": did you mean '" + best + "'?"
                                                                            : ": run '" + where + " --help' for the commands")
              << "\n";
    return;
  }
  const CLI::App* failed = &app;
  while (!failed->get_subcommands().empty()) failed = failed->get_subcommands().front();
  const std::string where = CommandPath(failed);
  std::string what = error.what();
  if (what == "A subcommand is required") what = "a command is required";
  std::cerr << where << ": " << what << ": run '" << where << " --help'\n";
}

// Library codes whose remedy is known; the location says the rest.
std::string RemedyFor(int code) {
  switch (code) {
    case HoxConfigStore::ConfigStoreException::kConfigStoreError:
      return "a value has the wrong type; `hoxcfg schema-check --host` on the document says which";
    case HoxConfigManager::SchemaStoreAccessFailed:
      return "check the schemas with `hoxcfg schemas`";
    case HoxConfigManager::HostNotInMaintenanceMode:
      return "run `hoxcfg maintenance enter` first";
    case HoxConfigManager::ImpactResultNotApplicable:
      return "the host changed since its verdict: run the command again for a new plan";
    case HoxConfigManager::PendingDesiredConfiguration:
      return "a change staged for the next boot waits (`hoxcfg show desired`): reboot the host first";
    case HoxConfigManager::NotUserConfiguration:
      return "the host keeps this item out of its user configuration";
    default:
      return std::string();
  }
}

void PrintErrorLine(const std::string& where, const std::string& what, const std::string& todo) {
  std::string line = "hoxcfg: ";
  if (!where.empty()) line += where + ": ";
  line += what;
  if (!todo.empty()) line += ": " + todo;
  std::cerr << line << '\n' << std::flush;
}

void ApplyGlobalOptions(GlobalOptions& options) {
  if (!options.root.empty()) {
    // Absolute, so that the runners (which find the root from their own
    // path) and the audit line agree with what the user meant.
    std::error_code ec;
    const auto absolute = std::filesystem::absolute(options.root, ec);
    if (!ec) options.root = absolute.lexically_normal().string();
    ::setenv("HOX_ROOT", options.root.c_str(), 1);
  }
  // The library's log is for diagnosis: the tool says itself what went
  // wrong, and some lines the library logs as errors are not failures. On a
  // terminal it stays silent unless -v (or HOX_LOG_LEVEL) asks for it; under
  // systemd (or HOX_LOG_JOURNAL=1) the journal keeps its information lines.
  if (options.verbose > 0 && !options.quiet) {
    CSLogger::SetThreshold(options.verbose == 1 ? CSLogger::kInfo : CSLogger::kDetail);
  } else if (std::getenv("HOX_LOG_LEVEL") == nullptr && CSLogger::WritesToJournal()) {
    CSLogger::SetThreshold(CSLogger::kInfo);
  } else if (options.quiet || std::getenv("HOX_LOG_LEVEL") == nullptr) {
    CSLogger::SetThreshold(-1);
  }
}

}  // namespace

std::string DisplayName(const std::string& path) { return path == "-" ? "<stdin>" : path; }

std::string FormatWhere(const Where& where) {
  std::string text = where.file.empty() ? std::string() : DisplayName(where.file);
  // A position in a text that came from no file (a store row) means nothing
  // to the reader; the reason still says what is wrong.
  if (where.line > 0 && !text.empty()) {
    text += ":" + std::to_string(where.line) + ":" + std::to_string(where.column);
  } else if (!where.documentPath.empty()) {
    text += (text.empty() ? "" : ": ") + where.documentPath;
  }
  return text;
}

int PrintCurrentError() {
  try {
    throw;
  } catch (const Failure& f) {
    PrintErrorLine(FormatWhere(f.where()), f.what(), f.todo());
    return f.exitCode();
  } catch (const HoxConfigStore::ConfigStoreException& e) {
    Where where;
    std::string what = "error " + std::to_string(e.GetErrorCode()) + ": " + e.what();
    if (const HostCtl::Lib::ErrorLocation* location = e.GetLocation()) {
      where = Where{location->file, location->line, location->column, location->documentPath};
      if (!location->reason.empty()) what += ": " + location->reason;
    }
    PrintErrorLine(FormatWhere(where), what, RemedyFor(e.GetErrorCode()));
  } catch (const HoxPlatform::FileError& e) {
    PrintErrorLine(DisplayName(e.path()), e.reason(), "");
  } catch (const HoxConfigManager::ErrorInfo& e) {
    // A plugin's failure, thrown as is by the library: the work failed.
    PrintErrorLine("", "error " + e.id + (e.message.empty() ? std::string() : ": " + e.message), "");
    return kExitNegative;
  } catch (const std::exception& e) {
    PrintErrorLine("", e.what(), "");
  } catch (...) {
    PrintErrorLine("", "unknown error", "");
  }
  return kExitUsage;
}

CLI::App* AddCommand(CLI::App& parent, const std::string& name, const std::string& summary,
                     const ExitStatuses& exitStatuses) {
  CLI::App* command = parent.add_subcommand(name, summary);
  command->group(kCommandGroup);
  if (!exitStatuses.empty()) {
    std::string footer = "Exit status:";
    for (const auto& [status, meaning] : exitStatuses) footer += "\n  " + std::to_string(status) + "  " + meaning;
    command->footer(footer);
  }
  return command;
}

void SetAction(CLI::App* command, GlobalOptions& options, Needs needs, std::function<int()> body) {
  command->callback([&options, needs, body = std::move(body)] {
    try {
      ApplyGlobalOptions(options);
      if (needs == Needs::kHost) RequireHost();
      options.exitCode = body();
    } catch (...) {
      options.exitCode = PrintCurrentError();
    }
  });
}

bool HostExists() {
  std::error_code ec;
  return std::filesystem::is_regular_file(HoxPlatform::HostPath(HoxPlatform::HostPaths::kStore), ec);
}

void RequireHost() {
  const std::string root = HoxPlatform::HostRoot();
  if (!HostExists()) {
    throw Failure("no host at " + root, "run `hoxcfg init --root " + root + "`");
  }
}

int RunTool(int argc, char** argv, const std::vector<Registrar>& registrars) {
  CLI::App app{"hoxcfg: keep this host's configuration in its desired state", "hoxcfg"};
  auto formatter = std::make_shared<HelpFormatter>();
  formatter->label("SUBCOMMAND", "COMMAND");
  formatter->label("SUBCOMMANDS", "COMMANDS");
  app.formatter(formatter);
  app.fallthrough();  // inherited by every subcommand: global options go anywhere
  app.require_subcommand(1);
  app.set_help_flag("-h,--help", "Print the help of hoxcfg or of a command and exit")->group(kGlobalGroup);
  app.set_version_flag("--version", "hoxcfg " HOXCM_VERSION, "Print the version and exit")->group(kGlobalGroup);
  GlobalOptions options;
  app.add_option("--root", options.root, "The host lives below DIR (default: $HOX_ROOT, then /)")
      ->envname("HOX_ROOT")
      ->type_name("DIR")
      ->group(kGlobalGroup);
  app.add_flag("--json", options.json, "Print the documented JSON shape instead of text (docs/cli.md)")
      ->group(kGlobalGroup);
  app.add_flag("--compact", options.compact, "Print JSON on one line")->group(kGlobalGroup);
  app.add_flag("-y,--yes", options.yes, "Change the host without asking (required without a terminal)")
      ->group(kGlobalGroup);
  app.add_flag("-q,--quiet", options.quiet, "Print errors only: the exit status answers")->group(kGlobalGroup);
  app.add_flag("-v,--verbose", options.verbose, "Show the library's log on stderr (-vv: every detail)")
      ->group(kGlobalGroup);
  for (Registrar add : registrars) add(app, options);

  try {
    app.parse(argc, argv);
  } catch (const CLI::CallForHelp& e) {
    return app.exit(e);
  } catch (const CLI::CallForAllHelp& e) {
    return app.exit(e);
  } catch (const CLI::CallForVersion& e) {
    return app.exit(e);
  } catch (const CLI::ParseError& e) {
    PrintUsageError(app, e, argc, argv);
    return kExitUsage;
  }
  return options.exitCode;
}

}  // namespace hoxcfg
