// Document building and reshaping: host sections, clean-up,
// normalisation, auto-configuration patches, parsing and instance ids.
#include <regex>
#include <set>

#include "platform_store/store_fixture.h"

namespace hoxcm_test {
namespace {

using HoxConfigStore::ConfigStoreDocument;
using namespace HoxConfigStore;

TEST(ConfigStoreDocumentTest, HostIdsNormaliseToLowerCaseHyphenatedForm) {
  const std::string id = "4c4c4544-0042-3510-8053-b4c04f4e3132";
  for (const auto& [input, expected] : std::vector<std::pair<std::string, std::string>>{
           {"4C4C4544-0042-3510-8053-B4C04F4E3132", id},
           {"4c4c454400423510 8053b4c04f4e3132\n", id},
           {"{4C4C4544-0042-3510-8053-B4C04F4E3132}", id},
           {"Not-A-UUID", "not-a-uuid"},
           {"", ""}}) {
    EXPECT_EQ(ConfigStoreDocument::NormalizeHostId(input), expected) << input;
  }
}

TEST(ConfigStoreDocumentTest, SplitMovesHostSpecificKeysAndDocumentForHostMergesThemBack) {
  const rapidjson::Document profile = Parse(R"({
    "system": {"identity": {"hostname": {"hostname": "h1"}}, "kernel": {"boot_options": {"iommu": true}}},
    "network": {"interfaces": {"vnic": [{"name": "vnic0"}]}}})");
  const rapidjson::Document schemaDocument = Parse(R"({"type": "object", "properties": {
    "system": {"type": "object", "properties": {
      "identity": {"type": "object", "properties": {"hostname": {"type": "object", "hostSpecific": true}}},
      "kernel": {"type": "object", "properties": {"boot_options": {"type": "object"}}}}},
    "network": {"type": "object", "properties": {
      "interfaces": {"type": "object", "properties": {"vnic": {"type": "array", "hostSpecific": true}}}}}}})");
  rapidjson::Document split;
  ConfigStoreDocument::SplitDocument(profile, schemaDocument, "4C4C4544-0042-3510-8053-B4C04F4E3132", split);
  const std::string shared = R"({"system":{"kernel":{"boot_options":{"iommu":true}}}})";
  EXPECT_EQ(Compact(split),
            R"({"profile":)" + shared + R"(,"hostSpecific":)"
            R"({"4c4c4544-0042-3510-8053-b4c04f4e3132":{"system":{"identity":{"hostname":{"hostname":"h1"}}},)"
            R"("network":{"interfaces":{"vnic":[{"name":"vnic0"}]}}}}})");

  // Merged back for that host (named in any form), the profile is whole
  // again; any other host gets the shared items; other members stay.
  const std::string text = Compact(split);
  const rapidjson::Document source = Parse(text.substr(0, text.size() - 1) + R"(,"metadata":{"note":"kept"}})");
  rapidjson::Document merged, whole = Parse(R"({"metadata":{"note":"kept"},"profile":)" + Compact(profile) + "}");
  ConfigStoreDocument::GetDocumentForHost(source, merged, "{4c4c4544-0042-3510-8053-b4c04f4e3132}");
  ConfigStoreDocument::NormalizeValue(merged, merged.GetAllocator());
  ConfigStoreDocument::NormalizeValue(whole, whole.GetAllocator());
  EXPECT_EQ(Compact(merged), Compact(whole));
  ConfigStoreDocument::GetDocumentForHost(source, merged, "ffffffff-0000-0000-0000-000000000000");
  EXPECT_EQ(Compact(merged), R"({"profile":)" + shared + R"(,"metadata":{"note":"kept"}})");
  EXPECT_THROW(ConfigStoreDocument::GetDocumentForHost(Parse(R"({"hostSpecific": []})"), merged, "x"),
               ConfigStoreException);
}

TEST(ConfigStoreDocumentTest, CleanupActionsDropWhatEachPromises) {
  const rapidjson::Document schema = Parse(R"({"type": "object",
    "properties": {
      "name": {"type": "string", "default": "x"},
      "mtu": {"type": "integer", "default": 1500},
      "ipv4": {"type": "object", "properties": {"address": {"type": "string"}, "dhcp": {"default": false}}},
      "tags": {"type": "array", "items": {"type": "object", "properties": {"k": {}}}},
      "options": {"type": "object", "additionalProperties": {"type": "string"}}
    },
    "required": ["name"], "additionalProperties": false})");
  const std::string input = R"({"cs_generated_id":"g","name":"x","mtu":1500,"extra":1,"gone":null,)"
                            R"("ipv4":{"address":null,"dhcp":false,"junk":2},"tags":[{"k":1,"z":null,"q":3}],)"
                            R"("options":{"Port":"22"},"empty":{}})";
  const std::vector<std::pair<std::vector<CLEANUP_ACTIONS>, std::string>> cases = {
      {{CLEANUP_REMOVE_GENERATED_ID},
       R"({"name":"x","mtu":1500,"extra":1,"gone":null,"ipv4":{"address":null,"dhcp":false,"junk":2},)"
       R"("tags":[{"k":1,"z":null,"q":3}],"options":{"Port":"22"},"empty":{}})"},
      {{CLEANUP_REMOVE_NULLS},
       R"({"cs_generated_id":"g","name":"x","mtu":1500,"extra":1,"ipv4":{"dhcp":false,"junk":2},)"
       R"("tags":[{"k":1,"q":3}],"options":{"Port":"22"},"empty":{}})"},
      // Required members stay even at their default.
      {{CLEANUP_REMOVE_DEFAULTS},
       R"({"cs_generated_id":"g","name":"x","extra":1,"gone":null,"ipv4":{"address":null,"junk":2},)"
       R"("tags":[{"k":1,"z":null,"q":3}],"options":{"Port":"22"},"empty":{}})"},
      // The generated identity is removed only by its own action.
      {{CLEANUP_REMOVE_UNKNOWN},
       R"({"cs_generated_id":"g","name":"x","mtu":1500,"ipv4":{"address":null,"dhcp":false},)"
       R"("tags":[{"k":1}],"options":{"Port":"22"}})"},
      // Objects emptied by earlier actions go as well.
      {{CLEANUP_REMOVE_GENERATED_ID, CLEANUP_REMOVE_NULLS, CLEANUP_REMOVE_DEFAULTS, CLEANUP_REMOVE_UNKNOWN,
        CLEANUP_REMOVE_EMPTY_OBJECTS},
       R"({"name":"x","tags":[{"k":1}],"options":{"Port":"22"}})"},
  };
  for (const auto& [actions, expected] : cases) {
    rapidjson::Document value = Parse(input);
    ConfigStoreDocument::CleanupObject(value, schema, actions, value.GetAllocator());
    EXPECT_EQ(Compact(value), expected);
  }
  // A multi-instance key's array schema cleans its instances by "items".
  const rapidjson::Document arraySchema = Parse(R"({"type":"array","items":)" + Compact(schema) + "}");
  rapidjson::Document instance = Parse(R"({"name":"a","extra":1})");
  ConfigStoreDocument::CleanupObject(instance, arraySchema, {CLEANUP_REMOVE_UNKNOWN}, instance.GetAllocator());
  EXPECT_EQ(Compact(instance), R"({"name":"a"})");
}

TEST(ConfigStoreDocumentTest, NormalizeValueSortsMembersAtEveryDepthAndKeepsArrayOrder) {
  rapidjson::Document value = Parse(R"({"b":{"z":1,"a":[{"y":1,"x":2},3]},"a":null,"B":true})");
  ConfigStoreDocument::NormalizeValue(value, value.GetAllocator());
  EXPECT_EQ(Compact(value), R"({"B":true,"a":null,"b":{"a":[{"x":2,"y":1},3],"z":1}})");
}

TEST(ConfigStoreDocumentTest, PatchesFillFromAutoConfigurationValues) {
  const rapidjson::Document autoConf =
      Parse(R"({"protocol":"udp","port":514,"tls":{"caFile":"/ca","verify":true},"servers":["a","b","c","d"]})");
  // A plain missing member is patched in the host document tests; here the
  // field paths, members already present and what may stand in the way.
  const std::vector<std::tuple<bool, const char*, const char*, const char*>> cases = {  // union tag?
      {false, R"({"remoteHost":"h"})", "port", R"({"remoteHost":"h","port":514})"},
      {false, R"({"port":1})", "/port", R"({"port":1})"},
      {false, R"({"remoteHost":"h"})", "/missing", R"({"remoteHost":"h"})"},  // nothing to patch from
      {false, R"({"tls":{"caFile":"/mine"}})", "/tls", R"({"tls":{"caFile":"/mine","verify":true}})"},
      {true, R"({"protocol":"carrier-pigeon"})", "/protocol", R"({"protocol":"udp"})"},
      // Only members of objects that exist are patched: nothing in the way
      // is turned into an object, and no array is padded.
      {false, R"({"tls":"off"})", "/tls/caFile", R"({"tls":"off"})"},
      {true, R"({"tls":["x"]})", "/tls/caFile", R"({"tls":["x"]})"},
      {false, R"({"remoteHost":"h"})", "/tls/caFile", R"({"remoteHost":"h"})"},
      {false, R"({"servers":["a"]})", "/servers/3", R"({"servers":["a"]})"},
  };
  for (const auto& [unionTag, text, field, expected] : cases) {
    rapidjson::Document value = Parse(text);
    (unionTag ? ConfigStoreDocument::PatchUnionTagProperty : ConfigStoreDocument::PatchRequiredProperty)(
        value, field, autoConf, value.GetAllocator());
    EXPECT_EQ(Compact(value), expected) << text << " " << field;
  }
}

TEST(ConfigStoreDocumentTest, GeneratedInstanceIdsAreDistinctVersion4Uuids) {
  const std::regex uuid("[0-9a-f]{8}-[0-9a-f]{4}-4[0-9a-f]{3}-[89ab][0-9a-f]{3}-[0-9a-f]{12}");
  std::set<std::string> ids;
  for (int i = 0; i < 2000; ++i) {
    const std::string id = GenerateInstanceId();
    ASSERT_TRUE(std::regex_match(id, uuid)) << id;
    ids.insert(id);
  }
  EXPECT_EQ(ids.size(), 2000u);
}

}  // namespace
}  // namespace hoxcm_test
