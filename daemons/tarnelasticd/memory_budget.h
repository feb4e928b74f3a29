// A bound on what all requests together hold in memory.

#ifndef QUARRY_DAEMONS_TARNELASTICD_MEMORY_BUDGET_H_
#define QUARRY_DAEMONS_TARNELASTICD_MEMORY_BUDGET_H_

#include <json/json.h>

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <mutex>

namespace quarry::engine {

// Any thread.
class MemoryBudget {
 public:
  // Who would exceed `bytes` waits up to `patience` for others to end.
  MemoryBudget(std::size_t bytes, std::chrono::steady_clock::duration patience)
      : limit_(bytes), patience_(patience) {}

  // Takes its share as long as it lives.
  class Share {
   public:
    // Throws Error kErrorEngineBusy when others keep holding so much that `bytes` more would be
    // too much. Who asks while nobody else holds any is never refused: waiting would not help.
    Share(MemoryBudget* budget, std::size_t bytes);
    ~Share();
    Share(const Share&) = delete;
    Share& operator=(const Share&) = delete;

   private:
    MemoryBudget* budget_;
    std::size_t bytes_;
  };

 private:
  const std::size_t limit_;
  const std::chrono::steady_clock::duration patience_;
  std::mutex mutex_;
  std::condition_variable freed_;
  std::size_t used_ = 0;  // guarded by mutex_
};

// Roughly what storing `document` takes: its text is held as it came, packed and compressed.
std::size_t EstimateMemory(const Json::Value& document);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_MEMORY_BUDGET_H_
