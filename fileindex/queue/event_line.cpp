#include "fileindex/queue/event_line.h"

#include <charconv>
#include <system_error>

namespace quarry::fileindex {
namespace {

// What is left of a line. Each function takes something off its front, or returns false.
class Scanner {
 public:
  explicit Scanner(std::string_view line) : rest_(line) {}

  bool empty() const { return rest_.empty(); }

  bool Take(std::string_view text) {
    if (!rest_.starts_with(text)) return false;
    rest_.remove_prefix(text.size());
    return true;
  }

  // A text of any bytes but escapes.
  bool TakeText(std::string_view& text) {
    if (!Take("\"")) return false;
    const std::size_t end = rest_.find('"');
    if (end == std::string_view::npos) return false;
    text = rest_.substr(0, end);
    rest_.remove_prefix(end + 1);
    return true;
  }

  // Digits alone. A number that begins with 0 is left to the library.
  bool TakeNumber(std::uint32_t& number) {
    if (rest_.empty() || rest_.front() == '0') return false;
    const char* const end = rest_.data() + rest_.size();
    const auto [stop, error] = std::from_chars(rest_.data(), end, number);
    if (error != std::errc()) return false;
    rest_.remove_prefix(static_cast<std::size_t>(stop - rest_.data()));
    return true;
  }

  bool TakeBool(bool& value) {
    value = Take("true");
    return value || Take("false");
  }

 private:
  std::string_view rest_;
};

// The keys that were met, as bits.
enum Key : unsigned { kUnknown = 0, kEvent = 1, kIsDir = 2, kPath = 4, kPathOld = 8, kData = 16 };

Key TakeKey(Scanner& line) {
  if (line.Take("\"event\":")) return kEvent;
  if (line.Take("\"is_dir\":")) return kIsDir;
  if (line.Take("\"path\":")) return kPath;
  if (line.Take("\"path_old\":")) return kPathOld;
  if (line.Take("\"data\":")) return kData;
  return kUnknown;
}

bool TakeValue(Scanner& line, Key key, EventLine& event) {
  switch (key) {
    case kEvent:
      return line.TakeNumber(event.op);
    case kIsDir:
      return line.TakeBool(event.is_dir);
    case kPath:
      return line.TakeText(event.path);
    case kPathOld:
      return line.TakeText(event.path_old);
    case kData:
      return line.Take("null");
    case kUnknown:
      break;
  }
  return false;
}

// Of a key that comes twice, the library knows which one counts.
bool TakeMember(Scanner& line, EventLine& event, unsigned& met) {
  const Key key = TakeKey(line);
  if ((met & key) != 0) return false;
  met |= key;
  return TakeValue(line, key, event);
}

}  // namespace

bool IsPlain(std::string_view text) {
  return text.find('\\') == std::string_view::npos && text.find('\0') == std::string_view::npos;
}

bool ReadEventLine(std::string_view text, EventLine& event, bool is_plain) {
  if (!is_plain && !IsPlain(text)) return false;
  event = EventLine();
  Scanner line(text);
  unsigned met = 0;
  if (!line.Take("{")) return false;
  do {
    if (!TakeMember(line, event, met)) return false;
  } while (line.Take(","));
  const unsigned required = kEvent | kPath;
  return line.Take("}") && line.empty() && (met & required) == required;
}

}  // namespace quarry::fileindex
