#include "daemons/tarncontentextractd/attributes.h"

#include <fcntl.h>

#include <cstdio>

#include "common/file_util.h"
#include "daemons/tarncontentextractd/stamp.h"

namespace quarry::extract {
namespace {

constexpr std::int64_t kBlockBytes = 512;

Json::Int64 Number(std::int64_t value) {
  return value;
}

std::string OctalMode(mode_t mode) {
  char text[16];
  std::snprintf(text, sizeof(text), "%04o", static_cast<unsigned>(mode) & 07777u);
  return text;
}

void SetNames(const std::string& path, Json::Value& document) {
  const std::string name = Basename(path);
  const std::string parent = Dirname(path);
  const std::string extension = GetFileExtension(path, true);
  document["TARNMDPath"] = path;
  document["TARNMDParent"] = parent.empty() ? "/" : parent;
  document["TARNMDFSName"] = name;
  document["TARNMDDisplayName"] = name;
  document["TARNMDExtension"] = extension;
  document["TARNMDKind"] = extension;
}

void SetOwnership(const struct stat& status, Json::Value& document) {
  document["TARNMDIsDir"] = S_ISDIR(status.st_mode);
  document["TARNMDOwnerUserID"] = std::to_string(status.st_uid);
  document["TARNMDOwnerGroupID"] = std::to_string(status.st_gid);
  document["TARNMDPrivilege"] = OctalMode(status.st_mode);
}

void SetSizes(const struct stat& status, Json::Value& document) {
  document["TARNMDFSSize"] = Number(status.st_size);
  document["TARNMDLogicalSize"] = Number(status.st_size);
  document["TARNMDPhysicalSize"] = Number(status.st_blocks * kBlockBytes);
}

void SetTimes(const Attributes& attributes, Json::Value& document) {
  const struct stat& status = attributes.status;
  document["TARNMDFSContentChangeDate"] = Number(status.st_mtim.tv_sec);
  document["TARNMDContentModificationDate"] = Number(status.st_mtim.tv_sec);
  document["TARNMDAttributeChangeDate"] = Number(status.st_ctim.tv_sec);
  document["TARNMDLastUsedDate"] = Number(status.st_atim.tv_sec);
  if (attributes.birth_time == 0) return;
  document["TARNMDFSCreationDate"] = Number(attributes.birth_time);
  document["TARNMDContentCreationDate"] = Number(attributes.birth_time);
  document["TARNMDDateAdded"] = Number(attributes.birth_time);
}

}  // namespace

bool ReadAttributes(int place, Attributes* out) {
  if (fstat(place, &out->status) != 0) return false;
  struct statx extended {};
  if (statx(place, "", AT_EMPTY_PATH, STATX_BTIME, &extended) == 0 &&
      (extended.stx_mask & STATX_BTIME) != 0) {
    out->birth_time = extended.stx_btime.tv_sec;
  }
  return true;
}

Json::Value AttributeDocument(const std::string& path, const Attributes& attributes) {
  Json::Value document(Json::objectValue);
  SetNames(path, document);
  SetOwnership(attributes.status, document);
  SetSizes(attributes.status, document);
  SetTimes(attributes, document);
  document[kAttributeStampField] = AttributeStamp(attributes.status);
  return document;
}

}  // namespace quarry::extract
