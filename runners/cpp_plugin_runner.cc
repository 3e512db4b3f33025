// cpp_plugin_runner: runs one request against a shared-object plugin.
//
//   cpp_plugin_runner [++group=...]             run the request file
//   cpp_plugin_runner --commit-request <file>   store an applied request
//
// Started with an empty environment: the root comes from the path the
// runner was started under. Failures exit with the codes of
// runner_support.h; failures the plugin reports travel in the result file.
#include <dlfcn.h>
#include <stdlib.h>

#include <cstdio>
#include <cstring>
#include <memory>
#include <string>

#include <hoxcm/documents.h>
#include <hoxcm/files.h>
#include <hoxcm/host.h>
#include <hoxcm/plugin_sdk.h>
#include <hoxcm/plugins.h>

#include "runner_support.h"

namespace {

using namespace hoxcm_runner;

struct RunnerFailure {
  int exitCode;
  std::string message;
};

// Owns a dlopen handle.
class SharedObject {
 public:
  explicit SharedObject(const std::string& path) : handle_(::dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL)) {
    if (handle_ == nullptr) throw RunnerFailure{kExitModuleLoad, std::string("cannot load plugin: ") + ::dlerror()};
  }
  ~SharedObject() { ::dlclose(handle_); }
  SharedObject(const SharedObject&) = delete;
  SharedObject& operator=(const SharedObject&) = delete;
  void* Symbol(const char* name) const { return ::dlsym(handle_, name); }

 private:
  void* handle_;
};

// The plugin's directory below the manifest root: one directory per ":"
// separated part of its id.
std::string PluginDirectoryOf(const std::string& id) {
  std::string relative = id;
  for (char& c : relative) {
    if (c == ':') c = '/';
  }
  if (relative.empty() || relative.find("..") != std::string::npos) {
    throw RunnerFailure{kExitBadRequest, "bad plugin id in the request"};
  }
  return HoxConfigManager::PluginDirectory() + relative + "/";
}

// Checks that `text` is a result of the expected shape by reading it back
// the way the library will.
void CheckResult(const std::string& operation, const std::string& path) {
  try {
    if (operation == "APPLY") {
      HoxConfigManager::ErrorInfo::Load(path);
    } else if (operation == "IMPACT") {
      HoxConfigManager::ImpactPluginResult::Load(path);
    } else {
      HoxConfigManager::ValidationPluginResult::Load(path);
    }
  } catch (const std::exception& e) {
    throw RunnerFailure{kExitBadResult, std::string("plugin returned a malformed result: ") + e.what()};
  }
}

int RunRequest(const std::string& root) {
  HoxConfigManager::PluginRequest request;
  std::string operation, id, module;
  try {
    request.Load(HoxConfigManager::PluginRequestPath());
    operation = request.GetType();
    id = request.GetId();
    module = request.GetModule();
  } catch (const std::exception& e) {
    throw RunnerFailure{kExitBadRequest, std::string("cannot read the request: ") + e.what()};
  }
  if (module.empty() || module.find('/') != std::string::npos) {
    throw RunnerFailure{kExitBadRequest, "the request names no usable module"};
  }
  SharedObject plugin(PluginDirectoryOf(id) + module);
  auto describe = reinterpret_cast<hoxcm_plugin_describe_fn>(plugin.Symbol(HOXCM_PLUGIN_DESCRIBE_SYMBOL));
  if (describe == nullptr) throw RunnerFailure{kExitNoEntry, "plugin has no " HOXCM_PLUGIN_DESCRIBE_SYMBOL};
  const hoxcm_plugin_table* table = describe();
  if (table == nullptr || table->abi_version != HOXCM_PLUGIN_ABI_VERSION || table->free_result == nullptr) {
    throw RunnerFailure{kExitAbiMismatch, "plugin interface version does not match"};
  }
  hoxcm_plugin_entry entry = operation == "APPLY"    ? table->apply
                             : operation == "IMPACT" ? table->impact
                             : operation == "VALIDATE" ? table->validate
                                                       : nullptr;
  if (entry == nullptr) throw RunnerFailure{kExitUnsupported, "plugin does not support " + operation};

  const std::string requestText = HoxConfigManager::JsonToString(request.GetDocument());
  char* raw = nullptr;
  try {
    raw = entry(requestText.c_str(), root.c_str());
  } catch (...) {
    throw RunnerFailure{kExitPluginCrashed, "exception escaped from the plugin"};
  }
  if (raw == nullptr) throw RunnerFailure{kExitBadResult, "plugin returned no result"};
  std::unique_ptr<char, void (*)(char*)> result(raw, table->free_result);

  const std::string resultPath = HoxConfigManager::PluginResultPath();
  // The result lives for one run: atomic, but not worth a flush to disk.
  HoxPlatform::WriteFileAtomically(resultPath, result.get(), 0600, HoxPlatform::Durability::kAtomic);
  CheckResult(operation, resultPath);

  if (operation == "APPLY" && HoxConfigManager::ErrorInfo::Load(resultPath).id.empty()) {
    try {
      CommitAppliedRequest(request);
    } catch (const std::exception& e) {
      throw RunnerFailure{kExitStoreCommit, std::string("cannot store the applied configuration: ") + e.what()};
    }
  }
  return 0;
}

int CommitRequestFile(const std::string& path) {
  HoxConfigManager::PluginRequest request;
  try {
    request.Load(path);
  } catch (const std::exception& e) {
    throw RunnerFailure{kExitBadRequest, std::string("cannot read the request: ") + e.what()};
  }
  try {
    CommitAppliedRequest(request);
  } catch (const std::exception& e) {
    throw RunnerFailure{kExitStoreCommit, std::string("cannot store the applied configuration: ") + e.what()};
  }
  return 0;
}

constexpr const char* kUsage =
    "Usage: cpp_plugin_runner                         run the plugin request\n"
    "       cpp_plugin_runner --commit-request FILE   store the objects of an applied request\n"
    "\n"
    "Runs the request ROOT/var/tarvik/lifecycle/cm-plugin-input.json against its shared-object\n"
    "plugin (ROOT/usr/lib/tarvik/configmanager/apply_modules/<plugin id>/<module>) and writes the\n"
    "result to ROOT/var/tarvik/lifecycle/cm-plugin-output.json. ROOT is where the runner is\n"
    "installed: the directory above usr/lib/tarvik/configmanager/bin/. The request's \"type\" is\n"
    "APPLY, IMPACT or VALIDATE; an applied request is stored in the configuration store.\n"
    "Exit 0 when the plugin ran (its own failure is in the result), else an errno value:\n"
    "EINVAL bad request, ELIBACC module not loadable, ENOSYS no entry point, EPROTO interface\n"
    "version, EOPNOTSUPP operation not supported, EBADMSG bad result, ENOTRECOVERABLE the plugin\n"
    "threw, EIO the store update failed. See docs/plugin-protocol.md.\n";

}  // namespace

int main(int argc, char** argv) {
  if (argc == 2 && (std::strcmp(argv[1], "--help") == 0 || std::strcmp(argv[1], "-h") == 0)) {
    std::fputs(kUsage, stdout);
    return 0;
  }
  const std::string root = RootFromProgramPath(argc > 0 ? argv[0] : "");
  ::setenv("HOX_ROOT", root.c_str(), 1);
  try {
    if (argc == 3 && std::strcmp(argv[1], "--commit-request") == 0) return CommitRequestFile(argv[2]);
    return RunRequest(root);
  } catch (const RunnerFailure& failure) {
    std::fprintf(stderr, "cpp_plugin_runner: %s\n", failure.message.c_str());
    return failure.exitCode;
  } catch (const std::exception& e) {
    std::fprintf(stderr, "cpp_plugin_runner: %s\n", e.what());
    return kExitBadResult;
  }
}
