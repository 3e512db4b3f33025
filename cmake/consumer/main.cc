// A management daemon's view of the library: only the public headers.
#include <hoxcm/documents.h>
#include <hoxcm/errors.h>
#include <hoxcm/task.h>

#include <cstdio>
#include <cstring>

int main() {
  using namespace HoxConfigManager;
  int failures = 0;
  try {
    ParseDocument("{", *CreateDocument());
    ++failures;
  } catch (const InvalidArgumentException& e) {
    if (e.GetErrorCode() != 2080) ++failures;
  }
  auto doc = CreateDocumentFromString(R"({"a":[1,2,2]})");
  Document other;
  ParseDocument(R"([2,1,2])", other);
  if (!IsEqualArray((*doc)["a"], other)) ++failures;
  try {
    (void)(*doc)["a"].GetString();  // a type assertion throws, never aborts
    ++failures;
  } catch (const HoxConfigStore::ConfigStoreException& e) {
    if (e.GetErrorCode() != 2000 || std::strcmp(e.what(), "Invalid JSON") != 0) ++failures;
  }
  TaskPluginMonitor monitor(TaskHandle::Dummy());
  if (monitor.IsAborted()) ++failures;
  std::printf("%s\n", failures == 0 ? "consumer ok" : "consumer FAILED");
  return failures == 0 ? 0 : 1;
}
