#include "fileindex/queue/event.h"

#include "common/json.h"
#include "common/log.h"
#include "fileindex/queue/event_line.h"

namespace quarry::fileindex {

Event::Event(const std::string& event_raw) {
  EventLine line;
  if (ReadEventLine(event_raw, line)) {
    op = line.op;
    is_dir = line.is_dir;
    path = line.path;
    path_old = line.path_old;
    return;
  }
  Json::Value json;
  if (!fromString(json, event_raw)) {
    Fail(QUARRY_SITE("optree"), "!data.fromString(event_raw)", kErrorMalformedEvent,
         "Malformed event_raw: " + event_raw);
  }
  GetJsonValue(op, json, "event", true);
  GetJsonValue(is_dir, json, "is_dir", false);
  GetJsonValue(path, json, "path", true);
  GetJsonValue(path_old, json, "path_old", false);
  GetJsonValue(data, json, "data", false);
}

Event::~Event() = default;

}  // namespace quarry::fileindex
