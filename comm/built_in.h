// JSON texts that are built into the library.

#ifndef QUARRY_COMM_BUILT_IN_H_
#define QUARRY_COMM_BUILT_IN_H_

#include <json/json.h>

#include <string>

#include "common/log.h"

namespace quarry::fileindex::elastic {

// The document that `text` holds. Logs `condition` at `site` and throws Error 502 when it is not
// JSON.
Json::Value ParseBuiltIn(const std::string& text, const LogSite& site, const char* condition);

}  // namespace quarry::fileindex::elastic

#endif  // QUARRY_COMM_BUILT_IN_H_
