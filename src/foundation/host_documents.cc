// Document utilities that depend on the host: its identity, maintenance mode,
// and documents built from configuration-store rows.
#include <hoxcm/documents.h>

#include <stdexcept>

#include <hoxcm/host.h>
#include <hoxcm/schema_store.h>

namespace HoxConfigManager {

std::string GetBIOSUUID() { throw std::logic_error("not implemented"); }
void CreateMergedDocument(const Document&, Document&) { throw std::logic_error("not implemented"); }
bool IsMaintenanceModeEnabled() { throw std::logic_error("not implemented"); }
void CreateDocumentFromMap(const HoxConfigStore::ConfigMapList&, const std::shared_ptr<HoxSchemaStore::SchemaObject>&,
                           Document&) {
  throw std::logic_error("not implemented");
}
HoxConfigStore::ConfigMapList FilterSolutionUserInstances(const HoxConfigStore::ConfigMapList&,
                                                          const std::shared_ptr<HoxSchemaStore::SchemaObject>&) {
  throw std::logic_error("not implemented");
}
void GetExternalDefaultUserConfig(const HoxConfigStore::ConfigStoreObjectId&,
                                  const std::shared_ptr<HoxConfigStore::DBStore>&,
                                  const std::shared_ptr<HoxSchemaStore::SchemaObject>&, Document&) {
  throw std::logic_error("not implemented");
}
void CreateMergedBootDocument(const std::string&, const std::string&) { throw std::logic_error("not implemented"); }

}  // namespace HoxConfigManager
