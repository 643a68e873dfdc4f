#pragma once

/// The platform's list of strings: grows by appending, owned by whoever allocated it.

struct MLIBCSzList;

/// A new empty list with room for `capacity` items, or null.
MLIBCSzList* MLIBCSzListAlloc(int capacity);
/// Appends a copy of `item`; the new number of items, or -1. The list may move, hence the pointer
/// to the pointer.
int MLIBCSzListPush(MLIBCSzList** list, const char* item);
/// Number of items.
int MLIBCSzListCount(const MLIBCSzList* list);
/// Item `index` (from 0), owned by the list; null outside it.
const char* MLIBCSzListGet(const MLIBCSzList* list, int index);
/// Frees the list; null is allowed.
void MLIBCSzListFree(MLIBCSzList* list);
