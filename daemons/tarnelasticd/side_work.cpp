#include "daemons/tarnelasticd/side_work.h"

#include <algorithm>
#include <utility>

namespace quarry::engine {

class SideWork::Task {
 public:
  explicit Task(std::function<void()> run) : run_(std::move(run)) {}

 private:
  friend class SideWork;

  std::function<void()> run_;  // of the thread that has taken the task
  bool is_done_ = false;       // this and what follows: guarded by the work's mutex
  std::exception_ptr failure_;
};

std::shared_ptr<SideWork::Task> SideWork::Add(std::function<void()> run) {
  auto task = std::make_shared<Task>(std::move(run));
  const std::lock_guard<std::mutex> lock(mutex_);
  waiting_.push_back(task);
  return task;
}

std::shared_ptr<SideWork::Task> SideWork::TakeFirst() noexcept {
  const std::lock_guard<std::mutex> lock(mutex_);
  if (waiting_.empty()) return nullptr;
  std::shared_ptr<Task> task = std::move(waiting_.front());
  waiting_.pop_front();
  return task;
}

// Whether nobody had begun it; nobody else will then.
bool SideWork::Take(const std::shared_ptr<Task>& task) noexcept {
  const std::lock_guard<std::mutex> lock(mutex_);
  const auto found = std::find(waiting_.begin(), waiting_.end(), task);
  if (found == waiting_.end()) return false;
  waiting_.erase(found);
  return true;
}

void SideWork::Run(Task* task) noexcept {
  std::exception_ptr failure;
  try {
    task->run_();
  } catch (...) {
    failure = std::current_exception();
  }
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    task->failure_ = std::move(failure);
    task->is_done_ = true;
  }
  done_.notify_all();
}

void SideWork::RunAll() noexcept {
  while (const std::shared_ptr<Task> task = TakeFirst()) Run(task.get());
}

bool SideWork::IsDone(const Task& task) const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return task.is_done_;
}

void SideWork::Finish(const std::shared_ptr<Task>& task) {
  if (Take(task)) Run(task.get());
  std::unique_lock<std::mutex> lock(mutex_);
  done_.wait(lock, [&task] { return task->is_done_; });
  if (task->failure_) std::rethrow_exception(task->failure_);
}

void SideWork::Drop(const std::shared_ptr<Task>& task) noexcept {
  Take(task);
}

}  // namespace quarry::engine
