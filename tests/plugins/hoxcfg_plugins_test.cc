// hoxcfg plugins list | check, run as real processes against a sample root.
#include <sys/wait.h>

#include <cstdlib>

#include <gtest/gtest.h>

#include <hoxcm/documents.h>

#include "support/temp_root.h"

namespace hoxcm_test {
namespace {

struct Outcome {
  int exitCode;
  std::string out;
  std::string err;
};

class HoxcfgPluginsTest : public ::testing::Test {
 protected:
  HoxcfgPluginsTest() { EXPECT_EQ(Run("init --sample").exitCode, 0); }
  Outcome Run(const std::string& args) {
    const std::string out = root.Path("/tmp/stdout"), err = root.Path("/tmp/stderr");
    root.WriteFile("/tmp/stdout", "");
    const int status =
        std::system((BuildPath("tools/hoxcfg") + " --compact " + args + " >" + out + " 2>" + err).c_str());
    return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, root.ReadFile("/tmp/stdout"), root.ReadFile("/tmp/stderr")};
  }
  TempRoot root;
};

TEST_F(HoxcfgPluginsTest, ListsTheSamplePluginsAndTheirOrder) {
  const Outcome list = Run("plugins list");
  ASSERT_EQ(list.exitCode, 0) << list.err;
  HoxConfigManager::Document doc;
  HoxConfigManager::ParseDocument(list.out, doc);
  EXPECT_EQ(doc["plugins"].Size(), 9u);
  std::vector<std::string> order;
  for (const auto& name : doc["order"].GetArray()) order.emplace_back(name.GetString());
  EXPECT_EQ(order.front(), "REMEDIATE:hox");
  EXPECT_EQ(order.back(), "system");
  EXPECT_EQ(Run("plugins check").out, "[]\n");
}

TEST_F(HoxcfgPluginsTest, ABadManifestIsReportedByCheckAndFailsList) {
  root.WriteFile("/usr/lib/tarvik/configmanager/apply_modules/bad/plugin.json", R"({"version":3,"type":"python"})");
  const Outcome check = Run("plugins check");
  EXPECT_EQ(check.exitCode, 1);
  EXPECT_NE(check.out.find("apply_modules/bad/plugin.json"), std::string::npos) << check.out;
  const Outcome list = Run("plugins list");
  EXPECT_EQ(list.exitCode, 2);
  EXPECT_NE(list.err.find("hoxcfg: error 3000: Failed to validate the plugin"), std::string::npos) << list.err;
}

}  // namespace
}  // namespace hoxcm_test
