#include "cli/layout.h"

#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <system_error>

#include "cli/problem.h"
#include "common/paths.h"

namespace quarry::cli {
namespace {

constexpr const char* kDirectories[] = {
    "/etc/quarry", "/tmp", "/var/run", "/var/log", "/var/lib/quarry", "/var/packages/Quarry/etc"};
constexpr const char* kLongestSocket = "/var/run/tarncontentextractd.sock";

[[noreturn]] void Refuse(const std::string& what) {
  throw Problem(what +
                ". Run as the user who owns the system, or as root; or set QUARRY_ROOT to a " +
                "directory of your own.");
}

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
    if (error) Refuse("Cannot make the directory " + path + ": " + error.message());
    if (access(path.c_str(), W_OK | X_OK) != 0) {
      Refuse("Cannot write in " + path + ": " + std::generic_category().message(errno));
    }
  }
}

}  // namespace quarry::cli
