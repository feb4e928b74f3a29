#include "daemons/tarnelasticd/compression.h"

#include <zstd.h>

#include <memory>

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

// Setting up a context costs more than compressing a short text, so each thread keeps its own.
template <typename Context, Context* (*create)()>
Context* ThreadContext() {
  thread_local std::unique_ptr<Context, FreeContext> context;
  if (!context) context.reset(create());
  if (!context) throw Error(kErrorEngineBusyMemory, "Out of memory");
  return context.get();
}

}  // namespace

// A text that comes back changed could not be taken out of the full text again, so each carries a
// checksum.
std::string Compress(std::string_view bytes) {
  ZSTD_CCtx* const context = ThreadContext<ZSTD_CCtx, ZSTD_createCCtx>();
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
  const std::size_t got =
      ZSTD_decompressDCtx(ThreadContext<ZSTD_DCtx, ZSTD_createDCtx>(), buffer.get(), size,
                          compressed.data(), compressed.size());
  if (ZSTD_isError(got) != 0 || got != size) {
    throw Error(kDamagedIndex, "A stored text is damaged");
  }
  return std::string(buffer.get(), got);
}

}  // namespace quarry::engine
