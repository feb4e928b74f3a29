// What the parsers of marked-up text share.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_MARKUP_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_MARKUP_H_

#include <string>
#include <string_view>

#include "daemons/tarncontentextractd/text_sink.h"

namespace quarry::extract {

// Fields of a document that describe its text.
inline constexpr char kTitleField[] = "TARNMDTitle";
inline constexpr char kAuthorsField[] = "TARNMDAuthors";
inline constexpr char kDescriptionField[] = "TARNMDDescription";
inline constexpr char kKeywordsField[] = "TARNMDKeywords";
inline constexpr char kCreatorField[] = "TARNMDCreator";

// `text` with the letters A to Z lower-cased.
std::string AsciiLower(std::string_view text);

// Finds `lower`, which is in lower case, in `text` from `from` on, whatever the case of `text`.
std::size_t FindIgnoringCase(std::string_view text, std::string_view lower, std::size_t from = 0);

// `text` without white space, byte-order mark included, at its beginning.
std::string_view SkipSpace(std::string_view text);

// The first bytes of a file as ASCII as can be: NUL bytes are dropped, so that markup in UTF-16 is
// recognised as well, and so is a mark in front. At most the first KiB.
std::string AsciiHead(std::string_view head);

// Whether AsciiHead might begin with "<". Most files are told from markup by that alone.
bool BeginsLikeMarkup(std::string_view head);

// The encoding that a text names for itself, as HTML ("charset=") or XML ("encoding=") does it in
// its first 4 KiB; empty where it does not.
std::string DeclaredCharset(std::string_view bytes);

// The UTF-8 of a named ("amp") or numeric ("#38", "#x26") character reference; empty for others.
std::string DecodeEntity(std::string_view name);

// `utf8` with its character references ("&amp;", "&#38;") decoded; others stand as they are.
std::string DecodeReferences(std::string_view utf8);

// Adds the text of an HTML document or fragment, in UTF-8, without scripts, styles and titles.
void AppendHtmlText(std::string_view utf8, TextSink& sink);

// Makes libxml2 ready: it opens no file, asks no network, and reports nothing on its own. May be
// called again.
void PrepareXmlLibrary();

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_MARKUP_H_
