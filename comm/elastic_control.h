// The commands of the search engine: one index per share, one document per file or directory, keyed
// by its full path.
//
// All commands go through SendRequest (comm/comm.h): they block while the engine is busy and throw
// what it throws, the engine's own codes unchanged. No function keeps state; all may be called from
// several threads at once. Shares are given by name, places by absolute path without a trailing
// "/", both as byte strings in UTF-8.

#ifndef QUARRY_COMM_ELASTIC_CONTROL_H_
#define QUARRY_COMM_ELASTIC_CONTROL_H_

#include <json/json.h>

#include <string>
#include <vector>

#include "common/export.h"

namespace quarry::fileindex::elastic {

// Fields of a document.
inline constexpr char kFieldPath[] = "TARNMDPath";
inline constexpr char kFieldParent[] = "TARNMDParent";
inline constexpr char kFieldFSName[] = "TARNMDFSName";
inline constexpr char kFieldSearchFileName[] = "TARNMDSearchFileName";
inline constexpr char kFieldDisplayName[] = "TARNMDDisplayName";
inline constexpr char kFieldKind[] = "TARNMDKind";
inline constexpr char kFieldExtension[] = "TARNMDExtension";

// The extractor's option: whether content and embedded metadata are wanted beside attributes.
inline constexpr char kOptionNeedMeta[] = "need_meta";

// The extractor's service, and where it keeps its process id and its shared memory.
inline constexpr char kContentExtractDaemon[] = "tarncontentextractd";
QUARRY_EXPORT extern const std::string kContentExtractPidPath;
QUARRY_EXPORT extern const std::string kContentExtractShmPath;

// The engine's name for the index of a share.
QUARRY_EXPORT std::string GetFileIndexID(const std::string& share);

// What an index is created with: its settings (none), its fields, and the module that the engine
// loads for it. The latter two throw Error 502 when the built-in text is not JSON.
QUARRY_EXPORT Json::Value GetFileIndexSettings();
QUARRY_EXPORT Json::Value GetFileIndexMappings();
QUARRY_EXPORT Json::Value GetFileIndexEventHandler();

// Creates the share's index in the directory that the platform gives it. Throws also Error 800 for
// an unknown share, and Error 502 when the platform gives no directory.
QUARRY_EXPORT void ShareIndexCreate(const std::string& share);
// Each needs no share of that name any more, only the engine's index.
QUARRY_EXPORT void ShareIndexDelete(const std::string& share);
QUARRY_EXPORT void ShareIndexPause(const std::string& share);
QUARRY_EXPORT void ShareIndexResume(const std::string& share);

// Makes the index of `old_share` that of `new_share`, kept in the directory `new_db_path`.
QUARRY_EXPORT void ShareIndexRename(const std::string& old_share, const std::string& new_share,
                                    const std::string& new_db_path);
// Makes the engine use the directory `new_db_path` for the share's index.
QUARRY_EXPORT void ShareIndexMigrate(const std::string& share, const std::string& new_db_path);

// Deletes one document.
QUARRY_EXPORT void IndexDel(const std::string& share, const std::string& path);
// Deletes what lies below `dir`, but not the document of `dir` itself.
QUARRY_EXPORT void IndexDelDir(const std::string& share, const std::string& dir);

// Reads the file and replaces its whole document; its content is read only with `need_meta`. Blocks
// while the extractor reads. Throws also Error 914 when the extractor cannot tell anything about
// the file; nothing is sent then.
QUARRY_EXPORT void IndexUpsert(const std::string& share, const std::string& path, bool need_meta);
// Reads the file's attributes and merges them into its document. Blocks and throws as above.
QUARRY_EXPORT void IndexAttr(const std::string& share, const std::string& path);

// Moves the document of `old_path`, and all documents below it, to `new_path`; note the order of
// the arguments. Throws also Error 916 when the engine's list of what lies below is malformed, and
// Error 120 when one of its documents is; only the document of `old_path` has been moved then.
// Documents that the engine cannot move are logged and left.
QUARRY_EXPORT void IndexRename(const std::string& share, const std::string& new_path,
                               const std::string& old_path);

// Appends to `out` the paths of all documents below the directory `prefix`, in the engine's order.
// `id` is the engine's name of an index, not a share's name. Throws as IndexRename does; `out` then
// holds the paths up to the malformed one.
QUARRY_EXPORT void IndexGetByPrefixPath(const std::string& id, const std::string& prefix,
                                        std::vector<std::string>& out);

// Makes durable what was sent for the share. When that fails and the share's volume is full, the
// share is marked as needing a reindex and Error 1003 is thrown instead of the engine's. Throws
// Error 800 when it fails for a share that is gone, and what StatusMgr throws when the share cannot
// be marked.
QUARRY_EXPORT void IndexCommit(const std::string& share);

// Refreshes the term suggestions of the index named `db_name` from the documents `fields`. Sends
// nothing when there are none.
QUARRY_EXPORT void UpdateTermSuggestion(const std::string& db_name,
                                        const std::vector<std::string>& fields);

}  // namespace quarry::fileindex::elastic

#endif  // QUARRY_COMM_ELASTIC_CONTROL_H_
