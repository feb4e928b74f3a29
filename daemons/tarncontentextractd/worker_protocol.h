// What the daemon and a worker say to each other, on a pair of stream sockets.
//
// A message is a 4-byte length in the host's byte order and as many bytes. A worker's first message
// is kReady, or says what was wrong. Then it answers one request after another: a request is the
// extension of the file's name, with the file's descriptor attached; an answer is a list of fields.
// The daemon trusts no answer further than these functions check it.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_PROTOCOL_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_PROTOCOL_H_

#include <cstddef>
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

// The daemon's: does not block, since a worker that waits has emptied its channel. Returns false
// when the worker is gone or does not take the request.
bool SendRequest(int channel, const std::string& extension, int file);

// The worker's: each blocks until all is through, and returns false when the daemon is gone or
// breaks the rules.
bool ReceiveRequest(int channel, std::string* extension, UniqueFd* file);
bool SendAnswer(int channel, std::string_view text);

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_PROTOCOL_H_
