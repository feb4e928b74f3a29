// A fixed number of threads that run tasks in order of arrival.

#ifndef QUARRY_DAEMONS_COMMON_WORKER_POOL_H_
#define QUARRY_DAEMONS_COMMON_WORKER_POOL_H_

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <functional>
#include <mutex>
#include <thread>
#include <vector>

namespace quarry::daemon {

// Add() may be called from any thread. Tasks must not throw.
class WorkerPool {
 public:
  explicit WorkerPool(std::size_t threads);
  // Waits for the tasks that are running; those that have not begun are dropped.
  ~WorkerPool();
  WorkerPool(const WorkerPool&) = delete;
  WorkerPool& operator=(const WorkerPool&) = delete;

  // Does not block. How many tasks may wait is for the caller to bound.
  void Add(std::function<void()> task);

 private:
  void Run();

  std::mutex mutex_;
  std::condition_variable changed_;
  std::deque<std::function<void()>> tasks_;
  bool stopping_ = false;
  std::vector<std::thread> threads_;
};

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_WORKER_POOL_H_
