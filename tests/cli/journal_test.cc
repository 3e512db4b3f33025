// Log records in the journal: the native protocol's fields, the thread's
// log context, and hoxcfg's records of real operations, read from a journal
// socket under a temporary root (no journald needed).
#include <gtest/gtest.h>

#include <cstdint>
#include <cstdlib>
#include <map>
#include <set>
#include <string>
#include <vector>

#include <hoxcm/host.h>

#include "support/datagram_socket.h"
#include "support/run_hoxcfg.h"

namespace hoxcm_test {
namespace {

using Record = std::map<std::string, std::string>;
using HoxPlatform::LogContext;

// One datagram of the native protocol: "NAME=value\n" fields, or "NAME\n",
// a 64-bit little-endian length, the value and "\n".
Record Parse(const std::string& datagram) {
  Record record;
  std::size_t at = 0;
  while (at < datagram.size()) {
    const std::size_t end = datagram.find('\n', at);
    const std::string line = datagram.substr(at, end - at);
    const std::size_t equals = line.find('=');
    if (equals != std::string::npos) {
      record[line.substr(0, equals)] = line.substr(equals + 1);
      at = end + 1;
      continue;
    }
    std::uint64_t size = 0;
    for (int i = 0; i < 8; ++i) size |= std::uint64_t(static_cast<unsigned char>(datagram[end + 1 + i])) << (8 * i);
    record[line] = datagram.substr(end + 9, size);
    at = end + 9 + size + 1;
  }
  return record;
}

std::vector<Record> Records(DatagramSocket& journal) {
  std::vector<Record> records;
  for (const std::string& datagram : journal.Received()) records.push_back(Parse(datagram));
  return records;
}

class JournalTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_TRUE(journal_.bound());
    ::setenv("HOX_LOG_JOURNAL", "1", 1);
    ::setenv("HOX_LOG_LEVEL", "info", 1);
  }
  void TearDown() override {
    ::unsetenv("HOX_LOG_JOURNAL");
    ::unsetenv("HOX_LOG_LEVEL");
  }
  TempRoot root_;
  DatagramSocket journal_{root_, std::string(HoxPlatform::HostPaths::kJournalSocket)};
};

TEST_F(JournalTest, RecordsCarryTheirPriorityIdentifierAndTheThreadsContext) {
  // Given nested contexts, each record carries the fields set when it was
  // written, a multi-line message survives whole, and nothing reaches
  // stderr while the journal takes the records.
  testing::internal::CaptureStderr();
  {
    const LogContext operation(LogContext::Field::kOperation, "Apply");
    CSLogger::Log(CSLogger::kError, "first %d", 1);
    {
      const LogContext plugin(LogContext::Field::kPlugin, "network");
      const LogContext object(LogContext::Field::kObject, "/network/dns/config");
      CSLogger::Log(CSLogger::kInfo, "two\nlines");
      const LogContext inner(LogContext::Field::kPlugin, "network:vswitch");
      CSLogger::Log(CSLogger::kWarning, "inner");
    }
    CSLogger::Log(CSLogger::kInfo, "plugin done");
  }
  CSLogger::Log(CSLogger::kInfo, "outside");
  CSLogger::Log(CSLogger::kDetail, "below the threshold");
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "");

  const std::vector<Record> records = Records(journal_);
  const std::vector<Record> expected = {
      {{"PRIORITY", "3"}, {"MESSAGE", "first 1"}, {"HOXCM_OPERATION", "Apply"}},
      {{"PRIORITY", "6"}, {"MESSAGE", "two\nlines"}, {"HOXCM_OPERATION", "Apply"}, {"HOXCM_PLUGIN", "network"},
       {"HOXCM_OBJECT", "/network/dns/config"}},
      {{"PRIORITY", "4"}, {"MESSAGE", "inner"}, {"HOXCM_OPERATION", "Apply"}, {"HOXCM_PLUGIN", "network:vswitch"},
       {"HOXCM_OBJECT", "/network/dns/config"}},
      {{"PRIORITY", "6"}, {"MESSAGE", "plugin done"}, {"HOXCM_OPERATION", "Apply"}},
      {{"PRIORITY", "6"}, {"MESSAGE", "outside"}},
  };
  ASSERT_EQ(records.size(), expected.size());
  for (std::size_t i = 0; i < records.size(); ++i) {
    Record want = expected[i];
    want["SYSLOG_IDENTIFIER"] = "hoxcm";
    EXPECT_EQ(records[i], want) << "record " << i;
  }
}

TEST_F(JournalTest, HoxcfgRecordsItsOperationsPluginsAndObjectsWithoutSecrets) {
  // Given a sample host and a desired document that adds a firewall rule
  // (maintenance mode, by the network plugin's verdict) and changes a
  // user's password, hoxcfg impact and validate should leave records of
  // their operation, the plugins they ran and the objects they judged in the
  // journal, and the new password in none of them.
  ::unsetenv("HOX_LOG_LEVEL");  // hoxcfg keeps information lines for the journal
  ASSERT_EQ(RunHoxcfg(root_, "init --sample").exitCode, 0);
  const std::string desired = ExportWith(
      root_, "desired.json",
      {{"/security/accounts/users/1/password", R"("Journal-Secret-4711")"},
       {"/network/firewall/rules/-", R"({"action": "allow", "name": "https-in", "port": 443, "protocol": "tcp"})"}});
  for (const char* command : {"impact", "validate"}) {
    const HoxcfgOutcome outcome = RunHoxcfg(root_, std::string(command) + " " + desired);
    EXPECT_LE(outcome.exitCode, 1) << command << ": " << outcome.err;
    EXPECT_FALSE(Has(outcome.err, "hoxcm[")) << "log lines on stderr: " << outcome.err;
  }
  std::set<std::string> seen;
  for (const Record& record : Records(journal_)) {
    EXPECT_EQ(record.at("SYSLOG_IDENTIFIER"), "hoxcm");
    for (const auto& [name, value] : record) {
      EXPECT_FALSE(Has(value, "Journal-Secret")) << name << "=" << value;
      if (name.rfind("HOXCM_", 0) == 0) seen.insert(name + "=" + value);
    }
  }
  for (const char* field : {"HOXCM_OPERATION=Impact", "HOXCM_OPERATION=Validate", "HOXCM_PLUGIN=network",
                            "HOXCM_OBJECT=/network/firewall/rules"}) {
    EXPECT_TRUE(seen.count(field)) << field;
  }
}

}  // namespace
}  // namespace hoxcm_test
