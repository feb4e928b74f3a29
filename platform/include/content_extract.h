// Reading a file into a document for the search index.

#ifndef QUARRY_PLATFORM_INCLUDE_CONTENT_EXTRACT_H_
#define QUARRY_PLATFORM_INCLUDE_CONTENT_EXTRACT_H_

#include <json/json.h>

#include <string>

#include "common/export.h"

// Fills `document` with the attributes of the file or directory at `path` and, where
// options["need_meta"] is true, with its content and embedded metadata. Blocks until the document
// is there. Throws std::runtime_error when there is no such file, or nobody answers. A file whose
// content cannot be read gives its attributes only. May be called from any thread.
QUARRY_EXPORT void TARN_CONTENT_EXTRACT_ParseFile(const std::string& path,
                                                  const Json::Value& options,
                                                  Json::Value& document);

#endif  // QUARRY_PLATFORM_INCLUDE_CONTENT_EXTRACT_H_
