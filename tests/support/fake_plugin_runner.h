// Stand-ins for orchestration tests: a PluginRunner that starts no process
// but returns scripted results per plugin id and records every call, and a
// TaskHandle that records progress and notifications as one list of events
// and can be aborted.
#pragma once

#include <atomic>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "plugins/plugin_runner.h"

namespace hoxcm_test {

using HoxConfigManager::DesiredConfigInput;
using HoxConfigManager::Plugin;
using HoxConfigManager::PluginMonitor;
using StoreObjects = std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>;

class FakePluginRunner final : public HoxConfigManager::PluginRunner {
 public:
  struct Call {
    std::string kind;  // "APPLY", "IMPACT" or "VALIDATE"
    std::string pluginId;
    std::vector<DesiredConfigInput> inputs;  // apply and impact
    StoreObjects data, references;           // validate
    std::string context;
    std::string taskId;
  };
  // Results by plugin id; a plugin without an entry succeeds.
  std::map<std::string, HoxConfigManager::ErrorInfo> apply;
  std::map<std::string, HoxConfigManager::ImpactPluginResult> impact;
  std::map<std::string, HoxConfigManager::ValidationPluginResult> validate;
  // Called during each run, once it is recorded (to abort the task, say).
  std::function<void(const Call&)> during;
  std::vector<Call> calls;

  std::vector<std::string> CalledIds() const {
    std::vector<std::string> ids;
    for (const Call& c : calls) ids.push_back(c.pluginId);
    return ids;
  }
  HoxConfigManager::ErrorInfo Apply(const Plugin& p, const std::vector<DesiredConfigInput>& inputs,
                                    const std::string& context, std::shared_ptr<PluginMonitor> monitor) override {
    return Run("APPLY", p, inputs, context, monitor, apply);
  }
  HoxConfigManager::ImpactPluginResult Impact(const Plugin& p, const std::vector<DesiredConfigInput>& inputs,
                                              const std::string& context,
                                              std::shared_ptr<PluginMonitor> monitor) override {
    return Run("IMPACT", p, inputs, context, monitor, impact);
  }
  HoxConfigManager::ValidationPluginResult Validate(const Plugin& p, const StoreObjects& data,
                                                    const StoreObjects& references, const std::string& context,
                                                    std::shared_ptr<PluginMonitor> monitor) override {
    return Run("VALIDATE", p, {}, context, monitor, validate, data, references);
  }

 private:
  template <typename Result>
  Result Run(const char* kind, const Plugin& p, const std::vector<DesiredConfigInput>& inputs,
             const std::string& context, const std::shared_ptr<PluginMonitor>& monitor,
             const std::map<std::string, Result>& results, const StoreObjects& data = {},
             const StoreObjects& references = {}) {
    calls.push_back({kind, p.GetId(), inputs, data, references, context, monitor ? monitor->GetTaskId() : ""});
    if (during) during(calls.back());
    const auto it = results.find(p.GetId());
    return it == results.end() ? Result() : it->second;
  }
};

// Events in order: "progress <value>", "info|error <message id> <args...>".
// Its child tasks are itself: their events and abort are the task's.
class RecordingTask final : public HoxConfigManager::TaskHandle,
                            public std::enable_shared_from_this<RecordingTask> {
 public:
  std::atomic<bool> aborted{false};

  bool IsAborted() override { return aborted; }
  std::shared_ptr<TaskHandle> ChildTask(int) override { return shared_from_this(); }
  void UpdateProgress(float percent) override { Add("progress " + std::to_string(percent)); }
  std::shared_ptr<Notifications> AddNotification() override { return std::make_shared<Recorder>(this); }
  std::string GetTaskId() const override { return "task-1"; }
  std::vector<std::string> Events() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return events_;
  }

 private:
  // Used at once by the library, never kept beyond the task.
  struct Recorder final : Notifications {
    explicit Recorder(RecordingTask* task) : task(task) {}
    void PluginInfo(const std::string& id, const std::list<std::string>& args) override { Post("info", id, args); }
    void PluginError(HoxConfigManager::ErrorInfo e) override { Post("error", e.id, {e.args.begin(), e.args.end()}); }
    void Post(const std::string& kind, const std::string& id, const std::list<std::string>& args) {
      std::string event = kind + " " + id;
      for (const std::string& a : args) event += " " + a;
      task->Add(event);
    }
    RecordingTask* const task;
  };
  void Add(std::string event) {
    std::lock_guard<std::mutex> lock(mutex_);
    events_.push_back(std::move(event));
  }

  mutable std::mutex mutex_;
  std::vector<std::string> events_;  // guarded by mutex_
};

}  // namespace hoxcm_test
