// ThrowException: the class an error arrives as, its code and its formatted
// message. The fixed texts themselves are checked where each error is raised.
#include <gtest/gtest.h>

#include <string>

#include <hoxcm/errors.h>

using namespace HoxConfigManager;

namespace {

// "code message" of what ThrowException<T> throws, caught as T.
template <typename T, typename Arg>
std::string Thrown(CMErrorCodes code, const Arg& arg) {
  try {
    ThrowException<T>(code, arg);
  } catch (const T& e) {
    return std::to_string(e.GetErrorCode()) + " " + e.what();
  }
  return "no exception";
}

}  // namespace

TEST(ErrorsTest, ThrownAsTheirClassWithCodeAndMessageOfAnyLength) {
  // A message without argument ignores a missing one.
  EXPECT_EQ(Thrown<HostNotInMM>(HostNotInMaintenanceMode, nullptr),
            "2026 The host must be in maintenance mode for apply to proceed.");
  EXPECT_EQ(Thrown<SchemaNotFound>(SchemaObjectNotFound, std::string("/net/vswitch/config")),
            "2021 Schema object not found: /net/vswitch/config");
  const std::string big(100000, 'x');
  EXPECT_EQ(Thrown<InvalidArgumentException>(NotSingletonObject, big), "2022 Not a Singleton object: " + big);
}
