// hoxcfg plugins list | check, run as real processes against a sample root.
#include <gtest/gtest.h>

#include <hoxcm/documents.h>

#include "support/run_hoxcfg.h"

namespace hoxcm_test {
namespace {

using HoxcfgPluginsTest = HoxcfgTest;

TEST_F(HoxcfgPluginsTest, ListsTheSamplePluginsAndReportsBadManifests) {
  InitSample();
  // Not on a terminal, a list is printed as JSON.
  const HoxcfgOutcome list = Run("--compact plugins list");
  ASSERT_EQ(list.exitCode, 0) << list.err;
  HoxConfigManager::Document doc;
  HoxConfigManager::ParseDocument(list.out, doc);
  EXPECT_EQ(doc["plugins"].Size(), 10u);
  EXPECT_STREQ(doc["order"][0].GetString(), "REMEDIATE:hox");
  EXPECT_STREQ(doc["order"][doc["order"].Size() - 1].GetString(), "system");
  // The sample plugins agree with the manifest schemas.
  EXPECT_EQ(Run("--json --compact plugins check").out, "{\"valid\":true,\"failures\":[]}\n");

  const std::string bad = "/usr/lib/tarvik/configmanager/apply_modules/bad/plugin.json";
  root_.WriteFile(bad, R"({"version":3,"type":"python"})");
  RunSteps(root_, {{"--compact plugins check", 1, "apply_modules/bad/plugin.json"},
                  {"plugins list", 2, "error 3000: Failed to validate the plugin"}});
  // A valid manifest whose "depends" names nothing: check lists it (exit 1),
  // list fails naming the manifest.
  root_.WriteFile(bad, R"({"version":3,"type":"python","accepts":["quorlet:system:quorlet_daemon"],"apply":{"boot":false,
                     "apply_group":"system","REMEDIATE":{"provides":"X","depends":["REMEDIATE:hoks"]}}})");
  RunSteps(root_, {{"--compact plugins check", 1, "bad/plugin.json: plugin \"bad\": \"X\" depends on \"REMEDIATE:hoks\""},
                  {"plugins list", 2, "bad/plugin.json: error 2083"}});
}

}  // namespace
}  // namespace hoxcm_test
