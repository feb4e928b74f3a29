// The running system as the command line sees it.

#ifndef QUARRY_CLI_SYSTEM_H_
#define QUARRY_CLI_SYSTEM_H_

#include <json/json.h>

#include <string>

namespace quarry::cli {

// Where the supervisor and the daemons listen.
std::string SupervisorSocket();
std::string EngineSocket();
std::string IndexDaemonSocket();
std::string ExtractorSocket();

// One request to a daemon. Returns the answer's "data". Throws Problem when the daemon does not run
// or does not answer in time, and Error with the daemon's own code and message when it refuses.
Json::Value AskSupervisor(const std::string& command, const Json::Value& data);
Json::Value AskEngine(const std::string& command, const Json::Value& data);
Json::Value AskIndexDaemon(const std::string& command, const Json::Value& data);

// Whether the supervisor runs and does what it is asked; one that is about to end does not. Blocks
// until it has answered, at most half a minute.
bool SupervisorAnswers();

// Whether somebody keeps the services running: the supervisor, or systemd for a system without a
// root of its own.
bool ServicesAreManaged();

// Why nobody does, and what to do about it, in a sentence; "" when somebody does.
std::string WhyNotManaged();

// Throws Problem, naming what does not run, unless folders can be changed now.
void RequireRunningSystem();

// The supervisor's work, in the foreground until it is told to stop. Without `full_speed` what is
// indexed is indexed in the background. Throws Problem or Error when it cannot begin.
void RunSystem(bool full_speed);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_SYSTEM_H_
