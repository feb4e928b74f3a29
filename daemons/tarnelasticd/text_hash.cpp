#include "daemons/tarnelasticd/text_hash.h"

#include <sodium.h>

#include "common/error.h"

namespace quarry::engine {
namespace {

static_assert(kHashKeyBytes >= crypto_generichash_KEYBYTES_MIN);
static_assert(kTextHashBytes >= crypto_generichash_BYTES_MIN);

void Prepare() {
  static const bool is_ready = sodium_init() >= 0;
  if (!is_ready) throw Error(kErrorSystem, "The system gives no random numbers");
}

unsigned char* Bytes(std::string* bytes) {
  return reinterpret_cast<unsigned char*>(bytes->data());
}

const unsigned char* Bytes(std::string_view bytes) {
  return reinterpret_cast<const unsigned char*>(bytes.data());
}

}  // namespace

std::string TextHash(std::string_view key, std::string_view text) {
  Prepare();
  std::string hash(kTextHashBytes, '\0');
  // It fails for lengths only, which are right here.
  crypto_generichash(Bytes(&hash), hash.size(), Bytes(text), text.size(), Bytes(key), key.size());
  return hash;
}

std::string RandomHashKey() {
  Prepare();
  std::string key(kHashKeyBytes, '\0');
  randombytes_buf(key.data(), key.size());
  return key;
}

}  // namespace quarry::engine
