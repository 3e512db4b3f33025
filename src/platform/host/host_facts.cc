// Hardware identity, kernel version, quick-boot support, feature switches and
// the maintenance-mode node, read from files under the host root.
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/utsname.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstring>
#include <mutex>
#include <set>

#include <hoxcm/config_store.h>
#include <hoxcm/errors.h>
#include <hoxcm/files.h>
#include <hoxcm/json.h>

#include "foundation/json_parse.h"
#include "platform/host/host_internal.h"

namespace HoxPlatform::detail {
namespace {



std::string Trim(std::string text) {
  const auto notSpace = [](unsigned char c) { return !std::isspace(c); };
  text.erase(text.begin(), std::find_if(text.begin(), text.end(), notSpace));
  text.erase(std::find_if(text.rbegin(), text.rend(), notSpace).base(), text.end());
  return text;
}

// The trimmed first line of a host file; empty when missing or unreadable.
std::string ReadFact(std::string_view hostPath) {
  std::string text;
  try {
    if (!ReadHostFile(HostPath(hostPath), text)) return {};
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kWarning, "%s", e.what());
    return {};
  }
  return Trim(text.substr(0, text.find('\n')));
}

// What identifies a version of the facts file; a change reloads it.
struct FileSignature {
  bool exists = false;
  dev_t device = 0;
  ino_t inode = 0;
  off_t size = 0;
  long long mtimeNs = 0;
  bool operator==(const FileSignature&) const = default;
};

FileSignature Signature(const std::string& path) {
  struct stat st {};
  FileSignature s;
  if (::stat(path.c_str(), &st) != 0) return s;
  s.exists = true;
  s.device = st.st_dev;
  s.inode = st.st_ino;
  s.size = st.st_size;
  s.mtimeNs = static_cast<long long>(st.st_mtim.tv_sec) * 1000000000LL + st.st_mtim.tv_nsec;
  return s;
}

struct FactsCache {
  std::mutex mutex;  // guards the fields below
  bool loaded = false;
  std::string path;
  FileSignature signature;
  HostFacts facts;
};

FactsCache& TheFactsCache() {
  static FactsCache cache;
  return cache;
}

enum class LoadMode { kSilent, kDelta, kLazy };

HostFacts LoadFacts(LoadMode mode) {
  const std::string path = HostPath(HostPaths::kHostFacts);
  FactsCache& cache = TheFactsCache();
  std::lock_guard<std::mutex> lock(cache.mutex);
  const FileSignature signature = Signature(path);
  const bool changed = !cache.loaded || cache.path != path || !(cache.signature == signature);
  if (!changed && mode != LoadMode::kSilent) return cache.facts;

  HostFacts facts;
  std::vector<std::string> problems;
  std::string text;
  try {
    if (ReadHostFile(path, text)) facts = ParseHostFacts(text, problems);
  } catch (const std::exception& e) {
    problems.push_back(e.what());
  }
  if (mode != LoadMode::kSilent) {
    for (const std::string& problem : problems) {
      CSLogger::Log(CSLogger::kWarning, "Host facts %s: %s", path.c_str(), problem.c_str());
    }
  }
  if (mode == LoadMode::kDelta && cache.loaded && cache.path == path) {
    const auto enabled = [](const HostFacts& f, const std::string& name) {
      auto it = f.features.find(name);
      return it != f.features.end() && it->second;
    };
    // A switch removed from the file is off now: both sides are compared.
    std::set<std::string> names;
    for (const HostFacts* f : {&cache.facts, &facts}) {
      for (const auto& entry : f->features) names.insert(entry.first);
    }
    for (const std::string& name : names) {
      const bool now = enabled(facts, name);
      if (enabled(cache.facts, name) != now) {
        CSLogger::Log(CSLogger::kDetail, "Feature switch %s is now %d", name.c_str(), now);
      }
    }
  }
  cache.loaded = true;
  cache.path = path;
  cache.signature = signature;
  cache.facts = facts;
  return facts;
}

}  // namespace

bool ReadHostFile(const std::string& path, std::string& out) {
  std::optional<std::string> text = ReadFileIfExists(path, FileKind::HostFile);
  if (!text) return false;
  out = std::move(*text);
  return true;
}

QmkCtl::System::QmkVersion ParseKernelRelease(std::string_view release, std::string_view version) {
  QmkCtl::System::QmkVersion result;
  const std::size_t dash = release.find('-');
  result.version = std::string(release.substr(0, dash));
  if (dash != std::string_view::npos) {
    const std::string_view rest = release.substr(dash + 1);
    const std::size_t next = rest.find('-');
    result.patch = std::string(rest.substr(0, next));
    if (next != std::string_view::npos) result.update = std::string(rest.substr(next + 1));
  }
  // "#1 SMP PREEMPT_DYNAMIC Debian ..." is build 1; a version string without
  // a build number is kept whole.
  std::size_t digits = 0;
  if (!version.empty() && version.front() == '#') {
    while (1 + digits < version.size() && std::isdigit(static_cast<unsigned char>(version[1 + digits]))) ++digits;
  }
  result.build = digits > 0 ? std::string(version.substr(1, digits)) : std::string(version);
  return result;
}

HostFacts ParseHostFacts(const std::string& text, std::vector<std::string>& problems) {
  HostFacts facts;
  rapidjson::Document doc;
  std::string error;
  if (!HoxConfigManager::detail::ParseJson(text.data(), text.size(), doc, &error) || !doc.IsObject()) {
    problems.push_back(error.empty() ? "not a JSON object" : error);
    return facts;
  }
  const auto flag = [&](const char* name, bool& out) {
    auto it = doc.FindMember(name);
    if (it == doc.MemberEnd()) return;
    if (it->value.IsBool()) {
      out = it->value.GetBool();
    } else {
      problems.push_back(std::string("\"") + name + "\" is not a boolean");
    }
  };
  flag("stmSupported", facts.stmSupported);
  flag("quickBootSupported", facts.quickBootSupported);
  auto features = doc.FindMember("features");
  if (features == doc.MemberEnd()) return facts;
  if (!features->value.IsObject()) {
    problems.push_back("\"features\" is not an object");
    return facts;
  }
  for (const auto& feature : features->value.GetObject()) {
    if (feature.value.IsBool()) {
      facts.features[feature.name.GetString()] = feature.value.GetBool();
    } else {
      problems.push_back(std::string("feature \"") + feature.name.GetString() + "\" is not a boolean");
    }
  }
  return facts;
}

HostFacts CurrentHostFacts() { return LoadFacts(LoadMode::kLazy); }

}  // namespace HoxPlatform::detail

namespace HostCtl {
namespace Host {

HardwareInfo GetHardwareInfo() {
  using HoxPlatform::detail::ReadFact;
  HardwareInfo info;
  info.biosUuid = ReadFact(HoxPlatform::HostPaths::kProductUuid);
  if (info.biosUuid.empty()) info.biosUuid = ReadFact(HoxPlatform::HostPaths::kMachineId);
  if (info.biosUuid.empty()) {
    throw Lib::HostCtlException("No hardware identity: neither " +
                                HoxPlatform::HostPath(HoxPlatform::HostPaths::kProductUuid) + " nor " +
                                HoxPlatform::HostPath(HoxPlatform::HostPaths::kMachineId) + " is readable");
  }
  info.vendor = ReadFact(HoxPlatform::HostPaths::kSystemVendor);
  info.product = ReadFact(HoxPlatform::HostPaths::kProductName);
  return info;
}

}  // namespace Host

namespace System::LoadHox {
bool IsSTMSupported() { return HoxPlatform::detail::CurrentHostFacts().stmSupported; }
bool IsSupported() { return HoxPlatform::detail::CurrentHostFacts().quickBootSupported; }
}  // namespace System::LoadHox
}  // namespace HostCtl

namespace QmkCtl::System {
QmkVersion SystemInfoImpl::GetQmkVersion() {
  struct utsname uts {};
  if (::uname(&uts) != 0) {
    throw HostCtl::Lib::HostCtlException(std::string("uname failed: ") + std::strerror(errno));
  }
  return HoxPlatform::detail::ParseKernelRelease(uts.release, uts.version);
}
}  // namespace QmkCtl::System

int VSI_CheckSig() {
  try {
    HoxConfigStore::GetDBStore(0, true);
    return 0;
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "Maintenance-mode interface unavailable: %s", e.what());
    return 1;
  }
}

int VSI_Get(const char* node, bool* value) {
  if (node == nullptr || value == nullptr) return EINVAL;
  if (std::strcmp(node, "maintenanceMode") != 0) return ENOENT;
  try {
    *value = HoxConfigStore::GetMaintenanceMode();
    return 0;
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "Cannot read the maintenance mode: %s", e.what());
    return EIO;
  }
}

void FeatureState_InitSilentMode() { HoxPlatform::detail::LoadFacts(HoxPlatform::detail::LoadMode::kSilent); }
void FeatureState_InitDeltaMode() { HoxPlatform::detail::LoadFacts(HoxPlatform::detail::LoadMode::kDelta); }

bool FeatureState_IsEnabled(const char* feature) {
  if (feature == nullptr) return false;
  const auto facts = HoxPlatform::detail::CurrentHostFacts();
  auto it = facts.features.find(feature);
  return it != facts.features.end() && it->second;
}
