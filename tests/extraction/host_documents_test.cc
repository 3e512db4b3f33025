// Host document utilities and the row-level steps of extraction: documents
// from store rows, the solution filters, auto-configuration, boot documents.
#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/extraction.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

#include "extraction/sample_host.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;
using HoxConfigStore::ConfigMap;

std::shared_ptr<ConfigMap> Row(const std::string& component, const std::string& group, const std::string& key,
                               const std::string& identifier, const std::string& value,
                               const char* autoConf = nullptr) {
  auto row = std::make_shared<ConfigMap>(ConfigMap{
      {"Component", component}, {"ConfigGroup", group}, {"Name", key}, {"Identifier", identifier}, {"Value", value}});
  if (autoConf != nullptr) (*row)["AutoConfValue"] = autoConf;
  return row;
}

std::shared_ptr<HoxSchemaStore::SchemaObject> Schema(const char* c, const char* g, const char* k) {
  auto schema = HoxSchemaStore::SchemaStore::GetStore()->Find(c, g, k);
  EXPECT_NE(schema, nullptr) << c << "/" << g << "/" << k;
  return schema;
}

using HostDocumentsTest = SampleHostTest;

TEST_F(HostDocumentsTest, DocumentFromRowsFollowsTheKeyShapeAndDefaultsHideSolutionUsers) {
  // Rows of stored items are read by the extraction tests; here no rows at
  // all, and the external default without the solution users.
  auto users = Schema("security", "accounts", "users");
  auto ntp = Schema("services", "time", "ntp");
  Document doc;
  CreateDocumentFromMap({}, users, doc);
  EXPECT_EQ(JsonToString(doc), "[]");
  CreateDocumentFromMap({}, ntp, doc);
  EXPECT_TRUE(doc.IsNull());
  auto db = HoxConfigStore::GetDBStore(0, true);
  GetExternalDefaultUserConfig({"security", "accounts", "users"}, db, users, doc);
  EXPECT_EQ(JsonToString(doc), R"([{"name":"root","shell":"/bin/sh","groups":["root"]}])");
  GetExternalDefaultUserConfig({"services", "time", "ntp"}, db, ntp, doc);
  EXPECT_EQ(JsonToString(doc), R"({"enabled":false,"servers":[]})");
}

TEST_F(HostDocumentsTest, MapListSkipsSolutionInstancesAndEmptyValuesAndPatchesAutoConfiguration) {
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  const std::pair<DocumentType, const char*> empty[] = {
      {DOCUMENT_CURRENT, "{}"}, {DOCUMENT_PROFILE, R"({"profile":{}})"}, {DOCUMENT_DESIRED, "{}"}};
  for (const auto& [type, expected] : empty) {
    Document result;
    result.SetObject();
    ProcessConfigMapList(result, {}, store, type);
    EXPECT_EQ(JsonToString(result), expected) << "type " << type;
  }
  // mgmtagent was created by a solution; localconsole is only a solution
  // user; the installer item holds nothing once nulls are gone; the stored
  // ntp row lacks "enabled", which auto-configuration supplies.
  Document result;
  result.SetObject();
  ProcessConfigMapList(result,
                       {Row("security", "accounts", "users", "mgmtagent", R"({"name":"mgmtagent"})"),
                        Row("security", "accounts", "users", "localconsole", R"({"name":"localconsole","shell":null})"),
                        Row("hox", "system", "installer", "", R"({"mode":null})"),
                        Row("services", "time", "ntp", "", R"({"servers":[]})", R"({"enabled":true})")},
                       store, DOCUMENT_CURRENT);
  EXPECT_EQ(JsonToString(result), R"({"security":{"accounts":{"users":[{"name":"localconsole"}]}},)"
                                  R"("services":{"time":{"ntp":{"servers":[],"enabled":true}}}})");
}

TEST_F(HostDocumentsTest, AutoConfigurationFillsMissingRequiredProperties) {
  // A missing required property is patched in the map-list test above.
  auto ntp = Schema("services", "time", "ntp");
  auto syslog = Schema("services", "syslog", "config");
  const struct {
    const char* what;
    std::shared_ptr<HoxSchemaStore::SchemaObject> schema;
    const char *value, *autoConf, *expected;
  } cases[] = {
      {"nothing to patch", ntp, R"({"enabled":false})", R"({"enabled":true})", R"({"enabled":false})"},
      {"no auto configuration", ntp, R"({"servers":[]})", "", R"({"servers":[]})"},
      {"missing union tag patched", syslog, R"({"remoteHost":"x"})", R"({"protocol":"tcp"})",
       R"({"remoteHost":"x","protocol":"tcp"})"},
      {"finding without auto configuration value", syslog, R"({"port":1})", R"({"protocol":"tcp"})",
       R"({"port":1,"protocol":"tcp"})"},
  };
  for (const auto& c : cases) {
    Document value;
    ParseDocument(c.value, value);
    ProcessAutoConfig(value, c.schema->GetInstanceSchema(), c.autoConf, value.GetAllocator());
    EXPECT_EQ(JsonToString(value), c.expected) << c.what;
  }
  Document value;
  ParseDocument("{}", value);
  EXPECT_THROW(ProcessAutoConfig(value, ntp->GetInstanceSchema(), "{", value.GetAllocator()), InvalidArgumentException);
}

TEST_F(HostDocumentsTest, MergedBootDocumentIsWrittenOnlyWhenEveryKeyHasASchema) {
  root_.WriteFile("/sys/class/dmi/id/product_uuid", "4C4C4544-0042-3510-8053-B4C04F4E3132\n");
  root_.WriteFile("/tmp/good.json", R"({"services":{"time":{"ntp":{"enabled":true}}}})");
  root_.WriteFile("/tmp/bad.json", R"({"services":{"time":{"sundial":{"enabled":true}}}})");
  CreateMergedBootDocument(root_.Path("/tmp/good.json"), root_.Path("/tmp/out.json"));
  EXPECT_EQ(root_.ReadFile("/tmp/out.json"), R"({"services":{"time":{"ntp":{"enabled":true}}}})");

  const Thrown unknown = ThrownBy([&] { CreateMergedBootDocument(root_.Path("/tmp/bad.json"), root_.Path("/tmp/o2")); });
  EXPECT_EQ(unknown.code, 2021);
  EXPECT_NE(unknown.message.find("sundial"), std::string::npos) << unknown.message;
  EXPECT_FALSE(fileExists(root_.Path("/tmp/o2")));
  EXPECT_GT(ThrownBy([&] { CreateMergedBootDocument(root_.Path("/tmp/none.json"), root_.Path("/tmp/o3")); }).code, 0);
}

TEST(StoreValueParsingTest, NonAsciiTextIsStillValidatedAtEveryOffset) {
  // Store values are mostly ASCII and skip the per-character check; a single
  // byte of invalid UTF-8 anywhere (inside a machine word or in the tail)
  // must still be refused, and valid multi-byte text must still parse.
  for (std::size_t padding = 0; padding < 17; ++padding) {
    const std::string text = R"({"s":")" + std::string(padding, 'a');
    Document doc;
    EXPECT_THROW(ParseDocument(text + "\xff\"}", doc), InvalidArgumentException) << padding;
    ASSERT_NO_THROW(ParseDocument(text + "Z\xc3\xbcrich\"}", doc)) << padding;
    EXPECT_EQ(std::string(doc["s"].GetString()), std::string(padding, 'a') + "Z\xc3\xbcrich");
  }
}

}  // namespace
}  // namespace hoxcm_test
