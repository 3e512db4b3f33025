#include "foundation/schema_refs.h"

#include <unordered_set>
#include <vector>

namespace HoxConfigManager::detail {
namespace {

bool Fail(std::string* why, const char* reason) {
  if (why != nullptr) *why = reason;
  return false;
}

int HexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

// One token of a reference, decoded: "~1" and "~0" first, then "%XX" (the
// order the schema engine decodes them in, so both read a token alike).
bool DecodeToken(std::string_view raw, std::string& token, std::string* why) {
  if (raw.empty()) return Fail(why, "it has an empty token");
  std::string unescaped;
  for (std::size_t i = 0; i < raw.size(); ++i) {
    if (raw[i] != '~') {
      unescaped.push_back(raw[i]);
    } else if (i + 1 < raw.size() && (raw[i + 1] == '0' || raw[i + 1] == '1')) {
      unescaped.push_back(raw[++i] == '0' ? '~' : '/');
    } else {
      return Fail(why, "\"~\" is not followed by 0 or 1");
    }
  }
  token.clear();
  for (std::size_t i = 0; i < unescaped.size(); ++i) {
    if (unescaped[i] != '%') {
      token.push_back(unescaped[i]);
      continue;
    }
    const bool complete = i + 2 < unescaped.size();
    const int high = complete ? HexDigit(unescaped[i + 1]) : -1;
    const int low = complete ? HexDigit(unescaped[i + 2]) : -1;
    if (high < 0 || low < 0) return Fail(why, "\"%\" is not followed by two hexadecimal digits");
    token.push_back(static_cast<char>(high * 16 + low));
    i += 2;
  }
  return true;
}

const Value* Step(const Value& node, const std::string& token, std::string* why) {
  if (node.IsObject()) {
    auto it = node.FindMember(Value(rapidjson::StringRef(token.data(), static_cast<rapidjson::SizeType>(token.size()))));
    if (it == node.MemberEnd()) {
      Fail(why, "it names a member that does not exist");
      return nullptr;
    }
    return &it->value;
  }
  if (node.IsArray()) {
    // Decimal, without leading zeros: the one spelling every reader agrees on.
    const bool digits = token.find_first_not_of("0123456789") == std::string::npos;
    if (!digits || (token.size() > 1 && token[0] == '0') || token.size() > 9 ||
        std::stoul(token) >= node.Size()) {
      Fail(why, "it names an array element that does not exist");
      return nullptr;
    }
    return &node[static_cast<rapidjson::SizeType>(std::stoul(token))];
  }
  Fail(why, "it leads through a value that is neither an object nor an array");
  return nullptr;
}

const Value* Member(const Value& node, const char* name) {
  auto it = node.FindMember(name);
  return it == node.MemberEnd() ? nullptr : &it->value;
}

class SubschemaWalk {
 public:
  SubschemaWalk(const Value& root, const std::function<void(const Value&)>& visit) : root_(root), visit_(visit) {}

  void Walk(const Value& node) {
    if (!node.IsObject() || !seen_.insert(&node).second) return;
    visit_(node);
    for (const char* keyword : {"properties", "patternProperties", "definitions", "dependencies"}) {
      const Value* map = Member(node, keyword);
      if (map == nullptr || !map->IsObject()) continue;
      for (const auto& m : map->GetObject()) Walk(m.value);
    }
    for (const char* keyword : {"additionalProperties", "additionalItems", "not", "contains", "items"}) {
      if (const Value* child = Member(node, keyword)) Walk(*child);
    }
    for (const char* keyword : {"items", "allOf", "anyOf", "oneOf"}) {
      const Value* list = Member(node, keyword);
      if (list == nullptr || !list->IsArray()) continue;
      for (const Value& element : list->GetArray()) Walk(element);
    }
    const Value* ref = Member(node, "$ref");
    if (ref != nullptr && ref->IsString()) {
      if (const Value* target = ResolveReference(root_, std::string_view(ref->GetString(), ref->GetStringLength()))) {
        Walk(*target);
      }
    }
  }

 private:
  const Value& root_;
  const std::function<void(const Value&)>& visit_;
  std::unordered_set<const Value*> seen_;
};

// "/" and `name` escaped as a pointer token; "%" too when it goes into a
// reference, whose tokens are also percent-decoded.
void AppendToken(std::string& out, std::string_view name, bool percent) {
  out.push_back('/');
  for (char c : name) {
    if (c == '~') {
      out += "~0";
    } else if (c == '/') {
      out += "~1";
    } else if (c == '%' && percent) {
      out += "%25";
    } else {
      out.push_back(c);
    }
  }
}

std::string Quoted(const Value& ref) { return "\"" + std::string(ref.GetString(), ref.GetStringLength()) + "\""; }

}  // namespace

const Value* ResolveReference(const Value& root, std::string_view ref, std::string* why) {
  if (ref.empty() || ref.front() != '#') {
    Fail(why, "it refers to another document, which is never fetched");
    return nullptr;
  }
  std::string_view rest = ref.substr(1);
  if (!rest.empty() && rest.front() != '/') {
    Fail(why, "it is not a JSON pointer (\"#/...\")");
    return nullptr;
  }
  const Value* node = &root;
  std::string token;
  while (!rest.empty()) {
    rest.remove_prefix(1);
    const std::size_t end = rest.find('/');
    if (!DecodeToken(rest.substr(0, end), token, why)) return nullptr;
    node = Step(*node, token, why);
    if (node == nullptr) return nullptr;
    rest = end == std::string_view::npos ? std::string_view() : rest.substr(end);
  }
  return node;
}

const Value* FollowReferences(const Value& root, const Value* node) {
  for (int hop = 0; node != nullptr && node->IsObject(); ++hop) {
    const Value* ref = Member(*node, "$ref");
    if (ref == nullptr) return node;
    if (!ref->IsString() || hop == kMaxReferenceHops) return nullptr;
    node = ResolveReference(root, std::string_view(ref->GetString(), ref->GetStringLength()));
  }
  return node;
}

void ForEachSubschema(const Value& root, const std::function<void(const Value& node)>& visit) {
  SubschemaWalk(root, visit).Walk(root);
}

std::string CheckReferences(const Value& schema) {
  std::string problem;
  ForEachSubschema(schema, [&](const Value& node) {
    const Value* ref = Member(node, "$ref");
    if (ref == nullptr || !problem.empty()) return;
    if (!ref->IsString()) {
      problem = "a \"$ref\" is not a string";
      return;
    }
    std::string why;
    const Value* target = ResolveReference(schema, std::string_view(ref->GetString(), ref->GetStringLength()), &why);
    if (target == nullptr) {
      problem = "the reference " + Quoted(*ref) + " is not usable: " + why;
    } else if (!target->IsObject()) {
      problem = "the reference " + Quoted(*ref) + " does not lead to a schema object";
    } else {
      // In draft 4 a node with "$ref" is nothing but the reference: a chain
      // of such nodes that comes back never reaches a schema.
      std::unordered_set<const Value*> chain{&node};
      for (const Value* next = target; next != nullptr && next->IsObject();) {
        const Value* nextRef = Member(*next, "$ref");
        if (nextRef == nullptr || !nextRef->IsString()) break;
        if (!chain.insert(next).second) {
          problem = "the references through " + Quoted(*ref) + " form a loop";
          break;
        }
        next = ResolveReference(schema, std::string_view(nextRef->GetString(), nextRef->GetStringLength()));
      }
    }
  });
  return problem;
}

void RebaseReferences(Value& schema, std::string_view fragment, Allocator& allocator) {
  std::vector<Value*> refs;
  ForEachSubschema(schema, [&](const Value& node) {
    const Value* ref = Member(node, "$ref");
    // The nodes belong to `schema`, which the caller lets us change.
    if (ref != nullptr && ref->IsString() && ref->GetStringLength() > 0 && ref->GetString()[0] == '#') {
      refs.push_back(const_cast<Value*>(ref));
    }
  });
  for (Value* ref : refs) {
    std::string text = "#";
    text.append(fragment);
    text.append(ref->GetString() + 1, ref->GetStringLength() - 1);
    ref->SetString(text.data(), static_cast<rapidjson::SizeType>(text.size()), allocator);
  }
}

void AppendReferenceToken(std::string& fragment, std::string_view name) { AppendToken(fragment, name, true); }

void AppendPointerToken(std::string& pointer, std::string_view name) { AppendToken(pointer, name, false); }

std::string PointerTokenName(std::string_view token) {
  std::string name;
  for (std::size_t i = 0; i < token.size(); ++i) {
    if (token[i] == '~' && i + 1 < token.size() && (token[i + 1] == '0' || token[i + 1] == '1')) {
      name.push_back(token[++i] == '0' ? '~' : '/');
    } else {
      name.push_back(token[i]);
    }
  }
  return name;
}

}  // namespace HoxConfigManager::detail
