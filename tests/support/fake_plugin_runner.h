// Stand-ins for orchestration tests: a PluginRunner that starts no process
// but returns scripted results per plugin id and records every call, and a
// TaskHandle that records progress and notifications in one event list and
// can be aborted. Orchestration takes its runner as a parameter; these let
// its scheduling, progress and abort cases run without processes.
#pragma once

#include <atomic>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include <hoxcm/task.h>

#include "plugins/plugin_runner.h"

namespace hoxcm_test {

class FakePluginRunner final : public HoxConfigManager::PluginRunner {
 public:
  struct Call {
    std::string kind;  // "APPLY", "IMPACT" or "VALIDATE"
    std::string pluginId;
    std::vector<HoxConfigManager::DesiredConfigInput> inputs;  // apply and impact
    std::size_t objects = 0;                                   // validate: data and references
    std::string clusterContext;
    std::string taskId;
  };

  // Results by plugin id; a plugin without an entry succeeds.
  std::map<std::string, HoxConfigManager::ErrorInfo> apply;
  std::map<std::string, HoxConfigManager::ImpactPluginResult> impact;
  std::map<std::string, HoxConfigManager::ValidationPluginResult> validate;
  // Called during each run, after it is recorded: to abort the task in the
  // middle of a plan, for example.
  std::function<void(const Call&)> during;
  std::vector<Call> calls;

  std::vector<std::string> CalledIds() const {
    std::vector<std::string> ids;
    for (const Call& c : calls) ids.push_back(c.pluginId);
    return ids;
  }

  HoxConfigManager::ErrorInfo Apply(const HoxConfigManager::Plugin& plugin,
                                    const std::vector<HoxConfigManager::DesiredConfigInput>& inputs,
                                    const std::string& context,
                                    std::shared_ptr<HoxConfigManager::PluginMonitor> monitor) override {
    Record({"APPLY", plugin.GetId(), inputs, 0, context, monitor ? monitor->GetTaskId() : ""});
    return Scripted(apply, plugin.GetId());
  }
  HoxConfigManager::ImpactPluginResult Impact(const HoxConfigManager::Plugin& plugin,
                                              const std::vector<HoxConfigManager::DesiredConfigInput>& inputs,
                                              const std::string& context,
                                              std::shared_ptr<HoxConfigManager::PluginMonitor> monitor) override {
    Record({"IMPACT", plugin.GetId(), inputs, 0, context, monitor ? monitor->GetTaskId() : ""});
    return Scripted(impact, plugin.GetId());
  }
  HoxConfigManager::ValidationPluginResult Validate(
      const HoxConfigManager::Plugin& plugin,
      const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& data,
      const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& references, const std::string& context,
      std::shared_ptr<HoxConfigManager::PluginMonitor> monitor) override {
    Record({"VALIDATE", plugin.GetId(), {}, data.size() + references.size(), context,
            monitor ? monitor->GetTaskId() : ""});
    return Scripted(validate, plugin.GetId());
  }

 private:
  void Record(Call call) {
    calls.push_back(std::move(call));
    if (during) during(calls.back());
  }
  template <typename Result>
  static Result Scripted(const std::map<std::string, Result>& results, const std::string& id) {
    const auto it = results.find(id);
    return it == results.end() ? Result() : it->second;
  }
};

// Events in order: "progress <value>", "info <message id> <args...>",
// "error <message id> <args...>".
class RecordingTask final : public HoxConfigManager::TaskHandle {
 public:
  explicit RecordingTask(std::string taskId = "task-1") : taskId_(std::move(taskId)) {}

  std::atomic<bool> aborted{false};

  bool IsAborted() override { return aborted; }
  void UpdateProgress(float percent) override { Add("progress " + std::to_string(percent)); }
  std::shared_ptr<Notifications> AddNotification() override { return std::make_shared<Recorder>(*this); }
  std::string GetTaskId() const override { return taskId_; }

  std::vector<std::string> Events() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return events_;
  }

 private:
  class Recorder final : public Notifications {
   public:
    explicit Recorder(RecordingTask& task) : task_(task) {}
    void PluginInfo(const std::string& id, const std::list<std::string>& args) override { Post("info", id, args); }
    void PluginWarning(const std::string& id, const std::list<std::string>& args) override {
      Post("warning", id, args);
    }
    void PluginError(HoxConfigManager::ErrorInfo error) override {
      Post("error", error.id, {error.args.begin(), error.args.end()});
    }

   private:
    void Post(const std::string& kind, const std::string& id, const std::list<std::string>& args) {
      std::string event = kind + " " + id;
      for (const std::string& a : args) event += " " + a;
      task_.Add(event);
    }
    RecordingTask& task_;
  };

  void Add(std::string event) {
    std::lock_guard<std::mutex> lock(mutex_);
    events_.push_back(std::move(event));
  }

  const std::string taskId_;
  mutable std::mutex mutex_;
  std::vector<std::string> events_;  // guarded by mutex_
};

}  // namespace hoxcm_test
