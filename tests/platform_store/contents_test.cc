// Configuration contents, namespace objects and host state as readers and
// writers of the store see them.
#include <hoxcm/schema_store.h>

#include "platform_store/store_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigStore;

TEST_F(StoreTest, KindsAreSeparateAndEachIsReplacedWhole) {
  ImportConfiguration(ConfigKind::User, Parse(R"({"network":{"routes":{"static":[
      {"cs_generated_id":"r-1","destination":"10.0.0.0/8","gateway":"10.0.0.1"},
      {"destination":"10.1.0.0/16","gateway":"10.0.0.1"}]}}})"));
  // A generated identity is kept, or created and written into the value.
  const auto user = Rows(ConfigKind::User);
  ASSERT_EQ(user.size(), 2u);
  EXPECT_EQ(std::get<3>(user[0]), "r-1");
  EXPECT_EQ(std::get<3>(user[1]).size(), 36u);
  EXPECT_EQ(Parse(std::get<4>(user[1]))["cs_generated_id"].GetString(), std::get<3>(user[1]));

  rapidjson::Document desired = Parse(R"({"profile":{"system":{"identity":{"hostname":{"hostname":"a"}}},
      "storage":{"nfs":{"mounts":[{"name":"m1","server":"s","export":"/e"}]}}}})");
  SetDesiredUserConfig(desired);
  EXPECT_EQ(Rows(ConfigKind::Desired).size(), 2u);
  desired = Parse(R"({"system":{"identity":{"hostname":{"hostname":"b"}}}})");
  SetDesiredUserConfig(desired);
  // A staged object replaces its own row; a new instance gets an identity.
  auto schemas = HoxSchemaStore::SchemaStore::GetStore();
  ProcessDesiredObject(desired.GetAllocator(), GetDBStore(), "system", "identity", "hostname",
                       HoxSchemaStore::GetSchema("system", "identity", "hostname", schemas),
                       Parse(R"({"hostname":"c"})"));
  ProcessDesiredObject(desired.GetAllocator(), GetDBStore(), "network", "routes", "static",
                       HoxSchemaStore::GetSchema("network", "routes", "static", schemas), Parse(R"({"gateway":"g"})"));
  const auto staged = Rows(ConfigKind::Desired);
  ASSERT_EQ(staged.size(), 2u);
  EXPECT_EQ(std::get<3>(staged[0]).size(), 36u);
  EXPECT_EQ(staged[1], (RowTuple{"system", "identity", "hostname", "", R"({"hostname":"c"})"}));
  rapidjson::Document nic = Parse(R"({"nic":{"port":{"speed":{"gbps":25}}}})");
  SetDesiredSmartnicConfiguration(nic);
  EXPECT_EQ(GetDesiredSmartnicConfiguration(GetDBStore()).size(), 1u);
  EXPECT_TRUE(GetSmartnicConfiguration(GetDBStore()).empty());

  // Defaults are read per key and per instance.
  ImportConfiguration(ConfigKind::Default,
                      Parse(R"({"security":{"accounts":{"users":[{"name":"root"},{"name":"localconsole"}]}}})"));
  auto db = GetDBStore();
  EXPECT_EQ(GetDefaultUserConfigInternal(db, "security", "accounts", "users").Size(), 2u);
  const auto localconsole = GetDefaultUserConfigMapList({"security", "accounts", "users", "localconsole"}, db);
  ASSERT_EQ(localconsole.size(), 1u);
  EXPECT_EQ(localconsole[0]->at("Identifier"), "localconsole");
  EXPECT_EQ(Rows(ConfigKind::User), user);
}

TEST_F(StoreTest, UserConfigChangesUpsertKeepingPositionAndDeleteById) {
  ImportConfiguration(ConfigKind::User, Parse(R"({"storage":{"nfs":{"mounts":[
      {"name":"a","server":"s","export":"/a"},{"name":"b","server":"s","export":"/b"}]}}})"));
  ApplyUserConfigChanges({
      {"SET", {"storage", "nfs", "mounts", "a"}, R"({"name":"a","server":"t","export":"/a"})"},
      {"ADD", {"storage", "nfs", "mounts", "c"}, R"({"name":"c","server":"s","export":"/c"})"},
      {"DELETE", {"storage", "nfs", "mounts", "b"}, ""},
      {"DELETE", {"storage", "nfs", "mounts", "never-there"}, ""},
      {"SET", {"system", "identity", "hostname"}, R"({"hostname":"h"})"},
  });
  const auto rows = Rows(ConfigKind::User);
  ASSERT_EQ(rows.size(), 3u);  // the mounts, then the host name
  EXPECT_EQ(rows[0], (RowTuple{"storage", "nfs", "mounts", "a", R"({"name":"a","server":"t","export":"/a"})"}));
  EXPECT_EQ(std::get<3>(rows[1]), "c");

  // A generated identity named only by the id is written into the value; a
  // deletion may name the instance by its value instead of its id.
  ApplyUserConfigChanges({{"ADD", {"network", "routes", "static", "g-1"}, R"({"destination":"d","gateway":"g"})"}});
  auto route = GetCurrentConfigInternal(GetDBStore(), "network", "routes", "static");
  ASSERT_TRUE(route.IsArray());
  EXPECT_STREQ(route[0]["cs_generated_id"].GetString(), "g-1");
  ApplyUserConfigChanges({{"DELETE", {"network", "routes", "static"}, R"({"cs_generated_id":"g-1"})"}});
  EXPECT_TRUE(GetCurrentConfigInternal(GetDBStore(), "network", "routes", "static").IsNull());

  // An id and a value that name different instances are refused: the row
  // would hold an instance that could never be found by its name.
  EXPECT_THROW(ApplyUserConfigChanges(
                   {{"SET", {"storage", "nfs", "mounts", "a"}, R"({"name":"z","server":"t","export":"/a"})"}}),
               HoxConfigManager::ConfigManagerException);
  EXPECT_EQ(Rows(ConfigKind::User), rows);
}

TEST_F(StoreTest, RowsKeepAutoConfigurationValuesAndBadValuesFailOnlyTheirReader) {
  ApplyUserConfigChanges({{"SET", {"services", "syslog", "config"}, R"({"remoteHost":"h"})"}});
  SetAutoConfValue(ConfigKind::User, {"services", "syslog", "config"}, R"({"protocol":"udp"})");
  EXPECT_EQ(GetUserConfigContents(GetDBStore())[0]->at("AutoConfValue"), R"({"protocol":"udp"})");
  SetAutoConfValue(ConfigKind::User, {"services", "syslog", "config"}, "");
  EXPECT_EQ(GetUserConfigContents(GetDBStore())[0]->count("AutoConfValue"), 0u);

  // A row written by someone else whose value is not JSON.
  StoreSql("UPDATE config_item SET value = '{broken' WHERE name = 'config'");
  EXPECT_EQ(GetUserConfigContents(GetDBStore())[0]->at("Value"), "{broken");
  EXPECT_EQ(ThrownBy([] { GetCurrentConfigInternal(GetDBStore(), "services", "syslog", "config"); }).code, 2080);
}

TEST_F(StoreTest, NamespaceObjectsKeepTheirValuesByteForByteAndAreReplacedWhole) {
  auto global = ConfigStore::GetStore(sGlobalNamespace);
  const ConfigStoreObjectId id("autodeploy", "bootstrap", "hox");
  const std::string xml = "<?xml version=\"1.0\"?>\r\n<rules>\n\t<rule name=\"ünï\"/>\n</rules>\n";
  ConfigStoreObject object(id);
  object.SetValue("waiter_notify", R"({"url":"https://x"})");
  object.SetValue("firewall", xml);
  global->SetObject(object);
  EXPECT_EQ(ConfigStore::GetStore("elsewhere")->GetObject(id), nullptr);
  auto read = global->GetObject(id);
  ASSERT_NE(read, nullptr);
  EXPECT_EQ(read->GetValues(), object.GetValues());
  EXPECT_STREQ(read->GetData()["firewall"].GetString(), xml.c_str());

  ConfigStoreObject smaller(id);
  smaller.SetValue("firewall", "");
  global->SetObject(smaller);
  EXPECT_EQ(global->GetObject(id)->GetValues(), smaller.GetValues());
  global->DeleteObject(id);
  EXPECT_EQ(global->GetObject(id), nullptr);
}

TEST_F(StoreTest, ADamagedBootModeRowIsRefused) {
  // Host state is written and read across processes by the transaction,
  // hoxcfg, boot and concurrency tests; a damaged row is an error, never
  // some mode by accident.
  SetBootMode(BOOTMODE_DESIRED_STAGED);
  for (const char* damaged : {"7", "4x", "", "normal"}) {
    StoreSql(std::string("UPDATE host_state SET value = '") + damaged + "' WHERE name = 'bootMode'");
    EXPECT_THROW(GetBootMode(), ConfigStoreException) << damaged;
  }
}

}  // namespace
}  // namespace hoxcm_test
