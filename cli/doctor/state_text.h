// State files whose text may be damaged.

#ifndef QUARRY_CLI_DOCTOR_STATE_TEXT_H_
#define QUARRY_CLI_DOCTOR_STATE_TEXT_H_

#include <json/json.h>

#include <string>
#include <vector>

namespace quarry::cli {

struct StateText {
  bool exists = false;   // there is something by that name
  bool is_file = false;  // and it is a regular file, links followed
  std::string text;      // its bytes, as far as the bound
};

// The most bytes of a state file that are looked at; longer ones are damaged.
inline constexpr std::size_t kMaxStateBytes = std::size_t{64} << 20;

// Throws Problem where the file may be sound but cannot be read, as by a user who must not.
StateText ReadStateText(const std::string& path);

// The whole objects of the first array in `text`, in order, of which those that are no JSON are
// left out: what there is to be had of a list that was cut off or has a hole. Takes time in
// proportion to the text.
std::vector<Json::Value> WholeObjects(const std::string& text);

// Gives what lies at `path` another name beside it and returns that. Throws Problem.
std::string SetAside(const std::string& path);

// The same, with `value` in its place: at every moment there is the old or the new file. Throws
// Problem, with the old file in its place.
std::string ReplaceDamaged(const std::string& path, const Json::Value& value);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_DOCTOR_STATE_TEXT_H_
