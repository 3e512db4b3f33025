#include "hoxcfg/host_setup.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <iostream>
#include <system_error>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/schema_store.h>

#include "hoxcfg/common.h"

namespace fs = std::filesystem;

namespace hoxcfg {
namespace {

constexpr const char* kSchemaDir = "/usr/lib/tarvik/configmanager/schemas";
constexpr const char* kManifestDir = "/usr/lib/tarvik/configmanager/apply_modules";
constexpr const char* kManifestSchemaDir = "/usr/lib/tarvik/configmanager/plugin_schemas";
constexpr const char* kRunnerDir = "/usr/lib/tarvik/configmanager/bin";

std::string Under(const std::string& hostPath) { return HoxPlatform::HostPath(hostPath); }

bool IsDir(const std::string& path) {
  std::error_code ec;
  return !path.empty() && fs::is_directory(path, ec);
}

bool IsFile(const std::string& path) {
  std::error_code ec;
  return !path.empty() && fs::is_regular_file(path, ec);
}

void MakeDirs(const std::string& path, fs::perms perms = fs::perms::none) {
  std::error_code ec;
  fs::create_directories(path, ec);
  if (ec) throw CommandError{kExitError, "cannot create " + path + ": " + ec.message()};
  if (perms != fs::perms::none) fs::permissions(path, perms, ec);
}

// Copies the regular files below `from` to `to`, keeping the relative layout
// and replacing files that exist. Returns the number of files copied.
int CopyTree(const std::string& from, const std::string& to) {
  int count = 0;
  std::error_code ec;
  for (auto it = fs::recursive_directory_iterator(from, ec); !ec && it != fs::recursive_directory_iterator();
       it.increment(ec)) {
    if (!it->is_regular_file(ec)) continue;
    const fs::path target = fs::path(to) / fs::relative(it->path(), from);
    MakeDirs(target.parent_path().string());
    fs::copy_file(it->path(), target, fs::copy_options::overwrite_existing, ec);
    if (ec) break;
    ++count;
  }
  if (ec) throw CommandError{kExitError, "cannot copy " + from + " to " + to + ": " + ec.message()};
  return count;
}

void CopyFile(const std::string& from, const std::string& to, fs::perms perms) {
  MakeDirs(fs::path(to).parent_path().string());
  std::error_code ec;
  fs::copy_file(from, to, fs::copy_options::overwrite_existing, ec);
  if (!ec) fs::permissions(to, perms, ec);
  if (ec) throw CommandError{kExitError, "cannot copy " + from + " to " + to + ": " + ec.message()};
}

constexpr fs::perms kExecutable = fs::perms::owner_all | fs::perms::group_read | fs::perms::group_exec |
                                  fs::perms::others_read | fs::perms::others_exec;
constexpr fs::perms kReadable = fs::perms::owner_read | fs::perms::owner_write | fs::perms::group_read |
                                fs::perms::others_read;
constexpr fs::perms kPrivate = fs::perms::owner_read | fs::perms::owner_write;

std::string InstallRunner(const std::string& from, const char* name) {
  const std::string target = Under(std::string(kRunnerDir) + "/" + name);
  if (!IsFile(from)) return std::string("skipped ") + name + ": not built (looked for " + from + ")";
  CopyFile(from, target, kExecutable);
  return std::string("installed ") + name;
}

std::string InstallSamplePlugins(const ProductFiles& files) {
  const std::string manifests = files.dataDir + "/sample-plugins";
  if (!IsDir(manifests)) return "skipped sample plugins: none shipped (looked in " + manifests + ")";
  const int count = CopyTree(manifests, Under(kManifestDir));
  // Built C++ plugins sit in the build tree at the path they take below the
  // manifest directory, beside their manifests; an installation ships them
  // inside the manifest tree already.
  int libraries = 0;
  if (IsDir(files.pluginLibDir)) libraries = CopyTree(files.pluginLibDir, Under(kManifestDir));
  std::string line = "installed sample plugins: " + std::to_string(count) + " files";
  if (files.fromBuildTree) {
    line += libraries > 0 ? ", " + std::to_string(libraries) + " built plugin libraries"
                          : "; skipped C++ plugin libraries: not built (looked in " + files.pluginLibDir + ")";
  }
  return line;
}

void ImportDocument(HoxConfigStore::ConfigKind kind, const std::string& path) {
  rapidjson::Document doc;
  HoxConfigManager::CreateDocumentFromFile(path.c_str(), doc);
  HoxConfigStore::ImportConfiguration(kind, doc);
}

std::vector<std::string> InstallSampleHost(const std::string& sampleDir) {
  std::vector<std::string> report;
  CopyFile(sampleDir + "/host-facts.json", Under("/etc/tarvik/host-facts.json"), kReadable);
  CopyFile(sampleDir + "/product_uuid", Under("/sys/class/dmi/id/product_uuid"), kReadable);
  report.push_back("installed host facts and DMI uuid");
  CopyFile(sampleDir + "/etc/ssh/sshd_config", Under("/etc/ssh/sshd_config"), kReadable);
  CopyFile(sampleDir + "/etc/ssh/ssh_config", Under("/etc/ssh/ssh_config"), kReadable);
  MakeDirs(Under("/root/.ssh"), fs::perms::owner_all);
  CopyFile(sampleDir + "/root/.ssh/authorized_keys", Under("/root/.ssh/authorized_keys"), kPrivate);
  report.push_back("installed SSH files");
  ImportDocument(HoxConfigStore::ConfigKind::Default, sampleDir + "/default-config.json");
  ImportDocument(HoxConfigStore::ConfigKind::User, sampleDir + "/user-config.json");
  report.push_back("loaded the sample host's default and user configuration");
  return report;
}

}  // namespace

ProductFiles LocateProductFiles() {
  ProductFiles files;
  std::error_code ec;
  const std::string exe = fs::read_symlink("/proc/self/exe", ec).string();
  const std::string buildDir = HOXCM_BUILD_DIR;
  files.fromBuildTree = !ec && exe.rfind(buildDir + "/", 0) == 0;
  if (files.fromBuildTree) {
    files.dataDir = HOXCM_SOURCE_DATA_DIR;
    const std::string sourceDir = fs::path(files.dataDir).parent_path().string();
    files.cppRunner = buildDir + "/runners/cpp_plugin_runner";
    files.pyRunner = sourceDir + "/runners/py_plugin_runner";
    files.pluginLibDir = buildDir + "/sample-plugins";
  } else {
    // An installation may have been moved (cmake --install --prefix): look
    // beside the program first, then where it was configured to go.
    const fs::path prefix = fs::path(exe).parent_path().parent_path();
    const bool relocated = !ec && IsDir((prefix / "share/hoxcm").string());
    files.dataDir = relocated ? (prefix / "share/hoxcm").string() : HOXCM_INSTALLED_DATA_DIR;
    const std::string libexec = relocated ? (prefix / "libexec/hoxcm").string() : HOXCM_INSTALLED_LIBEXEC_DIR;
    files.cppRunner = libexec + "/cpp_plugin_runner";
    files.pyRunner = libexec + "/py_plugin_runner";
  }
  return files;
}

std::vector<std::string> InitHostRoot(const ProductFiles& files, bool sample) {
  const std::string sampleDir = files.dataDir + "/sample-host";
  if (sample && !IsDir(sampleDir)) {
    throw CommandError{kExitError, "the sample host is not shipped (looked in " + sampleDir + ")"};
  }
  std::vector<std::string> report;
  report.push_back("host root " + HoxPlatform::HostRoot() + " (product files from " +
                   (files.fromBuildTree ? "the build tree" : "the installation") + ")");
  for (const char* dir : {kSchemaDir, kManifestDir, kManifestSchemaDir, kRunnerDir, "/var/tarvik/lifecycle",
                          "/var/lib/tarvik/configstore", "/etc/tarvik"}) {
    MakeDirs(Under(dir));
  }

  const std::string schemas = files.dataDir + "/sample-host/schemas";
  if (IsDir(schemas)) {
    report.push_back("installed schemas: " + std::to_string(CopyTree(schemas, Under(kSchemaDir))) + " files");
  } else {
    report.push_back("skipped schemas: none shipped (looked in " + schemas + ")");
  }
  const std::string manifestSchemas = files.dataDir + "/plugin_schemas";
  if (IsDir(manifestSchemas)) {
    report.push_back("installed manifest schemas: " +
                     std::to_string(CopyTree(manifestSchemas, Under(kManifestSchemaDir))) + " files");
  } else {
    report.push_back("skipped manifest schemas: none shipped (looked in " + manifestSchemas + ")");
  }
  report.push_back(InstallRunner(files.cppRunner, "cpp_plugin_runner"));
  report.push_back(InstallRunner(files.pyRunner, "py_plugin_runner"));
  report.push_back(InstallSamplePlugins(files));

  const auto db = HoxConfigStore::GetDBStore(0, true);
  if (!db) throw CommandError{kExitError, "cannot create the configuration store"};
  report.push_back("configuration store " + db->GetPath());

  if (sample) {
    for (std::string& line : InstallSampleHost(sampleDir)) report.push_back(std::move(line));
  }
  return report;
}

void WritePrivateOutput(const std::string& text, const std::string& path) {
  if (path.empty() || path == "-") {
    std::cout << text << std::flush;
    return;
  }
  const std::string tmp = path + ".tmp";
  // The temporary file is always a new one: a leftover file or a link planted
  // there (in a directory others may write) is removed, not written through.
  constexpr int kFlags = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
  int fd = ::open(tmp.c_str(), kFlags, 0600);
  if (fd < 0 && errno == EEXIST && ::unlink(tmp.c_str()) == 0) fd = ::open(tmp.c_str(), kFlags, 0600);
  if (fd < 0) throw CommandError{kExitError, "cannot write " + path + ": " + std::strerror(errno)};
  bool ok = ::fchmod(fd, 0600) == 0;
  for (std::size_t done = 0; ok && done < text.size();) {
    const ssize_t n = ::write(fd, text.data() + done, text.size() - done);
    if (n < 0 && errno == EINTR) continue;
    ok = n > 0;
    if (ok) done += static_cast<std::size_t>(n);
  }
  ok = ::fsync(fd) == 0 && ok;
  const int err = errno;
  ok = ::close(fd) == 0 && ok;
  if (!ok || std::rename(tmp.c_str(), path.c_str()) != 0) {
    std::remove(tmp.c_str());
    throw CommandError{kExitError, "cannot write " + path + ": " + std::strerror(ok ? errno : err)};
  }
}

}  // namespace hoxcfg
