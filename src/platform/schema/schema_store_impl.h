// The schema store of one schema directory, and the process-wide stores per
// host root.
//
// A DirectorySchemaStore reads every schema file once, at construction, and
// is immutable afterwards: it may be shared between threads.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <vector>

#include <hoxcm/schema_store.h>

#include "platform/schema/schema_file.h"

namespace HoxSchemaStore::detail {

class DirectorySchemaStore final : public SchemaStore {
 public:
  // Loads <directory>/<component>/<group>/<key>.json. A file that fails to
  // load is recorded (GetLoadErrors) and logged; the others are kept.
  explicit DirectorySchemaStore(const std::string& directory);

  std::shared_ptr<SchemaObject> Find(const std::string& component, const std::string& group,
                                     const std::string& key) const override;
  std::string GetSchemaInfo(const std::string& component, const std::string& group,
                            const std::string& key) const override;
  std::set<SchemaObjectId> GetMutableDefaultIds() const override;
  std::vector<SchemaObjectId> ListKeys() const override;
  std::vector<std::string> GetLoadErrors() const override { return loadErrors_; }

  std::shared_ptr<KeySchema> FindKey(const SchemaObjectId& id) const;

 private:
  std::map<SchemaObjectId, std::shared_ptr<KeySchema>> keys_;
  std::vector<std::string> loadErrors_;
};

// The schema directory of the current root.
std::string SchemaDirectory();

// A store loaded from `directory`, outside the per-root cache; null when the
// directory cannot be read.
std::shared_ptr<DirectorySchemaStore> LoadStore(const std::string& directory);

}  // namespace HoxSchemaStore::detail
