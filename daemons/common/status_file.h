// What a running daemon without a socket says of itself, for whoever wants to know.

#ifndef QUARRY_DAEMONS_COMMON_STATUS_FILE_H_
#define QUARRY_DAEMONS_COMMON_STATUS_FILE_H_

#include <json/json.h>

#include <string>

namespace quarry::daemon {

// Keeps RootedPath("/var/run/" + name + ".status"), mode 0644, as long as the object lives. For the
// process that holds the pid file of that name (single_instance.h). One thread.
class StatusFile {
 public:
  // Removes what another process has left.
  explicit StatusFile(const std::string& name);
  ~StatusFile();
  StatusFile(const StatusFile&) = delete;
  StatusFile& operator=(const StatusFile&) = delete;

  // Replaces the file whole, unless it says so already. The status is an object. It is not synced,
  // since it means nothing after this process. Where it cannot be written there is no file, which
  // is logged once, and the next call tries again.
  void Write(const Json::Value& status);

 private:
  bool Replace(const std::string& text) const;

  const std::string name_;
  const std::string path_;
  std::string written_;
  bool failed_ = false;
};

// The status of the daemon of that name, with its process as "pid". Null when none runs, whatever
// file a killed one has left. Only the "pid" while it has not said anything yet.
Json::Value ReadStatusFile(const std::string& name);

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_STATUS_FILE_H_
