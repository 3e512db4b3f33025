// The SSH synchronisation: the host's authorized_keys, ssh_config and
// sshd_config files read into their user configuration objects, so that
// edits made outside the configuration manager become current configuration.
#include <cctype>
#include <set>

#include <hoxcm/config_store.h>
#include <hoxcm/json.h>

#include "platform/host/host_internal.h"

namespace HoxPlatform::detail {
namespace {

constexpr const char* kComponent = "security";
constexpr const char* kGroup = "ssh";

bool IsSpace(char c) { return std::isspace(static_cast<unsigned char>(c)) != 0; }

std::string_view TrimView(std::string_view s) {
  while (!s.empty() && IsSpace(s.front())) s.remove_prefix(1);
  while (!s.empty() && IsSpace(s.back())) s.remove_suffix(1);
  return s;
}

bool IsKeyType(std::string_view token) {
  for (char c : token) {
    if (!std::isalnum(static_cast<unsigned char>(c)) && c != '-' && c != '@' && c != '.') return false;
  }
  for (std::string_view prefix : {"ssh-", "ecdsa-sha2-", "sk-ssh-", "sk-ecdsa-sha2-"}) {
    if (token.size() > prefix.size() && token.substr(0, prefix.size()) == prefix) return true;
  }
  return false;
}

struct DiscardStream {
  using Ch = char;
  void Put(char) {}
};

// Length of the well-formed UTF-8 sequence at the start of `text` (not
// empty); 0 when its first bytes are not one.
std::size_t Utf8SequenceLength(std::string_view text) {
  DiscardStream out;
  rapidjson::MemoryStream in(text.data(), text.size());
  return rapidjson::UTF8<>::Validate(in, out) ? in.Tell() : 0;
}

bool IsUtf8(std::string_view text) {
  while (!text.empty()) {
    const std::size_t n = Utf8SequenceLength(text);
    if (n == 0) return false;
    text.remove_prefix(n);
  }
  return true;
}

// Free text of a file written in another encoding (a Latin-1 key comment)
// cannot go into the store as it is: each byte that does not belong to a
// well-formed UTF-8 sequence becomes U+FFFD.
std::string ToUtf8(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  while (!text.empty()) {
    const std::size_t n = Utf8SequenceLength(text);
    if (n == 0) {
      out += "\xEF\xBF\xBD";
      text.remove_prefix(1);
    } else {
      out.append(text.substr(0, n));
      text.remove_prefix(n);
    }
  }
  return out;
}

bool IsBase64(std::string_view token) {
  if (token.empty()) return false;
  for (char c : token) {
    if (!std::isalnum(static_cast<unsigned char>(c)) && c != '+' && c != '/' && c != '=') return false;
  }
  return true;
}

bool IsKeyword(std::string_view word) {
  if (word.empty() || !std::isalpha(static_cast<unsigned char>(word.front()))) return false;
  for (char c : word) {
    if (!std::isalnum(static_cast<unsigned char>(c))) return false;
  }
  return true;
}

// Splits off the next whitespace-separated token; double quotes (used in
// key options such as command="...") keep their spaces.
std::string_view NextToken(std::string_view& rest) {
  rest = TrimView(rest);
  std::size_t i = 0;
  bool quoted = false;
  while (i < rest.size() && (quoted || !IsSpace(rest[i]))) {
    if (rest[i] == '"') quoted = !quoted;
    ++i;
  }
  const std::string_view token = rest.substr(0, i);
  rest.remove_prefix(i);
  return token;
}

template <typename F>
void ForEachLine(std::string_view text, F&& f) {
  int number = 0;
  while (!text.empty()) {
    const std::size_t end = text.find('\n');
    ++number;
    f(TrimView(text.substr(0, end)), number);
    if (end == std::string_view::npos) break;
    text.remove_prefix(end + 1);
  }
}

void LogSkipped(const std::string& path, const std::vector<int>& skipped) {
  for (int line : skipped) CSLogger::Log(CSLogger::kWarning, "%s:%d: malformed line skipped", path.c_str(), line);
}

std::shared_ptr<HoxConfigStore::DBStore> Store() { return HoxConfigStore::GetDBStore(0, true); }

// Replaces the user configuration of a singleton SSH object when it differs.
void SyncSingleton(const char* key, const std::vector<std::pair<std::string, std::string>>& options) {
  rapidjson::Document value(rapidjson::kObjectType);
  auto& a = value.GetAllocator();
  rapidjson::Value map(rapidjson::kObjectType);
  for (const auto& [keyword, text] : options) {
    map.AddMember(rapidjson::Value(keyword, a), rapidjson::Value(text, a), a);
  }
  value.AddMember("options", map, a);
  const rapidjson::Document current = HoxConfigStore::GetCurrentConfigInternal(Store(), kComponent, kGroup, key);
  if (current == value) return;
  std::string text;
  HoxConfigStore::ConfigStoreDocument::SerializeValue(value, text);
  HoxConfigStore::ApplyUserConfigChanges({{"SET", {kComponent, kGroup, key}, text}});
}

// An ssh_config or sshd_config file read into its singleton object; a
// missing file leaves the object alone.
void SyncOptionsFile(std::string_view hostPath, bool client, const char* key) {
  const std::string path = HoxPlatform::HostPath(hostPath);
  std::string text;
  if (!ReadHostFile(path, text)) return;
  std::vector<int> skipped;
  const auto options = ParseSshOptions(text, client, skipped);
  LogSkipped(path, skipped);
  SyncSingleton(key, options);
}

}  // namespace

std::vector<AuthorizedKey> ParseAuthorizedKeys(std::string_view text, std::vector<int>& skipped) {
  std::vector<AuthorizedKey> keys;
  ForEachLine(text, [&](std::string_view line, int number) {
    if (line.empty() || line.front() == '#') return;
    // [options] type key [comment]: the options, when present, come first.
    std::string_view rest = line;
    std::string_view type = NextToken(rest);
    if (!IsKeyType(type)) type = NextToken(rest);
    const std::string_view key = NextToken(rest);
    if (!IsKeyType(type) || !IsBase64(key)) {
      skipped.push_back(number);
      return;
    }
    keys.push_back({std::string(type), std::string(key), ToUtf8(TrimView(rest))});
  });
  return keys;
}

std::vector<std::pair<std::string, std::string>> ParseSshOptions(std::string_view text, bool client,
                                                                  std::vector<int>& skipped) {
  std::vector<std::pair<std::string, std::string>> options;
  std::set<std::string> seen;
  bool applies = true;  // inside a part that applies to every host
  ForEachLine(text, [&](std::string_view line, int number) {
    if (line.empty() || line.front() == '#') return;
    std::size_t end = 0;
    while (end < line.size() && !IsSpace(line[end]) && line[end] != '=') ++end;
    const std::string_view keyword = line.substr(0, end);
    std::string_view value = TrimView(line.substr(end));
    if (!value.empty() && value.front() == '=') value = TrimView(value.substr(1));
    // A value in another encoding is not guessed at: the line is skipped.
    if (!IsKeyword(keyword) || value.empty() || !IsUtf8(value)) {
      skipped.push_back(number);
      return;
    }
    std::string lower(keyword);
    for (char& c : lower) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    if (lower == "match") {
      applies = false;
      return;
    }
    if (client && lower == "host") {
      applies = value == "*";
      return;
    }
    if (!applies || !seen.insert(lower).second) return;
    options.emplace_back(std::string(keyword), std::string(value));
  });
  return options;
}

}  // namespace HoxPlatform::detail

namespace QmkCtl::System {

using namespace HoxPlatform::detail;

void SshAuthKeysConfig::UpgradeConfigToConfigStore() {
  const std::string path = HoxPlatform::HostPath(HoxPlatform::HostPaths::kSshAuthorizedKeys);
  std::string text;
  if (!ReadHostFile(path, text)) return;
  std::vector<int> skipped;
  std::vector<AuthorizedKey> keys = ParseAuthorizedKeys(text, skipped);
  LogSkipped(path, skipped);

  rapidjson::Document wanted(rapidjson::kArrayType);
  auto& a = wanted.GetAllocator();
  std::set<std::string> seen;
  std::vector<std::string> identities;
  for (const AuthorizedKey& k : keys) {
    if (!seen.insert(k.key).second) {
      CSLogger::Log(CSLogger::kWarning, "%s: duplicate key skipped (%s)", path.c_str(), k.comment.c_str());
      continue;
    }
    rapidjson::Value instance(rapidjson::kObjectType);
    instance.AddMember("type", rapidjson::Value(k.type, a), a);
    instance.AddMember("key", rapidjson::Value(k.key, a), a);
    if (!k.comment.empty()) instance.AddMember("comment", rapidjson::Value(k.comment, a), a);
    wanted.PushBack(instance, a);
    identities.push_back(k.key);
  }

  const rapidjson::Document current =
      HoxConfigStore::GetCurrentConfigInternal(Store(), kComponent, kGroup, "authorized_keys");
  if (current == wanted || (current.IsNull() && wanted.Empty())) return;

  // The file's keys replace the stored ones in file order: every stored
  // instance goes, the file's are added again, in one transaction.
  std::vector<HoxConfigStore::UserConfigChange> changes;
  if (current.IsArray()) {
    for (const auto& instance : current.GetArray()) {
      if (instance.IsObject() && instance.HasMember("key") && instance["key"].IsString()) {
        changes.push_back({"DELETE", {kComponent, kGroup, "authorized_keys", instance["key"].GetString()}, {}});
      }
    }
  }
  for (rapidjson::SizeType i = 0; i < wanted.Size(); ++i) {
    std::string value;
    HoxConfigStore::ConfigStoreDocument::SerializeValue(wanted[i], value);
    changes.push_back({"ADD", {kComponent, kGroup, "authorized_keys", identities[i]}, value});
  }
  HoxConfigStore::ApplyUserConfigChanges(changes);
}

void SshClientConfig::UpgradeConfigToConfigStore() { SyncOptionsFile(HoxPlatform::HostPaths::kSshClientConfig, true, "client"); }

void SshServerConfig::UpgradeConfigToConfigStore() { SyncOptionsFile(HoxPlatform::HostPaths::kSshServerConfig, false, "server"); }

}  // namespace QmkCtl::System
