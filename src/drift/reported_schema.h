// The schema a drift handler is given with a drifted property when the key's
// schema marks anything sensitive. A handler may show the drifted values
// (the compliance report does), and it sees neither the key's root nor the
// enclosing schemas: the node it gets must carry everything that decides
// masking. So the walk hands it a schema built for the drifted values alone,
// from the one resolution of sensitivity (SchemaView).
//
// Not thread-safe: the scratch document belongs to one walk.
#pragma once

#include <hoxcm/documents.h>

#include "foundation/compare/schema_view.h"

namespace HoxConfigManager::detail {

// Builds in `scratch` (cleared first) and returns a schema for `desired` and
// `host` (either may be null) as `view` describes them: the annotations of
// the value's own schema ("type", always a single string; triggers,
// defaults) and, below, such a schema for each member and element present.
// Whatever the view makes sensitive is marked "sensitive": true and not
// described further. The result holds no reference, so it means the same
// without the key's root. `node` stands in when the view knows no schema.
const Value& ReportedSchema(const compare::SchemaView& view, const Value& node, const Value& desired,
                           const Value& host, Document& scratch);

}  // namespace HoxConfigManager::detail
