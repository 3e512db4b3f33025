#include "platform/schema/patterns.h"

#include <memory>
#include <string_view>
#include <unordered_map>

#include "foundation/pattern.h"
#include "foundation/schema_refs.h"
#include "platform/schema/valijson.h"

namespace JsonValidator::detail {
namespace {

using HoxConfigManager::detail::SchemaPattern;

constexpr std::uint64_t kBytesPerStep = 64;

// The budget of the validation running on this thread, if any. A thread
// variable because the engine calls back into us with nothing of our own.
thread_local ValidationBudget* current = nullptr;

// The compiled pattern; a refused one throws, which makes the schema
// unusable (error 31) with the reason. CheckPatterns refuses such schemas
// first, so this is only a safety net. Each thread keeps the patterns it
// has used, so that matching a value takes neither the process-wide
// cache's lock nor a copy of the pattern; a pattern's compiled form depends
// on its text alone, so an entry is never stale.
const SchemaPattern& Compiled(std::string_view source) {
  constexpr std::size_t kMaxPerThread = 256;
  thread_local std::unordered_map<std::string, std::shared_ptr<const SchemaPattern>> known;
  thread_local std::string key;
  key.assign(source);
  auto it = known.find(key);
  if (it == known.end()) {
    std::string why;
    auto pattern = SchemaPattern::Get(source, &why);
    if (!pattern) throw std::runtime_error(why);
    if (known.size() >= kMaxPerThread) known.clear();
    it = known.emplace(key, std::move(pattern)).first;
  }
  return *it->second;
}

bool Matches(std::string_view source, std::string_view subject) {
  ValidationBudget::Charge(1 + subject.size() / kBytesPerStep);
  return Compiled(source).Search(subject);
}

// The values of `v` (itself, its members and elements, at any depth).
std::uint64_t CountValues(const rapidjson::Value& v) {
  std::uint64_t values = 1;
  if (v.IsObject()) {
    for (const auto& m : v.GetObject()) values += CountValues(m.value);
  } else if (v.IsArray()) {
    for (const auto& e : v.GetArray()) values += CountValues(e);
  }
  return values;
}

}  // namespace

std::string CheckPatterns(const rapidjson::Value& schema) {
  std::string problem;
  const auto check = [&](std::string_view source, const char* where) {
    std::string why;
    if (problem.empty() && !SchemaPattern::Get(source, &why)) {
      problem = std::string("the ") + where + " \"" + std::string(source.substr(0, 64)) +
                (source.size() > 64 ? "..." : "") + "\": " + why;
    }
  };
  HoxConfigManager::detail::ForEachSubschema(schema, [&](const rapidjson::Value& node) {
    auto pattern = node.FindMember("pattern");
    if (pattern != node.MemberEnd() && pattern->value.IsString()) {
      check({pattern->value.GetString(), pattern->value.GetStringLength()}, "pattern");
    }
    auto names = node.FindMember("patternProperties");
    if (names != node.MemberEnd() && names->value.IsObject()) {
      for (const auto& m : names->value.GetObject()) {
        check({m.name.GetString(), m.name.GetStringLength()}, "patternProperties name");
      }
    }
  });
  return problem;
}

std::uint64_t BudgetFor(const rapidjson::Value& document) {
  return kBaseBudget + kBudgetPerValue * CountValues(document);
}

BudgetExhausted::BudgetExhausted(std::uint64_t steps)
    : std::runtime_error("validating the document would take more than " + std::to_string(steps) + " steps") {}

ValidationBudget::ValidationBudget(std::uint64_t steps)
    : steps_(steps), left_(steps), inCharge_(current == nullptr) {
  if (inCharge_) current = this;
}

ValidationBudget::~ValidationBudget() {
  if (inCharge_) current = nullptr;
}

void ValidationBudget::Charge(std::uint64_t steps) {
  if (current == nullptr) return;
  if (current->left_ < steps) {
    current->left_ = 0;
    throw BudgetExhausted(current->steps_);
  }
  current->left_ -= steps;
}

}  // namespace JsonValidator::detail

namespace valijson {

using JsonValidator::detail::Matches;
using JsonValidator::detail::ValidationBudget;
using Visitor = ValidationVisitor<adapters::RapidJsonAdapter>;

template <>
bool Visitor::validationCallback(const constraints::Constraint& constraint, Visitor& visitor) {
  ValidationBudget::Charge(1);
  return constraint.accept(visitor);
}

template <>
bool Visitor::visit(const constraints::PatternConstraint& constraint) {
  if ((m_strictTypes && !m_target.isString()) || !m_target.maybeString()) return true;
  thread_local std::string pattern;  // reused: no allocation per value
  constraint.getPattern(pattern);
  if (Matches(pattern, m_target.asString())) return true;
  if (m_results) m_results->pushError(m_context, "Failed to match regex specified by 'pattern' constraint.");
  return false;
}

template <>
template <>
bool Visitor::ValidatePatternPropertySubschemas::operator()(const constraints::PropertiesConstraint::String& pattern,
                                                             const Subschema* subschema) const {
  const std::string source(pattern.c_str(), pattern.size());
  bool matchFound = false;
  for (const auto member : m_object) {
    if (!Matches(source, member.first)) continue;
    matchFound = true;
    if (m_propertiesMatched) m_propertiesMatched->insert(member.first);
    std::vector<std::string> context = m_context;
    context.push_back("[" + member.first + "]");
    Visitor validator(member.second, context, m_strictTypes, m_results, m_regexesCache);
    if (validator.validateSchema(*subschema)) continue;
    if (m_results) {
      m_results->pushError(m_context, "Failed to validate against schema associated with pattern '" + source + "'.");
    }
    if (m_validated) *m_validated = false;
    if (!m_continueOnFailure) return false;
  }
  if (!matchFound && !m_continueIfUnmatched) return false;
  return m_continueOnSuccess;
}

template <>
bool Visitor::visit(const constraints::FormatConstraint& constraint) {
  // Formats describe strings; other values pass, as for every string keyword.
  if (!m_target.isString()) return true;
  static constexpr std::string_view kDate = "^([0-9]+)-(0[1-9]|1[012])-(0[1-9]|[12][0-9]|3[01])";
  static constexpr std::string_view kTime =
      "([01][0-9]|2[0-3]):([0-5][0-9]):([0-5][0-9]|60)(\\.[0-9]+)?(([Zz])|([\\+|\\-]([01][0-9]|2[0-3]):[0-5][0-9]))$";
  const std::string& format = constraint.getFormat();
  const std::string text = m_target.asString();
  bool valid = true;
  if (format == "date") {
    valid = Matches(std::string(kDate) + "$", text) &&
            validate_date_range(std::stoi(text.substr(text.size() - 5, 2)), std::stoi(text.substr(text.size() - 2)));
  } else if (format == "time") {
    valid = Matches("^" + std::string(kTime), text);
  } else if (format == "date-time") {
    const std::size_t t = text.find_first_of("Tt");
    valid = Matches(std::string(kDate) + "[Tt]" + std::string(kTime), text) &&
            validate_date_range(std::stoi(text.substr(t - 5, 2)), std::stoi(text.substr(t - 2, 2)));
  } else {
    return true;
  }
  if (!valid && m_results) m_results->pushError(m_context, "String should be a valid " + format);
  return valid;
}

}  // namespace valijson
