#include "plugins/abort_watcher.h"

#include <hoxcm/host.h>

namespace HoxConfigManager {

AbortWatcher::AbortWatcher(std::shared_ptr<PluginMonitor> monitor, std::function<void()> onAbort,
                           std::chrono::milliseconds interval)
    : monitor_(std::move(monitor)),
      onAbort_(std::move(onAbort)),
      interval_(interval),
      thread_([this] { Watch(); }) {}

AbortWatcher::~AbortWatcher() { Stop(); }

void AbortWatcher::Stop() {
  {
    std::lock_guard<std::mutex> lock(mutex_);
    stop_ = true;
  }
  wake_.notify_all();
  if (thread_.joinable()) thread_.join();
}

void AbortWatcher::Watch() {
  CSLogger::Log(CSLogger::kInfo, "Starting plugin monitor thread");
  bool aborted = false;
  while (!stop_) {
    // An exception must not leave this thread: it would end the process.
    // A monitor that cannot answer is asked again at the next poll.
    try {
      aborted = monitor_->IsAborted();
    } catch (const std::exception& e) {
      CSLogger::Log(CSLogger::kError, "Plugin monitor failed: %s", e.what());
    }
    if (aborted) break;
    std::unique_lock<std::mutex> lock(mutex_);
    if (wake_.wait_for(lock, interval_, [this] { return stop_.load(); })) break;
  }
  if (aborted) onAbort_();
  CSLogger::Log(CSLogger::kInfo, "Stopping plugin monitor thread");
}

}  // namespace HoxConfigManager
