// Markdown: the words without the marks.

#include <md4c.h>

#include <array>

#include "daemons/tarncontentextractd/charset.h"
#include "daemons/tarncontentextractd/extractor.h"
#include "daemons/tarncontentextractd/front_matter.h"
#include "daemons/tarncontentextractd/markup.h"

namespace quarry::extract {
namespace {

class MarkdownReader {
 public:
  explicit MarkdownReader(Extraction& out) : out_(out) {}

  void EnterBlock(MD_BLOCKTYPE type) {
    Separate(type);
    if (type == MD_BLOCK_H && !has_title_) in_title_ = true;
    if (type == MD_BLOCK_HTML) in_html_ = true;
  }

  void LeaveBlock(MD_BLOCKTYPE type) {
    if (type == MD_BLOCK_HTML) {
      in_html_ = false;
      AppendHtmlText(html_, out_.text());
      html_.clear();
    }
    if (type == MD_BLOCK_H && in_title_) {
      in_title_ = false;
      has_title_ = !title_.empty();
      out_.Set(kTitleField, title_.Take());
    }
    Separate(type);
  }

  void Text(MD_TEXTTYPE type, std::string_view text) {
    switch (type) {
      case MD_TEXT_NULLCHAR:
        Add(" ");
        break;
      case MD_TEXT_BR:
      case MD_TEXT_SOFTBR:
        Add("\n");
        break;
      case MD_TEXT_ENTITY:
        AddEntity(text);
        break;
      case MD_TEXT_HTML:
        // Within a line only tags come this way; a block is HTML as a whole.
        if (in_html_) html_.append(text);
        break;
      default:
        Add(text);
    }
  }

  bool full() { return out_.text().full(); }

 private:
  void Separate(MD_BLOCKTYPE type) {
    if (type == MD_BLOCK_TD || type == MD_BLOCK_TH) {
      out_.text().Space();
    } else {
      out_.text().Break();
    }
  }

  void Add(std::string_view text) {
    if (in_title_) title_.Append(text);
    out_.text().Append(text);
  }

  void AddEntity(std::string_view text) {
    const std::string decoded =
        text.size() > 2 ? DecodeEntity(text.substr(1, text.size() - 2)) : "";
    Add(decoded.empty() ? text : std::string_view(decoded));
  }

  Extraction& out_;
  TextSink title_{kMaxFieldBytes};
  std::string html_;
  bool in_title_ = false;
  bool has_title_ = false;
  bool in_html_ = false;
};

MarkdownReader& ReaderOf(void* reader) {
  return *static_cast<MarkdownReader*>(reader);
}

int OnEnterBlock(MD_BLOCKTYPE type, void*, void* reader) {
  ReaderOf(reader).EnterBlock(type);
  return 0;
}

int OnLeaveBlock(MD_BLOCKTYPE type, void*, void* reader) {
  ReaderOf(reader).LeaveBlock(type);
  return 0;
}

int OnSpan(MD_SPANTYPE, void*, void*) {
  return 0;
}

int OnText(MD_TEXTTYPE type, const MD_CHAR* text, MD_SIZE size, void* reader) {
  ReaderOf(reader).Text(type, std::string_view(text, size));
  return ReaderOf(reader).full() ? 1 : 0;
}

// Returns whether the parser got to the end, or as far as text is wanted.
bool Parse(std::string_view utf8, MarkdownReader& reader) {
  MD_PARSER parser{};
  parser.flags = MD_DIALECT_GITHUB;
  parser.enter_block = OnEnterBlock;
  parser.leave_block = OnLeaveBlock;
  parser.enter_span = OnSpan;
  parser.leave_span = OnSpan;
  parser.text = OnText;
  return md_parse(utf8.data(), static_cast<MD_SIZE>(utf8.size()), &parser, &reader) >= 0;
}

class MarkdownExtractor : public Extractor {
 public:
  const char* Name() const override { return "markdown"; }
  bool Recognizes(std::string_view) const override { return false; }

  bool Claims(std::string_view extension) const override {
    static constexpr std::array<std::string_view, 8> kExtensions{
        "md", "markdown", "mkd", "mkdn", "mdown", "mdwn", "mdtxt", "mdtext"};
    for (const std::string_view each : kExtensions) {
      if (extension == each) return true;
    }
    return false;
  }

  void Extract(Source& source, Extraction& out) const override {
    if (!LooksLikeText(source.Head())) return;
    const auto decoded = DecodeText(source.Bytes());
    if (!decoded) return;
    MarkdownReader reader(out);
    const std::string_view body = TakeFrontMatter(decoded->utf8, out);
    if (Parse(body, reader)) return;
    // Of marks alone there can be more than memory has room for: then the text is what it looks
    // like.
    out.text().Take();
    out.text().Append(body);
  }
};

}  // namespace

std::unique_ptr<Extractor> MakeMarkdownExtractor() {
  return std::make_unique<MarkdownExtractor>();
}

}  // namespace quarry::extract
