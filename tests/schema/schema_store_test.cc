#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <latch>
#include <string>
#include <thread>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

#include "support/json.h"
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
  EXPECT_EQ(store->ListKeys().size(), 17u);

  // "single|multi identity defaults mutable reboot: OPS props|- mm: OPS props|-"
  const auto describe = [&](const char* c, const char* g, const char* k) {
    auto schema = HoxSchemaStore::GetSchema(c, g, k, store);
    const auto ops = [](const std::vector<std::string>& list, bool props) {
      std::string out;
      for (const std::string& op : list) out += op + " ";
      return out + (props ? "props" : "-");
    };
    std::vector<std::string> reboot, mm;
    bool rebootProps = true, mmProps = true;  // must be written either way
    schema->GetRebootOperations(reboot, rebootProps);
    schema->GetMaintenanceModeOperations(mm, mmProps);
    // A multi-instance key is an array of instances; a singleton is its instance.
    const auto& json = schema->GetJsonSchema();
    EXPECT_EQ(&schema->GetInstanceSchema(), schema->IsMultiInstance() ? &json["items"] : &json) << k;
    return std::string(schema->IsMultiInstance() ? "multi " : "single ") +
           schema->GetIdentityMember() + " " + std::to_string(schema->HasDefaultUserConfig()) +
           std::to_string(schema->IsMutableDefault()) + " reboot: " + ops(reboot, rebootProps) +
           " mm: " + ops(mm, mmProps);
  };
  EXPECT_EQ(describe("network", "dns", "config"), "single  10 reboot: - mm: -");
  EXPECT_EQ(describe("network", "interfaces", "vnic"), "multi name 00 reboot: - mm: SET props");
  EXPECT_EQ(describe("network", "firewall", "rules"), "multi name 00 reboot: - mm: ADD DELETE -");
  EXPECT_EQ(describe("network", "vswitch", "portgroups"), "multi name 00 reboot: - mm: DELETE -");
  EXPECT_EQ(describe("system", "kernel", "boot_options"), "single  00 reboot: SET ADD DELETE props mm: -");
  EXPECT_EQ(describe("services", "time", "ntp"), "single  11 reboot: - mm: -");

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
      {"bad/x/trigger_kind", withProperty(R"({"type": "array", "rebootRequired": {"SET": []}})"),
       "need a property of type integer, number, boolean or string"},
      {"bad/x/regex", withProperty(R"({"type": "string", "pattern": "(["})"), "cannot be used"},
      // Constructs only a backtracking matcher offers, and a back-reference
      // number that overflowed the standard library's regex compiler.
      {"bad/x/lookahead", withProperty(R"x({"type": "string", "pattern": "^(?=a)"})x"), "cannot be used"},
      {"bad/x/backreference", withProperty(R"({"type": "string", "pattern": "\\88888888888888888888"})"),
       "cannot be used"},
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
  EXPECT_EQ(store->ListKeys().size(), 18u);
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

TEST(SchemaStoreTest, KeyFilesAreReadWhenTheirKeyIsFirstLookedUp) {
  // Given a store whose index was built, files changed afterwards should be
  // seen as they are at the key's first lookup (a file turned bad is refused
  // with its path and hides nothing else), and as they were from then on.
  hoxcm_test::TempRoot root;
  root.InstallSampleSchemas();
  const std::string singleton = R"({"multiInstance": false, "schema": {"type": "object"}})";
  root.WriteFile(SchemaPath("late/x/turns_bad"), singleton);
  root.WriteFile(SchemaPath("late/x/removed"), singleton);
  root.WriteFile(SchemaPath("late/x/changed"), singleton);
  auto store = SchemaStore::GetStore();
  ASSERT_TRUE(store);
  ASSERT_TRUE(store->Find("network", "dns", "config"));

  root.WriteFile(SchemaPath("late/x/turns_bad"), R"({"multiInstance": false, "schema": {"type": "object", )");
  std::filesystem::remove(root.Path(SchemaPath("late/x/removed")));
  root.WriteFile(SchemaPath("late/x/changed"), R"({"multiInstance": false, "hostSpecific": true,
                                                  "schema": {"type": "object"}})");
  root.WriteFile(SchemaPath("network/dns/config"), "not a schema");

  EXPECT_FALSE(store->Find("late", "x", "turns_bad"));
  EXPECT_EQ(hoxcm_test::ThrownBy([&] { store->GetSchemaInfo("late", "x", "turns_bad"); }).code, 2021);
  EXPECT_FALSE(store->Find("late", "x", "removed"));
  auto changed = store->Find("late", "x", "changed");
  ASSERT_TRUE(changed);
  EXPECT_TRUE(changed->IsHostSpecific());
  EXPECT_TRUE(store->Find("network", "dns", "config")) << "loaded before the change";

  const auto errors = store->GetLoadErrors();
  ASSERT_EQ(errors.size(), 2u);
  EXPECT_EQ(errors[0].rfind(root.Path(SchemaPath("late/x/removed")) + ": ", 0), 0u) << errors[0];
  EXPECT_EQ(errors[1].rfind(root.Path(SchemaPath("late/x/turns_bad")) + ": not valid JSON", 0), 0u) << errors[1];
  EXPECT_EQ(store->ListKeys().size(), 18u);
  EXPECT_FALSE(store->Find("late", "x", "turns_bad")) << "a refusal is kept too";
}

TEST(SchemaStoreTest, ThreadsAskingForTheSameKeyAtOnceShareOneLoad) {
  // Given threads released together, all asking for the same keys, each
  // should get the one schema object of a good key, and nothing for a bad
  // key, which is reported once.
  hoxcm_test::TempRoot root;
  root.InstallSampleSchemas();
  root.WriteFile(SchemaPath("bad/x/key"), R"({"multiInstance": false})");
  auto store = SchemaStore::GetStore();
  ASSERT_TRUE(store);
  constexpr int kThreads = 16;
  const char* const keys[][3] = {{"security", "accounts", "users"}, {"network", "dns", "config"}, {"bad", "x", "key"}};
  std::vector<std::vector<std::shared_ptr<HoxSchemaStore::SchemaObject>>> seen(kThreads);
  std::latch start(kThreads);
  std::vector<std::thread> threads;
  for (auto& slot : seen) {
    threads.emplace_back([&] {
      start.arrive_and_wait();
      for (const auto& k : keys) slot.push_back(store->Find(k[0], k[1], k[2]));
    });
  }
  for (auto& t : threads) t.join();
  for (const auto& slot : seen) {
    ASSERT_EQ(slot.size(), 3u);
    EXPECT_TRUE(slot[0]);
    EXPECT_EQ(slot[0], seen.front()[0]);
    EXPECT_EQ(slot[1], seen.front()[1]);
    EXPECT_FALSE(slot[2]);
  }
  EXPECT_EQ(store->GetLoadErrors().size(), 1u);
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
  HoxConfigManager::Document user = hoxcm_test::SampleDocument("user-config.json");
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
