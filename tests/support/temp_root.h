// A temporary host root for tests: a fresh directory exported as HOX_ROOT for
// the test's lifetime, with helpers to install the product's data into it.
// Not thread-safe (it changes the process environment).
#pragma once

#include <string>

namespace hoxcm_test {

class TempRoot {
 public:
  TempRoot();
  ~TempRoot();
  TempRoot(const TempRoot&) = delete;
  TempRoot& operator=(const TempRoot&) = delete;

  const std::string& path() const { return path_; }
  // `hostPath` ("/etc/x") resolved under the root.
  std::string Path(const std::string& hostPath) const;
  // Writes a file below the root, creating directories.
  void WriteFile(const std::string& hostPath, const std::string& content) const;
  std::string ReadFile(const std::string& hostPath) const;
  // Copies a directory of the source tree (relative to the repository) to
  // `hostPath` under the root.
  void CopyTree(const std::string& sourceRelative, const std::string& hostPath) const;
  // The sample host's schemas into the schema directory.
  void InstallSampleSchemas() const;
  // The three manifest schemas into the manifest schema directory.
  void InstallPluginSchemas() const;
  // The built runner programs into the runner directory.
  void InstallRunners() const;
  // The sample plugins (manifests, Python modules and the built C++
  // plugin) into the manifest directory.
  void InstallSamplePlugins() const;

 private:
  std::string path_;
  std::string previous_;
  bool hadPrevious_ = false;
};

// Absolute path of a file of the source tree / build tree.
std::string SourcePath(const std::string& relative);
std::string BuildPath(const std::string& relative);

}  // namespace hoxcm_test
