// Fault injection through the real hoxcfg on a sandbox copy of the sample
// host: each failpoint of the writes that matter is armed in turn, with an
// I/O error and with a kill of the process, while hoxcfg applies a change or
// exports the host. Afterwards the store must pass its integrity check and
// hold the state from before or the state from after the operation (nothing
// half-written, nothing lost), and running the operation again must succeed.
#include <gtest/gtest.h>

#include <sys/wait.h>

#include <cctype>
#include <csignal>
#include <cstdlib>
#include <string>
#include <tuple>
#include <vector>

#include <hoxcm/documents.h>

#include "support/run_hoxcfg.h"
#include "support/store_sql.h"

namespace hoxcm_test {
namespace {

enum class Operation { kApply, kExport };

struct FailpointCase {
  const char* point;
  Operation operation;
  // An apply whose history record cannot be written stands: the failure is
  // logged and the record is lost, not the change.
  bool errorFailsOperation = true;
};

// Every failpoint, with an operation that passes it.
const FailpointCase kFailpoints[] = {
    {"store.commit", Operation::kApply},
    {"store.history", Operation::kApply, false},
    {"read:plugin.json", Operation::kApply},
    {"write:cm-plugin-input.json", Operation::kApply},
    {"rename:cm-plugin-input.json", Operation::kApply},
    {"read:cm-plugin-output.json", Operation::kApply},
    {"write:export.json", Operation::kExport},
    {"rename:export.json", Operation::kExport},
};

const char* const kActions[] = {"error", "kill"};

using Param = std::tuple<FailpointCase, const char*>;

class FailpointTest : public ::testing::TestWithParam<Param> {
 protected:
  FailpointTest() {
    EXPECT_EQ(RunHoxcfg(root_, "init --sample").exitCode, 0);
    // A change of the DNS servers: one plugin (the C++ network plugin) runs.
    ExportWith(root_, "desired.json", {{"/network/dns/config/servers/0", R"("10.20.0.99")"}});
    // What an earlier export left.
    root_.WriteFile("/export.json", "{}");
  }

  // Runs the operation; `armed` goes to HOX_FAILPOINTS. The exit status, or
  // -1 when hoxcfg was killed.
  int Run(Operation operation, const std::string& armed) {
    const std::string args = operation == Operation::kApply ? "apply --yes " + root_.Path("/desired.json")
                                                            : "export -o " + root_.Path("/export.json");
    // exec: the shell must not outlive hoxcfg and turn its death into 137.
    const std::string command = "HOX_FAILPOINTS='" + armed + "' exec " + BuildPath("tools/hoxcfg") + " " + args +
                                " >/dev/null 2>" + root_.Path("/stderr");
    const int status = std::system(command.c_str());
    if (WIFSIGNALED(status) || (WIFEXITED(status) && WEXITSTATUS(status) == 128 + SIGKILL)) return -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -2;
  }

  // What the operation changes: the configuration rows, and the exported
  // file.
  std::vector<std::string> State() const {
    std::vector<std::string> state = StoreSql(
        "SELECT kind, component, config_group, name, identifier, value FROM config_item "
        "ORDER BY kind, component, config_group, name, identifier");
    state.push_back(root_.ReadFile("/export.json"));
    return state;
  }

  TempRoot root_;
};

TEST_P(FailpointTest, LeavesTheOldOrTheNewStateAndARunAgainSucceeds) {
  const auto& [failpoint, action] = GetParam();
  const std::vector<std::string> before = State();

  const int faulted = Run(failpoint.operation, std::string(failpoint.point) + "=" + action);
  // The point was reached: the process died there, or the operation failed.
  if (std::string(action) == "kill") {
    EXPECT_EQ(faulted, -1) << root_.ReadFile("/stderr");
  } else if (failpoint.errorFailsOperation) {
    EXPECT_GT(faulted, 0) << "the injected error went unnoticed";
  } else {
    EXPECT_EQ(faulted, 0) << root_.ReadFile("/stderr");
    EXPECT_EQ(StoreSql("SELECT count(*) FROM apply_history"), std::vector<std::string>{"0|"});
  }
  EXPECT_EQ(StoreSql("PRAGMA integrity_check"), std::vector<std::string>{"ok|"});
  const std::vector<std::string> between = State();

  ASSERT_EQ(Run(failpoint.operation, ""), 0) << root_.ReadFile("/stderr");
  const std::vector<std::string> after = State();
  EXPECT_NE(before, after) << "the operation changed nothing: the case proves nothing";
  EXPECT_TRUE(between == before || between == after) << "a state that is neither the old nor the new one";
  if (failpoint.operation == Operation::kApply) {
    // The host now complies with what was applied.
    EXPECT_EQ(RunHoxcfg(root_, "compliance " + root_.Path("/desired.json")).exitCode, 0);
  }
}

std::string Name(const ::testing::TestParamInfo<Param>& info) {
  std::string name = std::string(std::get<0>(info.param).point) + "_" + std::get<1>(info.param);
  for (char& c : name) {
    if (!std::isalnum(static_cast<unsigned char>(c))) c = '_';
  }
  return name;
}

INSTANTIATE_TEST_SUITE_P(EveryPointAndAction, FailpointTest,
                         ::testing::Combine(::testing::ValuesIn(kFailpoints), ::testing::ValuesIn(kActions)), Name);

}  // namespace
}  // namespace hoxcm_test
