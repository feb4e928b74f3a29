// A short stand-in for a text, by which an index finds out that it has the text already.

#ifndef QUARRY_DAEMONS_TARNELASTICD_TEXT_HASH_H_
#define QUARRY_DAEMONS_TARNELASTICD_TEXT_HASH_H_

#include <cstddef>
#include <string>
#include <string_view>

namespace quarry::engine {

constexpr std::size_t kHashKeyBytes = 16;
constexpr std::size_t kTextHashBytes = 16;

// BLAKE2b of 128 bits, keyed. Who does not know the key cannot make two texts of one hash, nor one
// with the hash of somebody else's text, so equal hashes can be taken for equal texts. `key` has
// kHashKeyBytes. Any thread. Throws as RandomHashKey does.
std::string TextHash(std::string_view key, std::string_view text);

// A key that nobody can guess. Throws Error kErrorSystem when the system gives none.
std::string RandomHashKey();

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_TEXT_HASH_H_
