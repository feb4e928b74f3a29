// A bound on what all requests together hold in memory.

#ifndef QUARRY_DAEMONS_TARNELASTICD_MEMORY_BUDGET_H_
#define QUARRY_DAEMONS_TARNELASTICD_MEMORY_BUDGET_H_

#include <json/json.h>

#include <cstddef>
#include <mutex>

namespace quarry::engine {

// Any thread.
class MemoryBudget {
 public:
  explicit MemoryBudget(std::size_t bytes) : limit_(bytes) {}

  // Takes its share as long as it lives.
  class Share {
   public:
    // Throws Error kErrorEngineBusy when others hold so much that `bytes` more would be too much.
    // Who asks while nobody else holds any is never refused: waiting would not help.
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
  std::mutex mutex_;
  std::size_t used_ = 0;
};

// Roughly what storing `document` takes: its text is held as it came, packed and compressed.
std::size_t EstimateMemory(const Json::Value& document);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_MEMORY_BUDGET_H_
