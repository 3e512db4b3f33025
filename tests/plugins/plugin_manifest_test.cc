// Plugin manifests: identity from the path, versions, capabilities, and the
// checks against the manifest schemas.
#include "plugins/plugin_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;

TEST(GetPluginVersionTest, ReadsOnlySigned64BitIntegers) {
  const std::pair<const char*, long> cases[] = {
      {R"({"version":3})", 3},   {R"({})", 1},    {R"({"version":2.0})", 1},
      {R"({"version":"2"})", 1}, {R"([1,2])", 1}, {R"({"version":-4})", -4},
      {R"({"version":18446744073709551615})", 1},
  };
  for (const auto& [manifest, version] : cases) {
    Document doc;
    ParseDocument(manifest, doc);
    EXPECT_EQ(GetPluginVersion(doc), version) << manifest;
  }
}

using PluginManifestTest = PluginTest;

TEST_F(PluginManifestTest, IdentityFollowsThePathDepthOfEachVersion) {
  // The id, module and owned objects come from the directory names; only a
  // "c++" plugin has a module ("cpp" is not "c++").
  const std::string v1 = R"({"type":"c++","boot":false,"apply_group":"network","operations":{},
                             "accepts":["storage:nfs:mounts"]})";
  const std::string v3 = V3Manifest("c++", {"network:dns:config", "network:routes:static"}, "network", "R:net", {});
  const std::vector<std::string> both = {"network/dns/config", "network/routes/static"};
  const struct {
    std::string relative, text, id, module;
    std::vector<std::string> owned;
  } cases[] = {
      {"net/plugin.json", v3, "net", "libnet.so", both},
      {"net/dns/plugin.json", v3, "net:dns", "libnet_dns.so", both},
      {"network/dns/config/x.json", v1, "network:dns:config", "libnetwork_dns_config.so", {"network/dns/config"}},
      {"network/dns/config/extra/x.json", v1, "network:dns:config:extra", "libnetwork_dns_config_extra.so",
       {"network/dns/config"}},
      {"py/plugin.json", V3Manifest("python", {"network:dns:config"}, "network", "R:py", {}), "py", "",
       {"network/dns/config"}},
      {"cpp/plugin.json", V3Manifest("cpp", {"network:dns:config"}, "network", "R:cpp", {}), "cpp", "",
       {"network/dns/config"}},
  };
  for (const auto& c : cases) {
    Plugin plugin(Manifest(c.relative, c.text).c_str());
    EXPECT_EQ(plugin.GetId(), c.id);
    EXPECT_EQ(plugin.GetModule(), c.module) << c.relative;
    std::vector<std::string> owned;
    for (const auto& id : plugin.GetCSOIdList()) owned.push_back(id.component + "/" + id.group + "/" + id.key);
    EXPECT_EQ(owned, c.owned) << c.relative;
  }
}

TEST_F(PluginManifestTest, BadManifestsAreRejectedWithTheirCodeAndText) {
  const std::string v1 = R"({"type":"python","boot":true,"apply_group":"system","operations":{}})";
  const struct {
    std::string relative, text;
    int code;
    std::string prefix;  // of the message, with P for the path
  } cases[] = {
      {"a/b/c/plugin.json", V3Manifest("python", {"network:dns:config"}, "network", "R:a", {}), PluginSchemaInvalid,
       ""},
      {"network/dns/plugin.json", v1, PluginSchemaInvalid, ""},
      // Version 4 has no schema: the schema check refuses it first.
      {"v4/plugin.json", R"({"version":4,"type":"python"})", kPluginFailureCode,
       "The version of the plugin defined in 'P' which is 4 does not have a matching hardcoded schema to use for "
       "validation"},
      {"a/plugin.json", R"({"version":3,"type":"python"})", kPluginFailureCode,
       "Failed to validate the plugin defined in 'P' , version 3, errors: ["},
      {"b/plugin.json", V3Manifest("python", {"network:dns"}, "network", "R:b", {}), kPluginFailureCode, ""},
      // The schema store must know the first owned object.
      {"u/plugin.json", V3Manifest("python", {"no:such:key"}, "system", "R:u", {}), 2021, ""},
  };
  for (const auto& c : cases) {
    const std::string path = Manifest(c.relative, c.text);
    const Thrown thrown = ThrownBy([&] { Plugin p(path.c_str()); });
    EXPECT_EQ(thrown.code, c.code) << c.relative << ": " << thrown.message;
    std::string prefix = c.prefix;
    if (!prefix.empty()) prefix.replace(prefix.find('P'), 1, path);
    EXPECT_EQ(thrown.message.rfind(prefix, 0), 0u) << thrown.message;
  }
  EXPECT_EQ(ThrownBy([] { Plugin p(nullptr); }).code, kPluginFailureCode);
}

TEST_F(PluginManifestTest, MissingSchemaDirectoryFailsEveryManifest) {
  std::filesystem::remove_all(root.Path(kPluginSchemas));
  const std::string good = Manifest("g/plugin.json", V3Manifest("python", {"network:dns:config"}, "network", "R", {}));
  EXPECT_NE(ThrownBy([&] { Plugin p(good.c_str()); }).message.find("Failed to open the schema file"),
            std::string::npos);
}

TEST_F(PluginManifestTest, CapabilitiesPerVersion) {
  // Operations and their order come from every version (the manager tests);
  // here what each version supports.
  Plugin v1(Manifest("network/dns/config/a.json",
                     R"({"type":"python","boot":true,"apply_group":"network","operations":{}})").c_str());
  EXPECT_TRUE(v1.HasApplySupport() && v1.HasApplyBootSupport());
  EXPECT_FALSE(v1.HasImpactSupport() || v1.HasValidateSupport());
  // Without apply support there is no boot-time apply either.
  Plugin v2(Manifest("network/routes/static/a.json",
                     R"({"version":2,"type":"python","impact":{"supports":true},
                         "validation":{"supports":true,"references":["network:dns:config"]}})")
                .c_str());
  EXPECT_FALSE(v2.HasApplySupport() || v2.CheckType(APPLY) || v2.CheckType(APPLY_BOOT));
  EXPECT_TRUE(v2.CheckType(IMPACT) && v2.CheckType(VALIDATE));
  EXPECT_EQ(v2.GetReferences(), (std::vector<HoxConfigStore::ConfigStoreObjectId>{{"network", "dns", "config"}}));
}

// Writes a manifest schema file under the root's /s/ and returns its path.
std::string WriteSchema(const TempRoot& root, const std::string& name, const std::string& text) {
  root.WriteFile("/s/" + name, text);
  return root.Path("/s/" + name);
}

TEST(PluginSchemaFileTest, EveryDefectIsRefusedNamingTheFile) {
  // Each defect has its own text in the code; what counts here is that none
  // passes, and that the file is named.
  TempRoot root;
  const char* cases[] = {
      "{", "[]", "{}", R"({"properties":1})", R"({"properties":{}})", R"({"properties":{"version":{"maximum":1}}})",
      R"({"properties":{"version":{"minimum":1.5,"maximum":1}}})",
      R"({"properties":{"version":{"minimum":0,"maximum":1}}})", R"({"properties":{"version":{"minimum":2}}})",
      nullptr,  // no file
  };
  Document schema;
  std::string error;
  for (const char* text : cases) {
    const std::string path = text ? WriteSchema(root, "x.json", text) : root.Path("/s/none.json");
    error.clear();
    EXPECT_EQ(CreatePluginSchemaFromFile(path, schema, error), 0) << (text ? text : "missing");
    EXPECT_NE(error.find(path), std::string::npos) << error;
  }
  EXPECT_EQ(error, "Failed to open the schema file \"" + root.Path("/s/none.json") + "\"");
  const std::string ok = WriteSchema(root, "ok.json", R"({"properties":{"version":{"minimum":2,"maximum":7}}})");
  EXPECT_EQ(CreatePluginSchemaFromFile(ok, schema, error), 2);
}

TEST(PluginSchemaFileTest, SchemasAreFiledUnderTheirMinimumAndAllOrNone) {
  TempRoot root;
  const std::string dir = root.Path("/s/");
  WriteSchema(root, "plugin_version_1_schema.json", R"({"properties":{"version":{"minimum":3,"maximum":3}}})");
  WriteSchema(root, "plugin_version_2_schema.json", R"({"properties":{"version":{"minimum":2,"maximum":2}}})");
  std::string error;
  EXPECT_TRUE(CreatePluginSchemas(dir, error).empty());
  EXPECT_NE(error.find("Failed to open the schema file"), std::string::npos);
  WriteSchema(root, "plugin_version_3_schema.json", R"({"properties":{"version":{"minimum":1,"maximum":1}}})");
  error.clear();
  const auto schemas = CreatePluginSchemas(dir, error);
  EXPECT_EQ(error, "");
  ASSERT_EQ(schemas.size(), 3u);
  EXPECT_EQ(schemas.at(3)["properties"]["version"]["minimum"].GetInt(), 3);
  EXPECT_EQ(schemas.at(1)["properties"]["version"]["minimum"].GetInt(), 1);
}

TEST_F(PluginManifestTest, ValidateAllPluginsCollectsEveryBadFile) {
  Manifest("good/plugin.json", V3Manifest("python", {"network:dns:config"}, "network", "R:good", {}));
  Manifest("bad/plugin.json", R"({"version":3,"type":"python"})");
  Manifest("broken/plugin.json", "{");
  Manifest("ignored/notes.txt", "{");
  Document report;
  ValidateAllPlugins(root.Path(kModules), root.Path(kPluginSchemas), report);
  ASSERT_TRUE(report.IsArray());
  ASSERT_EQ(report.Size(), 2u);
  EXPECT_EQ(std::string(report[0]["file"].GetString()), root.Path(kModules + "bad/plugin.json"));
  EXPECT_GT(report[0]["validation_errors"].Size(), 0u);
  EXPECT_EQ(std::string(report[1]["validation_errors"][0].GetString()),
            "Failed to parse the data from file \"" + root.Path(kModules + "broken/plugin.json") + "\"");
}

}  // namespace
}  // namespace hoxcm_test
