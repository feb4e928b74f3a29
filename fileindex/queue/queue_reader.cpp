#include "fileindex/queue/queue_reader.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace quarry::fileindex {
namespace {

constexpr size_t kBufferSize = 64 * 1024;

}  // namespace

QueueReader::QueueReader(const std::string& path)
    : fd_(open(path.c_str(), O_RDONLY | O_CLOEXEC)), failed_(!fd_.valid()), buffer_(kBufferSize) {}

bool QueueReader::Next(std::string& line) {
  line.clear();
  line_ended_ = false;
  while (begin_ != end_ || Fill()) {
    const char* const start = buffer_.data() + begin_;
    const void* const newline = std::memchr(start, '\n', end_ - begin_);
    if (newline != nullptr) {
      const auto length = static_cast<size_t>(static_cast<const char*>(newline) - start);
      line.append(start, length);
      begin_ += length + 1;
      line_ended_ = true;
      return true;
    }
    line.append(start, end_ - begin_);
    begin_ = end_;
  }
  return !failed_ && !line.empty();
}

bool QueueReader::Fill() {
  // Once the end was met it stays: what is appended to a live queue now may be the rest of a line
  // that was handed out.
  if (failed_ || at_end_) return false;
  ssize_t count;
  do {
    count = read(fd_.get(), buffer_.data(), buffer_.size());
  } while (count < 0 && errno == EINTR);
  failed_ = count < 0;
  at_end_ = count == 0;
  begin_ = 0;
  end_ = count > 0 ? static_cast<size_t>(count) : 0;
  return count > 0;
}

}  // namespace quarry::fileindex
