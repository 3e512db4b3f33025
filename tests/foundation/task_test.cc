#include <gtest/gtest.h>

#include <atomic>
#include <thread>

#include <hoxcm/task.h>

using namespace HoxConfigManager;

namespace {

class AbortableTask : public TaskHandle {
 public:
  bool IsAborted() override {
    ++calls;
    return aborted.load();
  }
  std::string GetTaskId() const override { return "task-42"; }
  std::atomic<bool> aborted{false};
  std::atomic<int> calls{0};
};

}  // namespace

TEST(TaskHandleTest, DummyDoesNothingAndHandsOutDummies) {
  auto task = TaskHandle::Dummy();
  EXPECT_FALSE(task->IsAborted());
  EXPECT_EQ(task->GetTaskId(), "");
  task->UpdateProgress(50.0f);
  auto notifications = task->AddNotification();
  ASSERT_NE(notifications, nullptr);
  notifications->PluginInfo("com.tarvik.hox.settings.apply.plugin.started", {"p"});
  notifications->PluginWarning("w", {});
  notifications->PluginError(ErrorInfo("e", {"a"}));
  for (int share : {0, 2, -1, 100}) {
    auto child = task->ChildTask(share);
    ASSERT_NE(child, nullptr);
    EXPECT_FALSE(child->IsAborted());
    EXPECT_NE(child->ChildTask(1), nullptr);
  }
  auto monitor = PluginMonitor::Dummy();
  EXPECT_FALSE(monitor->IsAborted());
  EXPECT_EQ(monitor->GetTaskId(), "");
}

TEST(TaskPluginMonitorTest, KeepsItsTaskAliveAndAsksItAfreshOnEveryCall) {
  auto task = std::make_shared<AbortableTask>();
  AbortableTask& held = *task;
  std::weak_ptr<AbortableTask> weak = task;
  auto monitor = std::make_shared<TaskPluginMonitor>(std::move(task));
  ASSERT_FALSE(weak.expired());  // the monitor holds the only reference
  EXPECT_FALSE(monitor->IsAborted());
  held.aborted = true;
  EXPECT_TRUE(monitor->IsAborted());
  held.aborted = false;
  EXPECT_FALSE(monitor->IsAborted());
  EXPECT_EQ(held.calls.load(), 3);
  EXPECT_EQ(monitor->GetTaskId(), "task-42");
  monitor.reset();
  EXPECT_TRUE(weak.expired());
}

TEST(TaskPluginMonitorTest, SeesAnAbortRaisedOnAnotherThread) {
  // Given a monitor polled on one thread, an abort raised on another is seen.
  auto task = std::make_shared<AbortableTask>();
  auto monitor = std::make_shared<TaskPluginMonitor>(task);
  std::atomic<bool> seen{false};
  std::thread poller([&] {
    while (!monitor->IsAborted()) std::this_thread::yield();
    seen = true;
  });
  task->aborted = true;
  poller.join();
  EXPECT_TRUE(seen.load());
}
