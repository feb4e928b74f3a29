// One pass over a share's queue.

#ifndef QUARRY_DAEMONS_FILEINDEXD_PASS_H_
#define QUARRY_DAEMONS_FILEINDEXD_PASS_H_

#include <cstddef>
#include <functional>
#include <string>
#include <vector>

#include "daemons/fileindexd/operation_handler.h"
#include "daemons/fileindexd/slots.h"

namespace quarry::fileindexd {

struct PassSetup {
  std::string queue_path;
  std::string share_root;
  Index& index;
  const Survey& survey;
  Gate& gate;
  Progress& progress;
  SetAside& aside;
  Slots& slots;
  std::size_t threads = 1;
  Identity root_identity;  // of the share's directory
};

enum class PassResult {
  kDone,
  kAgain,  // the engine was started anew meanwhile: what was done may be lost
};

// Takes the queue's snapshot, does what it says, commits, and only then deletes the snapshot: a
// pass that is cut short anywhere is done again by the next one. With `full`, and where lines of
// the snapshot cannot be read, the whole share is compared besides. Throws Error, with the snapshot
// kept, when the pass cannot go on, and Interrupted when the worker is to stop.
PassResult RunPass(const PassSetup& setup, bool full);

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_PASS_H_
