// One indexed folder: a place inside a share, the kinds of content to index there, and its state.

#ifndef QUARRY_FILEINDEX_CONFIG_FOLDER_H_
#define QUARRY_FILEINDEX_CONFIG_FOLDER_H_

#include <json/json.h>

#include <string>

#include "common/export.h"

namespace quarry {
namespace fileindex {

// Every failure is an Error. A failed call leaves the record as it was. Share name and full path
// are worked out on first use and kept, so one object is for one thread at a time, const members
// too.
class QUARRY_EXPORT Folder {
 public:
  // `path` is a share path, "/" + share name + the place inside the share, in UTF-8; it is the
  // folder's identity. Nothing is checked.
  Folder(const std::string& path, const std::string& name, bool document, bool audio, bool video,
         bool photo, bool privileged, bool paused);

  // Reads an object as GetData() gives it. "privileged", "paused" and "volume_to_be_clean" may be
  // missing or of the wrong type. Throws Error 120 when `json` is no object, or when "path", "name"
  // or one of the four kinds is missing or of the wrong type. Nothing else is checked.
  explicit Folder(const Json::Value& json);

  const std::string& GetPath() const { return path_; }
  const std::string& GetName() const { return name_; }
  // The volume whose index data is still to be cleaned for this folder, or "".
  const std::string& GetVolumeToBeClean() const { return volume_to_be_clean_; }
  bool IsDocument() const { return document_; }
  bool IsAudio() const { return audio_; }
  bool IsVideo() const { return video_; }
  bool IsPhoto() const { return photo_; }
  bool IsPrivileged() const { return privileged_; }
  bool IsPaused() const { return paused_; }

  void SetPath(const std::string& path);
  void SetName(const std::string& name) { name_ = name; }
  void SetVolumeToBeClean(const std::string& volume) { volume_to_be_clean_ = volume; }
  void SetPaused(bool paused) { paused_ = paused; }

  // The name of the share. Throws Error 120 when the path does not begin with "/".
  std::string GetShare() const;

  // Puts `new_share` in the place of the path's share. A full path that was asked for before stays
  // as it was: for records that are saved and loaded anew. Throws as GetShare() does.
  void SetShare(const std::string& new_share);

  // The absolute path of the folder. Asks the platform the first time; throws Error 800 when the
  // share is not known, Error 120 as GetShare() does.
  std::string GetFullPath() const;

  // The whole record, as the folder list keeps it.
  Json::Value GetData() const;

  // The four kinds alone: "document", "audio", "video", "photo".
  Json::Value GetIndexCfg() const;

  // Whether the share's event queue still holds work at or below this folder. Reads the queue;
  // throws what opening or parsing it throws (800, 502, 906).
  bool IsIndexing() const;

  // Sets out["text"] to "error" (then out["desc"] is "invalid_path"), "need_reindex", "finished",
  // "paused" or "processing"; other members stay. Loads the status file and may read the queue.
  // Throws what these throw, and Error 120 when `out` is neither an object nor null.
  void GetStatus(Json::Value& out) const;

  // GetData(), and for each string in the array `additional` a member of that name below
  // "additional"; "status" is the only one there is. Throws Error 120 for anything else in
  // `additional`, and what GetStatus() throws.
  Json::Value GetDataWithAdditional(const Json::Value& additional) const;

 private:
  // The list asks every folder about every file, so it reads the texts without copying them.
  friend class FolderMgr;

  // What the path leads to. Not taken along by copies: each record asks for itself.
  struct Derived {
    Derived() = default;
    Derived(const Derived&) {}
    Derived& operator=(const Derived&) {
      share.clear();
      full_path.clear();
      return *this;
    }
    std::string share;
    std::string full_path;
  };

  const std::string& Share() const;
  const std::string& FullPath() const;
  // Whether the absolute path is that of this folder, or lies below it.
  bool Covers(const std::string& full_path) const;

  std::string path_;
  std::string name_;
  std::string volume_to_be_clean_;
  bool document_ = false;
  bool audio_ = false;
  bool video_ = false;
  bool photo_ = false;
  bool privileged_ = false;
  bool paused_ = false;
  mutable Derived derived_;
};

}  // namespace fileindex
}  // namespace quarry

#endif  // QUARRY_FILEINDEX_CONFIG_FOLDER_H_
