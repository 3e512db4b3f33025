// hoxcfg schema-check and schemas, run as real processes.
#include <gtest/gtest.h>

#include <tuple>
#include <vector>

#include "support/run_hoxcfg.h"

namespace hoxcm_test {
namespace {

TEST(HoxcfgSchemaTest, SchemaCheckExitsByOutcome) {
  // Given a schema and documents that pass, fail or cannot be read, the exit
  // code should be 0, 1 or 2, with the findings as JSON on stdout.
  TempRoot root;
  root.WriteFile("/s.json", R"({"type": "object", "required": ["name"]})");
  root.WriteFile("/unusable.json", R"({"type": "object", "minLength": "x"})");
  root.WriteFile("/good.json", R"({"name": "a"})");
  root.WriteFile("/bad.json", R"({"other": 1})");
  root.WriteFile("/broken.json", "{");
  const std::string s = root.Path("/s.json");
  const std::vector<std::tuple<std::string, int, std::string, std::string>> cases = {
      {s + " " + root.Path("/good.json"), 0, "[]\n", ""},
      {s + " " + root.Path("/bad.json"), 1,
       R"([{"field":"/name","errId":9,"errArgs":["name"],"error":"Missing required property 'name'."}])"
       "\n",
       ""},
      {s + " " + root.Path("/broken.json"), 2, "", "hoxcfg: error 2080: "},
      {root.Path("/unusable.json") + " " + root.Path("/good.json"), 2, "", "hoxcfg: error 31: "},
      {s + " " + root.Path("/missing.json"), 2, "", "hoxcfg: error 2080: "},
  };
  for (const auto& [args, exitCode, out, errStart] : cases) {
    const HoxcfgOutcome o = RunHoxcfg(root, "--compact schema-check " + args);
    EXPECT_EQ(o.exitCode, exitCode) << args << ": " << o.err;
    EXPECT_EQ(o.out, out) << args;
    EXPECT_EQ(o.err.rfind(errStart, 0), 0u) << args << ": " << o.err;
  }
}

TEST(HoxcfgSchemaTest, HostDocumentsAreCheckedAgainstTheInstalledSchemas) {
  TempRoot root;
  root.InstallSampleSchemas();
  const std::string hostCheck = "--compact --root " + root.path() + " schema-check --host ";
  HoxcfgOutcome o;
  for (const char* sample : {"data/sample-host/user-config.json", "data/sample-host/default-config.json"}) {
    o = RunHoxcfg(root, hostCheck + SourcePath(sample));
    EXPECT_EQ(o.exitCode, 0) << sample << ": " << o.err << o.out;
  }
  root.WriteFile("/doc.json", R"({"profile": {"network": {"dns": {"config": {}, "cache": {}}}}})");
  o = RunHoxcfg(root, hostCheck + root.Path("/doc.json"));
  EXPECT_EQ(o.exitCode, 1);
  EXPECT_NE(o.out.find(R"("field":"/network/dns/cache","errId":30)"), std::string::npos) << o.out;
  o = RunHoxcfg(root, "--compact schemas");
  EXPECT_EQ(o.exitCode, 0) << o.err;
  EXPECT_NE(o.out.find("\"security:accounts:users\""), std::string::npos) << o.out;
}

}  // namespace
}  // namespace hoxcm_test
