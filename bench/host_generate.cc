// Writes the files of an end-to-end run: the sample host's schemas
// replicated to scale, a host document and a desired document that differs
// from it (the drift benchmark's generator and rates).
//
//   host_generate DIR REPLICAS [INSTANCES]
//
// leaves DIR/schemas/<component>/<group>/<key>.json, DIR/host.json and
// DIR/desired.json.
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <string>

#include <hoxcm/documents.h>
#include <hoxcm/files.h>
#include <hoxcm/host.h>

#include "doc_generator.h"

int main(int argc, char** argv) {
  if (argc < 3) {
    std::fprintf(stderr, "usage: host_generate DIR REPLICAS [INSTANCES]\n");
    return 2;
  }
  const std::filesystem::path dir = std::filesystem::absolute(argv[1]);
  hoxcm_bench::GeneratorOptions options;
  options.replicas = std::atoi(argv[2]);
  options.instances = argc > 3 ? std::atoi(argv[3]) : 100;
  if (options.replicas <= 0 || options.instances <= 0) {
    std::fprintf(stderr, "host_generate: REPLICAS and INSTANCES must be positive\n");
    return 2;
  }
  // The generator installs schemas under the root's schema directory: give
  // it a scratch root and move the tree into DIR/schemas.
  const std::filesystem::path scratch = dir / "generator-root";
  std::filesystem::remove_all(scratch);
  std::filesystem::remove_all(dir / "schemas");
  std::filesystem::create_directories(scratch);
  ::setenv("HOX_ROOT", scratch.c_str(), 1);
  hoxcm_bench::InstallReplicatedSchemas(options.replicas);
  std::filesystem::rename(HoxPlatform::HostPath(HoxPlatform::HostPaths::kSchemaDirectory), dir / "schemas");
  std::filesystem::remove_all(scratch);

  HoxConfigManager::Document host, desired;
  hoxcm_bench::GeneratePair(options, host, desired);
  for (const auto& [name, doc] : {std::make_pair("host.json", &host), std::make_pair("desired.json", &desired)}) {
    std::string text;
    HoxConfigManager::SerializeValue(*doc, text);
    HoxPlatform::WriteFileAtomically((dir / name).string(), text, 0644, HoxPlatform::Durability::kAtomic);
    std::printf("%s: %.1f MB\n", name, text.size() / 1e6);
  }
  return 0;
}
