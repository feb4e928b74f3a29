// Where the system keeps its files. Every fixed path is computed once, when the library is loaded.

#ifndef QUARRY_COMMON_PATHS_H_
#define QUARRY_COMMON_PATHS_H_

#include <string>

#include "common/export.h"

namespace quarry {

// The value of QUARRY_ROOT, or the empty string where it is unset or the process is privileged
// beyond its caller. With a root a whole system runs privately below it.
QUARRY_EXPORT const std::string& Root();

// Root() + `fixed_path`, which begins with "/".
QUARRY_EXPORT std::string RootedPath(const std::string& fixed_path);

}  // namespace quarry

#endif  // QUARRY_COMMON_PATHS_H_
