#include "platform/include/list.h"

#include <algorithm>
#include <new>
#include <string>
#include <vector>

struct HLIBCSZLIST {
  std::vector<std::string> entries;
};

extern "C" {

HLIBCSZLIST* HLIBCSzListAlloc(int size) {
  try {
    auto* list = new HLIBCSZLIST;
    // The size is a hint, so an absurd one is not worth failing for.
    list->entries.reserve(static_cast<size_t>(std::clamp(size, 0, 1024)));
    return list;
  } catch (const std::bad_alloc&) {
    return nullptr;
  }
}

void HLIBCSzListFree(HLIBCSZLIST* list) {
  delete list;
}

int HLIBCSzListPush(const char* text, HLIBCSZLIST** list) {
  if (text == nullptr || list == nullptr || *list == nullptr) return -1;
  try {
    (*list)->entries.emplace_back(text);
    return 0;
  } catch (const std::bad_alloc&) {
    return -1;
  }
}

int HLIBCSzListCount(const HLIBCSZLIST* list) {
  return list == nullptr ? 0 : static_cast<int>(list->entries.size());
}

const char* HLIBCSzListGet(const HLIBCSZLIST* list, int index) {
  if (index < 0 || index >= HLIBCSzListCount(list)) return nullptr;
  return list->entries[static_cast<size_t>(index)].c_str();
}

}  // extern "C"
