// Sensitive values stay hidden whichever way a schema makes them sensitive,
// in the compliance report and in redacted serialisation (what hoxcfg show
// prints).
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <hoxcm/config_document.h>
#include <hoxcm/schema_store.h>

#include "drift/drift_fixture.h"

namespace {

using HoxConfigManager::ComplianceResult;
using HoxConfigManager::Document;
using HoxConfigManager::JsonToString;
using hoxcm_test::Parse;

// Every way a value becomes sensitive, one property each; "plain" is not.
constexpr const char* kProperties = R"({
  "whole": {"type": "object", "sensitive": true, "properties": {"x": {"type": "string"}}},
  "list": {"type": "array", "sensitive": true, "items": {"type": "string"}},
  "records": {"type": "array", "sensitive": true, "items": {"type": "object", "properties": {"x": {"type": "string"}}}},
  "oneOf": {"oneOf": [{"type": "string", "sensitive": true}, {"type": "integer"}]},
  "anyOf": {"anyOf": [{"type": "integer"}, {"type": "string", "sensitive": true}]},
  "allOf": {"allOf": [{"type": "string"}, {"sensitive": true}]},
  "ref": {"$ref": "#/definitions/secret"},
  "account": {"$ref": "#/definitions/account"},
  "patterned": {"type": "object", "patternProperties": {"^pw": {"type": "string", "sensitive": true}}},
  "extra": {"type": "object", "additionalProperties": {"type": "string", "sensitive": true}},
  "tuple": {"type": "array", "items": [{"type": "string"}, {"type": "string", "sensitive": true}]},
  "plain": {"type": "string"}})";

constexpr const char* kDefinitions = R"({
  "secret": {"type": "string", "sensitive": true},
  "account": {"type": "object", "properties": {"pw": {"type": "string", "sensitive": true}, "user": {"type": "string"}}}})";

// A value for each property; the secrets all start with `tag`.
std::string Values(const std::string& tag) {
  return R"({"whole": {"x": ")" + tag + R"(1"}, "list": [")" + tag + R"(2"], "records": [{"x": ")" + tag +
         R"(3"}], "oneOf": ")" + tag + R"(4", "anyOf": ")" + tag + R"(5", "allOf": ")" + tag + R"(6", "ref": ")" +
         tag + R"(7", "account": {"pw": ")" + tag + R"(8", "user": "u"}, "patterned": {"pwa": ")" + tag +
         R"(9"}, "extra": {"k": ")" + tag + R"(10"}, "tuple": ["a", ")" + tag + R"(11"], "plain": ")" + tag +
         R"(-shown"})";
}

class SensitivityTest : public ::testing::Test {
 protected:
  SensitivityTest() {
    const std::string schema = std::string(R"({"type": "object", "definitions": )") + kDefinitions +
                               R"(, "properties": )" + kProperties;
    root_.WriteFile("/usr/lib/tarvik/configmanager/schemas/t/sec/one.json",
                    R"({"multiInstance": false, "schema": )" + schema + "}}");
    // The same below "items" of a multi-instance key.
    std::string instance = schema;
    instance.insert(instance.find(R"("plain")"), R"("name": {"type": "string"}, )");
    root_.WriteFile("/usr/lib/tarvik/configmanager/schemas/t/sec/many.json",
                    R"({"multiInstance": true, "identity": "name", "schema": )" + instance +
                        R"(, "required": ["name"]}})");
  }

  static std::string HostDocument(const std::string& values, const std::string& instance) {
    std::string item = instance;
    item.insert(1, R"("name": "i", )");
    return R"({"t": {"sec": {"one": )" + values + R"(, "many": [)" + item + "]}}}";
  }

  hoxcm_test::TempRoot root_;
};

TEST_F(SensitivityTest, ComplianceReportsNoSecretWhicheverWayTheSchemaMarksIt) {
  // Given a desired document and a host that differ in every property, the
  // compliance report should show the plain values and none of the secrets.
  Document desired = Parse(HostDocument(Values("DESIRED"), Values("DESIRED")));
  ComplianceResult result;
  HoxConfigManager::CheckComplianceHandler handler(&result);
  HoxConfigManager::ComputeDrift(desired, desired.GetAllocator(), handler,
                                 Parse(HostDocument(Values("HOST"), Values("HOST"))));
  const std::string report = JsonToString(result.document);
  EXPECT_EQ(report.find("DESIRED1"), std::string::npos) << report;
  for (const char* tag : {"DESIRED", "HOST"}) {
    for (int secret = 1; secret <= 11; ++secret) {
      const std::string text = tag + std::to_string(secret) + "\\\"";
      EXPECT_EQ(report.find(text), std::string::npos) << text << " in " << report;
    }
    EXPECT_NE(report.find(std::string(tag) + "-shown"), std::string::npos) << report;
  }
  // The members of a secret object are reported, masked.
  EXPECT_NE(report.find(R"({"path":"/t/sec/one/whole/x","desiredValue":"\"******\"","hostValue":"\"******\""})"),
            std::string::npos)
      << report;
}

TEST_F(SensitivityTest, WholeValuesAreShownWithTheirSecretsMasked) {
  // Given a value of each key as hoxcfg show prints it, no secret should show.
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  ASSERT_TRUE(store);
  ASSERT_TRUE(store->GetLoadErrors().empty()) << store->GetLoadErrors().front();
  const Document values = Parse(Values("SHOWN"));
  for (const char* key : {"one", "many"}) {
    const std::string shown =
        HoxConfigStore::ConfigStoreDocument::RedactAndSerializeValue(store->Find("t", "sec", key)->GetJsonSchema(),
                                                                     values);
    EXPECT_EQ(shown.find("SHOWN1"), std::string::npos) << shown;
    for (int secret = 2; secret <= 11; ++secret) {
      EXPECT_EQ(shown.find("SHOWN" + std::to_string(secret) + "\""), std::string::npos) << key << ": " << shown;
    }
    EXPECT_NE(shown.find("SHOWN-shown"), std::string::npos) << shown;
  }
}

}  // namespace
