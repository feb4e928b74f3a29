#include "cli/layout.h"

#include <sys/un.h>

#include <filesystem>

#include "cli/problem.h"
#include "common/paths.h"

namespace quarry::cli {
namespace {

constexpr const char* kDirectories[] = {
    "/etc/quarry", "/tmp", "/var/run", "/var/log", "/var/lib/quarry", "/var/packages/Quarry/etc"};
constexpr const char* kLongestSocket = "/var/run/tarncontentextractd.sock";

}  // namespace

void CheckRoot() {
  const std::string& root = Root();
  if (root.empty()) return;
  if (root.front() != '/') {
    throw Problem("QUARRY_ROOT must be an absolute path, not \"" + root + "\".");
  }
  constexpr std::size_t kAddressMax = sizeof(sockaddr_un::sun_path) - 1;
  if (RootedPath(kLongestSocket).size() > kAddressMax) {
    const std::size_t room = kAddressMax - std::string(kLongestSocket).size();
    throw Problem("QUARRY_ROOT (" + root +
                  ") is too long for the daemons' sockets. Choose a path of " +
                  std::to_string(room) + " bytes or less.");
  }
}

void EnsureLayout() {
  for (const char* directory : kDirectories) {
    std::error_code error;
    const std::string path = RootedPath(directory);
    std::filesystem::create_directories(path, error);
    if (error) {
      throw Problem("Cannot make the directory " + path + ": " + error.message() +
                    ". Run as root, or set QUARRY_ROOT to a directory of your own.");
    }
  }
}

}  // namespace quarry::cli
