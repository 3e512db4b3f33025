#include <hoxcm/task.h>

namespace HoxConfigManager {

TaskHandle::Notifications::~Notifications() = default;
void TaskHandle::Notifications::PluginInfo(const std::string&, const std::list<std::string>&) {}
void TaskHandle::Notifications::PluginWarning(const std::string&, const std::list<std::string>&) {}
void TaskHandle::Notifications::PluginError(ErrorInfo) {}

TaskHandle::~TaskHandle() = default;
bool TaskHandle::IsAborted() { return false; }
void TaskHandle::UpdateProgress(float) {}
std::shared_ptr<TaskHandle::Notifications> TaskHandle::AddNotification() {
  return std::make_shared<Notifications>();
}
std::shared_ptr<TaskHandle> TaskHandle::ChildTask(int) { return Dummy(); }
std::string TaskHandle::GetTaskId() const { return {}; }
std::shared_ptr<TaskHandle> TaskHandle::Dummy() { return std::make_shared<TaskHandle>(); }

PluginMonitor::~PluginMonitor() = default;
bool PluginMonitor::IsAborted() { return false; }
std::string PluginMonitor::GetTaskId() { return {}; }
std::shared_ptr<PluginMonitor> PluginMonitor::Dummy() { return std::make_shared<PluginMonitor>(); }

TaskPluginMonitor::TaskPluginMonitor(std::shared_ptr<TaskHandle> task) : task_(std::move(task)) {}
TaskPluginMonitor::~TaskPluginMonitor() { task_.reset(); }
// Asked afresh every time: the caller may abort from any thread at any moment.
bool TaskPluginMonitor::IsAborted() { return task_ && task_->IsAborted(); }
std::string TaskPluginMonitor::GetTaskId() { return task_ ? task_->GetTaskId() : std::string(); }

}  // namespace HoxConfigManager
