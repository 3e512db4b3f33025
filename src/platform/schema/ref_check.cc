#include "platform/schema/ref_check.h"

#include <set>
#include <vector>

namespace JsonValidator::detail {
namespace {

using rapidjson::Value;

// In draft 4 a node with "$ref" is nothing but the reference: following a
// chain of such nodes without ever reaching a real schema is a loop.
std::string FollowChain(const Value& root, const Value& start) {
  std::set<const Value*> visited;
  const Value* node = &start;
  while (node != nullptr && node->IsObject()) {
    auto ref = node->FindMember("$ref");
    if (ref == node->MemberEnd() || !ref->value.IsString()) return std::string();
    if (!visited.insert(node).second) {
      return std::string("the references through \"") + ref->value.GetString() + "\" form a loop";
    }
    const char* target = ref->value.GetString();
    if (target[0] != '#') return std::string();  // remote: the engine refuses it
    rapidjson::Pointer pointer(target, ref->value.GetStringLength());
    node = pointer.IsValid() ? pointer.Get(root) : nullptr;
  }
  return std::string();
}

std::string Scan(const Value& root, const Value& node) {
  if (node.IsObject()) {
    if (node.HasMember("$ref")) {
      std::string loop = FollowChain(root, node);
      if (!loop.empty()) return loop;
    }
    for (const auto& m : node.GetObject()) {
      std::string loop = Scan(root, m.value);
      if (!loop.empty()) return loop;
    }
  } else if (node.IsArray()) {
    for (const auto& v : node.GetArray()) {
      std::string loop = Scan(root, v);
      if (!loop.empty()) return loop;
    }
  }
  return std::string();
}

}  // namespace

std::string FindReferenceLoop(const Value& schema) { return Scan(schema, schema); }

const Value* ResolveLocalReference(const Value& root, const Value* node) {
  constexpr int kMaxRefHops = 32;
  for (int hop = 0; node != nullptr && node->IsObject() && hop < kMaxRefHops; ++hop) {
    auto ref = node->FindMember("$ref");
    if (ref == node->MemberEnd()) return node;
    if (!ref->value.IsString() || ref->value.GetString()[0] != '#') return nullptr;
    rapidjson::Pointer pointer(ref->value.GetString(), ref->value.GetStringLength());
    node = pointer.IsValid() ? pointer.Get(root) : nullptr;
  }
  return node;
}

}  // namespace JsonValidator::detail
