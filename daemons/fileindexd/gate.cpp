#include "daemons/fileindexd/gate.h"

#include <utility>

namespace quarry::fileindexd {

void Gate::Stop() {
  const std::lock_guard<std::mutex> lock(mutex_);
  stopping_ = true;
  changed_.notify_all();
}

void Gate::SetPaused(bool paused) {
  const std::lock_guard<std::mutex> lock(mutex_);
  paused_ = paused;
  changed_.notify_all();
}

void Gate::Wake() {
  const std::lock_guard<std::mutex> lock(mutex_);
  woken_ = true;
  changed_.notify_all();
}

bool Gate::Stopping() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return stopping_;
}

bool Gate::Paused() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return paused_;
}

void Gate::Pass() {
  std::unique_lock<std::mutex> lock(mutex_);
  changed_.wait(lock, [this] { return stopping_ || !paused_; });
  if (stopping_) throw Interrupted();
}

void Gate::Rest(std::chrono::milliseconds time) {
  std::unique_lock<std::mutex> lock(mutex_);
  if (changed_.wait_for(lock, time, [this] { return stopping_; })) throw Interrupted();
}

bool Gate::WaitFor(std::chrono::milliseconds time) {
  std::unique_lock<std::mutex> lock(mutex_);
  changed_.wait_for(lock, time, [this] { return stopping_ || woken_; });
  return std::exchange(woken_, false);
}

}  // namespace quarry::fileindexd
