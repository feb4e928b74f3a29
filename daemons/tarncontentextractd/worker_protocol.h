// What the daemon and a worker say to each other, on a pair of stream sockets.
//
// A message is a 4-byte length in the host's byte order and as many bytes. A worker's first message
// is kReady, or says what was wrong. Then it answers requests in their order: a request is a 4-byte
// number and the extension of the file's name, with the file's descriptor attached; an answer is
// that number and a list of fields. The daemon trusts no answer further than these functions check
// it.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_PROTOCOL_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_PROTOCOL_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "common/unique_fd.h"
#include "daemons/tarncontentextractd/extractor.h"

namespace quarry::extract {

inline constexpr char kReady[] = "ready";
inline constexpr std::size_t kMaxExtensionBytes = 255;
inline constexpr std::size_t kMaxAnswerBytes = std::size_t{16} << 20;

// `text` behind its length.
std::string MakeMessage(std::string_view text);

// The fields as the bytes of an answer.
std::string EncodeFields(const std::vector<Field>& fields);

// Reads what EncodeFields wrote. Returns false, with `out` empty, for anything else: names must
// begin with "TARNMD" and consist of letters, texts must be UTF-8, numbers of fields and bytes keep
// within the bounds of extractor.h.
bool DecodeFields(std::string_view bytes, std::vector<Field>* out);

// The answer to the request of that number, as a message.
std::string MakeAnswer(std::uint32_t number, const std::vector<Field>& fields);

// Reads what MakeAnswer wrote, without the length. Returns false, with `out` empty, for anything
// else, another request's answer included.
bool ReadAnswer(std::string_view bytes, std::uint32_t number, std::vector<Field>* out);

struct Request {
  std::uint32_t number = 0;
  std::string extension;
  UniqueFd file;
};

// The daemon's: does not block. `file` stays the caller's. Returns false, with nothing sent, when
// the worker is gone or has too many requests before it.
bool SendRequest(int channel, std::uint32_t number, const std::string& extension, int file);

// The worker's. kNothing, where it need not wait, stands for no request yet; kEnd for a daemon that
// is gone or breaks the rules.
enum class Received { kRequest, kNothing, kEnd };
Received ReceiveRequest(int channel, bool wait, Request* request);

// The worker's: blocks until all is through, and returns false when the daemon is gone. `message`
// has its length in front; there may be several.
bool SendMessage(int channel, std::string_view message);

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_PROTOCOL_H_
