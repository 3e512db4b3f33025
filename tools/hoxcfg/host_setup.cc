#include "hoxcfg/host_setup.h"

#include <filesystem>
#include <optional>
#include <string_view>
#include <system_error>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/files.h>
#include <hoxcm/host.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

#include <rapidjson/pointer.h>

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
void CopyFile(const std::string& from, const std::string& to, mode_t mode, FileKind kind,
              HoxPlatform::Durability durability = HoxPlatform::Durability::kDurable) {
  MakeDirs(fs::path(to).parent_path().string());
  Checked([&] { HoxPlatform::WriteFileAtomically(to, HoxPlatform::ReadFile(from, kind), mode, durability); });
}

// Copies the regular files below `from` to `to`, keeping the relative layout
// and replacing files that exist. Returns the number of files copied.
int CopyTree(const std::string& from, const std::string& to, mode_t mode, FileKind kind,
             HoxPlatform::Durability durability = HoxPlatform::Durability::kDurable) {
  const HoxPlatform::DirectoryListing listing = HoxPlatform::ListFiles(from);
  if (!listing.problems.empty()) {
    const auto& problem = listing.problems.front();
    throw Failure("cannot copy " + problem.path + ": " + problem.reason);
  }
  for (const std::string& file : listing.files) {
    CopyFile(file, (fs::path(to) / fs::path(file).lexically_relative(from)).string(), mode, kind, durability);
  }
  return static_cast<int>(listing.files.size());
}

constexpr mode_t kExecutable = 0755;
constexpr mode_t kReadable = 0644;
constexpr mode_t kPrivate = 0600;
// Keys named in full when a document is refused for keys without schema.
constexpr std::size_t kMaxListed = 10;

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
  // Built C++ plugins sit in a tree of their own (the build tree, or the
  // installation's library directory) at the path they take below the
  // manifest directory, beside their manifests.
  int libraries = 0;
  if (IsDir(files.pluginLibDir)) {
    libraries = CopyTree(files.pluginLibDir, Under(HostPaths::kManifestDirectory), kExecutable, FileKind::Program);
  }
  std::string line = "installed sample plugins: " + std::to_string(count) + " files";
  line += libraries > 0 ? ", " + std::to_string(libraries) + " C++ plugin libraries"
                        : "; skipped C++ plugin libraries: none found (looked in " + files.pluginLibDir + ")";
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

// Installs the schema files: `tree` when given, else the sample host's.
// A tree may hold tens of thousands of files: each is replaced atomically,
// but not flushed to disk one by one, which would take minutes.
std::string InstallSchemas(const std::string& tree, const std::string& sampleDir) {
  const std::string from = tree.empty() ? sampleDir + "/schemas" : tree;
  if (!IsDir(from)) return "skipped schemas: none shipped (looked in " + from + ")";
  const int count = CopyTree(from, Under(HostPaths::kSchemaDirectory), kReadable, FileKind::Schema,
                             HoxPlatform::Durability::kAtomic);
  return "installed schemas: " + std::to_string(count) + " files" + (tree.empty() ? "" : " from " + tree);
}

// Reads every schema file, as the drift walk, validation and the boot path
// would one by one: a broken file is named now, not when its key is used.
std::vector<std::string> CheckSchemas(std::vector<std::string>& refused) {
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  if (!store) return {"skipped the schema check: no schema directory"};
  refused = store->GetLoadErrors();
  const std::size_t keys = store->ListKeys().size();
  std::vector<std::string> report{"checked the schema files: " + std::to_string(keys) + " keys, " +
                                  (refused.empty() ? "none" : std::to_string(refused.size())) + " refused"};
  for (const std::string& error : refused) report.push_back("refused schema file " + error);
  return report;
}

// The host this root stands for: the document's reference host when it names
// one (its host-specific sections are then this host's), else the sample
// host's identity when the root has none. Host facts default to the sample's.
std::vector<std::string> InstallHostIdentity(const rapidjson::Value& document, const std::string& sampleDir) {
  std::vector<std::string> report;
  const rapidjson::Value* uuid = rapidjson::Pointer("/metadata/reference_host/uuid").Get(document);
  const std::string identity = Under(HostPaths::kProductUuid);
  if (uuid != nullptr && uuid->IsString() && uuid->GetStringLength() > 0) {
    MakeDirs(fs::path(identity).parent_path().string());
    Checked([&] {
      HoxPlatform::WriteFileAtomically(identity, std::string(uuid->GetString()) + "\n", kReadable,
                                       HoxPlatform::Durability::kDurable);
    });
    report.push_back("host identity " + std::string(uuid->GetString()) + " (the document's reference host)");
  } else if (!IsFile(identity) && !IsFile(Under(HostPaths::kMachineId))) {
    CopyFile(sampleDir + "/product_uuid", identity, kReadable, FileKind::HostFile);
    report.push_back("installed the sample host's identity (the document names no reference host)");
  }
  if (!IsFile(Under(HostPaths::kHostFacts))) {
    CopyFile(sampleDir + "/host-facts.json", Under(HostPaths::kHostFacts), kReadable, FileKind::HostFile);
    report.push_back("installed the sample host's facts");
  }
  return report;
}

// Loads the items of `file` (as it applies to this host) as the user
// configuration, replacing it. Every key must have a schema that loads:
// otherwise nothing is loaded and the keys are named.
std::string LoadHostDocument(rapidjson::Document file, const std::string& path) {
  namespace Shape = HoxConfigManager::DocumentShape;
  rapidjson::Document doc;
  InDocument(path, [&] { HoxConfigManager::CreateMergedDocument(std::move(file), doc); });
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  if (!store) {
    HoxConfigManager::ThrowException<HoxConfigManager::ConfigManagerException>(
        HoxConfigManager::SchemaStoreAccessFailed);
  }
  std::vector<std::string> missing;
  std::size_t keys = 0;
  std::size_t items = 0;
  InDocument(path, [&] {
    Shape::ForEachItem(Shape::Unwrap(static_cast<const rapidjson::Value&>(doc)), [&](const Shape::Item<const rapidjson::Value>& item) {
      ++keys;
      if (store->Find(item.component.GetString(), item.group.GetString(), item.key.GetString())) {
        items += item.value.IsArray() ? item.value.Size() : 1;
        return;
      }
      // A key whose file was refused is named with the reason.
      std::string line = item.Path(), file, reason;
      if (store->GetLoadError({item.component.GetString(), item.group.GetString(), item.key.GetString()}, file,
                              reason)) {
        line += " (its schema file was refused: " + reason + ")";
      }
      missing.push_back(std::move(line));
    });
  });
  if (!missing.empty()) {
    std::string list;
    for (std::size_t i = 0; i < missing.size() && i < kMaxListed; ++i) list += (i == 0 ? "" : ", ") + missing[i];
    if (missing.size() > kMaxListed) list += ", and " + std::to_string(missing.size() - kMaxListed) + " more";
    throw Failure("no usable schema for " + std::to_string(missing.size()) + " of its " + std::to_string(keys) +
                      " keys: " + list,
                  "install their schemas (--schemas DIR) or leave them out; nothing was loaded", kExitUsage,
                  InFile(path));
  }
  InDocument(path, [&] { HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::User, doc); });
  return "loaded " + std::to_string(items) + " items of " + std::to_string(keys) + " keys from " + path +
         " as the user configuration";
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
    files.manifestSchemaDir = files.dataDir + "/plugin_schemas";
  } else {
    // The installed layout below the prefix is fixed at build time; the
    // prefix itself is where this program is (an installation may have been
    // moved, or unpacked below another root), else where it was configured.
    fs::path prefix = !ec ? fs::path(exe).parent_path() : fs::path();
    const fs::path binDir(HOXCM_INSTALL_BINDIR);  // "bin": one level below the prefix
    for (auto level = binDir.begin(); level != binDir.end(); ++level) prefix = prefix.parent_path();
    if (prefix.empty() || !IsDir((prefix / HOXCM_INSTALL_DATADIR).string())) prefix = HOXCM_INSTALL_PREFIX;
    files.dataDir = (prefix / HOXCM_INSTALL_DATADIR).string();
    files.manifestSchemaDir = (prefix / HOXCM_INSTALL_MANIFEST_SCHEMADIR).string();
    files.cppRunner = (prefix / HOXCM_INSTALL_RUNNERDIR / "cpp_plugin_runner").string();
    files.pyRunner = (prefix / HOXCM_INSTALL_RUNNERDIR / "py_plugin_runner").string();
    files.pluginLibDir = (prefix / HOXCM_INSTALL_SAMPLE_PLUGINDIR).string();
  }
  return files;
}

InitReport InitHostRoot(const ProductFiles& files, const InitRequest& request) {
  const std::string sampleDir = files.dataDir + "/sample-host";
  if (request.sample && (!request.from.empty() || !request.schemas.empty())) {
    throw Failure("--sample loads the sample host with its own schemas", "leave out --from and --schemas");
  }
  if (!request.schemas.empty() && !IsDir(request.schemas)) {
    throw Failure("no schema directory at " + request.schemas, "name a directory of <component>/<group>/<key>.json");
  }
  if ((request.sample || !request.from.empty()) && !IsDir(sampleDir)) {
    throw Failure("the sample host is not shipped (looked in " + sampleDir + ")");
  }
  // A document that cannot be loaded refuses the command before the root
  // is touched.
  std::optional<rapidjson::Document> document;
  if (!request.from.empty()) document = ReadConfigurationDocument(request.from);

  InitReport report;
  auto& steps = report.steps;
  steps.push_back("host root " + HoxPlatform::HostRoot() + " (product files from " +
                  (files.fromBuildTree ? "the build tree" : "the installation") + ")");
  for (std::string_view dir : {HostPaths::kSchemaDirectory, HostPaths::kManifestDirectory,
                               HostPaths::kManifestSchemaDirectory, HostPaths::kRunnerDirectory,
                               HostPaths::kLifecycleDirectory, HostPaths::kStoreDirectory}) {
    MakeDirs(Under(dir));
  }
  MakeDirs(fs::path(Under(HostPaths::kHostFacts)).parent_path().string());

  steps.push_back(InstallSchemas(request.schemas, sampleDir));
  const std::string& manifestSchemas = files.manifestSchemaDir;
  if (IsDir(manifestSchemas)) {
    steps.push_back("installed manifest schemas: " +
                    std::to_string(CopyTree(manifestSchemas, Under(HostPaths::kManifestSchemaDirectory), kReadable,
                                            FileKind::ManifestSchema)) +
                    " files");
  } else {
    steps.push_back("skipped manifest schemas: none shipped (looked in " + manifestSchemas + ")");
  }
  steps.push_back(InstallRunner(files.cppRunner, "cpp_plugin_runner"));
  steps.push_back(InstallRunner(files.pyRunner, "py_plugin_runner"));
  steps.push_back(InstallSamplePlugins(files));

  const auto db = HoxConfigStore::GetDBStore(0, true);
  if (!db) throw Failure("cannot create the configuration store");
  steps.push_back("configuration store " + db->GetPath());
  for (std::string& line : CheckSchemas(report.refusedSchemas)) steps.push_back(std::move(line));

  if (request.sample) {
    for (std::string& line : InstallSampleHost(sampleDir)) steps.push_back(std::move(line));
  }
  if (document) {
    for (std::string& line : InstallHostIdentity(*document, sampleDir)) steps.push_back(std::move(line));
    steps.push_back(LoadHostDocument(std::move(*document), request.from));
  }
  return report;
}

}  // namespace hoxcfg
