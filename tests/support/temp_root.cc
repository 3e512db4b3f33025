#include "support/temp_root.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>

#include <hoxcm/host.h>

namespace fs = std::filesystem;
namespace HostPaths = HoxPlatform::HostPaths;

namespace hoxcm_test {

std::string SourcePath(const std::string& relative) { return std::string(HOXCM_SOURCE_DIR) + "/" + relative; }
std::string BuildPath(const std::string& relative) { return std::string(HOXCM_BINARY_DIR) + "/" + relative; }

TempRoot::TempRoot() {
  std::string tmpl = (fs::temp_directory_path() / "hoxcm-test-XXXXXX").string();
  if (::mkdtemp(tmpl.data()) == nullptr) throw std::runtime_error("mkdtemp failed");
  path_ = tmpl;
  if (const char* prev = std::getenv("HOX_ROOT")) {
    hadPrevious_ = true;
    previous_ = prev;
  }
  ::setenv("HOX_ROOT", path_.c_str(), 1);
}

TempRoot::~TempRoot() {
  if (hadPrevious_) {
    ::setenv("HOX_ROOT", previous_.c_str(), 1);
  } else {
    ::unsetenv("HOX_ROOT");
  }
  std::error_code ec;
  fs::remove_all(path_, ec);
}

std::string TempRoot::Path(const std::string& hostPath) const {
  return hostPath.empty() || hostPath.front() != '/' ? path_ + "/" + hostPath : path_ + hostPath;
}

void TempRoot::WriteFile(const std::string& hostPath, const std::string& content) const {
  const fs::path p = Path(hostPath);
  fs::create_directories(p.parent_path());
  std::ofstream out(p, std::ios::binary | std::ios::trunc);
  out << content;
  if (!out) throw std::runtime_error("cannot write " + p.string());
}

std::string TempRoot::ReadFile(const std::string& hostPath) const {
  std::ifstream in(Path(hostPath), std::ios::binary);
  if (!in) throw std::runtime_error("cannot read " + Path(hostPath));
  std::stringstream ss;
  ss << in.rdbuf();
  return ss.str();
}

void TempRoot::CopyTree(const std::string& sourceRelative, const std::string& hostPath) const {
  const fs::path dest = Path(hostPath);
  fs::create_directories(dest);
  fs::copy(SourcePath(sourceRelative), dest, fs::copy_options::recursive | fs::copy_options::overwrite_existing);
}

void TempRoot::InstallSampleSchemas() const {
  CopyTree("data/sample-host/schemas", std::string(HostPaths::kSchemaDirectory));
}

void TempRoot::InstallPluginSchemas() const {
  CopyTree("data/plugin_schemas", std::string(HostPaths::kManifestSchemaDirectory));
}

void TempRoot::InstallRunners() const {
  const fs::path bin = Path(std::string(HostPaths::kRunnerDirectory));
  fs::create_directories(bin);
  // Symbolic links: a runner finds the root from the path it was started
  // under, not from its resolved location.
  fs::create_symlink(BuildPath("runners/cpp_plugin_runner"), bin / "cpp_plugin_runner");
  fs::create_symlink(SourcePath("runners/py_plugin_runner"), bin / "py_plugin_runner");
}

void TempRoot::InstallSamplePlugins() const {
  const std::string modules(HostPaths::kManifestDirectory);
  CopyTree("data/sample-plugins", modules);
  fs::copy_file(BuildPath("sample-plugins/network/libnetwork.so"), Path(modules + "/network/libnetwork.so"),
                fs::copy_options::overwrite_existing);
}

}  // namespace hoxcm_test
