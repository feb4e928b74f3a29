// The usual shape of a queue line, read many times as fast as the JSON library reads it.

#ifndef QUARRY_FILEINDEX_QUEUE_EVENT_LINE_H_
#define QUARRY_FILEINDEX_QUEUE_EVENT_LINE_H_

#include <cstdint>
#include <string_view>

namespace quarry::fileindex {

// The fields of an Event without data. The paths lie in the line that they were read from.
struct EventLine {
  std::uint32_t op = 0;
  bool is_dir = false;
  std::string_view path;
  std::string_view path_old;
};

// Whether a text has neither backslashes nor NUL bytes. Without these a JSON text ends at the next
// quotation mark, and its bytes stand for themselves.
bool IsPlain(std::string_view text);

// Reads a line as the monitor writes it: an object of the known keys, each once at most, without
// white space, escapes, NUL bytes or data. Returns false for any other line: it may still be an
// event, which Event finds out. What this takes, Event takes with the same fields. `is_plain` says
// that IsPlain is known to hold for the line.
bool ReadEventLine(std::string_view line, EventLine& event, bool is_plain = false);

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_QUEUE_EVENT_LINE_H_
