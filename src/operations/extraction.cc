// Configuration extraction: the store's contents as host documents.
#include <hoxcm/operations.h>

#include <stdexcept>

namespace HoxConfigManager {

Document ExtractDesiredConfiguration() { throw std::logic_error("not implemented"); }
Document ExtractUserConfiguration(bool) { throw std::logic_error("not implemented"); }
Document ExtractCurrentConfiguration() { throw std::logic_error("not implemented"); }
Document ExtractSmartnicConfiguration() { throw std::logic_error("not implemented"); }
Document ExportDocument() { throw std::logic_error("not implemented"); }
void ProcessAutoConfig(Value&, const Value&, const std::string&, Allocator&) {
  throw std::logic_error("not implemented");
}
void ProcessConfigMapList(Document&, const HoxConfigStore::ConfigMapList&,
                          const std::shared_ptr<HoxSchemaStore::SchemaStore>&, DocumentType) {
  throw std::logic_error("not implemented");
}

}  // namespace HoxConfigManager
