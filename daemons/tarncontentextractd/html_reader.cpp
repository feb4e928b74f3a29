#include "daemons/tarncontentextractd/html_reader.h"

#include <array>

#include "daemons/tarncontentextractd/markup.h"

namespace quarry::extract {
namespace {

using Edge = HtmlElement::Edge;
using Role = HtmlElement::Role;

// The last three: skipped, plain, nests. The first stands for all that are not known. What newer
// parsers take for text, or for another language, is not plain.
constexpr std::array<HtmlElement, 88> kElements{{
    {"", Edge::kLine, Role::kOther, false, false, false},
    {"a", Edge::kNone, Role::kOther, false, true, false},
    {"abbr", Edge::kNone, Role::kOther, false, true, false},
    {"acronym", Edge::kNone, Role::kOther, false, true, false},
    {"address", Edge::kLine, Role::kOther, false, true, false},
    {"article", Edge::kLine, Role::kOther, false, true, true},
    {"aside", Edge::kLine, Role::kOther, false, true, true},
    {"b", Edge::kNone, Role::kOther, false, true, false},
    {"bdi", Edge::kNone, Role::kOther, false, true, false},
    {"bdo", Edge::kNone, Role::kOther, false, true, false},
    {"big", Edge::kNone, Role::kOther, false, true, false},
    {"blockquote", Edge::kLine, Role::kOther, false, true, true},
    {"body", Edge::kLine, Role::kOther, false, true, false},
    {"br", Edge::kLine, Role::kOther, false, true, false},
    {"caption", Edge::kLine, Role::kOther, false, true, false},
    {"center", Edge::kLine, Role::kOther, false, true, false},
    {"cite", Edge::kNone, Role::kOther, false, true, true},
    {"code", Edge::kNone, Role::kOther, false, true, true},
    {"col", Edge::kLine, Role::kOther, false, true, false},
    {"colgroup", Edge::kLine, Role::kOther, false, true, false},
    {"data", Edge::kNone, Role::kOther, false, false, false},
    {"dd", Edge::kLine, Role::kOther, false, true, false},
    {"del", Edge::kNone, Role::kOther, false, true, false},
    {"dfn", Edge::kNone, Role::kOther, false, true, false},
    {"div", Edge::kLine, Role::kOther, false, true, true},
    {"dl", Edge::kLine, Role::kOther, false, true, true},
    {"dt", Edge::kLine, Role::kOther, false, true, false},
    {"em", Edge::kNone, Role::kOther, false, true, true},
    {"figcaption", Edge::kLine, Role::kOther, false, true, false},
    {"figure", Edge::kLine, Role::kOther, false, true, true},
    {"font", Edge::kNone, Role::kOther, false, false, false},
    {"footer", Edge::kLine, Role::kOther, false, true, false},
    {"form", Edge::kLine, Role::kOther, false, true, false},
    {"h1", Edge::kLine, Role::kOther, false, true, false},
    {"h2", Edge::kLine, Role::kOther, false, true, false},
    {"h3", Edge::kLine, Role::kOther, false, true, false},
    {"h4", Edge::kLine, Role::kOther, false, true, false},
    {"h5", Edge::kLine, Role::kOther, false, true, false},
    {"h6", Edge::kLine, Role::kOther, false, true, false},
    {"head", Edge::kLine, Role::kOther, false, true, false},
    {"header", Edge::kLine, Role::kOther, false, true, false},
    {"hr", Edge::kLine, Role::kOther, false, true, false},
    {"html", Edge::kLine, Role::kOther, false, true, false},
    {"i", Edge::kNone, Role::kOther, false, true, false},
    {"iframe", Edge::kLine, Role::kOther, true, false, false},
    {"img", Edge::kBlank, Role::kImage, false, true, false},
    {"input", Edge::kLine, Role::kOther, false, true, false},
    {"ins", Edge::kNone, Role::kOther, false, true, false},
    {"kbd", Edge::kNone, Role::kOther, false, true, true},
    {"label", Edge::kLine, Role::kOther, false, true, false},
    {"li", Edge::kLine, Role::kOther, false, true, false},
    {"link", Edge::kLine, Role::kOther, false, true, false},
    {"main", Edge::kLine, Role::kOther, false, true, false},
    {"mark", Edge::kNone, Role::kOther, false, true, false},
    {"meta", Edge::kLine, Role::kMeta, false, true, false},
    {"nav", Edge::kLine, Role::kOther, false, true, true},
    {"ol", Edge::kLine, Role::kOther, false, true, true},
    {"option", Edge::kBlank, Role::kOther, false, false, false},
    {"p", Edge::kLine, Role::kOther, false, true, false},
    {"pre", Edge::kLine, Role::kOther, false, true, false},
    {"q", Edge::kNone, Role::kOther, false, true, false},
    {"rp", Edge::kNone, Role::kOther, false, false, false},
    {"s", Edge::kNone, Role::kOther, false, true, false},
    {"samp", Edge::kNone, Role::kOther, false, true, false},
    {"script", Edge::kLine, Role::kOther, true, true, false},
    {"section", Edge::kLine, Role::kOther, false, true, true},
    {"small", Edge::kNone, Role::kOther, false, true, true},
    {"span", Edge::kNone, Role::kOther, false, true, true},
    {"strike", Edge::kNone, Role::kOther, false, true, false},
    {"strong", Edge::kNone, Role::kOther, false, true, true},
    {"style", Edge::kLine, Role::kOther, true, true, false},
    {"sub", Edge::kNone, Role::kOther, false, true, true},
    {"sup", Edge::kNone, Role::kOther, false, true, true},
    {"table", Edge::kLine, Role::kOther, false, true, false},
    {"tbody", Edge::kLine, Role::kOther, false, true, false},
    {"td", Edge::kBlank, Role::kOther, false, true, false},
    {"template", Edge::kLine, Role::kOther, true, false, false},
    {"tfoot", Edge::kLine, Role::kOther, false, true, false},
    {"th", Edge::kBlank, Role::kOther, false, true, false},
    {"thead", Edge::kLine, Role::kOther, false, true, false},
    {"time", Edge::kNone, Role::kOther, false, false, false},
    {"title", Edge::kLine, Role::kTitle, false, true, false},
    {"tr", Edge::kLine, Role::kOther, false, true, false},
    {"tt", Edge::kNone, Role::kOther, false, true, false},
    {"u", Edge::kNone, Role::kOther, false, true, false},
    {"ul", Edge::kLine, Role::kOther, false, true, true},
    {"var", Edge::kNone, Role::kOther, false, true, false},
    {"wbr", Edge::kNone, Role::kOther, false, false, false},
}};
static_assert(kElements.size() <= kMaxHtmlElements);

// Where in a table of names to begin looking.
constexpr std::size_t kSlots = 256;
constexpr std::size_t SlotOf(std::string_view name) {
  std::size_t hash = name.size();
  for (const char c : name) hash = hash * 31 + static_cast<unsigned char>(c);
  return hash % kSlots;
}

// The numbers of elements, each at its slot or behind it; 0 where there is none.
constexpr std::array<std::uint8_t, kSlots> MakeSlots() {
  std::array<std::uint8_t, kSlots> slots{};
  for (std::size_t i = 1; i < kElements.size(); ++i) {
    std::size_t slot = SlotOf(kElements[i].name);
    while (slots[slot] != 0) slot = (slot + 1) % kSlots;
    slots[slot] = static_cast<std::uint8_t>(i);
  }
  return slots;
}
constexpr std::array<std::uint8_t, kSlots> kSlotTable = MakeSlots();

std::string_view View(const xmlChar* text) {
  return text == nullptr ? std::string_view() : reinterpret_cast<const char*>(text);
}

std::string_view Attribute(const xmlChar** attributes, std::string_view name) {
  for (; attributes != nullptr && attributes[0] != nullptr; attributes += 2) {
    if (View(attributes[0]) == name) return View(attributes[1]);
  }
  return std::string_view();
}

}  // namespace

const HtmlElement& FindHtmlElement(std::string_view name) {
  std::size_t slot = SlotOf(name);
  while (kSlotTable[slot] != 0 && kElements[kSlotTable[slot]].name != name) {
    slot = (slot + 1) % kSlots;
  }
  return kElements[kSlotTable[slot]];
}

std::size_t NumberOf(const HtmlElement& element) {
  return static_cast<std::size_t>(&element - kElements.data());
}

void HtmlReader::Start(const HtmlElement& element, const xmlChar** attributes) {
  if (element.skipped) ++skipped_;
  // Drawings within the page have titles too; they are text.
  if (element.role == Role::kTitle && title_.empty()) in_title_ = true;
  if (element.role == Role::kMeta) Meta(attributes);
  Separate(element);
  if (element.role == Role::kImage) Text(Attribute(attributes, "alt"));
}

void HtmlReader::End(const HtmlElement& element) {
  if (element.skipped && skipped_ > 0) --skipped_;
  if (element.role == Role::kTitle) in_title_ = false;
  Separate(element);
}

void HtmlReader::Text(std::string_view text) {
  if (skipped_ > 0) return;
  if (in_title_) {
    title_.Append(text);
  } else {
    sink_.Append(text);
  }
}

void HtmlReader::Finish() {
  if (out_ == nullptr) return;
  out_->Set(kTitleField, title_.text());
  out_->Set(kTitleField, social_title_);
}

void HtmlReader::Separate(const HtmlElement& element) {
  if (element.edge == Edge::kBlank) {
    sink_.Space();
  } else if (element.edge == Edge::kLine) {
    sink_.Break();
  }
}

void HtmlReader::Meta(const xmlChar** attributes) {
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

}  // namespace quarry::extract
