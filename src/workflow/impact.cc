// Impact: the walk with the impact handler, then the impact plugins asked
// one by one, folded into one ImpactResult.
#include "workflow/impact.h"

#include <algorithm>
#include <functional>
#include <tuple>

#include <hoxcm/host.h>

#include "workflow/impact_handler.h"

namespace HoxConfigManager {
namespace {

constexpr const char* kStarted = "com.tarvik.hox.settings.impact.plugin.started";
constexpr const char* kFinished = "com.tarvik.hox.settings.impact.plugin.finished";
constexpr const char* kAborted = "com.tarvik.hox.settings.impact.plugin.aborted";

const char* ImpactName(int impact) {
  switch (impact) {
    case IMPACT_NONE: return "none";
    case IMPACT_MAINTENANCE_MODE_REQUIRED: return "maintenance mode";
    case IMPACT_REBOOT_REQUIRED: return "reboot";
    default: return "unknown";
  }
}

// Adds a plugin's verdict to the reasons: to the one object of its run that
// the verdict's key names, or to the key when the run held several (or none)
// of its objects, since a verdict names no instance.
void AddPluginReason(ImpactReasons& reasons, const TaskMap& run, const ImpactPluginInfo& verdict) {
  const IMPACT_TYPE level = static_cast<IMPACT_TYPE>(verdict.impact);
  ObjectImpact object;
  object.id = HoxConfigStore::ConfigStoreObjectId(verdict.component, verdict.group, verdict.key);
  int named = 0;
  for (const DesiredConfigInput& input : run.inputs) {
    const auto& id = input.object->GetConfigStoreObjectId();
    if (id.component != verdict.component || id.group != verdict.group || id.key != verdict.key) continue;
    if (++named == 1) {
      object.id = id;
      object.action = input.action;
    }
  }
  if (named != 1) {
    object.id.instanceId.clear();
    object.action.clear();
  }
  ImpactReason reason;
  reason.rule = ImpactReason::Rule::kPlugin;
  reason.impact = level;
  reason.plugin = run.plugin->GetId();
  reason.reason = verdict.reason;
  const auto same = std::find_if(reasons.objects.begin(), reasons.objects.end(), [&](const ObjectImpact& o) {
    return o.id == object.id && o.action == object.action;
  });
  ObjectImpact& entry = same != reasons.objects.end() ? *same : reasons.objects.emplace_back(std::move(object));
  entry.impact = std::max(entry.impact, level);
  entry.reasons.push_back(std::move(reason));
}

// Feeds one walk to the impact handler and the apply task generator, in
// that order. Both ask the walk for the same report (consolidated sets with
// their drift records, no per-property walk), so either sees exactly the
// calls it would see walking alone.
class ImpactAndTasks final : public DriftHandler {
 public:
  ImpactAndTasks(ImpactHandler& impact, ApplyTaskGenerator& tasks)
      : DriftHandler(impact.IsConsolidatedActionRequired(), impact.IsCreateDriftObject(), impact.IsPerProperty()),
        impact_(impact),
        tasks_(tasks) {
    RAPIDJSON_ASSERT(tasks.IsConsolidatedActionRequired() == IsConsolidatedActionRequired() &&
                     tasks.IsCreateDriftObject() == IsCreateDriftObject() && tasks.IsPerProperty() == IsPerProperty());
  }

  void Add(const Value& desired, const HoxConfigStore::ConfigStoreObjectId& id,
           const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path) override {
    impact_.Add(desired, id, schema, path);
    tasks_.Add(desired, id, schema, path);
  }
  void Set(const Value& desired, const Value& current, const HoxConfigStore::ConfigStoreObjectId& id,
           const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path,
           const Value& drift) override {
    impact_.Set(desired, current, id, schema, path, drift);
    tasks_.Set(desired, current, id, schema, path, drift);
  }
  void Delete(const Value& current, const HoxConfigStore::ConfigStoreObjectId& id,
              const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string& path) override {
    impact_.Delete(current, id, schema, path);
    tasks_.Delete(current, id, schema, path);
  }
  void PropertyDrift(const Value& desired, const Value& current, const Value& schemaNode, const std::string& path,
                     ACTION action) override {
    impact_.PropertyDrift(desired, current, schemaNode, path, action);
    tasks_.PropertyDrift(desired, current, schemaNode, path, action);
  }

 private:
  ImpactHandler& impact_;
  ApplyTaskGenerator& tasks_;
};

void ImpactWith(Document& desiredDocument, const std::string& taskId, ImpactResult& result,
                std::shared_ptr<TaskHandle> taskHandle, std::optional<Document> currentDocument,
                ImpactReasons* reasons, PluginRunner& runner, std::vector<DesiredConfigInput>* applyTasks);

}  // namespace

std::size_t ImpactInfoHash::operator()(const ImpactInfo& info) const {
  std::size_t h = std::hash<std::string>()(info.id);
  for (const std::string& arg : info.args) h = h * 1000003u ^ std::hash<std::string>()(arg);
  return h;
}

void ImpactReasonsToJson(const ImpactReasons& reasons, Value& out, Allocator& allocator) {
  out.SetArray();
  auto text = [&allocator](const std::string& s) { return Value(s, allocator); };
  for (const ObjectImpact& object : reasons.objects) {
    Value entry(rapidjson::kObjectType), list(rapidjson::kArrayType);
    entry.AddMember("component", text(object.id.component), allocator);
    entry.AddMember("group", text(object.id.group), allocator);
    entry.AddMember("key", text(object.id.key), allocator);
    entry.AddMember("instance", text(object.id.instanceId), allocator);
    entry.AddMember("action", text(object.action), allocator);
    entry.AddMember("impact", static_cast<int>(object.impact), allocator);
    for (const ImpactReason& r : object.reasons) {
      Value reason(rapidjson::kObjectType);
      const bool plugin = r.rule == ImpactReason::Rule::kPlugin;
      reason.AddMember("rule",
                       rapidjson::StringRef(plugin ? "plugin"
                                            : r.rule == ImpactReason::Rule::kPropertyTrigger ? "property"
                                                                                              : "operation"),
                       allocator);
      reason.AddMember("impact", static_cast<int>(r.impact), allocator);
      if (plugin) {
        reason.AddMember("plugin", text(r.plugin), allocator);
        reason.AddMember("reason", text(r.reason), allocator);
      } else {
        reason.AddMember("path", text(r.path), allocator);
        reason.AddMember("oldValue", text(r.oldValue), allocator);
        reason.AddMember("newValue", text(r.newValue), allocator);
      }
      list.PushBack(reason, allocator);
    }
    entry.AddMember("reasons", list, allocator);
    out.PushBack(entry, allocator);
  }
}

void Impact(Document& desiredDocument, const std::string& taskId, ImpactResult& result,
            std::shared_ptr<TaskHandle> taskHandle, std::optional<Document> currentDocument, ImpactReasons* reasons) {
  Impact(desiredDocument, taskId, result, std::move(taskHandle), std::move(currentDocument), reasons,
         PluginRunner::Default());
}

void Impact(Document& desiredDocument, const std::string& taskId, ImpactResult& result,
            std::shared_ptr<TaskHandle> taskHandle, std::optional<Document> currentDocument, ImpactReasons* reasons,
            PluginRunner& runner) {
  ImpactWith(desiredDocument, taskId, result, std::move(taskHandle), std::move(currentDocument), reasons, runner,
             nullptr);
}

void Impact(Document& desiredDocument, const std::string& taskId, ImpactResult& result,
            std::shared_ptr<TaskHandle> taskHandle, std::optional<Document> currentDocument, ImpactReasons* reasons,
            PluginRunner& runner, std::vector<DesiredConfigInput>& applyTasks) {
  ImpactWith(desiredDocument, taskId, result, std::move(taskHandle), std::move(currentDocument), reasons, runner,
             &applyTasks);
}

namespace {

void ImpactWith(Document& desiredDocument, const std::string& taskId, ImpactResult& result,
                std::shared_ptr<TaskHandle> taskHandle, std::optional<Document> currentDocument,
                ImpactReasons* reasons, PluginRunner& runner, std::vector<DesiredConfigInput>* applyTasks) {
  const HoxPlatform::LogContext operation(HoxPlatform::LogContext::Field::kOperation, "Impact");
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "Impact");
  std::shared_ptr<TaskHandle> task = taskHandle ? std::move(taskHandle) : TaskHandle::Dummy();
  ImpactHandler handler(reasons != nullptr);
  RAPIDJSON_ASSERT(desiredDocument.IsObject());
  // The walk looks through a "profile" wrapper itself.
  if (applyTasks != nullptr) {
    ApplyTaskGenerator generator;
    ImpactAndTasks both(handler, generator);
    ComputeDrift(desiredDocument, desiredDocument.GetAllocator(), both, std::move(currentDocument));
    *applyTasks = generator.takeTasks();
  } else {
    ComputeDrift(desiredDocument, desiredDocument.GetAllocator(), handler, std::move(currentDocument));
  }
  ImpactReasons why = handler.TakeReasons();

  task->UpdateProgress(20.0f);
  const std::unordered_map<std::string, TaskMap>& runs = handler.PluginMap();
  const float step = runs.empty() ? 100.0f : 80.0f / static_cast<float>(runs.size());
  float progress = 20.0f;
  bool pluginReboot = false, pluginMaintenance = false;
  const auto monitor = std::make_shared<TaskPluginMonitor>(task);
  // In the order the walk met each plugin's first object.
  for (const std::string& name : handler.GetPluginOrder()) {
    const TaskMap& run = runs.at(name);
    if (task->IsAborted()) {
      CSLogger::Log(CSLogger::kInfo, "Impact aborted, returning...");
      result.error = ErrorInfo(kAborted, {name}, "");
      return;
    }
    CSLogger::Log(CSLogger::kInfo, "Invoking plugin: %s", name.c_str());
    task->AddNotification()->PluginInfo(kStarted, {name});
    const ImpactPluginResult verdicts = runner.Impact(*run.plugin, run.inputs, taskId, monitor);
    if (!verdicts.error.id.empty()) {
      CSLogger::Log(CSLogger::kError, "%s plugin failed to execute.", name.c_str());
      task->AddNotification()->PluginError(verdicts.error);
      result.error = verdicts.error;
      return;
    }
    for (const ImpactPluginInfo& verdict : verdicts.impacts) {
      CSLogger::Log(CSLogger::kInfo, "Impact: Plugin=%s, impact=%d (%s:%s:%s:%s)", name.c_str(), verdict.impact,
                    verdict.component.c_str(), verdict.group.c_str(), verdict.key.c_str(), verdict.reason.c_str());
      pluginReboot = pluginReboot || verdict.impact == IMPACT_REBOOT_REQUIRED;
      pluginMaintenance = pluginMaintenance || verdict.impact == IMPACT_MAINTENANCE_MODE_REQUIRED;
      if (reasons != nullptr && verdict.impact != IMPACT_NONE) AddPluginReason(why, run, verdict);
    }
    progress += step;
    task->UpdateProgress(progress);
    task->AddNotification()->PluginInfo(kFinished, {name});
  }

  result.compliant = handler.GetCompliant();
  if (result.compliant) return;
  // The statements in a stable order, so that equal verdicts read alike.
  const auto statements = handler.GetImpactInfo();
  result.impactInfo.assign(statements.begin(), statements.end());
  std::sort(result.impactInfo.begin(), result.impactInfo.end(), [](const ImpactInfo& a, const ImpactInfo& b) {
    return std::tie(a.args, a.id) < std::tie(b.args, b.id);
  });
  // Schema and plugins combined; reboot covers maintenance mode.
  if (pluginReboot || handler.GetRebootRequired()) {
    result.impact = IMPACT_REBOOT_REQUIRED;
    result.impactInfo.insert(result.impactInfo.begin(), ImpactInfo{kImpactInfoReboot, {}});
  } else if (pluginMaintenance || handler.GetMaintenanceModeRequired()) {
    result.impact = IMPACT_MAINTENANCE_MODE_REQUIRED;
    result.impactInfo.insert(result.impactInfo.begin(), ImpactInfo{kImpactInfoMaintenanceMode, {}});
  }
  CSLogger::Log(CSLogger::kDetail, "Impact of the desired configuration: %s", ImpactName(result.impact));
  if (reasons != nullptr) *reasons = std::move(why);
}

}  // namespace

}  // namespace HoxConfigManager
