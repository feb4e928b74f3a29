// Opening a file by a path that others may be changing at this moment.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_PATH_OPEN_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_PATH_OPEN_H_

#include <string>

#include "common/unique_fd.h"

namespace quarry::extract {

// A descriptor for what stands at the absolute `path`, of any kind and any length, good for asking
// its attributes only (O_PATH). The last component is never followed; a symbolic link further up
// is followed only if it belongs to root or to this process's account: nobody else can lead the
// daemon, which may read more than they, to another place. Opens no device and never blocks on one.
// Invalid, with errno set, on failure; ELOOP where a link was not followed.
UniqueFd OpenPlace(const std::string& path);

// A descriptor to read the regular file that `place`, a descriptor of OpenPlace(), stands for. Its
// time of last access stays as it is where the system allows. Invalid, with errno set, on failure.
UniqueFd OpenForReading(int place);

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_PATH_OPEN_H_
