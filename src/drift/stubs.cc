#include <stdexcept>

#include <hoxcm/drift.h>

namespace HoxConfigManager {

void ComputeDrift(Value&, Allocator&, DriftHandler&, std::optional<Document>) {
  throw std::logic_error("not implemented");
}
ApplyTaskGenerator::ApplyTaskGenerator() : DriftHandler(true, true, false) {}
void ApplyTaskGenerator::Add(const Value&, const HoxConfigStore::ConfigStoreObjectId&,
                             const std::shared_ptr<HoxSchemaStore::SchemaObject>&, const std::string&) {}
void ApplyTaskGenerator::Set(const Value&, const Value&, const HoxConfigStore::ConfigStoreObjectId&,
                             const std::shared_ptr<HoxSchemaStore::SchemaObject>&, const std::string&,
                             const Value&) {}
void ApplyTaskGenerator::Delete(const Value&, const HoxConfigStore::ConfigStoreObjectId&,
                                const std::shared_ptr<HoxSchemaStore::SchemaObject>&, const std::string&) {}
void ApplyTaskGenerator::createTask(const HoxConfigStore::ConfigStoreObjectId&, const Value&,
                                    const std::shared_ptr<HoxSchemaStore::SchemaObject>&, ACTION,
                                    std::shared_ptr<HoxConfigStore::DriftObject>) {}
std::vector<DesiredConfigInput> ApplyTaskGenerator::getTasks() const { return tasks_; }
std::vector<DesiredConfigInput> GenerateApplyTasks(Document&) { throw std::logic_error("not implemented"); }
std::vector<DesiredConfigInput> GenerateBootTimeTasks(const Document&) {
  throw std::logic_error("not implemented");
}
CheckComplianceHandler::CheckComplianceHandler(ComplianceResult* result)
    : DriftHandler(true, false, false), result_(result) {}
void CheckComplianceHandler::Add(const Value&, const HoxConfigStore::ConfigStoreObjectId&,
                                 const std::shared_ptr<HoxSchemaStore::SchemaObject>&, const std::string&) {}
void CheckComplianceHandler::Set(const Value&, const Value&, const HoxConfigStore::ConfigStoreObjectId&,
                                 const std::shared_ptr<HoxSchemaStore::SchemaObject>&, const std::string&,
                                 const Value&) {}
void CheckComplianceHandler::Delete(const Value&, const HoxConfigStore::ConfigStoreObjectId&,
                                    const std::shared_ptr<HoxSchemaStore::SchemaObject>&, const std::string&) {}
void CheckComplianceHandler::PropertyDrift(const Value&, const Value&, const Value&, const std::string&,
                                           ACTION) {}
void CheckComplianceHandler::populateResult(Document&, const std::string&, Value&) {}
void CheckComplianceHandler::Append(const char*, Value&) {}
void CheckCompliance(Document&, ComplianceResult&, std::shared_ptr<TaskHandle>) {
  throw std::logic_error("not implemented");
}

}  // namespace HoxConfigManager
