// The drift walk over the sample host's keys: which differences are reported,
// in which order, under which paths and identities.
#include <fstream>
#include <iterator>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <hoxcm/documents.h>
#include <hoxcm/drift.h>

#include "drift/recording_handler.h"
#include "support/temp_root.h"

namespace {

using HoxConfigManager::Document;
using Calls = std::vector<std::string>;

class DriftWalkTest : public ::testing::Test {
 protected:
  DriftWalkTest() { root_.InstallSampleSchemas(); }

  static Document Parse(const std::string& text) {
    Document doc;
    HoxConfigManager::ParseDocument(text, doc);
    return doc;
  }

  // Runs the walk of `desired` against `current` and returns the calls.
  Calls Walk(const std::string& desired, const std::string& current, hoxcm_test::RecordingHandler handler = {}) {
    Document d = Parse(desired);
    HoxConfigManager::ComputeDrift(d, d.GetAllocator(), handler, Parse(current));
    records_ = handler.records;
    return handler.calls;
  }

  hoxcm_test::TempRoot root_;
  std::vector<std::string> records_;
};

const char* kVnics = R"({"network":{"interfaces":{"vnic":[
  {"name":"vnic0","portgroup":"Management","mtu":1500,"ipv4":{"address":"10.0.0.5","netmask":"255.255.255.0"}},
  {"name":"vnic1","portgroup":"Storage","mtu":9000}]}}})";

TEST_F(DriftWalkTest, IdenticalDocumentsReportNothingBareOrWrapped) {
  // Given the sample host's own configuration as desired document, bare or
  // wrapped in "profile", no handler call should be made.
  const std::string config = [] {
    std::ifstream in(hoxcm_test::SourcePath("data/sample-host/user-config.json"));
    return std::string(std::istreambuf_iterator<char>(in), {});
  }();
  EXPECT_EQ(Walk(config, config), Calls{});
  EXPECT_EQ(Walk("{\"profile\":" + config + "}", config), Calls{});
}

TEST_F(DriftWalkTest, NamedInstancesReportPropertiesBeforeTheirSet) {
  // Given a changed, an added and a removed vnic, the changed one should
  // report its properties and then one Set; the removed one is numbered after
  // the desired instances.
  const Calls calls = Walk(R"({"network":{"interfaces":{"vnic":[
      {"name":"vnic0","portgroup":"Management","mtu":9000,"ipv4":{"address":"10.0.0.6","netmask":"255.255.255.0"}},
      {"name":"vnic2","portgroup":"VM"}]}}})",
                           kVnics);
  const std::string p = "/network/interfaces/vnic";
  ASSERT_EQ(calls.size(), 5u) << ::testing::PrintToString(calls);
  EXPECT_EQ(calls[0], "Property SET " + p + "/0/mtu 9000 1500");
  EXPECT_EQ(calls[1], "Property SET " + p + "/0/ipv4/address \"10.0.0.6\" \"10.0.0.5\"");
  EXPECT_EQ(calls[2].rfind("Set " + p + "/0 [vnic0] ", 0), 0u) << calls[2];
  EXPECT_EQ(calls[3], "Add " + p + "/1 [vnic2] {\"name\":\"vnic2\",\"portgroup\":\"VM\"}");
  EXPECT_EQ(calls[4], "Delete " + p + "/2 [vnic1] {\"name\":\"vnic1\",\"portgroup\":\"Storage\",\"mtu\":9000}");
  // The drift record names the instance and marks each changed property.
  ASSERT_EQ(records_.size(), 1u);
  EXPECT_EQ(records_[0],
            R"({"DRIFTOBJ":{"INSTANCEID":"vnic0","DRIFTOP":"SET"},"mtu":{"DRIFTOBJ":{"INSTANCEID":"vnic0","DRIFTOP":"SET"}},)"
            R"("ipv4":{"DRIFTOBJ":{"INSTANCEID":"vnic0","DRIFTOP":"SET"},)"
            R"("address":{"DRIFTOBJ":{"INSTANCEID":"vnic0","DRIFTOP":"SET"}}}})");
}

TEST_F(DriftWalkTest, PropertyActionsFollowWhichSideHoldsTheMember) {
  // Given members added, removed and emptied, each is reported with its
  // action: desired members first, then members only the host holds.
  const Calls calls = Walk(
      R"({"storage":{"nfs":{"mounts":[{"name":"m","server":"s","export":"","readOnly":true}]}}})",
      R"({"storage":{"nfs":{"mounts":[{"name":"m","export":"/e","server":"s","cs_generated_id":"x"}]}}})",
      hoxcm_test::RecordingHandler(false, false, false));
  EXPECT_EQ(calls, (Calls{"Property DELETE /storage/nfs/mounts/0/export \"\" \"/e\"",
                          "Property ADD /storage/nfs/mounts/0/readOnly true null"}));
}

TEST_F(DriftWalkTest, LeftoverHostInstancesAreNumberedAfterTheDesiredOnes) {
  // Given two desired instances and three host instances of which the middle
  // one matches, the two others are deleted as /2 and /3, in host order.
  const Calls calls = Walk(
      R"({"storage":{"nfs":{"mounts":[{"name":"a","server":"s"},{"name":"b","server":"s"}]}}})",
      R"({"storage":{"nfs":{"mounts":[{"name":"x","server":"s"},{"name":"b","server":"s"},{"name":"y","server":"s"}]}}})");
  EXPECT_EQ(calls, (Calls{"Add /storage/nfs/mounts/0 [a] {\"name\":\"a\",\"server\":\"s\"}",
                          "Delete /storage/nfs/mounts/2 [x] {\"name\":\"x\",\"server\":\"s\"}",
                          "Delete /storage/nfs/mounts/3 [y] {\"name\":\"y\",\"server\":\"s\"}"}));
}

TEST_F(DriftWalkTest, DuplicateIdentitiesMatchTheFirstUnmatchedHostInstance) {
  const Calls calls = Walk(R"({"storage":{"nfs":{"mounts":[{"name":"a","server":"2"}]}}})",
                           R"({"storage":{"nfs":{"mounts":[{"name":"a","server":"1"},{"name":"a","server":"2"}]}}})",
                           hoxcm_test::RecordingHandler(false, false, false));
  EXPECT_EQ(calls, (Calls{"Property SET /storage/nfs/mounts/0/server \"2\" \"1\"",
                          "Delete /storage/nfs/mounts/1 [a] {\"name\":\"a\",\"server\":\"2\"}"}));
}

TEST_F(DriftWalkTest, GeneratedIdentitiesReportAChangeAsAddAndDelete) {
  // Given a route whose gateway changed, there is no Set: the new content is
  // added (under its own generated id) and the old one deleted; equal routes
  // match whatever their ids and positions.
  const Calls calls = Walk(R"({"network":{"routes":{"static":[
        {"destination":"10.1.0.0/16","gateway":"10.0.0.2","metric":1,"cs_generated_id":"new"},
        {"destination":"10.2.0.0/16","gateway":"10.0.0.1"}]}}})",
                           R"({"network":{"routes":{"static":[
        {"destination":"10.2.0.0/16","gateway":"10.0.0.1","cs_generated_id":"r2"},
        {"destination":"10.1.0.0/16","gateway":"10.0.0.1","metric":1,"cs_generated_id":"r1"}]}}})");
  const std::string p = "/network/routes/static";
  ASSERT_EQ(calls.size(), 2u) << ::testing::PrintToString(calls);
  EXPECT_EQ(calls[0].rfind("Add " + p + "/0 [new] ", 0), 0u) << calls[0];
  EXPECT_EQ(calls[1].rfind("Delete " + p + "/2 [r1] ", 0), 0u) << calls[1];
}

TEST_F(DriftWalkTest, SingleObjectsMissingOnOneSideAreReportedWholeOrPerProperty) {
  const std::string options = R"({"system":{"kernel":{"boot_options":{"iommu":true,"hugepages":4096}}}})";
  const std::string k = "/system/kernel/boot_options";
  // Whole: a singleton the host lacks is a Set with the absent host value;
  // one only the host holds (no default configuration) is a Delete.
  EXPECT_EQ(Walk(options, "{}"), (Calls{"Set " + k + " {\"iommu\":true,\"hugepages\":4096} null"}));
  EXPECT_EQ(Walk("{}", options), (Calls{"Delete " + k + " {\"iommu\":true,\"hugepages\":4096}"}));
  // An empty object counts as absent, on either side.
  EXPECT_EQ(Walk(R"({"system":{"kernel":{"boot_options":{}}}})", "{}"), Calls{});
  // Per property: each member is reported on its own, and no Set without
  // the consolidated flag.
  const hoxcm_test::RecordingHandler perProperty(false, false, true);
  EXPECT_EQ(Walk(options, "{}", perProperty),
            (Calls{"Property ADD " + k + "/iommu true null", "Property ADD " + k + "/hugepages 4096 null"}));
  EXPECT_EQ(Walk("{}", options, perProperty),
            (Calls{"Property DELETE " + k + "/iommu null true", "Property DELETE " + k + "/hugepages null 4096"}));
}

TEST_F(DriftWalkTest, ArraysOfScalarsChangeAsAWholeAndIgnoreOrder) {
  const std::string host = R"({"network":{"dns":{"config":{"servers":["1.1.1.1","8.8.8.8"]}}}})";
  EXPECT_EQ(Walk(R"({"network":{"dns":{"config":{"servers":["8.8.8.8","1.1.1.1"]}}}})", host), Calls{});
  const Calls calls = Walk(R"({"network":{"dns":{"config":{"servers":["8.8.8.8"]}}}})", host,
                           hoxcm_test::RecordingHandler(false, false, false));
  EXPECT_EQ(calls, (Calls{R"(Property SET /network/dns/config/servers ["8.8.8.8"] ["1.1.1.1","8.8.8.8"])"}));
}

struct MalformedCase {
  const char* what;
  const char* desired;
  int code;
  const char* message;
};

TEST_F(DriftWalkTest, MalformedDocumentsThrowBeforeReportingTheFaultyItem) {
  const std::vector<MalformedCase> cases = {
      {"document is an array", "[]", 2000, "Invalid JSON"},
      {"component is a string", R"({"network":"x"})", 2000, "Invalid JSON"},
      {"group is an array", R"({"network":{"dns":[]}})", 2000, "Invalid JSON"},
      {"singleton is an array", R"({"network":{"dns":{"config":[]}}})", 2000, "Invalid JSON"},
      {"instances are an object", R"({"storage":{"nfs":{"mounts":{}}}})", 2000, "Invalid JSON"},
      {"instance is a string", R"({"storage":{"nfs":{"mounts":["a"]}}})", 2000, "Invalid JSON"},
      {"instance without identity", R"({"storage":{"nfs":{"mounts":[{"name":"a"},{"server":"s"}]}}})", 2000,
       "Invalid JSON"},
      {"identity is a number", R"({"storage":{"nfs":{"mounts":[{"name":1}]}}})", 2000, "Invalid JSON"},
      {"key without schema", R"({"no":{"such":{"key":{}}}})", 2021, "Schema object not found: /no/such/key"},
  };
  for (const MalformedCase& c : cases) {
    hoxcm_test::RecordingHandler handler;
    Document d = Parse(c.desired);
    try {
      HoxConfigManager::ComputeDrift(d, d.GetAllocator(), handler, Parse("{}"));
      ADD_FAILURE() << c.what << ": no exception";
    } catch (const HoxConfigStore::ConfigStoreException& e) {
      EXPECT_EQ(e.GetErrorCode(), c.code) << c.what;
      EXPECT_STREQ(e.what(), c.message) << c.what;
    }
    EXPECT_EQ(handler.calls, Calls{}) << c.what;
  }
}

TEST_F(DriftWalkTest, ItemsOnlyOnTheHostComeAfterTheForwardPassInHostOrder) {
  // Given additions in the desired document and items only on the host, the
  // additions come first in desired order, then the removals in host order.
  const Calls calls = Walk(
      R"({"storage":{"nfs":{"mounts":[{"name":"b"}]}},"system":{"kernel":{"boot_options":{"iommu":true}}}})",
      R"({"quorlet":{"system":{"quorlet_daemon":{"enabled":true}}},"storage":{"iscsi":{"targets":[{"iqn":"i"}]}}})");
  EXPECT_EQ(calls, (Calls{"Add /storage/nfs/mounts/0 [b] {\"name\":\"b\"}",
                          "Set /system/kernel/boot_options {\"iommu\":true} null",
                          "Delete /quorlet/system/quorlet_daemon {\"enabled\":true}",
                          "Delete /storage/iscsi/targets/0 [i] {\"iqn\":\"i\"}"}));
}

// The reference rule: each desired instance takes the first unmatched host
// instance that matches it, in host order; leftovers are deleted in host
// order, numbered after the desired instances.
Calls Reference(const std::vector<std::string>& desired, const std::vector<std::string>& host, bool named) {
  const std::string p = named ? "/storage/nfs/mounts" : "/network/routes/static";
  std::vector<bool> matched(host.size(), false);
  Calls calls;
  for (size_t i = 0; i < desired.size(); ++i) {
    size_t j = 0;
    while (j < host.size() && (matched[j] || host[j] != desired[i])) ++j;
    if (j < host.size()) {
      matched[j] = true;
      if (named) {
        calls.push_back("Property SET " + p + "/" + std::to_string(i) + "/server \"d" + std::to_string(i) + "\" \"h" +
                        std::to_string(j) + "\"");
      }
      continue;
    }
    calls.push_back("Add " + p + "/" + std::to_string(i) + " [" + (named ? desired[i] : "d" + std::to_string(i)) + "]");
  }
  size_t next = desired.size();
  for (size_t j = 0; j < host.size(); ++j) {
    if (matched[j]) continue;
    calls.push_back("Delete " + p + "/" + std::to_string(next++) + " [" + (named ? host[j] : "h" + std::to_string(j)) +
                    "]");
  }
  return calls;
}

TEST_F(DriftWalkTest, MatchingFollowsTheFirstUnmatchedHostInstanceRule) {
  // Given random instance lists with many duplicates, in runs long and short
  // (so that both the positional and the indexed matching are used), the
  // walk should pair instances exactly as the reference rule does.
  std::mt19937 rng(5);
  for (int round = 0; round < 60; ++round) {
    const bool named = round % 2 == 0;
    const size_t hostSize = rng() % (round < 30 ? 12 : 80), desiredSize = rng() % (round < 30 ? 12 : 80);
    const unsigned alphabet = 1 + rng() % 6;
    std::vector<std::string> host, desired;
    for (size_t j = 0; j < hostSize; ++j) host.push_back("n" + std::to_string(rng() % alphabet));
    // Mostly the host's order, with some changes, as real documents are.
    for (size_t i = 0; i < desiredSize; ++i) {
      desired.push_back(i < hostSize && rng() % 4 != 0 ? host[i] : "n" + std::to_string(rng() % alphabet));
    }
    std::string d = named ? R"({"storage":{"nfs":{"mounts":[)" : R"({"network":{"routes":{"static":[)";
    std::string h = d;
    for (size_t i = 0; i < desired.size(); ++i) {
      d += (i ? "," : "") + (named ? R"({"name":")" + desired[i] + R"(","server":"d)" + std::to_string(i) + "\"}"
                                   : R"({"destination":")" + desired[i] + R"(","cs_generated_id":"d)" +
                                         std::to_string(i) + "\"}");
    }
    for (size_t j = 0; j < host.size(); ++j) {
      h += (j ? "," : "") + (named ? R"({"name":")" + host[j] + R"(","server":"h)" + std::to_string(j) + "\"}"
                                   : R"({"destination":")" + host[j] + R"(","cs_generated_id":"h)" +
                                         std::to_string(j) + "\"}");
    }
    d += "]}}}";
    h += "]}}}";
    Calls calls = Walk(d, h, hoxcm_test::RecordingHandler(false, false, false));
    // Values are not part of the rule: keep path and identity.
    for (std::string& call : calls) {
      if (call.rfind("Property", 0) != 0) call = call.substr(0, call.find(']') + 1);
    }
    EXPECT_EQ(calls, Reference(desired, host, named)) << "round " << round;
  }
}

}  // namespace
