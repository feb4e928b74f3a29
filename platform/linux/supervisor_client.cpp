#include "platform/linux/supervisor_client.h"

#include <json/json.h>
#include <sys/socket.h>
#include <sys/time.h>

#include <cerrno>

#include "common/json.h"
#include "common/paths.h"
#include "platform/include/socket.h"
#include "platform/linux/last_error.h"

namespace quarry::platform {
namespace {

constexpr time_t kTimeoutSeconds = 60;

// A supervisor that hangs must not hang whoever changes a folder.
class Connection : public tarndaemon::DomainSockConnection {
 public:
  Connection() : DomainSockConnection(SupervisorSocketPath()) {}

  bool ConnectWithTimeout() {
    if (!Connect()) return false;
    const timeval timeout{kTimeoutSeconds, 0};
    return setsockopt(fd_, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof(timeout)) == 0 &&
           setsockopt(fd_, SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof(timeout)) == 0;
  }
};

bool IsSuccess(const std::string& text) {
  Json::Value reply;
  return fromString(reply, text) && reply.isObject() && reply["success"].isBool() &&
         reply["success"].asBool();
}

}  // namespace

const std::string& SupervisorSocketPath() {
  static const std::string path = RootedPath("/var/run/quarry.sock");
  return path;
}

int AskSupervisor(const std::string& command, const std::string& service, bool force) {
  Json::Value request;
  request["command"] = command;
  request["data"]["service"] = service;
  if (force) request["data"]["force"] = true;
  Connection connection;
  std::string reply;
  if (!connection.ConnectWithTimeout() || !connection.Send(toString(request)) ||
      !connection.Recv(reply)) {
    return QUARRY_PLATFORM_FAIL(kErrService);
  }
  if (IsSuccess(reply)) return 0;
  errno = EREMOTEIO;
  return QUARRY_PLATFORM_FAIL(kErrService);
}

}  // namespace quarry::platform
