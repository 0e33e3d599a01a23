// The string list. Every string is a block of its own, so that what MLIBCSzListGet() returned stays
// where it is while the list grows.

#include <errno.h>
#include <stdlib.h>
#include <string.h>

#include <climits>
#include <cstddef>

#include "platform/include/mavocore.h"

struct MLIBCSzList {
    char** strings;
    int count;
    int capacity;
};

namespace {

constexpr int kFirstGrowth = 16;

// Makes room for one more string. False with errno when it cannot; nothing has changed then.
bool Grow(MLIBCSzList* list) {
    if (list->capacity == INT_MAX) {
        errno = ENOMEM;
        return false;
    }
    int capacity = kFirstGrowth;
    if (list->capacity > INT_MAX / 2) {
        capacity = INT_MAX;
    } else if (list->capacity > kFirstGrowth / 2) {
        capacity = 2 * list->capacity;
    }
    // reallocarray() refuses a product that does not fit in size_t.
    void* const grown =
        reallocarray(list->strings, static_cast<std::size_t>(capacity), sizeof(char*));
    if (grown == nullptr) return false;
    list->strings = static_cast<char**>(grown);
    list->capacity = capacity;
    return true;
}

}  // namespace

MLIBCSzList* MLIBCSzListAlloc(int capacity) {
    if (capacity < 0) {
        errno = EINVAL;
        return nullptr;
    }
    auto* const list = static_cast<MLIBCSzList*>(malloc(sizeof(MLIBCSzList)));
    if (list == nullptr) return nullptr;
    *list = {nullptr, 0, capacity};
    if (capacity == 0) return list;

    list->strings = static_cast<char**>(
        reallocarray(nullptr, static_cast<std::size_t>(capacity), sizeof(char*)));
    if (list->strings == nullptr) {
        free(list);
        errno = ENOMEM;
        return nullptr;
    }
    return list;
}

int MLIBCSzListPush(MLIBCSzList** ppList, const char* sz) {
    if (ppList == nullptr || *ppList == nullptr || sz == nullptr) {
        errno = EINVAL;
        return -1;
    }
    MLIBCSzList* const list = *ppList;
    if (list->count == list->capacity && !Grow(list)) return -1;

    const std::size_t size = strlen(sz) + 1;
    auto* const copy = static_cast<char*>(malloc(size));
    if (copy == nullptr) return -1;
    memcpy(copy, sz, size);
    list->strings[list->count++] = copy;
    return 0;
}

const char* MLIBCSzListGet(const MLIBCSzList* pList, int index) {
    if (pList == nullptr || index < 0 || index >= pList->count) return nullptr;
    return pList->strings[index];
}

void MLIBCSzListRemoveAll(MLIBCSzList* pList) {
    if (pList == nullptr) return;
    const int saved = errno;  // Lists are emptied on the way out of failures.
    for (int i = 0; i < pList->count; ++i) free(pList->strings[i]);
    pList->count = 0;
    errno = saved;
}

void MLIBCSzListFree(MLIBCSzList* pList) {
    if (pList == nullptr) return;
    const int saved = errno;
    MLIBCSzListRemoveAll(pList);
    free(pList->strings);
    free(pList);
    errno = saved;
}
