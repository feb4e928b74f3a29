// The files of an index: one database in the directory of its own that the index was given.

#ifndef QUARRY_DAEMONS_TARNELASTICD_INDEX_FILES_H_
#define QUARRY_DAEMONS_TARNELASTICD_INDEX_FILES_H_

#include <memory>
#include <string>

#include "daemons/tarnelasticd/schema.h"

namespace quarry::engine {

// The database in the directory of an index.
std::string DatabasePath(const std::string& directory);

// Throws Error kMalformedRequest unless `directory` is an absolute path, not "/", without empty,
// "." or ".." components, that leaves room for the names of files.
void CheckDirectory(const std::string& directory);

// Whether there is a database file, sound or not.
bool HasDatabase(const std::string& directory);

// Makes an empty database, and the directory where it is missing, so that after a crash there is
// either a whole one or none; what was there is replaced, but for directories in the place of
// files, which get another name. No connection may be open on it. Throws Error kDiskFull or
// kStorageFailed.
void CreateDatabase(const std::string& directory, const Schema& schema);

// The same under a name of its own, to be put in place with PlaceDatabase when it has been filled.
// Returns its path.
std::string CreateSpareDatabase(const std::string& directory, const Schema& schema);
// Removes what there is of one. Never throws: it is called when something has failed already.
void RemoveSpareDatabase(const std::string& directory) noexcept;
// Puts it in the place of the one that was there. No connection may be open on either.
void PlaceSpareDatabase(const std::string& directory);

// What the database was made with. Throws Error kDamagedIndex when it is missing, no sound database
// or of another layout.
std::shared_ptr<const Schema> LoadSchema(const std::string& directory);

// Removes the database's files, also what a crash has left of them, and the directory if it is
// empty then. What is missing counts as removed. Throws Error kStorageFailed.
void RemoveDatabase(const std::string& directory);

// Moves a database that has been closed cleanly, within a file system or to another one. At every
// moment one of the two directories holds it whole; where `to` has one, the move is complete but
// for leftovers in `from`, and calling this again ends it. Throws Error kDiskFull or
// kStorageFailed, and then the database is where it was.
void MoveDatabase(const std::string& from, const std::string& to);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_INDEX_FILES_H_
