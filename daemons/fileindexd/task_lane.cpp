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

TaskLane::TaskLane(std::size_t threads, Slots& slots, Gate* gate, std::size_t most_together)
    : max_threads_(std::max<std::size_t>(threads, 1)),
      most_together_(std::max<std::size_t>(most_together, 1)),
      slots_(slots),
      gate_(gate) {}

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

bool TaskLane::IsInTheWay(const Task& earlier, const std::string& path, bool small) {
  return small && earlier.joint != nullptr ? earlier.path == path : PathsMeet(earlier.path, path);
}

bool TaskLane::IsFree(const std::string& path, bool small) const {
  return std::none_of(unfinished_.begin(), unfinished_.end(),
                      [&](const Task& task) { return IsInTheWay(task, path, small); });
}

void TaskLane::Submit(const std::string& path, std::function<void()> task) {
  Enqueue({path, std::move(task)});
}

void TaskLane::SubmitSmall(const Wish& wish, std::function<void()> task, const Joint& joint) {
  Enqueue({wish.path, std::move(task), wish.need_meta, most_together_ > 1 ? &joint : nullptr});
}

void TaskLane::Enqueue(Task task) {
  std::unique_lock<std::mutex> lock(mutex_);
  const std::size_t load = LoadOf(task);
  WaitUntil(lock, [&] {
    return load_ + load <= 2 * max_threads_ * most_together_ &&
           IsFree(task.path, task.joint != nullptr);
  });
  load_ += load;
  unfinished_.push_back(std::move(task));
  ++waiting_;
  if (idle_ < waiting_ && threads_.size() < max_threads_) StartThread();
  ready_.notify_one();
}

void TaskLane::Settle(const std::string& path) {
  std::unique_lock<std::mutex> lock(mutex_);
  WaitUntil(lock, [&] { return IsFree(path, false); });
}

void TaskLane::SettleBelow(const std::string& dir) {
  const auto in_the_way = [&](const Task& task) {
    if (task.joint == nullptr) return PathsMeet(task.path, dir);
    return task.path.size() > dir.size() && IsAtOrBelow(task.path, dir);
  };
  std::unique_lock<std::mutex> lock(mutex_);
  WaitUntil(lock, [&] { return std::none_of(unfinished_.begin(), unfinished_.end(), in_the_way); });
}

void TaskLane::Drain() {
  std::unique_lock<std::mutex> lock(mutex_);
  WaitUntil(lock, [&] { return unfinished_.empty(); });
}

void TaskLane::StartThread() {
  threads_.emplace_back([this] { Run(); });
}

// What was submitted later than a task that was put off waits for it, if the two meet.
bool TaskLane::MayBegin(Tasks::const_iterator task) const {
  if (task->begun) return false;
  return !task->put_off || std::none_of(unfinished_.begin(), task, [&](const Task& earlier) {
    return PathsMeet(earlier.path, task->path);
  });
}

TaskLane::Tasks::iterator TaskLane::NextTask() {
  auto task = unfinished_.begin();
  while (task != unfinished_.end() && !MayBegin(task)) ++task;
  return task;
}

// What waits is shared out among all threads.
TaskLane::Taken TaskLane::TakeTogether() {
  const Tasks::iterator first = NextTask();
  Taken taken;
  if (first == unfinished_.end()) return taken;
  const std::size_t share = (waiting_ + max_threads_ - 1) / max_threads_;
  const std::size_t most = first->joint == nullptr ? 1 : std::min(most_together_, share);
  for (auto task = first; task != unfinished_.end() && taken.size() < most; ++task) {
    if (task->begun || task->joint != first->joint) continue;
    task->begun = true;
    taken.push_back(task);
  }
  waiting_ -= taken.size();
  return taken;
}

// A task is never changed while it is begun, but by whom it was taken.
std::vector<bool> TaskLane::Do(const Taken& taken) {
  if (gate_ != nullptr) gate_->Pass();
  const SlotHolder slot(slots_);
  if (taken.front()->joint == nullptr) {
    taken.front()->work();
    return {true};
  }
  std::vector<Wish> wishes;
  for (const Tasks::iterator task : taken) wishes.push_back({task->path, task->need_meta});
  return (*taken.front()->joint)(wishes);
}

void TaskLane::Run() {
  std::unique_lock<std::mutex> lock(mutex_);
  for (;;) {
    Taken taken;
    ++idle_;
    ready_.wait(lock, [&] {
      if (ending_ || failure_ != nullptr) return true;
      if (waiting_ > 0) taken = TakeTogether();
      return !taken.empty();
    });
    --idle_;
    if (taken.empty()) return;
    lock.unlock();
    std::vector<bool> done;
    std::exception_ptr failure;
    try {
      done = Do(taken);
    } catch (...) {
      failure = std::current_exception();
    }
    lock.lock();
    Finish(taken, done, failure);
  }
}

void TaskLane::PutOff(Tasks::iterator task) {
  load_ += most_together_ - LoadOf(*task);
  task->joint = nullptr;
  task->begun = false;
  task->put_off = true;
  ++waiting_;
  unfinished_.splice(unfinished_.end(), unfinished_, task);
}

void TaskLane::Finish(const Taken& taken, const std::vector<bool>& done,
                      std::exception_ptr failure) {
  for (std::size_t i = 0; i < taken.size(); ++i) {
    if (failure == nullptr && (i >= done.size() || !done[i])) {
      PutOff(taken[i]);
      continue;
    }
    load_ -= LoadOf(*taken[i]);
    unfinished_.erase(taken[i]);
  }
  if (failure != nullptr && failure_ == nullptr) failure_ = failure;
  if (failure_ != nullptr || waiting_ > 0) ready_.notify_all();
  finished_.notify_all();
}

}  // namespace quarry::fileindexd
