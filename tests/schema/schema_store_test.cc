#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/schema_store.h>

#include "support/temp_root.h"
#include "support/thrown.h"

using HoxSchemaStore::SchemaObjectId;
using HoxSchemaStore::SchemaStore;

namespace {

constexpr const char* kSchemaDir = "/usr/lib/tarvik/configmanager/schemas";

std::string SchemaPath(const std::string& cgk) { return std::string(kSchemaDir) + "/" + cgk + ".json"; }

}  // namespace

TEST(SchemaStoreTest, SampleKeysAnswerEveryQueryAsTheirFilesDeclare) {
  // Given the sample schemas, every key should load and describe itself as
  // its file says, with the property-level flags derived from the properties.
  hoxcm_test::TempRoot root;
  root.InstallSampleSchemas();
  auto store = SchemaStore::GetStore();
  ASSERT_TRUE(store);
  EXPECT_TRUE(store->GetLoadErrors().empty());
  EXPECT_EQ(store->ListKeys().size(), 16u);

  struct Case {
    const char *c, *g, *k;
    bool multi;
    const char* identity;
    bool defaults, mutableDefault;
    std::vector<std::string> reboot;
    bool rebootProps;
    std::vector<std::string> mm;
    bool mmProps;
  };
  const Case cases[] = {
      {"network", "dns", "config", false, "", true, false, {}, false, {}, false},
      {"network", "interfaces", "vnic", true, "name", false, false, {}, false, {"SET"}, true},
      {"network", "firewall", "rules", true, "name", false, false, {}, false, {"ADD", "DELETE"}, false},
      {"system", "kernel", "boot_options", false, "", false, false, {"SET"}, true, {}, false},
      {"services", "time", "ntp", false, "", true, true, {}, false, {}, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(std::string(c.c) + "/" + c.g + "/" + c.k);
    auto schema = HoxSchemaStore::GetSchema(c.c, c.g, c.k, store);
    ASSERT_TRUE(schema);
    EXPECT_EQ(schema->IsMultiInstance(), c.multi);
    EXPECT_EQ(schema->GetIdentityMember(), c.identity);
    EXPECT_EQ(schema->HasDefaultUserConfig(), c.defaults);
    EXPECT_EQ(schema->IsMutableDefault(), c.mutableDefault);
    std::vector<std::string> ops;
    bool props = !c.rebootProps;
    EXPECT_EQ(schema->GetRebootOperations(ops, props), 0);
    EXPECT_EQ(std::make_pair(ops, props), std::make_pair(c.reboot, c.rebootProps));
    props = !c.mmProps;
    EXPECT_EQ(schema->GetMaintenanceModeOperations(ops, props), 0);
    EXPECT_EQ(std::make_pair(ops, props), std::make_pair(c.mm, c.mmProps));
    // A multi-instance key is an array of instances; a singleton is its instance.
    const auto& json = schema->GetJsonSchema();
    EXPECT_STREQ(json["type"].GetString(), c.multi ? "array" : "object");
    EXPECT_EQ(&schema->GetInstanceSchema(), c.multi ? &json["items"] : &json);
  }

  auto users = store->Find("security", "accounts", "users");
  ASSERT_TRUE(users);
  EXPECT_EQ(users->GetSolutionUserNames(), (std::vector<std::string>{"mgmtagent", "localconsole"}));
  EXPECT_EQ(users->GetSolutionInstanceIds(), (std::vector<std::string>{"mgmtagent"}));
  EXPECT_EQ(store->GetMutableDefaultIds(), (std::set<SchemaObjectId>{{"services", "time", "ntp"}}));
  // Instances of store-generated identities may carry that member.
  auto routes = store->Find("network", "routes", "static");
  EXPECT_EQ(routes->GetIdentityMember(), "cs_generated_id");
  EXPECT_TRUE(routes->GetInstanceSchema()["properties"].HasMember("cs_generated_id"));
  EXPECT_TRUE(store->Find("network", "interfaces", "vnic")->IsHostSpecific());
  EXPECT_FALSE(store->Find("network", "dns", "config")->IsHostSpecific());
  EXPECT_NE(store->GetSchemaInfo("network", "routes", "static").find("/schemas/network/routes/static.json"),
            std::string::npos);
  const auto unknown = hoxcm_test::ThrownBy([&] { store->GetSchemaInfo("network", "routes", "dynamic"); });
  EXPECT_EQ(unknown.code, 2021);
  EXPECT_EQ(unknown.message, "Schema object not found: network:routes:dynamic");
  EXPECT_FALSE(store->Find("network", "routes", "dynamic"));
}

TEST(SchemaStoreTest, MalformedFilesAreReportedWithTheirPathAndHideNothingElse) {
  // Given a tree with good and bad schema files, each bad file should be
  // named in the load errors and every good key should still be served.
  hoxcm_test::TempRoot root;
  root.InstallSampleSchemas();
  const std::string object =
      R"("schema": {"type": "object", "properties": {"a": {"type": "string"}}, "required": ["a"]})";
  // A singleton key whose one property "a" is `property`.
  auto withProperty = [](const std::string& property) {
    return R"({"multiInstance": false, "schema": {"type": "object", "properties": {"a": )" + property + "}}}";
  };
  struct Bad {
    const char* key;
    std::string content;  // empty: a directory where a key file belongs
    const char* reason;
  };
  const Bad bad[] = {
      {"bad/x/syntax", "{\"multiInstance\": false,", "not valid JSON"},
      {"bad/x/unknown", "{\"multiInstance\": false, \"multi\": true, " + object + "}", "unknown member \"multi\""},
      {"bad/x/noidentity", "{\"multiInstance\": true, " + object + "}", "needs \"identity\""},
      {"bad/x/optional_identity",
       R"({"multiInstance": true, "identity": "a", "schema": {"type": "object", "properties": {"a": {"type": "string"}}}})",
       "must be a required property"},
      {"bad/x/secret_identity",
       R"({"multiInstance": true, "identity": "a", "schema": {"type": "object",)"
       R"( "properties": {"a": {"type": "string", "sensitive": true}}, "required": ["a"]}})",
       "cannot be sensitive"},
      {"bad/x/operation", "{\"multiInstance\": false, \"rebootRequired\": [\"REBOOT\"], " + object + "}", "\"REBOOT\""},
      {"bad/x/trigger", withProperty(R"({"type": "integer", "rebootRequired": [1]})"), "must be {\"SET\""},
      {"bad/x/trigger_type", withProperty(R"({"type": "integer", "rebootRequired": {"SET": ["1"]}})"),
       "must be of the property's type \"integer\""},
      {"bad/x/regex", withProperty(R"({"type": "string", "pattern": "(["})"), "invalid regular expression"},
      {"bad/x/long_regex", withProperty(R"({"type": "string", "pattern": ")" + std::string(200000, 'a') + "\"}"),
       "longer than 4096 bytes"},
      {"bad/x/engine", R"({"multiInstance": false, "schema": {"type": "object", "minLength": "x"}})", "not usable"},
      {"bad/x/array", R"({"multiInstance": false, "schema": {"type": "array"}})", "\"type\": \"object\""},
      {"bad/x/mutable", "{\"multiInstance\": false, \"mutableDefault\": true, " + object + "}",
       "needs \"defaultUserConfig\""},
      {"bad/x/huge", "{\"multiInstance\": false, " + object + std::string(4 << 20, ' ') + "}", "larger than 4 MiB"},
      {"bad/shallow", "{}", "not at <component>/<group>/<key>.json"},
      {"bad/x/y", "", "not at <component>/<group>/<key>.json"},
  };
  for (const Bad& b : bad) {
    if (b.content.empty()) {  // holding a link back up
      std::filesystem::create_directories(root.Path(std::string(kSchemaDir) + "/" + b.key));
      std::filesystem::create_directory_symlink(root.Path(kSchemaDir),
                                                root.Path(std::string(kSchemaDir) + "/" + b.key + "/loop"));
    } else {
      root.WriteFile(SchemaPath(b.key), b.content);
    }
  }
  root.WriteFile(SchemaPath("good/x/fine"), "{\"multiInstance\": false, " + object + "}");

  auto store = SchemaStore::GetStore();
  ASSERT_TRUE(store);
  const auto errors = store->GetLoadErrors();
  EXPECT_EQ(errors.size(), std::size(bad));
  for (const Bad& b : bad) {
    const std::string path = root.Path(b.content.empty() ? std::string(kSchemaDir) + "/" + b.key : SchemaPath(b.key));
    auto it =
        std::find_if(errors.begin(), errors.end(), [&](const std::string& e) { return e.rfind(path + ": ", 0) == 0; });
    ASSERT_NE(it, errors.end()) << b.key;
    EXPECT_NE(it->find(b.reason), std::string::npos) << *it;
  }
  EXPECT_TRUE(store->Find("good", "x", "fine"));
  EXPECT_TRUE(store->Find("network", "dns", "config"));
  EXPECT_FALSE(store->Find("bad", "x", "unknown"));
  EXPECT_EQ(store->ListKeys().size(), 17u);
}

TEST(SchemaStoreTest, StoresAreCachedPerRoot) {
  std::shared_ptr<SchemaStore> first;
  {
    hoxcm_test::TempRoot root;
    // No schema directory: no store, and the answer is not remembered.
    EXPECT_FALSE(SchemaStore::GetStore());
    EXPECT_FALSE(SchemaStore::GetCache());
    root.InstallSampleSchemas();
    first = SchemaStore::GetStore();
    ASSERT_TRUE(first);
    EXPECT_EQ(SchemaStore::GetStore(), first);
    EXPECT_EQ(SchemaStore::GetCache()->GetStore(), first);
    // Loaded once: a file added later is not seen by this process.
    root.WriteFile(SchemaPath("late/x/key"), R"({"multiInstance": false, "schema": {"type": "object"}})");
    EXPECT_FALSE(SchemaStore::GetStore()->Find("late", "x", "key"));
  }
  hoxcm_test::TempRoot other;
  // Threads asking at once share one store.
  other.InstallSampleSchemas();
  std::vector<std::shared_ptr<SchemaStore>> seen(8);
  std::vector<std::thread> threads;
  for (auto& slot : seen) threads.emplace_back([&slot] { slot = SchemaStore::GetStore(); });
  for (auto& t : threads) t.join();
  for (const auto& s : seen) EXPECT_EQ(s, seen.front());
  auto second = SchemaStore::GetStore();
  ASSERT_TRUE(second);
  EXPECT_NE(second, first);
  EXPECT_FALSE(second->Find("late", "x", "key"));
}

TEST(SchemaStoreTest, HostDocumentSchemaCoversKnownKeysAndNamesOrRefusesTheRest) {
  using hoxcm_test::ThrownBy;
  hoxcm_test::TempRoot root;
  HoxConfigManager::Document out;
  // No schema directory: the store cannot be reached.
  const HoxConfigManager::Document empty(rapidjson::kObjectType);
  EXPECT_EQ(ThrownBy([&] { HoxConfigManager::GenerateHostDocumentSchema(empty, out); }).code, 2180);
  EXPECT_EQ(ThrownBy([&] { HoxSchemaStore::GenerateSchemaDocument(empty, nullptr, out); }).code, 2180);
  root.InstallSampleSchemas();
  for (const char* text : {R"([])", R"({"network": 1})", R"({"network": {"dns": []}})", R"({"profile": "x"})"}) {
    HoxConfigManager::Document doc;
    HoxConfigManager::ParseDocument(text, doc);
    EXPECT_EQ(ThrownBy([&] { HoxConfigManager::GenerateHostDocumentSchema(doc, out); }).code, 2000) << text;
  }

  // Keys without schema are named (the "profile" wrapper is looked through
  // by the hoxcfg test).
  HoxConfigManager::Document user;
  HoxConfigManager::CreateDocumentFromFile(hoxcm_test::SourcePath("data/sample-host/user-config.json").c_str(), user);
  user["network"]["dns"].AddMember("resolver", HoxConfigManager::Value(rapidjson::kObjectType), user.GetAllocator());
  user["storage"].AddMember("fc", HoxConfigManager::Value(rapidjson::kObjectType), user.GetAllocator());
  user["storage"]["fc"].AddMember("ports", HoxConfigManager::Value(rapidjson::kArrayType), user.GetAllocator());
  HoxConfigManager::Document errors;
  ASSERT_FALSE(HoxConfigManager::GenerateHostDocumentSchema(user, errors));
  ASSERT_TRUE(errors.IsArray());
  ASSERT_EQ(errors.Size(), 2u);
  EXPECT_STREQ(errors[0]["field"].GetString(), "/network/dns/resolver");
  EXPECT_EQ(errors[0]["errId"].GetInt(), 30);
  EXPECT_STREQ(errors[1]["errArgs"][0].GetString(), "storage:fc:ports");
}
