// The workers of all shares.

#ifndef QUARRY_DAEMONS_FILEINDEXD_WORKER_TABLE_H_
#define QUARRY_DAEMONS_FILEINDEXD_WORKER_TABLE_H_

#include <json/json.h>
#include <sys/types.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <thread>

#include "common/unique_fd.h"
#include "daemons/fileindexd/worker.h"

namespace quarry::fileindexd {

// Starts and stops one thread for each share. No member waits for a worker, StopAll() excepted. One
// thread.
class WorkerTable {
 public:
  using Factory = std::function<std::unique_ptr<Worker>(const std::string& share)>;

  explicit WorkerTable(Factory factory) : factory_(std::move(factory)) {}
  // Stops all workers and waits for them, however long that takes.
  ~WorkerTable();
  WorkerTable(const WorkerTable&) = delete;
  WorkerTable& operator=(const WorkerTable&) = delete;

  // The shares that have indexed folders: each gets a worker, unless it was deleted; others lose
  // theirs. A worker is started once the share's former one has ended.
  void SetShares(const std::set<std::string>& shares);

  // The worker of a share with indexed folders stops, and none is started until the share is
  // allowed one again, or has had no indexed folder in between. With a process given it is allowed
  // one, too, as soon as that process has ended; 0 is none. Throws Error 502, and leaves the
  // worker, when the process cannot be watched for a shortage that may pass.
  void Delete(const std::string& share, pid_t while_running = 0);
  void Allow(const std::string& share);

  void SetPaused(bool paused);
  // Tells all workers that the folder list, or the status, may have changed.
  void Reload();
  void CheckStatus();

  // Starts what can be started and forgets what has ended. To be called now and then.
  void Tend();

  // An array with one element per share, in ascending order.
  Json::Value Report() const;

  // Stops all workers. Returns whether all have ended in that time.
  bool StopAll(std::chrono::milliseconds time);

 private:
  struct Running {
    std::unique_ptr<Worker> worker;
    std::thread thread;
    std::atomic<bool> ended{false};
  };

  void Start(const std::string& share);
  void Retire(const std::string& share);

  const Factory factory_;
  bool paused_ = false;
  std::set<std::string> shares_;  // with indexed folders
  // By command, with the descriptor of the process that is to be outlived, if any.
  std::map<std::string, UniqueFd> deleted_;
  std::map<std::string, std::unique_ptr<Running>> workers_;
  // Stopped, but perhaps not yet ended; several of one share cannot be.
  std::map<std::string, std::unique_ptr<Running>> leaving_;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_WORKER_TABLE_H_
