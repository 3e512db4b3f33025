// Where a compliance check spends its time, phase by phase, in one process
// against the host root of HOX_ROOT (as bench/e2e_ratios.sh seeds it): the
// parse of the desired document, the schema store's index, the load of
// every key, the extraction of the host from the store, the walk with the
// compliance handler, the report's serialisation. Prints CPU and wall time
// of each.
//
//   HOX_ROOT=ROOT compliance_phases DESIRED
#include <time.h>

#include <cstdio>
#include <string>

#include <hoxcm/documents.h>
#include <hoxcm/drift.h>
#include <hoxcm/extraction.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

namespace {

double Clock(clockid_t clock) {
  timespec t{};
  ::clock_gettime(clock, &t);
  return static_cast<double>(t.tv_sec) + static_cast<double>(t.tv_nsec) / 1e9;
}

template <typename F>
void Phase(const char* name, F&& work) {
  const double cpu = Clock(CLOCK_PROCESS_CPUTIME_ID), wall = Clock(CLOCK_MONOTONIC);
  work();
  std::printf("  %-22s cpu %6.3f s   wall %6.3f s\n", name, Clock(CLOCK_PROCESS_CPUTIME_ID) - cpu,
              Clock(CLOCK_MONOTONIC) - wall);
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    std::fprintf(stderr, "usage: HOX_ROOT=ROOT compliance_phases DESIRED\n");
    return 2;
  }
  try {
    HoxConfigManager::Document desired, host;
    std::shared_ptr<HoxSchemaStore::SchemaStore> store;
    HoxConfigManager::ComplianceResult result;
    std::string report;
    Phase("parse desired", [&] { HoxConfigManager::CreateDocumentFromFile(argv[1], desired); });
    Phase("schema index", [&] { store = HoxSchemaStore::SchemaStore::GetStore(); });
    if (!store) throw std::runtime_error("no schema directory under HOX_ROOT");
    Phase("load every key", [&] { store->GetMutableDefaultIds(); });
    Phase("extract the host", [&] { host = HoxConfigManager::ExtractCurrentConfiguration(); });
    Phase("walk (compliance)", [&] {
      HoxConfigManager::CheckComplianceHandler handler(&result);
      HoxConfigManager::ComputeDrift(desired, desired.GetAllocator(), handler, std::move(host));
    });
    Phase("write the report", [&] { HoxConfigManager::SerializeValue(result.document, report); });
  } catch (const std::exception& e) {
    std::fprintf(stderr, "compliance_phases: %s\n", e.what());
    return 2;
  }
  return 0;
}
