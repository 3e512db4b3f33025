// The documents exchanged with a runner: the request's wire format and its
// runner-side getters, and the result files, of which nothing malformed
// may read as success.
#include "plugins/plugin_fixture.h"
#include "plugins/plugin_request_writer.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;
using HoxConfigStore::ConfigStoreObjectId;

TEST(PluginRequestTest, ApplyRequestsCarryTextsInTheirFixedOrder) {
  TempRoot root;
  const ConfigStoreObjectId vnic("network", "interfaces", "vnic", "vnic0");
  Document drift;
  ParseDocument(R"({"mtu":9000})", drift);
  std::vector<DesiredConfigInput> inputs = {
      {Object(vnic, R"({"name":"vnic0","mtu":9000})"),
       std::make_shared<HoxConfigStore::DriftObject>(vnic, "SET", drift), "SET"},
      {Object(ConfigStoreObjectId("network", "dns", "config"), R"({"servers":[]})"), nullptr, "ADD"},
  };
  PluginRequest("net", "APPLY", "", 3, inputs).Dump(PluginRequestPath(), "task", "cluster");
  const std::string text = root.ReadFile("/var/tarvik/lifecycle/cm-plugin-input.json");
  EXPECT_EQ(text.substr(0, text.find("\"data\"")), R"({"key":"net","version":3,"type":"APPLY","module":"",)");
  EXPECT_NE(text.find(R"({"operation":"ADD","config":"{\"servers\":[]}","component":"network","group":"dns",)"
                      R"("key":"config","instanceId":""})"),
            std::string::npos)
      << text;
  EXPECT_EQ(text.substr(text.size() - 45), R"(],"taskId":"task","clusterContext":"cluster"})");

  PluginRequest loaded;
  loaded.Load(PluginRequestPath());
  const auto data = loaded.GetData();
  ASSERT_EQ(data.size(), 2u);
  EXPECT_EQ(data[0].operation + " " + data[0].id.toString() + " " + std::to_string(data[0].hasDrift),
            "SET " + vnic.toString() + " 1");
  EXPECT_EQ(data[1].config + " " + std::to_string(data[1].hasDrift), R"({"servers":[]} 0)");

  // The validation form carries values and references.
  const ConfigStoreObjectId host("system", "identity", "hostname");
  PluginRequest("net", "VALIDATE", "libnet.so", 3, {Object(ConfigStoreObjectId("network", "dns", "config"), "{}")},
                {Object(host, R"({"hostname":"h"})")})
      .Dump(PluginRequestPath(), "", "");
  loaded.Load(PluginRequestPath());
  EXPECT_EQ(loaded.GetModule(), "libnet.so");
  EXPECT_EQ(loaded.GetData().at(0).config, "{}");
  EXPECT_EQ(loaded.GetReferences(), std::vector<ConfigStoreObjectId>{host});
  EXPECT_EQ(JsonToString(loaded.GetDocument()["references"][0]["config"]), R"({"hostname":"h"})");
}

TEST(PluginRequestTest, TheOnePassWriterWritesTheBytesOfTheRequestDocument) {
  // Given values that need escaping twice (quotes, backslashes, control and
  // non-ASCII characters), numbers of every kind, an input without drift and
  // one without object, the runs' writer should write what Dump writes.
  TempRoot root;
  const ConfigStoreObjectId vnic("network", "interfaces", "vnic", "v\"0");
  Document drift;
  ParseDocument(R"({"mtu":{"old":1500,"new":9000},"note":"tab\there \u00e9 \u0001","ratio":0.1})", drift);
  const std::vector<DesiredConfigInput> inputs = {
      {Object(vnic, R"({"name":"v\"0","mtu":9000,"big":-9223372036854775808,"r":1e-7,"s":"a\\b\n\u2028","n":null,)"
                    R"("l":[true,false,{},[]]})"),
       std::make_shared<HoxConfigStore::DriftObject>(vnic, "SET", drift), "SET"},
      {Object(ConfigStoreObjectId("network", "dns", "config"), R"({"servers":[]})"), nullptr, "ADD"},
      {nullptr, nullptr, "DELETE"},
  };
  PluginRequest("n\u00e9t\"", "IMPACT", "lib.so", 3, inputs).Dump(PluginRequestPath(), "t\"1", "c\n");
  const std::string expected = root.ReadFile("/var/tarvik/lifecycle/cm-plugin-input.json");
  WriteInputsRequest(PluginRequestPath(), "n\u00e9t\"", "IMPACT", "lib.so", 3, inputs, "t\"1", "c\n");
  EXPECT_EQ(root.ReadFile("/var/tarvik/lifecycle/cm-plugin-input.json"), expected);
}

TEST(PluginRequestTest, MissingOrMistypedMembersThrow) {
  TempRoot root;
  using Get = std::function<void(const PluginRequest&)>;
  const Get getters[] = {[](const PluginRequest& r) { r.GetVersion(); }, [](const PluginRequest& r) { r.GetType(); },
                         [](const PluginRequest& r) { r.GetModule(); },  [](const PluginRequest& r) { r.GetId(); },
                         [](const PluginRequest& r) { r.GetTaskId(); },  [](const PluginRequest& r) { r.GetData(); },
                         [](const PluginRequest& r) { r.GetClusterContext(); }};
  for (const char* text : {"{}", "[]", R"({"version":"3","type":1,"module":[],"key":{},"taskId":2,"data":[{}],)"
                                       R"("clusterContext":null})"}) {
    root.WriteFile("/r.json", text);
    PluginRequest request;
    request.Load(root.Path("/r.json"));
    for (const Get& get : getters) EXPECT_NE(ThrownBy([&] { get(request); }).code, 0) << text;
  }
  // A missing member is named.
  root.WriteFile("/r.json", "{}");
  PluginRequest request;
  request.Load(root.Path("/r.json"));
  EXPECT_EQ(ThrownBy([&] { request.GetVersion(); }).message, "The PluginRequest structure does not contain version.");
}

TEST(ResultReadersTest, RecordsRoundTripAndNothingMalformedIsAccepted) {
  const ErrorInfo error("com.x.failed", {"a \"quoted\" arg", "ü"}, "line\nbreak");
  ErrorInfo back;
  back.Deserialize(error.Serialize());
  EXPECT_EQ(back, error);
  back.Deserialize(R"({"id":""})");
  EXPECT_EQ(back, ErrorInfo());

  TempRoot root;
  const std::string path = root.Path("/r.json");
  const std::function<void()> readers[] = {[&] { ErrorInfo::Load(path); }, [&] { ImpactPluginResult::Load(path); },
                                           [&] { ValidationPluginResult::Load(path); }};
  const std::pair<const char*, int> cases[] = {
      {"", 0}, {"{", 0}, {"{}", 0}, {R"({"id":1})", 0}, {R"({"id":"","args":[1]})", 0}, {R"({"id":"","args":"a"})", 0},
      {"{}", 1}, {R"({"impacts":{}})", 1}, {R"({"impacts":[{"impact":3}]})", 1}, {R"({"impacts":[{}]})", 1},
      {R"({"impacts":[],"error":[]})", 1},
      {"{}", 2}, {R"({"errors":[{"errors":[]}]})", 2}, {R"({"errors":[{"field":"f"}]})", 2},
      {R"({"errors":[{"field":"f","errors":[{}]}]})", 2},
  };
  for (const auto& [text, reader] : cases) {
    root.WriteFile("/r.json", text);
    EXPECT_GT(ThrownBy(readers[reader]).code, 0) << reader << ": " << text;
  }
  EXPECT_THROW(ErrorInfo::Load(root.Path("/missing.json")), HoxPlatform::FileError);
  // A failure report stands in for the verdicts.
  root.WriteFile("/r.json", R"({"error":{"id":"x","args":["a"],"message":"m"}})");
  EXPECT_EQ(ImpactPluginResult::Load(path).error, ErrorInfo("x", {"a"}, "m"));
  EXPECT_EQ(ValidationPluginResult::Load(path).error, ErrorInfo("x", {"a"}, "m"));
}

}  // namespace
}  // namespace hoxcm_test
