// Key schema files: each is refused with a reason or loads into a key whose
// schema the validator then applies to a few documents.
#include <hoxcm/documents.h>
#include <hoxcm/schema_store.h>

#include "fuzz/fuzz_support.h"
#include "platform/schema/schema_file.h"

using namespace HoxConfigManager;

namespace {

// Documents of the kinds a key holds: empty, one instance, several.
const char* const kInstances[] = {
    "{}",
    R"({"name": "eth0", "mtu": 1500, "enabled": true, "servers": ["10.0.0.1"]})",
    R"([{"name": "a", "value": 1}, {"name": "b", "value": -2.5, "extra": null}])",
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string path = hoxcm_fuzz::WriteInput("key.json", hoxcm_fuzz::Text(data, size));
  const HoxSchemaStore::SchemaObjectId id("network", "interfaces", "vnic");
  std::string error;
  std::shared_ptr<HoxSchemaStore::detail::KeySchema> key;
  hoxcm_fuzz::Refusable([&] { key = HoxSchemaStore::detail::LoadSchemaFile(path, id, error); });
  if (!key) return 0;
  std::vector<std::string> operations;
  bool propertyLevel = false;
  key->GetRebootOperations(operations, propertyLevel);
  key->GetMaintenanceModeOperations(operations, propertyLevel);
  for (const char* text : kInstances) {
    Document instance;
    ParseDocument(text, instance);
    hoxcm_fuzz::Refusable([&] {
      rapidjson::Document findings;
      JsonValidator::Validate(key->GetJsonSchema(), instance, findings, {}, "");
      JsonValidator::Validate(key->GetInstanceSchema(), instance, findings, {}, "");
    });
  }
  return 0;
}
