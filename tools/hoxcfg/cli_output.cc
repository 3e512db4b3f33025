// What commands print: JSON or text, tables, the spelling of items, and
// documents written to a file.
#include <unistd.h>

#include <algorithm>
#include <iostream>

#include <hoxcm/documents.h>
#include <hoxcm/files.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/schema_store.h>

#include "hoxcfg/cli.h"

namespace hoxcfg {

bool StdinIsTerminal() { return ::isatty(STDIN_FILENO) == 1; }
bool StdoutIsTerminal() { return ::isatty(STDOUT_FILENO) == 1; }
bool StderrIsTerminal() { return ::isatty(STDERR_FILENO) == 1; }

std::string JsonText(const rapidjson::Value& value, const GlobalOptions& options) {
  rapidjson::StringBuffer buffer;
  if (options.compact) {
    rapidjson::Writer<rapidjson::StringBuffer> writer(buffer);
    value.Accept(writer);
  } else {
    rapidjson::PrettyWriter<rapidjson::StringBuffer> writer(buffer);
    writer.SetIndent(' ', 2);
    value.Accept(writer);
  }
  return std::string(buffer.GetString(), buffer.GetSize()) + "\n";
}

rapidjson::Document CopyOf(const rapidjson::Value& value) {
  rapidjson::Document copy;
  copy.CopyFrom(value, copy.GetAllocator());
  return copy;
}

rapidjson::Document CheckShape(const char* name, const rapidjson::Value& findings) {
  rapidjson::Document out(rapidjson::kObjectType);
  auto& a = out.GetAllocator();
  out.AddMember("valid", findings.IsArray() && findings.Empty(), a);
  out.AddMember(rapidjson::StringRef(name), rapidjson::Value(findings, a), a);
  return out;
}

int PrintFindings(const GlobalOptions& options, std::shared_ptr<rapidjson::Document> findings,
                  const std::string& document) {
  Print(options, {[findings, document] {
                    if (findings->Empty()) return DisplayName(document) + ": valid\n";
                    std::string text;
                    for (const auto& f : findings->GetArray()) {
                      text += FormatWhere(Where{document, 0, 0, f["field"].GetString()}) + ": " +
                              f["error"].GetString() + "\n";
                    }
                    return text;
                  },
                  [findings] { return CheckShape("findings", *findings); }});
  return findings->Empty() ? kExitOk : kExitNegative;
}

void Print(const GlobalOptions& options, const Answer& answer) {
  if (options.quiet) return;
  const bool json = options.json || (answer.list && !StdoutIsTerminal());
  std::cout << (json ? JsonText(answer.json(), options) : answer.text()) << std::flush;
}

void WriteOutput(const std::string& text, const std::string& path) {
  if (path.empty() || path == "-") {
    std::cout << text << std::flush;
    return;
  }
  HoxPlatform::WriteFileAtomically(path, text, 0600, HoxPlatform::Durability::kDurable);
}

std::string Table::Render() const {
  std::vector<std::size_t> widths;
  for (const auto& row : rows_) {
    if (widths.size() < row.size()) widths.resize(row.size(), 0);
    for (std::size_t i = 0; i < row.size(); ++i) widths[i] = std::max(widths[i], row[i].size());
  }
  std::string out;
  for (const auto& row : rows_) {
    std::string line;
    for (std::size_t i = 0; i < row.size(); ++i) {
      line += row[i];
      if (i + 1 < row.size()) line += std::string(widths[i] - row[i].size() + 2, ' ');
    }
    while (!line.empty() && line.back() == ' ') line.pop_back();
    out += line + "\n";
  }
  return out;
}

std::string ItemName(std::string_view component, std::string_view group, std::string_view key,
                     std::string_view instance) {
  std::string name = HoxConfigManager::DocumentShape::ItemPath(component, group, key);
  if (!instance.empty()) name.append("[").append(instance).append("]");
  return name;
}

std::optional<ItemRef> ParseItemName(std::string_view text) {
  if (text.size() < 6 || text.front() != '/') return std::nullopt;
  ItemRef item;
  const std::size_t second = text.find('/', 1);
  const std::size_t third = second == std::string_view::npos ? second : text.find('/', second + 1);
  if (third == std::string_view::npos) return std::nullopt;
  item.component = text.substr(1, second - 1);
  item.group = text.substr(second + 1, third - second - 1);
  std::string_view rest = text.substr(third + 1);
  const std::size_t open = rest.find('[');
  item.key = rest.substr(0, open);
  if (open != std::string_view::npos) {
    if (rest.back() != ']' || rest.size() - open < 3) return std::nullopt;
    item.instance = rest.substr(open + 1, rest.size() - open - 2);
  }
  if (item.component.empty() || item.group.empty() || item.key.empty() || item.key.find('/') != std::string::npos) {
    return std::nullopt;
  }
  return item;
}

namespace {

const rapidjson::Value* Member(const rapidjson::Value* object, const std::string& name) {
  if (object == nullptr || !object->IsObject()) return nullptr;
  const auto it = object->FindMember(name.c_str());
  return it == object->MemberEnd() ? nullptr : &it->value;
}

std::string IdentityOf(const rapidjson::Value* instance, const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema) {
  if (instance == nullptr || !instance->IsObject()) return std::string();
  try {
    return HoxConfigManager::GetInstanceIdFromValue(*instance, schema);
  } catch (const std::exception&) {
    return std::string();  // an identity that is not a string: named by number
  }
}

}  // namespace

std::string ReportPathToItemName(const std::string& path, const rapidjson::Value& desired, const char* hostValue) {
  std::vector<std::string> parts;
  for (std::size_t start = 1; start <= path.size();) {
    std::size_t end = path.find('/', start);
    if (end == std::string::npos) end = path.size();
    parts.push_back(path.substr(start, end - start));
    start = end + 1;
  }
  if (path.empty() || path[0] != '/' || parts.size() < 4 ||
      parts[3].find_first_not_of("0123456789") != std::string::npos || parts[3].empty()) {
    return path;
  }
  const auto store = HoxSchemaStore::SchemaStore::GetStore();
  const auto schema = store ? store->Find(parts[0], parts[1], parts[2]) : nullptr;
  if (!schema || !schema->IsMultiInstance()) return path;
  const std::size_t index = std::stoul(parts[3]);
  std::string identity;
  const rapidjson::Value* instances = Member(Member(Member(&desired, parts[0]), parts[1]), parts[2]);
  if (instances != nullptr && instances->IsArray() && index < instances->Size()) {
    identity = IdentityOf(&(*instances)[static_cast<rapidjson::SizeType>(index)], schema);
  } else if (hostValue != nullptr && parts.size() == 4) {
    // An instance only the host holds: the report carries it whole.
    rapidjson::Document value;
    try {
      HoxConfigManager::ParseDocument(hostValue, value);
      identity = IdentityOf(&value, schema);
    } catch (const std::exception&) {
    }
  }
  std::string name = ItemName(parts[0], parts[1], parts[2], identity.empty() ? "#" + parts[3] : identity);
  for (std::size_t i = 4; i < parts.size(); ++i) name += "/" + parts[i];
  return name;
}

const char* Requirement(int impact) {
  return impact == HoxConfigManager::IMPACT_REBOOT_REQUIRED             ? "a reboot"
         : impact == HoxConfigManager::IMPACT_MAINTENANCE_MODE_REQUIRED ? "maintenance mode"
                                                                        : "neither a reboot nor maintenance mode";
}

std::string ReasonsText(const HoxConfigManager::ImpactReasons& reasons, const rapidjson::Value& root) {
  using HoxConfigManager::ImpactReason;
  const auto shown = [](const std::string& value) { return value.empty() ? std::string("(none)") : value; };
  std::string text = reasons.objects.empty() ? "" : "why:\n";
  for (const auto& object : reasons.objects) {
    const auto& id = object.id;
    text += "  " + ItemName(id.component, id.group, id.key, id.instanceId) +
            (object.action.empty() ? "" : " (" + object.action + ")") + ": needs " + Requirement(object.impact) + "\n";
    for (const ImpactReason& r : object.reasons) {
      text += "      ";
      if (r.rule == ImpactReason::Rule::kPlugin) {
        text += "plugin " + r.plugin + ": " + (r.reason.empty() ? "(no reason given)" : r.reason) + "\n";
        continue;
      }
      text += ReportPathToItemName(r.path, root, r.oldValue.empty() ? nullptr : r.oldValue.c_str()) + ": " +
              shown(r.oldValue) + " -> " + shown(r.newValue);
      text += r.rule == ImpactReason::Rule::kPropertyTrigger
                  ? " (a trigger value of the property)\n"
                  : " (" + object.action + " of this key needs " + Requirement(r.impact) + ")\n";
    }
  }
  return text;
}

void AddErrorInfo(rapidjson::Value& object, const HoxConfigManager::ErrorInfo& error,
                  rapidjson::Document::AllocatorType& a) {
  rapidjson::Value args(rapidjson::kArrayType);
  for (const std::string& arg : error.args) args.PushBack(rapidjson::Value(arg, a), a);
  object.AddMember("id", rapidjson::Value(error.id, a), a);
  object.AddMember("args", args, a);
  object.AddMember("message", rapidjson::Value(error.message, a), a);
}

}  // namespace hoxcfg
