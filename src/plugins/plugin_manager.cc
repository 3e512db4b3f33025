// PluginManager: the registry of installed plugins and the order in which
// apply operations run.
#include <algorithm>
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

}  // namespace

PluginManager::PluginManager(PluginType type) : directory(PluginDirectory()) { Load(type); }

void PluginManager::Load(PluginType type) {
  // A host without plugins has no directory: an empty registry.
  if (HoxPlatform::IsDirectory(directory)) {
    // Symbolic links to directories are not followed, so a link loop cannot
    // trap the walk; a directory that happens to end in ".json" is walked,
    // not read. Manifests load in path order, which fixes the order in
    // which Find returns the owners of an object.
    HoxPlatform::ListOptions options;
    options.suffix = ".json";
    const HoxPlatform::DirectoryListing listing = HoxPlatform::ListFiles(directory, options);
    // An unreadable manifest fails the registry, as a malformed one does:
    // a plugin missing from it would silently not run.
    for (const auto& problem : listing.problems) {
      const std::string text = "Plugin manifest " + problem.path + " cannot be read: " + problem.reason;
      CSLogger::Log(CSLogger::kError, "%s", text.c_str());
      throw ConfigManagerException(kPluginFailureCode, text.c_str());
    }
    for (const std::string& file : listing.files) ProcessJson(file.c_str(), type);
  }
  if (type != APPLY && type != APPLY_BOOT) return;
  try {
    BuildDependencies();
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "Failed to process dependencies %s", e.what());
    ThrowException<ConfigManagerException>(PluginDependencyGraphFailed);
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
  for (const auto& [path, plugin] : plugins) {
    CSLogger::Log(CSLogger::kDetail, "Processing operations in %s", path.c_str());
    const std::string group = plugin->GetApplyGroup();
    const long version = plugin->GetVersion();
    if (version >= 0 && version <= 2) {
      for (const auto& op : plugin->GetOperations()) ProcessOperation(op, group, table);
    } else if (version == 3) {
      PluginApplyOperation op;
      plugin->GetRemediateOperation(op);
      ProcessOperation(op, group, table);
    }
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
