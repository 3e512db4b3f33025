// The request of an apply or impact run written in one pass, straight from
// its inputs: the bytes PluginRequest(id, operation, module, version,
// inputs).Dump(path, taskId, clusterContext) writes, without building the
// request document or a text per object first. The runners read it with
// PluginRequest::Load like any other request.
#pragma once

#include <string>
#include <vector>

#include <hoxcm/drift.h>

namespace HoxConfigManager {

// Writes the request to `path` as Dump does: mode 0600, replaced atomically.
void WriteInputsRequest(const std::string& path, const std::string& id, const std::string& operation,
                        const std::string& module, int version, const std::vector<DesiredConfigInput>& inputs,
                        const std::string& taskId, const std::string& clusterContext);

}  // namespace HoxConfigManager
