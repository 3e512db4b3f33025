// hoxcfg init, export, show and maintenance, run as real processes against a
// temporary root.
#include <sys/stat.h>
#include <unistd.h>

#include <hoxcm/documents.h>
#include <hoxcm/host_documents.h>

#include "extraction/sample_host.h"
#include "support/run_hoxcfg.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;

using HoxcfgStoreTest = HoxcfgTest;

TEST_F(HoxcfgStoreTest, InitCreatesASampleHostThatExportsToAPrivateFile) {
  RunSteps(root_, {{"init --root " + root_.path() + " --sample", 0, "installed schemas"}});
  EXPECT_TRUE(fileExists(root_.Path(kStoreHostPath)));
  EXPECT_TRUE(fileExists(root_.Path("/etc/tarvik/host-facts.json")));

  const HoxcfgOutcome exported = Run("export");
  ASSERT_EQ(exported.exitCode, 0) << exported.err;
  Document doc;
  ASSERT_NO_THROW(ParseDocument(exported.out, doc)) << exported.out;
  const auto* uuid = rapidjson::Pointer("/metadata/reference_host/uuid").Get(doc);
  ASSERT_NE(uuid, nullptr);
  EXPECT_STREQ(uuid->GetString(), "4c4c4544-0042-3510-8053-b4c04f4e3132");
  // A second init, with or without the sample, refuses to touch the host
  // and names the flag that replaces it; --reset does replace it.
  StoreSql("UPDATE config_item SET value = '{\"hostname\":\"changed\"}' WHERE name = 'hostname'");
  const std::string changed = Run("export").out;
  ASSERT_NE(changed, exported.out);
  for (const char* again : {"init --sample", "init", "init --sample --json"}) {
    RunSteps(root_, {{again, 2, "a host already exists at " + root_.path()}, {again, 2, "--reset"}});
    EXPECT_EQ(Run("export").out, changed) << again;
  }
  EXPECT_EQ(Run("init --sample --reset").exitCode, 0);
  EXPECT_EQ(Run("export").out, exported.out);

  const std::string file = root_.Path("/tmp/host.json");
  EXPECT_EQ(Run("export --output " + file).out, "");
  struct stat st {};
  ASSERT_EQ(::stat(file.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 0777, 0600u);
  // The export is applicable elsewhere, so it carries the secrets.
  EXPECT_TRUE(Has(root_.ReadFile("/tmp/host.json"), "s3cr3t-chap-01"));
  // A link planted where the temporary file goes is replaced, not written through.
  const std::string victim = root_.Path("/tmp/victim");
  root_.WriteFile("/tmp/victim", "untouched");
  ASSERT_EQ(::symlink(victim.c_str(), (file + ".tmp").c_str()), 0);
  ASSERT_EQ(Run("export --output " + file).exitCode, 0);
  EXPECT_EQ(root_.ReadFile("/tmp/victim"), "untouched");
  EXPECT_TRUE(Has(root_.ReadFile("/tmp/host.json"), "s3cr3t-chap-01"));
}

TEST_F(HoxcfgStoreTest, ShowMasksSensitiveValues) {
  InitSample();
  for (const char* which : {"", "current", "user"}) {
    const HoxcfgOutcome shown = Run(std::string("show ") + which + " --compact");
    ASSERT_EQ(shown.exitCode, 0) << which << shown.err;
    EXPECT_TRUE(!Has(shown.out, "s3cr3t-chap-01") && Has(shown.out, "******")) << which;
    EXPECT_EQ(shown.out.find('\n'), shown.out.size() - 1) << "compact: one line";
  }
  EXPECT_EQ(Run("show desired").out, "{}\n");
  EXPECT_EQ(Run("show everything").exitCode, 2);
}

TEST_F(HoxcfgStoreTest, ErrorsPrintTheCodeAndNothingOnStdout) {
  auto expectError = [&](const std::string& command, const std::string& code) {
    const HoxcfgOutcome failed = Run(command);
    EXPECT_EQ(failed.exitCode, 2) << command;
    EXPECT_EQ(failed.out, "") << command;
    EXPECT_EQ(failed.err.rfind("hoxcfg: error " + code + ": ", 0), 0u) << command << ": " << failed.err;
  };
  // A store row that is not JSON.
  InitSample();
  StoreSql("UPDATE config_item SET value = '{oops' WHERE name = 'hostname'");
  for (const char* command : {"export", "show current"}) expectError(command, "2080");
  RunSteps(root_, {{"init --root /", 2, "refusing"}});
}

TEST_F(HoxcfgStoreTest, InitFromAnExportMakesACopyOfTheHost) {
  // Given the export of the sample host, a root initialised from it should
  // take the reference host's identity, export the same document and comply
  // with it; a schema file that turns bad is named when its key is used.
  InitSample();
  const std::string exported = root_.Path("/tmp/host.json");
  ASSERT_EQ(Run("export -o " + exported).exitCode, 0);
  const std::string copy = "--root " + root_.Path("/copy");
  RunSteps(root_, {{"init " + copy + " --from " + exported, 0,
                    "host identity 4c4c4544-0042-3510-8053-b4c04f4e3132 (the document's reference host)"},
                   {"compliance " + copy + " " + exported, 0, "compliant\n"}});
  EXPECT_EQ(Run("export " + copy).out, Run("export").out);

  const std::string dns = "/copy/usr/lib/tarvik/configmanager/schemas/network/dns/config.json";
  root_.WriteFile(dns, R"({"multiInstance": false, "schema": )");
  RunSteps(root_, {{"compliance " + copy + " " + exported, 2, "hoxcfg: " + root_.Path(dns) + ": error 2021: "},
                   {"compliance " + copy + " " + exported, 2, "not valid JSON"}});
}

TEST_F(HoxcfgStoreTest, InitChecksEverySchemaFileAndLoadsADocumentWholeOrNotAtAll) {
  // Given a schema tree with a refused file, init should list it (exit 1),
  // and a document with keys that have no usable schema should be refused
  // with those keys named, leaving the user configuration as it was.
  root_.CopyTree("data/sample-host/schemas", "/tmp/schemas");
  root_.WriteFile("/tmp/schemas/bad/x/key.json", R"({"multiInstance": false})");
  const std::string schemas = " --schemas " + root_.Path("/tmp/schemas");
  RunSteps(root_, {{"init" + schemas, 1,
                    "refused schema file " + root_.Path(std::string(HoxPlatform::HostPaths::kSchemaDirectory)) + "/bad/x/key.json: "},
                   {"schemas --check", 1, ""}});

  Document doc = SampleDocument("user-config.json");
  auto& a = doc.GetAllocator();
  for (const char* component : {"none", "bad"}) {
    Value group(rapidjson::kObjectType), key(rapidjson::kObjectType);
    key.AddMember("key", Value(rapidjson::kObjectType), a);
    group.AddMember("x", key, a);
    doc.AddMember(Value(component, a), group, a);
  }
  root_.WriteFile("/tmp/doc.json", JsonToString(doc));
  const HoxcfgOutcome refused = Run("init --reset --from " + root_.Path("/tmp/doc.json") + schemas);
  EXPECT_EQ(refused.exitCode, 2);
  for (const char* named : {"no usable schema for 2 of its", "/none/x/key, /bad/x/key (its schema file was refused: ",
                            "nothing was loaded"}) {
    EXPECT_TRUE(Has(refused.err, named)) << named << ": " << refused.err;
  }
  EXPECT_EQ(Run("show user --compact").out, "{\"profile\":{}}\n");
  EXPECT_EQ(Run("init --sample --from " + root_.Path("/tmp/doc.json")).exitCode, 2);
}

}  // namespace
}  // namespace hoxcm_test
