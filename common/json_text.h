// Reading and writing JSON text about as fast as it can be copied. Documents carry whole texts of
// files through several processes, each of which would else spend more on this than on its work.

#ifndef QUARRY_COMMON_JSON_TEXT_H_
#define QUARRY_COMMON_JSON_TEXT_H_

#include <json/json.h>

#include <string>
#include <string_view>

#include "common/export.h"

namespace quarry {

// Reads `text` just as the JSON library in its strict mode would, or returns false, with `out` as
// it was: then the text is no JSON, or of a rare kind that is left to the library to judge. Bytes
// that are not UTF-8 are kept. Throws what the library throws for strings too long for it. Any
// thread.
bool ReadPlainJson(std::string_view text, Json::Value* out);

// The compact text of `value`, byte for byte as the JSON library writes it. Any thread.
std::string WriteJson(const Json::Value& value);

// Adds `text` as a JSON string, byte for byte as WriteJson does. Any thread.
QUARRY_EXPORT void AppendJsonString(std::string* out, std::string_view text);

}  // namespace quarry

#endif  // QUARRY_COMMON_JSON_TEXT_H_
