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
#include <unordered_map>
#include <vector>

#include <hoxcm/export.h>

// Allocating printf: returns a malloc'd buffer the caller frees; throws
// std::bad_alloc when memory runs out. `length` (may be null) receives the
// length of the text without its terminator.
HOXCM_API char* Str_Asprintf(std::size_t* length, const char* format, ...);
HOXCM_API char* Str_Vasprintf(std::size_t* length, const char* format, va_list args);

namespace HostCtl::Lib {

// Base of every platform and library exception: carries the message text.
class HOXCM_API HostCtlException : public std::exception {
 public:
  explicit HostCtlException(const char* message);
  explicit HostCtlException(std::string message);
  const char* what() const noexcept override;

 private:
  std::string message_;
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

// Throws T(code, formatted message). An unknown code is a programming error
// and raises std::out_of_range instead.
template <typename T, typename... Args>
[[noreturn]] void ThrowException(CMErrorCodes code, const Args&... args) {
  const char* format = ErrorMessageTable().at(code);
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-security"
#pragma GCC diagnostic ignored "-Wformat-extra-args"
  std::unique_ptr<char, detail::FreeDeleter> text(
      Str_Asprintf(nullptr, format, detail::FormatArg(args)...));
#pragma GCC diagnostic pop
  throw T(static_cast<int>(code), text.get());
}

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
