// Memory for the nodes and records of a tree, which come by the million and go together.

#ifndef QUARRY_FILEINDEX_QUEUE_POOL_H_
#define QUARRY_FILEINDEX_QUEUE_POOL_H_

#include <cstddef>
#include <memory>
#include <utility>

namespace quarry::fileindex {

template <typename T>
class PoolAllocator;

// Hands out memory piece by piece, in the order in which it lies there, from chunks of two
// megabytes: as few as these, the system can give and find as one page each. A chunk goes back to
// the system as soon as the pool has done with it and everything in it is gone, which may be after
// the pool: whoever keeps an object of a pool keeps its chunk. Objects may be let go by any thread,
// made by one at a time.
class Pool {
 public:
  Pool() = default;
  ~Pool() { Finish(); }
  Pool(const Pool&) = delete;
  Pool& operator=(const Pool&) = delete;

  template <typename T, typename... Args>
  std::shared_ptr<T> Make(Args&&... args) {
    in_use_ = this;
    return std::allocate_shared<T>(PoolAllocator<T>(), std::forward<Args>(args)...);
  }

  // How many bytes the chunks of all pools take.
  static std::size_t BytesInUse();

 private:
  template <typename T>
  friend class PoolAllocator;
  struct Chunk;
  static constexpr std::size_t kAlignment = alignof(void*);

  // Throws std::bad_alloc.
  void* Allocate(std::size_t bytes);
  static void Free(void* memory, std::size_t bytes) noexcept;
  static void Release(Chunk& chunk, std::size_t pieces) noexcept;
  void Begin();
  void Finish() noexcept;

  // The pool that is making an object: an allocator that knew it would take up room in each one.
  static constinit thread_local Pool* in_use_;

  Chunk* chunk_ = nullptr;  // the last one
  std::size_t used_ = 0;    // bytes of it
  std::size_t pieces_ = 0;  // handed out of it
  bool is_large_ = false;   // there is more than one
};

// For std::allocate_shared within Pool::Make.
template <typename T>
class PoolAllocator {
 public:
  using value_type = T;

  PoolAllocator() = default;
  template <typename Other>
  PoolAllocator(const PoolAllocator<Other>&) {}  // NOLINT(google-explicit-constructor)

  T* allocate(std::size_t count) {
    static_assert(alignof(T) <= Pool::kAlignment);
    return static_cast<T*>(Pool::in_use_->Allocate(count * sizeof(T)));
  }
  void deallocate(T* memory, std::size_t count) noexcept { Pool::Free(memory, count * sizeof(T)); }

  friend bool operator==(const PoolAllocator&, const PoolAllocator&) { return true; }
  friend bool operator!=(const PoolAllocator&, const PoolAllocator&) { return false; }
};

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_QUEUE_POOL_H_
