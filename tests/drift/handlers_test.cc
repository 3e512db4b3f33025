// The handlers built on the drift walk: the compliance report, the apply
// tasks and the boot-time tasks, on hand-written and generated documents.
#include <fstream>
#include <iterator>
#include <set>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <hoxcm/documents.h>
#include <hoxcm/drift.h>

#include "doc_generator.h"
#include "drift/recording_handler.h"
#include "support/temp_root.h"

namespace {

using HoxConfigManager::ComplianceResult;
using HoxConfigManager::Document;
using HoxConfigManager::Value;

Document Parse(const std::string& text) {
  Document doc;
  HoxConfigManager::ParseDocument(text, doc);
  return doc;
}

Document Copy(const Document& doc) {
  Document out;
  out.CopyFrom(doc, out.GetAllocator());
  return out;
}

class DriftHandlersTest : public ::testing::Test {
 protected:
  DriftHandlersTest() { root_.InstallSampleSchemas(); }

  // The compliance report of `desired` against `current`, as compact text.
  std::string Report(const std::string& desired, const std::string& current, bool* compliant = nullptr) {
    Document d = Parse(desired);
    ComplianceResult result;
    HoxConfigManager::CheckComplianceHandler handler(&result);
    HoxConfigManager::ComputeDrift(d, d.GetAllocator(), handler, Parse(current));
    if (compliant != nullptr) *compliant = result.compliant;
    return HoxConfigManager::JsonToString(result.document);
  }

  hoxcm_test::TempRoot root_;
};

TEST_F(DriftHandlersTest, ComplianceReportLayout) {
  struct Case {
    const char* what;
    const char* desired;
    const char* current;
    bool compliant;
    const char* report;
  };
  const std::vector<Case> cases = {
      {"equal documents", R"({"storage":{"nfs":{"mounts":[{"name":"a","server":"s"}]}}})",
       R"({"storage":{"nfs":{"mounts":[{"server":"s","name":"a"}]}}})", true, R"({"ADDS":[],"DELETES":[],"SETS":[]})"},
      {"installer drift is ignored", R"({"hox":{"system":{"installer":{"mode":"iso","source":"a"}}}})",
       R"({"hox":{"system":{"installer":{"mode":"pxe","source":"a"}}}})", true,
       R"({"ADDS":[],"DELETES":[],"SETS":[]})"},
      {"added string property goes to SETS with its desired value only",
       R"({"storage":{"nfs":{"mounts":[{"name":"a","server":"s"}]}}})",
       R"({"storage":{"nfs":{"mounts":[{"name":"a"}]}}})", false,
       R"({"ADDS":[],"DELETES":[],"SETS":[{"path":"/storage/nfs/mounts/0/server","desiredValue":"\"s\""}]})"},
      {"removed nested object goes to DELETES with its host value only",
       R"({"network":{"interfaces":{"vnic":[{"name":"vnic0","portgroup":"p"}]}}})",
       R"({"network":{"interfaces":{"vnic":[{"name":"vnic0","portgroup":"p","ipv4":{"address":"1.2.3.4"}}]}}})", false,
       R"({"ADDS":[],"DELETES":[{"path":"/network/interfaces/vnic/0/ipv4","hostValue":"{\"address\":\"1.2.3.4\"}"}],"SETS":[]})"},
      {"whole objects: added instance, new singleton, removed instance",
       R"({"storage":{"nfs":{"mounts":[{"name":"b"}]}},"system":{"kernel":{"boot_options":{"iommu":true}}}})",
       R"({"storage":{"nfs":{"mounts":[{"name":"a"}]}}})", false,
       R"({"ADDS":[{"path":"/storage/nfs/mounts/0","desiredValue":"{\"name\":\"b\"}"},)"
       R"({"path":"/system/kernel/boot_options","desiredValue":"{\"iommu\":true}"}],)"
       R"("DELETES":[{"path":"/storage/nfs/mounts/1","hostValue":"{\"name\":\"a\"}"}],"SETS":[]})"},
      {"a singleton the host holds empty is set at object level with both values",
       R"({"system":{"kernel":{"boot_options":{"iommu":true}}}})", R"({"system":{"kernel":{"boot_options":{}}}})",
       false,
       R"({"ADDS":[{"path":"/system/kernel/boot_options","hostValue":"{}","desiredValue":"{\"iommu\":true}"}],)"
       R"("DELETES":[],"SETS":[]})"},
      {"sensitive values are masked in every entry",
       R"({"storage":{"iscsi":{"targets":[{"iqn":"q","chapSecret":"new-secret"}]}},)"
       R"("security":{"accounts":{"users":[{"name":"u","password":"pw"}]}}})",
       R"({"storage":{"iscsi":{"targets":[{"iqn":"q","chapSecret":"old-secret"}]}},)"
       R"("security":{"accounts":{"users":[{"name":"u","password":"pw"}]}}})", false,
       R"({"ADDS":[],"DELETES":[],"SETS":[{"path":"/storage/iscsi/targets/0/chapSecret","desiredValue":"\"******\"","hostValue":"\"******\""}]})"},
  };
  for (const Case& c : cases) {
    bool compliant = !c.compliant;
    EXPECT_EQ(Report(c.desired, c.current, &compliant), c.report) << c.what;
    EXPECT_EQ(compliant, c.compliant) << c.what;
  }
}

TEST_F(DriftHandlersTest, ApplyTasksCarryObjectActionAndDrift) {
  // Given a changed, an added and a removed instance, the tasks should be
  // SET (with its drift record), ADD, then DELETE carrying the host value.
  Document d = Parse(R"({"storage":{"nfs":{"mounts":[{"name":"a","server":"new"},{"name":"b"}]}}})");
  HoxConfigManager::ApplyTaskGenerator generator;
  HoxConfigManager::ComputeDrift(d, d.GetAllocator(), generator,
                                 Parse(R"({"storage":{"nfs":{"mounts":[{"name":"c"},{"name":"a","server":"old"}]}}})"));
  const auto tasks = generator.getTasks();
  ASSERT_EQ(tasks.size(), 3u);
  EXPECT_EQ(tasks[0].action, "SET");
  EXPECT_EQ(tasks[0].object->GetConfigStoreObjectId().instanceId, "a");
  EXPECT_EQ(tasks[0].object->Serialize(), R"({"name":"a","server":"new"})");
  ASSERT_TRUE(tasks[0].drift);
  EXPECT_EQ(HoxConfigManager::JsonToString(tasks[0].drift->GetDrift()),
            R"({"DRIFTOBJ":{"INSTANCEID":"a","DRIFTOP":"SET"},"server":{"DRIFTOBJ":{"INSTANCEID":"a","DRIFTOP":"SET"}}})");
  EXPECT_EQ(tasks[1].action, "ADD");
  EXPECT_EQ(tasks[1].object->GetConfigStoreObjectId().instanceId, "b");
  EXPECT_FALSE(tasks[1].drift);
  EXPECT_EQ(tasks[2].action, "DELETE");
  EXPECT_EQ(tasks[2].object->Serialize(), R"({"name":"c"})");
}

TEST_F(DriftHandlersTest, BootTimeTasksListEveryItemWithoutComparing) {
  const std::string inner = R"({"storage":{"nfs":{"mounts":[{"name":"a"},{"name":"b"},{"name":"c"}]}},)"
                            R"("system":{"kernel":{"boot_options":{"iommu":true}}}})";
  for (const std::string& text : {inner, "{\"profile\":" + inner + "}"}) {
    const auto tasks = HoxConfigManager::GenerateBootTimeTasks(Parse(text));
    std::vector<std::string> seen;
    for (const auto& t : tasks) seen.push_back(t.action + " " + t.object->GetConfigStoreObjectId().toString());
    EXPECT_EQ(seen, (std::vector<std::string>{"ADD comp storage grp nfs key mounts id a",
                                              "ADD comp storage grp nfs key mounts id b",
                                              "ADD comp storage grp nfs key mounts id c",
                                              "SET comp system grp kernel key boot_options"}));
  }
  try {
    HoxConfigManager::GenerateBootTimeTasks(Parse(R"({"storage":{"nfs":{"nope":[]}}})"));
    ADD_FAILURE() << "no exception";
  } catch (const HoxConfigManager::SchemaNotFound& e) {
    EXPECT_EQ(e.GetErrorCode(), 2021);
  }
  EXPECT_THROW(HoxConfigManager::GenerateBootTimeTasks(Parse(R"({"storage":{"nfs":{"mounts":[{"server":"s"}]}}})")),
               HoxConfigStore::ConfigStoreException);
}

// Object-level path of a report entry: the item, or the instance below it.
std::string ObjectPath(const std::string& path) {
  size_t slashes = 0, i = 0;
  for (; i < path.size(); ++i) {
    if (path[i] == '/' && ++slashes == 5) break;
  }
  std::string head = path.substr(0, i);
  // Singletons stop at the key; instances carry a numeric fifth segment.
  const size_t last = head.rfind('/');
  if (slashes >= 4 && head.find_first_not_of("0123456789", last + 1) != std::string::npos) {
    head = head.substr(0, last);
  }
  return head;
}

class GeneratedDocumentsTest : public ::testing::Test {
 protected:
  GeneratedDocumentsTest() { hoxcm_bench::InstallReplicatedSchemas(3); }
  hoxcm_test::TempRoot root_;
};

TEST_F(GeneratedDocumentsTest, DriftOfADocumentAgainstItselfIsEmpty) {
  hoxcm_bench::GeneratorOptions options;
  options.replicas = 3;
  options.changeRate = options.instanceChurn = options.oneSidedKeys = 0;
  for (std::uint64_t seed : {1, 2, 3}) {
    options.seed = seed;
    Document host, desired;
    hoxcm_bench::GeneratePair(options, host, desired);
    hoxcm_test::RecordingHandler handler(true, true, false);
    HoxConfigManager::ComputeDrift(desired, desired.GetAllocator(), handler, Copy(host));
    EXPECT_EQ(handler.calls, std::vector<std::string>{}) << "seed " << seed;
  }
}

TEST_F(GeneratedDocumentsTest, ProfileWrapperAndHandlersAgree) {
  // Given generated documents with about 5% drift, the walk of the wrapped
  // document should equal that of the bare one, and the apply tasks should
  // touch exactly the objects the compliance report names.
  hoxcm_bench::GeneratorOptions options;
  options.replicas = 3;
  options.changeRate = 0.05;
  options.instanceChurn = options.oneSidedKeys = 0.05;
  for (std::uint64_t seed : {7, 8, 9}) {
    options.seed = seed;
    Document host, desired;
    hoxcm_bench::GeneratePair(options, host, desired);

    hoxcm_test::RecordingHandler bare(true, true, false);
    HoxConfigManager::ComputeDrift(desired, desired.GetAllocator(), bare, Copy(host));
    ASSERT_FALSE(bare.calls.empty());
    Document wrapped;
    wrapped.SetObject();
    wrapped.AddMember("profile", Value(desired, wrapped.GetAllocator()), wrapped.GetAllocator());
    hoxcm_test::RecordingHandler inner(true, true, false);
    HoxConfigManager::ComputeDrift(wrapped, wrapped.GetAllocator(), inner, Copy(host));
    EXPECT_EQ(inner.calls, bare.calls) << "seed " << seed;

    // Objects named by the report (installer drift aside) ...
    ComplianceResult result;
    HoxConfigManager::CheckComplianceHandler compliance(&result);
    HoxConfigManager::ComputeDrift(desired, desired.GetAllocator(), compliance, Copy(host));
    std::set<std::string> reported;
    for (const char* list : {"ADDS", "DELETES", "SETS"}) {
      for (const auto& entry : result.document[list].GetArray()) reported.insert(ObjectPath(entry["path"].GetString()));
    }
    // ... against the objects of the object-level calls, which the tasks
    // mirror one for one.
    std::set<std::string> touched;
    std::vector<std::string> objectCalls;
    for (const std::string& call : bare.calls) {
      if (call.rfind("Property", 0) == 0) continue;
      const std::string path = call.substr(call.find(' ') + 1, call.find(' ', call.find(' ') + 1) - call.find(' ') - 1);
      // Changes of the installer's settings never count against compliance.
      const bool installerChange = call.rfind("Set", 0) == 0 && call.size() > 5 &&
                                   call.compare(call.size() - 5, 5, " null") != 0;
      if (!installerChange || path.find("/hox/system/installer") == std::string::npos) touched.insert(path);
      objectCalls.push_back(call.substr(0, call.find(' ')));
    }
    EXPECT_EQ(reported, touched) << "seed " << seed;
    HoxConfigManager::ApplyTaskGenerator generator;
    HoxConfigManager::ComputeDrift(desired, desired.GetAllocator(), generator, Copy(host));
    const auto tasks = generator.getTasks();
    ASSERT_EQ(tasks.size(), objectCalls.size()) << "seed " << seed;
    for (size_t i = 0; i < tasks.size(); ++i) {
      const std::string expected = objectCalls[i] == "Set" ? "SET" : objectCalls[i] == "Add" ? "ADD" : "DELETE";
      EXPECT_EQ(tasks[i].action, expected) << i;
    }
  }
}

}  // namespace
