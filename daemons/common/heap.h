// How much memory a daemon keeps for later.

#ifndef QUARRY_DAEMONS_COMMON_HEAP_H_
#define QUARRY_DAEMONS_COMMON_HEAP_H_

namespace quarry::daemon {

// Makes the process give memory back soon after its use. Texts of all sizes come and go on several
// threads, and the C library would else keep several times what is in use at any moment. To be
// called before threads are started.
void KeepHeapSmall();

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_HEAP_H_
