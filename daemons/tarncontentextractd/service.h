// Answering the daemon's requests. docs/extractor-protocol.md describes them.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_SERVICE_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_SERVICE_H_

#include <json/json.h>

#include <chrono>
#include <cstddef>
#include <string>
#include <vector>

#include "daemons/tarncontentextractd/attributes.h"
#include "daemons/tarncontentextractd/bad_files.h"
#include "daemons/tarncontentextractd/worker_pool.h"

namespace quarry::extract {

inline constexpr std::size_t kMaxBadFiles = 10000;
inline constexpr std::size_t kMaxBadFileBytes = std::size_t{8} << 20;

// A request for many documents is answered once there are so many bytes of them, or so much time
// has passed: whoever asks holds them all, and may have been told to stop.
inline constexpr std::size_t kManyBytes = std::size_t{1} << 20;
// A worker is given so many files at a time, and no further one once they have so many bytes: a
// slow one holds up those behind it.
inline constexpr std::size_t kFilesTogether = 8;
inline constexpr std::int64_t kBytesTogether = std::int64_t{256} << 10;
inline constexpr std::chrono::milliseconds kManyTime(300);

// Makes documents of files. Any thread, any number at once.
class ExtractService {
 public:
  // `pool` must outlive the object.
  explicit ExtractService(WorkerPool& pool) : pool_(pool) {}

  // The text of the answer to the text of a request. Throws nothing but std::bad_alloc.
  std::string Handle(const std::string& request);

  // The document of what stands at the absolute `path`: attributes, and with `need_meta` content
  // where it is a regular file whose content can be read. Throws Error 120 for a path that is none,
  // 914 when nothing can be said about it, and 502 when the daemon is stopping.
  Json::Value ParseFile(const std::string& path, bool need_meta);

 private:
  struct Draft;

  std::string Answer(const Json::Value& request);
  Draft Begin(const std::string& path, bool need_meta);
  Draft BeginAsked(const Json::Value& data);
  std::string ParseOne(Draft draft);
  std::string ParseMany(const Json::Value& data);
  Json::ArrayIndex ParseSome(const Json::Value& files, Json::ArrayIndex begin, std::string* out);
  void OpenContent(int place, Draft* draft);
  std::size_t ReadContents(std::vector<Draft>* drafts);
  void TakeContent(PoolResult result, Draft* draft);

  WorkerPool& pool_;
  BadFiles bad_files_{kMaxBadFiles, kMaxBadFileBytes};
};

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_SERVICE_H_
