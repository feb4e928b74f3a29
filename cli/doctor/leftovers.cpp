// What processes that were killed have left behind.

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <ctime>
#include <filesystem>
#include <system_error>
#include <vector>

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

// Whether the name ends in what is drawn for a temporary file. Some of these are words; a copy that
// somebody has called ".backup" must not be taken for one.
bool EndsAtRandom(const std::string& name) {
  const std::string end = GetFileExtension(name, false);
  const auto count = [&](int (*is)(int)) {
    return std::count_if(end.begin(), end.end(),
                         [is](char c) { return is(static_cast<unsigned char>(c)) != 0; });
  };
  return end.size() == 6 && count(std::isalnum) == 6 && count(std::islower) < 6;
}

// Where state files are written under another name before they get their own. Queues, and the
// directories of indexes, may have any name that does not begin with a point.
struct Place {
  std::string directory;
  std::vector<std::string> prefixes;  // of names that end at random
};

bool IsTemporaryName(const std::string& name, const Place& place) {
  if (StringStartWith(name, ".quarry-")) return GetFileExtension(name, false) == "tmp";
  return std::any_of(place.prefixes.begin(), place.prefixes.end(), [&](const std::string& prefix) {
    return StringStartWith(name, prefix) && EndsAtRandom(name);
  });
}

// Nobody else may read it before it is whole, unless its writer thinks otherwise.
bool IsOldDraft(const std::string& path) {
  struct stat info {};
  const bool hidden = Basename(path).front() == '.';
  return lstat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode) &&
         (hidden || (info.st_mode & 0777) == 0600) &&
         info.st_mtime < std::time(nullptr) - kOldSeconds;
}

void CheckTemporaryFiles(Examination& examination, const Place& place) {
  std::error_code failure;
  std::filesystem::directory_iterator entry(place.directory, failure);
  for (const std::filesystem::directory_iterator end; !failure && entry != end;
       entry.increment(failure)) {
    const std::string path = entry->path();
    if (!IsTemporaryName(entry->path().filename(), place) || !IsOldDraft(path)) continue;
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
  const Place places[] = {{Dirname(fileindex::kFileIndexFoldersCfgPath), {}},
                          {Dirname(EngineListPath()), {}},
                          {RootedPath("/var/lib/quarry/queue"), {}},
                          {RootedPath("/etc/quarry"), {"shares.json.", "samba-spotlight.conf."}},
                          {MonitorDirectory(), {"fileindex-"}}};
  for (const Place& place : places) CheckTemporaryFiles(examination, place);
}

}  // namespace quarry::cli
