#include "daemons/tarnelasticd/word_lists.h"

#include <algorithm>
#include <cstring>

#include "daemons/tarnelasticd/fts_number.h"
#include "daemons/tarnelasticd/word_bytes.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kSlabBytes = std::size_t{256} << 10;
constexpr std::uint32_t kFirstBlock = 12;
constexpr std::uint32_t kLargestBlock = 1536;
constexpr std::size_t kFirstSlots = 4096;

// The first bytes of a word as a number that sorts as they do.
std::uint64_t SortKey(std::string_view word) {
  std::uint64_t key = 0;
  for (std::size_t i = 0; i < sizeof key; ++i) {
    key = key << 8 | (i < word.size() ? static_cast<unsigned char>(word[i]) : 0U);
  }
  return key;
}

}  // namespace

// Has the processor fetch what Find() will need for words to come, as waiting for memory would be
// most of the work.
void WordLists::Prefetch(const std::vector<CutText::Word>& words, std::size_t next) const {
  constexpr std::size_t kNear = 4;
  constexpr std::size_t kFar = 8;
  if (slots_.empty()) return;
  const auto slot_of = [this](const CutText::Word& word) {
    return &slots_[word.hash >> 32 & (slots_.size() - 1)];
  };
  if (next + kFar < words.size()) __builtin_prefetch(slot_of(words[next + kFar]));
  if (next + kNear >= words.size()) return;
  const Slot* const slot = slot_of(words[next + kNear]);
  if (slot->word != 0) __builtin_prefetch(&At(slot->word - 1));
}

void WordLists::Add(std::int64_t id, const CutText& text) {
  const char* places = text.places.data();
  for (std::size_t i = 0; i < text.words.size(); ++i) {
    Prefetch(text.words, i);
    const CutText::Word& cut = text.words[i];
    Word& word = Find(std::string_view(text.letters).substr(cut.begin, cut.size), cut.hash);
    char head[2 * kMaxVarint];
    char* const middle = PutVarint(head, static_cast<std::uint64_t>(id - word.last_id));
    char* const end = PutVarint(middle, std::uint64_t{2} * cut.place_bytes);
    word.last_id = id;
    Append(&word, head, static_cast<std::size_t>(end - head));
    Append(&word, places, cut.place_bytes);
    places += cut.place_bytes;
  }
}

WordLists::Word& WordLists::Find(std::string_view word, std::uint64_t hash) {
  if (2 * std::size_t{count_} >= slots_.size()) Grow();
  const auto short_hash = static_cast<std::uint32_t>(hash >> 32);
  std::size_t slot = short_hash & (slots_.size() - 1);
  for (; slots_[slot].word != 0; slot = (slot + 1) & (slots_.size() - 1)) {
    if (slots_[slot].hash != short_hash) continue;
    Word& known = At(slots_[slot].word - 1);
    if (known.size == word.size() && AreEqualWords(known.text, word.data(), word.size()))
      return known;
  }
  char* const text = Allocate(word.size());
  if (!word.empty()) std::memcpy(text, word.data(), word.size());
  char* const block = Allocate(kFirstBlock + sizeof(char*));
  Word& made = NewWord();
  made = {text,
          static_cast<std::uint32_t>(word.size()),
          short_hash,
          0,
          kFirstBlock,
          block,
          block,
          block + kFirstBlock,
          0};
  slots_[slot] = {short_hash, count_};
  return made;
}

WordLists::Word& WordLists::NewWord() {
  if (count_ % kChunkWords == 0) chunks_.emplace_back(new Word[kChunkWords]);
  return At(count_++);
}

void WordLists::Grow() {
  slots_.assign(std::max(kFirstSlots, 2 * slots_.size()), Slot{});
  for (std::uint32_t number = 0; number < count_; ++number) {
    std::size_t slot = At(number).hash & (slots_.size() - 1);
    while (slots_[slot].word != 0) slot = (slot + 1) & (slots_.size() - 1);
    slots_[slot] = {At(number).hash, number + 1};
  }
}

char* WordLists::Allocate(std::size_t bytes) {
  if (static_cast<std::size_t>(slab_end_ - slab_at_) < bytes) {
    slabs_.emplace_back(new char[kSlabBytes]);
    slab_at_ = slabs_.back().get();
    slab_end_ = slab_at_ + kSlabBytes;
  }
  char* const given = slab_at_;
  slab_at_ += bytes;
  return given;
}

void WordLists::Append(Word* word, const char* bytes, std::size_t size) {
  word->list_bytes += static_cast<std::uint32_t>(size);
  while (size > static_cast<std::size_t>(word->end - word->at)) {
    const auto room = static_cast<std::size_t>(word->end - word->at);
    std::memcpy(word->at, bytes, room);
    bytes += room;
    size -= room;
    word->block_bytes = std::min(2 * word->block_bytes, kLargestBlock);
    char* const block = Allocate(word->block_bytes + sizeof(char*));
    std::memcpy(word->end, &block, sizeof block);
    word->at = block;
    word->end = block + word->block_bytes;
  }
  std::memcpy(word->at, bytes, size);
  word->at += size;
}

void WordLists::CopyList(const Word& word, std::string* list) {
  list->clear();
  const char* block = word.first_block;
  std::uint32_t bytes = kFirstBlock;
  std::uint32_t left = word.list_bytes;
  while (left > bytes) {
    const char* next = nullptr;
    std::memcpy(&next, block + bytes, sizeof next);
    __builtin_prefetch(next);
    list->append(block, bytes);
    left -= bytes;
    block = next;
    bytes = std::min(2 * bytes, kLargestBlock);
  }
  list->append(block, left);
}

std::size_t WordLists::bytes() const {
  return slabs_.size() * kSlabBytes + chunks_.size() * kChunkWords * sizeof(Word) +
         slots_.size() * sizeof(Slot);
}

void WordLists::ForEach(const Visitor& visit) const {
  struct Place {
    std::uint64_t key;
    const Word* word;
  };
  std::vector<Place> order;
  order.reserve(count_);
  for (std::uint32_t number = 0; number < count_; ++number) {
    const Word& word = At(number);
    order.push_back({SortKey({word.text, word.size}), &word});
  }
  std::sort(order.begin(), order.end(), [](const Place& a, const Place& b) {
    if (a.key != b.key) return a.key < b.key;
    return std::string_view(a.word->text, a.word->size) <
           std::string_view(b.word->text, b.word->size);
  });
  // Words lie in the order in which they came, so each would be waited for.
  constexpr std::size_t kNear = 4;
  constexpr std::size_t kFar = 8;
  std::string list;
  for (std::size_t i = 0; i < order.size(); ++i) {
    if (i + kFar < order.size()) __builtin_prefetch(order[i + kFar].word);
    if (i + kNear < order.size()) __builtin_prefetch(order[i + kNear].word->first_block);
    const Word& word = *order[i].word;
    CopyList(word, &list);
    visit({word.text, word.size}, list);
  }
}

void WordLists::Clear() {
  chunks_.clear();
  count_ = 0;
  std::vector<Slot>().swap(slots_);
  slabs_.clear();
  slab_at_ = nullptr;
  slab_end_ = nullptr;
}

}  // namespace quarry::engine
