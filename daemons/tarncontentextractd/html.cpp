// HTML, and XHTML read as such.

#include <libxml/HTMLparser.h>

#include <algorithm>
#include <array>
#include <memory>

#include "daemons/tarncontentextractd/charset.h"
#include "daemons/tarncontentextractd/extractor.h"
#include "daemons/tarncontentextractd/markup.h"

namespace quarry::extract {
namespace {

constexpr std::size_t kMaxTitleBytes = kMaxFieldBytes;

// Elements whose text is nothing to read.
constexpr std::array<std::string_view, 4> kSkipped{"script", "style", "template", "iframe"};

// Elements that do not end a line.
constexpr std::array<std::string_view, 34> kInline{
    "a",    "abbr", "acronym", "b",  "bdi",  "bdo",   "big",  "cite",   "code",
    "data", "del",  "dfn",     "em", "font", "i",     "img",  "ins",    "kbd",
    "mark", "q",    "rp",      "s",  "samp", "small", "span", "strike", "strong",
    "sub",  "sup",  "time",    "tt", "u",    "var",   "wbr"};

template <std::size_t size>
bool IsAmong(const std::array<std::string_view, size>& names, std::string_view name) {
  return std::find(names.begin(), names.end(), name) != names.end();
}

std::string_view View(const xmlChar* text) {
  return text == nullptr ? std::string_view() : reinterpret_cast<const char*>(text);
}

std::string_view Attribute(const xmlChar** attributes, std::string_view name) {
  for (; attributes != nullptr && attributes[0] != nullptr; attributes += 2) {
    if (View(attributes[0]) == name) return View(attributes[1]);
  }
  return std::string_view();
}

// Follows the parser's events. Nothing of the tree is kept, whatever its depth.
class HtmlReader {
 public:
  // `out` may be null: then only the text is wanted.
  HtmlReader(TextSink& sink, Extraction* out) : sink_(sink), out_(out) {}

  void Start(std::string_view name, const xmlChar** attributes) {
    if (IsAmong(kSkipped, name)) ++skipped_;
    // Drawings within the page have titles too; they are text.
    if (name == "title" && title_.empty()) in_title_ = true;
    if (name == "meta") Meta(attributes);
    Separate(name);
    if (name == "img") Text(Attribute(attributes, "alt"));
  }

  void End(std::string_view name) {
    if (IsAmong(kSkipped, name) && skipped_ > 0) --skipped_;
    if (name == "title") in_title_ = false;
    Separate(name);
  }

  void Text(std::string_view text) {
    if (skipped_ > 0) return;
    if (in_title_) {
      title_.Append(text);
    } else {
      sink_.Append(text);
    }
  }

  bool full() const { return sink_.full(); }

  void Finish() {
    if (out_ == nullptr) return;
    out_->Set(kTitleField, title_.text());
    out_->Set(kTitleField, social_title_);
  }

 private:
  void Separate(std::string_view name) {
    if (name == "td" || name == "th" || name == "option" || name == "img") {
      sink_.Space();
    } else if (!IsAmong(kInline, name)) {
      sink_.Break();
    }
  }

  void Meta(const xmlChar** attributes) {
    if (out_ == nullptr) return;
    std::string name = AsciiLower(Attribute(attributes, "name"));
    if (name.empty()) name = AsciiLower(Attribute(attributes, "property"));
    const std::string_view content = Attribute(attributes, "content");
    if (name == "author" || name == "dc.creator" || name == "dcterms.creator") {
      out_->Add(kAuthorsField, content);
    } else if (name == "description" || name == "dc.description" || name == "og:description") {
      out_->Set(kDescriptionField, content);
    } else if (name == "keywords" || name == "dc.subject") {
      out_->Add(kKeywordsField, content);
    } else if (name == "generator") {
      out_->Set(kCreatorField, content);
    } else if (name == "og:title") {
      social_title_ = content;
    }
  }

  TextSink& sink_;
  Extraction* out_;
  TextSink title_{kMaxTitleBytes};
  std::string social_title_;
  int skipped_ = 0;
  bool in_title_ = false;
};

struct ContextCloser {
  void operator()(htmlParserCtxtPtr context) const { htmlFreeParserCtxt(context); }
};
using Context = std::unique_ptr<htmlParserCtxt, ContextCloser>;

// What the parser calls back with.
struct Session {
  HtmlReader* reader;
  htmlParserCtxtPtr context;
};

HtmlReader& ReaderOf(void* session) {
  return *static_cast<Session*>(session)->reader;
}

void OnStart(void* session, const xmlChar* name, const xmlChar** attributes) {
  ReaderOf(session).Start(View(name), attributes);
}

void OnEnd(void* session, const xmlChar* name) {
  ReaderOf(session).End(View(name));
}

void OnText(void* session, const xmlChar* text, int size) {
  ReaderOf(session).Text({reinterpret_cast<const char*>(text), static_cast<std::size_t>(size)});
  if (ReaderOf(session).full()) xmlStopParser(static_cast<Session*>(session)->context);
}

xmlSAXHandler Handler() {
  xmlSAXHandler handler{};
  handler.startElement = OnStart;
  handler.endElement = OnEnd;
  handler.characters = OnText;
  handler.cdataBlock = OnText;
  handler.ignorableWhitespace = OnText;
  return handler;
}

void Parse(std::string_view utf8, HtmlReader& reader) {
  PrepareXmlLibrary();
  const Context context(htmlNewParserCtxt());
  if (!context) throw std::bad_alloc();
  Session session{&reader, context.get()};
  *context->sax = Handler();
  context->userData = &session;
  xmlFreeDoc(htmlCtxtReadMemory(context.get(), utf8.data(), static_cast<int>(utf8.size()), nullptr,
                                "UTF-8",
                                HTML_PARSE_RECOVER | HTML_PARSE_NOERROR | HTML_PARSE_NOWARNING |
                                    HTML_PARSE_NONET | HTML_PARSE_IGNORE_ENC | HTML_PARSE_COMPACT));
  reader.Finish();
}

// The parser takes a NUL for the end.
void ReplaceNuls(std::string& text) {
  std::replace(text.begin(), text.end(), '\0', ' ');
}

class HtmlExtractor : public Extractor {
 public:
  const char* Name() const override { return "html"; }

  bool Recognizes(std::string_view head) const override {
    const std::string start = AsciiLower(AsciiHead(head));
    for (const std::string_view mark : {"<!doctype html", "<html"}) {
      if (start.substr(0, mark.size()) == mark) return true;
    }
    return start.substr(0, 5) == "<?xml" && start.find("<html") != std::string::npos;
  }

  bool Claims(std::string_view extension) const override {
    return extension == "html" || extension == "htm" || extension == "xhtml" ||
           extension == "htmls" || extension == "xhtm" || extension == "shtml";
  }

  void Extract(Source& source, Extraction& out) const override {
    if (!LooksLikeText(source.Head())) return;
    auto decoded = DecodeText(source.Bytes(), DeclaredCharset(source.Bytes()));
    if (!decoded) return;
    ReplaceNuls(decoded->utf8);
    HtmlReader reader(out.text(), &out);
    Parse(decoded->utf8, reader);
  }
};

}  // namespace

void AppendHtmlText(std::string_view utf8, TextSink& sink) {
  HtmlReader reader(sink, nullptr);
  Parse(utf8, reader);
}

std::unique_ptr<Extractor> MakeHtmlExtractor() {
  return std::make_unique<HtmlExtractor>();
}

}  // namespace quarry::extract
