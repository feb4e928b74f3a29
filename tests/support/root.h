// The private root below which one test program runs. It is made before the program's static
// objects are (the program starts itself again with QUARRY_ROOT set), and removed when it ends.

#ifndef QUARRY_TESTS_SUPPORT_ROOT_H_
#define QUARRY_TESTS_SUPPORT_ROOT_H_

#include <string>

namespace quarry::test {

// The root, an absolute path without a "/" at its end.
std::string TestRoot();

// Empties the root, then makes the directories of a fresh system in it: etc/quarry, tmp, var/run,
// var/packages/Quarry/etc, var/lib/quarry/queue, var/lib/quarry/index.
void ResetTestRoot();

}  // namespace quarry::test

#endif  // QUARRY_TESTS_SUPPORT_ROOT_H_
