// A temporary host root for the benchmarks that run plugins: HOX_ROOT set to
// it and the library's log silenced, the manifest schemas installed and the
// do-nothing runner linked as the script runner; removed at exit.
#pragma once

#include <stdlib.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>

namespace hoxcm_bench {

class BenchRoot {
 public:
  explicit BenchRoot(const std::string& name) {
    std::string tmpl = (std::filesystem::temp_directory_path() / ("hoxcm-" + name + "-XXXXXX")).string();
    if (::mkdtemp(tmpl.data()) == nullptr) std::abort();
    path_ = tmpl;
    ::setenv("HOX_ROOT", path_.c_str(), 1);
    ::setenv("HOX_LOG_LEVEL", "-1", 1);
    Copy(std::string(HOXCM_SOURCE_DIR) + "/data/plugin_schemas", "/usr/lib/tarvik/configmanager/plugin_schemas");
    std::filesystem::create_directories(path_ + "/usr/lib/tarvik/configmanager/bin");
    std::filesystem::create_directories(path_ + "/var/tarvik/lifecycle");
    runner_ = path_ + "/usr/lib/tarvik/configmanager/bin/py_plugin_runner";
    std::filesystem::create_symlink(HOXCM_NOOP_RUNNER, runner_);
  }
  ~BenchRoot() {
    std::error_code ec;
    std::filesystem::remove_all(path_, ec);
  }
  BenchRoot(const BenchRoot&) = delete;
  BenchRoot& operator=(const BenchRoot&) = delete;

  void Copy(const std::string& from, const std::string& hostPath) const {
    std::filesystem::create_directories(path_ + hostPath);
    std::filesystem::copy(from, path_ + hostPath,
                          std::filesystem::copy_options::recursive | std::filesystem::copy_options::overwrite_existing);
  }
  void Write(const std::string& hostPath, const std::string& text) const {
    std::filesystem::create_directories(std::filesystem::path(path_ + hostPath).parent_path());
    std::ofstream(path_ + hostPath) << text;
  }
  const std::string& runner() const { return runner_; }
  const std::string& path() const { return path_; }

 private:
  std::string path_;
  std::string runner_;
};

}  // namespace hoxcm_bench
