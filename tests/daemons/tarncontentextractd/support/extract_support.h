// What the tests of the extractor share.

#ifndef QUARRY_TESTS_DAEMONS_TARNCONTENTEXTRACTD_SUPPORT_EXTRACT_SUPPORT_H_
#define QUARRY_TESTS_DAEMONS_TARNCONTENTEXTRACTD_SUPPORT_EXTRACT_SUPPORT_H_

#include <sys/types.h>

#include <map>
#include <string>
#include <vector>

#include "common/unique_fd.h"
#include "daemons/tarncontentextractd/extractor.h"

namespace quarry::extract {

using Fields = std::map<std::string, std::string>;

// All fields by name, numbers written out.
Fields ToMap(const std::vector<Field>& fields);

// What the standard formats find in a file of these bytes.
Fields ExtractBytes(const std::string& bytes, const std::string& extension);
// The text alone.
std::string TextOf(const std::string& bytes, const std::string& extension);

// `utf8` in another encoding, by the name that ICU knows it under.
std::string Encode(const std::string& utf8, const std::string& charset);
bool IsValidUtf8(const std::string& text);

// Throws std::runtime_error where the file cannot be opened.
UniqueFd OpenToRead(const std::string& path);

// The command of a worker whose formats do harm, and of the daemon's own worker.
std::vector<std::string> HostileWorker(const std::string& mode = "");
std::vector<std::string> RealWorker();

// What /proc/PID/status says under `key`; "" where there is no such process.
std::string ProcessStatus(pid_t pid, const std::string& key);

}  // namespace quarry::extract

#endif  // QUARRY_TESTS_DAEMONS_TARNCONTENTEXTRACTD_SUPPORT_EXTRACT_SUPPORT_H_
