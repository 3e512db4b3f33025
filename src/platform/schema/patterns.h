// The schema engine's regular expressions, and what one validation may cost.
//
// The engine's own matcher (std::regex) backtracks: a pattern such as
// "^(a+)+$" takes seconds on a few dozen characters, and it recurses once per
// character of the subject. For the one adapter the library uses, the
// engine's "pattern", "patternProperties" and "format" checks are replaced
// (explicit template instances declared in valijson.h) by checks that match
// with SchemaPattern (RE2), in time linear in the subject.
//
// Every constraint the engine evaluates, and every byte it matches, is
// charged to the budget of the validation running on the thread; past
// kValidationBudget the validation stops (docs/validator.md). Thread-safe:
// each thread has its own budget.
#pragma once

#include <cstdint>
#include <stdexcept>
#include <string>

#include <hoxcm/json.h>

namespace JsonValidator::detail {

// Empty when every "pattern" and "patternProperties" name of `schema` can
// be matched; otherwise the reason, naming the pattern's place.
std::string CheckPatterns(const rapidjson::Value& schema);

// Steps one validation may take: one per constraint evaluated, one per 64
// bytes matched against a pattern. Documents take a few steps per value
// (the sample host, 3 kB, takes 425); a schema whose alternatives multiply
// the work at every level takes exponentially many, at up to some
// microseconds each, and is stopped.
constexpr std::uint64_t kBaseBudget = 1'000'000;
constexpr std::uint64_t kBudgetPerValue = 100;
// The budget for validating `document`: kBaseBudget plus kBudgetPerValue for
// each of its values (members and elements, at any depth).
std::uint64_t BudgetFor(const rapidjson::Value& document);

// Thrown by Charge when the budget of the running validation is used up.
class BudgetExhausted : public std::runtime_error {
 public:
  explicit BudgetExhausted(std::uint64_t steps);
};

// The budget of what is validated on this thread while the object lives.
// One made while another is in charge leaves that one in charge, so that
// everything a validation does (the checks of union variants included) and
// validations run within a caller's budget share one budget.
class ValidationBudget {
 public:
  explicit ValidationBudget(std::uint64_t steps);
  ~ValidationBudget();
  ValidationBudget(const ValidationBudget&) = delete;
  ValidationBudget& operator=(const ValidationBudget&) = delete;

  // Takes `steps` from the thread's budget; without one, nothing happens.
  static void Charge(std::uint64_t steps);

 private:
  const std::uint64_t steps_;
  std::uint64_t left_;
  const bool inCharge_;
};

}  // namespace JsonValidator::detail
