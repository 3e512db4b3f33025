// Host facts read from files under a temporary root.
#include <cerrno>
#include <cstdlib>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>
#include <hoxcm/config_store.h>
#include <hoxcm/host.h>

#include "platform/host/host_internal.h"
#include "support/temp_root.h"

namespace hoxcm_test {
namespace {

constexpr const char* kFacts = "/etc/tarvik/host-facts.json";

TEST(HostFactsTest, HardwareIdentityComesFromDmiThenMachineIdElseFails) {
  TempRoot root;
  EXPECT_THROW(HostCtl::Host::GetHardwareInfo(), HostCtl::Lib::HostCtlException);
  root.WriteFile("/etc/machine-id", "0123456789abcdef0123456789abcdef\n");
  EXPECT_EQ(HostCtl::Host::GetHardwareInfo().biosUuid, "0123456789abcdef0123456789abcdef");
  root.WriteFile("/sys/class/dmi/id/product_uuid", "\n");  // empty: no identity
  EXPECT_EQ(HostCtl::Host::GetHardwareInfo().biosUuid, "0123456789abcdef0123456789abcdef");
  root.WriteFile("/sys/class/dmi/id/product_uuid", "  4C4C4544-0042-3510-8053-B4C04F4E3132\n");
  root.WriteFile("/sys/class/dmi/id/sys_vendor", "Example Inc.\n");
  const auto info = HostCtl::Host::GetHardwareInfo();
  EXPECT_EQ(info.biosUuid + "|" + info.vendor + "|" + info.product,
            "4C4C4544-0042-3510-8053-B4C04F4E3132|Example Inc.|");
}

TEST(HostFactsTest, KernelReleaseSplitsIntoBuildVersionPatchAndUpdate) {
  const std::vector<std::tuple<const char*, const char*, const char*>> cases = {
      {"6.1.0-13-amd64", "#1 SMP PREEMPT_DYNAMIC Debian 6.1.55-1 (2023-09-29)", "1|6.1.0|13|amd64"},
      {"6.5.0-1-cloud-amd64", "#42 SMP", "42|6.5.0|1|cloud-amd64"},
      {"5.15.0", "SMP Tue", "SMP Tue|5.15.0||"},
      {"", "", "|||"},
  };
  for (const auto& [release, version, expected] : cases) {
    const auto v = HoxPlatform::detail::ParseKernelRelease(release, version);
    EXPECT_EQ(v.build + "|" + v.version + "|" + v.patch + "|" + v.update, expected) << release;
  }
  EXPECT_FALSE(QmkCtl::System::SystemInfoImpl::GetQmkVersion().version.empty());
}

TEST(HostFactsTest, FactsFileGivesQuickBootAndSwitchesAndMissingOrMalformedMeansFalse) {
  TempRoot root;
  EXPECT_FALSE(HostCtl::System::LoadHox::IsSupported());
  EXPECT_FALSE(FeatureState_IsEnabled("Qmkapps_BlockSshFileEdits"));
  root.WriteFile(kFacts,
                 R"({"quickBootSupported": true, "features": {"Qmkapps_BlockSshFileEdits": true, "x": "yes"}})");
  FeatureState_InitDeltaMode();
  EXPECT_TRUE(HostCtl::System::LoadHox::IsSupported());
  EXPECT_FALSE(HostCtl::System::LoadHox::IsSTMSupported());
  EXPECT_TRUE(FeatureState_IsEnabled("Qmkapps_BlockSshFileEdits"));
  EXPECT_FALSE(FeatureState_IsEnabled("x"));
  EXPECT_FALSE(FeatureState_IsEnabled(nullptr));
  // A changed file is seen without any call to re-initialise.
  root.WriteFile(kFacts, R"({"stmSupported": true, "features": {}})");
  EXPECT_TRUE(HostCtl::System::LoadHox::IsSTMSupported());
  EXPECT_FALSE(FeatureState_IsEnabled("Qmkapps_BlockSshFileEdits"));
  root.WriteFile(kFacts, "{\"stmSupported\": tru");
  FeatureState_InitSilentMode();
  EXPECT_FALSE(HostCtl::System::LoadHox::IsSTMSupported());
  std::vector<std::string> problems;
  EXPECT_FALSE(HoxPlatform::detail::ParseHostFacts(R"({"stmSupported": 1, "features": []})", problems).stmSupported);
  EXPECT_EQ(problems.size(), 2u);

  // A delta re-read logs every switch that changed, also one that was
  // removed from the file (and so is off now).
  root.WriteFile(kFacts, R"({"features": {"a": true, "b": true, "c": false}})");
  FeatureState_InitSilentMode();
  root.WriteFile(kFacts, R"({"features": {"b": true, "c": true}})");
  ::setenv("HOX_LOG_LEVEL", "detail", 1);
  testing::internal::CaptureStderr();
  FeatureState_InitDeltaMode();
  const std::string log = testing::internal::GetCapturedStderr();
  ::unsetenv("HOX_LOG_LEVEL");
  EXPECT_NE(log.find("Feature switch a is now 0"), std::string::npos) << log;
  EXPECT_EQ(log.find("Feature switch b"), std::string::npos) << log;
  EXPECT_NE(log.find("Feature switch c is now 1"), std::string::npos) << log;
}

TEST(HostFactsTest, MaintenanceModeNodeReadsTheStoreAndFailsWithoutOne) {
  TempRoot root;
  EXPECT_EQ(VSI_CheckSig(), 0);
  bool enabled = true;
  EXPECT_EQ(VSI_Get("maintenanceMode", &enabled), 0);
  EXPECT_FALSE(enabled);
  HoxConfigStore::SetMaintenanceMode(true);
  EXPECT_EQ(VSI_Get("maintenanceMode", &enabled), 0);
  EXPECT_TRUE(enabled);
  EXPECT_EQ(VSI_Get("noSuchNode", &enabled), ENOENT);
  EXPECT_EQ(VSI_Get("maintenanceMode", nullptr), EINVAL);
  TempRoot broken;
  broken.WriteFile("/var/lib/tarvik/configstore/configstore.db", std::string(4096, 'x'));
  EXPECT_NE(VSI_CheckSig(), 0);
  EXPECT_NE(VSI_Get("maintenanceMode", &enabled), 0);
}

}  // namespace
}  // namespace hoxcm_test
