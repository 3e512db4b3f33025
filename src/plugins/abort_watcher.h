// Watches a plugin run's monitor for an abort while the runner works: a
// thread of its own asks PluginMonitor::IsAborted() once per poll interval
// and, the first time it answers true, calls the abort action once and
// stops. Stop() (or the destructor) wakes the thread at once and joins it,
// so a run that ends normally never waits out the poll interval.
//
// Ownership: the watcher keeps the monitor alive while it runs. The abort
// action runs on the watcher's thread and must not outlive what it refers
// to: declare the watcher after the objects its action uses, so that it is
// stopped and joined before they go away, on every path.
//
// Thread safety: Stop() and the destructor belong to the owning thread.
#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <thread>

#include <hoxcm/task.h>

namespace HoxConfigManager {

class AbortWatcher final {
 public:
  // Starts the thread; throws std::system_error when it cannot be started.
  AbortWatcher(std::shared_ptr<PluginMonitor> monitor, std::function<void()> onAbort,
               std::chrono::milliseconds interval);
  ~AbortWatcher();
  AbortWatcher(const AbortWatcher&) = delete;
  AbortWatcher& operator=(const AbortWatcher&) = delete;

  // Stops watching and joins the thread; the abort action has run by then
  // if it is going to. Idempotent.
  void Stop();

 private:
  void Watch();

  const std::shared_ptr<PluginMonitor> monitor_;
  const std::function<void()> onAbort_;
  const std::chrono::milliseconds interval_;
  std::mutex mutex_;
  std::condition_variable wake_;
  // Written under mutex_, so that the thread cannot miss the wake-up
  // between testing it and going to sleep.
  std::atomic<bool> stop_{false};
  // Last: the thread starts once every other member is ready.
  std::thread thread_;
};

}  // namespace HoxConfigManager
