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

#include "daemons/fileindexd/gate.h"
#include "daemons/fileindexd/index.h"
#include "daemons/fileindexd/slots.h"

namespace quarry::fileindexd {

// Whether the places are the same or one lies below the other.
bool PathsMeet(const std::string& a, const std::string& b);

// Tasks on the same place, or on places above and below each other, are done in the order in which
// they were submitted; others side by side. At most twice as many as there are threads are
// unfinished at a time. The first failure of a task ends the lane: tasks that have not begun are
// dropped, and every later call throws that failure. One thread submits.
//
// Small tasks, which change nothing but their own place, are done together where several of a kind
// wait at the same time; none waits for others to come. So many more of them may be unfinished. To
// each other they only matter on the same place, not above and below.
class TaskLane {
 public:
  // Does what it can of these, which are not more than `most_together`, and returns for each
  // whether it is done. One that is not is then done by itself.
  using Joint = std::function<std::vector<bool>(const std::vector<Wish>& wishes)>;
  static constexpr std::size_t kMostTogether = 32;

  // Threads are started when they are needed. `slots` bounds the tasks of several lanes together,
  // and nothing is begun while `gate`, if there is one, is closed; once that stops it ends the
  // lane. Both must outlive the lane.
  TaskLane(std::size_t threads, Slots& slots, Gate* gate = nullptr,
           std::size_t most_together = kMostTogether);
  ~TaskLane() { End(); }
  TaskLane(const TaskLane&) = delete;
  TaskLane& operator=(const TaskLane&) = delete;

  // Blocks until the task may begin without overtaking another one.
  void Submit(const std::string& path, std::function<void()> task);
  // The same for a small one: `joint`, which outlives the lane and tells its kind, does it together
  // with others, `task` does it alone.
  void SubmitSmall(const Wish& wish, std::function<void()> task, const Joint& joint);
  // Blocks until nothing that was submitted for the place, above it or below it is unfinished.
  void Settle(const std::string& path);
  // Blocks until nothing that was submitted for places below the directory is unfinished, nor
  // anything else that may change them.
  void SettleBelow(const std::string& dir);
  // Blocks until everything is finished.
  void Drain();
  // Drops what has not begun and waits for what has. Nothing can be submitted afterwards.
  void End();

 private:
  struct Task {
    std::string path;
    std::function<void()> work;
    bool need_meta = false;        // of a small one
    const Joint* joint = nullptr;  // null: it is done alone
    bool begun = false;
    bool put_off = false;  // tasks that it meets may have been submitted before
  };
  using Tasks = std::list<Task>;
  using Taken = std::vector<Tasks::iterator>;  // one task, or small ones of one kind

  template <typename Condition>
  void WaitUntil(std::unique_lock<std::mutex>& lock, const Condition& condition);
  static bool IsInTheWay(const Task& earlier, const std::string& path, bool small);
  bool IsFree(const std::string& path, bool small) const;
  std::size_t LoadOf(const Task& task) const { return task.joint != nullptr ? 1 : most_together_; }
  void Enqueue(Task task);
  void StartThread();
  void Run();
  bool MayBegin(Tasks::const_iterator task) const;
  Tasks::iterator NextTask();
  Taken TakeTogether();
  std::vector<bool> Do(const Taken& taken);
  void Finish(const Taken& taken, const std::vector<bool>& done, std::exception_ptr failure);
  void PutOff(Tasks::iterator task);

  const std::size_t max_threads_;
  const std::size_t most_together_;
  Slots& slots_;
  Gate* const gate_;
  std::mutex mutex_;
  std::condition_variable finished_;  // a task has ended
  std::condition_variable ready_;     // a task may begin, or all is over
  Tasks unfinished_;
  std::size_t load_ = 0;     // of these, as many small ones together counting as much as another
  std::size_t waiting_ = 0;  // of these, not begun
  std::size_t idle_ = 0;     // threads without a task
  bool ending_ = false;
  std::exception_ptr failure_;
  std::vector<std::thread> threads_;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_TASK_LANE_H_
