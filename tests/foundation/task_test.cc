#include <gtest/gtest.h>

#include <atomic>

#include <hoxcm/task.h>

using namespace HoxConfigManager;

namespace {

class AbortableTask : public TaskHandle {
 public:
  bool IsAborted() override { return aborted.load(); }
  std::string GetTaskId() const override { return "task-42"; }
  std::atomic<bool> aborted{false};
};

}  // namespace

TEST(TaskPluginMonitorTest, KeepsItsTaskAliveAndAsksItAfreshOnEveryCall) {
  // Given a monitor holding the only reference to its task, an abort raised
  // on the task after the monitor was made is seen, and withdrawn again.
  auto task = std::make_shared<AbortableTask>();
  AbortableTask& held = *task;
  std::weak_ptr<AbortableTask> weak = task;
  auto monitor = std::make_shared<TaskPluginMonitor>(std::move(task));
  EXPECT_FALSE(monitor->IsAborted());
  held.aborted = true;
  EXPECT_TRUE(monitor->IsAborted());
  held.aborted = false;
  EXPECT_FALSE(monitor->IsAborted());
  EXPECT_EQ(monitor->GetTaskId(), "task-42");
  ASSERT_FALSE(weak.expired());
  monitor.reset();
  EXPECT_TRUE(weak.expired());
}
