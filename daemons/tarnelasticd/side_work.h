// Work that a writer leaves to whoever has time for it.
//
// An index has one writer at a time, so what need not be done by it should not be: compressing
// texts takes longer than storing them. Whoever has had the writer does afterwards what has been
// left, while the next one writes already; what the writer needs before that, it does itself. Only
// for large tasks, which somebody would wait for, there is a thread, as long as there are any.

#ifndef QUARRY_DAEMONS_TARNELASTICD_SIDE_WORK_H_
#define QUARRY_DAEMONS_TARNELASTICD_SIDE_WORK_H_

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <exception>
#include <functional>
#include <memory>
#include <mutex>
#include <thread>

namespace quarry::engine {

// Any thread. Blocks only in Finish(), and at the end for what is being done.
class SideWork {
 public:
  class Task;

  SideWork() = default;
  ~SideWork();
  SideWork(const SideWork&) = delete;
  SideWork& operator=(const SideWork&) = delete;

  // Leaves `run`, which works on so many bytes and is called at most once, by any thread. What it
  // refers to must stay as long as the task does, also when nobody asks for it any more. What it
  // owns is let go before the task is done, so that whoever waits for that may count on the memory;
  // of a task that is dropped, at the end of its run, or with the last who has the task.
  std::shared_ptr<Task> Add(std::size_t bytes, std::function<void()> run);

  // Does what nobody has begun by now, but for what is large. What others add meanwhile they do
  // themselves, or whoever helps them without end would never be answered.
  void RunAll() noexcept;

  // What works on so many bytes is large.
  static constexpr std::size_t kLarge = std::size_t{1} << 20;

  bool IsDone(const Task& task) const;
  // Returns when the task has been done, by the caller where nobody has begun it. Throws what it
  // has thrown.
  void Finish(const std::shared_ptr<Task>& task);
  // Nobody needs it any more: it is not begun, and its failure is nobody's.
  void Drop(const std::shared_ptr<Task>& task) noexcept;

 private:
  using Queue = std::deque<std::shared_ptr<Task>>;
  void StartHelper();
  void Help() noexcept;
  std::size_t CountWaiting() const noexcept;
  std::shared_ptr<Task> TakeFirst(Queue* queue) noexcept;
  bool Take(const std::shared_ptr<Task>& task) noexcept;
  void Run(Task* task) noexcept;

  mutable std::mutex mutex_;
  std::condition_variable done_;
  Queue waiting_;  // this and what follows: guarded by mutex_
  Queue large_;
  std::thread helper_;
  bool is_helping_ = false;
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_SIDE_WORK_H_
