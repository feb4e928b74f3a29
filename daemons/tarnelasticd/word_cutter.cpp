#include "daemons/tarnelasticd/word_cutter.h"

#include <algorithm>
#include <random>
#include <utility>

#include "daemons/tarnelasticd/fts_number.h"
#include "daemons/tarnelasticd/word_bytes.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kFirstSlots = 4096;
// Bytes of a place among the words of one text.
constexpr std::size_t kMostPlace = 4;
static_assert(WordCutter::kMaxText < std::size_t{1} << 7 * kMostPlace);
constexpr std::size_t kManyWords = std::size_t{64} << 10;  // of one text

// Whoever knows the seed could write texts whose words all meet in one place of the table. One for
// all, as hashes go from cutters to lists.
std::uint64_t ProcessSeed() {
  static const std::uint64_t seed = [] {
    std::random_device device;
    return std::uint64_t{device()} << 32 | device();
  }();
  return seed;
}

}  // namespace

WordCutter::WordCutter(const TextTokenizer& tokenizer)
    : tokenizer_(tokenizer), seed_(ProcessSeed()), slots_(kFirstSlots) {}

void WordCutter::Cut(const std::vector<std::string_view>& columns, CutText* cut) {
  *cut = CutText();
  std::size_t bytes = 0;
  for (const std::string_view text : columns) bytes += text.size();
  if (bytes > kMaxText) return;
  if (!is_clear_) Reset();
  is_clear_ = false;
  std::vector<std::size_t> starts;  // of the columns, in stream_
  has_long_word_ = false;
  for (const std::string_view text : columns) {
    starts.push_back(stream_.size());
    tokenizer_.EachWord(text, [this](std::string_view word) { TakeWord(word); });
    cut->sizes.push_back(stream_.size() - starts.back());
  }
  if (has_long_word_) {
    cut->sizes.clear();
  } else {
    PlacePositions();
    EncodePositions(starts, cut);
    cut->words = words_;
    cut->letters = letters_;
  }
  Clear();
}

void WordCutter::TakeWord(std::string_view word) {
  if (word.size() > kMaxWord) {
    has_long_word_ = true;
    return;
  }
  const std::uint64_t hash = HashWord(word, seed_);
  std::size_t slot = hash & (slots_.size() - 1);
  for (; slots_[slot] != 0; slot = (slot + 1) & (slots_.size() - 1)) {
    const std::uint32_t number = slots_[slot] - 1;
    const CutText::Word& known = words_[number];
    if (known.hash != hash || known.size != word.size()) continue;
    if (!AreEqualWords(letters_.data() + known.begin, word.data(), word.size())) continue;
    ++counts_[number];
    stream_.push_back(number);
    return;
  }
  const auto number = static_cast<std::uint32_t>(words_.size());
  words_.push_back({static_cast<std::uint32_t>(letters_.size()),
                    static_cast<std::uint32_t>(word.size()), hash, 0});
  letters_ += word;
  counts_.push_back(1);
  word_slots_.push_back(static_cast<std::uint32_t>(slot));
  slots_[slot] = number + 1;
  stream_.push_back(number);
  if (2 * words_.size() > slots_.size()) Grow();
}

void WordCutter::Grow() {
  slots_.assign(2 * slots_.size(), 0);
  for (std::uint32_t number = 0; number < words_.size(); ++number) {
    std::size_t slot = words_[number].hash & (slots_.size() - 1);
    while (slots_[slot] != 0) slot = (slot + 1) & (slots_.size() - 1);
    slots_[slot] = number + 1;
    word_slots_[number] = static_cast<std::uint32_t>(slot);
  }
}

// One large text must not cost every small one behind it, in time or in memory.
void WordCutter::Clear() {
  if (slots_.size() > kFirstSlots || stream_.size() > kManyWords) {
    Reset();
  } else {
    for (const std::uint32_t slot : word_slots_) slots_[slot] = 0;
    word_slots_.clear();
    counts_.clear();
    stream_.clear();
    words_.clear();
    letters_.clear();
  }
  is_clear_ = true;
}

void WordCutter::Reset() {
  std::vector<std::uint32_t>(kFirstSlots).swap(slots_);
  for (auto* numbers : {&word_slots_, &counts_, &stream_, &places_, &place_ends_}) {
    std::vector<std::uint32_t>().swap(*numbers);
  }
  std::vector<CutText::Word>().swap(words_);
  std::string().swap(letters_);
  std::string().swap(encoded_);
}

void WordCutter::PlacePositions() {
  place_ends_.resize(counts_.size());
  std::uint32_t sum = 0;
  for (std::size_t i = 0; i < counts_.size(); ++i) {
    place_ends_[i] = sum;
    sum += counts_[i];
  }
  places_.resize(stream_.size());
  for (std::size_t i = 0; i < stream_.size(); ++i) {
    places_[place_ends_[stream_[i]]++] = static_cast<std::uint32_t>(i);
  }
}

void WordCutter::EncodePositions(const std::vector<std::size_t>& starts, CutText* cut) {
  std::size_t used = 0;
  for (std::size_t i = 0; i < counts_.size(); ++i) {
    const std::size_t most = counts_[i] * kMostPlace + 2 * starts.size() * kMaxVarint;
    if (encoded_.size() < used + most) {
      encoded_.resize(std::max(used + most, 2 * encoded_.size()));
    }
    char* const begin = encoded_.data() + used;
    char* const end =
        EncodeWord(places_.data() + place_ends_[i] - counts_[i], counts_[i], starts, begin);
    words_[i].place_bytes = static_cast<std::uint32_t>(end - begin);
    used += words_[i].place_bytes;
  }
  cut->places.assign(encoded_, 0, used);
}

// Places as FTS5 writes them: each as the distance from the one before and 2, with 1 and its number
// before the first one of each column but the first column.
char* WordCutter::EncodeWord(const std::uint32_t* places, std::size_t count,
                             const std::vector<std::size_t>& starts, char* at) {
  std::size_t column = 0;
  std::size_t last = 0;
  for (std::size_t i = 0; i < count; ++i) {
    const std::size_t place = places[i];
    if (column + 1 < starts.size() && place >= starts[column + 1]) {
      while (column + 1 < starts.size() && place >= starts[column + 1]) ++column;
      *at++ = 1;
      at = PutVarint(at, column);
      last = 0;
    }
    const std::size_t position = place - starts[column];
    at = PutVarint(at, position - last + 2);
    last = position;
  }
  return at;
}

std::unique_ptr<WordCutters::Cutter> WordCutters::Take() {
  const std::lock_guard<std::mutex> lock(mutex_);
  if (idle_.empty()) {
    if (!db_) db_ = std::make_unique<Database>(":memory:");
    return std::make_unique<Cutter>(db_->handle());
  }
  std::unique_ptr<Cutter> taken = std::move(idle_.back());
  idle_.pop_back();
  return taken;
}

CutText WordCutters::Cut(const std::vector<std::string_view>& columns) {
  std::unique_ptr<Cutter> taken = Take();
  CutText cut;
  taken->cutter.Cut(columns, &cut);
  const std::lock_guard<std::mutex> lock(mutex_);
  idle_.push_back(std::move(taken));
  return cut;
}

}  // namespace quarry::engine
