// The handlers built on the drift walk: the compliance report, the apply
// tasks and the boot-time tasks, on hand-written and generated documents.
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "doc_generator.h"
#include "drift/drift_fixture.h"

namespace {

using HoxConfigManager::ComplianceResult;
using HoxConfigManager::Document;
using hoxcm_test::Calls;
using hoxcm_test::Copy;
using hoxcm_test::Parse;
using hoxcm_test::Walk;

// The compliance report of `desired` against `current`.
ComplianceResult Check(Document& desired, const Document& current) {
  ComplianceResult result;
  HoxConfigManager::CheckComplianceHandler handler(&result);
  HoxConfigManager::ComputeDrift(desired, desired.GetAllocator(), handler, Copy(current));
  return result;
}

// Each task as "ACTION object-id value [drift record]".
Calls Describe(const std::vector<HoxConfigManager::DesiredConfigInput>& tasks) {
  Calls out;
  for (const auto& t : tasks) {
    out.push_back(t.action + " " + t.object->GetConfigStoreObjectId().toString() + " " + t.object->Serialize() +
                  (t.drift ? " " + HoxConfigManager::JsonToString(t.drift->GetDrift()) : ""));
  }
  return out;
}

class DriftHandlersTest : public ::testing::Test {
 protected:
  DriftHandlersTest() { root_.InstallSampleSchemas(); }
  hoxcm_test::TempRoot root_;
};

TEST_F(DriftHandlersTest, ComplianceReportLayout) {
  struct Case {
    const char* what;
    const char* desired;
    const char* current;
    const char* report;
  };
  const std::vector<Case> cases = {
      {"properties: an added one goes to SETS with its desired value only, a removed one to DELETES with its host "
       "value only",
       R"({"network":{"interfaces":{"vnic":[{"name":"vnic0","portgroup":"p"}]}}})",
       R"({"network":{"interfaces":{"vnic":[{"name":"vnic0","ipv4":{"address":"1.2.3.4"}}]}}})",
       R"({"ADDS":[],"DELETES":[{"path":"/network/interfaces/vnic/0/ipv4","hostValue":"{\"address\":\"1.2.3.4\"}"}],)"
       R"("SETS":[{"path":"/network/interfaces/vnic/0/portgroup","desiredValue":"\"p\""}]})"},
      {"whole objects: added instance, new singleton, removed instance; installer drift is ignored",
       R"({"storage":{"nfs":{"mounts":[{"name":"b"}]}},"system":{"kernel":{"boot_options":{"iommu":true}}},)"
       R"("hox":{"system":{"installer":{"mode":"iso","source":"a"}}}})",
       R"({"storage":{"nfs":{"mounts":[{"name":"a"}]}},"hox":{"system":{"installer":{"mode":"pxe","source":"a"}}}})",
       R"({"ADDS":[{"path":"/storage/nfs/mounts/0","desiredValue":"{\"name\":\"b\"}"},)"
       R"({"path":"/system/kernel/boot_options","desiredValue":"{\"iommu\":true}"}],)"
       R"("DELETES":[{"path":"/storage/nfs/mounts/1","hostValue":"{\"name\":\"a\"}"}],"SETS":[]})"},
      {"a singleton the host holds empty is set at object level with both values",
       R"({"system":{"kernel":{"boot_options":{"iommu":true}}}})", R"({"system":{"kernel":{"boot_options":{}}}})",
       R"({"ADDS":[{"path":"/system/kernel/boot_options","hostValue":"{}","desiredValue":"{\"iommu\":true}"}],)"
       R"("DELETES":[],"SETS":[]})"},
      {"sensitive values are masked in every entry",
       R"({"storage":{"iscsi":{"targets":[{"iqn":"q","chapSecret":"new-secret"}]}},)"
       R"("security":{"accounts":{"users":[{"name":"u","password":"pw"}]}}})",
       R"({"storage":{"iscsi":{"targets":[{"iqn":"q","chapSecret":"old-secret"}]}},)"
       R"("security":{"accounts":{"users":[{"name":"u","password":"pw"}]}}})",
       R"({"ADDS":[],"DELETES":[],"SETS":[{"path":"/storage/iscsi/targets/0/chapSecret","desiredValue":"\"******\"","hostValue":"\"******\""}]})"},
  };
  for (const Case& c : cases) {
    Document desired = Parse(c.desired);
    const ComplianceResult result = Check(desired, Parse(c.current));
    EXPECT_EQ(HoxConfigManager::JsonToString(result.document), c.report) << c.what;
    EXPECT_FALSE(result.compliant) << c.what;
  }
  // Installer drift alone leaves the host compliant.
  Document installer = Parse(R"({"hox":{"system":{"installer":{"mode":"iso","source":"a"}}}})");
  EXPECT_TRUE(Check(installer, Parse(R"({"hox":{"system":{"installer":{"mode":"pxe","source":"a"}}}})")).compliant);
}

TEST_F(DriftHandlersTest, ApplyTasksCarryObjectActionAndDrift) {
  // Given a changed, an added and a removed instance, the tasks are SET (with
  // a drift record marking each changed member, nested ones included), ADD,
  // then DELETE carrying the host value.
  const std::string vnic0New = R"({"name":"vnic0","mtu":9000,"ipv4":{"address":"10.0.0.6","netmask":"m"}})";
  const std::string vnic1 = R"({"name":"vnic1","mtu":9000})";
  Document d = Parse(R"({"network":{"interfaces":{"vnic":[)" + vnic0New + R"(,{"name":"vnic2"}]}}})");
  HoxConfigManager::ApplyTaskGenerator generator;
  HoxConfigManager::ComputeDrift(d, d.GetAllocator(), generator, Parse(R"({"network":{"interfaces":{"vnic":[)" +
      vnic1 + R"(,{"name":"vnic0","mtu":1500,"ipv4":{"address":"10.0.0.5","netmask":"m"}}]}}})"));
  const std::string key = "comp network grp interfaces key vnic id ";
  const std::string set = R"("DRIFTOBJ":{"INSTANCEID":"vnic0","DRIFTOP":"SET"})";
  EXPECT_EQ(Describe(generator.getTasks()),
            (Calls{"SET " + key + "vnic0 " + vnic0New + " {" + set + R"(,"mtu":{)" + set + R"(},"ipv4":{)" + set +
                       R"(,"address":{)" + set + "}}}",
                   "ADD " + key + R"(vnic2 {"name":"vnic2"})", "DELETE " + key + "vnic1 " + vnic1}));
}

TEST_F(DriftHandlersTest, BootTimeTasksListEveryItemWithoutComparing) {
  const std::string inner = R"({"storage":{"nfs":{"mounts":[{"name":"a"},{"name":"b"}]}},)"
                            R"("system":{"kernel":{"boot_options":{"iommu":true}}}})";
  for (const std::string& text : {inner, "{\"profile\":" + inner + "}"}) {
    EXPECT_EQ(Describe(HoxConfigManager::GenerateBootTimeTasks(Parse(text))),
              (Calls{R"(ADD comp storage grp nfs key mounts id a {"name":"a"})",
                     R"(ADD comp storage grp nfs key mounts id b {"name":"b"})",
                     R"(SET comp system grp kernel key boot_options {"iommu":true})"}));
  }
  EXPECT_THROW(HoxConfigManager::GenerateBootTimeTasks(Parse(R"({"storage":{"nfs":{"nope":[]}}})")),
               HoxConfigManager::SchemaNotFound);
  EXPECT_THROW(HoxConfigManager::GenerateBootTimeTasks(Parse(R"({"storage":{"nfs":{"mounts":[{"server":"s"}]}}})")),
               HoxConfigStore::ConfigStoreException);
}

TEST(GeneratedDocumentsTest, SelfDriftIsEmptyAndTheProfileWrapperChangesNothing) {
  // Given generated documents, a document against itself (host instance
  // order shuffled) reports nothing; with about 5% drift, the walk of the
  // wrapped document equals that of the bare one.
  hoxcm_test::TempRoot root;
  hoxcm_bench::InstallReplicatedSchemas(3);
  for (std::uint64_t seed : {7, 8, 9}) {
    hoxcm_bench::GeneratorOptions options;
    options.replicas = 3;
    options.seed = seed;
    options.changeRate = options.instanceChurn = options.oneSidedKeys = 0;
    Document host, desired;
    hoxcm_bench::GeneratePair(options, host, desired);
    EXPECT_EQ(Walk(desired, host), Calls{}) << "seed " << seed;

    options.changeRate = options.instanceChurn = options.oneSidedKeys = 0.05;
    hoxcm_bench::GeneratePair(options, host, desired);
    const Calls bare = Walk(desired, host);
    ASSERT_FALSE(bare.empty());
    Document wrapped;
    wrapped.SetObject().AddMember("profile", HoxConfigManager::Value(desired, wrapped.GetAllocator()),
                                  wrapped.GetAllocator());
    EXPECT_EQ(Walk(wrapped, host), bare) << "seed " << seed;
  }
}

}  // namespace
