// Reading a queue file line by line.

#ifndef QUARRY_FILEINDEX_QUEUE_QUEUE_READER_H_
#define QUARRY_FILEINDEX_QUEUE_QUEUE_READER_H_

#include <string>
#include <string_view>
#include <vector>

#include "common/unique_fd.h"

namespace quarry::fileindex {

class QueueReader {
 public:
  // Opens the file. When that fails, failed() is true and errno says why.
  explicit QueueReader(const std::string& path);

  // The next line without its newline, of any bytes and any length; the last one need not be ended.
  // False at the end of the file, also if it grows thereafter, and when reading fails: then
  // failed() is true and errno says why. The line stays where it is until a call without
  // has_line().
  bool Next(std::string_view& line);

  // Whether the line that Next handed out last is known to have neither backslashes nor NUL bytes:
  // for the whole buffer at once, that is found out in no time.
  bool is_plain() const { return is_plain_; }

  // Whether the next line is at hand, whole.
  bool has_line() const { return newline_ != nullptr; }

  bool failed() const { return failed_; }

  // Whether the line that Next handed out last had its newline.
  bool line_ended() const { return line_ended_; }

 private:
  void FindNewline();
  bool Fill();
  void MakeRoom();

  UniqueFd fd_;
  bool failed_;
  bool at_end_ = false;
  bool line_ended_ = false;
  bool is_plain_ = true;  // the buffer
  std::vector<char> buffer_;
  size_t begin_ = 0;  // what has not been handed out yet is buffer_[begin_, end_)
  size_t end_ = 0;
  const char* newline_ = nullptr;  // the first one there
  size_t searched_ = 0;            // without one, there is none before
};

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_QUEUE_QUEUE_READER_H_
