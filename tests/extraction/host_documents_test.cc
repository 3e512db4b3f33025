// Host document utilities and the row-level steps of extraction: documents
// from store rows, the solution filters, auto-configuration, boot documents.
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/operations.h>
#include <hoxcm/schema_store.h>

#include "extraction/sample_host.h"

namespace hoxcm_test {
namespace {

using HoxConfigManager::Document;
using HoxConfigManager::Value;
using HoxConfigStore::ConfigMap;
using HoxConfigStore::ConfigMapList;

std::string Json(const Value& value) { return HoxConfigManager::JsonToString(value); }

std::shared_ptr<ConfigMap> Row(const std::string& component, const std::string& group, const std::string& key,
                               const std::string& identifier, const std::string& value,
                               const char* autoConf = nullptr) {
  auto row = std::make_shared<ConfigMap>(ConfigMap{{"Component", component},
                                                   {"ConfigGroup", group},
                                                   {"Name", key},
                                                   {"Identifier", identifier},
                                                   {"Value", value}});
  if (autoConf != nullptr) (*row)["AutoConfValue"] = autoConf;
  return row;
}

std::shared_ptr<HoxSchemaStore::SchemaObject> Schema(const char* c, const char* g, const char* k) {
  auto schema = HoxSchemaStore::SchemaStore::GetStore()->Find(c, g, k);
  EXPECT_NE(schema, nullptr) << c << "/" << g << "/" << k;
  return schema;
}

std::vector<std::string> Identifiers(const ConfigMapList& rows) {
  std::vector<std::string> ids;
  for (const auto& row : rows) ids.push_back(row->at("Identifier"));
  return ids;
}

class HostDocumentsTest : public SampleHostTest {};

TEST_F(HostDocumentsTest, SolutionUserInstancesAreFilteredOnlyForNamedIdentityKeys) {
  auto userRow = [](const std::string& name) {
    return Row("security", "accounts", "users", name, R"({"name":")" + name + "\"}");
  };
  const ConfigMapList users = {userRow("root"), userRow("mgmtagent"), userRow("ops"), userRow("localconsole")};
  const ConfigMapList routes = {Row("network", "routes", "static", "mgmtagent", "{}")};
  const ConfigMapList ntp = {Row("services", "time", "ntp", "", "{}")};

  struct Case {
    const char* what;
    ConfigMapList rows;
    std::shared_ptr<HoxSchemaStore::SchemaObject> schema;
    std::vector<std::string> kept;
  };
  const std::vector<Case> cases = {
      {"solution users dropped", users, Schema("security", "accounts", "users"), {"root", "ops"}},
      {"generated identities untouched", routes, Schema("network", "routes", "static"), {"mgmtagent"}},
      {"singleton untouched", ntp, Schema("services", "time", "ntp"), {""}},
      {"empty list", {}, Schema("security", "accounts", "users"), {}},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(Identifiers(HoxConfigManager::FilterSolutionUserInstances(c.rows, c.schema)), c.kept) << c.what;
  }
}

TEST_F(HostDocumentsTest, DocumentFromRowsFollowsTheKeyShape) {
  auto users = Schema("security", "accounts", "users");
  auto ntp = Schema("services", "time", "ntp");
  Document doc;
  HoxConfigManager::CreateDocumentFromMap(
      {Row("security", "accounts", "users", "a", R"({"name":"a"})"),
       Row("security", "accounts", "users", "b", R"({"name":"b"})")},
      users, doc);
  EXPECT_EQ(Json(doc), R"([{"name":"a"},{"name":"b"}])");
  HoxConfigManager::CreateDocumentFromMap({}, users, doc);
  EXPECT_EQ(Json(doc), "[]");
  HoxConfigManager::CreateDocumentFromMap({Row("services", "time", "ntp", "", R"({"enabled":true})")}, ntp, doc);
  EXPECT_EQ(Json(doc), R"({"enabled":true})");
  HoxConfigManager::CreateDocumentFromMap({}, ntp, doc);
  EXPECT_TRUE(doc.IsNull());
  try {
    HoxConfigManager::CreateDocumentFromMap({Row("services", "time", "ntp", "", "{")}, ntp, doc);
    FAIL();
  } catch (const HoxConfigManager::InvalidArgumentException& e) {
    EXPECT_EQ(e.GetErrorCode(), 2080);
  }
}

TEST_F(HostDocumentsTest, ExternalDefaultHidesSolutionUsers) {
  auto users = Schema("security", "accounts", "users");
  auto db = HoxConfigStore::GetDBStore(0, true);
  Document doc;
  HoxConfigManager::GetExternalDefaultUserConfig({"security", "accounts", "users"}, db, users, doc);
  EXPECT_EQ(Json(doc), R"([{"name":"root","shell":"/bin/sh","groups":["root"]}])");
  HoxConfigManager::GetExternalDefaultUserConfig({"services", "time", "ntp"}, db, Schema("services", "time", "ntp"),
                                                 doc);
  EXPECT_EQ(Json(doc), R"({"enabled":false,"servers":[]})");
}

TEST_F(HostDocumentsTest, MapListSkipsSolutionInstancesAndEmptyValues) {
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  Document result;
  result.SetObject();
  HoxConfigManager::ProcessConfigMapList(
      result,
      {Row("security", "accounts", "users", "mgmtagent", R"({"name":"mgmtagent"})"),
       Row("security", "accounts", "users", "localconsole", R"({"name":"localconsole","shell":null})"),
       Row("hox", "system", "installer", "", R"({"mode":null})")},
      store, HoxConfigManager::DOCUMENT_CURRENT);
  // mgmtagent was created by a solution; localconsole is only a solution user; the
  // installer item holds nothing once nulls are gone.
  EXPECT_EQ(Json(result), R"({"security":{"accounts":{"users":[{"name":"localconsole"}]}}})");
}

TEST_F(HostDocumentsTest, AutoConfigurationFillsMissingRequiredProperties) {
  auto ntp = Schema("services", "time", "ntp");
  auto syslog = Schema("services", "syslog", "config");
  struct Case {
    const char* what;
    std::shared_ptr<HoxSchemaStore::SchemaObject> schema;
    const char* value;
    const char* autoConf;
    const char* expected;
  };
  const std::vector<Case> cases = {
      {"required property patched", ntp, R"({"servers":["a"]})", R"({"enabled":true})",
       R"({"servers":["a"],"enabled":true})"},
      {"nothing to patch", ntp, R"({"enabled":false})", R"({"enabled":true})", R"({"enabled":false})"},
      {"no auto configuration", ntp, R"({"servers":[]})", "", R"({"servers":[]})"},
      {"missing union tag patched", syslog, R"({"remoteHost":"x"})", R"({"protocol":"tcp"})",
       R"({"remoteHost":"x","protocol":"tcp"})"},
      {"finding without auto configuration value", syslog, R"({"port":1})", R"({"protocol":"tcp"})",
       R"({"port":1,"protocol":"tcp"})"},
  };
  for (const Case& c : cases) {
    Document value;
    HoxConfigManager::ParseDocument(c.value, value);
    HoxConfigManager::ProcessAutoConfig(value, c.schema->GetInstanceSchema(), c.autoConf, value.GetAllocator());
    EXPECT_EQ(Json(value), c.expected) << c.what;
  }
  Document value;
  HoxConfigManager::ParseDocument("{}", value);
  EXPECT_THROW(HoxConfigManager::ProcessAutoConfig(value, ntp->GetInstanceSchema(), "{", value.GetAllocator()),
               HoxConfigManager::InvalidArgumentException);

  // Through the map list: the stored row lacks "enabled".
  Document result;
  result.SetObject();
  const ConfigMapList rows = {Row("services", "time", "ntp", "", R"({"servers":[]})", R"({"enabled":true})")};
  HoxConfigManager::ProcessConfigMapList(result, rows, HoxSchemaStore::SchemaStore::GetStore(),
                                         HoxConfigManager::DOCUMENT_CURRENT);
  EXPECT_EQ(Json(result["services"]["time"]["ntp"]), R"({"servers":[],"enabled":true})");
}

TEST_F(HostDocumentsTest, MergedBootDocumentIsWrittenOnlyWhenEveryKeyHasASchema) {
  root_.WriteFile("/sys/class/dmi/id/product_uuid", "4C4C4544-0042-3510-8053-B4C04F4E3132\n");
  root_.WriteFile("/tmp/good.json", R"({"services":{"time":{"ntp":{"enabled":true}}}})");
  root_.WriteFile("/tmp/bad.json", R"({"services":{"time":{"sundial":{"enabled":true}}}})");

  HoxConfigManager::CreateMergedBootDocument(root_.Path("/tmp/good.json"), root_.Path("/tmp/out.json"));
  EXPECT_EQ(root_.ReadFile("/tmp/out.json"), R"({"services":{"time":{"ntp":{"enabled":true}}}})");

  try {
    HoxConfigManager::CreateMergedBootDocument(root_.Path("/tmp/bad.json"), root_.Path("/tmp/out2.json"));
    FAIL();
  } catch (const HoxConfigManager::SchemaNotFound& e) {
    EXPECT_EQ(e.GetErrorCode(), 2021);
    EXPECT_NE(std::string(e.what()).find("sundial"), std::string::npos) << e.what();
  }
  EXPECT_FALSE(HoxConfigManager::fileExists(root_.Path("/tmp/out2.json")));
  EXPECT_THROW(HoxConfigManager::CreateMergedBootDocument(root_.Path("/tmp/none.json"), root_.Path("/tmp/out3.json")),
               HoxConfigManager::ConfigManagerException);
}

}  // namespace
}  // namespace hoxcm_test

namespace hoxcm_test {
namespace {

TEST(StoreValueParsingTest, NonAsciiTextIsStillValidatedAtEveryOffset) {
  // Store values are mostly ASCII and skip the per-character check; a single
  // byte of invalid UTF-8 anywhere (inside a machine word or in the tail)
  // must still be refused, and valid multi-byte text must still parse.
  const std::string prefix = R"({"s":")";
  for (std::size_t padding = 0; padding < 17; ++padding) {
    const std::string ascii(padding, 'a');
    Document doc;
    EXPECT_THROW(HoxConfigManager::ParseDocument(prefix + ascii + "\xff\"}", doc),
                 HoxConfigManager::InvalidArgumentException)
        << padding;
    ASSERT_NO_THROW(HoxConfigManager::ParseDocument(prefix + ascii + "Z\xc3\xbcrich\"}", doc)) << padding;
    EXPECT_EQ(std::string(doc["s"].GetString()), ascii + "Z\xc3\xbcrich");
  }
}

}  // namespace
}  // namespace hoxcm_test
