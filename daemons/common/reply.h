// What daemons answer to a command.

#ifndef QUARRY_DAEMONS_COMMON_REPLY_H_
#define QUARRY_DAEMONS_COMMON_REPLY_H_

#include <json/json.h>

#include <string>
#include <utility>

namespace quarry::daemon {

// {"success": true, "data": data}, without "data" where that is null.
inline Json::Value SuccessReply(Json::Value data = Json::Value()) {
  Json::Value reply;
  reply["success"] = true;
  if (!data.isNull()) reply["data"] = std::move(data);
  return reply;
}

// {"success": false, "error": {"code": code, "msg": message}}.
inline Json::Value FailureReply(int code, const std::string& message) {
  Json::Value reply;
  reply["success"] = false;
  reply["error"]["code"] = code;
  reply["error"]["msg"] = message;
  return reply;
}

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_REPLY_H_
