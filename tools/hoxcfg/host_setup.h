// Setting up a host root for hoxcfg init: where the product's files are
// (build tree or installation) and copying them under the root. Not
// thread-safe: it changes the file system under the root.
#pragma once

#include <string>
#include <vector>

namespace hoxcfg {

// Where the files that init installs come from. An empty path means "not
// found"; init says so and goes on.
struct ProductFiles {
  std::string dataDir;       // sample-host/, plugin_schemas/, sample-plugins/
  std::string cppRunner;     // the C++ plugin runner program
  std::string pyRunner;      // the Python plugin runner script
  std::string pluginLibDir;  // build tree only: C++ sample plugins, laid out as below apply_modules
  bool fromBuildTree = false;
};

// The build tree when this program runs from it, else the installation.
ProductFiles LocateProductFiles();

// Creates the host root under HOX_ROOT: directories, the store, the schemas,
// the manifest schemas, the runners and the sample plugins found in `files`;
// with `sample`, also the sample host's facts, DMI uuid, SSH files and its
// user and default configuration. Returns one line per step, naming what it
// skipped. Throws Failure or the library's exceptions on failure.
std::vector<std::string> InitHostRoot(const ProductFiles& files, bool sample);

}  // namespace hoxcfg
