// What processes that were killed have left behind.

#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <ctime>
#include <filesystem>
#include <system_error>

#include "cli/doctor/checks.h"
#include "cli/doctor/known_places.h"
#include "cli/doctor/state_text.h"
#include "cli/problem.h"
#include "common/file_util.h"
#include "common/paths.h"
#include "daemons/common/client.h"
#include "daemons/common/single_instance.h"
#include "fileindex/config/folder_mgr.h"

namespace quarry::cli {
namespace {

constexpr const char* kPrograms[] = {"quarry", "tarnelasticd", "tarncontentextractd", "fileindexd",
                                     "tarnotifyd"};
// Nobody takes as long to write a state file.
constexpr std::time_t kOldSeconds = 600;

std::string SocketOf(const std::string& program) {
  return RootedPath("/var/run/" + program + ".sock");
}

void Remove(const std::string& path) {
  if (unlink(path.c_str()) == 0 || errno == ENOENT) return;
  throw Problem("Cannot remove " + path + ": " + std::generic_category().message(errno));
}

bool IsDeadSocket(const std::string& path) {
  struct stat info {};
  return lstat(path.c_str(), &info) == 0 && S_ISSOCK(info.st_mode) && !daemon::IsListening(path);
}

// With the pid file locked no daemon of that name can start, so nobody's socket is removed but a
// dead one's. Giving the lock back empties the pid file.
std::string RemoveTraces(const std::string& program) {
  const daemon::SingleInstance lock(program);
  if (IsDeadSocket(SocketOf(program))) Remove(SocketOf(program));
  return "";
}

bool HasText(const std::string& path) {
  struct stat info {};
  return lstat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode) && info.st_size > 0;
}

void CheckTraces(Examination& examination, const std::string& program) {
  const std::string pid_file = daemon::PidFilePath(program);
  if (daemon::RunningPid(pid_file) != 0) return;
  const bool socket = IsDeadSocket(SocketOf(program));
  if (!socket && !HasText(pid_file)) return;
  examination.Mend(program + " was killed and has left " +
                       (socket ? "its socket " + SocketOf(program) : "its number in " + pid_file),
                   "removed", [&] { return RemoveTraces(program); });
}

// A daemon does not start where something is in the way of its socket.
void CheckSocketPlace(Examination& examination, const std::string& program) {
  const std::string path = SocketOf(program);
  struct stat info {};
  if (lstat(path.c_str(), &info) != 0 || S_ISSOCK(info.st_mode)) return;
  examination.Mend("At the place of " + program + "'s socket (" + path + ") lies something else",
                   "set aside", [&] { return "set aside as " + SetAside(path); });
}

bool EndsInSixCharacters(const std::string& name) {
  static const char* const letters =
      "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789";
  const std::string end = GetFileExtension(name, false);
  return end.size() == 6 && end.find_first_not_of(letters) == std::string::npos;
}

// Names under which state files are written before they get their own.
bool IsTemporaryName(const std::string& name) {
  if (StringStartWith(name, ".quarry-")) return GetFileExtension(name, false) == "tmp";
  const bool replaced = StringStartWith(name, "shares.json.") ||
                        StringStartWith(name, "samba-spotlight.conf.") ||
                        name.find(".json.") != std::string::npos;
  return replaced && EndsInSixCharacters(name);
}

bool IsOldFile(const std::string& path) {
  struct stat info {};
  return lstat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode) &&
         info.st_mtime < std::time(nullptr) - kOldSeconds;
}

void CheckTemporaryFiles(Examination& examination, const std::string& directory) {
  std::error_code failure;
  std::filesystem::directory_iterator entry(directory, failure);
  for (const std::filesystem::directory_iterator end; !failure && entry != end;
       entry.increment(failure)) {
    const std::string path = entry->path();
    if (!IsTemporaryName(entry->path().filename()) || !IsOldFile(path)) continue;
    examination.Mend("A writer that was killed has left " + path, "removed", [&] {
      Remove(path);
      return "";
    });
  }
}

}  // namespace

void CheckLeftovers(Examination& examination) {
  for (const char* program : kPrograms) {
    CheckTraces(examination, program);
    CheckSocketPlace(examination, program);
  }
  for (const std::string& directory :
       {Dirname(fileindex::kFileIndexFoldersCfgPath), RootedPath("/etc/quarry"),
        Dirname(EngineListPath()), MonitorDirectory(), RootedPath("/var/lib/quarry/queue")}) {
    CheckTemporaryFiles(examination, directory);
  }
}

}  // namespace quarry::cli
