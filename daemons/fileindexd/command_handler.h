// The commands of the daemon's socket (docs/daemon-protocol.md).

#ifndef QUARRY_DAEMONS_FILEINDEXD_COMMAND_HANDLER_H_
#define QUARRY_DAEMONS_FILEINDEXD_COMMAND_HANDLER_H_

#include <json/json.h>
#include <sys/types.h>

#include <string>

namespace quarry::fileindexd {

// What commands do. No member may wait for anything.
class CommandTarget {
 public:
  virtual ~CommandTarget() = default;

  virtual void SettingChanged(const std::string& share, bool is_upsert) = 0;
  virtual void Pause(long long resume_time) = 0;
  virtual void Resume() = 0;
  virtual void CreateWorker(const std::string& share) = 0;
  // With a process given the share gets a worker again when that process has ended; 0 is none.
  virtual void DeleteWorker(const std::string& share, pid_t while_running) = 0;
  virtual Json::Value Status() const = 0;
};

// The answer's text to a request's text, whatever that is, of the process `peer`.
std::string HandleCommand(CommandTarget& target, const std::string& request, pid_t peer);

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_COMMAND_HANDLER_H_
