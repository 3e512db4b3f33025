// The file module: every read, write and listing of a host file goes through
// here, so that errno values are turned into FileError in one place and every
// descriptor is owned by a FileDescriptor.
#include <hoxcm/files.h>

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <set>
#include <utility>

#include "platform/failpoint.h"
#include "platform/file_descriptor.h"

namespace HoxPlatform {
namespace {

// The one conversion of an errno value into text (thread-safe strerror).
std::string ErrorText(int error) {
  char buffer[256];
  // GNU strerror_r returns the text, which may not be `buffer`.
  return ::strerror_r(error, buffer, sizeof buffer);
}

[[noreturn]] void Fail(std::string_view action, const std::string& path, int error) {
  throw FileError(action, path, error, ErrorText(error));
}

[[noreturn]] void Refuse(std::string_view action, const std::string& path, std::string reason) {
  throw FileError(action, path, 0, std::move(reason));
}

// What a file is, for the error text.
const char* KindOf(mode_t mode) {
  if (S_ISREG(mode)) return "a regular file";
  if (S_ISDIR(mode)) return "a directory";
  if (S_ISFIFO(mode)) return "a FIFO";
  if (S_ISCHR(mode)) return "a character device";
  if (S_ISBLK(mode)) return "a block device";
  if (S_ISSOCK(mode)) return "a socket";
  return "of an unknown kind";
}

std::string SizeText(std::size_t bytes) {
  if (bytes % (1u << 20) == 0) return std::to_string(bytes >> 20) + " MiB";
  return std::to_string(bytes) + " bytes";
}

// Opens `path` for reading. Empty when it does not exist and `missingOk`.
std::optional<FileDescriptor> OpenForReading(const std::string& path, bool missingOk) {
  for (;;) {
    // O_NONBLOCK: opening a FIFO must not wait for a writer; it is refused
    // below. Reads of regular files ignore the flag.
    const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
    if (fd >= 0) return std::optional<FileDescriptor>(std::in_place, fd);
    if (errno == EINTR) continue;  // a signal interrupted the open
    if (missingOk && (errno == ENOENT || errno == ENOTDIR)) return std::nullopt;
    if (errno == ELOOP) Refuse("read", path, "too many levels of symbolic links");
    Fail("read", path, errno);
  }
}

std::string ReadOpened(const FileDescriptor& fd, const std::string& path, FileKind kind) {
  if (Failpoint("read:", path)) Fail("read", path, EIO);
  const std::size_t limit = MaxFileSize(kind);
  struct stat st {};
  if (::fstat(fd.get(), &st) != 0) Fail("read", path, errno);
  if (!S_ISREG(st.st_mode)) Refuse("read", path, std::string("not a regular file (") + KindOf(st.st_mode) + ")");
  const auto tooLarge = [&] {
    const bool overridable = kind == FileKind::Document || kind == FileKind::PluginExchange;
    Refuse("read", path, "larger than " + SizeText(limit) + (overridable ? " (HOX_MAX_DOCUMENT_MIB raises it)" : ""));
  };
  if (st.st_size > 0 && static_cast<std::size_t>(st.st_size) > limit) tooLarge();
  std::string text;
  // The size is a hint only: files under /sys report a size they do not
  // have, and a file may grow while it is read.
  text.reserve(st.st_size > 0 ? static_cast<std::size_t>(st.st_size) : 0);
  char buffer[65536];
  for (;;) {
    const ssize_t n = ::read(fd.get(), buffer, sizeof buffer);
    if (n < 0 && errno == EINTR) continue;  // a signal interrupted the read
    if (n < 0) Fail("read", path, errno);
    if (n == 0) break;
    if (text.size() + static_cast<std::size_t>(n) > limit) tooLarge();
    text.append(buffer, static_cast<std::size_t>(n));
  }
  return text;
}

void WriteAll(const FileDescriptor& fd, std::string_view content, const std::string& temp) {
  while (!content.empty()) {
    const ssize_t n = ::write(fd.get(), content.data(), content.size());
    if (n < 0 && errno == EINTR) continue;  // a signal interrupted the write
    if (n < 0) Fail("write", temp, errno);
    content.remove_prefix(static_cast<std::size_t>(n));
  }
}

std::string DirectoryOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  if (slash == std::string::npos) return ".";
  return slash == 0 ? "/" : path.substr(0, slash);
}

// Flushes a directory's entries, so that a rename in it survives a crash.
void SyncDirectory(const std::string& directory, const std::string& path) {
  FileDescriptor fd(::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (fd.get() < 0) Fail("write", path, errno);
  if (::fsync(fd.get()) != 0) Fail("write", path, errno);
}

// Removes the temporary file of a failed write.
class TemporaryFile {
 public:
  explicit TemporaryFile(std::string path) : path_(std::move(path)) {}
  ~TemporaryFile() {
    if (!path_.empty()) ::unlink(path_.c_str());
  }
  TemporaryFile(const TemporaryFile&) = delete;
  TemporaryFile& operator=(const TemporaryFile&) = delete;
  const std::string& path() const { return path_; }
  void Release() { path_.clear(); }

 private:
  std::string path_;
};

// Walks a tree through descriptors of open directories: every entry is
// opened or examined relative to its directory (no walk of the full path
// for each entry), and entries whose kind the directory reports are not
// examined at all. A large schema tree lists several times faster so.
class Lister {
 public:
  Lister(const ListOptions& options, DirectoryListing& out) : options_(options), out_(out) {}

  // Lists `path`, opened relative to `parent` (AT_FDCWD for the top).
  void List(int parent, const std::string& name, const std::string& path, int depth) {
    const int fd = ::openat(parent, name.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (fd < 0) {
      out_.problems.push_back({path, ErrorText(errno)});
      return;
    }
    // Owned by `dir` from here on; closed with it.
    std::unique_ptr<DIR, int (*)(DIR*)> dir(::fdopendir(fd), &::closedir);
    if (!dir) {
      const int error = errno;
      ::close(fd);
      out_.problems.push_back({path, ErrorText(error)});
      return;
    }
    struct stat st {};
    if (::fstat(fd, &st) != 0) {
      out_.problems.push_back({path, ErrorText(errno)});
      return;
    }
    // A directory reached again through a link is not walked twice.
    if (!visited_.insert({st.st_dev, st.st_ino}).second) return;
    std::vector<std::pair<std::string, unsigned char>> entries;
    for (;;) {
      errno = 0;
      const dirent* entry = ::readdir(dir.get());
      if (entry == nullptr) {
        if (errno != 0) out_.problems.push_back({path, ErrorText(errno)});
        break;
      }
      const std::string_view entryName = entry->d_name;
      if (entryName != "." && entryName != "..") entries.emplace_back(entryName, entry->d_type);
    }
    std::sort(entries.begin(), entries.end());
    const std::string prefix = !path.empty() && path.back() == '/' ? path : path + "/";
    for (const auto& [entryName, type] : entries) Visit(fd, prefix + entryName, entryName, type, depth + 1);
  }

 private:
  void Visit(int directory, const std::string& path, const std::string& name, unsigned char type, int depth) {
    // The directory's word is taken for plain files and directories; links
    // and file systems that do not say are asked.
    mode_t mode = type == DT_REG ? S_IFREG : type == DT_DIR ? S_IFDIR : 0;
    bool link = false;
    if (mode == 0) {
      struct stat st {};
      if (::fstatat(directory, name.c_str(), &st, AT_SYMLINK_NOFOLLOW) != 0) {
        out_.problems.push_back({path, ErrorText(errno)});
        return;
      }
      link = S_ISLNK(st.st_mode);
      if (link && ::fstatat(directory, name.c_str(), &st, 0) != 0) {
        out_.problems.push_back({path, ErrorText(errno)});
        return;
      }
      mode = st.st_mode;
    }
    if (S_ISDIR(mode)) {
      if (link && !options_.followDirectoryLinks) return;
      if (options_.maxDepth > 0 && depth >= options_.maxDepth) {
        out_.notEntered.push_back(path);
        return;
      }
      List(directory, name, path, depth);
      return;
    }
    if (!options_.suffix.empty() &&
        (name.size() < options_.suffix.size() ||
         name.compare(name.size() - options_.suffix.size(), options_.suffix.size(), options_.suffix) != 0)) {
      return;
    }
    if (S_ISREG(mode)) {
      out_.files.push_back(path);
    } else {
      out_.problems.push_back({path, std::string("not a regular file (") + KindOf(mode) + ")"});
    }
  }

  const ListOptions& options_;
  DirectoryListing& out_;
  std::set<std::pair<dev_t, ino_t>> visited_;
};

}  // namespace

FileError::FileError(std::string_view action, std::string path, int error, std::string reason)
    : HostCtlException("cannot " + std::string(action) + " " + path + ": " + reason),
      path_(std::move(path)),
      error_(error),
      reason_(std::move(reason)) {}

namespace {

// HOX_MAX_DOCUMENT_MIB in bytes; 0 when unset or unusable.
std::size_t DocumentOverride() {
  const char* text = std::getenv("HOX_MAX_DOCUMENT_MIB");
  if (text == nullptr || *text == '\0') return 0;
  char* end = nullptr;
  errno = 0;
  const unsigned long long mib = std::strtoull(text, &end, 10);
  if (errno != 0 || *end != '\0' || *text == '-' || mib == 0 || mib > kMaxDocumentMibOverride) return 0;
  return static_cast<std::size_t>(mib) << 20;
}

}  // namespace

std::size_t MaxFileSize(FileKind kind) {
  if (kind == FileKind::Document || kind == FileKind::PluginExchange) {
    if (const std::size_t override = DocumentOverride()) return override;
  }
  switch (kind) {
    case FileKind::Document: return kMaxDocumentFileSize;
    case FileKind::Manifest: return kMaxManifestFileSize;
    case FileKind::ManifestSchema: return kMaxManifestSchemaFileSize;
    case FileKind::Schema: return kMaxSchemaFileSize;
    case FileKind::PluginExchange: return kMaxPluginExchangeFileSize;
    case FileKind::HostFile: return kMaxHostFileSize;
    case FileKind::Program: return kMaxProgramFileSize;
  }
  return 0;
}

std::string ReadFile(const std::string& path, FileKind kind) {
  return ReadOpened(*OpenForReading(path, false), path, kind);
}

std::optional<std::string> ReadFileIfExists(const std::string& path, FileKind kind) {
  std::optional<FileDescriptor> fd = OpenForReading(path, true);
  if (!fd) return std::nullopt;
  return ReadOpened(*fd, path, kind);
}

bool IsRegularFile(const std::string& path, std::optional<FileError>* problem) {
  struct stat st {};
  if (::stat(path.c_str(), &st) != 0) {
    const int error = errno;
    if (problem != nullptr) problem->emplace("stat", path, error, ErrorText(error));
    return false;
  }
  return S_ISREG(st.st_mode);
}

bool IsDirectory(const std::string& path) {
  struct stat st {};
  return ::stat(path.c_str(), &st) == 0 && S_ISDIR(st.st_mode);
}

void WriteFileAtomically(const std::string& path, std::string_view content, mode_t mode, Durability durability) {
  std::string pattern = path + ".XXXXXX";
  // mkostemp creates a new file (O_EXCL) with mode 0600: nothing planted at
  // the name is written through, and the content is never readable by
  // others before the mode is set.
  FileDescriptor fd(::mkostemp(pattern.data(), O_CLOEXEC));
  if (fd.get() < 0) Fail("write", path, errno);
  TemporaryFile temp(std::move(pattern));
  WriteAll(fd, content, temp.path());
  if (Failpoint("write:", path)) Fail("write", temp.path(), EIO);
  if (::fchmod(fd.get(), mode) != 0) Fail("write", temp.path(), errno);
  if (durability == Durability::kDurable && ::fsync(fd.get()) != 0) Fail("write", temp.path(), errno);
  // A failing close may be the first sign of a lost write.
  if (fd.Close() != 0) Fail("write", temp.path(), errno);
  if (Failpoint("rename:", path)) Fail("write", path, EIO);
  if (::rename(temp.path().c_str(), path.c_str()) != 0) Fail("write", path, errno);
  temp.Release();
  if (durability == Durability::kDurable) SyncDirectory(DirectoryOf(path), path);
}

int RemoveFile(const std::string& path) { return ::unlink(path.c_str()) == 0 ? 0 : errno; }

void CreateDirectories(const std::string& directory, mode_t mode) {
  if (directory.empty()) return;
  struct stat st {};
  if (::stat(directory.c_str(), &st) == 0) {
    if (!S_ISDIR(st.st_mode)) Refuse("create", directory, std::string("not a directory (") + KindOf(st.st_mode) + ")");
    return;
  }
  const std::string parent = DirectoryOf(directory);
  if (parent != directory) CreateDirectories(parent, mode);
  if (::mkdir(directory.c_str(), mode) != 0) {
    if (errno == EEXIST) return;  // made meanwhile by another process
    Fail("create", directory, errno);
  }
  // mkdir applies the umask; the caller asked for exactly `mode`.
  if (::chmod(directory.c_str(), mode) != 0) Fail("create", directory, errno);
}

DirectoryListing ListFiles(const std::string& directory, const ListOptions& options) {
  DirectoryListing listing;
  Lister(options, listing).List(AT_FDCWD, directory, directory, 0);
  std::sort(listing.files.begin(), listing.files.end());
  std::sort(listing.notEntered.begin(), listing.notEntered.end());
  return listing;
}

}  // namespace HoxPlatform
