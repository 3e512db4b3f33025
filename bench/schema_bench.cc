// The schema store and the validator on the sample host: loading the 16
// schema files, validating one instance against its key schema (what
// auto-configuration does per stored item), and validating the whole sample
// configuration against its host document schema.
//
//   build/release/bench/schema_bench
#include <cstdlib>
#include <filesystem>
#include <string>

#include <benchmark/benchmark.h>

#include <hoxcm/documents.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

#include "platform/schema/schema_store_impl.h"

namespace {

using HoxConfigManager::Document;

const std::string kSchemas = std::string(HOXCM_SOURCE_DIR) + "/data/sample-host/schemas";

Document SampleConfiguration() {
  Document doc;
  HoxConfigManager::CreateDocumentFromFile(
      (std::string(HOXCM_SOURCE_DIR) + "/data/sample-host/user-config.json").c_str(), doc);
  return doc;
}

void BM_LoadSampleSchemas(benchmark::State& state) {
  for (auto _ : state) {
    auto store = HoxSchemaStore::detail::LoadStore(kSchemas);
    benchmark::DoNotOptimize(store);
  }
}
BENCHMARK(BM_LoadSampleSchemas)->Unit(benchmark::kMillisecond);

void BM_ValidateInstance(benchmark::State& state) {
  auto store = HoxSchemaStore::detail::LoadStore(kSchemas);
  auto users = store->Find("security", "accounts", "users");
  Document doc = SampleConfiguration();
  const auto& instance = doc["security"]["accounts"]["users"][0];
  for (auto _ : state) {
    Document result;
    benchmark::DoNotOptimize(JsonValidator::Validate(users->GetInstanceSchema(), instance, result, {}, ""));
  }
}
BENCHMARK(BM_ValidateInstance)->Unit(benchmark::kMicrosecond)->UseRealTime();

void BM_ValidateHostDocument(benchmark::State& state) {
  const std::string root = std::filesystem::temp_directory_path() / "hoxcm-schema-bench";
  std::filesystem::create_directories(root + "/usr/lib/tarvik/configmanager");
  std::filesystem::copy(kSchemas, root + "/usr/lib/tarvik/configmanager/schemas",
                        std::filesystem::copy_options::recursive | std::filesystem::copy_options::overwrite_existing);
  ::setenv("HOX_ROOT", root.c_str(), 1);
  Document doc = SampleConfiguration();
  Document schema;
  HoxConfigManager::GenerateHostDocumentSchema(doc, schema);
  for (auto _ : state) {
    Document result;
    benchmark::DoNotOptimize(JsonValidator::ValidateCMDocument(schema, doc, result, {}, ""));
  }
  std::filesystem::remove_all(root);
}
BENCHMARK(BM_ValidateHostDocument)->Unit(benchmark::kMicrosecond)->UseRealTime();

}  // namespace

BENCHMARK_MAIN();
