// The host's files, read and written one way by the library, hoxcfg and the
// plugin runners: bounded reads that accept only regular files, atomic
// replacement with an explicit mode, and sorted directory listings.
//
// Every failure of the operating system is converted once, into FileError,
// whose text names the path and the reason ("cannot read /x/y.json: not a
// regular file (a FIFO)"). Callers that owe their own callers another
// exception (a parse failure code, a load error text) convert FileError, and
// keep its text.
//
// Thread safety: every function may be called from any thread. Two writers of
// one path each replace it whole; the last rename wins.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <hoxcm/errors.h>
#include <hoxcm/export.h>

namespace HoxPlatform {

// A file that could not be read, written or listed.
class HOXCM_API FileError : public HostCtl::Lib::HostCtlException {
 public:
  // `action` is what failed ("read", "write", "create"); `error` the errno
  // value, 0 when the file was refused for what it is (its kind or size).
  FileError(std::string_view action, std::string path, int error, std::string reason);
  const std::string& path() const { return path_; }
  int error() const { return error_; }
  // The reason alone ("No such file or directory", "larger than 1 MiB").
  const std::string& reason() const { return reason_; }

 private:
  std::string path_;
  int error_;
  std::string reason_;
};

// What a file holds decides how large it may be. No legitimate file comes
// near its limit; a larger one (a log dropped into the tree, a runaway
// writer) is refused by its size, before it is read whole.
enum class FileKind : int {
  Document,        // desired, boot and exported host documents
  Manifest,        // plugin manifests
  ManifestSchema,  // the manifest schemas, one per manifest version
  Schema,          // key schema files of the schema store
  PluginExchange,  // the request and result files of a plugin run
  HostFile,        // host facts, hardware ids, SSH configuration files
  Program,         // runner programs and plugin files, as hoxcfg installs them
};

// Documents and request files carry whole host configurations (tens of MB
// for the largest hosts measured). A host that needs more sets
// HOX_MAX_DOCUMENT_MIB (a whole number of MiB) in the environment of the
// process that reads them; MaxFileSize applies it to both kinds.
constexpr std::size_t kMaxDocumentFileSize = 128u << 20;
constexpr std::size_t kMaxPluginExchangeFileSize = 128u << 20;
// The largest HOX_MAX_DOCUMENT_MIB taken; a larger, zero or malformed value
// leaves the default.
constexpr std::size_t kMaxDocumentMibOverride = 16384;
// A manifest or manifest schema is a few kB.
constexpr std::size_t kMaxManifestFileSize = 1u << 20;
constexpr std::size_t kMaxManifestSchemaFileSize = 1u << 20;
// The largest key schema shipped is some tens of kB.
constexpr std::size_t kMaxSchemaFileSize = 4u << 20;
// Host facts and SSH files are small text files.
constexpr std::size_t kMaxHostFileSize = 16u << 20;
// Runner programs and plugin libraries, debug and sanitizer builds included.
constexpr std::size_t kMaxProgramFileSize = 256u << 20;

// The limit of `kind`, with HOX_MAX_DOCUMENT_MIB applied to documents and
// plugin exchange files.
HOXCM_API std::size_t MaxFileSize(FileKind kind);

// The whole content of the file at `path`, symbolic links followed. Throws
// FileError when the path is missing, names anything but a regular file (a
// directory, FIFO, device or socket; a FIFO is never waited on), is a loop
// of links, cannot be read, or holds more than MaxFileSize(kind) bytes.
HOXCM_API std::string ReadFile(const std::string& path, FileKind kind);
// The same, but empty when the path does not exist (it, or a directory on the
// way, is missing).
HOXCM_API std::optional<std::string> ReadFileIfExists(const std::string& path, FileKind kind);

// True only when `path` names a regular file (symbolic links followed). When
// its status cannot be read (it is missing, among others), false, and
// `problem`, when given, receives why.
HOXCM_API bool IsRegularFile(const std::string& path, std::optional<FileError>* problem = nullptr);
// True only when `path` names a directory (symbolic links followed).
HOXCM_API bool IsDirectory(const std::string& path);

// Whether a replaced file must survive a crash of the host.
enum class Durability : int {
  // Readers see the old or the whole new file; after a crash either may be
  // there. For files that live for one plugin run.
  kAtomic,
  // Additionally flushed before the rename, and the directory after it, so
  // the new file is on disk when the call returns.
  kDurable,
};

// Replaces the file at `path` with `content` so that a reader sees either the
// old file or the whole new one: the text goes to a new temporary file beside
// it (created exclusively, never through a planted link), takes exactly
// `mode` (no umask), and is renamed over `path`. A symbolic link at `path` is
// replaced, not followed. The directory must exist. Throws FileError (the
// temporary file removed).
HOXCM_API void WriteFileAtomically(const std::string& path, std::string_view content, mode_t mode,
                                   Durability durability);

// Removes the file (or link) at `path`: 0, or the errno value of the
// failure (ENOENT when there was nothing to remove).
HOXCM_API int RemoveFile(const std::string& path);

// Creates `directory` and its missing parents; each directory created gets
// exactly `mode`. Throws FileError, also when a part of the path exists but
// is not a directory.
HOXCM_API void CreateDirectories(const std::string& directory, mode_t mode = 0755);

// What ListFiles finds below a directory.
struct HOXCM_API DirectoryListing {
  struct Problem {
    std::string path;
    std::string reason;
  };
  std::vector<std::string> files;       // full paths, sorted bytewise
  std::vector<std::string> notEntered;  // directories at maxDepth, sorted
  // Directories that could not be read, and entries that match the suffix
  // but are not regular files, in walk order.
  std::vector<Problem> problems;
};

struct HOXCM_API ListOptions {
  // Only names ending in it (for example ".json"); empty: every name.
  std::string suffix;
  // Enter symbolic links to directories. A directory reached twice (a loop
  // of links) is entered once.
  bool followDirectoryLinks = false;
  // Directories this deep (1: directly below the listed one) are not
  // entered but reported in `notEntered`; 0: no limit.
  int maxDepth = 0;
};

// The regular files below `directory`, at any depth, in sorted order, so that
// every caller sees the same order on every host. A missing directory is an
// error entry, not an exception.
HOXCM_API DirectoryListing ListFiles(const std::string& directory, const ListOptions& options = {});

}  // namespace HoxPlatform
