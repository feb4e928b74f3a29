// Doing the work of one pass on several threads without mixing up its order.

#ifndef QUARRY_DAEMONS_FILEINDEXD_TASK_LANE_H_
#define QUARRY_DAEMONS_FILEINDEXD_TASK_LANE_H_

#include <condition_variable>
#include <cstddef>
#include <exception>
#include <functional>
#include <list>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "daemons/fileindexd/slots.h"

namespace quarry::fileindexd {

// Whether the places are the same or one lies below the other.
bool PathsMeet(const std::string& a, const std::string& b);

// Tasks on the same place, or on places above and below each other, are done in the order in which
// they were submitted; others side by side. At most twice as many as there are threads are
// unfinished at a time. The first failure of a task ends the lane: tasks that have not begun are
// dropped, and every later call throws that failure. One thread submits.
class TaskLane {
 public:
  // Threads are started when they are needed. `slots` bounds the tasks of several lanes together
  // and must outlive the lane.
  TaskLane(std::size_t threads, Slots& slots);
  ~TaskLane() { End(); }
  TaskLane(const TaskLane&) = delete;
  TaskLane& operator=(const TaskLane&) = delete;

  // Blocks until the task may begin without overtaking another one.
  void Submit(const std::string& path, std::function<void()> task);
  // Blocks until nothing that was submitted for the place, above it or below it is unfinished.
  void Settle(const std::string& path);
  // Blocks until everything is finished.
  void Drain();
  // Drops what has not begun and waits for what has. Nothing can be submitted afterwards.
  void End();

 private:
  struct Task {
    std::string path;
    std::function<void()> work;
    bool begun = false;
  };
  using Tasks = std::list<Task>;

  template <typename Condition>
  void WaitUntil(std::unique_lock<std::mutex>& lock, const Condition& condition);
  bool IsFree(const std::string& path) const;
  void StartThread();
  void Run();
  Tasks::iterator NextTask();
  void Finish(Tasks::iterator task, std::exception_ptr failure);

  const std::size_t max_threads_;
  Slots& slots_;
  std::mutex mutex_;
  std::condition_variable finished_;  // a task has ended
  std::condition_variable ready_;     // a task may begin, or all is over
  Tasks unfinished_;
  std::size_t waiting_ = 0;  // of these, not begun
  std::size_t idle_ = 0;     // threads without a task
  bool ending_ = false;
  std::exception_ptr failure_;
  std::vector<std::thread> threads_;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_TASK_LANE_H_
