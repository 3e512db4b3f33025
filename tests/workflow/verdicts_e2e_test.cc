// Impact and validation end to end, with real runner processes: the sample
// plugins judging and validating a changed sample host in both runner
// languages. (Runs that crash, answer garbage or hang: the runner
// conformance suite and the launcher's failure table.)
#include <hoxcm/host_documents.h>
#include <hoxcm/operations.h>

#include "plugins/plugin_fixture.h"
#include "support/json.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;

class VerdictsEndToEndTest : public PluginTest {
 protected:
  VerdictsEndToEndTest() : host_(JsonToString(SampleDocument("user-config.json"))) { root.InstallRunners(); }

  // Impact of `desired` against the sample host, its reasons as lines.
  ImpactResult Judge(const std::string& desired, std::vector<std::string>* reasonLines = nullptr) {
    Document document = Parse(desired);
    ImpactResult result;
    ImpactReasons reasons;
    Impact(document, "t", result, TaskHandle::Dummy(), Parse(host_), &reasons);
    for (const ObjectImpact& object : reasons.objects) {
      if (reasonLines == nullptr) break;
      reasonLines->push_back(object.id.toString() + " " + object.action);
      for (const ImpactReason& r : object.reasons) {
        reasonLines->push_back(r.rule == ImpactReason::Rule::kPlugin ? "  " + r.plugin + ": " + r.reason
                                                                     : "  schema " + r.path);
      }
    }
    return result;
  }
  std::vector<std::string> Check(const std::string& desired, bool checkSchema) {
    const Document document = Parse(desired);
    Document schema;
    EXPECT_TRUE(GenerateHostDocumentSchema(document, schema));
    ValidationResult result;
    Validate(document, schema, "t", result, checkSchema);
    EXPECT_EQ(result.error, ErrorInfo());
    std::vector<std::string> lines;
    for (const ValidationErrorInfo& entry : result.errors) {
      for (const ErrorInfo& e : entry.errors) lines.push_back(entry.field + " " + e.id);
    }
    return lines;
  }

  const std::string host_;
};

TEST_F(VerdictsEndToEndTest, TheSamplePluginsJudgeAndValidateInBothLanguages) {
  root.InstallSamplePlugins();
  // A firewall rule added (the C++ plugin) and the management port group
  // retagged (the Python plugin): maintenance mode, each for its reason.
  std::string desired = Replaced(host_, R"({"name":"ssh-mgmt")",
                             R"({"name":"web","action":"allow","protocol":"tcp","port":443},{"name":"ssh-mgmt")");
  desired = Replaced(desired, R"("vswitch":"vSwitch0","vlan":0)", R"("vswitch":"vSwitch0","vlan":10)");
  std::vector<std::string> reasons;
  const ImpactResult result = Judge(desired, &reasons);
  EXPECT_EQ(result.error, ErrorInfo());
  EXPECT_EQ(result.impact, IMPACT_MAINTENANCE_MODE_REQUIRED);
  EXPECT_EQ(reasons, (std::vector<std::string>{
                         "comp network grp firewall key rules id web ADD",
                         "  schema /network/firewall/rules/0",
                         "  network: firewall rules change",
                         "comp network grp vswitch key portgroups id Management Network SET",
                         "  network:vswitch: the management port group moves to VLAN 10: the host's management "
                         "connection moves with it",
                     }));

  // With the schema stage: the vNIC key fails its schema, so the C++ plugin
  // is skipped; the Python plugin finds the empty domain label.
  std::string faulty = Replaced(host_, R"("mtu":1500)", R"("mtu":100)");
  faulty = Replaced(faulty, R"("domain":"lab.example.com")", R"("domain":"lab..example.com")");
  faulty = Replaced(faulty, R"("10.20.0.11")", R"("10.20.0.311")");
  EXPECT_EQ(Check(faulty, true), (std::vector<std::string>{
                                     "/network/dns/config/servers/1 com.tarvik.hox.settings.validation.pattern",
                                     "/network/interfaces/vnic/0/mtu com.tarvik.hox.settings.validation.minimum",
                                     "/system/identity/hostname/domain "
                                     "com.tarvik.hox.settings.system.identity.invalid-name",
                                 }));
  // Plugins only: the C++ plugin checks the DNS servers, and each vNIC's
  // port group against the port groups it gets as references.
  faulty = Replaced(faulty, R"("portgroup":"Storage")", R"("portgroup":"Nowhere")");
  EXPECT_EQ(Check(faulty, false), (std::vector<std::string>{
                                      "/network/dns/config/servers/1 com.tarvik.hox.settings.network.dns.invalid-server",
                                      "/network/interfaces/vnic/1/portgroup "
                                      "com.tarvik.hox.settings.network.vnic.unknown-portgroup",
                                      "/system/identity/hostname/domain "
                                      "com.tarvik.hox.settings.system.identity.invalid-name",
                                  }));
  EXPECT_TRUE(Check(host_, true).empty());
}

}  // namespace
}  // namespace hoxcm_test
