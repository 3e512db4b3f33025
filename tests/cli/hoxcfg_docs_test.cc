// docs/cli.md against the tool: a section "## hoxcfg COMMAND" per command,
// whose first text block is what `hoxcfg COMMAND --help` prints, and JSON
// examples that are JSON and have the shape of what `--json` prints.
#include <gtest/gtest.h>

#include <fstream>
#include <iterator>
#include <map>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include <hoxcm/documents.h>

#include "support/run_hoxcfg.h"
#include "support/temp_root.h"

namespace hoxcm_test {
namespace {

struct Section {
  std::string help;               // the first ```text block
  std::vector<std::string> json;  // every ```json block
};

std::map<std::string, Section> ReadSections() {
  std::ifstream doc(SourcePath("docs/cli.md"));
  const std::string markdown{std::istreambuf_iterator<char>(doc), std::istreambuf_iterator<char>()};
  std::map<std::string, Section> sections;
  std::istringstream in(markdown);
  std::string line, command, fence, block;
  bool inBlock = false, inSection = false;
  while (std::getline(in, line)) {
    if (inBlock) {
      if (line != "```") {
        block += line + "\n";
        continue;
      }
      inBlock = false;
      Section& s = sections[command];
      if (fence == "json") s.json.push_back(block);
      if (fence == "text" && s.help.empty()) s.help = block;
    } else if (line.rfind("```", 0) == 0) {
      inBlock = inSection;
      fence = line.substr(3);
      block.clear();
    } else if (line.rfind("## ", 0) == 0) {
      inSection = line == "## hoxcfg" || line.rfind("## hoxcfg ", 0) == 0;
      command = inSection ? line.substr(9) : "";
      if (inSection) sections[command];
    }
  }
  return sections;
}

// The commands a help text lists under "Commands:".
std::vector<std::string> SubcommandsIn(const std::string& help) {
  std::vector<std::string> names;
  std::istringstream in(help.substr(std::min(help.size(), help.find("\nCommands:\n"))));
  std::string line;
  std::getline(in, line);
  std::getline(in, line);
  while (std::getline(in, line) && line.rfind("  ", 0) == 0) names.push_back(line.substr(2, line.find(' ', 2) - 2));
  return names;
}

TEST(HoxcfgDocsTest, EveryCommandIsDocumentedWithItsHelpAndJsonExamples) {
  TempRoot root;
  const std::map<std::string, Section> sections = ReadSections();
  std::set<std::string> commands;
  std::vector<std::string> pending = {""};
  while (!pending.empty()) {
    const std::string command = pending.back();
    pending.pop_back();
    commands.insert(command);
    const HoxcfgOutcome help = RunHoxcfg(root, command + " --help");
    ASSERT_EQ(help.exitCode, 0) << command;
    std::string expected = help.out;
    while (!expected.empty() && expected.back() == '\n') expected.pop_back();
    const auto section = sections.find(command.empty() ? "" : " " + command);
    ASSERT_NE(section, sections.end()) << "docs/cli.md has no section \"## hoxcfg " << command << "\"";
    EXPECT_EQ(section->second.help, expected + "\n")
        << "docs/cli.md, section \"hoxcfg " << command << "\": its help block must read\n" << expected;
    for (const std::string& example : section->second.json) {
      HoxConfigManager::Document doc;
      EXPECT_NO_THROW(HoxConfigManager::ParseDocument(example, doc)) << command << ":\n" << example;
    }
    for (const std::string& sub : SubcommandsIn(help.out)) pending.push_back(command.empty() ? sub : command + " " + sub);
  }
  EXPECT_EQ(sections.size(), commands.size()) << "docs/cli.md documents a command that hoxcfg does not have";
}


using HoxConfigManager::Document;
using rapidjson::Value;

const char* KindOf(const Value& v) {
  if (v.IsObject()) return "object";
  if (v.IsArray()) return "array";
  if (v.IsString()) return "string";
  if (v.IsNumber()) return "number";
  if (v.IsBool()) return "boolean";
  return "null";
}

// The members documented for the elements of an array: those of every
// element of the example (elements may differ, as a plugin's reason and a
// rule's do), the first example of each member standing for it.
void MergeElements(const Value& array, Value& merged, Document::AllocatorType& allocator) {
  merged.SetObject();
  for (const Value& element : array.GetArray()) {
    if (!element.IsObject()) {
      merged.CopyFrom(element, allocator);
      return;
    }
    for (const auto& member : element.GetObject()) {
      if (!merged.HasMember(member.name)) {
        merged.AddMember(Value(member.name, allocator), Value(member.value, allocator), allocator);
      }
    }
  }
}

// Faults of `actual` against the documented `example`: a member the example
// lacks, or a value of another kind. A member the output leaves out is
// optional ("error" only on failure); a documented null may be anything.
void CompareShape(const Value& example, const Value& actual, const std::string& path,
                  std::vector<std::string>& faults) {
  if (example.IsNull() || actual.IsNull()) return;
  if (std::string(KindOf(example)) != KindOf(actual)) {
    faults.push_back(path + ": " + KindOf(actual) + ", documented as " + KindOf(example));
    return;
  }
  if (actual.IsObject()) {
    for (const auto& member : actual.GetObject()) {
      const std::string at = path + "/" + member.name.GetString();
      const auto documented = example.FindMember(member.name);
      if (documented == example.MemberEnd()) {
        faults.push_back(at + ": not documented");
      } else {
        CompareShape(documented->value, member.value, at, faults);
      }
    }
  } else if (actual.IsArray() && !example.Empty()) {
    Document merged;
    MergeElements(example, merged, merged.GetAllocator());
    for (rapidjson::SizeType i = 0; i < actual.Size(); ++i) {
      CompareShape(merged, actual[i], path + "/" + std::to_string(i), faults);
    }
  }
}

TEST(HoxcfgDocsTest, EveryJsonOutputHasTheDocumentedShape) {
  // Given the sample host and a desired document that adds a firewall rule
  // (maintenance mode), each command's --json output should have the shape
  // of its documented example: its member names, and the kinds of their
  // values, at every depth.
  TempRoot root, fresh;
  ASSERT_EQ(RunHoxcfg(root, "init --sample").exitCode, 0);
  const std::string desired = ExportWith(
      root, "desired.json", {{"/network/firewall/rules/-", R"({"action": "allow", "name": "web", "port": 443, "protocol": "tcp"})"}});
  root.WriteFile("/tmp/schema.json", R"({"type": "object", "properties": {"mtu": {"type": "integer", "minimum": 1280}}})");
  root.WriteFile("/tmp/value.json", R"({"mtu": 9})");
  root.WriteFile("/tmp/syslog.json", R"({"remoteHost": "logs.example.com", "port": 514, "protocol": "udp"})");
  root.WriteFile("/tmp/smartnic.json", R"({"smartnic": {"ports": {"uplink": {"mtu": 9000}}}})");
  // In order: what changes the host comes after what only reads it.
  const std::vector<std::pair<std::string, std::string>> runs = {
      {"init", "--root " + fresh.path() + " init --sample --reset"},  // the temporary root has a store already
      {"schemas", "schemas"},
      {"schema-check", "schema-check " + root.Path("/tmp/schema.json") + " " + root.Path("/tmp/value.json")},
      {"plugins list", "plugins list"},
      {"plugins check", "plugins check"},
      {"compliance", "compliance " + desired},
      {"drift", "drift " + desired},
      {"validate", "validate " + desired},
      {"impact", "impact " + desired},
      {"plan", "plan " + desired},
      {"maintenance status", "maintenance status"},
      {"maintenance enter", "--yes maintenance enter"},
      {"apply", "--yes apply " + desired},
      {"maintenance exit", "--yes maintenance exit"},
      {"history", "history"},
      {"get", "get services/syslog/config"},
      {"set", "--yes set services/syslog/config --file " + root.Path("/tmp/syslog.json")},
      {"delete", "--yes delete services/syslog/config"},
      {"bootstrap", "--yes bootstrap " + desired},
      {"boot run", "--yes boot run"},
      {"boot complete", "--yes boot complete"},
      {"boot status", "boot status"},
      {"smartnic set", "--yes smartnic set " + root.Path("/tmp/smartnic.json")},
  };
  const std::map<std::string, Section> sections = ReadSections();
  std::set<std::string> checked;
  for (const auto& [command, args] : runs) {
    SCOPED_TRACE("hoxcfg --json " + args);
    const HoxcfgOutcome outcome = RunHoxcfg(root, "--json " + args);
    ASSERT_TRUE(outcome.exitCode <= 1 || outcome.exitCode == 3) << outcome.err;  // 3: staged
    const auto section = sections.find(" " + command);
    ASSERT_NE(section, sections.end());
    if (section->second.json.empty()) continue;  // a stream of events (apply), shown as text
    checked.insert(command);
    Document example, actual;
    HoxConfigManager::ParseDocument(section->second.json.front(), example);
    ASSERT_NO_THROW(HoxConfigManager::ParseDocument(outcome.out, actual)) << outcome.out;
    std::vector<std::string> faults;
    CompareShape(example, actual, "", faults);
    for (const std::string& fault : faults) ADD_FAILURE() << "docs/cli.md, hoxcfg " << command << ": " << fault;
  }
  for (const auto& [name, section] : sections) {
    if (!section.json.empty()) {
      EXPECT_TRUE(checked.count(name.substr(1)))
          << "no run checks the JSON documented for hoxcfg" << name << ": add one to the table above";
    }
  }
}

}  // namespace
}  // namespace hoxcm_test
