// Taking a JSON text apart without reading what is in it, to hand its pieces on as they stand.

#ifndef QUARRY_DAEMONS_COMMON_JSON_PIECES_H_
#define QUARRY_DAEMONS_COMMON_JSON_PIECES_H_

#include <map>
#include <optional>
#include <string_view>
#include <vector>

namespace quarry::daemon {

// What they return points into `text`, and is taken as far as its brackets and quotation marks
// reach: they pair up and end with the piece, so that behind another piece it cannot be taken for a
// part of that. Whether the rest is JSON is for its reader to say. Nothing is returned for a text
// that is no object, or no array, with nothing but white space around it. Any thread.

// The texts of an object's members, by the texts of their names without quotation marks. The first
// of several of one name counts.
std::optional<std::map<std::string_view, std::string_view>> MembersOf(std::string_view text);

// The texts of an array's elements, in order.
std::optional<std::vector<std::string_view>> ElementsOf(std::string_view text);

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_JSON_PIECES_H_
