#include <string_view>

#include <hoxcm/drift.h>
#include <hoxcm/host.h>

namespace HoxConfigManager {

namespace {

// Drift below the installer's settings never makes a host non-compliant.
constexpr std::string_view kInstallerPath = "/hox/system/installer";

const Value& TypeOf(const Value& schemaNode) {
  RAPIDJSON_ASSERT(schemaNode.IsObject());
  auto type = schemaNode.FindMember("type");
  RAPIDJSON_ASSERT(type != schemaNode.MemberEnd() && type->value.IsString());
  return type->value;
}

// Adds `name` with the redacted text of `value` to a report entry, unless the
// value is null.
void AddRedacted(Document& report, Value& entry, const char* name, const Value& schemaNode, const Value& value) {
  if (value.IsNull()) return;
  Allocator& alloc = report.GetAllocator();
  const std::string text = HoxConfigStore::ConfigStoreDocument::RedactAndSerializeValue(schemaNode, value);
  entry.AddMember(rapidjson::StringRef(name), Value(text, alloc), alloc);
}

}  // namespace

// Property drift is reported entry by entry, so no consolidated Set is asked
// for: object-level Set comes only for a singleton the host lacks.
CheckComplianceHandler::CheckComplianceHandler(ComplianceResult* result)
    : DriftHandler(false, true, false), result_(result) {
  RAPIDJSON_ASSERT(result != nullptr);
  result_->compliant = true;
  Document& doc = result_->document;
  doc.SetObject();
  doc.AddMember("ADDS", Value(rapidjson::kArrayType), doc.GetAllocator());
  doc.AddMember("DELETES", Value(rapidjson::kArrayType), doc.GetAllocator());
  doc.AddMember("SETS", Value(rapidjson::kArrayType), doc.GetAllocator());
}

void CheckComplianceHandler::populateResult(Document& document, const std::string& path, Value& entry) {
  RAPIDJSON_ASSERT(entry.IsObject());
  entry.AddMember("path", Value(path, document.GetAllocator()), document.GetAllocator());
}

void CheckComplianceHandler::Append(const char* list, Value& entry) {
  Document& doc = result_->document;
  doc[list].PushBack(entry, doc.GetAllocator());
}

void CheckComplianceHandler::Add(const Value& desired, const HoxConfigStore::ConfigStoreObjectId&,
                                 const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema,
                                 const std::string& path) {
  result_->compliant = false;
  Value entry(rapidjson::kObjectType);
  populateResult(result_->document, path, entry);
  AddRedacted(result_->document, entry, "desiredValue", schema->GetJsonSchema(), desired);
  Append("ADDS", entry);
}

void CheckComplianceHandler::Set(const Value& desired, const Value& current,
                                 const HoxConfigStore::ConfigStoreObjectId&,
                                 const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema,
                                 const std::string& path, const Value&) {
  result_->compliant = false;
  Value entry(rapidjson::kObjectType);
  populateResult(result_->document, path, entry);
  const Value& keySchema = schema->GetJsonSchema();
  AddRedacted(result_->document, entry, "hostValue", keySchema, current);
  AddRedacted(result_->document, entry, "desiredValue", keySchema, desired);
  Append("ADDS", entry);
}

void CheckComplianceHandler::Delete(const Value& current, const HoxConfigStore::ConfigStoreObjectId&,
                                    const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema,
                                    const std::string& path) {
  result_->compliant = false;
  Value entry(rapidjson::kObjectType);
  populateResult(result_->document, path, entry);
  AddRedacted(result_->document, entry, "hostValue", schema->GetJsonSchema(), current);
  Append("DELETES", entry);
}

void CheckComplianceHandler::PropertyDrift(const Value& desired, const Value& current, const Value& schemaNode,
                                           const std::string& path, ACTION action) {
  if (path.find(kInstallerPath) != std::string::npos) return;
  result_->compliant = false;
  const Value* kind = &TypeOf(schemaNode);
  if (std::string_view(kind->GetString(), kind->GetStringLength()) == "array") {
    auto items = schemaNode.FindMember("items");
    RAPIDJSON_ASSERT(items != schemaNode.MemberEnd());
    kind = &TypeOf(items->value);
  }
  // Scalars and arrays of scalars are always reported as changes.
  if (std::string_view(kind->GetString(), kind->GetStringLength()) != "object") action = SET;
  Value entry(rapidjson::kObjectType);
  populateResult(result_->document, path, entry);
  AddRedacted(result_->document, entry, "desiredValue", schemaNode, desired);
  AddRedacted(result_->document, entry, "hostValue", schemaNode, current);
  Append(action == ADD ? "ADDS" : action == DELETE ? "DELETES" : "SETS", entry);
}

void CheckCompliance(Document& desired, ComplianceResult& result, std::shared_ptr<TaskHandle> task) {
  const HoxPlatform::LogContext operation(HoxPlatform::LogContext::Field::kOperation, "CheckCompliance");
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "CheckCompliance");
  CheckComplianceHandler handler(&result);
  ComputeDrift(desired, desired.GetAllocator(), handler, std::nullopt);
  if (task) task->UpdateProgress(100.0f);
}

}  // namespace HoxConfigManager
