// Plain text and source code: whatever can be read as text in some encoding.

#include "daemons/tarncontentextractd/charset.h"
#include "daemons/tarncontentextractd/extractor.h"

namespace quarry::extract {
namespace {

class PlainTextExtractor : public Extractor {
 public:
  const char* Name() const override { return "text"; }
  bool Recognizes(std::string_view) const override { return false; }
  bool Claims(std::string_view) const override { return true; }

  void Extract(Source& source, Extraction& out) const override {
    if (!LooksLikeText(source.Head())) return;
    if (const auto decoded = DecodeText(source.Bytes())) out.text().Append(decoded->utf8);
  }
};

// Formats of mostly printable bytes that are not for reading.
class OpaqueExtractor : public Extractor {
 public:
  const char* Name() const override { return "opaque"; }
  bool Claims(std::string_view) const override { return false; }
  void Extract(Source&, Extraction&) const override {}

  bool Recognizes(std::string_view head) const override {
    for (const std::string_view mark : {"%PDF-", "%!PS", "{\\rtf"}) {
      if (head.substr(0, mark.size()) == mark) return true;
    }
    return false;
  }
};

}  // namespace

std::unique_ptr<Extractor> MakePlainTextExtractor() {
  return std::make_unique<PlainTextExtractor>();
}

std::unique_ptr<Extractor> MakeOpaqueExtractor() {
  return std::make_unique<OpaqueExtractor>();
}

}  // namespace quarry::extract
