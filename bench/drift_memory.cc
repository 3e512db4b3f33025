// Peak heap of a compliance check against the heap of the two parsed
// documents it compares. Counts every malloc of the process (the library's
// and RapidJSON's included) by wrapping the C allocator.
//
//   drift_memory [scale]
#include <malloc.h>

#include <algorithm>
#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <string>

#include <hoxcm/documents.h>
#include <hoxcm/drift.h>
#include <hoxcm/schema_store.h>

#include "doc_generator.h"

extern "C" {
void* __libc_malloc(size_t);
void __libc_free(void*);
void* __libc_calloc(size_t, size_t);
void* __libc_realloc(void*, size_t);
}

namespace {
std::atomic<long long> gCurrent{0};
std::atomic<long long> gPeak{0};

void Grow(void* p) {
  if (p == nullptr) return;
  const long long now = gCurrent += static_cast<long long>(malloc_usable_size(p));
  long long peak = gPeak.load();
  while (now > peak && !gPeak.compare_exchange_weak(peak, now)) {
  }
}
void Shrink(void* p) {
  if (p != nullptr) gCurrent -= static_cast<long long>(malloc_usable_size(p));
}
}  // namespace

extern "C" {
void* malloc(size_t size) {
  void* p = __libc_malloc(size);
  Grow(p);
  return p;
}
void free(void* p) {
  Shrink(p);
  __libc_free(p);
}
void* calloc(size_t n, size_t size) {
  void* p = __libc_calloc(n, size);
  Grow(p);
  return p;
}
void* realloc(void* old, size_t size) {
  Shrink(old);
  void* p = __libc_realloc(old, size);
  Grow(p != nullptr ? p : (size == 0 ? nullptr : old));
  return p;
}
}

int main(int argc, char** argv) {
  const int scale = argc > 1 ? std::atoi(argv[1]) : 200;
  std::string root = (std::filesystem::temp_directory_path() / "hoxcm-bench-XXXXXX").string();
  if (::mkdtemp(root.data()) == nullptr) return 2;
  ::setenv("HOX_ROOT", root.c_str(), 1);
  ::setenv("HOX_LOG_LEVEL", "-1", 1);
  hoxcm_bench::InstallReplicatedSchemas(scale);
  {
    // What the schema store keeps: its index, then every key loaded.
    const long long start = gCurrent.load();
    auto store = HoxSchemaStore::SchemaStore::GetStore();
    const long long indexed = gCurrent.load();
    const std::size_t keys = store->ListKeys().size();  // loads every key; the list is gone below
    const long long loaded = gCurrent.load();
    std::printf("schema store: %zu keys, index %.0f bytes per key, %.0f bytes per loaded key\n", keys,
                static_cast<double>(indexed - start) / keys, static_cast<double>(loaded - indexed) / keys);
  }
  std::string hostText, desiredText;
  {
    hoxcm_bench::GeneratorOptions options;
    options.replicas = scale;
    options.instances = 100;
    HoxConfigManager::Document host, desired;
    hoxcm_bench::GeneratePair(options, host, desired);
    HoxConfigManager::SerializeValue(host, hostText);
    HoxConfigManager::SerializeValue(desired, desiredText);
    // Load the schema store, so that its cache is not counted below.
    HoxConfigManager::ComplianceResult warm;
    HoxConfigManager::CheckComplianceHandler handler(&warm);
    HoxConfigManager::ComputeDrift(desired, desired.GetAllocator(), handler, std::move(host));
  }

  const long long before = gCurrent.load();
  HoxConfigManager::Document host, desired;
  host.Parse(hostText.data(), hostText.size());
  desired.Parse(desiredText.data(), desiredText.size());
  const long long documents = gCurrent.load() - before;

  gPeak = gCurrent.load();
  HoxConfigManager::ComplianceResult result;
  {
    HoxConfigManager::CheckComplianceHandler handler(&result);
    HoxConfigManager::ComputeDrift(desired, desired.GetAllocator(), handler, std::move(host));
  }
  const long long peak = gPeak.load() - before;
  std::printf("documents: %.1f MB + %.1f MB of text, %.1f MB parsed\n", hostText.size() / 1e6,
              desiredText.size() / 1e6, documents / 1e6);
  std::printf("compliance check: peak %.1f MB (documents included), report %u entries\n", peak / 1e6,
              result.document["ADDS"].Size() + result.document["DELETES"].Size() + result.document["SETS"].Size());
  std::printf("ratio peak of compliance check / parsed documents: %.2f\n", static_cast<double>(peak) / documents);
  std::filesystem::remove_all(root);
  return 0;
}
