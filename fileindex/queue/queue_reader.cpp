#include "fileindex/queue/queue_reader.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "fileindex/queue/event_line.h"

namespace quarry::fileindex {
namespace {

constexpr size_t kBufferSize = 64 * 1024;

}  // namespace

QueueReader::QueueReader(const std::string& path)
    : fd_(open(path.c_str(), O_RDONLY | O_CLOEXEC)), failed_(!fd_.valid()), buffer_(kBufferSize) {}

bool QueueReader::Next(std::string_view& line) {
  while (newline_ == nullptr && Fill()) FindNewline();
  line_ended_ = newline_ != nullptr;
  const char* const start = buffer_.data() + begin_;
  const char* const stop = line_ended_ ? newline_ : buffer_.data() + end_;
  line = std::string_view(start, static_cast<size_t>(stop - start));
  begin_ = searched_ = std::min(begin_ + line.size() + 1, end_);
  FindNewline();
  return line_ended_ || (!failed_ && !line.empty());
}

void QueueReader::FindNewline() {
  const void* const found = std::memchr(buffer_.data() + searched_, '\n', end_ - searched_);
  newline_ = static_cast<const char*>(found);
  searched_ = end_;
}

// Moves the beginning of a line to the front. A line that fills the buffer gets a larger one.
void QueueReader::MakeRoom() {
  std::memmove(buffer_.data(), buffer_.data() + begin_, end_ - begin_);
  end_ -= begin_;
  searched_ -= begin_;
  begin_ = 0;
  // What is left of a buffer that was not plain may be; a line of many buffers is not gone through
  // again for each.
  if (!is_plain_ && end_ < kBufferSize) is_plain_ = IsPlain({buffer_.data(), end_});
  if (end_ == buffer_.size()) buffer_.resize(2 * buffer_.size());
}

bool QueueReader::Fill() {
  // Once the end was met it stays: what is appended to a live queue now may be the rest of a line
  // that was handed out.
  if (failed_ || at_end_) return false;
  MakeRoom();
  ssize_t count;
  do {
    count = read(fd_.get(), buffer_.data() + end_, buffer_.size() - end_);
  } while (count < 0 && errno == EINTR);
  failed_ = count < 0;
  at_end_ = count == 0;
  if (count <= 0) return false;
  const std::string_view added(buffer_.data() + end_, static_cast<size_t>(count));
  is_plain_ = is_plain_ && IsPlain(added);
  end_ += added.size();
  return true;
}

}  // namespace quarry::fileindex
