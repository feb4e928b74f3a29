// The engine at the other end of a connection.

#include <cerrno>
#include <memory>
#include <string>

#include "platform/include/socket.h"
#include "tests/fake_platform/fake_platform.h"
#include "tests/fake_platform/world.h"

namespace quarry::fake {
namespace {

Json::Value Parse(const std::string& text) {
  Json::Value value;
  Json::CharReaderBuilder builder;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  if (!reader->parse(text.data(), text.data() + text.size(), &value, nullptr)) return {};
  return value;
}

// The answer to a request, or null when the engine gives none.
std::optional<std::string> Answer(const std::string& request) {
  World& world = TheWorld();
  std::function<std::optional<std::string>(const Json::Value&)> engine;
  {
    WorldLock lock(world.mutex);
    if (!world.replies.empty()) {
      std::string reply = world.replies.front();
      world.replies.pop_front();
      return reply;
    }
    engine = world.engine;
  }
  if (!engine) return R"({"success":true})";
  return engine(Parse(request));
}

// Takes the oldest request of a connection that was not answered yet.
std::optional<std::string> TakeRequest(const void* connection) {
  World& world = TheWorld();
  WorldLock lock(world.mutex);
  auto& waiting = world.unanswered[connection];
  if (waiting.empty()) return std::nullopt;
  std::string request = waiting.front();
  waiting.pop_front();
  return request;
}

}  // namespace

std::vector<std::string> Requests() {
  WorldLock lock(TheWorld().mutex);
  return TheWorld().requests;
}

std::vector<Json::Value> JsonRequests() {
  std::vector<Json::Value> parsed;
  for (const std::string& request : Requests()) parsed.push_back(Parse(request));
  return parsed;
}

void ClearRequests() {
  WorldLock lock(TheWorld().mutex);
  TheWorld().requests.clear();
}

void QueueReply(const std::string& text) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().replies.push_back(text);
}

void QueueReply(const Json::Value& reply) {
  QueueReply(CompactText(reply));
}

void OnRequest(std::function<std::optional<std::string>(const Json::Value&)> handler) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().engine = std::move(handler);
}

}  // namespace quarry::fake

namespace tarndaemon {

using quarry::fake::Called;
using quarry::fake::TheWorld;
using quarry::fake::WorldLock;

namespace {

// Stands for a descriptor; nothing may be done with it but to see that it is not -1.
constexpr int kConnected = 1 << 30;

}  // namespace

SockConnection::~SockConnection() {
  Disconnect();
}

bool SockConnection::Send(const std::string& message) {
  if (Called("SockConnection::Send", message)) return false;
  if (fd_ == -1) {
    errno = ENOTCONN;
    return false;
  }
  WorldLock lock(TheWorld().mutex);
  TheWorld().requests.push_back(message);
  TheWorld().unanswered[this].push_back(message);
  return true;
}

bool SockConnection::Recv(std::string& message) {
  if (Called("SockConnection::Recv")) return false;
  const auto request = quarry::fake::TakeRequest(this);
  const auto reply = request ? quarry::fake::Answer(*request) : std::nullopt;
  if (!reply) {
    errno = ECONNRESET;
    return false;
  }
  message = *reply;
  return true;
}

void SockConnection::Disconnect() {
  if (fd_ == -1) return;
  Called("SockConnection::Disconnect");
  fd_ = -1;
  WorldLock lock(TheWorld().mutex);
  --TheWorld().outstanding;
  TheWorld().unanswered.erase(this);
}

bool DomainSockConnection::Connect() {
  if (Called("DomainSockConnection::Connect", path_)) return false;
  fd_ = kConnected;
  WorldLock lock(TheWorld().mutex);
  ++TheWorld().outstanding;
  return true;
}

}  // namespace tarndaemon
