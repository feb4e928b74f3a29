// The channel to the search engine: one JSON request, one JSON response, one connection each.
//
// A request has "command" and "data", or for a batch "compound", an array of such requests. A
// response has "success" (bool); when that is false "error" with "code" (int) and "msg" (string);
// else "data", and for a batch "has_fail", with one element of "data" per request.

#ifndef QUARRY_COMM_COMM_H_
#define QUARRY_COMM_COMM_H_

#include <json/json.h>

#include <functional>

#include "common/export.h"

namespace quarry::fileindex::elastic {

// One exchange. On return `response` holds the whole response, whose "success" is true; after a
// failure it holds what was received, null if nothing was. `response` and `request` are different
// objects. In a batch only busy elements fail the call, other failed elements are logged.
//
// Throws Error 913 when the exchange itself fails or the answer is malformed, Error 120 when a
// refusal lacks its code or message, else the engine's own code with "Request failed, msg=" + msg
// (for a busy element of a batch the message alone). Blocks for up to 15 seconds while the engine's
// socket is missing, then as long as the engine takes. May be called from several threads at once.
QUARRY_EXPORT void SendRequestImpl(Json::Value& response, const Json::Value& request);

// The same, but sends the request again for as long as the engine answers that it is busy (1400,
// 1401), 15 to 19 minutes apart and without limit, since work must not be dropped. Administrators
// are notified once when the engine stays busy. Hold no lock that other work needs. See BusyWait.
QUARRY_EXPORT void SendRequest(Json::Value& response, const Json::Value& request);

// As long as one lives, SendRequest on the thread that made it calls `wait` instead of sleeping,
// with the number of times that it has waited for this request before. What `wait` throws leaves
// SendRequest, and ends the request. Objects of one thread end in reverse order.
class QUARRY_EXPORT BusyWait {
 public:
  using Function = std::function<void(unsigned int waited)>;

  // `wait` must outlive the object.
  explicit BusyWait(const Function& wait);
  ~BusyWait();
  BusyWait(const BusyWait&) = delete;
  BusyWait& operator=(const BusyWait&) = delete;

 private:
  const Function* outer_;
};

}  // namespace quarry::fileindex::elastic

#endif  // QUARRY_COMM_COMM_H_
