#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <sys/stat.h>

#include <hoxcm/documents.h>

#include "support/fake_schema.h"
#include "support/temp_root.h"

using namespace HoxConfigManager;

namespace {

Document Parse(const std::string& text) {
  Document doc;
  ParseDocument(text, doc);
  return doc;
}

int CodeOf(const std::function<void()>& f) {
  try {
    f();
  } catch (const HoxConfigStore::ConfigStoreException& e) {
    return e.GetErrorCode();
  }
  return 0;
}

}  // namespace

TEST(DocumentsTest, IsEqualArrayMatchesEachElementOnce) {
  struct Case {
    const char* a;
    const char* b;
    bool equal;
  };
  const Case cases[] = {
      {"[1,2,2]", "[2,1,2]", true},
      {"[1,2,2]", "[1,1,2]", false},
      {"[1,2]", "[1,2,2]", false},
      {"[]", "[]", true},
      {"[\"a\"]", "[\"a\\u0000b\"]", false},  // strings compare with their length
      {"[1]", "[\"1\"]", false},               // type first
      {"[{\"x\":1},[2]]", "[[2],{\"x\":1}]", true},
      {"[true,null]", "[null,true]", true},
      {"[1.5,2]", "[2,1.5]", true},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(std::string(c.a) + " vs " + c.b);
    EXPECT_EQ(IsEqualArray(Parse(c.a), Parse(c.b)), c.equal);
  }
  EXPECT_EQ(CodeOf([] { IsEqualArray(Parse("{}"), Parse("[]")); }), 2000);
}

TEST(DocumentsTest, FileExistsOnlyForRegularFiles) {
  hoxcm_test::TempRoot root;
  root.WriteFile("/etc/file", "x");
  EXPECT_TRUE(fileExists(root.Path("/etc/file")));
  EXPECT_FALSE(fileExists(root.Path("/etc")));
  EXPECT_FALSE(fileExists(root.Path("/etc/missing")));
  EXPECT_FALSE(fileExists(root.Path("/etc/file/below-a-file")));
}

TEST(DocumentsTest, InstanceIdComesFromTheSchemasIdentityMember) {
  auto schema = std::make_shared<hoxcm_test::FakeSchemaObject>();
  schema->multiInstance = true;
  schema->identity = "name";
  EXPECT_EQ(GetInstanceIdFromValue(Parse(R"({"name":"vnic0"})"), schema), "vnic0");
  EXPECT_EQ(GetInstanceIdFromValue(Parse(R"({"other":"x"})"), schema), "");
  EXPECT_EQ(CodeOf([&] { GetInstanceIdFromValue(Parse(R"({"name":5})"), schema); }), 2084);
  try {
    GetInstanceIdFromValue(Parse(R"({"name":5})"), schema);
  } catch (const ConfigManagerException& e) {
    EXPECT_STREQ(e.what(), "Invalid value for key name");
  }
  schema->identity.clear();
  EXPECT_EQ(GetInstanceIdFromValue(Parse(R"({"name":"vnic0"})"), schema), "");
}

TEST(DocumentsTest, StringParsersRaiseInvalidArgumentAndTheFileParserConfigManager) {
  Document doc;
  try {
    ParseDocument("{", doc);
    FAIL();
  } catch (const InvalidArgumentException& e) {
    EXPECT_EQ(e.GetErrorCode(), 2080);
    EXPECT_STREQ(e.what(), "Failed to parse JSON String");
  }
  EXPECT_THROW(CreateDocumentFromString("[1,]"), InvalidArgumentException);

  hoxcm_test::TempRoot root;
  root.WriteFile("/bad.json", "{\"a\":");
  for (const std::string& path : {root.Path("/bad.json"), root.Path("/missing.json"), root.Path("/")}) {
    SCOPED_TRACE(path);
    try {
      CreateDocumentFromFile(path.c_str(), doc);
      FAIL();
    } catch (const InvalidArgumentException&) {
      FAIL() << "the file parser raises the base class";
    } catch (const ConfigManagerException& e) {
      EXPECT_EQ(e.GetErrorCode(), 2080);
    }
  }
}

TEST(DocumentsTest, MalformedInputOfEveryKindIsRefusedWithoutCrashing) {
  const std::string deepArrays = std::string(100000, '[') + std::string(100000, ']');
  const std::string deepObjects = [] {
    std::string s;
    for (int i = 0; i < 100000; ++i) s += "{\"a\":";
    s += "1";
    s += std::string(100000, '}');
    return s;
  }();
  const std::string unterminated = "\"" + std::string(50 * 1024 * 1024, 'a');
  const std::string cases[] = {
      "",
      "{\"a\": [1, 2",                 // truncated
      "{\"a\": tru}",                  // bad literal
      "{\"a\": 1} {\"b\": 2}",         // trailing document
      "\"\xff\xfe\"",                  // invalid UTF-8
      "{\"\xc3\x28\": 1}",             // invalid UTF-8 in a member name
      "\"\xed\xa0\x80\"",              // encoded surrogate
      std::string("\"a\0b\"", 5),      // NUL inside a string
      "NaN",
      deepArrays,
      deepObjects,
      unterminated,
  };
  for (const std::string& text : cases) {
    SCOPED_TRACE(text.substr(0, 40));
    Document doc;
    EXPECT_THROW(ParseDocument(text, doc), InvalidArgumentException);
  }
}

TEST(DocumentsTest, LargeStringsAndTheDepthLimitItselfAreAccepted) {
  const std::string big(50 * 1024 * 1024, 'x');
  Document doc;
  ParseDocument("{\"v\":\"" + big + "\"}", doc);
  EXPECT_EQ(doc["v"].GetStringLength(), big.size());

  const std::string atLimit = std::string(kMaxJsonDepth, '[') + std::string(kMaxJsonDepth, ']');
  EXPECT_NO_THROW(ParseDocument(atLimit, doc));
  const std::string overLimit = "[" + atLimit + "]";
  EXPECT_THROW(ParseDocument(overLimit, doc), InvalidArgumentException);
}

TEST(DocumentsTest, WritersAreCompactAndRoundTrip) {
  Document doc = Parse(R"({ "b" : [ 1, 2.5, "x\"y" ], "a" : { "n" : null } })");
  std::string text;
  SerializeValue(doc, text);
  EXPECT_EQ(text, R"({"b":[1,2.5,"x\"y"],"a":{"n":null}})");
  EXPECT_EQ(JsonToString(doc["b"]), R"([1,2.5,"x\"y"])");

  hoxcm_test::TempRoot root;
  const std::string path = root.Path("/out.json");
  CreateFileFromDocument(path.c_str(), doc);
  EXPECT_EQ(root.ReadFile("/out.json"), text);
  Document back;
  CreateDocumentFromFile(path.c_str(), back);
  EXPECT_TRUE(back == doc);
  EXPECT_FALSE(std::filesystem::exists(path + ".tmp"));

  const std::string unwritable = root.Path("/no/such/dir/out.json");
  EXPECT_THROW(CreateFileFromDocument(unwritable.c_str(), doc), std::exception);
}

TEST(DocumentsTest, AddMemberCopiesTheNameIntoTheDocument) {
  auto doc = CreateDocument();
  doc->SetObject();
  Value value("v", doc->GetAllocator());
  {
    std::string name = "transient";
    AddMember(doc.get(), doc.get(), name, &value);
    name.assign("overwritten");
  }
  EXPECT_TRUE(doc->HasMember("transient"));
  Value notObject(rapidjson::kArrayType);
  Value other(1);
  EXPECT_EQ(CodeOf([&] { AddMember(doc.get(), &notObject, "x", &other); }), 2000);
}
