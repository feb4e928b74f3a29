// Trying things in a process of their own, because they cannot be undone in this one.

#ifndef QUARRY_TESTS_PLATFORM_LINUX_CHILD_H_
#define QUARRY_TESTS_PLATFORM_LINUX_CHILD_H_

#include <sys/wait.h>
#include <unistd.h>

#include <functional>

namespace quarry::test {

// The exit status of a forked child that ran `body`, or -1 when it did not exit.
inline int RunInChild(const std::function<int()>& body) {
  const pid_t child = fork();
  if (child == 0) _exit(body());
  int status = 0;
  if (child < 0 || waitpid(child, &status, 0) != child || !WIFEXITED(status)) return -1;
  return WEXITSTATUS(status);
}

}  // namespace quarry::test

#endif  // QUARRY_TESTS_PLATFORM_LINUX_CHILD_H_
