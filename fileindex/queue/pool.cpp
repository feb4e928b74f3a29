#include "fileindex/queue/pool.h"

#include <sys/mman.h>

#include <atomic>
#include <cstdint>
#include <new>

#include "fileindex/queue/large_pages.h"

#if defined(__has_feature)
#if __has_feature(address_sanitizer)
#define QUARRY_WATCHED_POOL 1
#endif
#endif
#if defined(__SANITIZE_ADDRESS__)
#define QUARRY_WATCHED_POOL 1
#endif
#ifdef QUARRY_WATCHED_POOL
#include <sanitizer/asan_interface.h>
#else
#define ASAN_POISON_MEMORY_REGION(place, size) static_cast<void>(0)
#define ASAN_UNPOISON_MEMORY_REGION(place, size) static_cast<void>(0)
#endif

namespace quarry::fileindex {
namespace {

constexpr std::size_t kChunkSize = kLargePage;  // and its alignment
// What a chunk that the pool still hands out from seems to hold, beside what it does.
constexpr std::size_t kOpen = SIZE_MAX / 2;

std::atomic<std::size_t> chunks_in_use{0};

void* Map(std::size_t size) {
  void* const place =
      mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (place == MAP_FAILED) throw std::bad_alloc();
  return place;
}

std::size_t Misalignment(const void* place) {
  return reinterpret_cast<std::uintptr_t>(place) % kChunkSize;
}

// A place for a chunk out of one that is twice as large.
void* MapAligned() {
  char* const wide = static_cast<char*>(Map(2 * kChunkSize));
  const std::size_t before = (kChunkSize - Misalignment(wide)) % kChunkSize;
  if (before > 0) munmap(wide, before);
  munmap(wide + before + kChunkSize, kChunkSize - before);
  return wide + before;
}

void* MapChunk() {
  void* const place = Map(kChunkSize);
  if (Misalignment(place) == 0) return place;
  munmap(place, kChunkSize);
  return MapAligned();
}

}  // namespace

struct Pool::Chunk {
  std::atomic<std::size_t> held{kOpen};
};

constinit thread_local Pool* Pool::in_use_ = nullptr;

std::size_t Pool::BytesInUse() {
  return chunks_in_use * kChunkSize;
}

// Most queues are short: only from the second chunk on is a large page asked for.
void Pool::Begin() {
  Finish();
  void* const place = MapChunk();
  ++chunks_in_use;
  if (is_large_) PreferLargePages(place, kChunkSize);
  chunk_ = new (place) Chunk;
  used_ = sizeof(Chunk);
  is_large_ = true;
  ASAN_POISON_MEMORY_REGION(static_cast<char*>(place) + used_, kChunkSize - used_);
}

void Pool::Finish() noexcept {
  if (chunk_ != nullptr) Release(*chunk_, kOpen - pieces_);
  chunk_ = nullptr;
  pieces_ = 0;
}

void* Pool::Allocate(std::size_t bytes) {
  const std::size_t size = (bytes + kAlignment - 1) / kAlignment * kAlignment;
  if (chunk_ == nullptr || size > kChunkSize - used_) Begin();
  char* const piece = reinterpret_cast<char*>(chunk_) + used_;
  ASAN_UNPOISON_MEMORY_REGION(piece, bytes);
  used_ += size;
  ++pieces_;
  return piece;
}

void Pool::Free(void* memory, [[maybe_unused]] std::size_t bytes) noexcept {
  ASAN_POISON_MEMORY_REGION(memory, bytes);
  char* const place = static_cast<char*>(memory);
  Release(*reinterpret_cast<Chunk*>(place - Misalignment(place)), 1);
}

void Pool::Release(Chunk& chunk, std::size_t pieces) noexcept {
  if (chunk.held.fetch_sub(pieces, std::memory_order_acq_rel) != pieces) return;
  ASAN_UNPOISON_MEMORY_REGION(&chunk, kChunkSize);
  munmap(&chunk, kChunkSize);
  --chunks_in_use;
}

}  // namespace quarry::fileindex
