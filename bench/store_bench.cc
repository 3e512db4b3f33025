// The configuration store under load: importing 100,000 instances, reading
// them back as contents rows (against a bare SELECT of the same rows through
// the SQLite C API in the same run), and committing one change.
//
//   build/<dir>/bench/store_bench
#include <sqlite3.h>
#include <stdlib.h>
#include <unistd.h>

#include <filesystem>
#include <string>

#include <benchmark/benchmark.h>

#include <hoxcm/config_store.h>
#include <hoxcm/host.h>

namespace {

constexpr int kItems = 100000;

// A root of its own for the whole run; removed at exit.
class BenchRoot {
 public:
  BenchRoot() {
    std::string tmpl = (std::filesystem::temp_directory_path() / "hoxcm-store-bench-XXXXXX").string();
    if (::mkdtemp(tmpl.data()) == nullptr) std::abort();
    path_ = tmpl;
    ::setenv("HOX_ROOT", path_.c_str(), 1);
    // An installed host has a schema directory; the bench key has no schema.
    std::filesystem::create_directories(path_ + "/usr/lib/tarvik/configmanager/schemas");
  }
  ~BenchRoot() {
    std::error_code ec;
    std::filesystem::remove_all(path_, ec);
  }

 private:
  std::string path_;
};

BenchRoot& Root() {
  static BenchRoot root;
  return root;
}

// kItems instances of a key without schema, identified by "cs_generated_id".
rapidjson::Document Items(int generation) {
  rapidjson::Document doc(rapidjson::kObjectType);
  auto& a = doc.GetAllocator();
  rapidjson::Value rules(rapidjson::kArrayType);
  for (int i = 0; i < kItems; ++i) {
    rapidjson::Value v(rapidjson::kObjectType);
    v.AddMember("cs_generated_id", rapidjson::Value("id-" + std::to_string(i), a), a);
    v.AddMember("name", rapidjson::Value("rule-" + std::to_string(i), a), a);
    v.AddMember("action", "allow", a).AddMember("port", 1024 + i % 60000, a).AddMember("generation", generation, a);
    rules.PushBack(v, a);
  }
  rapidjson::Value group(rapidjson::kObjectType);
  group.AddMember("rules", rules, a);
  rapidjson::Value component(rapidjson::kObjectType);
  component.AddMember("bench", group, a);
  doc.AddMember("load", component, a);
  return doc;
}

void BM_ImportConfiguration(benchmark::State& state) {
  Root();
  int generation = 0;
  for (auto _ : state) {
    state.PauseTiming();
    rapidjson::Document doc = Items(++generation);
    state.ResumeTiming();
    HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::User, doc);
  }
  state.SetItemsProcessed(state.iterations() * kItems);
}
BENCHMARK(BM_ImportConfiguration)->Unit(benchmark::kMillisecond);

void EnsureFilled() {
  Root();
  auto db = HoxConfigStore::GetDBStore();
  if (HoxConfigStore::GetUserConfigContents(db).size() != static_cast<std::size_t>(kItems)) {
    HoxConfigStore::ImportConfiguration(HoxConfigStore::ConfigKind::User, Items(0));
  }
}

void BM_ReadUserConfigContents(benchmark::State& state) {
  EnsureFilled();
  auto db = HoxConfigStore::GetDBStore();
  for (auto _ : state) benchmark::DoNotOptimize(HoxConfigStore::GetUserConfigContents(db));
  state.SetItemsProcessed(state.iterations() * kItems);
}
BENCHMARK(BM_ReadUserConfigContents)->Unit(benchmark::kMillisecond);

// The same rows, same order, copied into strings and nothing else.
void BM_BareSelect(benchmark::State& state) {
  EnsureFilled();
  sqlite3* db = nullptr;
  sqlite3_open_v2(HoxConfigStore::GetDBStore()->GetPath().c_str(), &db, SQLITE_OPEN_READONLY, nullptr);
  for (auto _ : state) {
    sqlite3_stmt* stmt = nullptr;
    sqlite3_prepare_v2(db,
                       "SELECT component, config_group, name, identifier, value, auto_conf_value FROM config_item "
                       "WHERE kind = 0 ORDER BY component, config_group, name, seq",
                       -1, &stmt, nullptr);
    std::size_t bytes = 0;
    while (sqlite3_step(stmt) == SQLITE_ROW) {
      for (int c = 0; c < 6; ++c) {
        const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(stmt, c));
        std::string copy = text != nullptr ? text : "";
        bytes += copy.size();
      }
    }
    sqlite3_finalize(stmt);
    benchmark::DoNotOptimize(bytes);
  }
  sqlite3_close(db);
  state.SetItemsProcessed(state.iterations() * kItems);
}
BENCHMARK(BM_BareSelect)->Unit(benchmark::kMillisecond);

// One plugin run's commit: one SET in its own transaction, synced to disk.
void BM_ApplyOneChange(benchmark::State& state) {
  EnsureFilled();
  int n = 0;
  for (auto _ : state) {
    HoxConfigStore::ApplyUserConfigChanges(
        {{"SET", {"system", "identity", "hostname"}, "{\"hostname\":\"h" + std::to_string(++n) + "\"}"}});
  }
}
BENCHMARK(BM_ApplyOneChange)->Unit(benchmark::kMicrosecond);

}  // namespace

BENCHMARK_MAIN();
