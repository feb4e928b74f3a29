#include "comm/comm.h"

#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <string>
#include <utility>

#include "comm/socket_path.h"
#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "common/paths.h"
#include "fileindex/util/custom_event.h"
#include "platform/include/socket.h"

namespace quarry::fileindex::elastic {
namespace {

constexpr int kSocketWaits = 15;
constexpr unsigned int kRetriesBeforeNotice = 10;

const std::string kSocketPath = RootedPath("/var/run/tarnelasticd.sock");

bool IsBusy(int code) {
  return code == kErrorEngineBusy || code == kErrorEngineBusyMemory;
}

// The engine may have been started a moment ago. Whether it is there in the end is for the connect
// to say; a later failure must not be logged with what the waiting left in errno.
void WaitForSocket() {
  const int saved_errno = errno;
  for (int wait = 1; wait <= kSocketWaits && access(kSocketPath.c_str(), F_OK) != 0; ++wait) {
    LogLine({"comm.cpp", 14, "SendRequestImpl"},
            "elastic socket is not ready, retry ... " + std::to_string(wait));
    sleep(1);
  }
  errno = saved_errno;
}

bool IsResponse(const Json::Value& response) {
  return response.type() == Json::objectValue && response.isMember("success") &&
         response["success"].isBool();
}

[[noreturn]] void ThrowRefusal(const Json::Value& response) {
  const Json::Value& error = response["error"];
  int code = 0;
  std::string message;
  GetJsonValue(code, error, "code", true);
  GetJsonValue(message, error, "msg", true);
  throw Error(code, "Request failed, msg=" + message);
}

// A busy element must be sent again, with its whole batch; any other is given up with a log line.
void HandleElement(const Json::Value& element, const Json::Value& request) {
  if (element["success"].asBool()) return;
  const int code = element["error"]["code"].asInt();
  const std::string message = element["error"]["msg"].asString();
  if (IsBusy(code)) throw Error(code, message);
  LogError({"comm.cpp", 49, "SendRequestImpl"},
           "Compound failed: " + toString(request) + " (" + std::to_string(code) + ") " + message);
}

void CheckBatch(const Json::Value& response, const Json::Value& compound) {
  try {
    if (!response["has_fail"].asBool()) return;
    const Json::Value& elements = response["data"];
    for (Json::ArrayIndex i = 0; i < elements.size(); ++i) HandleElement(elements[i], compound[i]);
  } catch (const Json::Exception&) {
    throw Error(kErrorEngineRequest, "Malformed batch response" + AppendData(response));
  }
}

const Json::Value& Member(const Json::Value& value, const char* key) {
  return isObject(value) ? value[key] : Json::Value::nullSingleton();
}

// For a log line: a batch, for example, has neither a command nor an index.
std::string TextOf(const Json::Value& value) {
  return isJsonType<std::string>(value) ? asJsonType<std::string>(value) : std::string();
}

void LogRetry(unsigned int attempt, const Json::Value& request) {
  LogLine({"elastic_control.cpp", 40, "SendRequest"},
          "Retry[" + std::to_string(attempt) +
              "] since tarnelasticd is busy. Command: " + TextOf(Member(request, "command")) +
              ", db: " + TextOf(Member(Member(request, "data"), "id")));
}

// Null: sleep.
thread_local const BusyWait::Function* busy_wait = nullptr;

// Many processes wait for the same engine: they must not come back in the same second.
unsigned int RetryPause() {
  return 900 + 60 * static_cast<unsigned int>(rand() % 5);
}

void WaitWhileBusy(unsigned int waited) {
  if (busy_wait != nullptr) {
    (*busy_wait)(waited);
  } else {
    sleep(RetryPause());
  }
}

}  // namespace

BusyWait::BusyWait(const Function& wait) : outer_(std::exchange(busy_wait, &wait)) {}

BusyWait::~BusyWait() {
  busy_wait = outer_;
}

void SendRequestImpl(Json::Value& response, const Json::Value& request) {
  response = Json::Value();
  RequireSocketPath(QUARRY_SITE("comm"), kErrorEngineRequest, kSocketPath);
  WaitForSocket();

  tarndaemon::DomainSockConnection connection(kSocketPath);
  if (!connection.Connect()) {
    Fail(QUARRY_SITE_AT("comm", 24), "!conn.Connect()", kErrorEngineRequest, "Connect failed");
  }
  if (!connection.Send(toString(request))) {
    Fail(QUARRY_SITE_AT("comm", 26), "!conn.Send(req.toString())", kErrorEngineRequest,
         "Send failed");
  }
  std::string text;
  if (!connection.Recv(text) || !fromString(response, text) || !IsResponse(response)) {
    Fail(QUARRY_SITE_AT("comm", 29),
         "!conn.Recv(resp_raw) || !res.fromString(resp_raw) || !res.isMember(\"success\") || "
         "!res[\"success\"].isBool()",
         kErrorEngineRequest, "Recv failed, res=" + toString(response));
  }

  const Json::Value& answer = response;
  if (!answer["success"].asBool()) ThrowRefusal(answer);
  if (isObject(request) && request.isMember("compound")) CheckBatch(answer, request["compound"]);
}

void SendRequest(Json::Value& response, const Json::Value& request) {
  bool notified = false;
  for (unsigned int attempt = 0;;) {
    try {
      SendRequestImpl(response, request);
      return;
    } catch (const Error& error) {
      if (!IsBusy(error.code())) throw;
    }
    LogRetry(attempt, request);
    ++attempt;
    if (attempt > kRetriesBeforeNotice && !notified) {
      NotifyLackOfMemory();
      notified = true;
    }
    WaitWhileBusy(attempt - 1);
  }
}

}  // namespace quarry::fileindex::elastic
