// Plugin manifests: identity from the path, versions, capabilities, and the
// checks against the manifest schemas.
#include <filesystem>
#include <fstream>
#include <functional>

#include "plugins/plugin_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;

int CodeOf(const std::function<void()>& f) {
  try {
    f();
  } catch (const HoxConfigStore::ConfigStoreException& e) {
    return e.GetErrorCode();
  }
  return 0;
}

std::string MessageOf(const std::function<void()>& f) {
  try {
    f();
  } catch (const std::exception& e) {
    return e.what();
  }
  return "";
}

TEST(GetPluginVersionTest, ReadsOnlySigned64BitIntegers) {
  const struct {
    const char* manifest;
    long version;
  } cases[] = {
      {R"({"version":3})", 3},      {R"({})", 1},           {R"({"version":2.0})", 1},
      {R"({"version":"2"})", 1},    {R"([1,2])", 1},        {R"({"version":-4})", -4},
      {R"({"version":18446744073709551615})", 1},
  };
  for (const auto& c : cases) {
    Document doc;
    ParseDocument(c.manifest, doc);
    EXPECT_EQ(GetPluginVersion(doc), c.version) << c.manifest;
  }
}

using PluginManifestTest = PluginTest;

TEST_F(PluginManifestTest, IdentityFollowsThePathDepthOfEachVersion) {
  // Given manifests of both families at every allowed depth, the id, module
  // and owned objects come from the directory names.
  const std::string v1 = R"({"type":"c++","boot":false,"apply_group":"network","operations":{},
                             "accepts":["storage:nfs:mounts"]})";
  const std::string v3 = V3Manifest("c++", {"network:dns:config", "network:routes:static"}, "network",
                                    "REMEDIATE:net", {});
  const struct {
    std::string relative, text, id, module;
    std::vector<std::string> owned;
  } cases[] = {
      {"net/plugin.json", v3, "net", "libnet.so", {"network/dns/config", "network/routes/static"}},
      {"net/dns/plugin.json", v3, "net:dns", "libnet_dns.so", {"network/dns/config", "network/routes/static"}},
      {"network/dns/config/x.json", v1, "network:dns:config", "libnetwork_dns_config.so", {"network/dns/config"}},
      {"network/dns/config/extra/x.json", v1, "network:dns:config:extra", "libnetwork_dns_config_extra.so",
       {"network/dns/config"}},
  };
  for (const auto& c : cases) {
    Plugin plugin(Manifest(c.relative, c.text).c_str());
    EXPECT_EQ(plugin.GetId(), c.id);
    EXPECT_EQ(plugin.GetModule(), c.module);
    std::vector<std::string> owned;
    for (const auto& id : plugin.GetCSOIdList()) owned.push_back(id.component + "/" + id.group + "/" + id.key);
    EXPECT_EQ(owned, c.owned) << c.relative;
  }
}

TEST_F(PluginManifestTest, WrongDepthOrVersionIsRejected) {
  const std::string v3 = V3Manifest("python", {"network:dns:config"}, "network", "REMEDIATE:a", {});
  EXPECT_EQ(CodeOf([&] { Plugin(Manifest("a/b/c/plugin.json", v3).c_str()); }), PluginSchemaInvalid);
  const std::string v1 = R"({"type":"python","boot":true,"apply_group":"system","operations":{}})";
  EXPECT_EQ(CodeOf([&] { Plugin(Manifest("network/dns/plugin.json", v1).c_str()); }), PluginSchemaInvalid);
  // Version 4 has no schema: the schema check refuses it first.
  const std::string v4 = R"({"version":4,"type":"python"})";
  const std::string path = Manifest("v4/plugin.json", v4);
  EXPECT_EQ(MessageOf([&] { Plugin p(path.c_str()); }),
            "The version of the plugin defined in '" + path +
                "' which is 4 does not have a matching hardcoded schema to use for validation");
  EXPECT_EQ(CodeOf([] { Plugin p(nullptr); }), kPluginFailureCode);
  // A python plugin has no module; "cpp" is not "c++" and gets none either.
  EXPECT_EQ(Plugin(Manifest("py/plugin.json", v3).c_str()).GetModule(), "");
  EXPECT_EQ(Plugin(Manifest("cpp/plugin.json", V3Manifest("cpp", {"network:dns:config"}, "network", "R:x", {}))
                       .c_str())
                .GetModule(),
            "");
}

TEST_F(PluginManifestTest, SchemaFailuresNameTheFileAndTheErrors) {
  // A version-3 manifest without "accepts", and one whose "accepts" entry
  // has two parts.
  const std::string missing = Manifest("a/plugin.json", R"({"version":3,"type":"python"})");
  EXPECT_NE(MessageOf([&] { Plugin p(missing.c_str()); }).find("Failed to validate the plugin defined in '" + missing +
                                                               "' , version 3, errors: ["),
            std::string::npos);
  const std::string shortName =
      Manifest("b/plugin.json", V3Manifest("python", {"network:dns"}, "network", "REMEDIATE:b", {}));
  EXPECT_EQ(CodeOf([&] { Plugin p(shortName.c_str()); }), kPluginFailureCode);
}

TEST_F(PluginManifestTest, CapabilitiesPerVersion) {
  Plugin v1(Manifest("network/dns/config/a.json",
                     R"({"type":"python","boot":true,"apply_group":"network",
                         "operations":{"SET":{"provides":"SET:x","depends":["a","b"]},
                                       "ADD":{"provides":"ADD:x","depends":[]}}})")
                .c_str());
  EXPECT_TRUE(v1.HasApplySupport());
  EXPECT_TRUE(v1.HasApplyBootSupport());
  EXPECT_FALSE(v1.HasImpactSupport());
  EXPECT_FALSE(v1.HasValidateSupport());
  EXPECT_EQ(v1.GetApplyGroup(), "network");
  const auto ops = v1.GetOperations();
  ASSERT_EQ(ops.size(), 2u);
  EXPECT_EQ(ops[0].operation, "SET");
  EXPECT_EQ(ops[0].depends, (std::vector<std::string>{"a", "b"}));
  EXPECT_EQ(ops[1].operation, "ADD");
  EXPECT_TRUE(ops[1].depends.empty());

  Plugin v2(Manifest("network/routes/static/a.json",
                     R"({"version":2,"type":"python","impact":{"supports":true},
                         "validation":{"supports":true,"references":["network:dns:config"]}})")
                .c_str());
  EXPECT_FALSE(v2.HasApplySupport());
  EXPECT_FALSE(v2.CheckType(APPLY));
  EXPECT_FALSE(v2.CheckType(APPLY_BOOT));
  EXPECT_TRUE(v2.CheckType(IMPACT));
  EXPECT_TRUE(v2.CheckType(VALIDATE));
  ASSERT_EQ(v2.GetReferences().size(), 1u);
  EXPECT_EQ(v2.GetReferences()[0], HoxConfigStore::ConfigStoreObjectId("network", "dns", "config"));

  Plugin v3(Manifest("n/plugin.json",
                     V3Manifest("c++", {"network:dns:config"}, "storage", "REMEDIATE:n", {"x", "y"})).c_str());
  PluginApplyOperation op;
  v3.GetRemediateOperation(op);
  EXPECT_EQ(op.operation, "REMEDIATE");
  EXPECT_EQ(op.provides, "REMEDIATE:n");
  EXPECT_EQ(op.depends, (std::vector<std::string>{"x", "y"}));
  EXPECT_TRUE(v3.GetReferences().empty());
}

TEST_F(PluginManifestTest, AnUnknownKeyFailsConstruction) {
  // The schema store must know the first owned object.
  const std::string path = Manifest("u/plugin.json", V3Manifest("python", {"no:such:key"}, "system", "R:u", {}));
  EXPECT_THROW(Plugin p(path.c_str()), std::exception);
}

class PluginSchemaFileTest : public ::testing::Test {
 protected:
  std::string Write(const std::string& name, const std::string& text) {
    root.WriteFile("/s/" + name, text);
    return root.Path("/s/" + name);
  }
  TempRoot root;
};

TEST_F(PluginSchemaFileTest, EachDefectHasItsOwnText) {
  const std::string q = "\"";
  const struct {
    const char* text;
    std::string expected;  // with P for the path
  } cases[] = {
      {"{", "Failed to parse the schema file \"P\""},
      {"[]", "The schema P is not a JSON object"},
      {"{}", "The schema P does not have a property called \"properties\""},
      {R"({"properties":1})", "The schema P's property \"properties\" is not a JSON object"},
      {R"({"properties":{}})",
       "The property \"version\" of the property \"properties\" from  the schema P does not exist"},
      {R"({"properties":{"version":{"maximum":1}}})",
       "The property \"version\" of the property \"properties\" from the schema P does not have a property called "
       "\"minimum\""},
      {R"({"properties":{"version":{"minimum":1.5,"maximum":1}}})",
       "The property \"minimum\" of the property \"version\" of the property \"properties\" from the schema P has a "
       "value whose type is not Int64"},
      {R"({"properties":{"version":{"minimum":0,"maximum":1}}})",
       "The property \"minimum\" of the property \"version\" of the property \"properties\" from the schema P has a "
       "value whose type is Int64, but the value is not 1, 2 or 3"},
      {R"({"properties":{"version":{"minimum":2}}})",
       "The property \"version\" of the property \"properties\" from the schema P does not have a property called "
       "\"maximum\""},
  };
  for (const auto& c : cases) {
    const std::string path = Write("x.json", c.text);
    Document schema;
    std::string error;
    CreatePluginSchemaFromFile(path, schema, error);
    std::string expected = c.expected;
    expected.replace(expected.find('P'), 1, path);
    EXPECT_EQ(error, expected) << c.text;
  }
  Document schema;
  std::string error;
  EXPECT_EQ(CreatePluginSchemaFromFile(Write("ok.json", R"({"properties":{"version":{"minimum":2,"maximum":7}}})"),
                                       schema, error),
            2);
  EXPECT_EQ(error, "");
  CreatePluginSchemaFromFile(root.Path("/s/none.json"), schema, error);
  EXPECT_EQ(error, "Failed to open the schema file " + q + root.Path("/s/none.json") + q);
}

TEST_F(PluginSchemaFileTest, SchemasAreFiledUnderTheirMinimumAndAllOrNone) {
  const std::string dir = root.Path("/s/");
  Write("plugin_version_1_schema.json", R"({"properties":{"version":{"minimum":3,"maximum":3}}})");
  Write("plugin_version_2_schema.json", R"({"properties":{"version":{"minimum":2,"maximum":2}}})");
  std::string error;
  EXPECT_TRUE(CreatePluginSchemas(dir, error).empty());
  EXPECT_NE(error.find("Failed to open the schema file"), std::string::npos);
  Write("plugin_version_3_schema.json", R"({"properties":{"version":{"minimum":1,"maximum":1}}})");
  error.clear();
  const auto schemas = CreatePluginSchemas(dir, error);
  EXPECT_EQ(error, "");
  ASSERT_EQ(schemas.size(), 3u);
  EXPECT_EQ(schemas.at(3)["properties"]["version"]["minimum"].GetInt(), 3);
  EXPECT_EQ(schemas.at(1)["properties"]["version"]["minimum"].GetInt(), 1);
}

TEST_F(PluginManifestTest, MissingSchemaDirectoryFailsEveryManifest) {
  std::filesystem::remove_all(root.Path("/usr/lib/tarvik/configmanager/plugin_schemas"));
  const std::string path = Manifest("a/plugin.json", V3Manifest("python", {"network:dns:config"}, "network", "R", {}));
  EXPECT_NE(MessageOf([&] { Plugin p(path.c_str()); }).find("Failed to open the schema file"), std::string::npos);
}

TEST_F(PluginManifestTest, ValidateAllPluginsCollectsEveryBadFile) {
  Manifest("good/plugin.json", V3Manifest("python", {"network:dns:config"}, "network", "R:good", {}));
  Manifest("bad/plugin.json", R"({"version":3,"type":"python"})");
  Manifest("broken/plugin.json", "{");
  Manifest("ignored/notes.txt", "{");
  Document report;
  ValidateAllPlugins(root.Path(kModules), root.Path("/usr/lib/tarvik/configmanager/plugin_schemas/"), report);
  ASSERT_TRUE(report.IsArray());
  ASSERT_EQ(report.Size(), 2u);
  EXPECT_EQ(std::string(report[0]["file"].GetString()), root.Path(kModules + "bad/plugin.json"));
  EXPECT_GT(report[0]["validation_errors"].Size(), 0u);
  EXPECT_EQ(std::string(report[1]["validation_errors"][0].GetString()),
            "Failed to parse the data from file \"" + root.Path(kModules + "broken/plugin.json") + "\"");
}

TEST_F(PluginManifestTest, SamplePluginsAndSchemasAgree) {
  root.CopyTree("data/sample-plugins", kModules);
  Document report;
  ValidateAllPlugins(root.Path(kModules), root.Path("/usr/lib/tarvik/configmanager/plugin_schemas/"), report);
  EXPECT_EQ(report.Size(), 0u) << JsonToString(report);
}

}  // namespace
}  // namespace hoxcm_test
