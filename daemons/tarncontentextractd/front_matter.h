// The lines of "key: value" between two lines of "---" with which many Markdown files begin.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_FRONT_MATTER_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_FRONT_MATTER_H_

#include <string_view>

#include "daemons/tarncontentextractd/extractor.h"

namespace quarry::extract {

// Sets title, authors, description and keywords of `out` from the front matter of `utf8`, and
// returns the text behind it; all of `utf8` when there is no front matter.
std::string_view TakeFrontMatter(std::string_view utf8, Extraction& out);

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_FRONT_MATTER_H_
