#include <gtest/gtest.h>

#include <hoxcm/errors.h>

using namespace HoxConfigManager;

TEST(ErrorsTest, SchemaNotFoundCarriesCodeAndFormattedMessage) {
  try {
    ThrowException<SchemaNotFound>(SchemaObjectNotFound, "/net/vswitch/config");
    FAIL() << "no exception";
  } catch (const ConfigManagerException& e) {
    EXPECT_EQ(e.GetErrorCode(), 2021);
    EXPECT_STREQ(e.what(), "Schema object not found: /net/vswitch/config");
    EXPECT_NE(dynamic_cast<const SchemaNotFound*>(&e), nullptr);
  }
}
