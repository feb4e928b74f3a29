#include "daemons/tarncontentextractd/markup.h"

#include <libxml/HTMLparser.h>
#include <libxml/parser.h>
#include <libxml/xmlerror.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <charconv>
#include <cstdint>

namespace quarry::extract {
namespace {

constexpr std::size_t kAsciiHeadBytes = 1024;
constexpr std::size_t kDeclarationBytes = 4096;
constexpr std::size_t kMaxCharsetName = 40;
constexpr std::size_t kMaxEntityName = 32;

char Lower(char c) {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

bool IsSpace(char c) {
  return c == ' ' || (c >= '\t' && c <= '\r');
}

bool IsNameCharacter(char c) {
  return (Lower(c) >= 'a' && Lower(c) <= 'z') || (c >= '0' && c <= '9') || c == '-' || c == '_' ||
         c == ':' || c == '.';
}

// The name behind "charset=" or "encoding=" where `at` stands behind the word.
std::string CharsetAfter(std::string_view text, std::size_t at) {
  while (at < text.size() && IsSpace(text[at])) ++at;
  if (at >= text.size() || text[at] != '=') return std::string();
  ++at;
  while (at < text.size() && (IsSpace(text[at]) || text[at] == '"' || text[at] == '\'')) ++at;
  std::size_t end = at;
  while (end < text.size() && IsNameCharacter(text[end])) ++end;
  return std::string(text.substr(at, std::min(end - at, kMaxCharsetName)));
}

std::string Utf8Of(std::uint32_t c) {
  if (c == 0 || c > 0x10FFFF || (c >= 0xD800 && c < 0xE000)) return std::string();
  char buffer[4];
  std::size_t size = 0;
  U8_APPEND_UNSAFE(buffer, size, c);
  return std::string(buffer, size);
}

std::string NumericEntity(std::string_view digits) {
  const bool hex = !digits.empty() && Lower(digits[0]) == 'x';
  if (hex) digits.remove_prefix(1);
  std::uint32_t c = 0;
  const char* end = digits.data() + digits.size();
  const auto parsed = std::from_chars(digits.data(), end, c, hex ? 16 : 10);
  return parsed.ec == std::errc() && parsed.ptr == end ? Utf8Of(c) : std::string();
}

xmlParserInputPtr RefuseToLoad(const char*, const char*, xmlParserCtxtPtr) {
  return nullptr;
}

}  // namespace

std::string AsciiLower(std::string_view text) {
  std::string lower(text);
  std::transform(lower.begin(), lower.end(), lower.begin(), Lower);
  return lower;
}

std::size_t FindIgnoringCase(std::string_view text, std::string_view lower, std::size_t from) {
  if (from > text.size()) return std::string_view::npos;
  const auto found =
      std::search(text.begin() + static_cast<std::ptrdiff_t>(from), text.end(), lower.begin(),
                  lower.end(), [](char a, char b) { return Lower(a) == b; });
  return found == text.end() ? std::string_view::npos
                             : static_cast<std::size_t>(found - text.begin());
}

std::string_view SkipSpace(std::string_view text) {
  if (text.substr(0, 3) == "\xEF\xBB\xBF") text.remove_prefix(3);
  while (!text.empty() && IsSpace(text[0])) text.remove_prefix(1);
  return text;
}

std::string AsciiHead(std::string_view head) {
  head = head.substr(0, kAsciiHeadBytes);
  std::string ascii;
  std::copy_if(head.begin(), head.end(), std::back_inserter(ascii),
               [](char c) { return c != '\0' && c != '\xFE' && c != '\xFF'; });
  return std::string(SkipSpace(ascii));
}

bool BeginsLikeMarkup(std::string_view head) {
  for (const char c : head.substr(0, kAsciiHeadBytes)) {
    if (c == '<') return true;
    const bool passed = IsSpace(c) || c == '\0' || static_cast<unsigned char>(c) >= 0xFE ||
                        c == '\xEF' || c == '\xBB' || c == '\xBF';
    if (!passed) return false;
  }
  return false;
}

std::string DeclaredCharset(std::string_view bytes) {
  const std::string_view head = bytes.substr(0, kDeclarationBytes);
  for (const std::string_view word : {"encoding", "charset"}) {
    for (std::size_t at = FindIgnoringCase(head, word); at != std::string_view::npos;
         at = FindIgnoringCase(head, word, at + word.size())) {
      const std::string name = CharsetAfter(head, at + word.size());
      if (!name.empty()) return name;
    }
  }
  return std::string();
}

std::string DecodeEntity(std::string_view name) {
  if (name.empty() || name.size() > kMaxEntityName) return std::string();
  if (name[0] == '#') return NumericEntity(name.substr(1));
  const std::string text(name);
  if (text == "apos") return "'";
  const auto* entity = htmlEntityLookup(reinterpret_cast<const xmlChar*>(text.c_str()));
  return entity == nullptr ? std::string() : Utf8Of(entity->value);
}

std::string DecodeReferences(std::string_view utf8) {
  std::string out;
  while (!utf8.empty()) {
    const std::size_t start = std::min(utf8.find('&'), utf8.size());
    out.append(utf8.substr(0, start));
    utf8.remove_prefix(start);
    const std::size_t end = utf8.substr(0, kMaxEntityName).find(';');
    const std::string decoded =
        end == std::string_view::npos ? std::string() : DecodeEntity(utf8.substr(1, end - 1));
    out.append(decoded.empty() ? utf8.substr(0, 1) : std::string_view(decoded));
    utf8.remove_prefix(std::min(decoded.empty() ? 1 : end + 1, utf8.size()));
  }
  return out;
}

void PrepareXmlLibrary() {
  xmlInitParser();
  xmlSetExternalEntityLoader(RefuseToLoad);
  xmlSetStructuredErrorFunc(nullptr, [](void*, xmlErrorPtr) {});
}

}  // namespace quarry::extract
