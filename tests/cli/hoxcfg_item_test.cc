// hoxcfg get, set and delete through the built tool on a sandbox sample
// host, with the real runners.
#include <gtest/gtest.h>

#include <unistd.h>

#include <string>

#include "support/run_hoxcfg.h"

namespace hoxcm_test {
namespace {

using HoxcfgItemTest = HoxcfgTest;

TEST_F(HoxcfgItemTest, GetSetAndDeleteAnswerWithTheirExitStatuses) {
  InitSample();

  // Secrets are masked, and shown only to root on a terminal.
  HoxcfgOutcome r = Run("get security/accounts/users --json --compact");
  EXPECT_EQ(r.exitCode, 0);
  EXPECT_TRUE(Has(r.out, R"("password":"******")") && !Has(r.out, "$6$")) << r.out;
  EXPECT_EQ(Run("get security/accounts/users --show-secrets").exitCode, 2);
  r = RunHoxcfgOnTerminal(root_, "get security/accounts/users --show-secrets");
  EXPECT_EQ(r.exitCode, ::geteuid() == 0 ? 0 : 2) << r.out;
  EXPECT_EQ(Has(r.out, "$6$"), ::geteuid() == 0) << r.out;

  const std::string dns = R"(set network/dns/config --value '{"servers": ["10.0.0.53"]}')";
  RunSteps(root_, {
      // Findings per field: 1; a value that cannot be the item: 2.
      {R"(set network/dns/config --yes --value '{"servers": "10.0.0.1"}')", 1,
       "--value: /network/dns/config/servers: must be an array\n"},
      {R"(set network/dns/config --yes --value '[{"servers": []}]')", 2,
       "error 2028: Not a Non-Singleton object: /network/dns/config"},
      // Applied, then unchanged.
      {dns + " --yes", 0, "/network/dns/config: needs neither a reboot nor maintenance mode\n/network/dns/config: applied\n"},
      {dns + " --yes", 0, "/network/dns/config: unchanged\n"},
      {"delete services/syslog/config --yes", 0, "/services/syslog/config: deleted\n"},
      {"get services/syslog/config --json --compact", 0, R"("current":null)"},
      // An item is named with exactly three parts, with or without "/".
      {"get /services/syslog/config --json --compact", 0, R"("current":null)"},
      {"get services/syslog", 2, "'services/syslog' is not an item"},
      {"delete services//config --yes", 2, "is not an item"},
      {"get network/dns/config[x]", 2, "is not an item"},
  });

  // Staged for the next boot: 3, shown as desired; then every change is refused.
  r = Run("set system/kernel/boot_options --yes --json --compact --value "
                      R"('{"iommu": true, "hugepages": 4096, "console": "ttyS0"}')");
  EXPECT_EQ(r.exitCode, 3);
  EXPECT_EQ(r.out, R"({"item":"/system/kernel/boot_options","status":"staged","impact":2,"reasons":[{"component":)"
                   R"("system","group":"kernel","key":"boot_options","instance":"","action":"SET","impact":2,)"
                   R"("reasons":[{"rule":"property","impact":2,"path":"/system/kernel/boot_options/hugepages",)"
                   R"("oldValue":"2048","newValue":"4096"}]}]})" "\n");
  RunSteps(root_, {{"show desired --compact", 0, R"("hugepages":4096)"},
                  {R"(set network/dns/config --yes --value '{"servers": ["10.0.0.54"]}')", 2, "error 2029"}});
}

}  // namespace
}  // namespace hoxcm_test
