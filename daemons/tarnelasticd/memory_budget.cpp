#include "daemons/tarnelasticd/memory_budget.h"

#include "common/error.h"
#include "daemons/tarnelasticd/document.h"

namespace quarry::engine {

MemoryBudget::Share::Share(MemoryBudget* budget, std::size_t bytes)
    : budget_(budget), bytes_(bytes) {
  std::unique_lock<std::mutex> lock(budget_->mutex_);
  const auto fits = [this] {
    return budget_->used_ == 0 || budget_->used_ + bytes_ <= budget_->limit_;
  };
  // A busy answer sends the asker away for a quarter of an hour; most documents take milliseconds.
  if (!budget_->freed_.wait_for(lock, budget_->patience_, fits)) {
    throw Error(kErrorEngineBusy, "Too many documents at once");
  }
  budget_->used_ += bytes_;
}

MemoryBudget::Share::~Share() {
  {
    const std::lock_guard<std::mutex> lock(budget_->mutex_);
    budget_->used_ -= bytes_;
  }
  budget_->freed_.notify_all();
}

std::size_t EstimateMemory(const Json::Value& document) {
  constexpr std::size_t kFieldBytes = 128;
  constexpr std::size_t kCopies = 4;
  if (!document.isObject()) return 0;
  std::size_t bytes = 0;
  for (const Json::Value& value : document) bytes += kFieldBytes + kCopies * ViewOf(value).size();
  return bytes;
}

}  // namespace quarry::engine
