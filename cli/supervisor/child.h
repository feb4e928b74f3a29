// One child process.

#ifndef QUARRY_CLI_SUPERVISOR_CHILD_H_
#define QUARRY_CLI_SUPERVISOR_CHILD_H_

#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

namespace quarry::cli {

// A program started with `arguments` (its own name not among them). It inherits nothing but the
// standard descriptors, has no signal blocked, leads a process group of its own and is asked to
// stop when the thread that started it ends. Movable; an object that still owns a running child
// kills it.
class Child {
 public:
  // With an `output` file the child's standard output and error are appended to it and its standard
  // input is empty. Throws Problem when the program cannot be started.
  Child(const std::string& program, const std::vector<std::string>& arguments,
        const std::string& output = std::string());
  ~Child();
  Child(Child&& other) noexcept;
  Child& operator=(Child&& other) noexcept;

  pid_t Pid() const { return pid_; }

  // How the child ended, in words ("exit code 1", "signal 9"), once it has; nothing before. Does
  // not block.
  std::optional<std::string> Ended();

  // Waits up to `milliseconds` for the end and returns whether it has come.
  bool WaitEnded(int milliseconds);

  void Signal(int signal) const;

 private:
  pid_t pid_ = -1;
  std::optional<std::string> end_;
};

}  // namespace quarry::cli

#endif  // QUARRY_CLI_SUPERVISOR_CHILD_H_
