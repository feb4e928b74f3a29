#include "cli/place.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "cli/problem.h"
#include "common/file_util.h"
#include "common/sdk/share.h"

namespace quarry::cli {
namespace {

bool CoversOrIs(const std::string& upper, const std::string& path) {
  return StringStartWith(path + "/", upper + "/");
}

}  // namespace

std::string ResolveDirectory(const std::string& argument) {
  const std::string path = RealPath(argument);
  if (path.empty()) {
    throw Problem("Cannot open \"" + argument + "\": " + std::strerror(errno) +
                  ". Name a directory that exists.");
  }
  struct stat info {};
  if (stat(path.c_str(), &info) != 0 || !S_ISDIR(info.st_mode)) {
    throw Problem("\"" + path + "\" is not a directory. Name the directory that holds it.");
  }
  if (access(path.c_str(), R_OK | X_OK) != 0) {
    throw Problem("You may not read \"" + path +
                  "\". Ask its owner for permission, or run as root.");
  }
  return path;
}

Place PlanPlace(const std::string& directory, const std::vector<KnownShare>& shares) {
  if (directory == "/") {
    throw Problem("\"/\" cannot be a share. Name a directory below it.");
  }
  const KnownShare* holder = nullptr;
  for (const KnownShare& share : shares) {
    if (!CoversOrIs(share.path, directory)) continue;
    if (holder == nullptr || share.path.size() > holder->path.size()) holder = &share;
  }
  if (holder != nullptr) {
    return {holder->name, holder->path, "/" + holder->name + directory.substr(holder->path.size()),
            false};
  }
  const std::string name = Basename(directory);
  for (const KnownShare& share : shares) {
    if (CoversOrIs(directory, share.path)) {
      throw Problem("\"" + directory + "\" holds the share \"" + share.name + "\" (" + share.path +
                    "). Shares cannot lie within each other; name a directory beside it.");
    }
    if (share.name == name) {
      throw Problem("There is a share named \"" + name + "\" already (" + share.path +
                    "). A share is named after its directory; rename one of the two directories.");
    }
  }
  return {name, directory, "/" + name, true};
}

std::vector<KnownShare> KnownShares() {
  std::vector<KnownShare> shares;
  for (const std::string& name : sdk::SDKShare::Enum()) {
    try {
      shares.push_back({name, sdk::SDKShare(name).GetPath()});
    } catch (const Error&) {
      continue;
    }
  }
  return shares;
}

}  // namespace quarry::cli
