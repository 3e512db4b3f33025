#include "hoxcfg/common.h"

#include <cstdio>
#include <cstdlib>
#include <exception>
#include <iostream>
#include <unistd.h>

#include <hoxcm/errors.h>
#include <hoxcm/files.h>

namespace hoxcfg {

void ApplyRoot(const GlobalOptions& options) {
  if (!options.root.empty()) ::setenv("HOX_ROOT", options.root.c_str(), 1);
}

int RunCommand(const std::function<int()>& body) {
  try {
    return body();
  } catch (const HoxConfigStore::ConfigStoreException& e) {
    std::cerr << "hoxcfg: error " << e.GetErrorCode() << ": " << e.what() << std::endl;
  } catch (const HoxConfigManager::ErrorInfo& e) {
    std::cerr << "hoxcfg: error " << e.id << ": " << e.message << std::endl;
  } catch (const CommandError& e) {
    std::cerr << "hoxcfg: error " << e.code << ": " << e.message << std::endl;
  } catch (const std::exception& e) {
    std::cerr << "hoxcfg: error: " << e.what() << std::endl;
  }
  return kExitError;
}

void Run(GlobalOptions& options, const std::function<int()>& body) {
  ApplyRoot(options);
  // The library logs every item it handles at information level; on a
  // terminal that drowns the answer. The tool is quiet unless HOX_LOG_LEVEL
  // asks for more.
  ::setenv("HOX_LOG_LEVEL", "-1", 0);
  options.exitCode = RunCommand(body);
}

std::string FormatJson(const rapidjson::Value& value, const GlobalOptions& options) {
  rapidjson::StringBuffer buffer;
  if (!options.compact && ::isatty(STDOUT_FILENO)) {
    rapidjson::PrettyWriter<rapidjson::StringBuffer> writer(buffer);
    writer.SetIndent(' ', 2);
    value.Accept(writer);
  } else {
    rapidjson::Writer<rapidjson::StringBuffer> writer(buffer);
    value.Accept(writer);
  }
  return std::string(buffer.GetString(), buffer.GetSize()) + "\n";
}

void WriteOutput(const std::string& text, const std::string& path) {
  if (path.empty() || path == "-") {
    std::cout << text << std::flush;
    return;
  }
  try {
    HoxPlatform::WriteFileAtomically(path, text, 0644, HoxPlatform::Durability::kDurable);
  } catch (const HoxPlatform::FileError& e) {
    throw CommandError{kExitError, e.what()};
  }
}

}  // namespace hoxcfg
