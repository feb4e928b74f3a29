// Comparing what documents remember with what is on the disk. The stamps' form is the extractor's
// (daemons/tarncontentextractd/stamp.h).

#ifndef QUARRY_DAEMONS_FILEINDEXD_STAMPS_H_
#define QUARRY_DAEMONS_FILEINDEXD_STAMPS_H_

#include <string>

namespace quarry::fileindexd {

// Whether two attribute stamps are of the same file in the same state. The device's number, which
// comes first, does not count: it may be another one after each start of the machine.
bool SameAttributes(const std::string& a, const std::string& b);

// Whether two attribute stamps are of the same file, whatever its state.
bool SameInode(const std::string& a, const std::string& b);

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_STAMPS_H_
