// The SSH files read into their store objects.
#include <filesystem>

#include <gtest/gtest.h>
#include <hoxcm/config_store.h>
#include <hoxcm/host.h>

#include "platform/host/host_internal.h"
#include "support/temp_root.h"

namespace hoxcm_test {
namespace {

using HoxPlatform::detail::ParseAuthorizedKeys;
using HoxPlatform::detail::ParseSshOptions;

std::string Current(const char* key) {
  const rapidjson::Document doc =
      HoxConfigStore::GetCurrentConfigInternal(HoxConfigStore::GetDBStore(), "security", "ssh", key);
  std::string out;
  HoxConfigStore::ConfigStoreDocument::SerializeValue(doc, out);
  return out;
}

TEST(SshParseTest, AuthorizedKeysLinesGiveTypeKeyAndCommentAndMalformedLinesAreSkipped) {
  const std::string text =
      "# comment\n"
      "\n"
      "ssh-ed25519 AAAAC3Nza+/= admin@mgmt-01\n"
      "from=\"10.0.0.1\",command=\"echo a b\" ssh-rsa AAAAB3 deploy key with spaces  \n"
      "ecdsa-sha2-nistp256 AAAAE2\n"
      "not-a-key AAAA comment\n"
      "ssh-rsa\n"
      "ssh-rsa bad!base64\n";
  std::vector<int> skipped;
  const auto keys = ParseAuthorizedKeys(text, skipped);
  ASSERT_EQ(keys.size(), 3u);
  EXPECT_EQ(keys[0].type, "ssh-ed25519");
  EXPECT_EQ(keys[0].key, "AAAAC3Nza+/=");
  EXPECT_EQ(keys[0].comment, "admin@mgmt-01");
  EXPECT_EQ(keys[1].type, "ssh-rsa");
  EXPECT_EQ(keys[1].comment, "deploy key with spaces");
  EXPECT_EQ(keys[2].comment, "");
  EXPECT_EQ(skipped, (std::vector<int>{6, 7, 8}));
}

TEST(SshParseTest, TextInAnotherEncodingNeverReachesTheStoreAsItIs) {
  // Given a Latin-1 comment, a key type with a stray byte and a truncated
  // sequence, the comment keeps its readable part and the bad type is skipped.
  std::vector<int> skipped;
  const auto keys = ParseAuthorizedKeys(
      "ssh-ed25519 AAAA Jos\xe9@host\n"
      "ssh-rsa\xff AAAB x\n"
      "ssh-rsa AAAC caf\xc3\xa9 \xc3\n",
      skipped);
  ASSERT_EQ(keys.size(), 2u);
  EXPECT_EQ(keys[0].comment, "Jos\xef\xbf\xbd@host");
  EXPECT_EQ(keys[1].comment, "caf\xc3\xa9 \xef\xbf\xbd");
  EXPECT_EQ(skipped, (std::vector<int>{2}));
  // An option value in another encoding is skipped, not guessed at.
  skipped.clear();
  const auto options = ParseSshOptions("Banner /etc/issue\xe9\nPort 22\n", false, skipped);
  EXPECT_EQ(options, (std::vector<std::pair<std::string, std::string>>{{"Port", "22"}}));
  EXPECT_EQ(skipped, (std::vector<int>{1}));
}

TEST(SshParseTest, OptionsApplyingToEveryHostAreReadFirstValueWinning) {
  const std::string server =
      "Port 22\n"
      "  PermitRootLogin=no\n"
      "Port 2222\n"
      "Banner = /etc/issue\n"
      "Bad-Keyword yes\n"
      "NoValue\n"
      "Match User backup\n"
      "  PasswordAuthentication yes\n";
  std::vector<int> skipped;
  auto options = ParseSshOptions(server, false, skipped);
  const std::vector<std::pair<std::string, std::string>> expected = {
      {"Port", "22"}, {"PermitRootLogin", "no"}, {"Banner", "/etc/issue"}};
  EXPECT_EQ(options, expected);
  EXPECT_EQ(skipped, (std::vector<int>{5, 6}));

  const std::string client =
      "Compression yes\n"
      "Host build-*\n"
      "  User builder\n"
      "Host *\n"
      "  ServerAliveInterval 60\n"
      "  compression no\n";
  skipped.clear();
  options = ParseSshOptions(client, true, skipped);
  const std::vector<std::pair<std::string, std::string>> expectedClient = {{"Compression", "yes"},
                                                                           {"ServerAliveInterval", "60"}};
  EXPECT_EQ(options, expectedClient);
}

TEST(SshSyncTest, FilesReplaceTheirObjectsAndMissingFilesLeaveTheStoreAlone) {
  TempRoot root;
  root.InstallSampleSchemas();
  QmkCtl::System::SshAuthKeysConfig keys;
  QmkCtl::System::SshClientConfig client;
  QmkCtl::System::SshServerConfig server;

  // No files: nothing is stored.
  HoxConfigStore::ApplyUserConfigChanges(
      {{"SET", {"security", "ssh", "server"}, R"({"options":{"Port":"2200"}})"}});
  keys.UpgradeConfigToConfigStore();
  client.UpgradeConfigToConfigStore();
  server.UpgradeConfigToConfigStore();
  EXPECT_EQ(Current("authorized_keys"), "null");
  EXPECT_EQ(Current("client"), "null");
  EXPECT_EQ(Current("server"), R"({"options":{"Port":"2200"}})");
  // A file that exists but cannot be read fails the synchronisation and
  // leaves the store alone as well.
  root.WriteFile("/etc/ssh/sshd_config/placeholder", "");
  EXPECT_THROW(server.UpgradeConfigToConfigStore(), HostCtl::Lib::HostCtlException);
  EXPECT_EQ(Current("server"), R"({"options":{"Port":"2200"}})");
  std::filesystem::remove_all(root.Path("/etc/ssh"));
  // So does a file too large to be a configuration file.
  root.WriteFile("/etc/ssh/sshd_config", std::string((16 << 20) + 1, '#'));
  EXPECT_THROW(server.UpgradeConfigToConfigStore(), HostCtl::Lib::HostCtlException);
  EXPECT_EQ(Current("server"), R"({"options":{"Port":"2200"}})");
  std::filesystem::remove_all(root.Path("/etc/ssh"));

  root.CopyTree("data/sample-host/etc/ssh", "/etc/ssh");
  root.CopyTree("data/sample-host/root/.ssh", "/root/.ssh");
  keys.UpgradeConfigToConfigStore();
  client.UpgradeConfigToConfigStore();
  server.UpgradeConfigToConfigStore();
  EXPECT_EQ(Current("client"),
            R"({"options":{"StrictHostKeyChecking":"ask","ServerAliveInterval":"60","HashKnownHosts":"yes"}})");
  EXPECT_NE(Current("server").find(R"("Banner":"/etc/issue")"), std::string::npos);
  const rapidjson::Document stored = HoxConfigStore::GetCurrentConfigInternal(
      HoxConfigStore::GetDBStore(), "security", "ssh", "authorized_keys");
  ASSERT_TRUE(stored.IsArray());
  ASSERT_EQ(stored.Size(), 3u);
  EXPECT_STREQ(stored[2]["comment"].GetString(), "deploy@ci");

  // The file's order and contents win: a removed key goes, a new one comes.
  root.WriteFile("/root/.ssh/authorized_keys",
                 "ssh-ed25519 AAAAnew new@host\n"
                 "ssh-ed25519 AAAAC3NzaC1lZDI1NTE5AAAAIGJhY2t1cHNlcnZpY2VrZXlmb3J0aGVob3N0MDI= backup@vault\n"
                 "ssh-ed25519 AAAAnew duplicate\n");
  keys.UpgradeConfigToConfigStore();
  EXPECT_EQ(Current("authorized_keys"),
            R"([{"type":"ssh-ed25519","key":"AAAAnew","comment":"new@host"},)"
            R"({"type":"ssh-ed25519","key":"AAAAC3NzaC1lZDI1NTE5AAAAIGJhY2t1cHNlcnZpY2VrZXlmb3J0aGVob3N0MDI=",)"
            R"("comment":"backup@vault"}])");
  // A comment in another encoding does not fail the synchronisation.
  root.WriteFile("/root/.ssh/authorized_keys", "ssh-ed25519 AAAAnew Jos\xe9@host\n");
  keys.UpgradeConfigToConfigStore();
  EXPECT_EQ(Current("authorized_keys"),
            "[{\"type\":\"ssh-ed25519\",\"key\":\"AAAAnew\",\"comment\":\"Jos\xef\xbf\xbd@host\"}]");
  root.WriteFile("/root/.ssh/authorized_keys", "# no keys any more\n");
  keys.UpgradeConfigToConfigStore();
  EXPECT_EQ(Current("authorized_keys"), "null");
}

}  // namespace
}  // namespace hoxcm_test
