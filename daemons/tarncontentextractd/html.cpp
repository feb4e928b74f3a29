// HTML, and XHTML read as such.

#include <libxml/HTMLparser.h>

#include <memory>
#include <utility>

#include "daemons/tarncontentextractd/charset.h"
#include "daemons/tarncontentextractd/extractor.h"
#include "daemons/tarncontentextractd/html_reader.h"
#include "daemons/tarncontentextractd/markup.h"
#include "daemons/tarncontentextractd/plain_html.h"

namespace quarry::extract {
namespace {

std::string_view View(const xmlChar* text) {
  return text == nullptr ? std::string_view() : reinterpret_cast<const char*>(text);
}

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
  ReaderOf(session).Start(FindHtmlElement(View(name)), attributes);
}

void OnEnd(void* session, const xmlChar* name) {
  ReaderOf(session).End(FindHtmlElement(View(name)));
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

// The parser takes a NUL for the end.
void ReplaceNuls(std::string& text) {
  for (std::size_t at = text.find('\0'); at != std::string::npos; at = text.find('\0', at)) {
    text[at] = ' ';
  }
}

// Returns false, with `out` as it was, where that cannot be done.
bool ReadShortWay(std::string_view utf8, Extraction& out) {
  Extraction found;
  HtmlReader reader(found.text(), &found);
  if (!ReadPlainHtml(utf8, reader)) return false;
  out = std::move(found);
  return true;
}

class HtmlExtractor : public Extractor {
 public:
  const char* Name() const override { return "html"; }

  bool Recognizes(std::string_view head) const override {
    if (!BeginsLikeMarkup(head)) return false;
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
    if (ReadShortWay(decoded->utf8, out)) return;
    HtmlReader reader(out.text(), &out);
    ReadHtml(decoded->utf8, reader);
  }
};

}  // namespace

void ReadHtml(std::string_view utf8, HtmlReader& reader) {
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

void AppendHtmlText(std::string_view utf8, TextSink& sink) {
  HtmlReader reader(sink, nullptr);
  ReadHtml(utf8, reader);
}

std::unique_ptr<Extractor> MakeHtmlExtractor() {
  return std::make_unique<HtmlExtractor>();
}

}  // namespace quarry::extract
