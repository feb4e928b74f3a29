// A whole private system for one test: the real programs below the test's own root.

#ifndef QUARRY_TESTS_SYSTEM_RUNNING_SYSTEM_H_
#define QUARRY_TESTS_SYSTEM_RUNNING_SYSTEM_H_

#include <json/json.h>

#include <cstddef>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "cli/supervisor/child.h"
#include "tests/support/temp_dir.h"

namespace quarry::test {

struct Ran {
  std::string output;  // standard output and error
  std::string end;     // "exit code 0"
};

class RunningSystem {
 public:
  // An empty root; nothing runs yet.
  RunningSystem();

  // Starts "quarry run" and waits until the engine listens.
  void Start();
  // Only starts it.
  void StartSupervisor();
  // Asks it to stop and waits until it has. Kill() does not ask.
  void Stop();
  void Kill();

  // The program that is tested.
  static std::string Program();

  // Ends the change monitor, for tests of what is found without it, and waits until what it told
  // last is worked off. Returns whether that came.
  bool StopMonitor() const;

  // Runs quarry to its end, at most a minute.
  Ran Quarry(const std::vector<std::string>& arguments) const;
  // The same for what is to succeed; returns what it printed.
  std::string Run(const std::vector<std::string>& arguments) const;
  // Runs it and kills it after so many milliseconds, unless it has ended before.
  void KillQuarry(const std::vector<std::string>& arguments, int milliseconds) const;
  // The same as Quarry() with --json; the document it printed.
  Json::Value QuarryJson(std::vector<std::string> arguments) const;

  // Makes the directory a share, the whole of it indexed, and waits until it is.
  void IndexShare(const std::string& path) const;

  // Waits until no folder has anything waiting, at most a minute, and returns whether that came.
  // Where it did not, the test fails with what the status says.
  bool WaitUntilIdle() const;

  // The paths of all documents in the index of the share, each as often as it is there.
  std::multiset<std::string> Documents(const std::string& share_path) const;

  // How many queues are registered with the change monitor. What was being written when its writer
  // was killed does not count.
  std::ptrdiff_t Registrations() const;

  // What the supervisor and the daemons have logged since the first start.
  std::string Log() const;

  // The process of a service, 0 when it does not run.
  pid_t Pid(const std::string& service) const;

  // A directory whose files tests index; it lies outside the root.
  const std::string& Files() const { return files_.path(); }

 private:
  bool IsIdle() const;
  std::string WhatItWaitsFor() const;

  TempDir files_;
  TempDir scratch_;
  std::optional<cli::Child> supervisor_;
};

// All directories and regular files below `top`, and `top` itself.
std::multiset<std::string> Listing(const std::string& top);

}  // namespace quarry::test

#endif  // QUARRY_TESTS_SYSTEM_RUNNING_SYSTEM_H_
