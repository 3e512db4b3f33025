#include <hoxcm/host.h>

#include <cstdlib>

namespace HoxPlatform {

std::string HostRoot() {
  const char* root = std::getenv("HOX_ROOT");
  if (root == nullptr || *root == '\0') return "/";
  return root;
}

std::string HostPath(std::string_view path) {
  std::string root = HostRoot();
  while (root.size() > 1 && root.back() == '/') root.pop_back();
  if (root == "/") return std::string(path);
  if (!path.empty() && path.front() != '/') root.push_back('/');
  return root.append(path);
}

std::string StripHostRoot(std::string_view path) {
  std::string root = HostRoot();
  while (root.size() > 1 && root.back() == '/') root.pop_back();
  if (root == "/") return std::string(path);
  if (path.size() > root.size() && path.compare(0, root.size(), root) == 0 && path[root.size()] == '/') {
    return std::string(path.substr(root.size()));
  }
  return std::string(path);
}

}  // namespace HoxPlatform
