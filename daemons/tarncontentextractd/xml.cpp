// XML of any vocabulary.
//
// Documents may declare entities, and use them to name other files or to grow without bounds. Here
// no entity but the five of XML itself and the named characters of HTML has a value: declarations
// are passed over, so that neither can happen, and the parser's own limits can be lifted safely.

#include <libxml/parser.h>

#include <memory>
#include <new>

#include "daemons/tarncontentextractd/charset.h"
#include "daemons/tarncontentextractd/extractor.h"
#include "daemons/tarncontentextractd/markup.h"

namespace quarry::extract {
namespace {

constexpr std::string_view kDublinCore = "http://purl.org/dc/elements/1.1/";

std::string_view View(const xmlChar* text) {
  return text == nullptr ? std::string_view() : reinterpret_cast<const char*>(text);
}

// Follows the parser's events; the tree is not kept, and depth costs nothing here.
class XmlReader {
 public:
  explicit XmlReader(Extraction& out) : out_(out) {}

  void Start(std::string_view name, std::string_view space) {
    out_.text().Break();
    ++depth_;
    if (field_ != nullptr) return;
    field_ = FieldOf(name, space);
    field_depth_ = depth_;
  }

  void End() {
    out_.text().Break();
    if (field_ != nullptr && depth_ == field_depth_) {
      StoreField();
      field_ = nullptr;
    }
    --depth_;
  }

  void Text(std::string_view text) {
    if (field_ != nullptr) value_.Append(text);
    out_.text().Append(text);
  }

  bool full() { return out_.text().full(); }

 private:
  static const char* FieldOf(std::string_view name, std::string_view space) {
    if (name == "title") return kTitleField;
    if (space != kDublinCore) return nullptr;
    if (name == "creator") return kAuthorsField;
    if (name == "description") return kDescriptionField;
    return name == "subject" ? kKeywordsField : nullptr;
  }

  void StoreField() {
    const std::string value = value_.Take();
    if (field_ == kAuthorsField || field_ == kKeywordsField) {
      out_.Add(field_, value);
    } else {
      out_.Set(field_, value);
    }
  }

  Extraction& out_;
  TextSink value_{kMaxFieldBytes};
  const char* field_ = nullptr;
  std::size_t depth_ = 0;
  std::size_t field_depth_ = 0;
};

struct Session {
  XmlReader* reader;
  xmlParserCtxtPtr context;
};

XmlReader& ReaderOf(void* session) {
  return *static_cast<Session*>(session)->reader;
}

void OnStart(void* session, const xmlChar* name, const xmlChar*, const xmlChar* space, int,
             const xmlChar**, int, int, const xmlChar**) {
  ReaderOf(session).Start(View(name), View(space));
}

void OnEnd(void* session, const xmlChar*, const xmlChar*, const xmlChar*) {
  ReaderOf(session).End();
}

void OnText(void* session, const xmlChar* text, int size) {
  ReaderOf(session).Text({reinterpret_cast<const char*>(text), static_cast<std::size_t>(size)});
  if (ReaderOf(session).full()) xmlStopParser(static_cast<Session*>(session)->context);
}

void OnReference(void* session, const xmlChar* name) {
  ReaderOf(session).Text(DecodeEntity(View(name)));
}

xmlEntityPtr NoEntity(void*, const xmlChar*) {
  return nullptr;
}

xmlSAXHandler Handler() {
  xmlSAXHandler handler{};
  handler.initialized = XML_SAX2_MAGIC;
  handler.startElementNs = OnStart;
  handler.endElementNs = OnEnd;
  handler.characters = OnText;
  handler.cdataBlock = OnText;
  handler.ignorableWhitespace = OnText;
  handler.reference = OnReference;
  handler.getEntity = NoEntity;
  handler.getParameterEntity = NoEntity;
  return handler;
}

struct ContextCloser {
  void operator()(xmlParserCtxtPtr context) const {
    if (context->myDoc != nullptr) xmlFreeDoc(context->myDoc);
    context->myDoc = nullptr;
    xmlFreeParserCtxt(context);
  }
};
using Context = std::unique_ptr<xmlParserCtxt, ContextCloser>;

void Parse(std::string_view utf8, XmlReader& reader) {
  PrepareXmlLibrary();
  const Context context(xmlNewParserCtxt());
  if (!context) throw std::bad_alloc();
  Session session{&reader, context.get()};
  *context->sax = Handler();
  context->userData = &session;
  xmlCtxtReadMemory(context.get(), utf8.data(), static_cast<int>(utf8.size()), nullptr, "UTF-8",
                    XML_PARSE_RECOVER | XML_PARSE_NOERROR | XML_PARSE_NOWARNING | XML_PARSE_NONET |
                        XML_PARSE_IGNORE_ENC | XML_PARSE_HUGE);
}

class XmlExtractor : public Extractor {
 public:
  const char* Name() const override { return "xml"; }

  bool Recognizes(std::string_view head) const override {
    return AsciiHead(head).substr(0, 5) == "<?xml";
  }

  bool Claims(std::string_view extension) const override {
    return extension == "xml" || extension == "svg" || extension == "xsd" || extension == "xsl" ||
           extension == "xslt" || extension == "rdf" || extension == "opml" ||
           extension == "plist" || extension == "rss" || extension == "atom";
  }

  void Extract(Source& source, Extraction& out) const override {
    if (!LooksLikeText(source.Head())) return;
    const auto decoded = DecodeText(source.Bytes(), DeclaredCharset(source.Bytes()));
    if (!decoded) return;
    XmlReader reader(out);
    Parse(SkipSpace(decoded->utf8), reader);
    // What only has the name of XML is read as it stands.
    if (out.text().empty() && SkipSpace(decoded->utf8).substr(0, 1) != "<") {
      out.text().Append(decoded->utf8);
    }
  }
};

}  // namespace

std::unique_ptr<Extractor> MakeXmlExtractor() {
  return std::make_unique<XmlExtractor>();
}

}  // namespace quarry::extract
