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
using Options = std::vector<std::pair<std::string, std::string>>;

std::string Current(const char* key) {
  const rapidjson::Document doc =
      HoxConfigStore::GetCurrentConfigInternal(HoxConfigStore::GetDBStore(), "security", "ssh", key);
  std::string out;
  HoxConfigStore::ConfigStoreDocument::SerializeValue(doc, out);
  return out;
}

TEST(SshParseTest, AuthorizedKeysGiveTypeKeyAndCommentAndMalformedLinesAreSkipped) {
  const std::string text =
      "# comment\n"
      "\n"
      "ssh-ed25519 AAAAC3Nza+/= admin@mgmt-01\n"
      "from=\"10.0.0.1\",command=\"echo a b\" ssh-rsa AAAAB3 deploy key with spaces  \n"
      "ecdsa-sha2-nistp256 AAAAE2\n"
      "not-a-key AAAA comment\n"
      "ssh-rsa\n"
      "ssh-rsa bad!base64\n"
      // Text in another encoding never reaches the store as it is: a comment
      // keeps its readable part, a key type with a stray byte is skipped.
      "ssh-ed25519 AAAA Jos\xe9@host\n"
      "ssh-rsa\xff AAAB x\n"
      "ssh-rsa AAAC caf\xc3\xa9 \xc3\n";
  std::vector<int> skipped;
  std::vector<std::string> keys;
  for (const auto& k : ParseAuthorizedKeys(text, skipped)) keys.push_back(k.type + "|" + k.key + "|" + k.comment);
  EXPECT_EQ(keys, (std::vector<std::string>{"ssh-ed25519|AAAAC3Nza+/=|admin@mgmt-01",
                                            "ssh-rsa|AAAAB3|deploy key with spaces", "ecdsa-sha2-nistp256|AAAAE2|",
                                            "ssh-ed25519|AAAA|Jos\xef\xbf\xbd@host",
                                            "ssh-rsa|AAAC|caf\xc3\xa9 \xef\xbf\xbd"}));
  EXPECT_EQ(skipped, (std::vector<int>{6, 7, 8, 10}));
}

TEST(SshParseTest, OptionsApplyingToEveryHostAreReadFirstValueWinning) {
  const std::string server =
      "Port 22\n"
      "  PermitRootLogin=no\n"
      "Port 2222\n"
      "Banner = /etc/issue\n"
      "Bad-Keyword yes\n"
      "NoValue\n"
      "ChrootDirectory /srv/caf\xe9\n"  // another encoding: skipped, not guessed at
      "Match User backup\n"
      "  PasswordAuthentication yes\n";
  std::vector<int> skipped;
  EXPECT_EQ(ParseSshOptions(server, false, skipped),
            (Options{{"Port", "22"}, {"PermitRootLogin", "no"}, {"Banner", "/etc/issue"}}));
  EXPECT_EQ(skipped, (std::vector<int>{5, 6, 7}));

  const std::string client =
      "Compression yes\n"
      "Host build-*\n"
      "  User builder\n"
      "Host *\n"
      "  ServerAliveInterval 60\n"
      "  compression no\n";
  EXPECT_EQ(ParseSshOptions(client, true, skipped), (Options{{"Compression", "yes"}, {"ServerAliveInterval", "60"}}));
}

TEST(SshSyncTest, FilesReplaceTheirObjectsAndMissingOrUnreadableFilesLeaveTheStoreAlone) {
  TempRoot root;
  root.InstallSampleSchemas();
  QmkCtl::System::SshAuthKeysConfig keys;
  QmkCtl::System::SshClientConfig client;
  QmkCtl::System::SshServerConfig server;
  auto syncAll = [&] {
    keys.UpgradeConfigToConfigStore();
    client.UpgradeConfigToConfigStore();
    server.UpgradeConfigToConfigStore();
  };
  const std::string stored = R"({"options":{"Port":"2200"}})";
  HoxConfigStore::ApplyUserConfigChanges({{"SET", {"security", "ssh", "server"}, stored}});
  syncAll();
  EXPECT_EQ(Current("authorized_keys"), "null");
  EXPECT_EQ(Current("client"), "null");
  EXPECT_EQ(Current("server"), stored);
  // A file that exists but cannot be read (a directory, a file too large to
  // be a configuration file) fails the synchronisation.
  for (const auto& [path, content] : std::vector<std::pair<std::string, std::string>>{
           {"/etc/ssh/sshd_config/placeholder", ""}, {"/etc/ssh/sshd_config", std::string((16 << 20) + 1, '#')}}) {
    root.WriteFile(path, content);
    EXPECT_THROW(server.UpgradeConfigToConfigStore(), HostCtl::Lib::HostCtlException) << path;
    EXPECT_EQ(Current("server"), stored);
    std::filesystem::remove_all(root.Path("/etc/ssh"));
  }

  root.CopyTree("data/sample-host/etc/ssh", "/etc/ssh");
  root.CopyTree("data/sample-host/root/.ssh", "/root/.ssh");
  syncAll();
  EXPECT_EQ(Current("client"),
            R"({"options":{"StrictHostKeyChecking":"ask","ServerAliveInterval":"60","HashKnownHosts":"yes"}})");
  EXPECT_NE(Current("server").find(R"("Banner":"/etc/issue")"), std::string::npos);
  EXPECT_NE(Current("authorized_keys").find(R"("comment":"deploy@ci"}])"), std::string::npos);

  // The file's order and contents win: a removed key goes, a new one comes,
  // a repeated key is kept once.
  root.WriteFile("/root/.ssh/authorized_keys",
                 "ssh-ed25519 AAAAnew new@host\nssh-ed25519 AAAAold old@host\nssh-ed25519 AAAAnew duplicate\n");
  keys.UpgradeConfigToConfigStore();
  EXPECT_EQ(Current("authorized_keys"), R"([{"type":"ssh-ed25519","key":"AAAAnew","comment":"new@host"},)"
                                        R"({"type":"ssh-ed25519","key":"AAAAold","comment":"old@host"}])");
  root.WriteFile("/root/.ssh/authorized_keys", "# no keys any more\n");
  keys.UpgradeConfigToConfigStore();
  EXPECT_EQ(Current("authorized_keys"), "null");
}

}  // namespace
}  // namespace hoxcm_test
