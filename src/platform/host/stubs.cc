// Temporary definitions so that the library links while host facts are built.
#include <stdexcept>

#include <hoxcm/host.h>

namespace {
[[noreturn]] void NotImplemented() { throw std::logic_error("not implemented"); }
}  // namespace

namespace HostCtl {
namespace Host {
HardwareInfo GetHardwareInfo() { NotImplemented(); }
}  // namespace Host
namespace System::LoadHox {
bool IsSTMSupported() { NotImplemented(); }
bool IsSupported() { NotImplemented(); }
}  // namespace System::LoadHox
}  // namespace HostCtl

namespace QmkCtl::System {
QmkVersion SystemInfoImpl::GetQmkVersion() { NotImplemented(); }
void SshAuthKeysConfig::UpgradeConfigToConfigStore() { NotImplemented(); }
void SshClientConfig::UpgradeConfigToConfigStore() { NotImplemented(); }
void SshServerConfig::UpgradeConfigToConfigStore() { NotImplemented(); }
}  // namespace QmkCtl::System

int VSI_CheckSig() { NotImplemented(); }
int VSI_Get(const char*, bool*) { NotImplemented(); }
void FeatureState_InitSilentMode() { NotImplemented(); }
void FeatureState_InitDeltaMode() { NotImplemented(); }
bool FeatureState_IsEnabled(const char*) { NotImplemented(); }
