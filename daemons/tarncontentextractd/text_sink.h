// Collecting text from anywhere into clean UTF-8 of bounded size.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_TEXT_SINK_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_TEXT_SINK_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace quarry::extract {

// What comes out is valid UTF-8 whatever goes in. Runs of white space become one blank, or one line
// feed where the run holds a line end; none is left at either end. Control characters count as
// blanks; soft hyphens, byte-order marks, direction marks and noncharacters are left out; bytes
// that are no UTF-8 become U+FFFD.
class TextSink {
 public:
  // Holds at most `limit` bytes; what comes later is dropped, never half a character.
  explicit TextSink(std::size_t limit) : limit_(limit) {}

  // Adds text that begins and ends on characters. Returns false once nothing more fits.
  bool Append(std::string_view utf8);
  // Keeps what comes next apart by a blank, or by a line feed.
  void Space();
  void Break();

  bool full() const { return full_; }
  bool empty() const { return text_.empty(); }
  const std::string& text() const { return text_; }
  // Hands the text out; the sink is empty again.
  std::string Take();

 private:
  enum class Gap { kNone, kBlank, kLine };

  std::size_t AppendPlainRun(std::string_view utf8, std::size_t at);
  void AppendAsciiOther(char c);
  void AppendCharacter(std::string_view utf8, std::int32_t character);
  void Put(std::string_view piece);

  std::size_t limit_;
  std::string text_;
  Gap gap_ = Gap::kNone;
  bool full_ = false;
};

// `utf8` cleaned as above, at most `limit` bytes of it, on one line.
std::string OneLine(std::string_view utf8, std::size_t limit);

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_TEXT_SINK_H_
