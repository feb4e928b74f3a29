// What kind of file a name promises.

#ifndef QUARRY_FILEINDEX_UTIL_FILE_TYPE_H_
#define QUARRY_FILEINDEX_UTIL_FILE_TYPE_H_

#include <string>

#include "common/export.h"
#include "common/file_util.h"

namespace quarry::fileindex {

using quarry::GetFileExtension;

// The categories. The first four answer to the folder switches "document", "audio", "video" and
// "photo"; no switch covers kOther.
enum FileType : int {
  kDocument = 0,
  kAudio = 1,
  kVideo = 2,
  kImage = 3,
  kOther = 4,
};

// The category of a file by the extension of its name alone, without regard to ASCII case; no file
// is looked at. A name without extension is a document, an unknown extension is kOther. May be
// called from any thread.
QUARRY_EXPORT FileType GetFileTypeByFullPath(const std::string& full_path);

// A category's name and the search-engine query that matches its extensions. The queries are short
// and hand-picked, and no list of what GetFileTypeByFullPath knows.
struct FileTypeQuery {
  const char* name;
  const char* query;
};
QUARRY_EXPORT extern const FileTypeQuery kDocumentQuery;
QUARRY_EXPORT extern const FileTypeQuery kAudioQuery;
QUARRY_EXPORT extern const FileTypeQuery kVideoQuery;
QUARRY_EXPORT extern const FileTypeQuery kImageQuery;

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_UTIL_FILE_TYPE_H_
