// The search index of one share as a worker sees it.

#ifndef QUARRY_DAEMONS_FILEINDEXD_INDEX_H_
#define QUARRY_DAEMONS_FILEINDEXD_INDEX_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace quarry::fileindexd {

// What the index remembers about a place, as far as comparing needs it.
struct Document {
  std::string path;
  bool is_dir = false;
  std::string attribute_stamp;  // empty: none was kept
  std::string content_stamp;    // empty: its content was not asked for
};

// A document that is to be made anew, its content with `need_meta`.
struct Wish {
  std::string path;
  bool need_meta = false;
};

// Places are absolute paths without a "/" at their end. Every member blocks until the engine has
// answered, throws Error, and may be called from several threads at once.
class Index {
 public:
  virtual ~Index() = default;

  // Identifies this life of the engine: another value means that what was not committed before may
  // be lost. Throws Error 913 when the engine does not answer.
  virtual std::string Epoch() = 0;
  // Makes the share's index, which may be there already.
  virtual void Create() = 0;
  // Makes durable what was done.
  virtual void Commit() = 0;
  // The documents in the index.
  virtual std::uint64_t Count() = 0;

  // Reads the place and replaces its whole document. Throws Error 914 when it cannot be read.
  virtual void Upsert(const std::string& path, bool need_meta) = 0;
  // The same for many at once, as one piece of work. Returns for each whether it is done: where
  // anything at all is in the way, a stop or a pause of the worker included, it is not, and
  // Upsert() will tell what. Throws nothing.
  virtual std::vector<bool> UpsertMany(const std::vector<Wish>& wishes) = 0;
  // Reads the place's attributes and merges them into its document.
  virtual void SetAttributes(const std::string& path) = 0;
  // Removes one document; none is no failure.
  virtual void Delete(const std::string& path) = 0;
  // Removes every document below the directory.
  virtual void DeleteBelow(const std::string& dir) = 0;
  // Moves the document of `old_path` and all below it.
  virtual void Rename(const std::string& new_path, const std::string& old_path) = 0;

  virtual std::optional<Document> Find(const std::string& path) = 0;
  // Documents directly in the directory, or paths of documents at any depth below it: the first
  // `limit` of those whose path is greater than `after`, in ascending order of paths.
  virtual std::vector<Document> Children(const std::string& dir, const std::string& after,
                                         std::size_t limit) = 0;
  virtual std::vector<std::string> PathsBelow(const std::string& dir, const std::string& after,
                                              std::size_t limit) = 0;

  // Whether files can be read at all at the moment: tells a file that cannot be read from a reader
  // that does not run. Does not throw.
  virtual bool CanRead() = 0;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_INDEX_H_
