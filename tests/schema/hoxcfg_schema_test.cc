// hoxcfg schema-check and schemas, run as real processes.
#include <gtest/gtest.h>

#include <tuple>
#include <vector>

#include "support/run_hoxcfg.h"

namespace hoxcm_test {
namespace {

TEST(HoxcfgSchemaTest, SchemaCheckExitsByOutcomeAndTellsASchemaFromADocument) {
  // Given a schema and documents that pass, fail or cannot be used, the exit
  // code should be 0, 1 or 2; findings read as sentences after their field,
  // and a swapped schema and document are refused rather than called valid.
  TempRoot root;
  root.WriteFile("/s.json", R"({"type": "object", "properties": {"mtu": {"type": "integer", "minimum": 1280}},
                                "required": ["name"]})");
  root.WriteFile("/unusable.json", R"({"type": "object", "minLength": "x"})");
  root.WriteFile("/good.json", R"({"name": "a"})");
  root.WriteFile("/bad.json", R"({"mtu": 9000.5})");
  root.WriteFile("/host.json", R"({"network": {"dns": {"config": {}}}})");
  root.WriteFile("/broken.json", "{");
  const std::string s = root.Path("/s.json"), bad = root.Path("/bad.json"), host = root.Path("/host.json");
  const std::vector<std::tuple<std::string, int, std::string, std::string>> cases = {
      {s + " " + root.Path("/good.json"), 0, root.Path("/good.json") + ": valid\n", ""},
      {s + " " + bad, 1, bad + ": /mtu: must be an integer\n" + bad + ": /name: is required but missing\n", ""},
      {"--json --compact " + s + " " + root.Path("/good.json"), 0, "{\"valid\":true,\"findings\":[]}\n", ""},
      {s + " " + root.Path("/broken.json"), 2, "", "hoxcfg: " + root.Path("/broken.json") + ":1:2: error 2080: "},
      {root.Path("/unusable.json") + " " + root.Path("/good.json"), 2, "",
       "hoxcfg: " + root.Path("/unusable.json") + ": The schema is not usable: "},
      {s + " " + root.Path("/missing.json"), 2, "",
       "hoxcfg: " + root.Path("/missing.json") + ": No such file or directory\n"},
      {host + " " + s, 2, "", "hoxcfg: the schema comes first: " + s + " is the schema"},
      {host + " " + bad, 2, "", "hoxcfg: " + host + ": this is not a JSON schema"},
      {"--host " + s, 2, "", "hoxcfg: no host at "},
  };
  for (const auto& [args, exitCode, out, errStart] : cases) {
    const HoxcfgOutcome o = RunHoxcfg(root, "schema-check " + args);
    EXPECT_EQ(o.exitCode, exitCode) << args << ": " << o.err;
    EXPECT_EQ(o.out, out) << args;
    EXPECT_EQ(o.err.rfind(errStart, 0), 0u) << args << ": " << o.err;
  }
}

TEST(HoxcfgSchemaTest, HostDocumentsAreCheckedAgainstTheInstalledSchemas) {
  TempRoot root;
  ASSERT_EQ(RunHoxcfg(root, "init --sample").exitCode, 0);
  const std::string hostCheck = "--json --compact schema-check --host ";
  HoxcfgOutcome o;
  for (const char* sample : {"data/sample-host/user-config.json", "data/sample-host/default-config.json"}) {
    o = RunHoxcfg(root, hostCheck + SourcePath(sample));
    EXPECT_EQ(o.exitCode, 0) << sample << ": " << o.err << o.out;
  }
  root.WriteFile("/doc.json", R"({"profile": {"network": {"dns": {"config": {}, "cache": {}}}}})");
  o = RunHoxcfg(root, hostCheck + root.Path("/doc.json"));
  EXPECT_EQ(o.exitCode, 1);
  EXPECT_NE(o.out.find(R"("field":"/network/dns/cache","errId":30)"), std::string::npos) << o.out;
  // A schema given where a document belongs is refused.
  root.WriteFile("/schema.json", R"({"$schema": "http://json-schema.org/draft-04/schema#", "type": "object"})");
  o = RunHoxcfg(root, "schema-check --host - < " + root.Path("/schema.json"));
  EXPECT_EQ(o.exitCode, 2) << o.out;
  EXPECT_EQ(o.err.rfind("hoxcfg: <stdin>: this is a JSON schema, not a configuration document", 0), 0u) << o.err;
}

}  // namespace
}  // namespace hoxcm_test
