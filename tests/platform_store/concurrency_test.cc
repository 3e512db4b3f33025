// Killed writers and concurrent readers: what other threads and processes
// see of the store while a writer replaces a set.
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <chrono>
#include <thread>

#include "platform_store/store_fixture.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigStore;

constexpr int kInstances = 300;

// A user configuration of kInstances NFS mounts, every one tagged with
// `generation`.
rapidjson::Document Generation(int generation) {
  rapidjson::Document doc(rapidjson::kObjectType);
  auto& a = doc.GetAllocator();
  rapidjson::Value mounts(rapidjson::kArrayType);
  for (int i = 0; i < kInstances; ++i) {
    rapidjson::Value m(rapidjson::kObjectType);
    m.AddMember("name", rapidjson::Value("m" + std::to_string(i), a), a);
    m.AddMember("server", rapidjson::Value("gen" + std::to_string(generation), a), a);
    m.AddMember("export", "/e", a);
    mounts.PushBack(m, a);
  }
  rapidjson::Value nfs(rapidjson::kObjectType);
  nfs.AddMember("mounts", mounts, a);
  rapidjson::Value storage(rapidjson::kObjectType);
  storage.AddMember("nfs", nfs, a);
  doc.AddMember("storage", storage, a);
  return doc;
}

// The generation every row shows, or -1 when the rows are not one complete
// generation.
int ConsistentGeneration(const ConfigMapList& rows) {
  if (rows.size() != static_cast<std::size_t>(kInstances)) return -1;
  std::string server;
  for (const auto& row : rows) {
    const rapidjson::Document value = Json(row->at("Value"));
    const std::string s = value["server"].GetString();
    if (server.empty()) server = s;
    if (s != server) return -1;
  }
  return std::stoi(server.substr(3));
}

TEST_F(StoreTest, WriterKilledInsideATransactionLeavesThePreviousContents) {
  ImportConfiguration(ConfigKind::User, Generation(1));
  int ready[2];
  ASSERT_EQ(pipe(ready), 0);
  const pid_t child = fork();
  if (child == 0) {
    // Replace the set inside an open transaction, report, then wait to die.
    ConfigStoreTransaction transaction(ConfigStore::GetStore(sGlobalNamespace));
    ImportConfiguration(ConfigKind::User, Generation(2));
    SetBootMode(BOOTMODE_DESIRED_STAGED);
    (void)!write(ready[1], "r", 1);
    pause();
    _exit(0);
  }
  close(ready[1]);
  char byte = 0;
  ASSERT_EQ(read(ready[0], &byte, 1), 1);
  close(ready[0]);
  kill(child, SIGKILL);
  waitpid(child, nullptr, 0);

  EXPECT_EQ(ConsistentGeneration(GetUserConfigContents(GetDBStore())), 1);
  EXPECT_EQ(GetBootMode(), BOOTMODE_NORMAL);
  // The store stays writable after the killed writer.
  ImportConfiguration(ConfigKind::User, Generation(3));
  EXPECT_EQ(ConsistentGeneration(GetUserConfigContents(GetDBStore())), 3);
}

TEST_F(StoreTest, WriterKilledAtAnyMomentLeavesOneCompleteGeneration) {
  ImportConfiguration(ConfigKind::User, Generation(0));
  for (int round = 0; round < 6; ++round) {
    SCOPED_TRACE(round);
    const pid_t child = fork();
    if (child == 0) {
      for (int g = 1;; ++g) ImportConfiguration(ConfigKind::User, Generation(g));
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(40 + 23 * round));
    kill(child, SIGKILL);
    waitpid(child, nullptr, 0);
    EXPECT_GE(ConsistentGeneration(GetUserConfigContents(GetDBStore())), 0);
  }
}

TEST_F(StoreTest, ProcessesCreatingTheStoreAtOnceAllSucceed) {
  // Given a root without store, several processes open and write it at the
  // same moment: one creates it, the others wait and use it.
  std::vector<pid_t> children;
  for (int i = 0; i < 4; ++i) {
    const pid_t child = fork();
    if (child == 0) {
      try {
        AddBootTimeRestoreFailure({"c", "g", std::to_string(i)});
        _exit(0);
      } catch (const std::exception& e) {
        std::fprintf(stderr, "child %d: %s\n", i, e.what());
        _exit(1);
      }
    }
    children.push_back(child);
  }
  for (pid_t child : children) {
    int status = 0;
    waitpid(child, &status, 0);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
  }
  EXPECT_EQ(GetBootTimeRestoreFailures().size(), 4u);
}

TEST_F(StoreTest, ReadersInThreadsAndAnotherProcessSeeCompleteSetsWhileAWriterReplacesThem) {
  ImportConfiguration(ConfigKind::User, Generation(0));
  // The reading process starts before any thread of this one.
  int go[2];
  ASSERT_EQ(pipe(go), 0);
  const pid_t reader = fork();
  if (reader == 0) {
    close(go[1]);
    char byte;
    (void)!read(go[0], &byte, 1);
    int reads = 0;
    const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(1500);
    while (std::chrono::steady_clock::now() < end) {
      if (ConsistentGeneration(GetUserConfigContents(GetDBStore())) < 0) _exit(1);
      ++reads;
    }
    _exit(reads > 0 ? 0 : 2);
  }
  close(go[0]);

  std::atomic<bool> stop{false};
  std::atomic<int> inconsistent{0};
  std::atomic<int> generationsSeen{0};
  std::vector<std::thread> readers;
  for (int t = 0; t < 3; ++t) {
    readers.emplace_back([&] {
      int last = -1;
      while (!stop) {
        const int g = ConsistentGeneration(GetUserConfigContents(GetDBStore()));
        if (g < 0) ++inconsistent;
        if (g != last) ++generationsSeen;
        last = g;
      }
    });
  }
  (void)!write(go[1], "g", 1);
  close(go[1]);
  const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(1500);
  for (int g = 1; std::chrono::steady_clock::now() < end; ++g) ImportConfiguration(ConfigKind::User, Generation(g));
  stop = true;
  for (auto& t : readers) t.join();
  int status = 0;
  waitpid(reader, &status, 0);

  EXPECT_EQ(inconsistent, 0);
  EXPECT_GT(generationsSeen, 3);
  ASSERT_TRUE(WIFEXITED(status));
  EXPECT_EQ(WEXITSTATUS(status), 0);
}

}  // namespace
}  // namespace hoxcm_test
