#include "registry.h"

#include <dirent.h>
#include <wezo/wezotifyd.h>

#include <algorithm>
#include <memory>
#include <stdexcept>

#include "json_io.h"

namespace WEZO {
namespace WEZOTIFYD {
namespace {

bool EndsWith(const std::string& text, const std::string& tail) {
  return text.size() >= tail.size() &&
         text.compare(text.size() - tail.size(), tail.size(), tail) == 0;
}

// The entries of `dir` in name order, without "." and "..".
std::vector<std::string> List(const std::string& dir) {
  std::vector<std::string> names;
  const std::unique_ptr<DIR, int (*)(DIR*)> stream(opendir(dir.c_str()), closedir);
  if (!stream) {
    return names;
  }
  while (const dirent* entry = readdir(stream.get())) {
    const std::string name = entry->d_name;
    if (name != "." && name != "..") {
      names.push_back(name);
    }
  }
  std::sort(names.begin(), names.end());
  return names;
}

}  // namespace

const Tree* Registration::TreeOf(const std::string& path) const {
  for (const Tree& tree : trees) {
    if (path.compare(0, tree.path.size(), tree.path) != 0 ||
        (path.size() > tree.path.size() && path[tree.path.size()] != '/')) {
      continue;
    }
    bool ignored = false;
    for (size_t start = tree.path.size() + 1; start < path.size() && !ignored;) {
      const size_t end = std::min(path.find('/', start), path.size());
      ignored = tree.ignore.count(path.substr(start, end - start)) != 0;
      start = end + 1;
    }
    if (!ignored) {
      return &tree;
    }
  }
  return nullptr;
}

std::vector<Registration> LoadRegistry(const std::string& registryDir,
                                       std::vector<std::string>& problems) {
  std::vector<Registration> registrations;
  for (const std::string& client : List(registryDir)) {
    std::string clientDir = registryDir + "/";
    clientDir += client;
    for (const std::string& name : List(clientDir)) {
      if (!EndsWith(name, ".json")) {
        continue;  // a writer's temporary file
      }
      Registration registration;
      registration.file = clientDir + "/";
      registration.file += name;
      Json::Value value;
      if (!FILEINDEX::JsonFromFile(value, registration.file)) {
        problems.push_back(registration.file + ": cannot be read as JSON");
        continue;
      }
      try {
        const MonitorQueue entry(value);  // checks the shape of every element
        registration.queue = entry.QueuePath();
      } catch (const std::invalid_argument& e) {
        problems.push_back(registration.file + ": " + e.what());
        continue;
      }
      for (const Json::Value& dir : value["config"]) {
        Tree tree;
        tree.path = dir["path"].asString();
        while (tree.path.size() > 1 && tree.path.back() == '/') {
          tree.path.pop_back();
        }
        tree.mask = static_cast<uint32_t>(dir["mask"].asLargestInt());
        for (const Json::Value& ignored : dir["ignore"]) {
          tree.ignore.insert(ignored.asString());
        }
        if (tree.path.front() == '/') {
          registration.trees.push_back(std::move(tree));
        } else {
          problems.push_back(registration.file + ": a relative path is not watched: " + tree.path);
        }
      }
      registrations.push_back(std::move(registration));
    }
  }
  return registrations;
}

}  // namespace WEZOTIFYD
}  // namespace WEZO
