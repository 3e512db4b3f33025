#include <gtest/gtest.h>

#include <cstdlib>
#include <string>
#include <tuple>

#include <hoxcm/documents.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

#include "support/json.h"
#include "support/temp_root.h"
#include "support/thrown.h"

using namespace HoxConfigManager;

using hoxcm_test::Failure;
using hoxcm_test::Parse;

TEST(DocumentsTest, IsEqualArrayMatchesEachElementOnce) {
  struct Case {
    const char* a;
    const char* b;
    bool equal;
  };
  const Case cases[] = {
      {"[1,2,2]", "[2,1,2]", true},          {"[1,2,2]", "[1,1,2]", false},
      {"[1,2]", "[1,2,2]", false},           {"[]", "[]", true},
      {R"(["a"])", R"(["a\u0000b"])", false},  // strings compare with their length
      {"[1]", R"(["1"])", false},            // type first
      {R"([{"x":1},[2]])", R"([[2],{"x":1}])", true},
      {"[true,null]", "[null,true]", true},  {"[1.5,2]", "[2,1.5]", true},
  };
  for (const Case& c : cases) EXPECT_EQ(IsEqualArray(Parse(c.a), Parse(c.b)), c.equal) << c.a << " vs " << c.b;
  EXPECT_EQ(Failure([] { IsEqualArray(Parse("{}"), Parse("[]")); }), "2000 Invalid JSON");
}

TEST(DocumentsTest, InstanceIdComesFromTheSchemasIdentityMember) {
  hoxcm_test::TempRoot root;
  root.InstallSampleSchemas();
  const auto store = HoxSchemaStore::SchemaStore::GetStore();
  const auto vnic = store->Find("network", "interfaces", "vnic");
  EXPECT_EQ(GetInstanceIdFromValue(Parse(R"({"name":"vnic0"})"), vnic), "vnic0");
  EXPECT_EQ(GetInstanceIdFromValue(Parse(R"({"other":"x"})"), vnic), "");
  EXPECT_EQ(Failure([&] { GetInstanceIdFromValue(Parse(R"({"name":5})"), vnic); }), "2084 Invalid value for key name");
  // A singleton has no identity member.
  EXPECT_EQ(GetInstanceIdFromValue(Parse(R"({"name":"vnic0"})"), store->Find("network", "dns", "config")), "");
}

TEST(DocumentsTest, ParsersRefuseMalformedInputOfEveryKindWithoutCrashing) {
  const std::string deepArrays = std::string(100000, '[') + std::string(100000, ']');
  std::string deepObjects;
  for (int i = 0; i < 100000; ++i) deepObjects += "{\"a\":";
  deepObjects += "1" + std::string(100000, '}');
  const std::string unterminated = "\"" + std::string(50 * 1024 * 1024, 'a');
  const std::string atLimit = std::string(kMaxJsonDepth, '[') + std::string(kMaxJsonDepth, ']');
  const std::string cases[] = {
      "", "NaN", deepArrays, deepObjects, "[" + atLimit + "]", unterminated,
      "{\"a\": [1, 2",                 // truncated
      "{\"a\": tru}",                  // bad literal
      "{\"a\": 1} {\"b\": 2}",         // trailing document
      "\"\xff\xfe\"",                  // invalid UTF-8
      "{\"\xc3\x28\": 1}",             // invalid UTF-8 in a member name
      "\"\xed\xa0\x80\"",              // encoded surrogate
      "[\"a\\ude03\"]",                 // escaped low surrogate alone
      "{\"\\udc00\\ud800\": 1}",         // low then high surrogate in a name
      std::string("\"a\0b\"", 5),      // NUL inside a string
      std::string("{} \0 {}", 7),       // NUL and more after the document
  };
  for (const std::string& text : cases) {
    Document doc;
    try {
      ParseDocument(text, doc);
      ADD_FAILURE() << text.substr(0, 40);
    } catch (const InvalidArgumentException& e) {
      EXPECT_EQ(std::to_string(e.GetErrorCode()) + " " + e.what(), "2080 Failed to parse JSON String");
    }
  }
  // The string parser raises the same (the file parser: below).
  EXPECT_THROW(CreateDocumentFromString("[1,]"), InvalidArgumentException);
  Document doc;
  // The depth limit itself and a 50 MB string are accepted.
  EXPECT_NO_THROW(ParseDocument(atLimit, doc));
  ParseDocument("{\"v\":" + unterminated + "\"}", doc);
  EXPECT_EQ(doc["v"].GetStringLength(), unterminated.size() - 1);
  // The same name in different objects is no repeat.
  EXPECT_NO_THROW(ParseDocument("{\"a\":{\"x\":1},\"b\":{\"x\":1},\"c\":[{\"x\":1},{\"x\":1}]}", doc));
}

TEST(DocumentsTest, NumbersKeepTheirValueThroughTheirText) {
  // Given numbers at the edges of what a document holds, parsing the text
  // the library writes for them should give the same values: the store keeps
  // values as text, and a value that moved by its last digit would drift
  // forever after an apply.
  for (const char* text : {"[-9446744073709551616, 18446744073709551616, 123456789012345678901234567890]",
                           "[1e308, 1.7976931348623157e308, 5e-324, 2.2250738585072014e-308, 0.1, -0.0]",
                           "[0.30000000000000004, 9007199254740993, 1.0000000000000002, 4.35e-7, 7e22]",
                           "[0e307, -0e308, 1e-400, -2147483648, 4294967296, -9223372036854775808]"}) {
    Document document;
    ParseDocument(text, document);
    Document again;
    ParseDocument(JsonToString(document), again);
    EXPECT_EQ(again, document) << text << " wrote " << JsonToString(document);
  }
  // Zeros stay zero whatever their exponent; integers keep their kind.
  EXPECT_EQ(JsonToString(Parse("[0e307, -0e308, 1e-400, -0, 3000000000, -3000000000]")),
            "[0.0,-0.0,0.0,0,3000000000,-3000000000]");
  EXPECT_TRUE(Parse("[-3000000000]")[0].IsInt64());
  EXPECT_EQ(Failure([] { Parse("[1e400]"); }), "2080 Failed to parse JSON String");
}

TEST(DocumentsTest, ParseFailuresCarryTheirLocationBesideTheFixedText) {
  // Given malformed text, the exception should keep code 2080 and its text
  // and carry the line, the column (in characters) and the parser's reason;
  // a file that cannot be read carries the file and the reason. The file
  // parser raises the base class, for an unreadable file too.
  const struct {
    std::string text;
    std::size_t line, column;
    const char* reason;
  } cases[] = {
      {"{\n  \"a\": tru}", 2, 11, "invalid value"},
      {"{\"a\": 1,\n \"\xc3\xa9\": [1, 2", 2, 12, "missing a comma or ']' after an array element"},
      {"[\"\xff\"]", 1, 3, "invalid encoding in string"},
      {std::string(kMaxJsonDepth + 1, '['), 1, kMaxJsonDepth + 1, "nesting deeper than 512 levels"},
      // A member named twice, in a nested, a wide and an empty-named case;
      // the location is just after the second name.
      {"{\"a\": {\"b\": 1,\n \"b\": 2}}", 2, 5, "member \"b\" appears twice in one object"},
      {"[{\"1\":1,\"2\":2,\"3\":3,\"4\":4,\"5\":5,\"6\":6,\"7\":7,\"8\":8,\"9\":9,\"3\":0}]", 1, 60,
       "member \"3\" appears twice in one object"},
      {"{\"\":1,\"\":1}", 1, 9, "member \"\" appears twice in one object"},
  };
  for (const auto& c : cases) {
    Document doc;
    try {
      ParseDocument(c.text, doc);
      ADD_FAILURE() << c.text;
    } catch (const InvalidArgumentException& e) {
      EXPECT_STREQ(e.what(), "Failed to parse JSON String");
      ASSERT_NE(e.GetLocation(), nullptr);
      EXPECT_EQ(e.GetLocation()->line, c.line) << c.reason;
      EXPECT_EQ(e.GetLocation()->column, c.column) << c.reason;
      EXPECT_EQ(e.GetLocation()->reason, c.reason);
    }
  }
  hoxcm_test::TempRoot root;
  root.WriteFile("/bad.json", "[1,\n2,]");
  for (const auto& [path, line, reason] : {std::tuple{root.Path("/bad.json"), 2, "invalid value"},
                                           std::tuple{root.Path("/missing.json"), 0, "No such file or directory"},
                                           std::tuple{root.Path("/"), 0, "not a regular file (a directory)"}}) {
    Document doc;
    try {
      CreateDocumentFromFile(path.c_str(), doc);
      ADD_FAILURE() << path;
    } catch (const ConfigManagerException& e) {
      EXPECT_EQ(dynamic_cast<const InvalidArgumentException*>(&e), nullptr) << path;
      EXPECT_EQ(std::to_string(e.GetErrorCode()) + " " + e.what(), "2080 Failed to parse JSON String");
      ASSERT_NE(e.GetLocation(), nullptr);
      EXPECT_EQ(e.GetLocation()->file, path);
      EXPECT_EQ(e.GetLocation()->line, static_cast<std::size_t>(line)) << path;
      EXPECT_EQ(e.GetLocation()->reason, reason) << path;
    }
  }
}

TEST(DocumentsTest, AddMemberCopiesTheNameIntoTheDocument) {
  auto doc = CreateDocument();
  doc->SetObject();
  Value value("v", doc->GetAllocator()), notObject(rapidjson::kArrayType), other(1);
  {
    std::string name = "transient";
    AddMember(doc.get(), doc.get(), name, &value);
    name.assign("overwritten");
  }
  EXPECT_TRUE(doc->HasMember("transient"));
  EXPECT_EQ(Failure([&] { AddMember(doc.get(), &notObject, "x", &other); }), "2000 Invalid JSON");
}
