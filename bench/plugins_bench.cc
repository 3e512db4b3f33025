// The cost of the plugin framework: one plugin run against a bare
// posix_spawn + waitpid of the same do-nothing runner, and loading a
// manifest tree of 1,000 plugins.
//
//   plugins_bench --benchmark_repetitions=5 --benchmark_report_aggregates_only=true
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <memory>

#include <benchmark/benchmark.h>

#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/plugins.h>

#include "bare_spawn.h"
#include "bench_root.h"

namespace fs = std::filesystem;
using namespace HoxConfigManager;

namespace {

const std::string kModules = "/usr/lib/tarvik/configmanager/apply_modules/";

using hoxcm_bench::BenchRoot;

// The plugin framework's root, with the sample host's schemas.
BenchRoot& Root() {
  static BenchRoot root("bench");
  static const bool schemas =
      (root.Copy(std::string(HOXCM_SOURCE_DIR) + "/data/sample-host/schemas", "/usr/lib/tarvik/configmanager/schemas"),
       true);
  (void)schemas;
  return root;
}

std::string Manifest(const std::string& provides, const std::string& depends) {
  return R"({"version":3,"type":"python","accepts":["network:dns:config"],"apply":{"boot":true,)"
         R"("apply_group":"network","REMEDIATE":{"provides":")" +
         provides + R"(","depends":[)" + depends + "]}}}";
}

using hoxcm_bench::BareSpawnAndWait;

void BM_BareSpawnAndWait(benchmark::State& state) {
  for (auto _ : state) BareSpawnAndWait(Root().runner());
}
BENCHMARK(BM_BareSpawnAndWait)->Unit(benchmark::kMicrosecond);

// A plugin with one DNS object to apply.
struct BenchPlugin {
  BenchPlugin() : plugin(((void)Root().Write(kModules + "bench/plugin.json", Manifest("REMEDIATE:bench", "")),
                          (Root().path() + kModules + "bench/plugin.json").c_str())) {
    Document value;
    ParseDocument(R"({"servers":["10.0.0.1"],"search":["example.org"]})", value);
    inputs.push_back({std::make_shared<HoxConfigStore::ConfigStoreObject>(
                          HoxConfigStore::ConfigStoreObjectId("network", "dns", "config"), value),
                      nullptr, "SET"});
  }
  Plugin plugin;
  std::vector<DesiredConfigInput> inputs;
};

void BM_PluginApplyRun(benchmark::State& state) {
  BenchPlugin bench;
  const auto monitor = PluginMonitor::Dummy();
  for (auto _ : state) {
    const ErrorInfo result = bench.plugin.Apply(bench.inputs, "", monitor);
    if (!result.id.empty()) state.SkipWithError(result.message.c_str());
  }
}
BENCHMARK(BM_PluginApplyRun)->Unit(benchmark::kMicrosecond);

// Both in the same iteration, so that they see the same load of a shared
// machine: the counters give the mean wall time of each and of the
// difference.
void BM_RunOverheadInterleaved(benchmark::State& state) {
  BenchPlugin bench;
  const auto monitor = PluginMonitor::Dummy();
  using Clock = std::chrono::steady_clock;
  double bare = 0, run = 0;
  for (auto _ : state) {
    const auto t0 = Clock::now();
    BareSpawnAndWait(Root().runner());
    const auto t1 = Clock::now();
    const ErrorInfo result = bench.plugin.Apply(bench.inputs, "", monitor);
    const auto t2 = Clock::now();
    if (!result.id.empty()) state.SkipWithError(result.message.c_str());
    bare += std::chrono::duration<double, std::micro>(t1 - t0).count();
    run += std::chrono::duration<double, std::micro>(t2 - t1).count();
  }
  const double n = static_cast<double>(state.iterations());
  state.counters["bare_us"] = bare / n;
  state.counters["run_us"] = run / n;
  state.counters["overhead_us"] = (run - bare) / n;
}
BENCHMARK(BM_RunOverheadInterleaved)->Unit(benchmark::kMicrosecond);

void BM_LoadThousandPluginTree(benchmark::State& state) {
  for (int i = 0; i < 1000; ++i) {
    const std::string depends = i == 0 ? "" : "\"P" + std::to_string(i - 1) + "\"";
    Root().Write(kModules + "p" + std::to_string(i) + "/plugin.json", Manifest("P" + std::to_string(i), depends));
  }
  for (auto _ : state) {
    PluginManager manager(APPLY);
    benchmark::DoNotOptimize(manager.GetDependencies().size());
  }
  fs::remove_all(Root().path() + kModules);
}
BENCHMARK(BM_LoadThousandPluginTree)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
