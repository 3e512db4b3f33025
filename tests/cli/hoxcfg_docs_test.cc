// docs/cli.md against the tool: a section "## hoxcfg COMMAND" per command,
// whose first text block is what `hoxcfg COMMAND --help` prints, and JSON
// examples that are JSON.
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

namespace hoxcm_test {
namespace {

struct Section {
  std::string help;               // the first ```text block
  std::vector<std::string> json;  // every ```json block
};

std::map<std::string, Section> ReadSections(const std::string& markdown) {
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
  std::ifstream doc(SourcePath("docs/cli.md"));
  const std::map<std::string, Section> sections =
      ReadSections(std::string(std::istreambuf_iterator<char>(doc), std::istreambuf_iterator<char>()));
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

}  // namespace
}  // namespace hoxcm_test
