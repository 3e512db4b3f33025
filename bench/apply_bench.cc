// The library's own cost of an apply: CheckApply and Apply of a document
// that changes 10,000 objects owned by 10 plugins whose runner does nothing,
// against the bare spawn + wait of those 10 runner processes.
//
//   apply_bench [benchmark flags]      (bench/apply_ratios.sh runs it)
//
// The host: ten NFS mount keys (components storage, storage_1 ...
// storage_9), each owned by its own plugin, holding 950 mounts in the store.
// The desired document changes the server of 900 of them, drops 50 and adds
// 50: 1,000 changed objects per plugin. The do-nothing runner records
// nothing, so the host keeps its drift after an apply; what an Apply leaves
// behind (its history record) is removed before the next one, outside the
// timed region.
#include <unistd.h>

#include <sqlite3.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/operations.h>

#include "bare_spawn.h"
#include "bench_root.h"

using namespace HoxConfigManager;
using Clock = std::chrono::steady_clock;

namespace {

constexpr int kPlugins = 10;
constexpr int kHostMounts = 950;
constexpr int kChanged = 900;  // mounts 0..899 change server, 900..949 go
constexpr int kAdded = 50;

const std::string kModules = "/usr/lib/tarvik/configmanager/apply_modules/";

std::string Component(int i) { return i == 0 ? "storage" : "storage_" + std::to_string(i); }

// A temporary host root with the NFS mount schema under ten components, ten
// plugins (plugin i owns component i and runs after plugin i-1) and the
// do-nothing runner installed as the script runner; removed at exit.
class ApplyRoot {
 public:
  ApplyRoot() : root_("apply-bench") {
    const std::string schemas = "/usr/lib/tarvik/configmanager/schemas/";
    for (int i = 0; i < kPlugins; ++i) {
      root_.Copy(std::string(HOXCM_SOURCE_DIR) + "/data/sample-host/schemas/storage/nfs",
                 schemas + Component(i) + "/nfs");
      const std::string depends = i == 0 ? "" : "\"REMEDIATE:bench" + std::to_string(i - 1) + "\"";
      root_.Write(kModules + "bench" + std::to_string(i) + "/plugin.json",
                  R"({"version":3,"type":"python","accepts":[")" + Component(i) +
                      R"(:nfs:mounts"],"apply":{"boot":true,"apply_group":"storage",)"
                      R"("REMEDIATE":{"provides":"REMEDIATE:bench)" + std::to_string(i) + R"(","depends":[)" +
                      depends + "]}}}");
    }
    Document host;
    Fill(host, false);
    HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::User, host);
    HoxConfigStore::SetBootMode(HoxConfigStore::BOOTMODE_NORMAL);
    Fill(desired_, true);
  }
  const std::string& runner() const { return root_.runner(); }
  const Document& desired() const { return desired_; }

  // Removes the apply history, through a connection of its own, so that
  // every Apply appends to the same store.
  void ForgetHistory() const {
    sqlite3* db = nullptr;
    const std::string store = HoxPlatform::HostPath(HoxPlatform::HostPaths::kStore);
    bool ok = sqlite3_open_v2(store.c_str(), &db, SQLITE_OPEN_READWRITE, nullptr) == SQLITE_OK;
    ok = ok && sqlite3_busy_timeout(db, 5000) == SQLITE_OK &&
         sqlite3_exec(db, "DELETE FROM apply_history", nullptr, nullptr, nullptr) == SQLITE_OK;
    sqlite3_close(db);
    if (!ok) std::abort();
  }

 private:
  // The host's mounts, or the desired ones (changed, dropped and added).
  static void Fill(Document& doc, bool desired) {
    doc.SetObject();
    auto& a = doc.GetAllocator();
    for (int c = 0; c < kPlugins; ++c) {
      Value mounts(rapidjson::kArrayType);
      const int count = desired ? kChanged + kAdded : kHostMounts;
      for (int m = 0; m < count; ++m) {
        // The desired document's mounts past kChanged are new ones.
        const int id = desired && m >= kChanged ? kHostMounts + (m - kChanged) : m;
        Value mount(rapidjson::kObjectType);
        mount.AddMember("name", Value("mount-" + std::to_string(id), a), a);
        mount.AddMember("server", Value((desired ? "nfs-new-" : "nfs-") + std::to_string(id % 7), a), a);
        mount.AddMember("export", Value("/export/" + std::to_string(id), a), a);
        mount.AddMember("readOnly", id % 2 == 0, a);
        mounts.PushBack(mount, a);
      }
      Value nfs(rapidjson::kObjectType), component(rapidjson::kObjectType);
      nfs.AddMember("mounts", mounts, a);
      component.AddMember("nfs", nfs, a);
      doc.AddMember(Value(Component(c), a), component, a);
    }
  }

  hoxcm_bench::BenchRoot root_;
  Document desired_;
};

ApplyRoot& Root() {
  static ApplyRoot root;
  return root;
}

Document Copy(const Document& doc) {
  Document out;
  out.CopyFrom(doc, out.GetAllocator());
  return out;
}

using hoxcm_bench::BareSpawnAndWait;

// Wall and CPU (of this thread: the runners' own work is not in it) time.
struct Cost {
  double wall = 0, cpu = 0;
  Cost& operator+=(const Cost& other) {
    wall += other.wall;
    cpu += other.cpu;
    return *this;
  }
};

double ThreadCpuSeconds() {
  timespec ts{};
  ::clock_gettime(CLOCK_THREAD_CPUTIME_ID, &ts);
  return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) * 1e-9;
}

template <typename F>
Cost Measure(F f) {
  const double cpu = ThreadCpuSeconds();
  const auto t0 = Clock::now();
  f();
  return {std::chrono::duration<double>(Clock::now() - t0).count(), ThreadCpuSeconds() - cpu};
}

// CheckApply of a fresh copy of the desired document (the walk writes its
// drift records into the document it is given).
std::shared_ptr<CheckApplyResult> TimedCheck(Cost& cost) {
  Document desired = Copy(Root().desired());
  std::shared_ptr<CheckApplyResult> result;
  cost += Measure([&] { result = CheckApply(desired, "bench", TaskHandle::Dummy()); });
  return result;
}

void TimedApply(const std::shared_ptr<CheckApplyResult>& check, Cost& cost, benchmark::State& state) {
  Root().ForgetHistory();
  ApplyResult result;
  cost += Measure([&] { result = Apply(check, TaskHandle::Dummy()); });
  if (!result.errorInfo.id.empty()) state.SkipWithError(result.errorInfo.id.c_str());
}

void TimedRunners(Cost& cost) {
  cost += Measure([] {
    for (int i = 0; i < kPlugins; ++i) BareSpawnAndWait(Root().runner());
  });
}

// The three in each iteration, so that they see the same load of a shared
// machine; the iteration's time is their sum. The counters give each part
// (means in ms) and the ratios: of wall times (Apply - runners) / CheckApply,
// and of this thread's CPU times Apply / CheckApply.
void BM_ApplyAgainstCheckApply(benchmark::State& state) {
  Cost check, apply, runners;
  for (auto _ : state) {
    Cost iteration;
    const auto result = TimedCheck(iteration);
    check += iteration;
    if (!result) {
      state.SkipWithError("the host complies: nothing to apply");
      break;
    }
    Cost applied, spawned;
    TimedApply(result, applied, state);
    TimedRunners(spawned);
    apply += applied;
    runners += spawned;
    state.SetIterationTime(iteration.wall + applied.wall + spawned.wall);
  }
  const double ms = 1e3 / static_cast<double>(std::max<benchmark::IterationCount>(state.iterations(), 1));
  state.counters["check_ms"] = check.wall * ms;
  state.counters["apply_ms"] = apply.wall * ms;
  state.counters["runners_ms"] = runners.wall * ms;
  state.counters["ratio"] = check.wall > 0 ? (apply.wall - runners.wall) / check.wall : 0;
  state.counters["check_cpu_ms"] = check.cpu * ms;
  state.counters["apply_cpu_ms"] = apply.cpu * ms;
  state.counters["cpu_ratio"] = check.cpu > 0 ? apply.cpu / check.cpu : 0;
}
BENCHMARK(BM_ApplyAgainstCheckApply)->UseManualTime()->Unit(benchmark::kMillisecond)->MinTime(3.0);

void BM_CheckApply(benchmark::State& state) {
  for (auto _ : state) {
    Cost cost;
    benchmark::DoNotOptimize(TimedCheck(cost));
    state.SetIterationTime(cost.wall);
  }
}
BENCHMARK(BM_CheckApply)->UseManualTime()->Unit(benchmark::kMillisecond)->MinTime(2.0);

void BM_Apply(benchmark::State& state) {
  Cost unused;
  const auto check = TimedCheck(unused);
  for (auto _ : state) {
    Cost cost;
    TimedApply(check, cost, state);
    state.SetIterationTime(cost.wall);
  }
}
BENCHMARK(BM_Apply)->UseManualTime()->Unit(benchmark::kMillisecond)->MinTime(2.0);

void BM_TenBareRunners(benchmark::State& state) {
  for (auto _ : state) {
    Cost cost;
    TimedRunners(cost);
    state.SetIterationTime(cost.wall);
  }
}
BENCHMARK(BM_TenBareRunners)->UseManualTime()->Unit(benchmark::kMillisecond)->MinTime(2.0);

// Keeps the ratios of every repetition of the interleaved benchmark.
class RatioReporter : public benchmark::ConsoleReporter {
 public:
  void ReportRuns(const std::vector<Run>& runs) override {
    ConsoleReporter::ReportRuns(runs);
    for (const Run& run : runs) {
      if (run.run_type != Run::RT_Iteration || run.error_occurred) continue;
      if (run.benchmark_name().rfind("BM_ApplyAgainstCheckApply", 0) != 0) continue;
      wall.push_back(run.counters.at("ratio"));
      cpu.push_back(run.counters.at("cpu_ratio"));
    }
  }
  std::vector<double> wall, cpu;
};

void PrintRange(const char* what, std::vector<double> values) {
  if (values.empty()) return;
  std::sort(values.begin(), values.end());
  std::printf("%s: median %.2f, range %.2f-%.2f over %zu runs (aim: at most 2.0)\n", what, values[values.size() / 2],
              values.front(), values.back(), values.size());
}

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 2;
  {
    // Build the host and load the schema store and registry before
    // anything is timed; say what one apply changes.
    Document desired = Copy(Root().desired());
    const ApplyPlan plan = PlanApply(desired);
    std::size_t objects = 0;
    for (const PlannedRun& run : plan.runs) objects += run.inputs.size();
    std::printf("apply: %zu plugin runs, %zu objects, %zu never run, %zu unowned\n", plan.runs.size(), objects,
                plan.neverRun.size(), plan.unowned.size());
  }
  RatioReporter reporter;
  benchmark::RunSpecifiedBenchmarks(&reporter);
  benchmark::Shutdown();
  PrintRange("wall (Apply - runner processes) / CheckApply", reporter.wall);
  PrintRange("cpu Apply / CheckApply (this thread)", reporter.cpu);
  return 0;
}
