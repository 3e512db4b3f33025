// hoxcfg schema-check and schemas, run as real processes.
#include <gtest/gtest.h>

#include <sys/wait.h>

#include <cstdlib>
#include <string>

#include "support/temp_root.h"

namespace {

struct Outcome {
  int exitCode;
  std::string out;
  std::string err;
};

class HoxcfgSchemaTest : public ::testing::Test {
 protected:
  Outcome Run(const std::string& args) {
    root_.WriteFile("/tmp/stdout", "");
    root_.WriteFile("/tmp/stderr", "");
    const std::string command = hoxcm_test::BuildPath("tools/hoxcfg") + " --compact " + args + " >" +
                                root_.Path("/tmp/stdout") + " 2>" + root_.Path("/tmp/stderr");
    const int status = std::system(command.c_str());
    return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, root_.ReadFile("/tmp/stdout"), root_.ReadFile("/tmp/stderr")};
  }

  hoxcm_test::TempRoot root_;
};

}  // namespace

TEST_F(HoxcfgSchemaTest, SchemaCheckExitsByOutcome) {
  // Given a schema and documents that pass, fail or cannot be read, the exit
  // code should be 0, 1 or 2, with the findings as JSON on stdout.
  root_.WriteFile("/s.json", R"({"type": "object", "required": ["name"]})");
  root_.WriteFile("/unusable.json", R"({"type": "object", "minLength": "x"})");
  root_.WriteFile("/good.json", R"({"name": "a"})");
  root_.WriteFile("/bad.json", R"({"other": 1})");
  root_.WriteFile("/broken.json", "{");
  const std::string s = root_.Path("/s.json");
  struct Case {
    std::string args;
    int exitCode;
    std::string out;
    std::string errStart;
  };
  const Case cases[] = {
      {s + " " + root_.Path("/good.json"), 0, "[]\n", ""},
      {s + " " + root_.Path("/bad.json"), 1,
       R"([{"field":"/name","errId":9,"errArgs":["name"],"error":"Missing required property 'name'."}])"
       "\n",
       ""},
      {s + " " + root_.Path("/broken.json"), 2, "", "hoxcfg: error 2080: "},
      {root_.Path("/unusable.json") + " " + root_.Path("/good.json"), 2, "", "hoxcfg: error 31: "},
      {s + " " + root_.Path("/missing.json"), 2, "", "hoxcfg: error 2080: "},
  };
  for (const Case& c : cases) {
    const Outcome o = Run("schema-check " + c.args);
    EXPECT_EQ(o.exitCode, c.exitCode) << c.args << ": " << o.err;
    EXPECT_EQ(o.out, c.out) << c.args;
    EXPECT_EQ(o.err.rfind(c.errStart, 0), 0u) << c.args << ": " << o.err;
  }
}

TEST_F(HoxcfgSchemaTest, HostDocumentsAreCheckedAgainstTheInstalledSchemas) {
  root_.InstallSampleSchemas();
  const std::string sample = hoxcm_test::SourcePath("data/sample-host/user-config.json");
  Outcome o = Run("--root " + root_.path() + " schema-check --host " + sample);
  EXPECT_EQ(o.exitCode, 0) << o.err << o.out;
  root_.WriteFile("/doc.json", R"({"profile": {"network": {"dns": {"config": {}, "cache": {}}}}})");
  o = Run("--root " + root_.path() + " schema-check --host " + root_.Path("/doc.json"));
  EXPECT_EQ(o.exitCode, 1);
  EXPECT_NE(o.out.find(R"("field":"/network/dns/cache","errId":30)"), std::string::npos) << o.out;

  o = Run("--root " + root_.path() + " schemas");
  EXPECT_EQ(o.exitCode, 0) << o.err;
  EXPECT_NE(o.out.find("\"security:accounts:users\""), std::string::npos) << o.out;
}
