#include <gtest/gtest.h>

#include <string>
#include <thread>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

#include "platform/schema/prepared_schema.h"
#include "support/json.h"
#include "support/temp_root.h"

using HoxConfigManager::Document;
using HoxConfigManager::JsonToString;
using JsonValidator::detail::UsesKeySchemas;

namespace {

// The sample configuration with faults of every kind the levels and keys
// can have, and the host document schema generated for it beforehand.
struct FaultyHost {
  FaultyHost() {
    root.InstallSampleSchemas();
    doc = hoxcm_test::SampleDocument("user-config.json");
    EXPECT_TRUE(HoxConfigManager::GenerateHostDocumentSchema(doc, schema));
    auto& a = doc.GetAllocator();
    auto& vnics = doc["network"]["interfaces"]["vnic"];
    vnics[0]["mtu"].SetString("jumbo", a);
    vnics[1]["mtu"] = 9600;
    vnics[2].RemoveMember("name");
    doc["storage"]["iscsi"]["targets"][0]["chapSecret"].SetString("tiny-secret", a);
    doc["services"]["syslog"]["config"]["protocol"] = "tls";
    doc["hox"].SetString("not a component", a);
    doc.AddMember("ghost", rapidjson::Value(rapidjson::kObjectType), a);
    doc.AddMember("another_ghost", rapidjson::Value(rapidjson::kObjectType), a);
    doc["system"].AddMember("ghost", rapidjson::Value(rapidjson::kObjectType), a);
    doc["network"]["dns"].AddMember("ghost", rapidjson::Value(rapidjson::kArrayType), a);
  }

  // The same schema as the engine compiles it whole: a member the store
  // never writes makes it one the store did not generate.
  Document Whole() const {
    Document whole;
    whole.CopyFrom(schema, whole.GetAllocator());
    whole.AddMember("description", "edited", whole.GetAllocator());
    return whole;
  }

  hoxcm_test::TempRoot root;
  Document doc;
  Document schema;
};

std::string Findings(const Document& schema, const Document& doc, const std::string& context = "") {
  Document result;
  JsonValidator::ValidateCMDocument(schema, doc, result, {}, context);
  return JsonToString(result);
}

}  // namespace

TEST(HostDocumentValidationTest, KeySchemasCompiledOnceGiveTheWholeSchemasFindings) {
  // Given a store-generated host document schema, validating with the keys'
  // compiled schemas should report exactly what the engine reports on the
  // whole schema: the same findings, fields, arguments, texts and order.
  FaultyHost host;
  const Document whole = host.Whole();
  ASSERT_TRUE(UsesKeySchemas(host.schema));
  ASSERT_FALSE(UsesKeySchemas(whole));
  for (const std::string context : {"", "/profile"}) {
    const std::string expected = Findings(whole, host.doc, context);
    EXPECT_EQ(Findings(host.schema, host.doc, context), expected);
    // Every kind above is there: levels, unknown keys, key faults, unions.
    for (const std::string field :
         {"/hox", "/ghost", "/system/ghost", "/network/dns/ghost", "/network/interfaces/vnic/0/mtu",
          "/network/interfaces/vnic/1/mtu", "/network/interfaces/vnic/2/name", "/storage/iscsi/targets/0/chapSecret",
          "/services/syslog/config/caFile"}) {
      const std::string quoted = "\"" + context + field + "\"";
      EXPECT_NE(expected.find(quoted), std::string::npos) << quoted << " in " << expected;
    }
  }
}

TEST(HostDocumentValidationTest, ASchemaThatDiffersFromTheStoresIsValidatedAsGiven) {
  // Given a host document schema whose key node is not the store's (edited,
  // or generated from a schema file since replaced), the findings should
  // follow that schema, never the key's compiled one; a key node the
  // engine cannot use makes the schema unusable, as before.
  hoxcm_test::TempRoot root;
  root.InstallSampleSchemas();
  const Document doc = hoxcm_test::SampleDocument("user-config.json");
  Document schema;
  ASSERT_TRUE(HoxConfigManager::GenerateHostDocumentSchema(doc, schema));
  ASSERT_EQ(Findings(schema, doc), "[]");
  struct Case {
    const char* edit;
    const char* value;
    const char* expected;
  } cases[] = {
      {"maximum", "1500", R"("field":"/network/interfaces/vnic/1/mtu","errId":5)"},
      {"pattern", R"("(")", R"("field":"","errId":31)"},
  };
  for (const Case& c : cases) {
    Document edited;
    edited.CopyFrom(schema, edited.GetAllocator());
    auto& mtu = edited["properties"]["network"]["properties"]["interfaces"]["properties"]["vnic"]["items"]
                      ["properties"]["mtu"];
    Document value;
    value.Parse(c.value);
    mtu.RemoveMember(c.edit);
    mtu.AddMember(rapidjson::StringRef(c.edit), rapidjson::Value(value, edited.GetAllocator()), edited.GetAllocator());
    EXPECT_FALSE(UsesKeySchemas(edited)) << c.edit;
    EXPECT_NE(Findings(edited, doc).find(c.expected), std::string::npos) << Findings(edited, doc);
  }
}

TEST(HostDocumentValidationTest, ConcurrentValidationsShareOneCompilation) {
  // Given keys not compiled yet, threads validating at once should compile
  // each key once between them and all report what the whole schema gives.
  FaultyHost host;
  const std::string expected = Findings(host.Whole(), host.doc);
  std::vector<std::string> found(6);
  std::vector<std::thread> threads;
  for (auto& slot : found) threads.emplace_back([&slot, &host] { slot = Findings(host.schema, host.doc); });
  for (auto& t : threads) t.join();
  for (const auto& f : found) EXPECT_EQ(f, expected);
}
