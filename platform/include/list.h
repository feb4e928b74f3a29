// Lists of strings that the platform fills.

#ifndef QUARRY_PLATFORM_INCLUDE_LIST_H_
#define QUARRY_PLATFORM_INCLUDE_LIST_H_

#include "common/export.h"

// A growing list of NUL-terminated strings, allocated by the platform. One thread at a time.
struct HLIBCSZLIST;

extern "C" {

// A new, empty list with room for `size` entries at first; null when memory is short. Released with
// HLIBCSzListFree.
QUARRY_EXPORT HLIBCSZLIST* HLIBCSzListAlloc(int size);

// Releases a list with its strings; null is allowed.
QUARRY_EXPORT void HLIBCSzListFree(HLIBCSZLIST* list);

// Appends a copy of `text`; the list may move. 0, or negative when memory is short.
QUARRY_EXPORT int HLIBCSzListPush(const char* text, HLIBCSZLIST** list);

// The number of entries.
QUARRY_EXPORT int HLIBCSzListCount(const HLIBCSZLIST* list);

// The entry at `index`, from 0; it belongs to the list. Null when there is none.
QUARRY_EXPORT const char* HLIBCSzListGet(const HLIBCSZLIST* list, int index);

}  // extern "C"

#endif  // QUARRY_PLATFORM_INCLUDE_LIST_H_
