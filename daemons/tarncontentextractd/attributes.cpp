#include "daemons/tarncontentextractd/attributes.h"

#include <fcntl.h>

#include <cstdio>
#include <string_view>
#include <utility>

#include "common/file_util.h"
#include "common/json_text.h"
#include "daemons/tarncontentextractd/stamp.h"

namespace quarry::extract {
namespace {

constexpr std::int64_t kBlockBytes = 512;

// An object in the making, as text.
class ObjectText {
 public:
  void Add(std::string_view name, std::string_view text) {
    AddName(name);
    AppendJsonString(&text_, text);
  }
  void Add(std::string_view name, std::int64_t number) {
    AddName(name);
    text_ += std::to_string(number);
  }
  void AddBool(std::string_view name, bool value) {
    AddName(name);
    text_ += value ? "true" : "false";
  }
  std::string Take() { return std::move(text_ += '}'); }

 private:
  void AddName(std::string_view name) {
    if (text_.size() > 1) text_ += ',';
    text_ += '"';
    text_ += name;
    text_ += "\":";
  }

  std::string text_ = "{";
};

std::string OctalMode(mode_t mode) {
  char text[16];
  std::snprintf(text, sizeof(text), "%04o", static_cast<unsigned>(mode) & 07777u);
  return text;
}

void SetNames(const std::string& path, ObjectText& document) {
  const std::string name = Basename(path);
  const std::string parent = Dirname(path);
  const std::string extension = GetFileExtension(path, true);
  document.Add("TARNMDPath", path);
  document.Add("TARNMDParent", parent.empty() ? "/" : parent);
  document.Add("TARNMDFSName", name);
  document.Add("TARNMDDisplayName", name);
  document.Add("TARNMDExtension", extension);
  document.Add("TARNMDKind", extension);
}

void SetOwnership(const struct stat& status, ObjectText& document) {
  document.AddBool("TARNMDIsDir", S_ISDIR(status.st_mode));
  document.Add("TARNMDOwnerUserID", std::to_string(status.st_uid));
  document.Add("TARNMDOwnerGroupID", std::to_string(status.st_gid));
  document.Add("TARNMDPrivilege", OctalMode(status.st_mode));
}

void SetSizes(const struct stat& status, ObjectText& document) {
  document.Add("TARNMDFSSize", std::int64_t{status.st_size});
  document.Add("TARNMDLogicalSize", std::int64_t{status.st_size});
  document.Add("TARNMDPhysicalSize", std::int64_t{status.st_blocks * kBlockBytes});
}

void SetTimes(const Attributes& attributes, ObjectText& document) {
  const struct stat& status = attributes.status;
  document.Add("TARNMDFSContentChangeDate", std::int64_t{status.st_mtim.tv_sec});
  document.Add("TARNMDContentModificationDate", std::int64_t{status.st_mtim.tv_sec});
  document.Add("TARNMDAttributeChangeDate", std::int64_t{status.st_ctim.tv_sec});
  document.Add("TARNMDLastUsedDate", std::int64_t{status.st_atim.tv_sec});
  if (attributes.birth_time == 0) return;
  document.Add("TARNMDFSCreationDate", std::int64_t{attributes.birth_time});
  document.Add("TARNMDContentCreationDate", std::int64_t{attributes.birth_time});
  document.Add("TARNMDDateAdded", std::int64_t{attributes.birth_time});
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

std::string AttributeText(const std::string& path, const Attributes& attributes) {
  ObjectText document;
  document.Add(kAttributeStampField, AttributeStamp(attributes.status));
  SetNames(path, document);
  SetOwnership(attributes.status, document);
  SetSizes(attributes.status, document);
  SetTimes(attributes, document);
  return document.Take();
}

}  // namespace quarry::extract
