// A short way through pages of HTML in which nothing is left to a parser's judgement.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_PLAIN_HTML_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_PLAIN_HTML_H_

#include <string_view>

#include "daemons/tarncontentextractd/html_reader.h"

namespace quarry::extract {

// Reads a page of which all elements are known and closed in their order, as programs that make
// pages write them; libxml2 would make the same of it, in many times the time. Returns false, with
// the reader in no state to go on, for a page in which anything would have to be guessed or mended,
// down to a missing end tag or a byte that is no UTF-8: that is a parser's work.
bool ReadPlainHtml(std::string_view utf8, HtmlReader& reader);

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_PLAIN_HTML_H_
