// Error codes and the exception family of the configuration manager.
//
// Every failure the library reports to its caller is thrown through
// ThrowException<T>(code, args...), which formats the code's fixed message.
// Plugin failures are not thrown: they travel as ErrorInfo records inside the
// operations' results. The message table is immutable and may be read from any
// thread.
#pragma once

#include <cstdarg>
#include <cstddef>
#include <cstdlib>
#include <exception>
#include <memory>
#include <string>
#include <type_traits>
#include <utility>
#include <unordered_map>
#include <vector>

#include <hoxcm/export.h>

// Allocating printf: returns a malloc'd buffer the caller frees; throws
// std::bad_alloc when memory runs out. `length` (may be null) receives the
// length of the text without its terminator.
HOXCM_API char* Str_Asprintf(std::size_t* length, const char* format, ...);
HOXCM_API char* Str_Vasprintf(std::size_t* length, const char* format, va_list args);

namespace HostCtl::Lib {

// Where the fault behind an exception lies, when the thrower knows it. It
// travels beside the code and the message and never changes them, so that a
// front end can say "file:line:column" or "file: /document/path".
struct HOXCM_API ErrorLocation {
  std::string file;          // the file that was read; empty when the text came from elsewhere
  std::size_t offset = 0;    // byte offset of the fault in the text
  std::size_t line = 0;      // 1-based line of the fault; 0 when not known
  std::size_t column = 0;    // 1-based column on that line, in characters
  std::string reason;        // the parser's reason, or the system's for a file that cannot be read
  std::string documentPath;  // the faulty value's place in the document ("/network/dns/config"); may be empty
};

// Base of every platform and library exception: carries the message text and,
// optionally, the location of the fault.
class HOXCM_API HostCtlException : public std::exception {
 public:
  explicit HostCtlException(const char* message);
  explicit HostCtlException(std::string message);
  const char* what() const noexcept override;
  // Null unless the thrower attached a location.
  const ErrorLocation* GetLocation() const noexcept { return location_.get(); }
  void SetLocation(ErrorLocation location);

 private:
  std::string message_;
  std::shared_ptr<const ErrorLocation> location_;  // shared: copies of a thrown exception stay cheap
};

}  // namespace HostCtl::Lib

namespace HoxConfigStore {

// The configuration store's exception: a message and an integer code.
class HOXCM_API ConfigStoreException : public HostCtl::Lib::HostCtlException {
 public:
  static constexpr int kConfigStoreError = 2000;
  ConfigStoreException(int code, const char* message);
  explicit ConfigStoreException(const char* message);  // code 2000
  int GetErrorCode() const;

 private:
  int code_;
};

}  // namespace HoxConfigStore

namespace HoxConfigManager {

enum CMErrorCodes : int {
  ConfigStoreConnectFailed = 2001,
  SchemaObjectNotFound = 2021,
  NotSingletonObject = 2022,
  EmptyDesiredDocument = 2023,
  InvalidApplyInput = 2024,
  ImpactResultNotApplicable = 2025,
  HostNotInMaintenanceMode = 2026,
  DeleteDefaultNotSupported = 2027,
  NotNonSingletonObject = 2028,
  PendingDesiredConfiguration = 2029,
  JsonParseFailed = 2080,
  PluginSchemaInvalid = 2081,
  PluginVersionNotSupported = 2082,
  PluginDependencyGraphFailed = 2083,
  InvalidKeyValue = 2084,
  SchemaStoreAccessFailed = 2180,
  NotUserConfiguration = 2181,
};

// Code of the plugin framework's own failures (launcher, manifest checks).
// It has no entry in the message table: those failures carry their own text.
constexpr int kPluginFailureCode = 3000;

class HOXCM_API ConfigManagerException : public HoxConfigStore::ConfigStoreException {
 public:
  using ConfigStoreException::ConfigStoreException;
};
class HOXCM_API HostNotInMM final : public ConfigManagerException {
 public:
  using ConfigManagerException::ConfigManagerException;
};
class HOXCM_API HostNotInNBM final : public ConfigManagerException {
 public:
  using ConfigManagerException::ConfigManagerException;
};
class HOXCM_API InvalidImpact final : public ConfigManagerException {
 public:
  using ConfigManagerException::ConfigManagerException;
};
class HOXCM_API SchemaNotFound final : public ConfigManagerException {
 public:
  using ConfigManagerException::ConfigManagerException;
};
class HOXCM_API InvalidArgumentException final : public ConfigManagerException {
 public:
  using ConfigManagerException::ConfigManagerException;
};

// The fixed message of every CMErrorCodes value, built once at load time.
HOXCM_API const std::unordered_map<CMErrorCodes, const char*>& ErrorMessageTable();

namespace detail {
// Message arguments are passed to a printf-style formatter: only C strings
// and integers may travel there.
inline const char* FormatArg(const std::string& s) { return s.c_str(); }
inline const char* FormatArg(const char* s) { return s; }
template <typename T, typename = std::enable_if_t<std::is_integral_v<T>>>
inline T FormatArg(T v) { return v; }
struct FreeDeleter {
  void operator()(char* p) const { std::free(p); }
};
}  // namespace detail

using HostCtl::Lib::ErrorLocation;

namespace detail {
// T(code, formatted message); an unknown code raises std::out_of_range.
template <typename T, typename... Args>
T MakeException(CMErrorCodes code, const Args&... args) {
  const char* format = ErrorMessageTable().at(code);
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-security"
#pragma GCC diagnostic ignored "-Wformat-extra-args"
  std::unique_ptr<char, FreeDeleter> text(Str_Asprintf(nullptr, format, FormatArg(args)...));
#pragma GCC diagnostic pop
  return T(static_cast<int>(code), text.get());
}
}  // namespace detail

// Throws T(code, formatted message). An unknown code is a programming error
// and raises std::out_of_range instead.
template <typename T, typename... Args>
[[noreturn]] void ThrowException(CMErrorCodes code, const Args&... args) {
  throw detail::MakeException<T>(code, args...);
}

// The same, with the location of the fault attached: code and message are
// those of ThrowException.
template <typename T, typename... Args>
[[noreturn]] void ThrowExceptionAt(ErrorLocation location, CMErrorCodes code, const Args&... args) {
  T exception = detail::MakeException<T>(code, args...);
  exception.SetLocation(std::move(location));
  throw exception;
}

// Gives a fault in a document's structure (ConfigStoreException 2000 "Invalid
// JSON", or 2084) the place where it was found, `documentPath`, unless a
// deeper level of the walk already gave it one. Code and text stay as they
// are; other exceptions (a store failure with code 2000 among them) are left
// alone. Called only on the failure path: the walks pay nothing for it.
HOXCM_API void LocateStructuralFault(HoxConfigStore::ConfigStoreException& error, std::string documentPath);

// A structured, localisable error reported by a plugin or an operation. An
// empty `id` means success.
struct HOXCM_API ErrorInfo {
  std::string id;
  std::vector<std::string> args;
  std::string message;

  ErrorInfo() = default;
  ErrorInfo(std::string id, std::vector<std::string> args, std::string message = {})
      : id(std::move(id)), args(std::move(args)), message(std::move(message)) {}
  bool operator==(const ErrorInfo& o) const { return id == o.id && args == o.args && message == o.message; }
  bool operator!=(const ErrorInfo& o) const { return !(*this == o); }

  // JSON form, see docs/plugin-protocol.md. Serialize never fails;
  // Deserialize and Load throw ConfigStoreException(2000, "Invalid JSON")
  // on malformed text; Load throws HoxPlatform::FileError (a
  // HostCtlException) when the file cannot be read.
  std::string Serialize() const;
  void Deserialize(const std::string& text);
  static ErrorInfo Load(const std::string& path);
};

// Every error found for one field of a validated document.
struct HOXCM_API ValidationErrorInfo {
  std::string field;
  std::vector<ErrorInfo> errors;
};

}  // namespace HoxConfigManager
