// The daemon as a process of its own, below the test's root.

#ifndef QUARRY_TESTS_DAEMONS_TARNCONTENTEXTRACTD_SUPPORT_RUNNING_EXTRACTOR_H_
#define QUARRY_TESTS_DAEMONS_TARNCONTENTEXTRACTD_SUPPORT_RUNNING_EXTRACTOR_H_

#include <json/json.h>
#include <sys/types.h>

#include <string>
#include <vector>

#include "tests/support/temp_dir.h"

namespace quarry::extract {

class RunningExtractor {
 public:
  // Starts it with these arguments.
  explicit RunningExtractor(const std::vector<std::string>& arguments = {});
  // Kills it if it still runs.
  ~RunningExtractor();
  RunningExtractor(const RunningExtractor&) = delete;
  RunningExtractor& operator=(const RunningExtractor&) = delete;

  // Whether it takes requests within a minute.
  bool IsReady() const;
  void Signal(int signal) const;
  // Waits up to a minute for its end: "exit code 0", "signal 9", "none".
  std::string End();
  // What it has written to standard output and error.
  std::string Output() const;

  static std::string SocketPath();
  // The answer to a request for the document of `path`, and that document.
  static Json::Value Ask(const std::string& path, bool need_meta = true);
  static Json::Value Document(const std::string& path) { return Ask(path)["data"]; }

  // Its children.
  std::vector<pid_t> Workers() const;

 private:
  test::TempDir dir_;
  pid_t pid_ = -1;
};

}  // namespace quarry::extract

#endif  // QUARRY_TESTS_DAEMONS_TARNCONTENTEXTRACTD_SUPPORT_RUNNING_EXTRACTOR_H_
