// PluginRequest: the request document of one plugin run, written by the
// library and read back by the runners.
#include <filesystem>
#include <stdexcept>
#include <string_view>

#include <hoxcm/documents.h>
#include <hoxcm/files.h>
#include <hoxcm/plugins.h>

#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

#include "platform/files/document_files.h"
#include "plugins/plugin_request_writer.h"

namespace HoxConfigManager {
namespace {

Value Text(const std::string& s, Allocator& a) { return Value(s, a); }

const Value& Required(const Document& doc, const char* name, const char* missingText) {
  RAPIDJSON_ASSERT(doc.IsObject());
  const auto it = doc.FindMember(name);
  if (it == doc.MemberEnd()) throw std::runtime_error(missingText);
  return it->value;
}

std::string RequiredString(const Document& doc, const char* name, const char* missingText) {
  const Value& v = Required(doc, name, missingText);
  RAPIDJSON_ASSERT(v.IsString());
  return std::string(v.GetString(), v.GetStringLength());
}

std::string StringMember(const Value& object, const char* name) {
  RAPIDJSON_ASSERT(object.IsObject());
  const auto it = object.FindMember(name);
  RAPIDJSON_ASSERT(it != object.MemberEnd() && it->value.IsString());
  return std::string(it->value.GetString(), it->value.GetStringLength());
}

HoxConfigStore::ConfigStoreObjectId IdOf(const Value& element) {
  RAPIDJSON_ASSERT(element.IsObject());
  const auto instance = element.FindMember("instanceId");
  std::string instanceId;
  if (instance != element.MemberEnd()) {
    RAPIDJSON_ASSERT(instance->value.IsString());
    instanceId = instance->value.GetString();
  }
  return HoxConfigStore::ConfigStoreObjectId(StringMember(element, "component"), StringMember(element, "group"),
                                             StringMember(element, "key"), instanceId);
}

void AddIdentity(Value& element, const HoxConfigStore::ConfigStoreObjectId& id, Allocator& a) {
  element.AddMember("component", Text(id.component, a), a);
  element.AddMember("group", Text(id.group, a), a);
  element.AddMember("key", Text(id.key, a), a);
  // Singletons carry an empty "instanceId": every element has the same shape.
  element.AddMember("instanceId", Text(id.instanceId, a), a);
}

using RequestWriter = rapidjson::Writer<rapidjson::StringBuffer>;

void WriteText(RequestWriter& writer, const std::string& text) {
  writer.String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
}

// A value as the member text the request carries: its compact JSON,
// serialised into `scratch` (reused from one value to the next) and written
// as a string, escaped by the writer as any string member is.
void WriteAsText(RequestWriter& writer, const Value& value, rapidjson::StringBuffer& scratch) {
  scratch.Clear();
  RequestWriter inner(scratch);
  value.Accept(inner);
  writer.String(scratch.GetString(), static_cast<rapidjson::SizeType>(scratch.GetSize()));
}

void WriteIdentity(RequestWriter& writer, const HoxConfigStore::ConfigStoreObjectId& id) {
  writer.Key("component");
  WriteText(writer, id.component);
  writer.Key("group");
  WriteText(writer, id.group);
  writer.Key("key");
  WriteText(writer, id.key);
  writer.Key("instanceId");
  WriteText(writer, id.instanceId);
}

void WriteRequestFile(const std::string& path, std::string_view content) {
  HoxPlatform::CreateDirectories(std::filesystem::path(path).parent_path().string());
  // The request carries configuration values, passwords among them: only the
  // owner may read it. It lives for one run: after a crash the run is gone
  // too, so it needs atomic replacement but no flush to disk.
  HoxPlatform::WriteFileAtomically(path, content, 0600, HoxPlatform::Durability::kAtomic);
}

}  // namespace

void WriteInputsRequest(const std::string& path, const std::string& id, const std::string& operation,
                        const std::string& module, int version, const std::vector<DesiredConfigInput>& inputs,
                        const std::string& taskId, const std::string& clusterContext) {
  // Members in the order the request document adds them.
  rapidjson::StringBuffer out, scratch;
  RequestWriter writer(out);
  writer.StartObject();
  writer.Key("key");
  WriteText(writer, id);
  writer.Key("version");
  writer.Int(version);
  writer.Key("type");
  WriteText(writer, operation);
  writer.Key("module");
  WriteText(writer, module);
  writer.Key("data");
  writer.StartArray();
  const HoxConfigStore::ConfigStoreObjectId noObject;
  for (const DesiredConfigInput& input : inputs) {
    writer.StartObject();
    writer.Key("operation");
    WriteText(writer, input.action);
    writer.Key("config");
    if (input.object) {
      WriteAsText(writer, input.object->GetData(), scratch);
    } else {
      writer.String("null");
    }
    if (input.drift) {
      writer.Key("drift");
      WriteAsText(writer, input.drift->GetDrift(), scratch);
    }
    WriteIdentity(writer, input.object ? input.object->GetConfigStoreObjectId() : noObject);
    writer.EndObject();
  }
  writer.EndArray();
  writer.Key("taskId");
  WriteText(writer, taskId);
  writer.Key("clusterContext");
  WriteText(writer, clusterContext);
  writer.EndObject();
  WriteRequestFile(path, std::string_view(out.GetString(), out.GetSize()));
}

PluginRequest::PluginRequest() { document_.SetObject(); }

PluginRequest::PluginRequest(const std::string& id, const std::string& operation, const std::string& module,
                             int version,
                             const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& data,
                             const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& references) {
  document_.SetObject();
  Allocator& a = document_.GetAllocator();
  PopulateMetadata(id, operation, module, version, a);
  PopulateCSOList(data, "data", a);
  PopulateCSOList(references, "references", a);
}

PluginRequest::PluginRequest(const std::string& id, const std::string& operation, const std::string& module,
                             int version, const std::vector<DesiredConfigInput>& inputs) {
  document_.SetObject();
  Allocator& a = document_.GetAllocator();
  PopulateMetadata(id, operation, module, version, a);
  Value data(rapidjson::kArrayType);
  for (const DesiredConfigInput& input : inputs) {
    Value element(rapidjson::kObjectType);
    element.AddMember("operation", Text(input.action, a), a);
    element.AddMember("config", Text(input.object ? input.object->Serialize() : std::string("null"), a), a);
    if (input.drift) element.AddMember("drift", Text(input.drift->Serialize(), a), a);
    if (input.object) {
      AddIdentity(element, input.object->GetConfigStoreObjectId(), a);
    } else {
      AddIdentity(element, HoxConfigStore::ConfigStoreObjectId(), a);
    }
    data.PushBack(element, a);
  }
  document_.AddMember("data", data, a);
}

void PluginRequest::PopulateMetadata(const std::string& id, const std::string& operation, const std::string& module,
                                     int version, Allocator& a) {
  document_.AddMember("key", Text(id, a), a);
  document_.AddMember("version", version, a);
  document_.AddMember("type", Text(operation, a), a);
  document_.AddMember("module", Text(module, a), a);
}

void PluginRequest::PopulateCSOId(Value& element, const std::shared_ptr<HoxConfigStore::ConfigStoreObject>& object,
                                  Allocator& a) {
  AddIdentity(element, object->GetConfigStoreObjectId(), a);
}

void PluginRequest::PopulateCSOList(const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& objects,
                                    const std::string& name, Allocator& a) {
  Value list(rapidjson::kArrayType);
  for (const auto& object : objects) {
    if (!object) continue;
    Value element(rapidjson::kObjectType);
    PopulateCSOId(element, object, a);
    element.AddMember("config", Value(object->GetData(), a), a);
    list.PushBack(element, a);
  }
  document_.AddMember(Text(name, a), list, a);
}

void PluginRequest::PopulateTaskId(const std::string& taskId, Allocator& a) {
  document_.RemoveMember("taskId");
  document_.AddMember("taskId", Text(taskId, a), a);
}

void PluginRequest::PopulateClusterContext(const std::string& context, Allocator& a) {
  document_.RemoveMember("clusterContext");
  document_.AddMember("clusterContext", Text(context, a), a);
}

void PluginRequest::Dump(const std::string& path, const std::string& taskId, const std::string& clusterContext) {
  Allocator& a = document_.GetAllocator();
  PopulateTaskId(taskId, a);
  PopulateClusterContext(clusterContext, a);
  WriteRequestFile(path, JsonToString(document_));
}

void PluginRequest::Load(const std::string& path) {
  Document doc;
  HoxPlatform::detail::ReadDocumentFile(path, HoxPlatform::FileKind::PluginExchange, doc);
  document_.Swap(doc);
}

int PluginRequest::GetVersion() const {
  const Value& v = Required(document_, "version", "The PluginRequest structure does not contain version.");
  RAPIDJSON_ASSERT(v.IsInt());
  return v.GetInt();
}

std::string PluginRequest::GetType() const {
  return RequiredString(document_, "type", "The PluginRequest structure does not contain type");
}
std::string PluginRequest::GetModule() const {
  return RequiredString(document_, "module", "The PluginRequest structure does not contain module");
}
std::string PluginRequest::GetId() const {
  return RequiredString(document_, "key", "The PluginRequest structure does not contain key");
}
std::string PluginRequest::GetTaskId() const {
  return RequiredString(document_, "taskId", "The PluginRequest structure does not contain taskId");
}
std::string PluginRequest::GetClusterContext() const {
  return RequiredString(document_, "clusterContext", "The PluginRequest structure does not contain context");
}

std::vector<PluginRequest::DataItem> PluginRequest::GetData() const {
  const Value& data = Required(document_, "data", "The PluginRequest structure does not contain data");
  RAPIDJSON_ASSERT(data.IsArray());
  std::vector<DataItem> items;
  for (const Value& element : data.GetArray()) {
    DataItem item;
    item.id = IdOf(element);
    const auto op = element.FindMember("operation");
    if (op != element.MemberEnd()) item.operation = StringMember(element, "operation");
    const auto config = element.FindMember("config");
    RAPIDJSON_ASSERT(config != element.MemberEnd());
    item.config = config->value.IsString() ? StringMember(element, "config") : JsonToString(config->value);
    const auto drift = element.FindMember("drift");
    if (drift != element.MemberEnd()) {
      item.drift = StringMember(element, "drift");
      item.hasDrift = true;
    }
    items.push_back(std::move(item));
  }
  return items;
}

std::vector<HoxConfigStore::ConfigStoreObjectId> PluginRequest::GetReferences() const {
  RAPIDJSON_ASSERT(document_.IsObject());
  const auto it = document_.FindMember("references");
  if (it == document_.MemberEnd()) return {};
  RAPIDJSON_ASSERT(it->value.IsArray());
  std::vector<HoxConfigStore::ConfigStoreObjectId> ids;
  for (const Value& element : it->value.GetArray()) ids.push_back(IdOf(element));
  return ids;
}

}  // namespace HoxConfigManager
