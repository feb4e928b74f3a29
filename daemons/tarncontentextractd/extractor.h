// What a parser of one file format is, and how the right one is found.
//
// A format is added by one source file that implements Extractor and one line in registry.cpp.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_EXTRACTOR_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_EXTRACTOR_H_

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "daemons/tarncontentextractd/source.h"
#include "daemons/tarncontentextractd/text_sink.h"

namespace quarry::extract {

// Of a longer text only so much is kept, and so much of any other field.
inline constexpr std::size_t kMaxTextBytes = std::size_t{8} << 20;
inline constexpr std::size_t kMaxFieldBytes = std::size_t{16} << 10;
inline constexpr std::size_t kMaxFields = 64;

// A field of a document, by the name that the index knows it under.
using FieldValue = std::variant<std::string, std::int64_t, double>;
struct Field {
  std::string name;
  FieldValue value;
};

// How many bytes their texts have.
inline std::size_t TextBytes(const std::vector<Field>& fields) {
  std::size_t bytes = 0;
  for (const Field& field : fields) {
    if (const auto* text = std::get_if<std::string>(&field.value)) bytes += text->size();
  }
  return bytes;
}

// What was found in a file.
class Extraction {
 public:
  Extraction() : text_(kMaxTextBytes) {}

  // The running text.
  TextSink& text() { return text_; }
  // Sets a field, cleaned and on one line. The first value that says anything stays.
  void Set(const std::string& name, std::string_view utf8);
  void Set(const std::string& name, std::int64_t value);
  void Set(const std::string& name, double value);
  // Adds one more person or word to a field, which holds them separated by ", ".
  void Add(const std::string& name, std::string_view utf8);

  // All fields, with the text, where there is any, as TARNMDTextContent. The object is used up.
  std::vector<Field> Take();

 private:
  Field* Find(const std::string& name);
  void SetValue(const std::string& name, FieldValue value);

  TextSink text_;
  std::vector<Field> fields_;
};

// Parses one format. Stateless: one object serves file after file.
class Extractor {
 public:
  virtual ~Extractor() = default;

  // A short name for reports and tests.
  virtual const char* Name() const = 0;
  // Whether the first bytes of the file leave no doubt.
  virtual bool Recognizes(std::string_view head) const = 0;
  // Whether files of this (lower-case) extension have the format where no bytes say otherwise.
  virtual bool Claims(std::string_view extension) const = 0;
  // Parses what is there of the file; broken and truncated input gives what could be read of it.
  // Memory and time are the caller's concern: it runs in a process that has bounds for both.
  virtual void Extract(Source& source, Extraction& out) const = 0;
};

// An ordered list of formats.
class Registry {
 public:
  // Earlier ones are asked first.
  void Add(std::unique_ptr<Extractor> extractor);
  // By content first, by extension second; null where nobody knows the format.
  const Extractor* Find(Source& source) const;

 private:
  std::vector<std::unique_ptr<Extractor>> extractors_;
};

// All formats that this program knows.
Registry StandardRegistry();

std::unique_ptr<Extractor> MakeHtmlExtractor();
std::unique_ptr<Extractor> MakeXmlExtractor();
std::unique_ptr<Extractor> MakeMarkdownExtractor();
std::unique_ptr<Extractor> MakePlainTextExtractor();
// Knows formats that could be taken for text, and finds no text in them.
std::unique_ptr<Extractor> MakeOpaqueExtractor();

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_EXTRACTOR_H_
