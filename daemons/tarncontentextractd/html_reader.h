// What is taken from a page of HTML, whoever takes the page apart.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_HTML_READER_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_HTML_READER_H_

#include <libxml/xmlstring.h>

#include <cstdint>
#include <string>
#include <string_view>

#include "daemons/tarncontentextractd/extractor.h"
#include "daemons/tarncontentextractd/text_sink.h"

namespace quarry::extract {

// What an element means to a reader of text.
struct HtmlElement {
  enum class Role : std::uint8_t { kOther, kTitle, kMeta, kImage };
  enum class Edge : std::uint8_t { kNone, kBlank, kLine };

  std::string_view name;
  Edge edge = Edge::kLine;  // what keeps it apart from what is around it
  Role role = Role::kOther;
  bool skipped = false;  // its text is nothing to read
  // For ReadPlainHtml: whether it may stand in a plain page, and whether in an element of its own
  // name.
  bool plain = false;
  bool nests = false;
};

// The element of that name, in lower case; one without a name, which ends lines, for any that is
// not known. They live as long as the program. Any thread.
const HtmlElement& FindHtmlElement(std::string_view name);
// A number of its own, below kMaxHtmlElements, for each of them.
inline constexpr std::size_t kMaxHtmlElements = 128;
std::size_t NumberOf(const HtmlElement& element);

// Follows a page's elements. Nothing of the tree is kept, whatever its depth.
class HtmlReader {
 public:
  // `out` may be null: then only the text is wanted. Both must outlive the object.
  HtmlReader(TextSink& sink, Extraction* out) : sink_(sink), out_(out) {}

  // `attributes` are names and values in turn, up to a null pointer; or null itself. They are
  // looked at where the element's role is kMeta or kImage.
  void Start(const HtmlElement& element, const xmlChar** attributes);
  void End(const HtmlElement& element);
  void Text(std::string_view text);
  bool full() const { return sink_.full(); }
  // Sets what was found besides the text.
  void Finish();

 private:
  void Separate(const HtmlElement& element);
  void Meta(const xmlChar** attributes);

  TextSink& sink_;
  Extraction* out_;
  TextSink title_{kMaxFieldBytes};
  std::string social_title_;
  int skipped_ = 0;
  bool in_title_ = false;
};

// Has libxml2 take the page apart: any bytes but NUL are good.
void ReadHtml(std::string_view utf8, HtmlReader& reader);

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_HTML_READER_H_
