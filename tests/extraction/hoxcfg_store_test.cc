// hoxcfg init, export, show and maintenance, run as real processes against a
// temporary root.
#include <sys/stat.h>
#include <sys/wait.h>

#include <cstdlib>
#include <string>

#include <gtest/gtest.h>

#include <hoxcm/documents.h>

#include "extraction/sample_host.h"
#include "support/temp_root.h"

namespace hoxcm_test {
namespace {

struct Outcome {
  int exitCode;
  std::string out;
  std::string err;
};

class HoxcfgStoreTest : public ::testing::Test {
 protected:
  // Runs hoxcfg with `args` (shell words) and HOX_ROOT set to the root.
  Outcome Run(const std::string& args) {
    const std::string out = root_.Path("/tmp/stdout"), err = root_.Path("/tmp/stderr");
    root_.WriteFile("/tmp/stdout", "");
    const std::string command = BuildPath("tools/hoxcfg") + " " + args + " >" + out + " 2>" + err;
    const int status = std::system(command.c_str());
    return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, root_.ReadFile("/tmp/stdout"),
            root_.ReadFile("/tmp/stderr")};
  }

  void InitSample() {
    const Outcome init = Run("init --sample");
    ASSERT_EQ(init.exitCode, 0) << init.err;
  }

  TempRoot root_;
};

TEST_F(HoxcfgStoreTest, InitCreatesASampleHostThatExports) {
  const Outcome init = Run("init --root " + root_.path() + " --sample");
  ASSERT_EQ(init.exitCode, 0) << init.err;
  EXPECT_NE(init.out.find("installed schemas"), std::string::npos) << init.out;
  EXPECT_TRUE(HoxConfigManager::fileExists(root_.Path("/var/lib/tarvik/configstore/configstore.db")));
  EXPECT_TRUE(HoxConfigManager::fileExists(root_.Path("/etc/tarvik/host-facts.json")));

  const Outcome exported = Run("export");
  ASSERT_EQ(exported.exitCode, 0) << exported.err;
  HoxConfigManager::Document doc;
  ASSERT_NO_THROW(HoxConfigManager::ParseDocument(exported.out, doc)) << exported.out;
  const auto* uuid = rapidjson::Pointer("/metadata/reference_host/uuid").Get(doc);
  ASSERT_NE(uuid, nullptr);
  EXPECT_STREQ(uuid->GetString(), "4c4c4544-0042-3510-8053-b4c04f4e3132");
  // Run twice, init leaves the same host.
  EXPECT_EQ(Run("init --sample").exitCode, 0);
  EXPECT_EQ(Run("export").out, exported.out);
}

TEST_F(HoxcfgStoreTest, ExportToAFileIsPrivate) {
  InitSample();
  const std::string file = root_.Path("/tmp/host.json");
  const Outcome exported = Run("export --output " + file);
  ASSERT_EQ(exported.exitCode, 0) << exported.err;
  EXPECT_EQ(exported.out, "");
  struct stat st {};
  ASSERT_EQ(::stat(file.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 0777, 0600u);
  // The export is applicable elsewhere, so it carries the secrets.
  EXPECT_NE(root_.ReadFile("/tmp/host.json").find("s3cr3t-chap-01"), std::string::npos);
}

TEST_F(HoxcfgStoreTest, ShowMasksSensitiveValues) {
  InitSample();
  for (const char* which : {"", "current", "user"}) {
    const Outcome shown = Run(std::string("show ") + which + " --compact");
    ASSERT_EQ(shown.exitCode, 0) << which << shown.err;
    EXPECT_EQ(shown.out.find("s3cr3t-chap-01"), std::string::npos) << which;
    EXPECT_NE(shown.out.find("******"), std::string::npos) << which;
    EXPECT_EQ(shown.out.find('\n'), shown.out.size() - 1) << "compact: one line";
  }
  EXPECT_EQ(Run("show desired").out, "{}\n");
  EXPECT_EQ(Run("show everything").exitCode, 2);
}

TEST_F(HoxcfgStoreTest, MaintenanceModeIsEnteredAndExited) {
  InitSample();
  EXPECT_EQ(Run("maintenance status").out, "maintenance mode: not entered\n");
  EXPECT_EQ(Run("maintenance enter").out, "maintenance mode: entered\n");
  EXPECT_EQ(Run("maintenance status").out, "maintenance mode: entered\n");
  EXPECT_EQ(Run("maintenance exit").out, "maintenance mode: not entered\n");
}

TEST_F(HoxcfgStoreTest, ErrorsPrintTheCodeAndNothingOnStdout) {
  InitSample();
  // A store row that is not JSON.
  ExecStoreSql("UPDATE config_item SET value = '{oops' WHERE name = 'hostname'");
  for (const char* command : {"export", "show current"}) {
    const Outcome failed = Run(command);
    EXPECT_EQ(failed.exitCode, 2) << command;
    EXPECT_EQ(failed.out, "") << command;
    EXPECT_EQ(failed.err.rfind("hoxcfg: error 2080: ", 0), 0u) << command << ": " << failed.err;
  }
}

TEST_F(HoxcfgStoreTest, ReadingCommandsNeedAnInitialisedRoot) {
  for (const char* command : {"export", "show", "maintenance status"}) {
    const Outcome failed = Run(command);
    EXPECT_EQ(failed.exitCode, 2) << command;
    EXPECT_EQ(failed.err.rfind("hoxcfg: error 2001: ", 0), 0u) << command << ": " << failed.err;
  }
  EXPECT_FALSE(HoxConfigManager::fileExists(root_.Path("/var/lib/tarvik/configstore/configstore.db")));
}

TEST_F(HoxcfgStoreTest, InitRefusesTheRealRootWithoutForce) {
  const Outcome refused = Run("init --root /");
  EXPECT_EQ(refused.exitCode, 2);
  EXPECT_NE(refused.err.find("refusing"), std::string::npos) << refused.err;
}

}  // namespace
}  // namespace hoxcm_test
