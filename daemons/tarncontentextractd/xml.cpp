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
// Its attributes are coordinates and colours.
constexpr std::string_view kDrawing = "http://www.w3.org/2000/svg";

// The parser gives an attribute as so many pointers, the last two around its value.
constexpr int kAttributePointers = 5;

std::string_view View(const xmlChar* text) {
  return text == nullptr ? std::string_view() : reinterpret_cast<const char*>(text);
}

// Follows the parser's events; the tree is not kept, and depth costs nothing here.
class XmlReader {
 public:
  explicit XmlReader(Extraction& out) : out_(out) {}

  void Start(std::string_view name, std::string_view space, const xmlChar** attributes,
             int attribute_count) {
    out_.text().Break();
    // Only where elements hold no words are they looked for in attributes.
    if (out_.text().empty() && space != kDrawing) TakeAttributes(attributes, attribute_count);
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

  void Finish() {
    if (out_.text().empty()) out_.text().Append(attributes_.text());
  }

 private:
  void TakeAttributes(const xmlChar** attributes, int count) {
    attributes_.Break();
    for (int i = 0; i < count; ++i, attributes += kAttributePointers) {
      const char* value = reinterpret_cast<const char*>(attributes[3]);
      const char* end = reinterpret_cast<const char*>(attributes[4]);
      attributes_.Append(
          DecodeReferences(std::string_view(value, static_cast<std::size_t>(end - value))));
      attributes_.Space();
    }
  }

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
  TextSink attributes_{kMaxTextBytes};
  const char* field_ = nullptr;
  std::size_t depth_ = 0;
  std::size_t field_depth_ = 0;
};

// What the parser calls back with.
struct Session {
  XmlReader* reader;
  xmlParserCtxtPtr context;
  xmlEntity entity{};
  std::string character;
};

XmlReader& ReaderOf(void* session) {
  return *static_cast<Session*>(session)->reader;
}

void OnStart(void* session, const xmlChar* name, const xmlChar*, const xmlChar* space, int,
             const xmlChar**, int attribute_count, int, const xmlChar** attributes) {
  ReaderOf(session).Start(View(name), View(space), attributes, attribute_count);
}

void OnEnd(void* session, const xmlChar*, const xmlChar*, const xmlChar*) {
  ReaderOf(session).End();
}

void OnText(void* session, const xmlChar* text, int size) {
  ReaderOf(session).Text({reinterpret_cast<const char*>(text), static_cast<std::size_t>(size)});
  if (ReaderOf(session).full()) xmlStopParser(static_cast<Session*>(session)->context);
}

// The characters that HTML names are used without being declared. As a predefined entity one is
// handed on as text; in an attribute the parser would take its first byte only.
xmlEntityPtr NamedCharacter(void* session, const xmlChar* name) {
  if (static_cast<Session*>(session)->context->instate == XML_PARSER_ATTRIBUTE_VALUE) {
    return nullptr;
  }
  Session& current = *static_cast<Session*>(session);
  current.character = DecodeEntity(View(name));
  if (current.character.empty()) return nullptr;
  current.entity = xmlEntity{};
  current.entity.type = XML_ENTITY_DECL;
  current.entity.etype = XML_INTERNAL_PREDEFINED_ENTITY;
  current.entity.content = reinterpret_cast<xmlChar*>(current.character.data());
  return &current.entity;
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
  handler.getEntity = NamedCharacter;
  handler.getParameterEntity = NoEntity;
  return handler;
}

struct ContextCloser {
  void operator()(xmlParserCtxtPtr context) const { xmlFreeParserCtxt(context); }
};
using Context = std::unique_ptr<xmlParserCtxt, ContextCloser>;

void Parse(std::string_view utf8, XmlReader& reader) {
  PrepareXmlLibrary();
  const Context context(xmlNewParserCtxt());
  if (!context) throw std::bad_alloc();
  Session session{&reader, context.get(), {}, {}};
  *context->sax = Handler();
  context->userData = &session;
  // No tree is built, but where entities are declared there is something like the root of one.
  xmlFreeDoc(xmlCtxtReadMemory(context.get(), utf8.data(), static_cast<int>(utf8.size()), nullptr,
                               "UTF-8",
                               XML_PARSE_RECOVER | XML_PARSE_NOERROR | XML_PARSE_NOWARNING |
                                   XML_PARSE_NONET | XML_PARSE_IGNORE_ENC | XML_PARSE_HUGE));
  reader.Finish();
}

class XmlExtractor : public Extractor {
 public:
  const char* Name() const override { return "xml"; }

  bool Recognizes(std::string_view head) const override {
    return BeginsLikeMarkup(head) && AsciiHead(head).substr(0, 5) == "<?xml";
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
