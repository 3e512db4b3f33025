// One directed pass of the drift walk and the comparers it uses. Internal to
// the drift engine; ComputeDrift (include/hoxcm/drift.h) runs two passes.
//
// Not thread-safe: a pass belongs to the thread that runs it.
#pragma once

#include <memory>

#include <hoxcm/config_store.h>
#include <hoxcm/drift.h>
#include <hoxcm/schema_store.h>

namespace HoxConfigManager {

// Walks `source` (components, groups, keys, in document order) and compares
// each item with the same item of `other`. The forward pass (`reverse`
// false) reports items to add and change; the reverse pass (`source` is the
// host's configuration) reports items the desired document lacks, compared
// against their default user configuration. `connection` is opened on first
// need when null.
void computeComponents(const Value& source, const Value& other, Allocator& allocator,
                       const std::shared_ptr<HoxSchemaStore::SchemaStore>& store, DriftHandler& handler,
                       std::shared_ptr<HoxConfigStore::DBStore>& connection, bool reverse);

}  // namespace HoxConfigManager
