#include "fileindex/util/file_type.h"

#include <map>

namespace quarry::fileindex {
namespace {

#include "fileindex/util/file_type_table.inc"

template <size_t size>
void AddAll(std::map<std::string, FileType>& table, const char* const (&extensions)[size],
            FileType type) {
  for (const char* extension : extensions) table.emplace(extension, type);
}

std::map<std::string, FileType> MakeTable() {
  std::map<std::string, FileType> table;
  AddAll(table, kDocumentExtensions, kDocument);
  AddAll(table, kAudioExtensions, kAudio);
  AddAll(table, kVideoExtensions, kVideo);
  AddAll(table, kImageExtensions, kImage);
  return table;
}

const std::map<std::string, FileType> kTable = MakeTable();

}  // namespace

#include "fileindex/util/file_type_queries.inc"

FileType GetFileTypeByFullPath(const std::string& full_path) {
  const auto found = kTable.find(GetFileExtension(full_path, true));
  return found == kTable.end() ? kOther : found->second;
}

}  // namespace quarry::fileindex
