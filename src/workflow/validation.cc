// Validate: the schema stage over the whole document, then the validation
// plugins, findings merged per field.
#include "workflow/validation.h"

#include <algorithm>
#include <charconv>
#include <deque>
#include <cstdint>
#include <limits>
#include <tuple>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <utility>

#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/schema_store.h>

#include "foundation/compare/value_compare.h"

namespace HoxConfigManager {
namespace {

using HoxConfigStore::ConfigStoreObject;
using HoxConfigStore::ConfigStoreObjectId;
using compare::FindByName;
using compare::NameOf;
using StoreObjects = std::vector<std::shared_ptr<ConfigStoreObject>>;
using FailedSet = std::unordered_set<ConfigStoreObjectId, CsoIdHash>;

constexpr const char* kStarted = "com.tarvik.hox.settings.validation.plugin.started";
constexpr const char* kFinished = "com.tarvik.hox.settings.validation.plugin.finished";
constexpr const char* kAborted = "com.tarvik.hox.settings.validation.plugin.aborted";

// The "/"-separated segments of a field ("/a/b/0" gives a, b, 0).
std::vector<std::string_view> Segments(std::string_view field) {
  std::vector<std::string_view> out;
  if (!field.empty() && field.front() == '/') field.remove_prefix(1);
  while (!field.empty()) {
    const std::size_t slash = field.find('/');
    out.push_back(field.substr(0, slash));
    if (slash == std::string_view::npos) break;
    field.remove_prefix(slash + 1);
  }
  return out;
}

// The object a finding's field belongs to, as the set of failed objects
// holds it: the key whose item contains the field ("/c/g/k/..." gives
// component c, group g, key k, no instance: plugins own whole keys). A field
// above the key level ("/c", "/c/g") leaves the missing names empty, which
// stands for every key below it.
ConfigStoreObjectId FailedObjectOf(const std::string& field) {
  const std::vector<std::string_view> s = Segments(field);
  auto at = [&s](std::size_t i) { return i < s.size() ? std::string(s[i]) : std::string(); };
  return ConfigStoreObjectId(at(0), at(1), at(2));
}

// A key of the plugin, or a component or group above it, failed the schema.
bool Failed(const FailedSet& failed, const ConfigStoreObjectId& key) {
  if (failed.empty()) return false;
  return failed.count(ConfigStoreObjectId(key.component, key.group, key.key)) != 0 ||
         failed.count(ConfigStoreObjectId(key.component, key.group, "")) != 0 ||
         failed.count(ConfigStoreObjectId(key.component, "", "")) != 0 || failed.count(ConfigStoreObjectId()) != 0;
}


// One store object per configured value of the keys: one for a singleton's
// object, one per instance. The marker of a deleted default configuration
// holds no configuration to validate and is left out.
StoreObjects Gather(const Value& root, const std::vector<ConfigStoreObjectId>& keys,
                    const std::shared_ptr<HoxSchemaStore::SchemaStore>& store) {
  StoreObjects objects;
  for (const ConfigStoreObjectId& key : keys) {
    const Value* item = ItemOf(root, key);
    if (item == nullptr) continue;
    const auto schema = store ? store->Find(key.component, key.group, key.key) : nullptr;
    const ConfigStoreObjectId id(key.component, key.group, key.key);
    if (item->IsArray()) {
      for (const Value& instance : item->GetArray()) {
        if (!DocumentShape::IsDeleteDefault(instance)) {
          objects.push_back(HoxConfigStore::CreateObject(id, instance, schema));
        }
      }
    } else if (!DocumentShape::IsDeleteDefault(*item)) {
      objects.push_back(HoxConfigStore::CreateObject(id, *item, schema));
    }
  }
  return objects;
}

// Where fields lie in a document, as the positions of their segments; a
// segment the document lacks (a missing member) sorts after its siblings
// that exist. Wide objects (a document's components, say) are indexed once.
class DocumentOrder {
 public:
  explicit DocumentOrder(const Value& root) : root_(root) {}

  std::vector<std::uint32_t> Of(const std::string& field) {
    std::vector<std::uint32_t> position;
    const Value* at = &root_;
    for (const std::string_view segment : Segments(field)) {
      std::uint32_t index = kAbsent;
      if (at != nullptr && at->IsObject()) {
        index = IndexIn(*at, segment);
      } else if (at != nullptr && at->IsArray()) {
        std::uint32_t i = 0;
        const auto [end, error] = std::from_chars(segment.data(), segment.data() + segment.size(), i);
        if (error == std::errc() && end == segment.data() + segment.size() && i < at->Size()) index = i;
      }
      position.push_back(index);
      at = index == kAbsent ? nullptr : (at->IsObject() ? &at->MemberBegin()[index].value : &(*at)[index]);
    }
    return position;
  }

 private:
  static constexpr std::uint32_t kAbsent = std::numeric_limits<std::uint32_t>::max();

  std::uint32_t IndexIn(const Value& object, std::string_view name) {
    if (object.MemberCount() <= compare::kWideObject) {
      for (auto it = object.MemberBegin(); it != object.MemberEnd(); ++it) {
        if (NameOf(it->name) == name) return static_cast<std::uint32_t>(it - object.MemberBegin());
      }
      return kAbsent;
    }
    auto [entry, added] = wide_.try_emplace(&object);
    if (added) {
      for (auto it = object.MemberBegin(); it != object.MemberEnd(); ++it) {
        entry->second.try_emplace(NameOf(it->name), static_cast<std::uint32_t>(it - object.MemberBegin()));
      }
    }
    const auto found = entry->second.find(name);
    return found == entry->second.end() ? kAbsent : found->second;
  }

  const Value& root_;
  std::unordered_map<const Value*, std::unordered_map<std::string_view, std::uint32_t>> wide_;
};

// "/c/g/k" of a field "/c/g/k/...": the part that names its key.
std::string_view KeyPrefix(std::string_view field) {
  std::size_t end = 0;
  for (int slashes = 0; end < field.size(); ++end) {
    if (field[end] == '/' && ++slashes == 4) break;
  }
  return field.substr(0, end);
}

// The findings of one validation, one entry per field in the order the
// fields were first found.
class Findings {
 public:
  // The entry of `field`, created empty when new.
  ValidationErrorInfo& Entry(std::string_view field) {
    if (const auto it = byField_.find(field); it != byField_.end()) return *it->second;
    ValidationErrorInfo& entry = entries_.emplace_back();
    entry.field.assign(field.data(), field.size());
    byField_.emplace(entry.field, &entry);
    return entry;
  }
  // A whole entry, unless its field already has one.
  void Add(ValidationErrorInfo&& finding) {
    if (byField_.count(finding.field) != 0) return;
    ValidationErrorInfo& entry = entries_.emplace_back(std::move(finding));
    byField_.emplace(entry.field, &entry);
  }
  // The entries sorted by where their fields lie in `root`.
  std::vector<ValidationErrorInfo> InDocumentOrder(const Value& root) {
    DocumentOrder order(root);
    std::vector<std::vector<std::uint32_t>> positions;
    positions.reserve(entries_.size());
    for (const ValidationErrorInfo& entry : entries_) positions.push_back(order.Of(entry.field));
    std::vector<std::size_t> sorted(entries_.size());
    for (std::size_t i = 0; i < sorted.size(); ++i) sorted[i] = i;
    const auto before = [&](std::size_t a, std::size_t b) {
      return std::tie(positions[a], entries_[a].field) < std::tie(positions[b], entries_[b].field);
    };
    // The schema stage reports in document order already, as a rule.
    if (!std::is_sorted(sorted.begin(), sorted.end(), before)) std::sort(sorted.begin(), sorted.end(), before);
    std::vector<ValidationErrorInfo> out;
    out.reserve(sorted.size());
    for (const std::size_t i : sorted) out.push_back(std::move(entries_[i]));
    return out;
  }

 private:
  std::deque<ValidationErrorInfo> entries_;  // stable addresses: the index points into them
  std::unordered_map<std::string_view, ValidationErrorInfo*> byField_;
};

}  // namespace

const Value* ItemOf(const Value& root, const ConfigStoreObjectId& key) {
  const Value* level = &root;
  for (const std::string* name : {&key.component, &key.group, &key.key}) {
    if (!level->IsObject()) return nullptr;
    level = FindByName(*level, *name);
    if (level == nullptr) return nullptr;
  }
  return level;
}

std::pair<std::string, ErrorInfo> SchemaFinding(const Value& finding) {
  RAPIDJSON_ASSERT(finding.IsObject());
  const Value& field = finding["field"];
  const Value& code = finding["errId"];
  const Value& args = finding["errArgs"];
  RAPIDJSON_ASSERT(field.IsString() && code.IsInt() && args.IsArray());
  ErrorInfo error(JsonValidator::ConvertErrorCodeToMsgId(code.GetInt()), {}, "");
  for (const Value& arg : args.GetArray()) {
    RAPIDJSON_ASSERT(arg.IsString());
    error.args.emplace_back(arg.GetString(), arg.GetStringLength());
  }
  return {std::string(field.GetString(), field.GetStringLength()), std::move(error)};
}

std::size_t CsoIdHash::operator()(const ConfigStoreObjectId& id) const {
  return std::hash<std::string>()(id.toString());
}

void Validate(const Document& desiredDocument, const Document& schemaDocument, const std::string& taskId,
              ValidationResult& result, bool checkSchema, std::shared_ptr<TaskHandle> taskHandle) {
  Validate(desiredDocument, schemaDocument, taskId, result, checkSchema, std::move(taskHandle),
           PluginRunner::Default());
}

void Validate(const Document& desiredDocument, const Document& schemaDocument, const std::string& taskId,
              ValidationResult& result, bool checkSchema, std::shared_ptr<TaskHandle> taskHandle,
              PluginRunner& runner) {
  const HoxPlatform::LogContext operation(HoxPlatform::LogContext::Field::kOperation, "Validate");
  CSLogger::Log(CSLogger::kInfo, "ConfigManager Validate API invoked");
  std::shared_ptr<TaskHandle> task = taskHandle ? std::move(taskHandle) : TaskHandle::Dummy();
  const Value& root = DocumentShape::Unwrap(desiredDocument);
  // Each field once, in the order first found: the first finding wins.
  Findings findings;
  FailedSet failed;

  if (checkSchema) {
    Document output;
    JsonValidator::ValidateCMDocument(schemaDocument, root, output, {}, "");
    RAPIDJSON_ASSERT(output.IsArray());
    std::string_view lastKey;  // findings come in runs per key: mark each key once
    for (const Value& finding : output.GetArray()) {
      // The name as a view into `output`: the key marks below keep views of it.
      const std::string_view name = NameOf(finding["field"]);
      findings.Entry(name).errors.push_back(SchemaFinding(finding).second);
      if (const std::string_view key = KeyPrefix(name); key != lastKey) {
        failed.insert(FailedObjectOf(std::string(key)));
        lastKey = key;
      }
    }
  }
  task->UpdateProgress(20.0f);

  PluginManager registry(VALIDATE);
  const std::vector<std::shared_ptr<Plugin>> plugins = registry.GetPlugins();
  const auto monitor = std::make_shared<TaskPluginMonitor>(task);
  const auto store = plugins.empty() ? nullptr : HoxSchemaStore::SchemaStore::GetStore();
  const float step = plugins.empty() ? 100.0f : 80.0f / static_cast<float>(plugins.size());
  float progress = 20.0f;
  for (const std::shared_ptr<Plugin>& plugin : plugins) {
    const std::string id = plugin->GetId();
    if (task->IsAborted()) {
      CSLogger::Log(CSLogger::kInfo, "Validation aborted, returning...");
      result.error = ErrorInfo(kAborted, {id}, "");
      return;
    }
    const std::vector<ConfigStoreObjectId> keys = plugin->GetCSOIdList();
    const bool skip = std::any_of(keys.begin(), keys.end(), [&failed](const auto& k) { return Failed(failed, k); });
    if (skip) {
      // Its objects are already known to be invalid.
      CSLogger::Log(CSLogger::kInfo, "Validation plugin %s skipped: its configuration failed the schema check",
                    id.c_str());
    } else {
      const StoreObjects objects = Gather(root, keys, store);
      const StoreObjects references = Gather(root, plugin->GetReferences(), store);
      task->AddNotification()->PluginInfo(kStarted, {id});
      ValidationPluginResult outcome = runner.Validate(*plugin, objects, references, taskId, monitor);
      task->AddNotification()->PluginInfo(kFinished, {id});
      if (!outcome.error.message.empty()) {
        result.error = std::move(outcome.error);
        return;
      }
      for (ValidationErrorInfo& finding : outcome.errors) findings.Add(std::move(finding));
    }
    progress += step;
    task->UpdateProgress(progress);
  }

  result.errors = findings.InDocumentOrder(root);
}

}  // namespace HoxConfigManager
