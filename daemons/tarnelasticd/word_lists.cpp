#include "daemons/tarnelasticd/word_lists.h"

#include <algorithm>
#include <cstring>
#include <random>

#include "daemons/tarnelasticd/fts_number.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kSlabBytes = std::size_t{256} << 10;
constexpr std::uint32_t kFirstBlock = 12;
constexpr std::uint32_t kLargestBlock = 1536;
constexpr std::size_t kFirstSlots = 4096;
constexpr std::size_t kManyWords = std::size_t{64} << 10;  // of one text

// Whoever knows the seed could write texts whose words all meet in one place of the table.
std::uint64_t RandomSeed() {
  std::random_device device;
  return std::uint64_t{device()} << 32 | device();
}

std::uint64_t Mix(std::uint64_t hash, std::uint64_t bytes) {
  hash = (hash ^ bytes) * 0x9e3779b97f4a7c15U;
  return hash ^ hash >> 32;
}

std::uint64_t Load(const char* at, std::size_t size) {
  std::uint64_t bytes = 0;
  if (size == sizeof(std::uint64_t)) {
    std::memcpy(&bytes, at, sizeof(std::uint64_t));
  } else {
    std::memcpy(&bytes, at, sizeof(std::uint32_t));
  }
  return bytes;
}

// Up to eight bytes as one number. Loads that overlap are cheaper than one of any size.
std::uint64_t LoadShort(const char* at, std::size_t size) {
  if (size == 8) return Load(at, 8);
  if (size >= 4) return Load(at, 4) | Load(at + size - 4, 4) << 32;
  if (size == 0) return 0;
  const auto byte = [at](std::size_t i) {
    return std::uint64_t{static_cast<unsigned char>(at[i])};
  };
  return byte(0) | byte(size / 2) << 8 | byte(size - 1) << 16;
}

std::uint64_t HashOf(std::string_view word, std::uint64_t seed) {
  std::uint64_t hash = Mix(seed, word.size());
  for (; word.size() > 8; word.remove_prefix(8)) hash = Mix(hash, Load(word.data(), 8));
  return Mix(Mix(hash, LoadShort(word.data(), word.size())), seed);
}

// Nearly all words are that short, for which a call would cost more than the comparison.
bool AreEqual(const char* a, const char* b, std::size_t size) {
  if (size <= 8) return LoadShort(a, size) == LoadShort(b, size);
  if (size > 16) return std::memcmp(a, b, size) == 0;
  return Load(a, 8) == Load(b, 8) && Load(a + size - 8, 8) == Load(b + size - 8, 8);
}

// The first bytes of a word as a number that sorts as they do.
std::uint64_t SortKey(std::string_view word) {
  std::uint64_t key = 0;
  for (std::size_t i = 0; i < sizeof key; ++i) {
    key = key << 8 | (i < word.size() ? static_cast<unsigned char>(word[i]) : 0U);
  }
  return key;
}

}  // namespace

WordLists::WordLists(const TextTokenizer& tokenizer)
    : tokenizer_(tokenizer), seed_(RandomSeed()), local_slots_(kFirstSlots) {}

std::vector<std::size_t> WordLists::Add(std::int64_t id,
                                        const std::vector<std::string_view>& columns) {
  std::size_t bytes = 0;
  for (const std::string_view text : columns) bytes += text.size();
  if (bytes > kMaxText) return {};
  std::vector<std::size_t> sizes;
  std::vector<std::size_t> starts;  // of the columns, in stream_
  has_long_word_ = false;
  for (const std::string_view text : columns) {
    starts.push_back(stream_.size());
    tokenizer_.EachWord(text, [this](std::string_view word) { TakeWord(word); });
    sizes.push_back(stream_.size() - starts.back());
  }
  if (has_long_word_) {
    sizes.clear();
  } else {
    PlacePositions();
    Store(id, starts);
  }
  ClearLocal();
  return sizes;
}

void WordLists::TakeWord(std::string_view word) {
  if (word.size() > kMaxWord) {
    has_long_word_ = true;
    return;
  }
  const std::uint64_t hash = HashOf(word, seed_);
  std::size_t slot = hash & (local_slots_.size() - 1);
  for (; local_slots_[slot] != 0; slot = (slot + 1) & (local_slots_.size() - 1)) {
    Local& known = locals_[local_slots_[slot] - 1];
    if (known.hash != hash || known.size != word.size()) continue;
    if (!AreEqual(folded_.data() + known.begin, word.data(), word.size())) continue;
    ++known.count;
    stream_.push_back(local_slots_[slot] - 1);
    return;
  }
  const auto number = static_cast<std::uint32_t>(locals_.size());
  locals_.push_back({static_cast<std::uint32_t>(folded_.size()),
                     static_cast<std::uint32_t>(word.size()), hash,
                     static_cast<std::uint32_t>(slot), 1});
  folded_ += word;
  local_slots_[slot] = number + 1;
  stream_.push_back(number);
  if (2 * locals_.size() > local_slots_.size()) GrowLocal();
}

void WordLists::GrowLocal() {
  local_slots_.assign(2 * local_slots_.size(), 0);
  for (std::uint32_t number = 0; number < locals_.size(); ++number) {
    std::size_t slot = locals_[number].hash & (local_slots_.size() - 1);
    while (local_slots_[slot] != 0) slot = (slot + 1) & (local_slots_.size() - 1);
    local_slots_[slot] = number + 1;
    locals_[number].slot = static_cast<std::uint32_t>(slot);
  }
}

// One large text must not cost every small one behind it, in time or in memory.
void WordLists::ClearLocal() {
  if (local_slots_.size() > kFirstSlots || stream_.size() > kManyWords) {
    std::vector<std::uint32_t>(kFirstSlots).swap(local_slots_);
    std::vector<std::uint32_t>().swap(place_ends_);
    std::string().swap(encoded_);
    std::vector<std::uint32_t>().swap(stream_);
    std::vector<std::uint32_t>().swap(places_);
    std::vector<Local>().swap(locals_);
    std::string().swap(folded_);
    return;
  }
  for (const Local& local : locals_) local_slots_[local.slot] = 0;
  locals_.clear();
  stream_.clear();
  folded_.clear();
}

void WordLists::PlacePositions() {
  place_ends_.resize(locals_.size());
  std::uint32_t sum = 0;
  for (std::size_t i = 0; i < locals_.size(); ++i) {
    place_ends_[i] = sum;
    sum += locals_[i].count;
  }
  places_.resize(stream_.size());
  for (std::size_t i = 0; i < stream_.size(); ++i) {
    places_[place_ends_[stream_[i]]++] = static_cast<std::uint32_t>(i);
  }
}

// Has the processor fetch what Find() will need for words to come, as waiting for memory would be
// most of the work.
void WordLists::Prefetch(std::size_t local) const {
  constexpr std::size_t kNear = 4;
  constexpr std::size_t kFar = 8;
  if (slots_.empty()) return;
  const auto slot_of = [this](const Local& word) {
    return &slots_[word.hash >> 32 & (slots_.size() - 1)];
  };
  if (local + kFar < locals_.size()) __builtin_prefetch(slot_of(locals_[local + kFar]));
  if (local + kNear >= locals_.size()) return;
  const Slot* const slot = slot_of(locals_[local + kNear]);
  if (slot->word != 0) __builtin_prefetch(&words_[slot->word - 1]);
}

void WordLists::Store(std::int64_t id, const std::vector<std::size_t>& starts) {
  for (std::size_t i = 0; i < locals_.size(); ++i) {
    Prefetch(i);
    const Local& local = locals_[i];
    const std::size_t size =
        EncodePositions(places_.data() + place_ends_[i] - local.count, local.count, starts);
    Word& word = Find(std::string_view(folded_).substr(local.begin, local.size), local.hash);
    char head[2 * kMaxVarint];
    char* const middle = PutVarint(head, static_cast<std::uint64_t>(id - word.last_id));
    char* const end = PutVarint(middle, 2 * size);
    word.last_id = id;
    Append(&word, head, static_cast<std::size_t>(end - head));
    Append(&word, encoded_.data(), size);
  }
}

// Places as FTS5 writes them: each as the distance from the one before and 2, with 1 and its number
// before the first one of each column but the first column.
std::size_t WordLists::EncodePositions(const std::uint32_t* places, std::size_t count,
                                       const std::vector<std::size_t>& starts) {
  const std::size_t most = (count + 2 * starts.size()) * kMaxVarint;
  if (encoded_.size() < most) encoded_.resize(most);
  char* at = encoded_.data();
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
  return static_cast<std::size_t>(at - encoded_.data());
}

WordLists::Word& WordLists::Find(std::string_view word, std::uint64_t hash) {
  if (2 * words_.size() >= slots_.size()) Grow();
  const auto short_hash = static_cast<std::uint32_t>(hash >> 32);
  std::size_t slot = short_hash & (slots_.size() - 1);
  for (; slots_[slot].word != 0; slot = (slot + 1) & (slots_.size() - 1)) {
    if (slots_[slot].hash != short_hash) continue;
    Word& known = words_[slots_[slot].word - 1];
    if (known.size == word.size() && AreEqual(known.text, word.data(), word.size())) return known;
  }
  char* const text = Allocate(word.size());
  if (!word.empty()) std::memcpy(text, word.data(), word.size());
  char* const block = Allocate(kFirstBlock + sizeof(char*));
  words_.push_back({text, static_cast<std::uint32_t>(word.size()), short_hash, 0, kFirstBlock,
                    block, block, block + kFirstBlock, 0});
  slots_[slot] = {short_hash, static_cast<std::uint32_t>(words_.size())};
  return words_.back();
}

void WordLists::Grow() {
  slots_.assign(std::max(kFirstSlots, 2 * slots_.size()), Slot{});
  for (std::uint32_t number = 0; number < words_.size(); ++number) {
    std::size_t slot = words_[number].hash & (slots_.size() - 1);
    while (slots_[slot].word != 0) slot = (slot + 1) & (slots_.size() - 1);
    slots_[slot] = {words_[number].hash, number + 1};
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
  for (std::uint32_t left = word.list_bytes;;) {
    const std::uint32_t part = std::min(left, bytes);
    list->append(block, part);
    left -= part;
    if (left == 0) return;
    std::memcpy(&block, block + bytes, sizeof block);
    bytes = std::min(2 * bytes, kLargestBlock);
  }
}

std::size_t WordLists::bytes() const {
  return slabs_.size() * kSlabBytes + words_.capacity() * sizeof(Word) +
         slots_.size() * sizeof(Slot);
}

void WordLists::ForEach(const Visitor& visit) const {
  struct Place {
    std::uint64_t key;
    const Word* word;
  };
  std::vector<Place> order;
  order.reserve(words_.size());
  for (const Word& word : words_) order.push_back({SortKey({word.text, word.size}), &word});
  std::sort(order.begin(), order.end(), [](const Place& a, const Place& b) {
    if (a.key != b.key) return a.key < b.key;
    return std::string_view(a.word->text, a.word->size) <
           std::string_view(b.word->text, b.word->size);
  });
  std::string list;
  for (const Place& place : order) {
    CopyList(*place.word, &list);
    visit({place.word->text, place.word->size}, list);
  }
}

void WordLists::Clear() {
  std::vector<Word>().swap(words_);
  std::vector<Slot>().swap(slots_);
  slabs_.clear();
  slab_at_ = nullptr;
  slab_end_ = nullptr;
}

}  // namespace quarry::engine
