// Asking a daemon on this machine.

#ifndef QUARRY_DAEMONS_COMMON_CLIENT_H_
#define QUARRY_DAEMONS_COMMON_CLIENT_H_

#include <json/json.h>

#include <chrono>
#include <cstddef>
#include <string>

#include "common/unique_fd.h"

namespace quarry::daemon {

struct ClientOptions {
  // How long to wait for the connection, when the daemon's queue of connections is full.
  std::chrono::milliseconds connect_timeout = std::chrono::seconds(2);
  // How long one whole exchange may take.
  std::chrono::milliseconds timeout = std::chrono::seconds(30);
  // A longer answer is an error.
  std::size_t max_reply_bytes = std::size_t{256} << 20;
};

// One daemon's client. Its connection is kept open from request to request. One thread at a time.
class Client {
 public:
  // `daemon` names it in messages. Nothing is connected yet. Throws Error 502 when the path does
  // not fit a socket address.
  Client(const std::string& daemon, const std::string& socket_path, ClientOptions options = {});

  // Sends one request and returns its answer, which may be any JSON value: whether it reports
  // success is for the caller to see. Blocks for at most the two timeouts. Throws Error 502 with a
  // sentence that names the daemon: it does not run, did not answer in time, hung up, or its answer
  // was no JSON. After a failure the next request connects anew. A request is never sent twice.
  Json::Value Request(const Json::Value& request);

  // The same for the text of a request that was written already; returns the text of the answer,
  // which may be no JSON.
  std::string RequestText(std::string request);

 private:
  class Deadline;
  void Connect();
  bool IsStale() const;
  void Wait(short events, const Deadline& deadline);
  void SendFrame(std::string text, const Deadline& deadline);
  void RecvAll(char* buffer, std::size_t size, const Deadline& deadline);
  std::string RecvFrame(const Deadline& deadline);
  [[noreturn]] void Broken(const std::string& what);

  std::string daemon_;
  std::string path_;
  ClientOptions options_;
  UniqueFd fd_;
};

// One request on a connection of its own, as Client::Request.
Json::Value Request(const std::string& daemon, const std::string& socket_path,
                    const Json::Value& request, ClientOptions options = {});

// Whether somebody accepts connections at the socket. Never throws; does not block.
bool IsListening(const std::string& socket_path);

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_CLIENT_H_
