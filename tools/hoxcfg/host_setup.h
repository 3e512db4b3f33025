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
  std::string dataDir;       // sample-host/, sample-plugins/ (their manifests and scripts)
  std::string manifestSchemaDir;  // the manifest schemas
  std::string cppRunner;     // the C++ plugin runner program
  std::string pyRunner;      // the Python plugin runner script
  std::string pluginLibDir;  // C++ sample plugins, laid out as below apply_modules
  bool fromBuildTree = false;
};

// The build tree when this program runs from it, else the installation.
ProductFiles LocateProductFiles();

// What init loads besides the product's files.
struct InitRequest {
  bool sample = false;  // the sample host: configuration, host facts, SSH files
  std::string schemas;  // a schema tree installed instead of the sample host's
  std::string from;     // a host document loaded as the user configuration
};

// One line per step, naming what was skipped; the schema files refused
// when every file was checked ("path: reason").
struct InitReport {
  std::vector<std::string> steps;
  std::vector<std::string> refusedSchemas;
};

// Creates the host root under HOX_ROOT: directories, the store, the schemas
// (the request's tree or the sample host's), the manifest schemas, the
// runners and the sample plugins found in `files`, then checks every schema
// file. With `sample`, also the sample host's facts, DMI uuid, SSH files and
// its user and default configuration. With `from`, the host document's items
// become the user configuration, all or none: a key without a usable schema
// refuses the document before anything is loaded. Throws Failure or the
// library's exceptions on failure.
InitReport InitHostRoot(const ProductFiles& files, const InitRequest& request);

}  // namespace hoxcfg
