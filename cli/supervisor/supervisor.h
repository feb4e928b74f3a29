// Keeps services running.

#ifndef QUARRY_CLI_SUPERVISOR_SUPERVISOR_H_
#define QUARRY_CLI_SUPERVISOR_SUPERVISOR_H_

#include <json/json.h>

#include <chrono>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "cli/supervisor/child.h"

namespace quarry::cli {

struct ServiceSpec {
  std::string name;
  std::string program;      // full path
  std::string socket_path;  // at which it listens once it is ready; "" when it is not spoken to
  bool wanted = false;      // started without being asked
  std::vector<std::string> arguments{};
};

// Starts services, restarts those that die, with growing pauses, and leaves alone those that were
// stopped. One thread; Step() is to be called a few times a second.
class Supervisor {
 public:
  using Clock = std::chrono::steady_clock;

  explicit Supervisor(std::vector<ServiceSpec> services,
                      std::function<Clock::time_point()> now = Clock::now);

  // Notices who died and starts who is wanted and due.
  void Step();

  // Wants the service, starts it at once if it does not run, and waits up to 10 seconds until it
  // listens. Throws Problem when there is no such service or it does not come up; it stays wanted.
  void Start(const std::string& name);

  // Does not want the service any longer and ends it: asks it to stop, and after 10 seconds (at
  // once with `force`) kills it.
  void Stop(const std::string& name, bool force);

  // Stops everything. The services stop side by side.
  void StopAll();

  // Answers {"command": "start" | "stop" | "status", "data": {"service", "force"}} with {"success":
  // true, "data": {"services": [{"name", "state", "pid", "restarts", "last_end"}]}} or {"success":
  // false, "error": {"code", "msg"}}. Never throws.
  Json::Value Handle(const Json::Value& request);

 private:
  struct Service {
    ServiceSpec spec;
    std::optional<Child> child;
    Clock::time_point started{};
    Clock::time_point due{};  // not started again before
    std::chrono::milliseconds pause{0};
    unsigned restarts = 0;
    std::string last_end;
  };

  Service& Find(const std::string& name);
  void Spawn(Service& service);
  void Reap(Service& service);
  void WaitUntilListening(Service& service);
  static void End(Service& service, bool force);
  static void RemoveSocket(const Service& service);
  Json::Value Status() const;
  Json::Value Serve(const Json::Value& request);

  std::map<std::string, Service> services_;
  std::function<Clock::time_point()> now_;
};

}  // namespace quarry::cli

#endif  // QUARRY_CLI_SUPERVISOR_SUPERVISOR_H_
