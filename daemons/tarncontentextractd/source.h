// The bytes of the file that is being parsed.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_SOURCE_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_SOURCE_H_

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace quarry::extract {

// Of a longer file only so much is read.
inline constexpr std::size_t kMaxFileBytes = std::size_t{32} << 20;
// By so many bytes a format is recognised.
inline constexpr std::size_t kHeadBytes = std::size_t{8} << 10;

// A file, or bytes that stand for one. Reads as little as is asked for; never moves the
// descriptor's offset. One thread at a time.
class Source {
 public:
  // Reads from `fd`, which stays the caller's and must outlive the object. `extension` is the file
  // name's, lower-cased and without the dot.
  Source(int fd, std::string extension) : fd_(fd), extension_(std::move(extension)) {}
  // Holds `bytes`, as a file of these bytes would.
  static Source OfBytes(std::string bytes, std::string extension);

  // The first kHeadBytes, or the whole of a shorter file. Valid until the next call of Bytes().
  // A file that cannot be read seems to end there.
  std::string_view Head();
  // The first kMaxFileBytes. Valid as long as the object.
  std::string_view Bytes();
  // How many bytes it says that it has; 0 where it does not say.
  std::size_t Expected();
  // For libraries that read for themselves; -1 for bytes.
  int fd() const { return fd_; }
  const std::string& extension() const { return extension_; }

 private:
  void ReadUpTo(std::size_t size);

  int fd_;
  std::string extension_;
  std::string bytes_;
  std::optional<std::size_t> expected_;  // bytes in all, once asked
  bool at_end_ = false;
};

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_SOURCE_H_
