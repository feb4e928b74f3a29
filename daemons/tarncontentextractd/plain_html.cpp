#include "daemons/tarncontentextractd/plain_html.h"

#include <libxml/HTMLparser.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <string>
#include <vector>

#include "daemons/tarncontentextractd/markup.h"
#include "daemons/tarncontentextractd/utf8.h"

namespace quarry::extract {
namespace {

constexpr std::size_t kMaxNameBytes = 64;
constexpr std::size_t kMaxDepth = 1000;
constexpr std::size_t kMaxReference = 16;

bool IsBlank(char c) {
  return c == ' ' || c == '\n' || c == '\t' || c == '\r';
}

bool IsSmallLetter(char c) {
  return c >= 'a' && c <= 'z';
}

bool IsNameCharacter(char c) {
  return IsSmallLetter(c) || (c >= '0' && c <= '9') || c == '-' || c == '_';
}

// Whether all characters below a blank are white space. (A loop without a way out is done many
// bytes at a time.)
bool HoldsNoControls(std::string_view text) {
  unsigned odd = 0;
  for (const char c : text) {
    odd |= static_cast<unsigned>(static_cast<unsigned char>(c) < 0x20) &
           static_cast<unsigned>(!IsBlank(c));
  }
  return odd == 0;
}

// What the library holds of elements, asked once for each.
class LibraryRules {
 public:
  // Whether `inner`, coming next within `outer`, leaves that open.
  bool MayStandIn(const HtmlElement& inner, const HtmlElement& outer) {
    // The library does not tell about an element within its like.
    if (&inner == &outer) return inner.nests;
    Answer& known = may_stand_in_[NumberOf(outer) * kMaxHtmlElements + NumberOf(inner)];
    if (known == Answer::kUnknown) known = AnswerOf(!Ends(inner, outer));
    return known == Answer::kYes;
  }

  // Whether there is nothing in the element, and no end tag.
  bool IsEmpty(const HtmlElement& element) {
    Answer& known = empty_[NumberOf(element)];
    if (known == Answer::kUnknown) {
      const htmlElemDesc* told = htmlTagLookup(Chars(element));
      known = AnswerOf(told != nullptr && told->empty != 0);
    }
    return known == Answer::kYes;
  }

 private:
  enum class Answer : std::uint8_t { kUnknown, kYes, kNo };

  static Answer AnswerOf(bool yes) { return yes ? Answer::kYes : Answer::kNo; }

  static const xmlChar* Chars(const HtmlElement& element) {
    return reinterpret_cast<const xmlChar*>(element.name.data());
  }

  static bool Ends(const HtmlElement& inner, const HtmlElement& outer) {
    xmlNode node{};
    node.type = XML_ELEMENT_NODE;
    node.name = Chars(inner);
    return htmlAutoCloseTag(nullptr, Chars(outer), &node) != 0;
  }

  std::array<Answer, kMaxHtmlElements * kMaxHtmlElements> may_stand_in_{};
  std::array<Answer, kMaxHtmlElements> empty_{};
};

// One for each thread, since answers are noted.
LibraryRules& Rules() {
  thread_local LibraryRules rules;
  return rules;
}

// Characters that text does not hold are for the parser to judge: at some it ends an attribute.
bool IsForTheParser(std::string_view character) {
  return (!character.empty() && static_cast<unsigned char>(character[0]) < ' ') ||
         character == "\xEF\xBF\xBE" || character == "\xEF\xBF\xBF";
}

// The character reference at `*at`, where "&" stands, which is moved behind it; "" for one that is
// not written as it should be.
std::string TakeReference(std::string_view text, std::size_t* at) {
  const std::size_t size = text.substr(*at, kMaxReference).find(';');
  if (size == std::string_view::npos) return std::string();
  std::string decoded = DecodeEntity(text.substr(*at + 1, size - 1));
  *at += size + 1;
  if (IsForTheParser(decoded)) decoded.clear();
  return decoded;
}

class PlainPage {
 public:
  PlainPage(std::string_view text, HtmlReader& reader) : text_(text), reader_(reader) {}

  bool Read() {
    SkipBlanks();
    if (!Doctype()) return false;
    while (at_ < text_.size()) {
      const char c = text_[at_];
      if (!(c == '<' ? Markup() : c == '&' ? Reference() : Text())) return false;
    }
    return stage_ == Stage::kEnd;
  }

 private:
  // What has been: nothing, <html>, </head>, <body>, </body>, </html>.
  enum class Stage { kBegin, kHtml, kHead, kBody, kAfterBody, kEnd };

  char Peek(std::size_t ahead = 0) const {
    return at_ + ahead < text_.size() ? text_[at_ + ahead] : '\0';
  }
  bool StartsWith(std::string_view what) const { return text_.substr(at_, what.size()) == what; }
  bool Skip(std::string_view what) {
    if (!StartsWith(what)) return false;
    at_ += what.size();
    return true;
  }
  void SkipBlanks() {
    while (IsBlank(Peek())) ++at_;
  }

  // Whether words may stand here.
  bool InContent() const {
    if (open_.empty()) return false;
    return open_.back() != &html_ && open_.back() != &head_;
  }

  bool Doctype() {
    if (!StartsWith("<!DOCTYPE html") && !StartsWith("<!doctype html")) return true;
    at_ += std::string_view("<!doctype html").size();
    SkipBlanks();
    return Skip(">");
  }

  bool Text() {
    const std::size_t begin = at_;
    while (at_ < text_.size() && text_[at_] != '<' && text_[at_] != '&') ++at_;
    const std::string_view piece = text_.substr(begin, at_ - begin);
    if (InContent()) {
      reader_.Text(piece);
      return true;
    }
    return Peek() != '&' && std::all_of(piece.begin(), piece.end(), IsBlank);
  }

  bool Reference() {
    const std::string decoded = TakeReference(text_, &at_);
    if (decoded.empty() || !InContent()) return false;
    reader_.Text(decoded);
    return true;
  }

  bool Markup() {
    if (Peek(1) == '/') return EndTag();
    if (Peek(1) == '!') return Comment();
    return StartTag();
  }

  bool Comment() {
    if (!Skip("<!--") || Peek() == '>' || Peek() == '-') return false;
    const std::size_t end = text_.find("--", at_);
    if (end == std::string_view::npos) return false;
    at_ = end;
    return Skip("-->");
  }

  std::string_view Name() {
    const std::size_t begin = at_;
    if (!IsSmallLetter(Peek())) return std::string_view();
    while (IsNameCharacter(Peek())) ++at_;
    return text_.substr(begin, at_ - begin);
  }

  bool EndTag() {
    at_ += 2;
    if (open_.empty()) return false;
    const HtmlElement& element = *open_.back();
    if (!Skip(element.name) || !Skip(">")) return false;
    Close();
    return true;
  }

  void Close() {
    const HtmlElement& element = *open_.back();
    open_.pop_back();
    reader_.End(element);
    if (&element == &head_) stage_ = Stage::kHead;
    if (&element == &body_) stage_ = Stage::kAfterBody;
    if (&element == &html_) stage_ = Stage::kEnd;
  }

  bool StartTag() {
    ++at_;
    const std::string_view name = Name();
    const HtmlElement& element = FindHtmlElement(name);
    if (!element.plain || open_.size() >= kMaxDepth || !MayStart(element)) return false;
    const bool wanted =
        element.role == HtmlElement::Role::kMeta || element.role == HtmlElement::Role::kImage;
    if (!Attributes(wanted)) return false;
    return Open(element, wanted);
  }

  // Whether the element comes where neither another one is missing before it nor ended by it.
  bool MayStart(const HtmlElement& element) {
    if (&element == &html_) return stage_ == Stage::kBegin && MoveOn(Stage::kHtml);
    if (&element == &head_) return stage_ == Stage::kHtml && open_.size() == 1;
    if (&element == &body_) {
      return (stage_ == Stage::kHtml || stage_ == Stage::kHead) && open_.size() == 1 &&
             MoveOn(Stage::kBody);
    }
    // (What stands in a title is a tag to some and text to others.)
    return open_.size() > 1 && open_.back()->role != HtmlElement::Role::kTitle &&
           rules_.MayStandIn(element, *open_.back());
  }

  bool MoveOn(Stage stage) {
    stage_ = stage;
    return true;
  }

  bool Open(const HtmlElement& element, bool wanted) {
    const bool closed = Peek() == '/';
    if (!Skip(closed ? "/>" : ">")) return false;
    reader_.Start(element, wanted ? AttributePointers() : nullptr);
    open_.push_back(&element);
    if (closed || rules_.IsEmpty(element)) {
      Close();
      return true;
    }
    return !element.skipped || Raw(element);
  }

  // What is no markup, up to the end tag.
  bool Raw(const HtmlElement& element) {
    while (true) {
      at_ = std::min(text_.find('<', at_), text_.size());
      if (Peek(1) == '/') {
        return text_.substr(at_ + 2, element.name.size()) == element.name &&
               Peek(2 + element.name.size()) == '>';
      }
      if (at_ == text_.size() || Peek(1) == '!') return false;
      ++at_;
    }
  }

  // Goes up to the end of the tag; keeps attributes only if they are wanted.
  bool Attributes(bool wanted) {
    attributes_.clear();
    while (true) {
      const bool apart = IsBlank(Peek());
      SkipBlanks();
      if (Peek() == '>' || (Peek() == '/' && Peek(1) == '>')) return true;
      if (!apart || !Attribute(wanted)) return false;
    }
  }

  bool Attribute(bool wanted) {
    const std::string_view name = Name();
    if (name.empty() || name.size() > kMaxNameBytes) return false;
    std::string_view value;
    if (Peek() == '=') {
      ++at_;
      const char quote = Peek();
      if (quote != '"' && quote != '\'') return false;
      const std::size_t end = text_.find(quote, at_ + 1);
      if (end == std::string_view::npos) return false;
      value = text_.substr(at_ + 1, end - at_ - 1);
      at_ = end + 1;
    } else if (wanted) {
      return false;
    }
    return !wanted || Keep(name, value);
  }

  bool Keep(std::string_view name, std::string_view value) {
    std::string decoded;
    for (std::size_t at = 0; at < value.size();) {
      const std::size_t next = std::min(value.find('&', at), value.size());
      decoded.append(value.substr(at, next - at));
      at = next;
      if (at == value.size()) break;
      const std::string character = TakeReference(value, &at);
      if (character.empty()) return false;
      decoded += character;
    }
    attributes_.emplace_back(name);
    attributes_.push_back(std::move(decoded));
    return true;
  }

  const xmlChar** AttributePointers() {
    pointers_.clear();
    for (const std::string& text : attributes_) {
      pointers_.push_back(reinterpret_cast<const xmlChar*>(text.c_str()));
    }
    pointers_.push_back(nullptr);
    return pointers_.data();
  }

  const HtmlElement& html_ = FindHtmlElement("html");
  const HtmlElement& head_ = FindHtmlElement("head");
  const HtmlElement& body_ = FindHtmlElement("body");
  LibraryRules& rules_ = Rules();
  std::string_view text_;
  std::size_t at_ = 0;
  HtmlReader& reader_;
  std::vector<const HtmlElement*> open_;
  std::vector<std::string> attributes_;
  std::vector<const xmlChar*> pointers_;
  Stage stage_ = Stage::kBegin;
};

}  // namespace

bool ReadPlainHtml(std::string_view utf8, HtmlReader& reader) {
  // Of a longer one not all of the text may be wanted.
  if (utf8.size() > kMaxTextBytes || !HoldsNoControls(utf8) || !IsUtf8(utf8)) return false;
  if (!PlainPage(utf8, reader).Read()) return false;
  reader.Finish();
  return true;
}

}  // namespace quarry::extract
