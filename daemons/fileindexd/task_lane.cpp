#include "daemons/fileindexd/task_lane.h"

#include <algorithm>
#include <utility>

namespace quarry::fileindexd {
namespace {

bool IsAtOrBelow(const std::string& path, const std::string& dir) {
  return path.size() >= dir.size() && path.compare(0, dir.size(), dir) == 0 &&
         (path.size() == dir.size() || path[dir.size()] == '/');
}

}  // namespace

bool PathsMeet(const std::string& a, const std::string& b) {
  return a.size() < b.size() ? IsAtOrBelow(b, a) : IsAtOrBelow(a, b);
}

TaskLane::TaskLane(std::size_t threads, Slots& slots)
    : max_threads_(std::max<std::size_t>(threads, 1)), slots_(slots) {}

void TaskLane::End() {
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    ending_ = true;
    ready_.notify_all();
  }
  for (std::thread& thread : threads_) thread.join();
  threads_.clear();
}

template <typename Condition>
void TaskLane::WaitUntil(std::unique_lock<std::mutex>& lock, const Condition& condition) {
  finished_.wait(lock, [&] { return failure_ != nullptr || condition(); });
  if (failure_ != nullptr) std::rethrow_exception(failure_);
}

bool TaskLane::IsFree(const std::string& path) const {
  return std::none_of(unfinished_.begin(), unfinished_.end(),
                      [&](const Task& task) { return PathsMeet(task.path, path); });
}

void TaskLane::Submit(const std::string& path, std::function<void()> task) {
  std::unique_lock<std::mutex> lock(mutex_);
  WaitUntil(lock, [&] { return unfinished_.size() < 2 * max_threads_ && IsFree(path); });
  unfinished_.push_back({path, std::move(task), false});
  ++waiting_;
  if (idle_ < waiting_ && threads_.size() < max_threads_) StartThread();
  ready_.notify_one();
}

void TaskLane::Settle(const std::string& path) {
  std::unique_lock<std::mutex> lock(mutex_);
  WaitUntil(lock, [&] { return IsFree(path); });
}

void TaskLane::Drain() {
  std::unique_lock<std::mutex> lock(mutex_);
  WaitUntil(lock, [&] { return unfinished_.empty(); });
}

void TaskLane::StartThread() {
  threads_.emplace_back([this] { Run(); });
}

TaskLane::Tasks::iterator TaskLane::NextTask() {
  return std::find_if(unfinished_.begin(), unfinished_.end(),
                      [](const Task& task) { return !task.begun; });
}

void TaskLane::Run() {
  std::unique_lock<std::mutex> lock(mutex_);
  for (;;) {
    ++idle_;
    ready_.wait(lock, [this] { return ending_ || failure_ != nullptr || waiting_ > 0; });
    --idle_;
    if (ending_ || failure_ != nullptr) return;
    const Tasks::iterator task = NextTask();
    task->begun = true;
    --waiting_;
    lock.unlock();
    std::exception_ptr failure;
    try {
      const SlotHolder slot(slots_);
      task->work();
    } catch (...) {
      failure = std::current_exception();
    }
    lock.lock();
    Finish(task, failure);
  }
}

void TaskLane::Finish(Tasks::iterator task, std::exception_ptr failure) {
  unfinished_.erase(task);
  if (failure != nullptr && failure_ == nullptr) {
    failure_ = failure;
    ready_.notify_all();
  }
  finished_.notify_all();
}

}  // namespace quarry::fileindexd
