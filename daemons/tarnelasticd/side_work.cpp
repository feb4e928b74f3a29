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

SideWork::~SideWork() {
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    large_.clear();
  }
  if (helper_.joinable()) helper_.join();
}

std::shared_ptr<SideWork::Task> SideWork::Add(std::size_t bytes, std::function<void()> run) {
  auto task = std::make_shared<Task>(std::move(run));
  const std::lock_guard<std::mutex> lock(mutex_);
  if (bytes < kLarge) {
    waiting_.push_back(task);
    return task;
  }
  large_.push_back(task);
  StartHelper();
  return task;
}

// Without a thread the task waits for who needs it.
void SideWork::StartHelper() {
  if (is_helping_) return;
  if (helper_.joinable()) helper_.join();
  try {
    helper_ = std::thread([this] { Help(); });
    is_helping_ = true;
  } catch (const std::exception&) {
  }
}

void SideWork::Help() noexcept {
  while (const std::shared_ptr<Task> task = TakeFirst(&large_)) Run(task.get());
}

// The helper ends when it is told that there is nothing.
std::shared_ptr<SideWork::Task> SideWork::TakeFirst(Queue* queue) noexcept {
  const std::lock_guard<std::mutex> lock(mutex_);
  if (queue->empty()) {
    if (queue == &large_) is_helping_ = false;
    return nullptr;
  }
  std::shared_ptr<Task> task = std::move(queue->front());
  queue->pop_front();
  return task;
}

// Whether nobody had begun it; nobody else will then.
bool SideWork::Take(const std::shared_ptr<Task>& task) noexcept {
  const std::lock_guard<std::mutex> lock(mutex_);
  if (task->is_done_) return false;
  for (Queue* queue : {&waiting_, &large_}) {
    const auto found = std::find(queue->begin(), queue->end(), task);
    if (found == queue->end()) continue;
    queue->erase(found);
    return true;
  }
  return false;
}

void SideWork::Run(Task* task) noexcept {
  std::exception_ptr failure;
  try {
    std::exchange(task->run_, nullptr)();
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
  for (std::size_t left = CountWaiting(); left > 0; --left) {
    const std::shared_ptr<Task> task = TakeFirst(&waiting_);
    if (!task) return;
    Run(task.get());
  }
}

std::size_t SideWork::CountWaiting() const noexcept {
  const std::lock_guard<std::mutex> lock(mutex_);
  return waiting_.size();
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
