#include <gtest/gtest.h>

#include <stdexcept>
#include <string>

#include <hoxcm/errors.h>
#include <hoxcm/json.h>

using namespace HoxConfigManager;

namespace {

template <typename T>
void ExpectThrown(CMErrorCodes code, const char* arg, const std::string& text) {
  try {
    ThrowException<T>(code, arg);
    FAIL() << "no exception for " << code;
  } catch (const T& e) {
    EXPECT_EQ(e.GetErrorCode(), static_cast<int>(code));
    EXPECT_EQ(std::string(e.what()), text);
  }
}

}  // namespace

TEST(ErrorsTest, SchemaNotFoundIsCatchableAtEveryLevelOfTheFamily) {
  // Given code 2021 thrown as SchemaNotFound, every base catches it with the
  // formatted text.
  try {
    ThrowException<SchemaNotFound>(SchemaObjectNotFound, "/net/vswitch/config");
    FAIL();
  } catch (const HoxConfigStore::ConfigStoreException& e) {
    EXPECT_EQ(e.GetErrorCode(), 2021);
    EXPECT_STREQ(e.what(), "Schema object not found: /net/vswitch/config");
    EXPECT_NE(dynamic_cast<const SchemaNotFound*>(&e), nullptr);
    EXPECT_NE(dynamic_cast<const ConfigManagerException*>(&e), nullptr);
    EXPECT_NE(dynamic_cast<const HostCtl::Lib::HostCtlException*>(&e), nullptr);
  }
}

TEST(ErrorsTest, EveryCodeFormatsItsFixedMessage) {
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
    SCOPED_TRACE(c.code);
    // Codes without a conversion ignore the argument.
    ExpectThrown<ConfigManagerException>(c.code, "X", c.text);
  }
}

TEST(ErrorsTest, SubclassesCarryTheCodeTheyWereThrownWith) {
  ExpectThrown<HostNotInMM>(HostNotInMaintenanceMode, nullptr,
                            "The host must be in maintenance mode for apply to proceed.");
  ExpectThrown<HostNotInNBM>(PendingDesiredConfiguration, nullptr,
                             "The host has other pending desired configurations, please reboot the host.");
  ExpectThrown<InvalidImpact>(ImpactResultNotApplicable, nullptr, "The impact result is not applicable anymore.");
  ExpectThrown<InvalidArgumentException>(SchemaObjectNotFound, "a:b:c", "Schema object not found: a:b:c");
}

TEST(ErrorsTest, StringArgumentsAreFormattedAsText) {
  const std::string path = "/a/b/c";
  try {
    ThrowException<InvalidArgumentException>(NotSingletonObject, path);
    FAIL();
  } catch (const InvalidArgumentException& e) {
    EXPECT_STREQ(e.what(), "Not a Singleton object: /a/b/c");
  }
}

TEST(ErrorsTest, UnknownCodeIsOutOfRangeNotALibraryException) {
  EXPECT_THROW(ThrowException<ConfigManagerException>(static_cast<CMErrorCodes>(2002)), std::out_of_range);
  try {
    ThrowException<ConfigManagerException>(static_cast<CMErrorCodes>(2000));
  } catch (const HoxConfigStore::ConfigStoreException&) {
    FAIL() << "an unknown code must not produce a library exception";
  } catch (const std::out_of_range&) {
  }
}

TEST(ErrorsTest, PlatformBasesDefaultToTheStoreCode) {
  HoxConfigStore::ConfigStoreException plain("boom");
  EXPECT_EQ(plain.GetErrorCode(), 2000);
  EXPECT_STREQ(plain.what(), "boom");
  HostCtl::Lib::HostCtlException host(std::string("host"));
  EXPECT_STREQ(host.what(), "host");
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

TEST(ErrorsTest, AsprintfHasNoSizeLimit) {
  const std::string big(100000, 'x');
  std::size_t length = 0;
  char* text = Str_Asprintf(&length, "<%s>", big.c_str());
  ASSERT_NE(text, nullptr);
  EXPECT_EQ(length, big.size() + 2);
  std::free(text);
}
