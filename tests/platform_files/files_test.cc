// The file module: what a read refuses and why, what an atomic write
// promises, and the order of a listing.
#include <gtest/gtest.h>

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <cstdlib>
#include <functional>
#include <string>

#include <hoxcm/files.h>

#include "support/temp_root.h"

namespace hoxcm_test {
namespace {

namespace fs = std::filesystem;
using HoxPlatform::Durability;
using HoxPlatform::FileError;
using HoxPlatform::FileKind;

// "error: what()" of the FileError `f` throws; "no error" when it throws none.
std::string Refusal(const std::function<void()>& f) {
  try {
    f();
  } catch (const FileError& e) {
    return std::to_string(e.error()) + ": " + e.what();
  }
  return "no error";
}

TEST(FilesTest, TheDocumentLimitIsRaisedOnlyByAWellFormedOverride) {
  // Given HOX_MAX_DOCUMENT_MIB, documents and exchange files should take its
  // limit, other kinds keep theirs, and an unusable value changes nothing.
  TempRoot root;
  root.WriteFile("/doc.json", std::string((1u << 20) + 1, ' '));
  const char* const previous = std::getenv("HOX_MAX_DOCUMENT_MIB");
  const std::string saved = previous != nullptr ? previous : "";
  const struct {
    const char* value;
    std::size_t document;
  } cases[] = {
      {"", HoxPlatform::kMaxDocumentFileSize},  {"512", std::size_t{512} << 20},
      {"0", HoxPlatform::kMaxDocumentFileSize}, {"12x", HoxPlatform::kMaxDocumentFileSize},
      {"-1", HoxPlatform::kMaxDocumentFileSize}, {"99999999", HoxPlatform::kMaxDocumentFileSize},
  };
  for (const auto& c : cases) {
    ::setenv("HOX_MAX_DOCUMENT_MIB", c.value, 1);
    EXPECT_EQ(HoxPlatform::MaxFileSize(FileKind::Document), c.document) << c.value;
    EXPECT_EQ(HoxPlatform::MaxFileSize(FileKind::PluginExchange), c.document) << c.value;
    EXPECT_EQ(HoxPlatform::MaxFileSize(FileKind::Manifest), HoxPlatform::kMaxManifestFileSize) << c.value;
  }
  ::setenv("HOX_MAX_DOCUMENT_MIB", "1", 1);
  EXPECT_EQ(Refusal([&] { HoxPlatform::ReadFile(root.Path("/doc.json"), FileKind::Document); }),
            "0: cannot read " + root.Path("/doc.json") + ": larger than 1 MiB (HOX_MAX_DOCUMENT_MIB raises it)");
  if (previous != nullptr) {
    ::setenv("HOX_MAX_DOCUMENT_MIB", saved.c_str(), 1);
  } else {
    ::unsetenv("HOX_MAX_DOCUMENT_MIB");
  }
}

TEST(FilesTest, ReadsRefuseEverythingButARegularFileWithinItsLimit) {
  TempRoot root;
  root.WriteFile("/etc/dir/file", "x");
  ASSERT_EQ(::mkfifo(root.Path("/fifo").c_str(), 0600), 0);
  fs::create_symlink(root.Path("/loop-b"), root.Path("/loop-a"));
  fs::create_symlink(root.Path("/loop-a"), root.Path("/loop-b"));
  fs::create_symlink(root.Path("/etc/dir/file"), root.Path("/link"));
  root.WriteFile("/big", std::string(HoxPlatform::kMaxManifestFileSize + 1, 'x'));
  root.WriteFile("/at-limit", std::string(HoxPlatform::kMaxManifestFileSize, 'x'));
  struct Case {
    std::string path;
    std::string refusal;  // empty: read
  };
  const Case cases[] = {
      {root.Path("/etc/dir/file"), ""},
      {root.Path("/link"), ""},
      {root.Path("/at-limit"), ""},
      {root.Path("/missing"), "2: cannot read P: No such file or directory"},
      {root.Path("/etc/dir"), "0: cannot read P: not a regular file (a directory)"},
      // A FIFO without a writer: refused at once, never waited on.
      {root.Path("/fifo"), "0: cannot read P: not a regular file (a FIFO)"},
      {"/dev/null", "0: cannot read P: not a regular file (a character device)"},
      {root.Path("/loop-a"), "0: cannot read P: too many levels of symbolic links"},
      {root.Path("/big"), "0: cannot read P: larger than 1 MiB"},
  };
  for (const Case& c : cases) {
    std::string expected = c.refusal.empty() ? "no error" : c.refusal;
    if (const auto p = expected.find('P'); p != std::string::npos && !c.refusal.empty()) {
      expected.replace(p, 1, c.path);
    }
    EXPECT_EQ(Refusal([&] { HoxPlatform::ReadFile(c.path, FileKind::Manifest); }), expected);
  }
  EXPECT_EQ(HoxPlatform::ReadFile(root.Path("/link"), FileKind::HostFile), "x");
  // Only a missing file (or directory on the way) reads as absent.
  EXPECT_FALSE(HoxPlatform::ReadFileIfExists(root.Path("/missing"), FileKind::HostFile));
  EXPECT_FALSE(HoxPlatform::ReadFileIfExists(root.Path("/etc/dir/file/below"), FileKind::HostFile));
  EXPECT_THROW(HoxPlatform::ReadFileIfExists(root.Path("/fifo"), FileKind::HostFile), FileError);
}

TEST(FilesTest, AtomicWritesReplaceWholeFilesWithExactlyTheModeAsked) {
  TempRoot root;
  root.WriteFile("/etc/target", "old");
  root.WriteFile("/etc/elsewhere", "keep");
  fs::create_symlink(root.Path("/etc/elsewhere"), root.Path("/etc/link"));
  const mode_t previous = ::umask(0077);
  for (const Durability durability : {Durability::kAtomic, Durability::kDurable}) {
    HoxPlatform::WriteFileAtomically(root.Path("/etc/target"), "new", 0644, durability);
    EXPECT_EQ(root.ReadFile("/etc/target"), "new");
  }
  // A link at the path is replaced, never written through.
  HoxPlatform::WriteFileAtomically(root.Path("/etc/link"), "mine", 0600, Durability::kAtomic);
  ::umask(previous);
  struct stat st {};
  ASSERT_EQ(::stat(root.Path("/etc/target").c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0644u) << "the umask must not change the mode asked for";
  EXPECT_FALSE(fs::is_symlink(root.Path("/etc/link")));
  EXPECT_EQ(root.ReadFile("/etc/elsewhere"), "keep");

  // Failures name the path and leave nothing behind.
  fs::create_directories(root.Path("/etc/a-directory"));
  EXPECT_EQ(Refusal([&] {
              HoxPlatform::WriteFileAtomically(root.Path("/no/dir/file"), "x", 0600, Durability::kDurable);
            }),
            "2: cannot write " + root.Path("/no/dir/file") + ": No such file or directory");
  EXPECT_NE(Refusal([&] {
              HoxPlatform::WriteFileAtomically(root.Path("/etc/a-directory"), "x", 0600, Durability::kAtomic);
            }).find("cannot write " + root.Path("/etc/a-directory") + ": Is a directory"),
            std::string::npos);
  std::vector<std::string> left;
  for (const auto& entry : fs::directory_iterator(root.Path("/etc"))) left.push_back(entry.path().filename());
  std::sort(left.begin(), left.end());
  EXPECT_EQ(left, (std::vector<std::string>{"a-directory", "elsewhere", "link", "target"}));
}

TEST(FilesTest, CreateDirectoriesGivesNewDirectoriesTheirModeAndRefusesAFileInTheWay) {
  TempRoot root;
  const mode_t previous = ::umask(0077);
  HoxPlatform::CreateDirectories(root.Path("/a/b/c"), 0751);
  ::umask(previous);
  struct stat st {};
  ASSERT_EQ(::stat(root.Path("/a/b/c").c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0751u);
  root.WriteFile("/file", "x");
  EXPECT_EQ(Refusal([&] { HoxPlatform::CreateDirectories(root.Path("/file/d")); }),
            "0: cannot create " + root.Path("/file") + ": not a directory (a regular file)");
}

TEST(FilesTest, ListingsAreSortedAndWalkLinksOnlyWhenAsked) {
  TempRoot root;
  for (const char* file : {"/d/z.json", "/d/b/a.json", "/d/a.json", "/d/a.txt", "/d/x.json/inner.json",
                           "/d/deep/er/est/k.json", "/other/o.json"}) {
    root.WriteFile(file, "{}");
  }
  fs::create_directory_symlink(root.Path("/other"), root.Path("/d/linked"));
  fs::create_directory_symlink(root.Path("/d"), root.Path("/d/b/loop"));
  ASSERT_EQ(::mkfifo(root.Path("/d/pipe.json").c_str(), 0600), 0);
  const std::string d = root.Path("/d");

  HoxPlatform::ListOptions json;
  json.suffix = ".json";
  auto listing = HoxPlatform::ListFiles(d, json);
  EXPECT_EQ(listing.files, (std::vector<std::string>{d + "/a.json", d + "/b/a.json", d + "/deep/er/est/k.json",
                                                     d + "/x.json/inner.json", d + "/z.json"}));
  ASSERT_EQ(listing.problems.size(), 1u);
  EXPECT_EQ(listing.problems[0].path + ": " + listing.problems[0].reason, d + "/pipe.json: not a regular file (a FIFO)");

  // Followed links are walked, a loop of them once; depth cuts the walk.
  json.followDirectoryLinks = true;
  json.maxDepth = 2;
  listing = HoxPlatform::ListFiles(d, json);
  EXPECT_EQ(listing.files, (std::vector<std::string>{d + "/a.json", d + "/b/a.json", d + "/linked/o.json",
                                                     d + "/x.json/inner.json", d + "/z.json"}));
  EXPECT_EQ(listing.notEntered, (std::vector<std::string>{d + "/b/loop", d + "/deep/er"}));

  listing = HoxPlatform::ListFiles(root.Path("/missing"));
  EXPECT_TRUE(listing.files.empty());
  ASSERT_EQ(listing.problems.size(), 1u);
  EXPECT_EQ(listing.problems[0].reason, "No such file or directory");
}

}  // namespace
}  // namespace hoxcm_test
