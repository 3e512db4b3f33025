#include "foundation/compare/schema_view.h"

#include <algorithm>

#include "foundation/compare/value_compare.h"
#include "foundation/pattern.h"
#include "foundation/schema_refs.h"

namespace HoxConfigManager::compare {
namespace {

using rapidjson::Value;

// Combinators that reach back through references may fan out without end;
// past these bounds a view stops reasoning and counts the value as secret.
constexpr std::size_t kMaxGoverning = 64;
constexpr int kMaxNesting = 16;

const Value* Find(const Value& node, const char* name) {
  auto it = node.FindMember(name);
  return it == node.MemberEnd() ? nullptr : &it->value;
}

}  // namespace

SchemaView::SchemaView(const Value& root, const Value& node, bool insideSecret)
    : root_(&root), sensitive_(insideSecret) {
  Add(&node, 0);
}

SchemaView::SchemaView(const Value& root, const std::vector<const Value*>& nodes, bool insideSecret)
    : root_(&root), sensitive_(insideSecret) {
  for (const Value* node : nodes) Add(node, 0);
}

void SchemaView::Add(const Value* node, int nesting) {
  // A reference that leads nowhere governs nothing: the validator refuses
  // such a schema.
  node = HoxConfigManager::detail::FollowReferences(*root_, node);
  if (node == nullptr || !node->IsObject()) return;
  if (std::find(nodes_.begin(), nodes_.end(), node) != nodes_.end()) return;
  if (nodes_.size() == kMaxGoverning || nesting > kMaxNesting) {
    sensitive_ = true;
    return;
  }
  nodes_.push_back(node);
  const Value* flag = Find(*node, "sensitive");
  if (flag != nullptr && flag->IsTrue()) sensitive_ = true;
  for (const char* combinator : {"allOf", "anyOf", "oneOf"}) {
    const Value* branches = Find(*node, combinator);
    if (branches == nullptr || !branches->IsArray()) continue;
    for (const Value& branch : branches->GetArray()) Add(&branch, nesting + 1);
  }
}

SchemaView SchemaView::Member(std::string_view name) const {
  std::vector<const Value*> children;
  const Value key(rapidjson::StringRef(name.data(), static_cast<rapidjson::SizeType>(name.size())));
  for (const Value* node : nodes_) {
    bool described = false;
    const Value* properties = Find(*node, "properties");
    if (properties != nullptr && properties->IsObject()) {
      auto it = properties->FindMember(key);
      if (it != properties->MemberEnd()) {
        children.push_back(&it->value);
        described = true;
      }
    }
    const Value* patterns = Find(*node, "patternProperties");
    if (patterns != nullptr && patterns->IsObject()) {
      for (const auto& entry : patterns->GetObject()) {
        // A pattern that cannot be used is taken to match: it may be the
        // one that marks the member secret.
        auto pattern = HoxConfigManager::detail::SchemaPattern::Get(NameOf(entry.name));
        if (pattern && !pattern->Search(name)) continue;
        children.push_back(&entry.value);
        described = true;
      }
    }
    const Value* extra = Find(*node, "additionalProperties");
    if (!described && extra != nullptr && extra->IsObject()) children.push_back(extra);
  }
  return SchemaView(*root_, children, sensitive_);
}

SchemaView SchemaView::Element(rapidjson::SizeType index) const {
  std::vector<const Value*> children;
  for (const Value* node : nodes_) {
    const Value* items = Find(*node, "items");
    if (items != nullptr && items->IsObject()) {
      children.push_back(items);
    } else if (items != nullptr && items->IsArray() && index < items->Size()) {
      children.push_back(&(*items)[index]);
    } else if (const Value* extra = Find(*node, "additionalItems"); extra != nullptr && extra->IsObject()) {
      children.push_back(extra);
    }
  }
  return SchemaView(*root_, children, sensitive_);
}

const Value* SchemaView::Type() const {
  for (const Value* node : nodes_) {
    if (const Value* type = Find(*node, "type")) return type;
  }
  return nullptr;
}

bool NeedsRootToTellSecrets(const Value& root) {
  bool sensitive = false, tangled = false, secretContainer = false;
  HoxConfigManager::detail::ForEachSubschema(root, [&](const Value& node) {
    for (const char* keyword : {"$ref", "allOf", "anyOf", "oneOf"}) tangled = tangled || node.HasMember(keyword);
    const Value* flag = Find(node, "sensitive");
    if (flag == nullptr || !flag->IsTrue()) return;
    sensitive = true;
    const Value* type = Find(node, "type");
    const std::string_view kind = type != nullptr && type->IsString() ? NameOf(*type) : std::string_view("object");
    secretContainer = secretContainer || kind == "object" || kind == "array";
  });
  return sensitive && (tangled || secretContainer);
}

}  // namespace HoxConfigManager::compare
