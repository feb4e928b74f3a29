#include "common/error.h"

namespace quarry {
namespace {

std::string Message(ErrorCode code, const std::string& reason) {
  std::string message = "Quarry error, code=" + std::to_string(static_cast<std::int32_t>(code));
  if (!reason.empty()) message += ", reason=[" + reason + "]";
  return message;
}

}  // namespace

Error::Error(ErrorCode code, const std::string& reason)
    : std::runtime_error(Message(code, reason)), code_(code), reason_(reason) {}

namespace fileindex {

std::int32_t log_level = 7;

}  // namespace fileindex
}  // namespace quarry
