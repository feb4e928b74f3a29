#include "platform/include/content_extract.h"

#include <cerrno>
#include <stdexcept>
#include <string>

#include "common/json.h"
#include "common/paths.h"
#include "platform/include/socket.h"

namespace quarry::platform {
namespace {

constexpr char kDaemon[] = "tarncontentextractd";

const std::string& ExtractorSocketPath() {
  static const std::string path = RootedPath("/var/run/tarncontentextractd.sock");
  return path;
}

// One thread's connection to the extractor, kept open: connecting costs more than asking.
class Extractor {
 public:
  std::string Ask(const std::string& request) {
    const int before = errno;
    std::string reply;
    // A kept connection may have ended since. Asking twice does no harm: extracting changes
    // nothing.
    if (connected_ && Exchange(request, &reply)) return reply;
    errno = before;
    Connect();
    if (Exchange(request, &reply)) return reply;
    throw std::runtime_error(std::string(kDaemon) + " did not answer");
  }

 private:
  void Connect() {
    connected_ = connection_.Connect();
    if (!connected_) throw std::runtime_error(std::string(kDaemon) + " does not run");
  }

  bool Exchange(const std::string& request, std::string* reply) {
    if (connection_.Send(request) && connection_.Recv(*reply)) return true;
    connection_.Disconnect();
    connected_ = false;
    return false;
  }

  tarndaemon::DomainSockConnection connection_{ExtractorSocketPath()};
  bool connected_ = false;
};

std::string RequestText(const std::string& path, const Json::Value& options) {
  Json::Value request;
  request["command"] = "parse";
  request["data"]["path"] = path;
  request["data"]["options"] = options;
  return toString(request);
}

// The text of the daemon's error; what it sends is not trusted to have one.
std::string ErrorText(const Json::Value& reply) {
  const Json::Value& error = reply["error"];
  const bool has_text = error.isObject() && error["msg"].isString();
  return has_text ? error["msg"].asString() : std::string("malformed answer");
}

}  // namespace
}  // namespace quarry::platform

void TARN_CONTENT_EXTRACT_ParseFile(const std::string& path, const Json::Value& options,
                                    Json::Value& document) {
  using namespace quarry::platform;
  if (path.find('\0') != std::string::npos) throw std::runtime_error("the path has a NUL byte");
  thread_local Extractor extractor;
  Json::Value reply;
  if (!quarry::fromString(reply, extractor.Ask(RequestText(path, options))) || !reply.isObject() ||
      !reply["success"].isBool()) {
    throw std::runtime_error(std::string(kDaemon) + ": malformed answer");
  }
  if (!reply["success"].asBool()) {
    throw std::runtime_error(std::string(kDaemon) + ": " + ErrorText(reply));
  }
  if (!reply["data"].isObject()) {
    throw std::runtime_error(std::string(kDaemon) + ": malformed answer");
  }
  document.swap(reply["data"]);
}
