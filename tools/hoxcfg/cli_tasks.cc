// Changes and long work: confirmation, the audit line, Ctrl-C as an abort,
// and the task handles that show progress on a terminal or write JSON lines.
#include <fcntl.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <iostream>
#include <list>
#include <mutex>
#include <string_view>
#include <vector>

#include <hoxcm/host.h>
#include <hoxcm/operations.h>

#include "hoxcfg/cli.h"

namespace hoxcfg {

// Where a task's events go.
class Reporter {
 public:
  virtual ~Reporter() = default;
  virtual void Progress(float percent) = 0;
  // kind: "info", "warning" or "error"
  virtual void Notice(const char* kind, const std::string& id, const std::list<std::string>& args,
                      const std::string& message) = 0;
  virtual void Hide() {}
};

namespace {

using HoxConfigManager::ErrorInfo;
using HoxConfigManager::TaskHandle;

std::atomic<bool>& InterruptFlag() {
  static std::atomic<bool> flag{false};
  return flag;
}

// The first signal requests the abort; later ones change nothing, since
// ending the process could leave a half-applied change behind.
extern "C" void OnInterrupt(int) {
  if (InterruptFlag().exchange(true)) {
    static const char kAgain[] = "\nhoxcfg: already stopping: waiting for the running plugin to end\n";
    [[maybe_unused]] const ssize_t n = ::write(STDERR_FILENO, kAgain, sizeof kAgain - 1);
  }
}

// One write per line: lines of the monitor thread and of the command's
// thread never interleave.
void WriteAll(int fd, const std::string& text) {
  for (std::size_t done = 0; done < text.size();) {
    const ssize_t n = ::write(fd, text.data() + done, text.size() - done);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) return;  // a closed terminal or pipe: progress is not worth failing for
    done += static_cast<std::size_t>(n);
  }
}

// A bar on the terminal's stderr, redrawn in place; notices print above it.
class TerminalReporter final : public Reporter {
 public:
  ~TerminalReporter() override { Hide(); }
  void Hide() override {
    std::lock_guard<std::mutex> lock(mutex_);
    if (drawn_) WriteAll(STDERR_FILENO, "\r\033[K");
    drawn_ = false;
  }
  void Progress(float percent) override {
    std::lock_guard<std::mutex> lock(mutex_);
    percent_ = std::isfinite(percent) ? std::clamp(percent, 0.0f, 100.0f) : 0.0f;
    Draw();
  }
  void Notice(const char* kind, const std::string& id, const std::list<std::string>& args,
              const std::string& message) override {
    std::lock_guard<std::mutex> lock(mutex_);
    // The bar names the plugin that runs, between its start and its end.
    if (EndsWith(id, ".plugin.started") && args.size() == 1) {
      running_ = args.front();
    } else if (id.find(".plugin.") != std::string::npos) {
      running_.clear();
    }
    std::string line = "\r\033[K" + Describe(kind, id, args, message) + "\n";
    WriteAll(STDERR_FILENO, line);
    if (drawn_) Draw();
  }

 private:
  static bool EndsWith(const std::string& s, std::string_view end) {
    return s.size() >= end.size() && s.compare(s.size() - end.size(), end.size(), end) == 0;
  }
  // "com.tarvik.hox.settings.apply.plugin.started" with ["net"] reads
  // "apply: plugin net started"; other identifiers are shown as they are.
  static std::string Describe(const char* kind, const std::string& id, const std::list<std::string>& args,
                              const std::string& message) {
    static constexpr std::string_view kPrefix = "com.tarvik.hox.settings.";
    if (id == HoxConfigManager::kApplyWaitingForHost) return "hoxcfg: waiting for another apply to finish";
    std::string text = std::string(kind) == "info" ? "" : std::string(kind) + ": ";
    const std::size_t plugin = id.find(".plugin.");
    if (id.rfind(kPrefix, 0) == 0 && plugin != std::string::npos && args.size() == 1) {
      std::string event = id.substr(plugin + 8);
      std::replace(event.begin(), event.end(), '.', ' ');
      text += id.substr(kPrefix.size(), plugin - kPrefix.size()) + ": plugin " + args.front() + " " + event;
    } else {
      text += id;
      for (const std::string& arg : args) text += " " + arg;
    }
    if (!message.empty()) text += ": " + message;
    return "hoxcfg: " + text;
  }
  void Draw() {
    constexpr int kWidth = 30;
    const int filled = static_cast<int>(percent_ * kWidth / 100.0f);
    char percent[16];
    std::snprintf(percent, sizeof percent, "%3d%%", static_cast<int>(percent_));
    WriteAll(STDERR_FILENO, "\r\033[K[" + std::string(filled, '#') + std::string(kWidth - filled, ' ') + "] " + percent +
                                (running_.empty() ? std::string() : "  " + running_));
    drawn_ = true;
  }
  std::mutex mutex_;  // guards the three below and the terminal line
  float percent_ = 0;
  bool drawn_ = false;
  std::string running_;
};

// One JSON object per line: {"event":"progress","percent":42.5},
// {"event":"info"|"warning","id":...,"args":[...]},
// {"event":"error","id":...,"args":[...],"message":...}.
class JsonLinesReporter final : public Reporter {
 public:
  explicit JsonLinesReporter(int fd) : fd_(fd) {}
  ~JsonLinesReporter() override { ::close(fd_); }
  JsonLinesReporter(const JsonLinesReporter&) = delete;
  JsonLinesReporter& operator=(const JsonLinesReporter&) = delete;
  void Progress(float percent) override {
    rapidjson::Document event(rapidjson::kObjectType);
    event.AddMember("event", "progress", event.GetAllocator());
    // Tenths of a percent: a float's binary digits are noise to a reader.
    const double shown = std::isfinite(percent) ? std::round(static_cast<double>(percent) * 10.0) / 10.0 : 0.0;
    event.AddMember("percent", shown, event.GetAllocator());
    Write(event);
  }
  void Notice(const char* kind, const std::string& id, const std::list<std::string>& args,
              const std::string& message) override {
    rapidjson::Document event(rapidjson::kObjectType);
    auto& a = event.GetAllocator();
    event.AddMember("event", rapidjson::Value(kind, a), a);
    event.AddMember("id", rapidjson::Value(id, a), a);
    rapidjson::Value list(rapidjson::kArrayType);
    for (const std::string& arg : args) list.PushBack(rapidjson::Value(arg, a), a);
    event.AddMember("args", list, a);
    if (std::string(kind) == "error") event.AddMember("message", rapidjson::Value(message, a), a);
    Write(event);
  }

 private:
  void Write(const rapidjson::Document& event) {
    rapidjson::StringBuffer buffer;
    rapidjson::Writer<rapidjson::StringBuffer> writer(buffer);
    event.Accept(writer);
    std::lock_guard<std::mutex> lock(mutex_);
    WriteAll(fd_, std::string(buffer.GetString(), buffer.GetSize()) + "\n");
  }
  const int fd_;
  std::mutex mutex_;
};

// Without a terminal: only that the command waits for another apply, on
// stderr, so that a script's log says why nothing seems to happen.
class WaitingReporter final : public Reporter {
 public:
  void Progress(float) override {}
  void Notice(const char*, const std::string& id, const std::list<std::string>&, const std::string&) override {
    if (id == HoxConfigManager::kApplyWaitingForHost) WriteAll(STDERR_FILENO, "hoxcfg: waiting for another apply to finish\n");
  }
};

class ReportingNotifications final : public TaskHandle::Notifications {
 public:
  explicit ReportingNotifications(std::shared_ptr<Reporter> reporter) : reporter_(std::move(reporter)) {}
  void PluginInfo(const std::string& id, const std::list<std::string>& args) override {
    if (reporter_) reporter_->Notice("info", id, args, "");
  }
  void PluginWarning(const std::string& id, const std::list<std::string>& args) override {
    if (reporter_) reporter_->Notice("warning", id, args, "");
  }
  void PluginError(ErrorInfo error) override {
    if (reporter_) reporter_->Notice("error", error.id, {error.args.begin(), error.args.end()}, error.message);
  }

 private:
  const std::shared_ptr<Reporter> reporter_;
};

// The task the library gets. Its progress covers its range of the whole;
// child tasks report to the same place, each over its part of the range.
class ReportingTask final : public TaskHandle {
 public:
  ReportingTask(std::shared_ptr<Reporter> reporter, ProgressRange range, std::vector<ProgressRange> children)
      : reporter_(std::move(reporter)), range_(range), children_(std::move(children)) {}
  bool IsAborted() override { return InterruptWatch::Interrupted(); }
  void UpdateProgress(float percent) override {
    if (reporter_) reporter_->Progress(Scaled(percent));
  }
  std::shared_ptr<Notifications> AddNotification() override {
    return std::make_shared<ReportingNotifications>(reporter_);
  }
  // Called on the operation's thread only, like UpdateProgress.
  std::shared_ptr<TaskHandle> ChildTask(int) override {
    const ProgressRange part = made_ < children_.size() ? children_[made_++] : ProgressRange{};
    return std::make_shared<ReportingTask>(reporter_, ProgressRange{Scaled(part.from), Scaled(part.to)},
                                           std::vector<ProgressRange>());
  }

 private:
  float Scaled(float percent) const { return range_.from + (range_.to - range_.from) * percent / 100.0f; }

  const std::shared_ptr<Reporter> reporter_;  // null: silent
  const ProgressRange range_;
  const std::vector<ProgressRange> children_;
  std::size_t made_ = 0;  // child tasks made so far
};

}  // namespace

InterruptWatch::InterruptWatch() {
  InterruptFlag().store(false);
  struct sigaction action {};
  action.sa_handler = OnInterrupt;
  sigemptyset(&action.sa_mask);
  action.sa_flags = 0;  // no SA_RESTART: a wait at a prompt ends at once
  ::sigaction(SIGINT, &action, nullptr);
  ::sigaction(SIGTERM, &action, nullptr);
}

InterruptWatch::~InterruptWatch() {
  ::signal(SIGINT, SIG_DFL);
  ::signal(SIGTERM, SIG_DFL);
}

bool InterruptWatch::Interrupted() { return InterruptFlag().load(); }

void AddEventsOption(CLI::App* command, std::string& eventsPath) {
  command->add_option("--events", eventsPath,
                      "Write progress and plugin notifications to FILE as JSON lines, one event per line")
      ->type_name("FILE");
}

Progress::Progress(const GlobalOptions& options, const std::string& eventsPath) {
  if (!eventsPath.empty()) {
    const int fd = eventsPath == "-" ? ::fcntl(STDOUT_FILENO, F_DUPFD_CLOEXEC, 0)
                                     : ::open(eventsPath.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
    if (fd < 0) throw Failure(std::strerror(errno), "", kExitUsage, InFile(eventsPath));
    reporter_ = std::make_shared<JsonLinesReporter>(fd);
  } else if (!options.json && !options.quiet) {
    reporter_ = StderrIsTerminal() ? std::shared_ptr<Reporter>(std::make_shared<TerminalReporter>())
                                   : std::make_shared<WaitingReporter>();
  }
}

std::shared_ptr<TaskHandle> Progress::Task(ProgressRange range, std::vector<ProgressRange> children) const {
  return std::make_shared<ReportingTask>(reporter_, range, std::move(children));
}

void Progress::Hide() const {
  if (reporter_) reporter_->Hide();
}

std::shared_ptr<TaskHandle> MakeTask(const GlobalOptions& options, const std::string& eventsPath) {
  return Progress(options, eventsPath).Task();
}

void Confirm(const GlobalOptions& options, const std::string& plan) {
  if (options.yes) return;
  if (!StdinIsTerminal() || !StderrIsTerminal()) {
    throw Failure("refusing to " + plan + " without a terminal to ask", "pass --yes to confirm");
  }
  std::cerr << "hoxcfg will " << plan << ".\nProceed? [y/N] " << std::flush;
  std::string answer;
  std::getline(std::cin, answer);
  if (answer != "y" && answer != "Y" && answer != "yes") throw Failure("not confirmed: nothing was changed");
}

void AuditChange(const std::string& what) {
  const std::string root = HoxPlatform::HostRoot();
  HoxPlatform::AuditLog("hoxcfg", what + (root == "/" ? std::string() : " at root " + root));
}

}  // namespace hoxcfg
