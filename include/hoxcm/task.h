// The caller's task as the library sees it: abort flag, progress and plugin
// notifications (TaskHandle), and the narrower view a plugin run gets
// (PluginMonitor). Every operation has a do-nothing default.
//
// Thread safety: the library calls IsAborted() and GetTaskId() of a task and
// of its monitor from a plugin run's monitor thread as well as from the
// caller's thread; implementations must allow that. The defaults hold no
// state.
#pragma once

#include <list>
#include <memory>
#include <string>

#include <hoxcm/errors.h>
#include <hoxcm/export.h>

namespace HoxConfigManager {

class HOXCM_API TaskHandle {
 public:
  class HOXCM_API Notifications {
   public:
    virtual ~Notifications();
    virtual void PluginInfo(const std::string& messageId, const std::list<std::string>& arguments);
    virtual void PluginWarning(const std::string& messageId, const std::list<std::string>& arguments);
    virtual void PluginError(ErrorInfo error);
  };

  virtual ~TaskHandle();
  virtual bool IsAborted();
  // Percent of the whole operation, 0.0 to 100.0.
  virtual void UpdateProgress(float percent);
  virtual std::shared_ptr<Notifications> AddNotification();
  // `share`: the part of this task's work given to the child.
  virtual std::shared_ptr<TaskHandle> ChildTask(int share);
  virtual std::string GetTaskId() const;

  static std::shared_ptr<TaskHandle> Dummy();
};

class HOXCM_API PluginMonitor {
 public:
  virtual ~PluginMonitor();
  virtual bool IsAborted();
  virtual std::string GetTaskId();

  static std::shared_ptr<PluginMonitor> Dummy();
};

// A monitor over a task: keeps the task alive and asks it afresh on every
// call (nothing is cached).
class HOXCM_API TaskPluginMonitor final : public PluginMonitor {
 public:
  explicit TaskPluginMonitor(std::shared_ptr<TaskHandle> task);
  ~TaskPluginMonitor() override;
  bool IsAborted() override;
  std::string GetTaskId() override;

 private:
  std::shared_ptr<TaskHandle> task_;
};

}  // namespace HoxConfigManager
