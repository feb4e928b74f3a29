// How many requests per second go through SendRequest: one connection each, over a real socket, to
// a server that answers at once. What the engine does with a request is measured elsewhere.

#include <benchmark/benchmark.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <cstdint>
#include <cstdlib>
#include <string>
#include <thread>

#include "bench/private_root.h"
#include "comm/comm.h"
#include "common/paths.h"
#include "common/unique_fd.h"

namespace quarry::fileindex::elastic {
namespace {

// Answers {"success":true} to one request per connection, on a thread of its own.
class Server {
 public:
  Server() : listener_(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    RootedPath("/var/run/tarnelasticd.sock").copy(address.sun_path, sizeof(address.sun_path) - 1);
    if (bind(listener_.get(), reinterpret_cast<sockaddr*>(&address), sizeof(address)) != 0 ||
        listen(listener_.get(), 128) != 0) {
      std::abort();
    }
    thread_ = std::thread([this] { Serve(); });
  }
  ~Server() {
    shutdown(listener_.get(), SHUT_RDWR);
    thread_.join();
  }
  Server(const Server&) = delete;
  Server& operator=(const Server&) = delete;

 private:
  void Serve() {
    while (true) {
      const UniqueFd peer(accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
      if (!peer.valid()) return;
      if (ReadRequest(peer.get())) Answer(peer.get());
    }
  }

  bool ReadRequest(int peer) {
    std::uint32_t length = 0;
    if (recv(peer, &length, sizeof(length), MSG_WAITALL) != sizeof(length)) return false;
    request_.resize(length);
    return recv(peer, request_.data(), length, MSG_WAITALL) == static_cast<ssize_t>(length);
  }

  static void Answer(int peer) {
    const std::string text = R"({"success":true})";
    const auto length = static_cast<std::uint32_t>(text.size());
    const std::string frame(reinterpret_cast<const char*>(&length), sizeof(length));
    // A client that is gone does not end the measurement.
    if (send(peer, (frame + text).data(), frame.size() + text.size(), MSG_NOSIGNAL) < 0) return;
  }

  UniqueFd listener_;
  std::string request_;
  std::thread thread_;
};

// Argument: bytes of text in the document that the request carries.
void BM_SendRequest(benchmark::State& state) {
  Json::Value request;
  request["command"] = "document_upsert_by_id";
  request["data"]["id"] = "fileindex_share";
  request["data"]["doc_id"] = "/volume1/share/some/way/down/file.txt";
  request["data"]["data"]["TARNMDPath"] = "/volume1/share/some/way/down/file.txt";
  request["data"]["data"]["TARNMDTextContent"] =
      std::string(static_cast<size_t>(state.range(0)), 'x');
  for (auto _ : state) {
    Json::Value response;
    SendRequest(response, request);
    benchmark::DoNotOptimize(response);
  }
  state.SetItemsProcessed(state.iterations());
  state.SetBytesProcessed(state.iterations() * state.range(0));
}
BENCHMARK(BM_SendRequest)->Arg(0)->Arg(10000)->Arg(1000000)->UseRealTime();
BENCHMARK(BM_SendRequest)->Arg(0)->Threads(2)->UseRealTime();

}  // namespace
}  // namespace quarry::fileindex::elastic

int main(int argc, char** argv) {
  const quarry::bench::PrivateRoot root(argv);
  root.Write("var/run/made", "");
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  const quarry::fileindex::elastic::Server server;
  benchmark::RunSpecifiedBenchmarks();
  return 0;
}
