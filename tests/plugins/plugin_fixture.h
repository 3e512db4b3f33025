// Shared setup of the plugin tests: a temporary root with the sample
// schemas and the manifest schemas installed, and writers of manifests and
// store objects.
#pragma once

#include <filesystem>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <hoxcm/documents.h>
#include <hoxcm/files.h>
#include <hoxcm/host.h>
#include <hoxcm/plugins.h>

#include "support/temp_root.h"
#include "support/thrown.h"

namespace hoxcm_test {

inline const std::string kModules = std::string(HoxPlatform::HostPaths::kManifestDirectory) + "/";
inline const std::string kPluginSchemas = std::string(HoxPlatform::HostPaths::kManifestSchemaDirectory) + "/";

// A version-3 manifest.
inline std::string V3Manifest(const std::string& type, const std::vector<std::string>& accepts,
                              const std::string& group, const std::string& provides,
                              const std::vector<std::string>& depends, const std::string& extra = "") {
  auto list = [](const std::vector<std::string>& v) {
    std::string s = "[";
    for (std::size_t i = 0; i < v.size(); ++i) s += (i ? ",\"" : "\"") + v[i] + "\"";
    return s + "]";
  };
  return "{\"version\":3,\"type\":\"" + type + "\",\"accepts\":" + list(accepts) +
         ",\"apply\":{\"boot\":true,\"apply_group\":\"" + group + "\",\"REMEDIATE\":{\"provides\":\"" + provides +
         "\",\"depends\":" + list(depends) + "}}" + extra + "}";
}

inline std::shared_ptr<HoxConfigStore::ConfigStoreObject> Object(const HoxConfigStore::ConfigStoreObjectId& id,
                                                                 const std::string& json) {
  HoxConfigManager::Document value;
  HoxConfigManager::ParseDocument(json, value);
  return std::make_shared<HoxConfigStore::ConfigStoreObject>(id, value);
}

class PluginTest : public ::testing::Test {
 protected:
  PluginTest() {
    root.InstallSampleSchemas();
    root.InstallPluginSchemas();
  }
  // Writes a manifest below apply_modules and returns its full path.
  std::string Manifest(const std::string& relative, const std::string& text) {
    root.WriteFile(kModules + relative, text);
    return root.Path(kModules + relative);
  }

  TempRoot root;
};

}  // namespace hoxcm_test
