#include "common/json_text.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cstdint>
#include <memory>
#include <utility>
#include <vector>

namespace quarry {
namespace {

// Deeper texts are rare.
constexpr std::size_t kMaxLevels = 100;
// As many digits always fit 64 bits.
constexpr std::size_t kMaxDigits = 18;
// The library refuses longer ones, for it keeps the length in 30 bits.
constexpr std::size_t kKeyLimit = std::size_t{1} << 30;

// Whether a byte stands for itself inside of a string.
constexpr std::array<bool, 256> kPlain = [] {
  std::array<bool, 256> plain{};
  for (std::size_t c = 0x20; c < plain.size(); ++c) plain[c] = c != '"' && c != '\\';
  return plain;
}();

std::size_t PlainLength(std::string_view text) {
  std::size_t length = 0;
  while (length < text.size() && kPlain[static_cast<unsigned char>(text[length])]) ++length;
  return length;
}

bool IsDigit(char c) {
  return c >= '0' && c <= '9';
}

// Appends a character of the first plane, which is no half of a pair.
void AppendUtf8(std::string* out, unsigned code) {
  const auto put = [out](unsigned byte) { out->push_back(static_cast<char>(byte)); };
  if (code < 0x80) return put(code);
  if (code < 0x800) {
    put(0xC0 | (code >> 6));
  } else {
    put(0xE0 | (code >> 12));
    put(0x80 | ((code >> 6) & 0x3F));
  }
  put(0x80 | (code & 0x3F));
}

// What a letter behind "\" stands for, or 0.
char Unescaped(char letter) {
  switch (letter) {
    case '"':
    case '\\':
    case '/':
      return letter;
    case 'b':
      return '\b';
    case 'f':
      return '\f';
    case 'n':
      return '\n';
    case 'r':
      return '\r';
    case 't':
      return '\t';
    default:
      return 0;
  }
}

std::unique_ptr<Json::CharReader> NewNumberReader() {
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  builder["strictRoot"] = false;
  return std::unique_ptr<Json::CharReader>(builder.newCharReader());
}

// Each member returns whether it has understood the text so far.
class Reader {
 public:
  explicit Reader(std::string_view text) : rest_(text) {}

  bool Read(Json::Value* root) {
    if (!ReadValue(root)) return false;
    while (!open_.empty()) {
      if (!ReadElement()) return false;
    }
    SkipSpace();
    return rest_.empty();
  }

 private:
  struct Level {
    Json::Value* container;
    bool is_object;
    bool is_empty;
  };

  void SkipSpace() {
    rest_.remove_prefix(std::min(rest_.find_first_not_of(" \t\r\n"), rest_.size()));
  }
  bool Take(char c) {
    SkipSpace();
    if (rest_.empty() || rest_.front() != c) return false;
    rest_.remove_prefix(1);
    return true;
  }
  bool TakeWord(std::string_view word) {
    if (rest_.substr(0, word.size()) != word) return false;
    rest_.remove_prefix(word.size());
    return true;
  }

  // A value that holds no others, or the beginning of one that does.
  bool ReadValue(Json::Value* out) {
    if (Take('{')) return Open(out, Json::objectValue);
    if (Take('[')) return Open(out, Json::arrayValue);
    if (Take('"')) {
      std::string_view text;
      if (!TakeString(&text)) return false;
      *out = Json::Value(text.data(), text.data() + text.size());
      return true;
    }
    return ReadWord(out);
  }

  bool Open(Json::Value* out, Json::ValueType type) {
    if (open_.size() == kMaxLevels) return false;
    *out = Json::Value(type);
    open_.push_back({out, type == Json::objectValue, true});
    return true;
  }

  // The next element of the innermost container, or its end.
  bool ReadElement() {
    Level& level = open_.back();
    if (Take(level.is_object ? '}' : ']')) {
      open_.pop_back();
      return true;
    }
    if (!level.is_empty && !Take(',')) return false;
    level.is_empty = false;
    Json::Value* container = level.container;
    if (!level.is_object) return ReadValue(&container->append(Json::Value()));
    std::string_view key;
    if (!Take('"') || !TakeString(&key) || key.size() >= kKeyLimit) return false;
    Json::Value* member = container->demand(key.data(), key.data() + key.size());
    return Take(':') && ReadValue(member);
  }

  // A string behind its first quote. The view is valid until the next string.
  bool TakeString(std::string_view* text) {
    const std::size_t plain = PlainLength(rest_);
    *text = rest_.substr(0, plain);
    rest_.remove_prefix(plain);
    if (rest_.empty()) return false;
    if (rest_.front() == '"') {
      rest_.remove_prefix(1);
      return true;
    }
    buffer_ = *text;
    if (!UnescapeRest()) return false;
    *text = buffer_;
    return true;
  }

  bool UnescapeRest() {
    while (!rest_.empty() && rest_.front() == '\\') {
      if (!Unescape()) return false;
      const std::size_t plain = PlainLength(rest_);
      buffer_.append(rest_, 0, plain);
      rest_.remove_prefix(plain);
    }
    return TakeWord("\"");
  }

  bool Unescape() {
    if (rest_.size() < 2) return false;
    const char letter = rest_[1];
    rest_.remove_prefix(2);
    if (letter == 'u') return UnescapeNumber();
    const char c = Unescaped(letter);
    if (c != 0) buffer_.push_back(c);
    return c != 0;
  }

  bool UnescapeNumber() {
    unsigned code = 0;
    if (rest_.size() < 4) return false;
    const auto [end, error] = std::from_chars(rest_.data(), rest_.data() + 4, code, 16);
    if (error != std::errc() || end != rest_.data() + 4) return false;
    if (code >= 0xD800 && code < 0xE000) return false;
    rest_.remove_prefix(4);
    AppendUtf8(&buffer_, code);
    return true;
  }

  bool ReadWord(Json::Value* out) {
    if (TakeWord("true")) {
      *out = true;
    } else if (TakeWord("false")) {
      *out = false;
    } else if (TakeWord("null")) {
      *out = Json::Value();
    } else {
      return ReadNumber(out);
    }
    return true;
  }

  bool ReadNumber(Json::Value* out) {
    const std::string_view number =
        rest_.substr(0, std::min(rest_.find_first_not_of("+-.0123456789eE"), rest_.size()));
    rest_.remove_prefix(number.size());
    std::string_view digits = number;
    if (!digits.empty() && digits.front() == '-') digits.remove_prefix(1);
    const bool is_plain = !digits.empty() && digits.size() <= kMaxDigits &&
                          (digits.front() != '0' || digits.size() == 1) &&
                          std::all_of(digits.begin(), digits.end(), IsDigit);
    if (!is_plain) return ReadRareNumber(number, out);
    std::int64_t value = 0;
    std::from_chars(number.data(), number.data() + number.size(), value);
    *out = Json::Int64{value};
    return true;
  }

  // By the library: nobody else rounds just as it does.
  bool ReadRareNumber(std::string_view number, Json::Value* out) {
    if (!number_reader_) number_reader_ = NewNumberReader();
    Json::Value value;
    if (!number_reader_->parse(number.data(), number.data() + number.size(), &value, nullptr)) {
      return false;
    }
    *out = value;
    return value.isNumeric();
  }

  std::string_view rest_;
  std::vector<Level> open_;
  std::string buffer_;
  // Kept for all numbers of a text, as making one takes longer than reading some.
  std::unique_ptr<Json::CharReader> number_reader_;
};

void AppendEscaped(std::string* out, char c) {
  constexpr char kHex[] = "0123456789abcdef";
  constexpr std::string_view kNamed = "\"\\\b\f\n\r\t";
  constexpr std::string_view kLetters = "\"\\bfnrt";
  // The one that nearly all texts have.
  if (c == '\n') {
    out->append("\\n", 2);
    return;
  }
  out->push_back('\\');
  const std::size_t named = kNamed.find(c);
  if (named != std::string_view::npos) return out->push_back(kLetters[named]);
  const auto code = static_cast<unsigned char>(c);
  out->append("u00").push_back(kHex[code >> 4]);
  out->push_back(kHex[code & 0x0F]);
}

void AppendString(std::string* out, std::string_view text) {
  out->push_back('"');
  while (!text.empty()) {
    const std::size_t plain = PlainLength(text);
    out->append(text, 0, plain);
    if (plain == text.size()) break;
    AppendEscaped(out, text[plain]);
    text.remove_prefix(plain + 1);
  }
  out->push_back('"');
}

void AppendText(std::string* out, const Json::Value& value) {
  const char* begin = nullptr;
  const char* end = nullptr;
  // One without a text, which nobody but the library can make, is written as nothing.
  if (!value.getString(&begin, &end)) return;
  AppendString(out, {begin, static_cast<std::size_t>(end - begin)});
}

// The functions for single values are those that the library's writer calls too.
void AppendLeaf(std::string* out, const Json::Value& value) {
  switch (value.type()) {
    case Json::stringValue:
      return AppendText(out, value);
    case Json::booleanValue:
      out->append(Json::valueToString(value.asBool()));
      return;
    case Json::intValue:
      out->append(Json::valueToString(value.asLargestInt()));
      return;
    case Json::uintValue:
      out->append(Json::valueToString(value.asLargestUInt()));
      return;
    case Json::realValue:
      out->append(Json::valueToString(value.asDouble()));
      return;
    default:
      out->append("null");
  }
}

// A container of which the elements from `index` on are still to be written; those of an object
// from `next` on.
struct Pending {
  const Json::Value* container;
  Json::ArrayIndex index;
  Json::Value::const_iterator next;
};

class Writer {
 public:
  std::string Write(const Json::Value& root) {
    Begin(root);
    while (!pending_.empty()) WriteElement();
    return std::move(out_);
  }

 private:
  // Writes the beginning of what holds others, and all of what does not.
  void Begin(const Json::Value& value) {
    if (!value.isObject() && !value.isArray()) return AppendLeaf(&out_, value);
    out_.push_back(value.isObject() ? '{' : '[');
    pending_.push_back({&value, 0, value.begin()});
  }

  // The next element of the innermost container, or its end.
  void WriteElement() {
    Pending& level = pending_.back();
    const Json::Value& container = *level.container;
    if (level.index == container.size()) {
      out_.push_back(container.isObject() ? '}' : ']');
      pending_.pop_back();
      return;
    }
    if (level.index++ > 0) out_.push_back(',');
    // What an array does not have, though it is long enough, is null.
    if (container.isArray()) return Begin(container[level.index - 1]);
    const Json::Value::const_iterator member = level.next++;
    const char* end = nullptr;
    const char* name = member.memberName(&end);
    AppendString(&out_, {name, static_cast<std::size_t>(end - name)});
    out_.push_back(':');
    Begin(*member);
  }

  std::string out_;
  std::vector<Pending> pending_;
};

}  // namespace

bool ReadPlainJson(std::string_view text, Json::Value* out) {
  Json::Value value;
  if (!Reader(text).Read(&value)) return false;
  out->swap(value);
  return true;
}

void AppendJsonString(std::string* out, std::string_view text) {
  AppendString(out, text);
}

std::string WriteJson(const Json::Value& value) {
  return Writer().Write(value);
}

}  // namespace quarry
