// Keeping text small on disk.

#ifndef QUARRY_DAEMONS_TARNELASTICD_COMPRESSION_H_
#define QUARRY_DAEMONS_TARNELASTICD_COMPRESSION_H_

#include <string>
#include <string_view>

namespace quarry::engine {

// The same bytes give the same result as long as the compression library stays the same. Any
// thread. Throws Error kErrorEngineBusyMemory without memory.
std::string Compress(std::string_view bytes);

// The inverse. Throws Error kDamagedIndex for anything that Compress has not made.
std::string Decompress(std::string_view compressed);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_COMPRESSION_H_
