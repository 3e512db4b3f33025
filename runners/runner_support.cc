#include "runner_support.h"

#include <stdexcept>
#include <vector>

#include <hoxcm/host.h>

namespace hoxcm_runner {

std::string RootFromProgramPath(const std::string& programPath) {
  static const std::string kRunnerDirectory = std::string(HoxPlatform::HostPaths::kRunnerDirectory) + "/";
  const std::size_t slash = programPath.rfind('/');
  if (slash == std::string::npos) return "/";
  const std::string directory = programPath.substr(0, slash + 1);
  if (directory.size() < kRunnerDirectory.size() ||
      directory.compare(directory.size() - kRunnerDirectory.size(), kRunnerDirectory.size(), kRunnerDirectory) != 0) {
    return "/";
  }
  const std::string root = directory.substr(0, directory.size() - kRunnerDirectory.size());
  return root.empty() ? "/" : root;
}

void CommitAppliedRequest(const HoxConfigManager::PluginRequest& request) {
  std::vector<HoxConfigStore::UserConfigChange> changes;
  for (const auto& item : request.GetData()) {
    if (item.operation != "ADD" && item.operation != "SET" && item.operation != "DELETE") {
      throw std::runtime_error("unknown operation \"" + item.operation + "\" in the request");
    }
    HoxConfigStore::UserConfigChange change;
    change.action = item.operation;
    change.id = item.id;
    if (item.operation != "DELETE") change.value = item.config;
    changes.push_back(std::move(change));
  }
  if (!changes.empty()) HoxConfigStore::ApplyUserConfigChanges(changes);
}

}  // namespace hoxcm_runner
