#include "daemons/tarnelasticd/compression.h"

#include <zstd.h>

#include <memory>
#include <mutex>
#include <new>
#include <utility>
#include <vector>

#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::engine {
namespace {

// One level less takes a third less time and a thirtieth more room, one more a third more time.
constexpr int kLevel = 5;
// A request cannot bring more; a frame that claims more is damaged.
constexpr unsigned long long kMaxBytes = 1ULL << 30;

void CheckCompressed(std::size_t result) {
  if (ZSTD_isError(result) != 0) throw Error(kErrorEngineBusyMemory, ZSTD_getErrorName(result));
}

struct FreeContext {
  void operator()(ZSTD_CCtx* context) const { ZSTD_freeCCtx(context); }
  void operator()(ZSTD_DCtx* context) const { ZSTD_freeDCtx(context); }
};

// Setting up a context costs more than compressing a short text, and it keeps megabytes: there are
// as many as are used at once, not one for each thread that has ever used one.
template <typename Context, Context* (*create)()>
class Contexts {
 public:
  using Owned = std::unique_ptr<Context, FreeContext>;

  // One of the idle ones for as long as the object lives.
  class Lease {
   public:
    explicit Lease(Contexts* contexts) : contexts_(contexts), context_(contexts->Take()) {}
    ~Lease() { contexts_->Return(std::move(context_)); }
    Lease(const Lease&) = delete;
    Lease& operator=(const Lease&) = delete;
    Context* get() const { return context_.get(); }

   private:
    Contexts* contexts_;
    Owned context_;
  };

 private:
  Owned Take() {
    {
      const std::lock_guard<std::mutex> lock(mutex_);
      if (!idle_.empty()) {
        Owned taken = std::move(idle_.back());
        idle_.pop_back();
        return taken;
      }
    }
    Owned made(create());
    if (!made) throw Error(kErrorEngineBusyMemory, "Out of memory");
    return made;
  }

  // Without memory to note it, it is let go.
  void Return(Owned context) noexcept {
    try {
      const std::lock_guard<std::mutex> lock(mutex_);
      idle_.push_back(std::move(context));
    } catch (const std::bad_alloc&) {
    }
  }

  std::mutex mutex_;
  std::vector<Owned> idle_;  // guarded by mutex_
};

using Compressors = Contexts<ZSTD_CCtx, ZSTD_createCCtx>;
using Decompressors = Contexts<ZSTD_DCtx, ZSTD_createDCtx>;

template <typename Of>
Of& All() {
  static Of all;
  return all;
}

}  // namespace

// A text that comes back changed could not be taken out of the full text again, so each carries a
// checksum.
std::string Compress(std::string_view bytes) {
  const Compressors::Lease lease(&All<Compressors>());
  ZSTD_CCtx* const context = lease.get();
  CheckCompressed(ZSTD_CCtx_setParameter(context, ZSTD_c_compressionLevel, kLevel));
  CheckCompressed(ZSTD_CCtx_setParameter(context, ZSTD_c_checksumFlag, 1));
  // Not filled, since most of it will not be needed.
  const std::size_t room = ZSTD_compressBound(bytes.size());
  const std::unique_ptr<char[]> buffer(new char[room]);
  const std::size_t size = ZSTD_compress2(context, buffer.get(), room, bytes.data(), bytes.size());
  CheckCompressed(size);
  return std::string(buffer.get(), size);
}

std::string Decompress(std::string_view compressed) {
  const auto size = ZSTD_getFrameContentSize(compressed.data(), compressed.size());
  if (size > kMaxBytes) throw Error(kDamagedIndex, "A stored text is damaged");
  // Not filled: where a damaged frame claims too much, what is not written to takes no memory.
  const std::unique_ptr<char[]> buffer(new char[size]);
  const Decompressors::Lease lease(&All<Decompressors>());
  const std::size_t got =
      ZSTD_decompressDCtx(lease.get(), buffer.get(), size, compressed.data(), compressed.size());
  if (ZSTD_isError(got) != 0 || got != size) {
    throw Error(kDamagedIndex, "A stored text is damaged");
  }
  return std::string(buffer.get(), got);
}

}  // namespace quarry::engine
