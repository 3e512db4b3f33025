#include "platform/schema/validator_errors.h"

#include <cctype>
#include <string_view>

#include <hoxcm/schema_store.h>

#include "foundation/schema_refs.h"

namespace JsonValidator {
namespace {

struct Rule {
  std::string_view prefix;
  int code;
  bool limitArgument;  // the schema's limit follows as the second argument
};

// Reports that merely say a child failed; the child reported itself.
constexpr std::string_view kPropagation[] = {
    "Failed to validate item #",
    "Failed to validate against schema associated with property name",
    "Failed to validate against schema associated with pattern",
    "Failed to validate against additional properties schema",
    "Failed to validate against child schema #",
    "Failed to validate against dependent schema",
};

// The engine's report texts, by prefix. Order matters where one prefix
// extends another.
constexpr Rule kRules[] = {
    {"Value type not permitted by 'type' constraint", VALIDATION_ERR_TYPE, false},
    {"Failed to match against any enum values", VALIDATION_ERR_ENUM, false},
    {"Target value and comparison value are not equal", VALIDATION_ERR_ENUM, false},
    {"Failed to match expected value set by 'const'", VALIDATION_ERR_ENUM, false},
    {"Expected number greater than", VALIDATION_ERR_MINIMUM, true},
    {"Expected number less than", VALIDATION_ERR_MAXIMUM, true},
    {"String should be no fewer than", VALIDATION_ERR_MIN_LENGTH, true},
    {"String should be no more than", VALIDATION_ERR_MAX_LENGTH, true},
    {"Failed to match regex specified by 'pattern'", VALIDATION_ERR_PATTERN, false},
    {"Missing required property", VALIDATION_ERR_REQUIRED, false},
    {"Object contains a property that could not be validated", VALIDATION_ERR_ADDITIONAL_PROPERTIES, false},
    {"Array should contain no fewer than", VALIDATION_ERR_MIN_ITEMS, true},
    {"Array should contain no more than", VALIDATION_ERR_MAX_ITEMS, true},
    {"Elements at indexes", VALIDATION_ERR_UNIQUE_ITEMS, false},
    {"String should be a valid", VALIDATION_ERR_FORMAT, false},
    {"Failed to validate against any child schemas allowed by oneOf", VALIDATION_ERR_ONE_OF, false},
    {"Failed to validate against exactly one child schema", VALIDATION_ERR_ONE_OF, false},
    {"Failed to validate against any schemas allowed by anyOf", VALIDATION_ERR_ANY_OF, false},
    {"Target should not validate against schema specified in 'not'", VALIDATION_ERR_NOT, false},
    {"Value should be a multiple of", VALIDATION_ERR_MULTIPLE_OF, true},
    {"Value could not be converted", VALIDATION_ERR_MULTIPLE_OF, false},
    {"Missing dependency", VALIDATION_ERR_DEPENDENCIES, false},
    {"Object should have no fewer than", VALIDATION_ERR_MIN_PROPERTIES, true},
    {"Object should have no more than", VALIDATION_ERR_MAX_PROPERTIES, true},
    {"Array contains more items than allowed", VALIDATION_ERR_ADDITIONAL_ITEMS, false},
    {"Cannot validate item #", VALIDATION_ERR_ADDITIONAL_ITEMS, false},
};

// The first number of a text, trailing zeros of its fraction removed
// ("1280.000000" -> "1280").
std::string FirstNumber(std::string_view text) {
  std::size_t i = 0;
  while (i < text.size() && !std::isdigit(static_cast<unsigned char>(text[i]))) ++i;
  if (i == text.size()) return std::string();
  std::size_t start = (i > 0 && text[i - 1] == '-') ? i - 1 : i;
  std::size_t end = i;
  while (end < text.size() && (std::isdigit(static_cast<unsigned char>(text[end])) || text[end] == '.')) ++end;
  std::string number(text.substr(start, end - start));
  if (number.back() == '.') number.pop_back();
  if (number.find('.') != std::string::npos) {
    while (number.back() == '0') number.pop_back();
    if (number.back() == '.') number.pop_back();
  }
  return number;
}

// The member named by a report: the text between the report's fixed
// opening and its closing "'." (names may themselves hold quotes).
std::string QuotedName(const std::string& text) {
  static constexpr std::string_view kOpenings[] = {
      "Missing required property '",
      "Object contains a property that could not be validated using 'properties' or "
      "'additionalProperties' constraints: '",
      "Missing dependency '",
  };
  for (std::string_view opening : kOpenings) {
    if (text.starts_with(opening) && text.ends_with("'.") && text.size() >= opening.size() + 2) {
      return text.substr(opening.size(), text.size() - opening.size() - 2);
    }
  }
  return std::string();
}

}  // namespace

namespace detail {

std::string LastSegment(const std::string& field) {
  const std::size_t slash = field.rfind('/');
  return HoxConfigManager::detail::PointerTokenName(slash == std::string::npos ? field : field.substr(slash + 1));
}

bool ClassifyEngineError(const std::string& path, const std::string& description, Finding& out) {
  for (std::string_view prefix : kPropagation) {
    if (description.starts_with(prefix)) return false;
  }
  out = Finding();
  out.code = VALIDATION_ERR_GENERIC;
  out.field = path;
  out.text = description;
  for (const Rule& rule : kRules) {
    if (!description.starts_with(rule.prefix)) continue;
    out.code = rule.code;
    if (rule.limitArgument) {
      out.args.push_back(LastSegment(path));
      out.args.push_back(FirstNumber(description));
      out.text = DescribeFinding(out.code, out.args, description);
      return true;
    }
    break;
  }
  // Missing or unexpected members are reported at the member's own field.
  if (out.code == VALIDATION_ERR_REQUIRED || out.code == VALIDATION_ERR_ADDITIONAL_PROPERTIES ||
      out.code == VALIDATION_ERR_DEPENDENCIES) {
    const std::string name = QuotedName(description);
    out.field = path;
    HoxConfigManager::detail::AppendPointerToken(out.field, name);
    out.args.push_back(name);
  } else {
    out.args.push_back(LastSegment(path));
  }
  out.text = DescribeFinding(out.code, out.args, description);
  return true;
}

}  // namespace detail

namespace {

// "string" -> "a string", "integer" -> "an integer"; alternatives joined
// with "or" stay joined ("string or null" -> "a string or null").
std::string WithArticles(const std::string& types) {
  std::string out;
  std::size_t start = 0;
  while (start <= types.size()) {
    std::size_t end = types.find(" or ", start);
    if (end == std::string::npos) end = types.size();
    const std::string type = types.substr(start, end - start);
    if (!out.empty()) out += " or ";
    if (type == "null") {
      out += type;
    } else {
      out += (type.find_first_of("aeiou") == 0 ? "an " : "a ") + type;
    }
    start = end + 4;
  }
  return out;
}

}  // namespace

std::string DescribeFinding(int code, const std::vector<std::string>& args, const std::string& engineText) {
  const std::string limit = args.size() > 1 ? args[1] : "the limit";
  // The engine says "greater than 3" for an exclusive bound and "greater
  // than or equal to 3" for an inclusive one.
  const bool exclusive = !engineText.empty() && engineText.find("or equal") == std::string::npos;
  switch (code) {
    case VALIDATION_ERR_TYPE:
      return args.size() > 1 ? "must be " + WithArticles(args[1]) : "has a type the schema does not allow";
    case VALIDATION_ERR_ENUM: return "must be one of the values the schema allows";
    case VALIDATION_ERR_MINIMUM: return (exclusive ? "must be greater than " : "must be at least ") + limit;
    case VALIDATION_ERR_MAXIMUM: return (exclusive ? "must be less than " : "must be at most ") + limit;
    case VALIDATION_ERR_MIN_LENGTH: return "must be at least " + limit + " characters long";
    case VALIDATION_ERR_MAX_LENGTH: return "must be at most " + limit + " characters long";
    case VALIDATION_ERR_PATTERN: return "does not match the pattern the schema requires";
    case VALIDATION_ERR_REQUIRED: return "is required but missing";
    case VALIDATION_ERR_ADDITIONAL_PROPERTIES: return "is not allowed here: the schema does not describe it";
    case VALIDATION_ERR_MIN_ITEMS: return "must hold at least " + limit + " items";
    case VALIDATION_ERR_MAX_ITEMS: return "must hold at most " + limit + " items";
    case VALIDATION_ERR_UNIQUE_ITEMS: return "must not hold the same item twice";
    case VALIDATION_ERR_FORMAT: {
      static constexpr std::string_view kOpening = "String should be a valid ";
      if (engineText.starts_with(kOpening)) {
        std::string format = engineText.substr(kOpening.size());
        if (!format.empty() && format.back() == '.') format.pop_back();
        return "must be a valid " + format;
      }
      return "does not have the format the schema requires";
    }
    case VALIDATION_ERR_ONE_OF: return "must match exactly one of the forms the schema allows";
    case VALIDATION_ERR_ANY_OF: return "must match at least one of the forms the schema allows";
    case VALIDATION_ERR_ALL_OF: return "must match every form the schema requires";
    case VALIDATION_ERR_NOT: return "must not match the form the schema excludes";
    case VALIDATION_ERR_MULTIPLE_OF:
      return args.size() > 1 && !args[1].empty() ? "must be a multiple of " + args[1]
                                                  : "cannot be checked as a multiple";
    case VALIDATION_ERR_DEPENDENCIES: return "is required by another member but missing";
    case VALIDATION_ERR_MIN_PROPERTIES: return "must have at least " + limit + " members";
    case VALIDATION_ERR_MAX_PROPERTIES: return "must have at most " + limit + " members";
    case VALIDATION_ERR_ADDITIONAL_ITEMS: return "holds more items than the schema allows";
    case VALIDATION_ERR_UNKNOWN_KEY: return "is not a configuration key of this host: no schema describes it";
    default: return engineText.empty() ? "is not valid" : engineText;
  }
}

int ConvertMsgIdToErrorCode(const std::string& messageId) {
  // Codes without an identifier of their own share the generic one, which
  // the generic code (the lowest) claims first.
  for (int code = VALIDATION_OK; code <= VALIDATION_ERR_UNION_TAG; ++code) {
    if (ConvertErrorCodeToMsgId(code) == messageId) return code;
  }
  return VALIDATION_ERR_GENERIC;
}

std::string ConvertErrorCodeToMsgId(int code) {
  static constexpr std::string_view kPrefix = "com.tarvik.hox.settings.validation.";
  struct Entry {
    int code;
    std::string_view suffix;
  };
  static constexpr Entry kTable[] = {
      {VALIDATION_OK, "ok"},
      {VALIDATION_ERR_GENERIC, "invalid"},
      {VALIDATION_ERR_TYPE, "type"},
      {VALIDATION_ERR_ENUM, "enum"},
      {VALIDATION_ERR_MINIMUM, "minimum"},
      {VALIDATION_ERR_MAXIMUM, "maximum"},
      {VALIDATION_ERR_MIN_LENGTH, "min.length"},
      {VALIDATION_ERR_MAX_LENGTH, "max.length"},
      {VALIDATION_ERR_PATTERN, "pattern"},
      {VALIDATION_ERR_REQUIRED, "required"},
      {VALIDATION_ERR_ADDITIONAL_PROPERTIES, "additional.properties"},
      {VALIDATION_ERR_MIN_ITEMS, "min.items"},
      {VALIDATION_ERR_MAX_ITEMS, "max.items"},
      {VALIDATION_ERR_UNIQUE_ITEMS, "unique.items"},
      {VALIDATION_ERR_FORMAT, "format"},
      {VALIDATION_ERR_ONE_OF, "one.of"},
      {VALIDATION_ERR_ANY_OF, "any.of"},
      {VALIDATION_ERR_ALL_OF, "all.of"},
      {VALIDATION_ERR_NOT, "not"},
      {VALIDATION_ERR_MULTIPLE_OF, "multiple.of"},
      {VALIDATION_ERR_DEPENDENCIES, "dependencies"},
      {VALIDATION_ERR_MIN_PROPERTIES, "min.properties"},
      {VALIDATION_ERR_MAX_PROPERTIES, "max.properties"},
      {VALIDATION_ERR_ADDITIONAL_ITEMS, "additional.items"},
      {VALIDATION_ERR_UNKNOWN_KEY, "unknown.key"},
      {VALIDATION_ERR_SCHEMA_INVALID, "schema.invalid"},
      {VALIDATION_ERR_UNION_TAG, "union.tag"},
  };
  std::string_view suffix = "invalid";
  for (const Entry& e : kTable) {
    if (e.code == code) suffix = e.suffix;
  }
  return std::string(kPrefix) + std::string(suffix);
}

}  // namespace JsonValidator
