// A system of its own for one command.

#ifndef QUARRY_CLI_BACKGROUND_SYSTEM_H_
#define QUARRY_CLI_BACKGROUND_SYSTEM_H_

#include <optional>

#include "cli/supervisor/child.h"

namespace quarry::cli {

// Starts "quarry run" in the background unless a system runs already, and stops at the end of its
// life what it has started. One that is about to end is waited for. The supervisor's output goes to
// var/log/quarry.log.
class BackgroundSystem {
 public:
  // Blocks until the search engine answers, at most half a minute. Throws Problem.
  BackgroundSystem();
  ~BackgroundSystem();
  BackgroundSystem(const BackgroundSystem&) = delete;
  BackgroundSystem& operator=(const BackgroundSystem&) = delete;

 private:
  std::optional<Child> supervisor_;
};

}  // namespace quarry::cli

#endif  // QUARRY_CLI_BACKGROUND_SYSTEM_H_
