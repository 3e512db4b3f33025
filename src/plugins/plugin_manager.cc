// PluginManager: the registry of installed plugins and the order in which
// apply operations run.
#include <algorithm>
#include <map>
#include <stdexcept>

#include <boost/graph/adjacency_list.hpp>
#include <boost/graph/topological_sort.hpp>

#include <hoxcm/files.h>
#include <hoxcm/host.h>
#include <hoxcm/plugins.h>

namespace HoxConfigManager {
namespace {

using DependencyTable = std::unordered_map<std::string, std::vector<std::string>>;

// Apply groups and the names each comes after.
const DependencyTable& GroupTable() {
  static const DependencyTable table = {
      {"system-early", {}},
      {"network", {"system-early"}},
      {"storage", {"network"}},
      {"system", {"storage"}},
  };
  return table;
}

std::string ObjectKey(const HoxConfigStore::ConfigStoreObjectId& id) {
  return id.component + "/" + id.group + "/" + id.key;
}

std::string Quoted(const std::string& s) { return "\"" + s + "\""; }

// The manifests below `directory`, in path order. An unreadable manifest
// fails the registry, as a malformed one does: a plugin missing from it
// would silently not run.
std::vector<std::string> ManifestFiles(const std::string& directory) {
  // A host without plugins has no directory: an empty registry.
  if (!HoxPlatform::IsDirectory(directory)) return {};
  // Symbolic links to directories are not followed, so a link loop cannot
  // trap the walk; a directory that happens to end in ".json" is walked,
  // not read.
  HoxPlatform::ListOptions options;
  options.suffix = ".json";
  HoxPlatform::DirectoryListing listing = HoxPlatform::ListFiles(directory, options);
  for (const auto& problem : listing.problems) {
    const std::string text = "Plugin manifest " + problem.path + " cannot be read: " + problem.reason;
    CSLogger::Log(CSLogger::kError, "%s", text.c_str());
    throw ConfigManagerException(kPluginFailureCode, text.c_str());
  }
  return std::move(listing.files);
}

// The apply operations a plugin adds to the order.
std::vector<PluginApplyOperation> OrderedOperations(const Plugin& plugin) {
  const long version = plugin.GetVersion();
  if (version >= 0 && version <= 2) return plugin.GetOperations();
  if (version != 3) return {};
  PluginApplyOperation op;
  plugin.GetRemediateOperation(op);
  return {op};
}

// The order's table as BuildDependencies fills it (a later operation with the
// same "provides" replaces an earlier one's list), with the plugin behind
// each name, so that every fault can name the plugins involved.
class OrderTable {
 public:
  explicit OrderTable(const std::vector<std::shared_ptr<Plugin>>& plugins) {
    for (const auto& [group, before] : GroupTable()) after_[group] = before;
    for (const auto& plugin : plugins) {
      const std::string group = plugin->GetApplyGroup();
      const auto known = GroupTable().find(group);
      const auto operations = OrderedOperations(*plugin);
      if (known == GroupTable().end() && !operations.empty()) {
        faults_.push_back({"plugin " + Quoted(plugin->GetId()) + " names the apply group " + Quoted(group) +
                               ", which is not one of system-early, network, storage, system",
                           {plugin->GetPath()}});
      }
      for (const auto& op : operations) {
        auto& list = after_[op.provides];
        list.clear();
        if (known != GroupTable().end()) {
          after_[group].push_back(op.provides);
          list = known->second;
        }
        list.insert(list.end(), op.depends.begin(), op.depends.end());
        provider_[op.provides] = plugin.get();
      }
    }
  }

  std::vector<ApplyOrderFault> Faults() {
    for (const auto& [name, list] : after_) {
      for (const std::string& other : list) {
        if (after_.count(other) != 0) continue;
        const Plugin* plugin = provider_.at(name);
        faults_.push_back({"plugin " + Quoted(plugin->GetId()) + ": " + Quoted(name) + " depends on " +
                               Quoted(other) + ", which no plugin provides and which is not an apply group",
                           {plugin->GetPath()}});
      }
    }
    FindCycles();
    return std::move(faults_);
  }

 private:
  enum class Mark { kNew, kOnPath, kDone };

  // Depth first from every name in name order; an edge back to a name on the
  // current path closes a cycle, reported once with its names in order.
  void FindCycles() {
    std::map<std::string, Mark> marks;
    std::vector<std::string> path;
    for (const auto& entry : after_) Visit(entry.first, marks, path);
  }

  void Visit(const std::string& name, std::map<std::string, Mark>& marks, std::vector<std::string>& path) {
    Mark& mark = marks[name];
    if (mark != Mark::kNew) return;
    mark = Mark::kOnPath;
    path.push_back(name);
    for (const std::string& other : after_[name]) {
      if (after_.count(other) == 0) continue;
      if (marks[other] == Mark::kOnPath) {
        ReportCycle(std::vector<std::string>(std::find(path.begin(), path.end(), other), path.end()));
      } else {
        Visit(other, marks, path);
      }
    }
    path.pop_back();
    marks[name] = Mark::kDone;
  }

  void ReportCycle(const std::vector<std::string>& members) {
    std::string chain;
    std::vector<std::string> plugins, manifests;
    for (const std::string& name : members) {
      chain += name + " -> ";
      const auto it = provider_.find(name);
      if (it == provider_.end()) continue;
      const std::string id = Quoted(it->second->GetId());
      if (std::find(plugins.begin(), plugins.end(), id) == plugins.end()) plugins.push_back(id);
      if (std::find(manifests.begin(), manifests.end(), it->second->GetPath()) == manifests.end()) {
        manifests.push_back(it->second->GetPath());
      }
    }
    std::string ids;
    for (const std::string& id : plugins) ids += (ids.empty() ? "" : ", ") + id;
    faults_.push_back({"the apply order has a cycle: " + chain + members.front() +
                           " (each runs after the next), declared by the plugins " + ids,
                       manifests});
  }

  std::map<std::string, std::vector<std::string>> after_;
  std::map<std::string, const Plugin*> provider_;
  std::vector<ApplyOrderFault> faults_;
};

}  // namespace

std::vector<ApplyOrderFault> FindApplyOrderFaults(const std::vector<std::shared_ptr<Plugin>>& plugins) {
  return OrderTable(plugins).Faults();
}

std::vector<ApplyOrderFault> CheckApplyOrder(PluginType type) {
  std::vector<std::shared_ptr<Plugin>> plugins;
  for (const std::string& file : ManifestFiles(PluginDirectory())) {
    auto plugin = std::make_shared<Plugin>(file.c_str());
    if (plugin->CheckType(type)) plugins.push_back(std::move(plugin));
  }
  return FindApplyOrderFaults(plugins);
}

PluginManager::PluginManager(PluginType type) : directory(PluginDirectory()) { Load(type); }

void PluginManager::Load(PluginType type) {
  // Manifests load in path order, which fixes the order in which Find
  // returns the owners of an object.
  for (const std::string& file : ManifestFiles(directory)) ProcessJson(file.c_str(), type);
  if (type != APPLY && type != APPLY_BOOT) return;
  try {
    BuildDependencies();
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "Failed to process dependencies %s", e.what());
    // The first fault found, with its manifest, tells the reader where to look.
    ErrorLocation where;
    const auto faults = FindApplyOrderFaults(GetPlugins());
    if (!faults.empty()) {
      where.file = faults.front().manifests.empty() ? std::string() : faults.front().manifests.front();
      where.reason = faults.front().text;
    }
    ThrowExceptionAt<ConfigManagerException>(where, PluginDependencyGraphFailed);
  }
}

void PluginManager::ProcessJson(const char* path, PluginType type) {
  auto plugin = std::make_shared<Plugin>(path);
  if (!plugin->CheckType(type)) {
    CSLogger::Log(CSLogger::kDetail, "File %s does not support type:%d", path, static_cast<int>(type));
    return;
  }
  plugins[path] = plugin;
  for (const auto& id : plugin->GetCSOIdList()) {
    CSLogger::Log(CSLogger::kDetail, "Adding cso %s to extension table %s", id.toString().c_str(), path);
    extensions.emplace(ObjectKey(id), path);
  }
}

std::vector<std::shared_ptr<Plugin>> PluginManager::Find(const HoxConfigStore::ConfigStoreObjectId& id) {
  std::vector<std::shared_ptr<Plugin>> result;
  const auto range = extensions.equal_range(ObjectKey(id));
  // Apply looks up every object it changes: the line's text is built only
  // when it is written.
  const bool detail = CSLogger::IsEnabled(CSLogger::kDetail);
  for (auto it = range.first; it != range.second; ++it) {
    if (detail) {
      CSLogger::Log(CSLogger::kDetail, "Plugin found=%s for cso=%s", it->second.c_str(), id.toString().c_str());
    }
    result.push_back(plugins[it->second]);
  }
  return result;
}

std::vector<std::string> PluginManager::List() {
  std::vector<std::string> result;
  for (const auto& [key, path] : extensions) result.push_back(key + ":" + path);
  return result;
}

std::vector<std::shared_ptr<Plugin>> PluginManager::GetPlugins() {
  // In manifest path order, the order they were loaded in: callers that run
  // them one by one (validation) run them in the same order every time.
  std::vector<const std::pair<const std::string, std::shared_ptr<Plugin>>*> sorted;
  for (const auto& entry : plugins) sorted.push_back(&entry);
  std::sort(sorted.begin(), sorted.end(), [](const auto* a, const auto* b) { return a->first < b->first; });
  std::vector<std::shared_ptr<Plugin>> result;
  for (const auto* entry : sorted) result.push_back(entry->second);
  return result;
}

std::vector<std::string> PluginManager::GetDependencies() { return dependencies; }

void PluginManager::ProcessOperation(const PluginApplyOperation& op, const std::string& group,
                                     DependencyTable& table) {
  table[group].push_back(op.provides);
  // Bounds-checked: an unknown group throws std::out_of_range.
  table[op.provides] = GroupTable().at(group);
  auto& after = table[op.provides];
  after.insert(after.end(), op.depends.begin(), op.depends.end());
}

void PluginManager::BuildDependencies() {
  DependencyTable table = GroupTable();
  // In manifest path order, as OrderTable reads them: when two operations
  // provide one name, the later one's list wins in both, so the order built
  // here and the faults `plugins check` names agree.
  for (const auto& plugin : GetPlugins()) {
    CSLogger::Log(CSLogger::kDetail, "Processing operations in %s", plugin->GetPath().c_str());
    const std::string group = plugin->GetApplyGroup();
    for (const auto& op : OrderedOperations(*plugin)) ProcessOperation(op, group, table);
  }

  std::unordered_map<std::string, std::size_t> index;
  std::vector<std::string> names;
  for (const auto& entry : table) {
    index.emplace(entry.first, names.size());
    names.push_back(entry.first);
  }
  using Graph = boost::adjacency_list<boost::listS, boost::vecS, boost::directedS>;
  Graph graph(names.size());
  for (const auto& [name, after] : table) {
    // A name that nothing provides throws std::out_of_range.
    for (const std::string& other : after) boost::add_edge(index.at(name), index.at(other), graph);
  }
  std::vector<std::size_t> order;
  boost::topological_sort(graph, std::back_inserter(order));
  for (std::size_t v : order) dependencies.push_back(names[v]);
}

}  // namespace HoxConfigManager
