// Work that a writer leaves to whoever has time for it.
//
// An index has one writer at a time, so what need not be done by it should not be: compressing
// texts takes longer than storing them. There are no threads for it. Whoever has had the writer
// does afterwards what has been left, while the next one writes already; what the writer needs
// before that, it does itself.

#ifndef QUARRY_DAEMONS_TARNELASTICD_SIDE_WORK_H_
#define QUARRY_DAEMONS_TARNELASTICD_SIDE_WORK_H_

#include <condition_variable>
#include <deque>
#include <exception>
#include <functional>
#include <memory>
#include <mutex>

namespace quarry::engine {

// Any thread. Blocks only in Finish().
class SideWork {
 public:
  class Task;

  // Leaves `run`, which is called at most once, by any thread. What it uses must stay as long as
  // the task does, also when nobody asks for it any more.
  std::shared_ptr<Task> Add(std::function<void()> run);

  // Does all that nobody has begun.
  void RunAll() noexcept;

  bool IsDone(const Task& task) const;
  // Returns when the task has been done, by the caller where nobody has begun it. Throws what it
  // has thrown.
  void Finish(const std::shared_ptr<Task>& task);
  // Nobody needs it any more: it is not begun, and its failure is nobody's.
  void Drop(const std::shared_ptr<Task>& task) noexcept;

 private:
  std::shared_ptr<Task> TakeFirst() noexcept;
  bool Take(const std::shared_ptr<Task>& task) noexcept;
  void Run(Task* task) noexcept;

  mutable std::mutex mutex_;
  std::condition_variable done_;
  std::deque<std::shared_ptr<Task>> waiting_;  // guarded by mutex_
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_SIDE_WORK_H_
