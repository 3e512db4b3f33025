// The message table, the exception family and RapidJSON's assertion hook.
#include <gtest/gtest.h>

#include <stdexcept>
#include <string>

#include <hoxcm/errors.h>
#include <hoxcm/json.h>

using namespace HoxConfigManager;

namespace {

// "code message" of what ThrowException<T> throws, caught as T (so the class
// it arrives as is checked too).
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

TEST(ErrorsTest, EveryCodeFormatsItsFixedMessageAsTheClassItIsThrownAs) {
  struct Case {
    CMErrorCodes code;
    const char* text;  // with "X" substituted for %s
  };
  const Case cases[] = {
      {ConfigStoreConnectFailed, "Failed to connect to ConfigStore"},
      {SchemaObjectNotFound, "Schema object not found: X"},
      {NotSingletonObject, "Not a Singleton object: X"},
      {EmptyDesiredDocument, "The desired configuration document is empty."},
      {InvalidApplyInput, "The Apply API was invoked without valid input."},
      {ImpactResultNotApplicable, "The impact result is not applicable anymore."},
      {HostNotInMaintenanceMode, "The host must be in maintenance mode for apply to proceed."},
      {DeleteDefaultNotSupported, "Deleting default configuration for X is not supported."},
      {NotNonSingletonObject, "Not a Non-Singleton object: X"},
      {PendingDesiredConfiguration, "The host has other pending desired configurations, please reboot the host."},
      {JsonParseFailed, "Failed to parse JSON String"},
      {PluginSchemaInvalid, "The plugin JSON does not validate against schema: X"},
      {PluginVersionNotSupported, "The plugin JSON version is not supported: X"},
      {PluginDependencyGraphFailed, "Failed to create dependency graph from plugin JSON files."},
      {InvalidKeyValue, "Invalid value for key X"},
      {SchemaStoreAccessFailed, "Failed to access SchemaStore"},
      {NotUserConfiguration, "Cannot use HostAPIs as Configuration is not user configuration"},
  };
  EXPECT_EQ(ErrorMessageTable().size(), std::size(cases));
  for (const Case& c : cases) {
    // Codes without a conversion ignore the argument.
    EXPECT_EQ(Thrown<ConfigManagerException>(c.code, "X"), std::to_string(c.code) + " " + c.text);
  }
  // The subclasses carry the code they were thrown with; a missing argument
  // is harmless where none is used, and a std::string is formatted as text.
  EXPECT_EQ(Thrown<HostNotInMM>(HostNotInMaintenanceMode, nullptr),
            Thrown<ConfigManagerException>(HostNotInMaintenanceMode, "X"));
  EXPECT_EQ(Thrown<HostNotInNBM>(PendingDesiredConfiguration, nullptr),
            Thrown<ConfigManagerException>(PendingDesiredConfiguration, "X"));
  EXPECT_EQ(Thrown<InvalidImpact>(ImpactResultNotApplicable, nullptr),
            Thrown<ConfigManagerException>(ImpactResultNotApplicable, "X"));
  EXPECT_EQ(Thrown<SchemaNotFound>(SchemaObjectNotFound, std::string("/net/vswitch/config")),
            "2021 Schema object not found: /net/vswitch/config");
  // Messages have no size limit.
  const std::string big(100000, 'x');
  EXPECT_EQ(Thrown<InvalidArgumentException>(NotSingletonObject, big), "2022 Not a Singleton object: " + big);
  std::size_t length = 0;
  char* text = Str_Asprintf(&length, "<%s>", big.c_str());
  EXPECT_EQ(length, big.size() + 2);
  std::free(text);
}

TEST(ErrorsTest, UnknownCodesAreOutOfRangeAndTheBasesDefaultToTheStoreCode) {
  // 2000 is the platform bases' default code, yet has no message of its own.
  for (int code : {2000, 2002}) {
    EXPECT_THROW(ThrowException<ConfigManagerException>(static_cast<CMErrorCodes>(code)), std::out_of_range) << code;
  }
  HoxConfigStore::ConfigStoreException plain("boom");
  EXPECT_EQ(plain.GetErrorCode(), 2000);
  EXPECT_STREQ(plain.what(), "boom");
}

TEST(ErrorsTest, JsonTypeAssertionsThrowInvalidJson) {
  // Given RapidJSON's assertion hook, a wrong-type access throws instead of
  // ending the process.
  rapidjson::Document doc;
  doc.SetInt(3);
  try {
    (void)doc.GetString();
    FAIL();
  } catch (const HoxConfigStore::ConfigStoreException& e) {
    EXPECT_EQ(e.GetErrorCode(), 2000);
    EXPECT_STREQ(e.what(), "Invalid JSON");
  }
  EXPECT_THROW((void)doc["member"], HoxConfigStore::ConfigStoreException);
  rapidjson::Document other;
  EXPECT_THROW(other.CopyFrom(other, other.GetAllocator()), HoxConfigStore::ConfigStoreException);
}
