#include "daemons/tarnelasticd/word_runs.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <utility>

#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/fts_number.h"
#include "daemons/tarnelasticd/segment_reader.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kBuffer = std::size_t{64} << 10;

[[noreturn]] void FailSystem(const char* what) {
  const int saved = errno;
  const int code = saved == ENOSPC || saved == EDQUOT ? kDiskFull : kStorageFailed;
  throw Error(code, std::string(what) + ": " + strerror(saved));
}

// Some file systems know no file that never had a name.
int OpenNamed(const std::string& directory) {
  std::string path = directory + "/words-XXXXXX";
  const int file = mkostemp(path.data(), O_CLOEXEC);
  if (file >= 0) unlink(path.c_str());
  return file;
}

}  // namespace

// Goes through the words of a run.
class WordRuns::Reader {
 public:
  Reader(int file, const Run& run) : file_(file), next_(run.begin), end_(run.end) {}

  // Moves to the next word; false behind the last one.
  bool Next() {
    begin_ += word_.size() + list_.size();
    if (begin_ == bytes_.size() && next_ == end_) return false;
    const std::size_t word = TakeSize();
    const std::size_t list = TakeSize();
    Have(word + list);
    word_ = std::string_view(bytes_).substr(begin_, word);
    list_ = std::string_view(bytes_).substr(begin_ + word, list);
    return true;
  }

  std::string_view word() const { return word_; }
  std::string_view list() const { return list_; }

 private:
  std::size_t TakeSize() {
    Have(std::min(bytes_.size() - begin_ + static_cast<std::size_t>(end_ - next_),
                  static_cast<std::size_t>(kMaxVarint)));
    const char* const begin = bytes_.data() + begin_;
    const char* at = begin;
    const std::uint64_t size = TakeVarint(&at, bytes_.data() + bytes_.size());
    begin_ += static_cast<std::size_t>(at - begin);
    return static_cast<std::size_t>(size);
  }

  // Reads until so many bytes are there.
  void Have(std::size_t size) {
    if (bytes_.size() - begin_ >= size) return;
    bytes_.erase(0, begin_);
    begin_ = 0;
    std::size_t have = bytes_.size();
    const auto rest = static_cast<std::size_t>(end_ - next_);
    bytes_.resize(have + std::min(rest, std::max(size - have, kBuffer)));
    while (have < bytes_.size()) {
      const ssize_t got = pread(file_, bytes_.data() + have, bytes_.size() - have, next_);
      if (got < 0 && errno == EINTR) continue;
      if (got < 0) FailSystem("Cannot read what was kept of words");
      if (got == 0) break;
      have += static_cast<std::size_t>(got);
      next_ += got;
    }
    if (have < size || have < bytes_.size()) {
      throw Error(kStorageFailed, "What was kept of words is gone");
    }
  }

  const int file_;
  std::int64_t next_;  // in the file, behind bytes_
  const std::int64_t end_;
  std::string bytes_;
  std::size_t begin_ = 0;  // of what is not done with, in bytes_
  std::string_view word_;
  std::string_view list_;
};

void WordRuns::Open() {
  if (file_.valid()) return;
  file_ = UniqueFd(open(directory_.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600));
  if (!file_.valid()) file_ = UniqueFd(OpenNamed(directory_));
  if (!file_.valid()) FailSystem("Cannot keep words");
}

void WordRuns::Write(std::string* bytes) {
  for (std::size_t done = 0; done < bytes->size();) {
    const ssize_t put = pwrite(file_.get(), bytes->data() + done, bytes->size() - done, written_);
    if (put < 0 && errno == EINTR) continue;
    if (put < 0) FailSystem("Cannot keep words");
    done += static_cast<std::size_t>(put);
    written_ += put;
  }
  bytes->clear();
}

void WordRuns::Add(const WordLists& lists) {
  Open();
  const std::int64_t begin = written_;
  std::string bytes;
  bytes.reserve(2 * kBuffer);
  lists.ForEach([&](std::string_view word, std::string_view list) {
    AppendVarint(&bytes, word.size());
    AppendVarint(&bytes, list.size());
    bytes += word;
    bytes += list;
    if (bytes.size() >= kBuffer) Write(&bytes);
  });
  Write(&bytes);
  if (written_ > begin) runs_.push_back({begin, written_});
}

void WordRuns::ForEach(const Visitor& visit) const {
  std::vector<std::unique_ptr<Reader>> readers;
  for (const Run& run : runs_) {
    readers.push_back(std::make_unique<Reader>(file_.get(), run));
    if (!readers.back()->Next()) readers.pop_back();
  }
  std::vector<std::string_view> lists;
  while (!readers.empty()) {
    std::string_view word = readers.front()->word();
    for (const auto& reader : readers) word = std::min(word, reader->word());
    lists.clear();
    for (const auto& reader : readers) {
      if (reader->word() == word) lists.push_back(reader->list());
    }
    visit(word, lists);
    const std::string done(word);
    for (auto& reader : readers) {
      if (reader->word() == done && !reader->Next()) reader.reset();
    }
    std::erase(readers, nullptr);
  }
}

void WordRuns::Clear() {
  file_.Reset();
  written_ = 0;
  runs_.clear();
}

}  // namespace quarry::engine
