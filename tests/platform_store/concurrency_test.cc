// Killed writers and concurrent readers: what other threads and processes
// see of the store while a writer replaces a set.
#include <signal.h>
#include <unistd.h>

#include <chrono>
#include <thread>

#include "platform_store/store_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigStore;
using Clock = std::chrono::steady_clock;

constexpr int kInstances = 300;

// A user configuration of kInstances NFS mounts, every one tagged with
// `generation`.
rapidjson::Document Generation(int generation) {
  std::string text = R"({"storage":{"nfs":{"mounts":[)";
  for (int i = 0; i < kInstances; ++i) {
    text += (i == 0 ? "" : ",") + std::string(R"({"name":"m)") + std::to_string(i) + R"(","server":"gen)" +
            std::to_string(generation) + R"(","export":"/e"})";
  }
  return Parse(text + "]}}}");
}

// The generation the stored user configuration shows, or -1 when its rows
// are not one complete generation.
int StoredGeneration() {
  const ConfigMapList rows = GetUserConfigContents(GetDBStore());
  if (rows.size() != static_cast<std::size_t>(kInstances)) return -1;
  std::string server;
  for (const auto& row : rows) {
    const std::string s = Parse(row->at("Value"))["server"].GetString();
    if (server.empty()) server = s;
    if (s != server) return -1;
  }
  return std::stoi(server.substr(3));
}

// Reads the store until `end`: how many times the generation changed, or
// -1 as soon as a read is not one complete generation.
int WatchGenerations(Clock::time_point end) {
  int changes = 0;
  for (int last = -1; Clock::now() < end;) {
    const int g = StoredGeneration();
    if (g < 0) return -1;
    changes += g != last;
    last = g;
  }
  return changes;
}

TEST_F(StoreTest, WriterKilledMidWriteLeavesThePreviousContentsOrOneCompleteGeneration) {
  ImportConfiguration(ConfigKind::User, Generation(1));
  const pid_t child = fork();
  if (child == 0) {
    // Replace the set inside an open transaction, then die before the commit.
    ConfigStoreTransaction transaction(ConfigStore::GetStore(sGlobalNamespace));
    ImportConfiguration(ConfigKind::User, Generation(2));
    SetBootMode(BOOTMODE_DESIRED_STAGED);
    raise(SIGKILL);
  }
  EXPECT_EQ(ExitCodeOf(child), -1);
  EXPECT_EQ(StoredGeneration(), 1);
  EXPECT_EQ(GetBootMode(), BOOTMODE_NORMAL);

  // Writers killed at any moment of their loop, inside or outside a write.
  for (int round = 0; round < 6; ++round) {
    const pid_t writer = fork();
    if (writer == 0) {
      for (int g = 2;; ++g) ImportConfiguration(ConfigKind::User, Generation(g));
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(40 + 23 * round));
    kill(writer, SIGKILL);
    EXPECT_EQ(ExitCodeOf(writer), -1);
    EXPECT_GE(StoredGeneration(), 1) << "round " << round;
  }
  // The store stays writable after the killed writers.
  ImportConfiguration(ConfigKind::User, Generation(0));
  EXPECT_EQ(StoredGeneration(), 0);
}

TEST_F(StoreTest, ProcessesCreatingTheStoreAtOnceAllSucceed) {
  // Given a root without store, several processes open and write it at the
  // same moment: one creates it, the others wait and use it.
  std::vector<pid_t> children;
  for (int i = 0; i < 4; ++i) {
    const pid_t child = fork();
    if (child == 0) {
      _exit(ThrownBy([i] { AddBootTimeRestoreFailure({"c", "g", std::to_string(i)}); }).code == 0 ? 0 : 1);
    }
    children.push_back(child);
  }
  for (pid_t child : children) EXPECT_EQ(ExitCodeOf(child), 0);
  EXPECT_EQ(GetBootTimeRestoreFailures().size(), 4u);
}

TEST_F(StoreTest, ReadersInThreadsAndAnotherProcessSeeCompleteSetsWhileAWriterReplacesThem) {
  ImportConfiguration(ConfigKind::User, Generation(0));
  const Clock::time_point end = Clock::now() + std::chrono::milliseconds(1500);
  // The reading process is forked before any thread of this one exists.
  const pid_t reader = fork();
  if (reader == 0) _exit(WatchGenerations(end) > 1 ? 0 : 1);
  std::vector<int> changes(3);
  std::vector<std::thread> readers;
  for (int& seen : changes) readers.emplace_back([&seen, end] { seen = WatchGenerations(end); });
  for (int g = 1; Clock::now() < end; ++g) ImportConfiguration(ConfigKind::User, Generation(g));
  for (auto& t : readers) t.join();
  // Every reader saw only complete generations, and more than one of them.
  for (int seen : changes) EXPECT_GT(seen, 1);
  EXPECT_EQ(ExitCodeOf(reader), 0);
}

}  // namespace
}  // namespace hoxcm_test
