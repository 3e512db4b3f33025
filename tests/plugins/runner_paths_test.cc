// The script runner cannot include the table of host paths: it keeps a copy
// of the entries it uses, which must match the table.
#include <gtest/gtest.h>

#include <cstdio>
#include <map>
#include <memory>
#include <string>

#include <hoxcm/files.h>
#include <hoxcm/host.h>
#include <hoxcm/json.h>

#include "support/temp_root.h"

namespace hoxcm_test {
namespace {

// Runs `code` with the script runner loaded as the module `runner` and
// returns what it prints.
std::string RunWithRunner(const std::string& code) {
  const std::string script =
      "import json, runpy, types\n"
      "runner = types.SimpleNamespace(**runpy.run_path('" + SourcePath("runners/py_plugin_runner") +
      "', run_name='runner'))\n" + code;
  const std::string command = "python3 -c \"$HOXCM_SCRIPT\"";
  ::setenv("HOXCM_SCRIPT", script.c_str(), 1);
  std::unique_ptr<FILE, int (*)(FILE*)> pipe(::popen(command.c_str(), "r"), &::pclose);
  std::string out;
  char buffer[4096];
  while (pipe && std::fgets(buffer, sizeof buffer, pipe.get()) != nullptr) out += buffer;
  return out;
}

TEST(RunnerPathsTest, TheScriptRunnersCopyMatchesTheTableOfHostPaths) {
  rapidjson::Document copy;
  copy.Parse(RunWithRunner("print(json.dumps({'paths': runner.HOST_PATHS, 'limit': runner.MAX_EXCHANGE_FILE_SIZE}))"));
  ASSERT_TRUE(copy.IsObject() && copy["paths"].IsObject()) << "the runner's copy could not be read";
  std::map<std::string, std::string> table;
  for (const auto& entry : HoxPlatform::HostPaths::kTable) table.emplace(entry.name, entry.path);
  EXPECT_GT(copy["paths"].MemberCount(), 0u);
  for (const auto& entry : copy["paths"].GetObject()) {
    const std::string name = entry.name.GetString();
    ASSERT_TRUE(table.count(name)) << name << " is not an entry of the table";
    EXPECT_EQ(entry.value.GetString(), table[name]) << name;
  }
  EXPECT_EQ(copy["limit"].GetUint64(), HoxPlatform::kMaxPluginExchangeFileSize);
}

}  // namespace
}  // namespace hoxcm_test
