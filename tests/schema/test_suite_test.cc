// The draft-4 cases of the JSON Schema Test Suite (Debian package
// json-schema-test-suite) through the validator. Cases that fetch remote
// documents from the suite's own web server are left out.
#include <gtest/gtest.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

#include <hoxcm/schema_store.h>

#include "foundation/json_parse.h"

namespace fs = std::filesystem;

TEST(JsonSchemaTestSuiteTest, Draft4CasesPass) {
  const fs::path dir = "/usr/share/json-schema-test-suite/tests/draft4";
  if (!fs::is_directory(dir)) GTEST_SKIP() << "json-schema-test-suite is not installed";
  std::vector<fs::path> files;
  for (const auto& entry : fs::directory_iterator(dir)) {
    if (entry.path().extension() == ".json" && entry.path().filename() != "refRemote.json") files.push_back(entry);
  }
  std::sort(files.begin(), files.end());
  int passed = 0;
  int failed = 0;
  for (const fs::path& file : files) {
    std::ifstream in(file);
    const std::string text((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    rapidjson::Document groups;
    ASSERT_TRUE(HoxConfigManager::detail::ParseJson(text.data(), text.size(), groups)) << file;
    for (const auto& group : groups.GetArray()) {
      for (const auto& test : group["tests"].GetArray()) {
        rapidjson::Document result;
        const bool ok = (JsonValidator::Validate(group["schema"], test["data"], result, {}, "") == 0) ==
                        test["valid"].GetBool();
        ++(ok ? passed : failed);
        if (!ok) {
          std::printf("failed: %s: %s / %s\n", file.filename().c_str(), group["description"].GetString(),
                      test["description"].GetString());
        }
      }
    }
  }
  std::printf("%d passed, %d failed\n", passed, failed);
  EXPECT_GE(passed, 299);
}
