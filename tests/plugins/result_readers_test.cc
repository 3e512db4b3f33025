// The result files of a run: what is accepted, and that nothing malformed
// reads as success.
#include "plugins/plugin_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;

TEST(ResultReadersTest, ErrorRecordsRoundTrip) {
  const ErrorInfo error("com.x.failed", {"a \"quoted\" arg", "ü"}, "line\nbreak");
  ErrorInfo back;
  back.Deserialize(error.Serialize());
  EXPECT_EQ(back, error);
  back.Deserialize(R"({"id":""})");
  EXPECT_EQ(back, ErrorInfo());
}

TEST(ResultReadersTest, MalformedResultsAreRefused) {
  TempRoot root;
  const std::string path = root.Path("/r.json");
  const struct {
    const char* text;
    int reader;  // 0 error record, 1 impact, 2 validation
  } cases[] = {
      {"", 0}, {"{", 0}, {"{}", 0}, {R"({"id":1})", 0}, {R"({"id":"","args":[1]})", 0}, {R"({"id":"","args":"a"})", 0},
      {"{}", 1}, {R"({"impacts":{}})", 1}, {R"({"impacts":[{"impact":3}]})", 1}, {R"({"impacts":[{}]})", 1},
      {R"({"impacts":[],"error":[]})", 1},
      {"{}", 2}, {R"({"errors":[{"errors":[]}]})", 2}, {R"({"errors":[{"field":"f"}]})", 2},
      {R"({"errors":[{"field":"f","errors":[{}]}]})", 2},
  };
  for (const auto& c : cases) {
    root.WriteFile("/r.json", c.text);
    switch (c.reader) {
      case 0: EXPECT_THROW(ErrorInfo::Load(path), HoxConfigStore::ConfigStoreException) << c.text; break;
      case 1: EXPECT_THROW(ImpactPluginResult::Load(path), HoxConfigStore::ConfigStoreException) << c.text; break;
      default: EXPECT_THROW(ValidationPluginResult::Load(path), HoxConfigStore::ConfigStoreException) << c.text;
    }
  }
  EXPECT_THROW(ErrorInfo::Load(root.Path("/missing.json")), std::runtime_error);
  // A failure report stands in for the verdicts.
  root.WriteFile("/r.json", R"({"error":{"id":"x","args":["a"],"message":"m"}})");
  EXPECT_EQ(ImpactPluginResult::Load(path).error, ErrorInfo("x", {"a"}, "m"));
  EXPECT_EQ(ValidationPluginResult::Load(path).error, ErrorInfo("x", {"a"}, "m"));
}

}  // namespace
}  // namespace hoxcm_test
