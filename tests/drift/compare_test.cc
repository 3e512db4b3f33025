// Schema-aware equality, its hash, scalar-array equality and redaction of
// configuration values.
#include <functional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <hoxcm/config_store.h>

#include "drift/drift_fixture.h"
#include "foundation/compare/value_compare.h"

namespace {

using HoxConfigManager::Document;
using HoxConfigStore::ConfigStoreDocument;
using hoxcm_test::Parse;

const char* kUserSchema = R"({"type": "object", "properties": {
    "name": {"type": "string"}, "shell": {"type": "string", "default": "/bin/sh"}, "uid": {"type": "integer"},
    "groups": {"type": "array", "items": {"type": "string"}},
    "keys": {"type": "array", "items": {"type": "object", "properties": {"key": {"type": "string"}}}},
    "home": {"type": "object", "properties": {"path": {"type": "string"}, "quota": {"type": "integer"}}}}})";

// A JSON array of `count` elements made by `element(i)`.
std::string Array(int count, const std::function<std::string(int)>& element) {
  std::string out = "[";
  for (int i = 0; i < count; ++i) out += (i ? "," : "") + element(i);
  return out + "]";
}

TEST(IsEqualValueTest, FollowsTheDocumentedRules) {
  // Given one instance schema, each pair compares as documented both ways,
  // and equal pairs hash alike; long arrays (matched through hashes) answer
  // as short ones do.
  struct Case {
    const char* what;
    std::string desired, host;
    bool equal;
  };
  const Document schema = Parse(kUserSchema);
  const auto key = [](int k) { return R"({"key":")" + std::to_string(k) + R"("})"; };
  const std::string keys = "{\"keys\":" + Array(100, [&](int i) { return key(i % 7); }) + "}";
  const std::string keysReversed = "{\"keys\":" + Array(100, [&](int i) { return key((99 - i) % 7); }) + "}";
  const std::string keysChanged =
      "{\"keys\":" + Array(100, [&](int i) { return key(i == 3 ? 8 : (99 - i) % 7); }) + "}";
  const std::string counts = Array(40, [](int i) { return std::to_string(i % 3); });
  const std::string otherCounts = Array(40, [](int i) { return std::to_string((i + 1) % 3); });
  const std::vector<Case> cases = {
      {"member order does not matter", R"({"uid":1,"name":"a"})", R"({"name":"a","uid":1})", true},
      {"changed scalar", R"({"name":"a","uid":1})", R"({"name":"a","uid":2})", false},
      {"integer equals its double", R"({"uid":1})", R"({"uid":1.0})", true},
      {"string is not a number", R"({"uid":"1"})", R"({"uid":1})", false},
      {"generated id is ignored", R"({"name":"a","cs_generated_id":"x"})", R"({"name":"a","cs_generated_id":"y"})",
       true},
      {"generated id on one side only", R"({"name":"a"})", R"({"name":"a","cs_generated_id":"y"})", true},
      {"empty string equals absent", R"({"name":"a","shell":""})", R"({"name":"a"})", true},
      {"null equals absent", R"({"name":"a","uid":null})", R"({"name":"a"})", true},
      {"absent equals schema default", R"({"name":"a"})", R"({"name":"a","shell":"/bin/sh"})", true},
      {"absent differs from another value", R"({"name":"a"})", R"({"name":"a","shell":"/bin/bash"})", false},
      {"empty nested object equals absent", R"({"name":"a","home":{}})", R"({"name":"a"})", true},
      {"nested object of unset members equals absent", R"({"home":{"path":""}})", R"({})", true},
      {"nested change", R"({"home":{"path":"/h","quota":1}})", R"({"home":{"quota":1,"path":"/x"}})", false},
      {"scalar arrays are multisets", R"({"groups":["a","b","b"]})", R"({"groups":["b","a","b"]})", true},
      {"scalar arrays count duplicates", R"({"groups":["a","b","b"]})", R"({"groups":["a","a","b"]})", false},
      {"scalar arrays of different length", R"({"groups":["a"]})", R"({"groups":["a","a"]})", false},
      {"scalar arrays compare types", R"({"groups":["1",true]})", R"({"groups":[1,true]})", false},
      {"object arrays ignore order", R"({"keys":[{"key":"1"},{"key":"2"}]})", R"({"keys":[{"key":"2"},{"key":"1"}]})",
       true},
      {"object arrays compare elements", R"({"keys":[{"key":"1"}]})", R"({"keys":[{"key":"3"}]})", false},
      {"unknown members compare too", R"({"extra":[1,{"a":2}]})", R"({"extra":[{"a":2},1]})", true},
      {"unknown member on host only", R"({})", R"({"extra":true})", false},
      {"object against array", R"({"home":{"path":"/h"}})", R"({"home":["/h"]})", false},
      {"long object arrays ignore order", keys, keysReversed, true},
      {"long object arrays compare elements", keys, keysChanged, false},
      {"long scalar arrays are multisets",
       "{\"groups\":" + Array(100, [](int i) { return std::to_string(i % 5); }) + "}",
       "{\"groups\":" + Array(100, [](int i) { return std::to_string(i * 3 % 5); }) + "}", true},
      {"long scalar arrays count duplicates", "{\"groups\":" + counts + "}", "{\"groups\":" + otherCounts + "}", false},
  };
  for (const Case& c : cases) {
    const Document d = Parse(c.desired);
    const Document h = Parse(c.host);
    EXPECT_EQ(ConfigStoreDocument::IsEqualValue(d, h, schema), c.equal) << c.what;
    EXPECT_EQ(ConfigStoreDocument::IsEqualValue(h, d, schema), c.equal) << c.what << " (swapped)";
    if (c.equal) {
      EXPECT_EQ(ConfigStoreDocument::HashValue(d, schema), ConfigStoreDocument::HashValue(h, schema)) << c.what;
    }
  }
  // The scalar-array comparison on its own: a multiset of arrays only.
  const std::string reversed = Array(40, [](int i) { return std::to_string((39 - i) % 3); });
  EXPECT_TRUE(ConfigStoreDocument::IsEqualPrimitiveArray(Parse(counts), Parse(reversed)));
  EXPECT_FALSE(ConfigStoreDocument::IsEqualPrimitiveArray(Parse(counts), Parse(otherCounts)));
  EXPECT_THROW(ConfigStoreDocument::IsEqualPrimitiveArray(Parse("{}"), Parse("[]")),
               HoxConfigStore::ConfigStoreException);
}

TEST(RedactAndSerializeValueTest, MasksSensitivePropertiesAtAnyDepth) {
  const Document schema = Parse(R"({"type": "array", "items": {"type": "object", "properties": {
    "name": {"type": "string"},
    "password": {"type": "string", "sensitive": true},
    "tokens": {"type": "array", "items": {"type": "object",
               "properties": {"secret": {"type": "string", "sensitive": true}, "id": {"type": "string"}}}},
    "nested": {"type": "object", "properties": {"pin": {"type": "integer", "sensitive": true}}},
    "extra": {"type": "object", "additionalProperties": {"type": "string", "sensitive": true}},
    "variant": {"oneOf": [{"properties": {"key": {"type": "string"}}},
                          {"properties": {"key": {"type": "string", "sensitive": true}}}]}}}})");
  const char* instance = R"({"name":"root","password":"hunter2","tokens":[{"id":"t","secret":"s1"}],)"
                         R"("nested":{"pin":1234},"extra":{"a":"x"},"variant":{"key":"k"}})";
  const std::string masked = R"({"name":"root","password":"******","tokens":[{"id":"t","secret":"******"}],)"
                             R"("nested":{"pin":"******"},"extra":{"a":"******"},"variant":{"key":"******"}})";
  // An instance with its key's array schema, and the array itself.
  EXPECT_EQ(ConfigStoreDocument::RedactAndSerializeValue(schema, Parse(instance)), masked);
  EXPECT_EQ(ConfigStoreDocument::RedactAndSerializeValue(schema, Parse(std::string("[") + instance + "]")),
            "[" + masked + "]");
  // A sensitive property on its own, and a value without any schema.
  EXPECT_EQ(ConfigStoreDocument::RedactAndSerializeValue(schema["items"]["properties"]["password"], Parse("\"pw\"")),
            "\"******\"");
  EXPECT_EQ(ConfigStoreDocument::RedactAndSerializeValue(Parse("{}"), Parse(R"({"a":[1,"b"]})")), R"({"a":[1,"b"]})");
}

// Members described only by "patternProperties": the redaction and the schema
// node the drift walk hands to a handler both see a sensitive pattern, even
// over a listed property, and a sensitive pattern that cannot be compiled.
TEST(RedactAndSerializeValueTest, MasksMembersMatchedBySensitivePatterns) {
  const Document schema = Parse(R"({"type": "object", "properties": {"secretA": {"type": "string"}},
    "patternProperties": {"^secret": {"type": "string", "sensitive": true}, "^opt": {"type": "string"},
                          "(": {"type": "string", "sensitive": true}}, "additionalProperties": false})");
  EXPECT_EQ(ConfigStoreDocument::RedactAndSerializeValue(schema, Parse(R"({"secretA":"a","secretB":"b","optX":"x"})")),
            R"({"secretA":"******","secretB":"******","optX":"******"})");
  const Document plain = Parse(R"({"type": "object", "patternProperties": {"^secret": {"type": "string",
    "sensitive": true}, "^opt": {"type": "integer"}}})");
  EXPECT_EQ(ConfigStoreDocument::RedactAndSerializeValue(plain, Parse(R"({"secretB":"b","optX":1,"z":2})")),
            R"({"secretB":"******","optX":1,"z":2})");
  HoxConfigManager::compare::ValueComparer comparer;
  const Document value = Parse(R"("v")");
  EXPECT_TRUE(comparer.Child(plain, "secretB", value).HasMember("sensitive"));
  EXPECT_EQ(comparer.Child(plain, "optX", value), plain["patternProperties"]["^opt"]);
  EXPECT_TRUE(comparer.Child(schema, "secretA", value).HasMember("sensitive"));
}

}  // namespace
