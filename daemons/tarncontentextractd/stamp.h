// The two texts by which a document remembers what it was made from, so that a walk over a folder
// can tell what has changed without opening a file.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_STAMP_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_STAMP_H_

#include <sys/stat.h>

#include <cstdint>
#include <string>

namespace quarry::extract {

// Raised whenever parsers get more out of the same bytes: contents are then read again.
inline constexpr int kExtractorVersion = 1;

inline constexpr char kAttributeStampField[] = "QuarryAttributeStamp";
inline constexpr char kContentStampField[] = "QuarryContentStamp";

// A time in nanoseconds since 1970. Beyond the year 2262, which a file may claim, it wraps around:
// a stamp need only be another one for another time.
inline std::string NanosecondText(std::int64_t seconds, std::int64_t nanoseconds) {
  const std::uint64_t wrapped =
      static_cast<std::uint64_t>(seconds) * 1000000000 + static_cast<std::uint64_t>(nanoseconds);
  return std::to_string(static_cast<std::int64_t>(wrapped));
}

// "dev:inode:size:mtime_ns:ctime_ns" of what lstat() says. It differs when anything that a document
// holds besides content has changed.
inline std::string AttributeStamp(const struct stat& status) {
  return std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino) + ":" +
         std::to_string(status.st_size) + ":" +
         NanosecondText(status.st_mtim.tv_sec, status.st_mtim.tv_nsec) + ":" +
         NanosecondText(status.st_ctim.tv_sec, status.st_ctim.tv_nsec);
}

// "extractor-version:size:mtime_ns" of what lstat() says. It differs when content is worth reading
// again.
inline std::string ContentStamp(const struct stat& status) {
  return std::to_string(kExtractorVersion) + ":" + std::to_string(status.st_size) + ":" +
         NanosecondText(status.st_mtim.tv_sec, status.st_mtim.tv_nsec);
}

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_STAMP_H_
