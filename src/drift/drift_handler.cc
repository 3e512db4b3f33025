#include <hoxcm/drift.h>

namespace HoxConfigManager {

namespace {
// Indexed by ACTION.
constexpr const char* kActionNames[] = {"SET", "ADD", "DELETE"};
}  // namespace

const char* ActionName(ACTION action) {
  const int index = static_cast<int>(action);
  return index >= 0 && index < 3 ? kActionNames[index] : "";
}

DriftHandler::DriftHandler(bool consolidatedActionRequired, bool createDriftObject, bool perProperty)
    : consolidatedActionRequired_(consolidatedActionRequired),
      createDriftObject_(createDriftObject),
      perProperty_(perProperty) {}

DriftHandler::~DriftHandler() = default;

void DriftHandler::Add(const Value&, const HoxConfigStore::ConfigStoreObjectId&,
                       const std::shared_ptr<HoxSchemaStore::SchemaObject>&, const std::string&) {}
void DriftHandler::Set(const Value&, const Value&, const HoxConfigStore::ConfigStoreObjectId&,
                       const std::shared_ptr<HoxSchemaStore::SchemaObject>&, const std::string&, const Value&) {}
void DriftHandler::Delete(const Value&, const HoxConfigStore::ConfigStoreObjectId&,
                          const std::shared_ptr<HoxSchemaStore::SchemaObject>&, const std::string&) {}
void DriftHandler::PropertyDrift(const Value&, const Value&, const Value&, const std::string&, ACTION) {}

}  // namespace HoxConfigManager
