#include "daemons/tarnelasticd/compression.h"

#include <zstd.h>

#include <memory>

#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::engine {
namespace {

// Text at this level costs less time than cutting it into words does.
constexpr int kLevel = 3;
// A request cannot bring more; a frame that claims more is damaged.
constexpr unsigned long long kMaxBytes = 1ULL << 30;

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

std::string Compress(std::string_view bytes) {
  std::string result(ZSTD_compressBound(bytes.size()), '\0');
  const std::size_t size =
      ZSTD_compressCCtx(ThreadContext<ZSTD_CCtx, ZSTD_createCCtx>(), result.data(), result.size(),
                        bytes.data(), bytes.size(), kLevel);
  if (ZSTD_isError(size) != 0) throw Error(kErrorEngineBusyMemory, ZSTD_getErrorName(size));
  result.resize(size);
  return result;
}

std::string Decompress(std::string_view compressed) {
  const auto size = ZSTD_getFrameContentSize(compressed.data(), compressed.size());
  if (size > kMaxBytes) throw Error(kDamagedIndex, "A stored text is damaged");
  std::string result(size, '\0');
  const std::size_t got =
      ZSTD_decompressDCtx(ThreadContext<ZSTD_DCtx, ZSTD_createDCtx>(), result.data(), result.size(),
                          compressed.data(), compressed.size());
  if (ZSTD_isError(got) != 0 || got != size) {
    throw Error(kDamagedIndex, "A stored text is damaged");
  }
  return result;
}

}  // namespace quarry::engine
