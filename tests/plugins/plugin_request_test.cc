// The request document: its wire format and the runner-side getters.
#include <functional>

#include "plugins/plugin_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;

std::shared_ptr<HoxConfigStore::ConfigStoreObject> Object(const HoxConfigStore::ConfigStoreObjectId& id,
                                                          const char* json) {
  Document value;
  ParseDocument(json, value);
  return std::make_shared<HoxConfigStore::ConfigStoreObject>(id, value);
}

TEST(PluginRequestTest, ApplyRequestsCarryTextsInTheirFixedOrder) {
  TempRoot root;
  const HoxConfigStore::ConfigStoreObjectId vnic("network", "interfaces", "vnic", "vnic0");
  Document drift;
  ParseDocument(R"({"mtu":9000})", drift);
  std::vector<DesiredConfigInput> inputs = {
      {Object(vnic, R"({"name":"vnic0","mtu":9000})"),
       std::make_shared<HoxConfigStore::DriftObject>(vnic, "SET", drift), "SET"},
      {Object(HoxConfigStore::ConfigStoreObjectId("network", "dns", "config"), R"({"servers":[]})"), nullptr, "ADD"},
  };
  PluginRequest request("net", "APPLY", "", 3, inputs);
  request.Dump(PluginRequestPath(), "task", "cluster");
  const std::string text = root.ReadFile("/var/tarvik/lifecycle/cm-plugin-input.json");
  EXPECT_EQ(text.substr(0, text.find("\"data\"")), R"({"key":"net","version":3,"type":"APPLY","module":"",)");
  EXPECT_NE(text.find(R"({"operation":"ADD","config":"{\"servers\":[]}","component":"network","group":"dns",)"
                      R"("key":"config","instanceId":""})"),
            std::string::npos)
      << text;
  EXPECT_EQ(text.substr(text.size() - 45), R"(],"taskId":"task","clusterContext":"cluster"})");

  PluginRequest loaded;
  loaded.Load(PluginRequestPath());
  EXPECT_EQ(loaded.GetId(), "net");
  EXPECT_EQ(loaded.GetVersion(), 3);
  EXPECT_EQ(loaded.GetModule(), "");
  const auto data = loaded.GetData();
  ASSERT_EQ(data.size(), 2u);
  EXPECT_EQ(data[0].operation, "SET");
  EXPECT_EQ(data[0].id, vnic);
  EXPECT_TRUE(data[0].hasDrift);
  EXPECT_FALSE(data[1].hasDrift);
  EXPECT_EQ(data[1].config, R"({"servers":[]})");
}

TEST(PluginRequestTest, ValidationRequestsCarryValuesAndReferences) {
  TempRoot root;
  const HoxConfigStore::ConfigStoreObjectId host("system", "identity", "hostname");
  PluginRequest request("net", "VALIDATE", "libnet.so", 3,
                        {Object(HoxConfigStore::ConfigStoreObjectId("network", "dns", "config"), R"({"a":1})")},
                        {Object(host, R"({"hostname":"h"})")});
  request.Dump(PluginRequestPath(), "", "");
  PluginRequest loaded;
  loaded.Load(PluginRequestPath());
  EXPECT_EQ(loaded.GetData().at(0).config, R"({"a":1})");
  EXPECT_EQ(loaded.GetReferences(), std::vector<HoxConfigStore::ConfigStoreObjectId>{host});
  EXPECT_EQ(JsonToString(loaded.GetDocument()["references"][0]["config"]), R"({"hostname":"h"})");
}

TEST(PluginRequestTest, MissingMembersAreNamed) {
  TempRoot root;
  const struct {
    const char* text;
    std::function<void(const PluginRequest&)> get;
    const char* message;
  } cases[] = {
      {"{}", [](const PluginRequest& r) { r.GetVersion(); }, "The PluginRequest structure does not contain version."},
      {"{}", [](const PluginRequest& r) { r.GetType(); }, "The PluginRequest structure does not contain type"},
      {"{}", [](const PluginRequest& r) { r.GetModule(); }, "The PluginRequest structure does not contain module"},
      {"{}", [](const PluginRequest& r) { r.GetId(); }, "The PluginRequest structure does not contain key"},
      {"{}", [](const PluginRequest& r) { r.GetTaskId(); }, "The PluginRequest structure does not contain taskId"},
      {"{}", [](const PluginRequest& r) { r.GetClusterContext(); },
       "The PluginRequest structure does not contain context"},
      {"{}", [](const PluginRequest& r) { r.GetData(); }, "The PluginRequest structure does not contain data"},
      {R"({"version":"3"})", [](const PluginRequest& r) { r.GetVersion(); }, "Invalid JSON"},
      {"[]", [](const PluginRequest& r) { r.GetId(); }, "Invalid JSON"},
      {R"({"data":[{"component":1}]})", [](const PluginRequest& r) { r.GetData(); }, "Invalid JSON"},
  };
  for (const auto& c : cases) {
    root.WriteFile("/r.json", c.text);
    PluginRequest request;
    request.Load(root.Path("/r.json"));
    try {
      c.get(request);
      ADD_FAILURE() << c.message;
    } catch (const std::exception& e) {
      EXPECT_STREQ(e.what(), c.message);
    }
  }
}

}  // namespace
}  // namespace hoxcm_test
