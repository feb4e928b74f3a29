// The daemon as a whole.

#ifndef QUARRY_DAEMONS_FILEINDEXD_INDEX_DAEMON_H_
#define QUARRY_DAEMONS_FILEINDEXD_INDEX_DAEMON_H_

#include <chrono>
#include <cstddef>
#include <memory>
#include <set>
#include <string>

#include "daemons/common/socket_server.h"
#include "daemons/fileindexd/command_handler.h"
#include "daemons/fileindexd/slots.h"
#include "daemons/fileindexd/state_files.h"
#include "daemons/fileindexd/worker_table.h"

namespace quarry::fileindexd {

// Where the daemon listens.
const std::string& CommandSocketPath();

// Keeps one worker per share with indexed folders and answers commands. One thread.
class IndexDaemon : private CommandTarget {
 public:
  // `threads` documents are in work at a time, in the background unless `full_speed`. Listens at
  // once; workers are started by Step(). Throws Error 502 when somebody listens there already.
  explicit IndexDaemon(std::size_t threads, bool full_speed = false);

  // Waits up to `timeout_ms` for a command, answers what has come, and follows what has changed.
  void Step(int timeout_ms);

  // Step() returns as soon as `fd` is readable.
  void WakeOn(int fd) { server_->WakeOn(fd); }

  // Removes the socket file, answers the last commands (which takes 0.2 s at most) and stops the
  // workers. Returns whether all workers have ended in `time`. Nothing else may be called
  // afterwards.
  bool Stop(std::chrono::milliseconds time);

 private:
  void SettingChanged(const std::string& share, bool is_upsert) override;
  void Pause(long long resume_time) override;
  void Resume() override;
  void CreateWorker(const std::string& share) override;
  void DeleteWorker(const std::string& share, pid_t while_running) override;
  Json::Value Status() const override;

  std::unique_ptr<Worker> MakeWorker(const std::string& share);

  void FollowFolders();
  void FollowStatus();
  void ApplyPause();
  void SweepQueues();

  const std::size_t threads_;
  const bool full_speed_;
  Slots slots_;
  FileWatch folders_watch_;
  FileWatch status_watch_;
  PauseState pause_;
  bool paused_ = false;
  std::chrono::steady_clock::time_point next_sweep_{};
  WorkerTable workers_;
  std::unique_ptr<daemon::SocketServer> server_;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_INDEX_DAEMON_H_
