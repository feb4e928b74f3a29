#include "comm/built_in.h"

#include "common/error.h"
#include "common/json.h"

namespace quarry::fileindex::elastic {

Json::Value ParseBuiltIn(const std::string& text, const LogSite& site, const char* condition) {
  Json::Value document;
  if (!fromString(document, text)) Fail(site, condition, kErrorSystem);
  return document;
}

}  // namespace quarry::fileindex::elastic
