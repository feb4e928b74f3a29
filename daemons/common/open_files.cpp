#include "daemons/common/open_files.h"

#include <sys/resource.h>

namespace quarry::daemon {

void AllowManyFiles() {
  struct rlimit limit {};
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_NOFILE, &limit);
}

}  // namespace quarry::daemon
