#include "platform/schema/pattern_guard.h"

#include <pthread.h>

#include <cstring>
#include <exception>

#include <hoxcm/schema_store.h>

#include "foundation/schema_refs.h"

namespace JsonValidator::detail {
namespace {

using rapidjson::Value;

// Enough for kMaxPatternSubject with a wide margin: the matcher needs about
// a kilobyte of stack per subject character on unoptimised builds. Only the
// pages touched are ever committed.
constexpr std::size_t kEngineStack = 64u << 20;
// The guard walk follows every variant of every schema; past this many steps
// it stops reasoning and treats every long string as a pattern subject.
constexpr int kWalkBudget = 100000;

bool HasPatterns(const Value& node) {
  if (node.IsObject()) {
    for (const auto& m : node.GetObject()) {
      if ((m.name == "pattern" && m.value.IsString()) || m.name == "patternProperties" || HasPatterns(m.value)) {
        return true;
      }
    }
  } else if (node.IsArray()) {
    for (const auto& v : node.GetArray()) {
      if (HasPatterns(v)) return true;
    }
  }
  return false;
}

// A long string found: where it is, and whether it is a member name.
struct Subject {
  std::vector<std::string> tokens;  // path from the document root
  bool memberName;
};

class SubjectWalk {
 public:
  explicit SubjectWalk(const Value& root) : root_(root) {}

  // False when the budget ran out.
  bool Walk(const Value& doc, const Value* node, std::vector<std::string>& tokens) {
    if (--budget_ < 0) return false;
    node = HoxConfigManager::detail::FollowReferences(root_, node);
    if (node == nullptr || !node->IsObject()) return true;
    auto pattern = node->FindMember("pattern");
    if (pattern != node->MemberEnd() && doc.IsString() && doc.GetStringLength() > kMaxPatternSubject) {
      Record(tokens, false);
    }
    bool ok = true;
    for (const char* keyword : {"allOf", "anyOf", "oneOf"}) {
      auto branches = node->FindMember(keyword);
      if (branches == node->MemberEnd() || !branches->value.IsArray()) continue;
      for (const auto& branch : branches->value.GetArray()) ok = ok && Walk(doc, &branch, tokens);
    }
    auto negated = node->FindMember("not");
    if (negated != node->MemberEnd()) ok = ok && Walk(doc, &negated->value, tokens);
    if (doc.IsObject()) ok = ok && WalkObject(doc, *node, tokens);
    if (doc.IsArray()) ok = ok && WalkArray(doc, *node, tokens);
    return ok;
  }

  std::vector<Subject>& subjects() { return subjects_; }

 private:
  bool WalkObject(const Value& doc, const Value& node, std::vector<std::string>& tokens) {
    auto props = node.FindMember("properties");
    auto patterned = node.FindMember("patternProperties");
    auto extra = node.FindMember("additionalProperties");
    auto deps = node.FindMember("dependencies");
    const bool hasPatterned = patterned != node.MemberEnd() && patterned->value.IsObject();
    bool ok = true;
    for (const auto& m : doc.GetObject()) {
      tokens.emplace_back(m.name.GetString(), m.name.GetStringLength());
      if (hasPatterned && m.name.GetStringLength() > kMaxPatternSubject) Record(tokens, true);
      bool named = false;
      if (props != node.MemberEnd() && props->value.IsObject()) {
        auto p = props->value.FindMember(m.name);
        if (p != props->value.MemberEnd()) {
          named = true;
          ok = ok && Walk(m.value, &p->value, tokens);
        }
      }
      // Which pattern matches a name is not known without matching: assume
      // every one may.
      if (hasPatterned) {
        for (const auto& p : patterned->value.GetObject()) ok = ok && Walk(m.value, &p.value, tokens);
      }
      if (!named && extra != node.MemberEnd() && extra->value.IsObject())
        ok = ok && Walk(m.value, &extra->value, tokens);
      tokens.pop_back();
    }
    if (deps != node.MemberEnd() && deps->value.IsObject()) {
      for (const auto& d : deps->value.GetObject()) {
        if (d.value.IsObject()) ok = ok && Walk(doc, &d.value, tokens);
      }
    }
    return ok;
  }

  bool WalkArray(const Value& doc, const Value& node, std::vector<std::string>& tokens) {
    auto items = node.FindMember("items");
    auto extra = node.FindMember("additionalItems");
    bool ok = true;
    for (rapidjson::SizeType i = 0; i < doc.Size(); ++i) {
      const Value* child = nullptr;
      if (items != node.MemberEnd() && items->value.IsObject()) {
        child = &items->value;
      } else if (items != node.MemberEnd() && items->value.IsArray() && i < items->value.Size()) {
        child = &items->value[i];
      } else if (extra != node.MemberEnd() && extra->value.IsObject()) {
        child = &extra->value;
      }
      if (child == nullptr) continue;
      tokens.push_back(std::to_string(i));
      ok = ok && Walk(doc[i], child, tokens);
      tokens.pop_back();
    }
    return ok;
  }

  void Record(const std::vector<std::string>& tokens, bool memberName) {
    for (const Subject& s : subjects_) {
      if (s.tokens == tokens && s.memberName == memberName) return;
    }
    subjects_.push_back({tokens, memberName});
  }

  const Value& root_;
  int budget_ = kWalkBudget;
  std::vector<Subject> subjects_;
};

// Every long string of the document, when the walk gave up.
void AllLongStrings(const Value& v, std::vector<std::string>& tokens, std::vector<Subject>& out) {
  if (v.IsString() && v.GetStringLength() > kMaxPatternSubject) out.push_back({tokens, false});
  if (v.IsObject()) {
    for (const auto& m : v.GetObject()) {
      tokens.emplace_back(m.name.GetString(), m.name.GetStringLength());
      if (m.name.GetStringLength() > kMaxPatternSubject) out.push_back({tokens, true});
      AllLongStrings(m.value, tokens, out);
      tokens.pop_back();
    }
  } else if (v.IsArray()) {
    for (rapidjson::SizeType i = 0; i < v.Size(); ++i) {
      tokens.push_back(std::to_string(i));
      AllLongStrings(v[i], tokens, out);
      tokens.pop_back();
    }
  }
}

// The value at `tokens` in `doc` (array indexes are decimal tokens).
Value* Locate(Value* v, const std::vector<std::string>& tokens, std::size_t count) {
  for (std::size_t i = 0; i < count && v != nullptr; ++i) {
    if (v->IsObject()) {
      auto m = v->FindMember(Value(rapidjson::StringRef(tokens[i].data(), tokens[i].size())));
      v = m == v->MemberEnd() ? nullptr : &m->value;
    } else if (v->IsArray()) {
      const std::size_t index = std::stoul(tokens[i]);
      v = index < v->Size() ? &(*v)[static_cast<rapidjson::SizeType>(index)] : nullptr;
    } else {
      v = nullptr;
    }
  }
  return v;
}

void Cut(rapidjson::Document& doc, const Subject& s) {
  if (!s.memberName) {
    Value* v = Locate(&doc, s.tokens, s.tokens.size());
    if (v != nullptr && v->IsString()) v->SetString(v->GetString(), kMaxPatternSubject, doc.GetAllocator());
    return;
  }
  Value* parent = Locate(&doc, s.tokens, s.tokens.size() - 1);
  if (parent == nullptr || !parent->IsObject()) return;
  auto m = parent->FindMember(Value(rapidjson::StringRef(s.tokens.back().data(), s.tokens.back().size())));
  if (m != parent->MemberEnd()) m->name.SetString(s.tokens.back().data(), kMaxPatternSubject, doc.GetAllocator());
}

void* RunWork(void* arg) {
  auto* job = static_cast<std::pair<const std::function<void()>*, std::exception_ptr>*>(arg);
  try {
    (*job->first)();
  } catch (...) {
    job->second = std::current_exception();
  }
  return nullptr;
}

}  // namespace

bool GuardPatternSubjects(const Value& schema, const Value& document, const std::string& path,
                          rapidjson::Document& guarded, std::vector<Finding>& out) {
  if (!HasStringsLongerThan(document, kMaxPatternSubject) || !HasPatterns(schema)) return false;
  SubjectWalk walk(schema);
  std::vector<std::string> tokens;
  std::vector<Subject> subjects;
  if (walk.Walk(document, &schema, tokens)) {
    subjects = std::move(walk.subjects());
  } else {
    AllLongStrings(document, tokens, subjects);
  }
  if (subjects.empty()) return false;
  guarded.CopyFrom(document, guarded.GetAllocator());
  for (const Subject& s : subjects) {
    Finding f;
    for (const auto& t : s.tokens) HoxConfigManager::detail::AppendPointerToken(f.field, t);
    f.field = path + f.field;
    f.code = VALIDATION_ERR_PATTERN;
    f.args.push_back(s.tokens.empty() ? std::string() : s.tokens.back());
    f.text = std::string(s.memberName ? "The member name" : "The string") + " is longer than " +
             std::to_string(kMaxPatternSubject) + " bytes, the limit for strings checked against patterns.";
    out.push_back(std::move(f));
    Cut(guarded, s);
  }
  return true;
}

std::string FindOverlongPattern(const Value& node) {
  static const std::string kReason =
      "a regular expression is longer than " + std::to_string(kMaxPatternLength) + " bytes";
  if (node.IsObject()) {
    for (const auto& m : node.GetObject()) {
      if (m.name == "pattern" && m.value.IsString() && m.value.GetStringLength() > kMaxPatternLength) return kReason;
      if (m.name == "patternProperties" && m.value.IsObject()) {
        for (const auto& p : m.value.GetObject()) {
          if (p.name.GetStringLength() > kMaxPatternLength) return kReason;
        }
      }
      std::string found = FindOverlongPattern(m.value);
      if (!found.empty()) return found;
    }
  } else if (node.IsArray()) {
    for (const auto& v : node.GetArray()) {
      std::string found = FindOverlongPattern(v);
      if (!found.empty()) return found;
    }
  }
  return std::string();
}

bool HasStringsLongerThan(const Value& v, std::size_t limit) {
  if (v.IsString()) return v.GetStringLength() > limit;
  if (v.IsObject()) {
    for (const auto& m : v.GetObject()) {
      if (m.name.GetStringLength() > limit || HasStringsLongerThan(m.value, limit)) return true;
    }
  } else if (v.IsArray()) {
    for (const auto& e : v.GetArray()) {
      if (HasStringsLongerThan(e, limit)) return true;
    }
  }
  return false;
}

void RunOnLargeStack(const std::function<void()>& work) {
  pthread_attr_t attr;
  std::pair<const std::function<void()>*, std::exception_ptr> job{&work, nullptr};
  pthread_t thread;
  int rc = pthread_attr_init(&attr);
  if (rc == 0) {
    pthread_attr_setstacksize(&attr, kEngineStack);
    rc = pthread_create(&thread, &attr, RunWork, &job);
    pthread_attr_destroy(&attr);
  }
  if (rc != 0) {
    // No thread to be had: the caller's stack still holds subjects of the
    // guarded length on a default-sized stack.
    work();
    return;
  }
  pthread_join(thread, nullptr);
  if (job.second) std::rethrow_exception(job.second);
}

}  // namespace JsonValidator::detail
