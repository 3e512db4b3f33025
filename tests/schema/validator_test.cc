#include <gtest/gtest.h>

#include <algorithm>
#include <set>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

#include "platform/schema/patterns.h"
#include "support/json.h"
#include "support/temp_root.h"

using HoxConfigManager::Document;
using HoxConfigManager::JsonToString;

using hoxcm_test::Parse;

namespace {

using Findings = std::vector<std::pair<std::string, int>>;

Findings Check(const Document& schema, const Document& doc) {
  Document result;
  int n = JsonValidator::Validate(schema, doc, result, {}, "");
  EXPECT_TRUE(result.IsArray());
  EXPECT_EQ(static_cast<int>(result.Size()), n);
  Findings out;
  for (const auto& e : result.GetArray()) {
    EXPECT_TRUE(e["errArgs"].IsArray());
    EXPECT_TRUE(e["error"].IsString());
    out.emplace_back(e["field"].GetString(), e["errId"].GetInt());
  }
  return out;
}

// The syslog schema of the sample host: "protocol" is a union tag.
const char* kUnionSchema = R"({
  "type": "object",
  "properties": {
    "remoteHost": {"type": "string"}, "protocol": {"type": "string"}, "caFile": {"type": "string"}
  },
  "unionTag": "protocol",
  "oneOf": [
    {"properties": {"protocol": {"enum": ["udp", "tcp"]}}},
    {"properties": {"protocol": {"enum": ["tls"]}}, "required": ["caFile"]}
  ]
})";

}  // namespace

TEST(ValidatorTest, ReportsEachFaultAtItsFieldWithItsKind) {
  const char* object = R"({"type": "object", "properties": {
      "name": {"type": "string", "pattern": "^[a-z]+$", "maxLength": 8},
      "mtu": {"type": "integer", "minimum": 1280, "maximum": 9000},
      "mode": {"enum": ["a", "b"]},
      "tags": {"type": "array", "items": {"type": "string"}, "minItems": 1, "uniqueItems": true},
      "user": {"type": "string"}, "secret": {"type": "string"}},
    "required": ["name"], "additionalProperties": false, "dependencies": {"secret": ["user"]}})";
  const std::vector<std::tuple<std::string, const char*, Findings>> cases = {  // schema, document, findings
      {object, R"({"name": "ok", "mtu": 1500, "tags": ["x"]})", {}},
      {object, R"({"mtu": 1500})", {{"/name", 9}}},
      {object, R"({"name": 5})", {{"/name", 2}}},
      {object, R"({"name": "Bad!"})", {{"/name", 8}}},
      {object, R"({"name": "abcdefghij"})", {{"/name", 7}}},
      {object, R"({"name": "a", "mtu": 100})", {{"/mtu", 4}}},
      {object, R"({"name": "a", "mtu": 9001})", {{"/mtu", 5}}},
      {object, R"({"name": "a", "mode": "c"})", {{"/mode", 3}}},
      {object, R"({"name": "a", "tags": []})", {{"/tags", 11}}},
      {object, R"({"name": "a", "tags": ["x", "x"]})", {{"/tags", 13}}},
      {object, R"({"name": "a", "tags": ["x", 1]})", {{"/tags/1", 2}}},
      {object, R"({"name": "a", "extra": 1})", {{"/extra", 10}}},
      {object, R"({"name": "a", "secret": "s"})", {{"/user", 20}}},
      {kUnionSchema, R"({"remoteHost": "h", "protocol": "udp"})", {}},
      {kUnionSchema, R"({"remoteHost": "h", "protocol": "tls", "caFile": "/ca"})", {}},
      {kUnionSchema, R"({"remoteHost": "h"})", {{"/protocol", 32}}},
      {kUnionSchema, R"({"remoteHost": "h", "protocol": "smtp"})", {{"/protocol", 32}}},
      {kUnionSchema, R"({"remoteHost": "h", "protocol": "tls"})", {{"/caFile", 9}}},
      {R"({"type": "array", "items": )" + std::string(kUnionSchema) + "}",
       R"([{"protocol": "udp"}, {"protocol": 1}])",
       {{"/1/protocol", 2}, {"/1/protocol", 32}}},
      // A union reached through a reference is still checked by its tag.
      {R"({"definitions": {"syslog": )" + std::string(kUnionSchema) +
           R"(}, "type": "array", "items": {"$ref": "#/definitions/syslog"}})",
       R"([{"protocol": "udp"}, {"protocol": "tls"}])",
       {{"/1/caFile", 9}}},
      {R"({"type": "object", "minLength": "x"})", "{}", {{"", 31}}},
      {R"({"type": "string", "pattern": "(["})", R"("x")", {{"", 31}}},
      // A pattern long enough to exhaust the stack of the regex compiler.
      {R"({"type": "string", "pattern": ")" + std::string(200000, 'a') + R"("})", R"("x")", {{"", 31}}},
      {R"({"patternProperties": {")" + std::string(200000, '(') + R"(": {}}})", R"({"x": 1})", {{"", 31}}},
      {R"({"$ref": "#"})", "{}", {{"", 31}}},
      {R"({"definitions": {"a": {"$ref": "#/definitions/b"}, "b": {"$ref": "#/definitions/a"}},
           "properties": {"x": {"$ref": "#/definitions/a"}}})",
       "{}",
       {{"", 31}}},
      {R"({"type": "object", "properties": {"child": {"$ref": "#"}}})",
       R"({"child": {"child": 1}})",
       {{"/child/child", 2}}},
  };
  for (const auto& [schema, doc, expected] : cases) EXPECT_EQ(Check(Parse(schema), Parse(doc)), expected) << doc;
}

TEST(ValidatorTest, FindingsReadAsSentencesWithTheExpectedTypeOrBound) {
  // Given a fault, the text should name the expected type or the schema's
  // bound (trailing zeros gone), found through references and items.
  const struct {
    const char* schema;
    const char* doc;
    const char* text;
  } cases[] = {
      {R"({"properties": {"a": {"type": "string"}}})", R"({"a": 1})", "must be a string"},
      {R"({"definitions": {"n": {"type": ["integer", "null"]}}, "properties": {"a": {"items": {"$ref": "#/definitions/n"}}}})",
       R"({"a": [1, "x"]})", "must be an integer or null"},
      {R"({"properties": {"a": {"minimum": 3}}})", R"({"a": 1})", "must be at least 3"},
      {R"({"properties": {"a": {"minimum": 3, "exclusiveMinimum": true}}})", R"({"a": 3})", "must be greater than 3"},
      {R"({"properties": {"a": {"maxLength": 2}}})", R"({"a": "abc"})", "must be at most 2 characters long"},
      {R"({"properties": {"a": {"enum": [1]}}})", R"({"a": 2})", "must be one of the values the schema allows"},
  };
  for (const auto& c : cases) {
    Document result;
    JsonValidator::Validate(Parse(c.schema), Parse(c.doc), result, {}, "");
    ASSERT_EQ(result.Size(), 1u) << c.doc;
    EXPECT_STREQ(result[0]["error"].GetString(), c.text) << c.schema;
    const int code = result[0]["errId"].GetInt();
    EXPECT_EQ(JsonValidator::ConvertMsgIdToErrorCode(JsonValidator::ConvertErrorCodeToMsgId(code)), code);
  }
}

TEST(ValidatorTest, ArgumentsNameTheMemberAndTheLimit) {
  Document result;
  JsonValidator::Validate(Parse(R"({"properties": {"mtu": {"maximum": 9000}}, "required": ["name"]})"),
                          Parse(R"({"mtu": 9600})"), result, {}, "/network/interfaces/vnic/0");
  ASSERT_EQ(result.Size(), 2u);
  EXPECT_EQ(JsonToString(result[0]["errArgs"]), R"(["mtu","9000"])");
  EXPECT_STREQ(result[0]["field"].GetString(), "/network/interfaces/vnic/0/mtu");
  EXPECT_EQ(JsonToString(result[1]["errArgs"]), R"(["name"])");
  EXPECT_STREQ(result[1]["error"].GetString(), "is required but missing");
  // Ignored kinds are dropped and not counted.
  EXPECT_EQ(JsonValidator::Validate(Parse(R"({"required": ["a", "b"], "maxProperties": 0})"), Parse(R"({"c": 1})"),
                                    result, {9}, ""),
            1);
  EXPECT_EQ(result[0]["errId"].GetInt(), 22);
}

TEST(ValidatorTest, HostDocumentReportsEveryFaultyItemWithoutSensitiveValues) {
  // Given the sample configuration with several faults in different keys,
  // every one of them should be reported, and no sensitive value shown.
  hoxcm_test::TempRoot root;
  root.InstallSampleSchemas();
  Document doc = hoxcm_test::SampleDocument("user-config.json");
  auto& a = doc.GetAllocator();
  doc["network"]["interfaces"]["vnic"][1]["mtu"] = 9600;
  doc["network"]["interfaces"]["vnic"][2].RemoveMember("name");
  doc["storage"]["iscsi"]["targets"][0]["chapSecret"].SetString("tiny-secret", a);
  doc["services"]["syslog"]["config"]["protocol"] = "tls";
  Document schema;
  ASSERT_TRUE(HoxConfigManager::GenerateHostDocumentSchema(doc, schema));
  // A group the schema does not know is reported as a key without schema.
  doc["system"].AddMember("ghost", rapidjson::Value(rapidjson::kObjectType), a);
  Document result;
  JsonValidator::ValidateCMDocument(schema, doc, result, {}, "");
  Findings found;
  for (const auto& e : result.GetArray()) found.emplace_back(e["field"].GetString(), e["errId"].GetInt());
  std::sort(found.begin(), found.end());
  const Findings expected = {
      {"/network/interfaces/vnic/1/mtu", 5},
      {"/network/interfaces/vnic/2/name", 9},
      {"/services/syslog/config/caFile", 9},
      {"/storage/iscsi/targets/0/chapSecret", 6},
      {"/system/ghost", 30},
  };
  EXPECT_EQ(found, expected) << JsonToString(result);
  EXPECT_EQ(JsonToString(result).find("tiny-secret"), std::string::npos);
}

TEST(ValidatorTest, PatternsMatchInTimeLinearInTheSubject) {
  // Given patterns on which a backtracking matcher takes exponential time
  // (or recurses once per character) and long subjects that make them fail
  // at the very end, validation should report each mismatch, whatever the
  // length; constructs only backtracking offers make the schema unusable.
  const std::string many(200000, 'a');
  const Document schema = Parse(R"({"properties": {
      "name": {"type": "string", "pattern": "^(a+)+$"},
      "when": {"type": "string", "format": "date-time"},
      "tags": {"type": "object", "patternProperties": {"^(a|aa)+$": {"type": "integer"}},
               "additionalProperties": false}}})");
  const Document doc = Parse(R"({"name":")" + many + R"(!","when":")" + many + R"(","tags":{")" + many +
                             R"(!":1,")" + many + R"(":"x"}})");
  Findings found = Check(schema, doc);
  std::sort(found.begin(), found.end());
  EXPECT_EQ(found, (Findings{{"/name", 8}, {"/tags/" + many, 2}, {"/tags/" + many + "!", 10}, {"/when", 14}}));
  for (const char* pattern : {R"(^[A-Za-z5-9]([A-Za-z0-9.-]?{0,252})$)", R"((a)\\1)", R"(^(?!x))", R"(a{1001})"}) {
    EXPECT_EQ(Check(Parse(std::string(R"({"pattern": ")") + pattern + R"("})"), Parse(R"x("aaaa)")x")),
              (Findings{{"", 31}}))
        << pattern;
  }
}

TEST(ValidatorTest, OneValidationHasABoundedCost) {
  // Given a schema whose alternatives double the work at every level,
  // validation should stop at its budget with an unusable-schema finding.
  std::string definitions = R"("l0": {"type": "string"})";
  for (int level = 1; level <= 40; ++level) {
    const std::string below = R"({"$ref": "#/definitions/l)" + std::to_string(level - 1) + R"("})";
    definitions += R"(, "l)" + std::to_string(level) + R"(": {"anyOf": [)" + below + ", " + below + "]}";
  }
  const Document parsed = Parse(R"({"definitions": {)" + definitions + R"(}, "$ref": "#/definitions/l40"})");
  JsonValidator::detail::ValidationBudget budget(100000);
  Document result;
  JsonValidator::Validate(parsed, Parse("true"), result, {}, "");
  ASSERT_EQ(result.Size(), 1u);
  EXPECT_EQ(result[0]["errId"].GetInt(), 31);
  EXPECT_NE(std::string(result[0]["error"].GetString()).find("more than 100000 steps"), std::string::npos);
}
