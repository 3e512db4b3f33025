// What a key's schema says of one value, for everything that shows values:
// the one place that decides whether a value is sensitive.
//
// A value is sensitive when any schema that governs it says
// "sensitive": true: the schema of the value itself, any schema of an
// enclosing object or array, a branch of an "allOf", "anyOf" or "oneOf"
// (any branch: a variant that would hold a secret hides the value whatever
// variant it matches), the target of a "$ref", a "patternProperties" entry
// whose pattern matches the member's name (or cannot be used), an
// "additionalProperties" or "items" schema. References are read as the
// validator reads them (foundation/schema_refs.h), against the root the view
// was made with.
//
// A view points into the schema it was made from, which must outlive it.
// Views are values; they may be used from any thread.
#pragma once

#include <string_view>
#include <vector>

#include <hoxcm/documents.h>

namespace HoxConfigManager::compare {

class SchemaView {
 public:
  // The view of `node`, a part of `root` (references resolve against
  // `root`); `insideSecret` when an enclosing value is sensitive.
  SchemaView(const rapidjson::Value& root, const rapidjson::Value& node, bool insideSecret = false);

  bool Sensitive() const { return sensitive_; }
  // The view of member `name` of an object this view describes.
  SchemaView Member(std::string_view name) const;
  // The view of element `index` of an array this view describes.
  SchemaView Element(rapidjson::SizeType index) const;
  // The "type" the governing schemas declare (the first found), or null.
  const rapidjson::Value* Type() const;
  // The schema of the value itself with its references followed (the
  // first governing schema), or null when none describes it.
  const rapidjson::Value* Primary() const { return nodes_.empty() ? nullptr : nodes_.front(); }

 private:
  SchemaView(const rapidjson::Value& root, const std::vector<const rapidjson::Value*>& nodes, bool insideSecret);
  void Add(const rapidjson::Value* node, int depth);

  const rapidjson::Value* root_;
  // The schemas that govern the value: each one after its references, with
  // the branches of its combinators.
  std::vector<const rapidjson::Value*> nodes_;
  bool sensitive_ = false;
};

// True when the bare schema node of a value, without its root and enclosing
// schemas, may not show that the value or a part of it is sensitive: `root`
// marks something sensitive and has references, combinators, or a sensitive
// schema that is not of a scalar type (its members would be described
// without the mark).
bool NeedsRootToTellSecrets(const rapidjson::Value& root);

}  // namespace HoxConfigManager::compare
