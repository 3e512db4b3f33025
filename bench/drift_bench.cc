// Timings of the drift walk against parsing, on one pair of generated
// documents, of the verdicts built on it (impact without plugin runs,
// validation against the host document schema), and of one wide key in
// matching and shuffled order. Prints the ratios that docs/performance.md
// records.
//
//   drift_bench [--scale=N] [benchmark flags]
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <map>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

#include <hoxcm/documents.h>
#include <hoxcm/drift.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/operations.h>
#include <hoxcm/schema_store.h>

#include "doc_generator.h"

namespace {

using HoxConfigManager::Document;

struct Corpus {
  std::string hostText, desiredText;
  Document host, desired;
  Document schema;  // the host document schema of `desired`
};

Corpus& Medium() {
  static Corpus corpus;
  return corpus;
}

std::string Serialize(const Document& doc) {
  std::string out;
  HoxConfigManager::SerializeValue(doc, out);
  return out;
}

Document Copy(const Document& doc) {
  Document out;
  out.CopyFrom(doc, out.GetAllocator());
  return out;
}

// Parsing both documents with RapidJSON: the yardstick of the walk.
void BM_ParseBoth(benchmark::State& state) {
  const Corpus& c = Medium();
  for (auto _ : state) {
    Document host, desired;
    host.Parse(c.hostText.data(), c.hostText.size());
    desired.Parse(c.desiredText.data(), c.desiredText.size());
    benchmark::DoNotOptimize(host.IsObject() && desired.IsObject());
  }
  state.SetBytesProcessed(state.iterations() * (c.hostText.size() + c.desiredText.size()));
}

template <typename Handler>
void RunWalk(benchmark::State& state, Document& desired, const Document& host) {
  for (auto _ : state) {
    state.PauseTiming();
    Document current = Copy(host);
    Document scratch;  // drift records of this run go here, not into `desired`
    state.ResumeTiming();
    if constexpr (std::is_same_v<Handler, HoxConfigManager::CheckComplianceHandler>) {
      HoxConfigManager::ComplianceResult result;
      Handler handler(&result);
      HoxConfigManager::ComputeDrift(desired, scratch.GetAllocator(), handler, std::move(current));
      benchmark::DoNotOptimize(result.compliant);
    } else {
      Handler handler;
      HoxConfigManager::ComputeDrift(desired, scratch.GetAllocator(), handler, std::move(current));
      benchmark::DoNotOptimize(handler.getTasks().size());
    }
  }
}

// The walk alone: a handler that asks for consolidated Sets and does nothing.
class NullHandler final : public HoxConfigManager::DriftHandler {
 public:
  NullHandler() : DriftHandler(true, false, false) {}
  std::vector<int> getTasks() const { return {}; }
};

void BM_DriftBareWalk(benchmark::State& state) { RunWalk<NullHandler>(state, Medium().desired, Medium().host); }

void BM_DriftApplyTasks(benchmark::State& state) {
  RunWalk<HoxConfigManager::ApplyTaskGenerator>(state, Medium().desired, Medium().host);
}
void BM_DriftCompliance(benchmark::State& state) {
  RunWalk<HoxConfigManager::CheckComplianceHandler>(state, Medium().desired, Medium().host);
}

// Parsing the desired document alone: the yardstick of validation.
void BM_ParseDesired(benchmark::State& state) {
  const Corpus& c = Medium();
  for (auto _ : state) {
    Document desired;
    desired.Parse(c.desiredText.data(), c.desiredText.size());
    benchmark::DoNotOptimize(desired.IsObject());
  }
  state.SetBytesProcessed(state.iterations() * c.desiredText.size());
}

// Impact with no impact plugin installed: the walk with the impact handler
// and the folding of its verdict (state.range(0): with the reasons). The
// walk writes drift records into the desired document, so each run gets a
// fresh copy.
void BM_Impact(benchmark::State& state) {
  const Corpus& c = Medium();
  HoxConfigManager::ImpactReasons reasons;
  for (auto _ : state) {
    state.PauseTiming();
    Document desired = Copy(c.desired);
    Document current = Copy(c.host);
    HoxConfigManager::ImpactResult result;
    state.ResumeTiming();
    HoxConfigManager::Impact(desired, "", result, HoxConfigManager::TaskHandle::Dummy(), std::move(current),
                             state.range(0) != 0 ? &reasons : nullptr);
    benchmark::DoNotOptimize(result.impact);
  }
}

// Validation of the desired document against its host document schema,
// with no validation plugin installed.
void BM_Validate(benchmark::State& state) {
  const Corpus& c = Medium();
  for (auto _ : state) {
    HoxConfigManager::ValidationResult result;
    HoxConfigManager::Validate(c.desired, c.schema, "", result, true);
    benchmark::DoNotOptimize(result.errors.size());
  }
}

// The validator's own part of BM_Validate: the host document schema
// stage alone.
void BM_ValidateSchemaStage(benchmark::State& state) {
  const Corpus& c = Medium();
  for (auto _ : state) {
    Document findings;
    JsonValidator::ValidateCMDocument(c.schema, c.desired, findings, {}, "");
    benchmark::DoNotOptimize(findings.Size());
  }
}

// One key of state.range(0) instances; state.range(1) shuffles the host.
void BM_WideKey(benchmark::State& state) {
  Document host, desired;
  hoxcm_bench::GenerateWideKey(42, static_cast<int>(state.range(0)), state.range(1) != 0, host, desired);
  RunWalk<HoxConfigManager::CheckComplianceHandler>(state, desired, host);
  state.SetItemsProcessed(state.iterations() * state.range(0));
}

BENCHMARK(BM_ParseBoth)->Unit(benchmark::kMillisecond)->MinTime(2.0);
BENCHMARK(BM_DriftBareWalk)->Unit(benchmark::kMillisecond)->MinTime(2.0);
BENCHMARK(BM_DriftApplyTasks)->Unit(benchmark::kMillisecond)->MinTime(2.0);
BENCHMARK(BM_DriftCompliance)->Unit(benchmark::kMillisecond)->MinTime(2.0);
BENCHMARK(BM_ParseDesired)->Unit(benchmark::kMillisecond)->MinTime(2.0);
BENCHMARK(BM_Impact)->Arg(0)->Arg(1)->Unit(benchmark::kMillisecond)->MinTime(2.0);
BENCHMARK(BM_Validate)->Unit(benchmark::kMillisecond)->MinTime(2.0);
BENCHMARK(BM_ValidateSchemaStage)->Unit(benchmark::kMillisecond)->MinTime(2.0);
BENCHMARK(BM_WideKey)
    ->ArgsProduct({{1000, 10000, 100000}, {0, 1}})
    ->Unit(benchmark::kMillisecond)
    ->MinTime(1.0);

// Keeps the real time per iteration of every run, for the ratios.
class CollectingReporter : public benchmark::ConsoleReporter {
 public:
  void ReportRuns(const std::vector<Run>& runs) override {
    ConsoleReporter::ReportRuns(runs);
    for (const Run& run : runs) {
      // Single runs, or the median of repetitions.
      if (run.run_type == Run::RT_Aggregate ? run.aggregate_name != "median" : run.repetitions > 1) continue;
      std::string name = run.benchmark_name();
      name = name.substr(0, name.find("/min_time"));
      times[name] = run.GetAdjustedRealTime();
      cpu[name] = run.GetAdjustedCPUTime();
    }
  }
  std::map<std::string, double> times;
  std::map<std::string, double> cpu;
};

}  // namespace

int main(int argc, char** argv) {
  int scale = 200;
  std::vector<char*> args;
  for (int i = 0; i < argc; ++i) {
    if (std::string(argv[i]).rfind("--scale=", 0) == 0) {
      scale = std::atoi(argv[i] + 8);
    } else {
      args.push_back(argv[i]);
    }
  }
  int count = static_cast<int>(args.size());
  benchmark::Initialize(&count, args.data());

  // A private root holding the replicated schemas.
  std::string root = (std::filesystem::temp_directory_path() / "hoxcm-bench-XXXXXX").string();
  if (::mkdtemp(root.data()) == nullptr) return 2;
  ::setenv("HOX_ROOT", root.c_str(), 1);
  ::setenv("HOX_LOG_LEVEL", "-1", 1);
  hoxcm_bench::InstallReplicatedSchemas(scale);
  hoxcm_bench::GeneratorOptions options;
  options.replicas = scale;
  options.instances = 100;
  // A real document is valid or nearly: a handful of findings keep their
  // handling in the validation benchmarks.
  options.faults = 10;
  Corpus& c = Medium();
  hoxcm_bench::GeneratePair(options, c.host, c.desired);
  c.hostText = Serialize(c.host);
  c.desiredText = Serialize(c.desired);
  std::printf("documents: host %.1f MB, desired %.1f MB, %d replicas of the sample keys\n", c.hostText.size() / 1e6,
              c.desiredText.size() / 1e6, scale);
  {
    // Load the schema store before anything is timed.
    HoxConfigManager::ComplianceResult warm;
    HoxConfigManager::CheckComplianceHandler handler(&warm);
    HoxConfigManager::ComputeDrift(c.desired, c.desired.GetAllocator(), handler, Copy(c.host));
    std::printf("report: %u adds, %u deletes, %u sets\n", warm.document["ADDS"].Size(),
                warm.document["DELETES"].Size(), warm.document["SETS"].Size());
  }

  if (!HoxConfigManager::GenerateHostDocumentSchema(c.desired, c.schema)) return 2;
  {
    HoxConfigManager::ValidationResult findings;
    HoxConfigManager::Validate(c.desired, c.schema, "", findings, true);
    std::printf("validation: %zu faulty fields\n", findings.errors.size());
  }

  CollectingReporter reporter;
  benchmark::RunSpecifiedBenchmarks(&reporter);
  benchmark::Shutdown();
  std::filesystem::remove_all(root);

  // Ratios of wall times, then of CPU times (steadier on a shared machine).
  for (auto* t : {&reporter.times, &reporter.cpu}) {
    const char* kind = t == &reporter.times ? "wall" : "cpu";
    if (t->count("BM_ParseBoth")) {
      const double parse = t->at("BM_ParseBoth");
      for (const char* name : {"BM_DriftBareWalk", "BM_DriftApplyTasks", "BM_DriftCompliance"}) {
        if (t->count(name)) std::printf("%s ratio %s / BM_ParseBoth: %.2f\n", kind, name, t->at(name) / parse);
      }
    }
    if (t->count("BM_DriftCompliance")) {
      for (const char* name : {"BM_Impact/0", "BM_Impact/1"}) {
        if (!t->count(name)) continue;
        std::printf("%s ratio %s / BM_DriftCompliance: %.2f\n", kind, name,
                    t->at(name) / t->at("BM_DriftCompliance"));
      }
    }
    if (t->count("BM_ParseDesired")) {
      for (const char* name : {"BM_Validate", "BM_ValidateSchemaStage"}) {
        if (!t->count(name)) continue;
        std::printf("%s ratio %s / BM_ParseDesired: %.2f\n", kind, name, t->at(name) / t->at("BM_ParseDesired"));
      }
    }
    double lo = 0, hi = 0;
    for (int n : {1000, 10000, 100000}) {
      const std::string ordered = "BM_WideKey/" + std::to_string(n) + "/0";
      const std::string shuffled = "BM_WideKey/" + std::to_string(n) + "/1";
      if (!t->count(ordered) || !t->count(shuffled)) continue;
      const double perInstance = t->at(shuffled) / n;
      lo = lo == 0 ? perInstance : std::min(lo, perInstance);
      hi = std::max(hi, perInstance);
      std::printf("%s wide key %6d: %.3f us/instance shuffled, shuffled / ordered %.2f\n", kind, n,
                  perInstance * 1e3, t->at(shuffled) / t->at(ordered));
    }
    if (lo > 0) std::printf("%s wide key: per-instance time spread (max / min) %.2f\n", kind, hi / lo);
  }
  return 0;
}
