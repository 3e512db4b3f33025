// References inside schemas, and member names that need escaping in the
// paths of findings.
#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <utility>
#include <vector>

#include <hoxcm/config_document.h>
#include <hoxcm/documents.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

#include "support/json.h"
#include "support/temp_root.h"

namespace hoxcm_test {
namespace {

using Findings = std::vector<std::pair<std::string, int>>;

Findings Check(const std::string& schema, const std::string& doc) {
  HoxConfigManager::Document result;
  JsonValidator::Validate(Parse(schema), Parse(doc), result, {}, "");
  Findings out;
  for (const auto& e : result.GetArray()) out.emplace_back(e["field"].GetString(), e["errId"].GetInt());
  return out;
}

TEST(ReferencesTest, OnlyReferencesIntoTheSchemaItselfAreFollowed) {
  // Given references the engine would resolve against a document it never
  // fetches (or against itself, without end), the validator should refuse
  // the schema (31) instead of recursing; usable spellings keep working.
  const std::string defs = R"("definitions": {"int": {"type": "integer"}, "a/b~": {"type": "integer"},
                                "p%": {"type": "integer"}, "one": 1, "list": [{"type": "integer"}]})";
  const std::vector<std::pair<std::string, Findings>> cases = {
      {R"("x")", {{"", 31}}},
      {R"("/abs")", {{"", 31}}},
      {R"("%23")", {{"", 31}}},
      {R"("http://example.com/s.json")", {{"", 31}}},
      {R"("x#/definitions/int")", {{"", 31}}},
      {R"("#int")", {{"", 31}}},
      {R"("#/")", {{"", 31}}},
      {R"("#//definitions/int")", {{"", 31}}},
      {R"("#/definitions/int/")", {{"", 31}}},
      {R"("#/definitions/missing")", {{"", 31}}},
      {R"("#/definitions/a~2")", {{"", 31}}},
      {R"("#/definitions/p%2")", {{"", 31}}},
      {R"("#/definitions/one")", {{"", 31}}},
      {R"("#/definitions/list/01")", {{"", 31}}},
      {"5", {{"", 31}}},
      {R"("#/definitions/int")", {{"/v", 2}}},
      {R"("#/definitions/a~1b~0")", {{"/v", 2}}},
      {R"("#/definitions/p%25")", {{"/v", 2}}},
      {R"("#/definitions/list/0")", {{"/v", 2}}},
  };
  for (const auto& [ref, expected] : cases) {
    // The reference sits in each place a subschema may sit.
    for (const char* place :
         {R"("properties": {"v": {"$ref": REF}})", R"("items": [{"$ref": REF}])",
          R"("dependencies": {"v": {"$ref": REF}})", R"("not": {"not": {"$ref": REF}})"}) {
      std::string node = place;
      node.replace(node.find("REF"), 3, ref);
      const std::string schema = "{" + defs + ", " + node + "}";
      // Usable references are checked where they describe "v".
      const bool refused = expected.front().second == 31;
      if (refused || node.starts_with("\"properties\"")) {
        EXPECT_EQ(Check(schema, R"({"v": "x"})"), expected) << schema;
      }
    }
  }
  // A reference to the root is fine where it recurses into the document.
  EXPECT_EQ(Check(R"({"properties": {"child": {"$ref": "#"}}, "type": "object"})", R"({"child": {"child": 1}})"),
            (Findings{{"/child/child", 2}}));
}

TEST(ReferencesTest, KeySchemasKeepTheirReferencesWhereverTheyAreEmbedded) {
  // Given keys whose schemas refer to their own definitions, a singleton and
  // a multi-instance key, both should load, and their references should
  // hold in the key's schema and in the schema of a whole host document.
  TempRoot root;
  const std::string definitions = R"("definitions": {"port": {"type": "integer", "maximum": 65535}})";
  root.WriteFile("/usr/lib/tarvik/configmanager/schemas/t/refs/single.json",
                 R"({"multiInstance": false, "schema": {"type": "object", )" + definitions +
                     R"(, "properties": {"port": {"$ref": "#/definitions/port"}}}})");
  root.WriteFile("/usr/lib/tarvik/configmanager/schemas/t/refs/multi.json",
                 R"({"multiInstance": true, "identity": "name", "schema": {"type": "object", )" + definitions +
                     R"(, "required": ["name"], "properties": {"name": {"type": "string"},
                        "port": {"$ref": "#/definitions/port"}}}})");
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  ASSERT_TRUE(store);
  EXPECT_TRUE(store->GetLoadErrors().empty()) << store->GetLoadErrors().front();
  auto multi = store->Find("t", "refs", "multi");
  ASSERT_TRUE(multi);
  HoxConfigManager::Document result;
  JsonValidator::Validate(multi->GetJsonSchema(), Parse(R"([{"name": "a", "port": 70000}])"), result, {}, "");
  EXPECT_EQ(HoxConfigManager::JsonToString(result[0]["field"]), R"("/0/port")");

  const HoxConfigManager::Document doc =
      Parse(R"({"t": {"refs": {"single": {"port": "x"}, "multi": [{"name": "a", "port": 70000}]}}})");
  HoxConfigManager::Document schema;
  ASSERT_TRUE(HoxConfigManager::GenerateHostDocumentSchema(doc, schema));
  JsonValidator::ValidateCMDocument(schema, doc, result, {}, "");
  Findings found;
  for (const auto& e : result.GetArray()) found.emplace_back(e["field"].GetString(), e["errId"].GetInt());
  std::sort(found.begin(), found.end());
  EXPECT_EQ(found, (Findings{{"/t/refs/multi/0/port", 5}, {"/t/refs/single/port", 2}}))
      << HoxConfigManager::JsonToString(result);
}

TEST(ReferencesTest, FindingPathsEscapeMemberNamesBothWays) {
  // Given members named like paths ("/dev/sda", "a~b"), the fields of the
  // findings should be JSON pointers that lead back to those members, so
  // that patching a missing member from them changes the right object.
  const std::string schema = R"({"type": "object", "additionalProperties": {
      "type": "object", "required": ["size"], "properties": {"size": {"type": "integer"}}}})";
  const std::vector<std::pair<std::string, std::string>> cases = {  // member, field of its missing "size"
      {"/dev/sda", "/~1dev~1sda/size"},
      {"a~b", "/a~0b/size"},
      {"~1", "/~01/size"},
  };
  for (const auto& [member, field] : cases) {
    HoxConfigManager::Document doc = Parse(R"({")" + member + R"(": {}})");
    HoxConfigManager::Document result;
    JsonValidator::Validate(Parse(schema), doc, result, {}, "");
    ASSERT_EQ(result.Size(), 1u) << member;
    EXPECT_EQ(std::string(result[0]["field"].GetString()), field);
    const HoxConfigManager::Document autoConf = Parse(R"({")" + member + R"(": {"size": 8}})");
    EXPECT_TRUE(HoxConfigStore::ConfigStoreDocument::PatchRequiredProperty(doc, field, autoConf, doc.GetAllocator()));
    EXPECT_EQ(HoxConfigManager::JsonToString(doc), HoxConfigManager::JsonToString(autoConf)) << member;
  }
}

}  // namespace
}  // namespace hoxcm_test
