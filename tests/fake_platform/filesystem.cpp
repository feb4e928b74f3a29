// File systems, recycle bins, index paths and copying.

#include <cerrno>
#include <filesystem>
#include <string>
#include <system_error>

#include "platform/include/filesystem.h"
#include "platform/include/index_path.h"
#include "platform/include/recycle.h"
#include "tests/fake_platform/fake_platform.h"
#include "tests/fake_platform/world.h"

namespace fs = std::filesystem;

using quarry::fake::Called;
using quarry::fake::TheWorld;
using quarry::fake::World;
using quarry::fake::WorldLock;

namespace {

int Compose(const std::string& text, const std::string& subject, bool absolute, char* buffer,
            size_t size) {
  if (subject.empty() || (absolute && (subject[0] != '/' || subject == "/"))) return -1;
  return quarry::fake::CopyOut(text, buffer, size) ? 0 : -1;
}

// Decodes one character, or takes one byte of what is no UTF-8 as it is.
unsigned int NextCharacter(const unsigned char*& text) {
  const unsigned int first = *text++;
  const int more = first >= 0xF0 ? 3 : first >= 0xE0 ? 2 : first >= 0xC0 ? 1 : 0;
  unsigned int character = first & (0x7Fu >> more);
  for (int i = 0; i < more; ++i) {
    if ((text[i] & 0xC0) != 0x80) return first;
    character = (character << 6) | (text[i] & 0x3Fu);
  }
  text += more;
  return character;
}

// Simple folding of Latin, Greek and Cyrillic: enough for a test to tell it from byte order.
unsigned int Fold(unsigned int character) {
  const bool ascii = character >= 'A' && character <= 'Z';
  const bool latin = character >= 0xC0 && character <= 0xDE && character != 0xD7;
  const bool greek = character >= 0x391 && character <= 0x3A9;
  const bool cyrillic = character >= 0x410 && character <= 0x42F;
  return ascii || latin || greek || cyrillic ? character + 32 : character;
}

int Copy(const std::string& from, const std::string& to, bool move) {
  std::error_code error;
  if (!fs::exists(fs::symlink_status(from, error))) return 0;
  fs::copy(from, to,
           fs::copy_options::recursive | fs::copy_options::overwrite_existing |
               fs::copy_options::copy_symlinks,
           error);
  if (!error && move) fs::remove_all(from, error);
  if (!error) return 0;
  errno = error.value();
  return -1;
}

void Push(const std::set<std::string>& texts, HLIBCSZLIST** list) {
  for (const std::string& text : texts) HLIBCSzListPush(text.c_str(), list);
}

}  // namespace

extern "C" {

int TARNGetFSType(const char* path, int flags) {
  if (const auto failure = Called("TARNGetFSType", path, flags)) return failure->result;
  WorldLock lock(TheWorld().mutex);
  int type = 1;
  size_t longest = 0;
  for (const auto& [directory, its_type] : TheWorld().fs_types) {
    if (directory.size() < longest || !quarry::fake::IsWithin(path, directory)) continue;
    longest = directory.size();
    type = its_type;
  }
  return type;
}

int TARNFSIsRemoteFS(int type) {
  if (const auto failure = Called("TARNFSIsRemoteFS", type)) return failure->result;
  WorldLock lock(TheWorld().mutex);
  return TheWorld().remote_types.count(type) != 0 ? 1 : 0;
}

int TARNFSIsImageFS(int type) {
  if (const auto failure = Called("TARNFSIsImageFS", type)) return failure->result;
  WorldLock lock(TheWorld().mutex);
  return TheWorld().image_types.count(type) != 0 ? 1 : 0;
}

int TARNFSDirIsMntPoint(const char* path) {
  if (const auto failure = Called("TARNFSDirIsMntPoint", path)) return failure->result;
  WorldLock lock(TheWorld().mutex);
  return TheWorld().mount_points.count(path) != 0 ? 1 : 0;
}

int HLIBFhsPathInSnapshot(const char* path, int* in_snapshot) {
  const auto failure = Called("HLIBFhsPathInSnapshot", path);
  WorldLock lock(TheWorld().mutex);
  // Filled even by a call that fails, so that a caller who goes by it is found out.
  *in_snapshot = quarry::fake::IsWithinAny(path, TheWorld().snapshots) ? 1 : 0;
  return failure ? failure->result : 0;
}

int TARNEAIsHiddenDir(const char* name) {
  if (const auto failure = Called("TARNEAIsHiddenDir", name)) return failure->result;
  WorldLock lock(TheWorld().mutex);
  return TheWorld().hidden_names.count(name) != 0 ? 1 : 0;
}

int TARNACLPermGet(const char* path) {
  if (const auto failure = Called("TARNACLPermGet", path)) return failure->result;
  WorldLock lock(TheWorld().mutex);
  const auto found = TheWorld().acl_bits.find(path);
  return found == TheWorld().acl_bits.end() ? 7 : found->second;
}

int TARNQuotaIsEnough(const char* path, unsigned int uid, unsigned long long bytes) {
  if (const auto failure = Called("TARNQuotaIsEnough", path, uid, bytes)) return failure->result;
  World& world = TheWorld();
  WorldLock lock(world.mutex);
  if (!world.quota_enough) world.error_code = world.quota_error;
  return world.quota_enough ? 1 : 0;
}

int TARNFileCopy(const char* from, const char* to, TARNCOPYARGS* args) {
  bool rest_is_zero = true;
  for (const int value : args->reserved) rest_is_zero = rest_is_zero && value == 0;
  const std::string flags = "preserve=" + std::to_string(args->preserve) +
                            ", move=" + std::to_string(args->move) +
                            (rest_is_zero ? "" : ", others set");
  if (const auto failure = Called("TARNFileCopy", from, to, flags)) return failure->result;
  return Copy(from, to, args->move != 0);
}

int HLIBCUnicodeUTF8StrCaseCmp(const char* a, const char* b) {
  const auto* left = reinterpret_cast<const unsigned char*>(a);
  const auto* right = reinterpret_cast<const unsigned char*>(b);
  while (*left != 0 && *right != 0) {
    const unsigned int x = Fold(NextCharacter(left));
    const unsigned int y = Fold(NextCharacter(right));
    if (x != y) return x < y ? -1 : 1;
  }
  return static_cast<int>(*left != 0) - static_cast<int>(*right != 0);
}

int TARNShareIsShareRecycle(const char* full_path) {
  if (const auto failure = Called("TARNShareIsShareRecycle", full_path)) return failure->result;
  WorldLock lock(TheWorld().mutex);
  return quarry::fake::IsWithinAny(full_path, TheWorld().share_recycles) ? 1 : 0;
}

int TARNRecycleUserHomePathIsExist(const char* full_path, int kind) {
  const auto failure = Called("TARNRecycleUserHomePathIsExist", full_path, kind);
  if (failure) return failure->result;
  WorldLock lock(TheWorld().mutex);
  for (const auto& [auth, directories] : TheWorld().home_recycles) {
    if (quarry::fake::IsWithinAny(full_path, directories)) return 1;
  }
  return 0;
}

int TARNRecycleHomeEnumRecyclePath(HLIBCSZLIST** list) {
  if (const auto failure = Called("TARNRecycleHomeEnumRecyclePath")) return failure->result;
  for (const auto& [auth, directories] : TheWorld().home_recycles) Push(directories, list);
  return 0;
}

int TARNRecycleHomeEnumRecyclePathForAuthType(HLIBCSZLIST** list, AUTH_TYPE auth) {
  const auto failure = Called("TARNRecycleHomeEnumRecyclePathForAuthType", static_cast<int>(auth));
  if (failure) return failure->result;
  Push(TheWorld().home_recycles[auth], list);
  return 0;
}

int FILEIDXQueuePathCompose(const char* share_path, char* buffer, size_t size) {
  const auto failure = Called("FILEIDXQueuePathCompose", share_path, size);
  if (failure) return failure->result;
  return Compose(quarry::fake::QueuePath(share_path), share_path, true, buffer, size);
}

int FILEIDXDBPathCompose(const char* share_path, char* buffer, size_t size) {
  if (const auto failure = Called("FILEIDXDBPathCompose", share_path, size)) {
    return failure->result;
  }
  return Compose(quarry::fake::IndexPath(share_path), share_path, true, buffer, size);
}

int FILEIDXGetIndexID(const char* share_name, char* buffer, size_t size) {
  if (const auto failure = Called("FILEIDXGetIndexID", share_name, size)) return failure->result;
  return Compose(quarry::fake::IndexID(share_name), share_name, false, buffer, size);
}

}  // extern "C"
