// The drift walk over the sample host's keys: which differences are reported,
// in which order, under which paths and identities.
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "drift/drift_fixture.h"

namespace {

using hoxcm_test::Calls;
using hoxcm_test::Parse;
using hoxcm_test::RecordingHandler;

class DriftWalkTest : public ::testing::Test {
 protected:
  DriftWalkTest() { root_.InstallSampleSchemas(); }

  // The calls of the walk of `desired` against `current`.
  static Calls Walk(const std::string& desired, const std::string& current, const RecordingHandler& handler = {}) {
    HoxConfigManager::Document d = Parse(desired);
    return hoxcm_test::Walk(d, Parse(current), handler);
  }

  hoxcm_test::TempRoot root_;
};

// Object-level calls only, members only, and members without consolidation.
const RecordingHandler kObjects, kMembers(false, false, false), kPerProperty(false, false, true);

TEST_F(DriftWalkTest, ReportsEachDifferenceWithItsActionInWalkOrder) {
  struct Case {
    const char* what;
    std::string desired, current;
    RecordingHandler handler;
    Calls calls;
  };
  const std::string options = R"({"system":{"kernel":{"boot_options":{"iommu":true,"hugepages":4096}}}})";
  const std::string k = "/system/kernel/boot_options", m = "/storage/nfs/mounts";
  const std::string dns = R"({"network":{"dns":{"config":{"servers":["1.1.1.1","8.8.8.8"]}}}})";
  const std::string v = "/network/interfaces/vnic", vnic0 = R"({"name":"vnic0","portgroup":"Management",)";
  const std::string vnic1 = R"({"name":"vnic1","portgroup":"Storage","mtu":9000})";
  const std::string vnic0New = vnic0 + R"("mtu":9000,"ipv4":{"address":"10.0.0.6"}})";
  const std::string vnic0Old = vnic0 + R"("mtu":1500,"ipv4":{"address":"10.0.0.5"}})";
  const std::vector<Case> cases = {
      {"named instances: properties before their Set, leftovers numbered after the desired ones",
       R"({"network":{"interfaces":{"vnic":[)" + vnic0New + R"(,{"name":"vnic2"}]}}})",
       R"({"network":{"interfaces":{"vnic":[)" + vnic1 + "," + vnic0Old + "]}}}", kObjects,
       {"Property SET " + v + "/0/mtu 9000 1500", "Property SET " + v + "/0/ipv4/address \"10.0.0.6\" \"10.0.0.5\"",
        "Set " + v + "/0 [vnic0] " + vnic0New + " " + vnic0Old, "Add " + v + "/1 [vnic2] {\"name\":\"vnic2\"}",
        "Delete " + v + "/2 [vnic1] " + vnic1}},
      {"members: desired ones first, then those only the host holds; empty counts as absent",
       R"({"storage":{"nfs":{"mounts":[{"name":"m","server":"s","export":"","readOnly":true}]}}})",
       R"({"storage":{"nfs":{"mounts":[{"name":"m","export":"/e","server":"s","cs_generated_id":"x"}]}}})", kMembers,
       {"Property DELETE " + m + "/0/export \"\" \"/e\"", "Property ADD " + m + "/0/readOnly true null"}},
      {"empty singleton counts as absent", R"({"system":{"kernel":{"boot_options":{}}}})", "{}", kObjects, {}},
      {"singleton added per property", options, "{}", kPerProperty,
       {"Property ADD " + k + "/iommu true null", "Property ADD " + k + "/hugepages 4096 null"}},
      {"singleton deleted per property", "{}", options, kPerProperty,
       {"Property DELETE " + k + "/iommu null true", "Property DELETE " + k + "/hugepages null 4096"}},
      {"scalar arrays ignore order", R"({"network":{"dns":{"config":{"servers":["8.8.8.8","1.1.1.1"]}}}})", dns,
       kMembers, {}},
      {"scalar arrays change as a whole", R"({"network":{"dns":{"config":{"servers":["8.8.8.8"]}}}})", dns, kMembers,
       {R"(Property SET /network/dns/config/servers ["8.8.8.8"] ["1.1.1.1","8.8.8.8"])"}},
      {"a singleton the host lacks is a Set against null; host-only items, without default, are deleted after "
       "the forward pass, in host order",
       R"({"storage":{"nfs":{"mounts":[{"name":"b"}]}},"system":{"kernel":{"boot_options":{"iommu":true}}}})",
       R"({"quorlet":{"system":{"quorlet_daemon":{"enabled":true}}},"storage":{"iscsi":{"targets":[{"iqn":"i"}]}}})",
       kObjects,
       {"Add " + m + "/0 [b] {\"name\":\"b\"}", "Set " + k + " {\"iommu\":true} null",
        "Delete /quorlet/system/quorlet_daemon {\"enabled\":true}",
        "Delete /storage/iscsi/targets/0 [i] {\"iqn\":\"i\"}"}},
  };
  for (const Case& c : cases) EXPECT_EQ(Walk(c.desired, c.current, c.handler), c.calls) << c.what;
}

// The reference rule: each desired instance takes the first unmatched host
// instance that matches it, in host order; leftovers are deleted in host
// order, numbered after the desired instances.
Calls Reference(const std::vector<std::string>& desired, const std::vector<std::string>& host, bool named) {
  const std::string p = named ? "/storage/nfs/mounts/" : "/network/routes/static/";
  std::vector<bool> matched(host.size(), false);
  Calls calls;
  for (size_t i = 0; i < desired.size(); ++i) {
    size_t j = 0;
    while (j < host.size() && (matched[j] || host[j] != desired[i])) ++j;
    if (j == host.size()) {
      calls.push_back("Add " + p + std::to_string(i) + " [" + (named ? desired[i] : "d" + std::to_string(i)) + "]");
      continue;
    }
    matched[j] = true;
    if (named) {
      calls.push_back("Property SET " + p + std::to_string(i) + "/server \"d" + std::to_string(i) + "\" \"h" +
                      std::to_string(j) + "\"");
    }
  }
  size_t next = desired.size();
  for (size_t j = 0; j < host.size(); ++j) {
    if (!matched[j]) {
      const std::string id = named ? host[j] : "h" + std::to_string(j);
      calls.push_back("Delete " + p + std::to_string(next++) + " [" + id + "]");
    }
  }
  return calls;
}

// One multi-instance key holding `names`: NFS mounts named by them, or static
// routes (generated identities) whose destination they are.
std::string Instances(const std::vector<std::string>& names, bool named, const char* side) {
  std::string out = named ? R"({"storage":{"nfs":{"mounts":[)" : R"({"network":{"routes":{"static":[)";
  for (size_t i = 0; i < names.size(); ++i) {
    const std::string tag = side + std::to_string(i);
    out += (i ? "," : "") + (named ? R"({"name":")" + names[i] + R"(","server":")" + tag + "\"}"
                                   : R"({"destination":")" + names[i] + R"(","cs_generated_id":")" + tag + "\"}");
  }
  return out + "]}}}";
}

TEST_F(DriftWalkTest, MatchingFollowsTheFirstUnmatchedHostInstanceRule) {
  // Given random instance lists with many duplicates, in runs long and short
  // (so that both the positional and the indexed matching are used), the
  // walk pairs instances exactly as the reference rule does, for named and
  // generated identities: equal routes match whatever their ids, a changed
  // one is an Add and a Delete.
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
    Calls calls = Walk(Instances(desired, named, "d"), Instances(host, named, "h"), kMembers);
    // Values are not part of the rule: keep path and identity.
    for (std::string& call : calls) {
      if (call.rfind("Property", 0) != 0) call = call.substr(0, call.find(']') + 1);
    }
    EXPECT_EQ(calls, Reference(desired, host, named)) << "round " << round;
  }
}

}  // namespace
