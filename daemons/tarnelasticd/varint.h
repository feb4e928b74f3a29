// Numbers in stored bytes: seven bits to a byte, the lowest first.

#ifndef QUARRY_DAEMONS_TARNELASTICD_VARINT_H_
#define QUARRY_DAEMONS_TARNELASTICD_VARINT_H_

#include <cstdint>
#include <string>
#include <string_view>

namespace quarry::engine {

void AppendNumber(std::string* out, std::uint64_t number);

// The number at the beginning of `bytes`, which goes on behind it. Throws Error kDamagedIndex where
// there is none.
std::uint64_t TakeNumber(std::string_view* bytes);

// As many bytes as the number at the beginning of `bytes` says, which goes on behind them. Throws
// as TakeNumber does.
std::string_view TakeCounted(std::string_view* bytes);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_VARINT_H_
