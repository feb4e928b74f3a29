// What the two state files say that concerns all workers.

#ifndef QUARRY_DAEMONS_FILEINDEXD_STATE_FILES_H_
#define QUARRY_DAEMONS_FILEINDEXD_STATE_FILES_H_

#include <ctime>
#include <optional>
#include <set>
#include <string>

namespace quarry::fileindexd {

// Tells when a file has become another one. A file that is missing is a state, too.
class FileWatch {
 public:
  explicit FileWatch(const std::string& path) : path_(path) {}

  // Whether the file has changed since the last call; true the first time.
  bool HasChanged();

 private:
  std::string path_;
  std::optional<std::string> seen_;
};

// The pause that all workers keep. Takes no lock: a command that changes it is sent by a process
// that holds the status lock until it is answered.
class PauseState {
 public:
  // Since when and until when, as StatusMgr::GetPauseInfo() gives it: -1 not paused, 0 without end.
  void Set(long long resume_time) { resume_time_ = resume_time; }
  long long ResumeTime() const { return resume_time_; }
  bool IsPaused(std::time_t now) const { return resume_time_ == 0 || resume_time_ > now; }

 private:
  long long resume_time_ = -1;
};

// The pause end that the status file has. Throws Error when it cannot be loaded.
long long LoadResumeTime();

// The shares that have indexed folders. A record that names no share is logged and passed over.
// Throws Error when the folder list cannot be loaded.
std::set<std::string> LoadIndexedShares();

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_STATE_FILES_H_
