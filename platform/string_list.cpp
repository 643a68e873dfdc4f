#include "platform/string_list.h"

#include <limits.h>

#include <algorithm>
#include <new>
#include <string>
#include <vector>

struct MLIBCSzList {
  std::vector<std::string> items;
};

MLIBCSzList* MLIBCSzListAlloc(int capacity) try {
  auto* list = new MLIBCSzList;
  // A hint only: memory is taken as items come.
  list->items.reserve(static_cast<std::size_t>(std::clamp(capacity, 0, 1024)));
  return list;
} catch (const std::bad_alloc&) {
  return nullptr;
}

int MLIBCSzListPush(MLIBCSzList** list, const char* item) try {
  if (!list || !*list || !item || (*list)->items.size() >= INT_MAX) return -1;
  (*list)->items.emplace_back(item);
  return static_cast<int>((*list)->items.size());
} catch (const std::bad_alloc&) {
  return -1;
}

int MLIBCSzListCount(const MLIBCSzList* list) {
  return list ? static_cast<int>(list->items.size()) : 0;
}

const char* MLIBCSzListGet(const MLIBCSzList* list, int index) {
  if (index < 0 || index >= MLIBCSzListCount(list)) return nullptr;
  return list->items[static_cast<std::size_t>(index)].c_str();
}

void MLIBCSzListFree(MLIBCSzList* list) {
  delete list;
}
