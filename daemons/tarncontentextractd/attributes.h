// What the file system says about a file, as fields of its document.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_ATTRIBUTES_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_ATTRIBUTES_H_

#include <sys/stat.h>

#include <cstdint>
#include <string>

namespace quarry::extract {

struct Attributes {
  struct stat status {};
  // Seconds since 1970, 0 where the file system does not keep it.
  std::int64_t birth_time = 0;
};

// Asks about what `place`, a descriptor of any kind, stands for. Returns false, with errno set, on
// failure.
bool ReadAttributes(int place, Attributes* out);

// The document of `path` without its content, as the text of a JSON object. Names are byte strings:
// what is not UTF-8 is kept.
std::string AttributeText(const std::string& path, const Attributes& attributes);

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_ATTRIBUTES_H_
