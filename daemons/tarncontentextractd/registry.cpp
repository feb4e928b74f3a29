#include <algorithm>
#include <utility>

#include "daemons/tarncontentextractd/extractor.h"

namespace quarry::extract {
namespace {

constexpr char kTextField[] = "TARNMDTextContent";

}  // namespace

Field* Extraction::Find(const std::string& name) {
  const auto found = std::find_if(fields_.begin(), fields_.end(),
                                  [&](const Field& field) { return field.name == name; });
  return found == fields_.end() ? nullptr : &*found;
}

void Extraction::SetValue(const std::string& name, FieldValue value) {
  if (fields_.size() < kMaxFields && Find(name) == nullptr) {
    fields_.push_back(Field{name, std::move(value)});
  }
}

void Extraction::Set(const std::string& name, std::string_view utf8) {
  std::string value = OneLine(utf8, kMaxFieldBytes);
  if (!value.empty()) SetValue(name, std::move(value));
}

void Extraction::Set(const std::string& name, std::int64_t value) {
  SetValue(name, value);
}

void Extraction::Set(const std::string& name, double value) {
  SetValue(name, value);
}

void Extraction::Add(const std::string& name, std::string_view utf8) {
  Field* field = Find(name);
  if (field == nullptr) {
    Set(name, utf8);
    return;
  }
  std::string* held = std::get_if<std::string>(&field->value);
  const std::string value = OneLine(utf8, kMaxFieldBytes);
  if (held == nullptr || value.empty() || held->size() + value.size() + 2 > kMaxFieldBytes) return;
  *held += ", " + value;
}

std::vector<Field> Extraction::Take() {
  if (!text_.empty()) fields_.push_back(Field{kTextField, text_.Take()});
  return std::exchange(fields_, {});
}

void Registry::Add(std::unique_ptr<Extractor> extractor) {
  extractors_.push_back(std::move(extractor));
}

const Extractor* Registry::Find(Source& source) const {
  const std::string_view head = source.Head();
  for (const auto& extractor : extractors_) {
    if (extractor->Recognizes(head)) return extractor.get();
  }
  for (const auto& extractor : extractors_) {
    if (extractor->Claims(source.extension())) return extractor.get();
  }
  return nullptr;
}

Registry StandardRegistry() {
  Registry registry;
  registry.Add(MakeOpaqueExtractor());
  registry.Add(MakeHtmlExtractor());
  registry.Add(MakeXmlExtractor());
  registry.Add(MakeMarkdownExtractor());
  registry.Add(MakePlainTextExtractor());
  return registry;
}

}  // namespace quarry::extract
