#include "hoxcfg/host_setup.h"

#include <filesystem>
#include <string_view>
#include <system_error>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/files.h>
#include <hoxcm/host.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

#include "hoxcfg/cli.h"

namespace fs = std::filesystem;

namespace hoxcfg {
namespace {

using HoxPlatform::FileKind;
namespace HostPaths = HoxPlatform::HostPaths;

std::string Under(std::string_view hostPath) { return HoxPlatform::HostPath(hostPath); }

bool IsDir(const std::string& path) { return !path.empty() && HoxPlatform::IsDirectory(path); }
bool IsFile(const std::string& path) { return !path.empty() && HoxPlatform::IsRegularFile(path); }

// Runs a step of the set-up; a file error ends the command with its text.
template <typename F>
auto Checked(F&& step) {
  try {
    return step();
  } catch (const HoxPlatform::FileError& e) {
    throw Failure(e.reason(), "", kExitUsage, InFile(e.path()));
  }
}

void MakeDirs(const std::string& path, mode_t mode = 0755) {
  Checked([&] { HoxPlatform::CreateDirectories(path, mode); });
}

// Installs a copy of `from` at `to` with `mode`. The new file replaces the
// old one atomically: a reader (a plugin run, a schema load) sees the old
// file or the whole new one, never a partial copy.
void CopyFile(const std::string& from, const std::string& to, mode_t mode, FileKind kind) {
  MakeDirs(fs::path(to).parent_path().string());
  Checked([&] {
    HoxPlatform::WriteFileAtomically(to, HoxPlatform::ReadFile(from, kind), mode,
                                     HoxPlatform::Durability::kDurable);
  });
}

// Copies the regular files below `from` to `to`, keeping the relative layout
// and replacing files that exist. Returns the number of files copied.
int CopyTree(const std::string& from, const std::string& to, mode_t mode, FileKind kind) {
  const HoxPlatform::DirectoryListing listing = HoxPlatform::ListFiles(from);
  if (!listing.problems.empty()) {
    const auto& problem = listing.problems.front();
    throw Failure("cannot copy " + problem.path + ": " + problem.reason);
  }
  for (const std::string& file : listing.files) {
    CopyFile(file, (fs::path(to) / fs::path(file).lexically_relative(from)).string(), mode, kind);
  }
  return static_cast<int>(listing.files.size());
}

constexpr mode_t kExecutable = 0755;
constexpr mode_t kReadable = 0644;
constexpr mode_t kPrivate = 0600;

std::string InstallRunner(const std::string& from, const char* name) {
  const std::string target = Under(std::string(HostPaths::kRunnerDirectory) + "/" + name);
  if (!IsFile(from)) return std::string("skipped ") + name + ": not built (looked for " + from + ")";
  CopyFile(from, target, kExecutable, FileKind::Program);
  return std::string("installed ") + name;
}

std::string InstallSamplePlugins(const ProductFiles& files) {
  const std::string manifests = files.dataDir + "/sample-plugins";
  if (!IsDir(manifests)) return "skipped sample plugins: none shipped (looked in " + manifests + ")";
  // Manifests, script modules and plugin libraries: readable by everyone,
  // as an installation leaves them.
  const int count = CopyTree(manifests, Under(HostPaths::kManifestDirectory), kReadable, FileKind::Program);
  // Built C++ plugins sit in the build tree at the path they take below the
  // manifest directory, beside their manifests; an installation ships them
  // inside the manifest tree already.
  int libraries = 0;
  if (IsDir(files.pluginLibDir)) {
    libraries = CopyTree(files.pluginLibDir, Under(HostPaths::kManifestDirectory), kExecutable, FileKind::Program);
  }
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
  CopyFile(sampleDir + "/host-facts.json", Under(HostPaths::kHostFacts), kReadable, FileKind::HostFile);
  CopyFile(sampleDir + "/product_uuid", Under(HostPaths::kProductUuid), kReadable, FileKind::HostFile);
  report.push_back("installed host facts and DMI uuid");
  CopyFile(sampleDir + "/etc/ssh/sshd_config", Under(HostPaths::kSshServerConfig), kReadable, FileKind::HostFile);
  CopyFile(sampleDir + "/etc/ssh/ssh_config", Under(HostPaths::kSshClientConfig), kReadable, FileKind::HostFile);
  MakeDirs(fs::path(Under(HostPaths::kSshAuthorizedKeys)).parent_path().string(), 0700);
  CopyFile(sampleDir + "/root/.ssh/authorized_keys", Under(HostPaths::kSshAuthorizedKeys), kPrivate,
           FileKind::HostFile);
  report.push_back("installed SSH files");
  // What an installer leaves for the first boot; a bootstrap that needs a
  // reboot keeps them in the store until the next boot.
  for (std::string_view path : {HostPaths::kAutodeployWaiterNotify, HostPaths::kAutodeployFirewall}) {
    CopyFile(sampleDir + std::string(path), Under(path), kPrivate, FileKind::HostFile);
  }
  report.push_back("installed the auto-deployment files");
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
    throw Failure("the sample host is not shipped (looked in " + sampleDir + ")");
  }
  std::vector<std::string> report;
  report.push_back("host root " + HoxPlatform::HostRoot() + " (product files from " +
                   (files.fromBuildTree ? "the build tree" : "the installation") + ")");
  for (std::string_view dir : {HostPaths::kSchemaDirectory, HostPaths::kManifestDirectory,
                               HostPaths::kManifestSchemaDirectory, HostPaths::kRunnerDirectory,
                               HostPaths::kLifecycleDirectory, HostPaths::kStoreDirectory}) {
    MakeDirs(Under(dir));
  }
  MakeDirs(fs::path(Under(HostPaths::kHostFacts)).parent_path().string());

  const std::string schemas = files.dataDir + "/sample-host/schemas";
  if (IsDir(schemas)) {
    report.push_back("installed schemas: " +
                     std::to_string(CopyTree(schemas, Under(HostPaths::kSchemaDirectory), kReadable, FileKind::Schema)) +
                     " files");
  } else {
    report.push_back("skipped schemas: none shipped (looked in " + schemas + ")");
  }
  const std::string manifestSchemas = files.dataDir + "/plugin_schemas";
  if (IsDir(manifestSchemas)) {
    report.push_back("installed manifest schemas: " +
                     std::to_string(CopyTree(manifestSchemas, Under(HostPaths::kManifestSchemaDirectory), kReadable,
                                             FileKind::ManifestSchema)) +
                     " files");
  } else {
    report.push_back("skipped manifest schemas: none shipped (looked in " + manifestSchemas + ")");
  }
  report.push_back(InstallRunner(files.cppRunner, "cpp_plugin_runner"));
  report.push_back(InstallRunner(files.pyRunner, "py_plugin_runner"));
  report.push_back(InstallSamplePlugins(files));

  const auto db = HoxConfigStore::GetDBStore(0, true);
  if (!db) throw Failure("cannot create the configuration store");
  report.push_back("configuration store " + db->GetPath());

  if (sample) {
    for (std::string& line : InstallSampleHost(sampleDir)) report.push_back(std::move(line));
  }
  return report;
}

}  // namespace hoxcfg
