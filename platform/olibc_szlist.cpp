// The platform string list: a growable array of owned, NUL-terminated strings.
//
// The list header stays where it was allocated; growing reallocates only the item
// array, so a handle never dangles (the API still passes a pointer to the handle so
// that callers need not care).  Every failure sets the per-thread platform error.
#include <climits>
#include <cstdlib>
#include <cstring>

#include "olibc.h"
#include "platform/olibc_mem.h"

namespace {

constexpr int kMinCapacity = 4;

int CompareAscending(const void *a, const void *b) {
    return strcmp(*static_cast<char *const *>(a), *static_cast<char *const *>(b));
}

int CompareDescending(const void *a, const void *b) { return CompareAscending(b, a); }

// Makes room for one more item, doubling the array.  0 or -1 (out of memory).
int Reserve(POLIBC_SZLIST list) {
    if (list->nItem < list->nAlloc) return 0;
    if (list->nAlloc > INT_MAX / 2) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return -1;
    }
    int grown = list->nAlloc < kMinCapacity ? kMinCapacity : list->nAlloc * 2;
    void *items = orlo::olibc::Realloc(list->ppszItem, sizeof(char *) * static_cast<size_t>(grown));
    if (items == nullptr) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return -1;
    }
    list->ppszItem = static_cast<char **>(items);
    list->nAlloc = grown;
    return 0;
}

}  // namespace

extern "C" {

ORLO_EXPORT POLIBC_SZLIST OLIBCSzListAlloc(int capacity) {
    if (capacity < 0) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return nullptr;
    }
    if (capacity < kMinCapacity) capacity = kMinCapacity;
    auto *list = static_cast<POLIBC_SZLIST>(orlo::olibc::Malloc(sizeof(OLIBC_SZLIST)));
    if (list == nullptr) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return nullptr;
    }
    list->ppszItem = static_cast<char **>(orlo::olibc::Malloc(sizeof(char *) * static_cast<size_t>(capacity)));
    if (list->ppszItem == nullptr) {
        free(list);
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return nullptr;
    }
    list->nAlloc = capacity;
    list->nItem = 0;
    return list;
}

ORLO_EXPORT void OLIBCSzListFree(POLIBC_SZLIST pList) {
    if (pList == nullptr) return;
    OLIBCSzListRemoveAll(pList);
    free(pList->ppszItem);
    free(pList);
}

ORLO_EXPORT int OLIBCSzListPush(POLIBC_SZLIST *ppList, const char *sz) {
    if (ppList == nullptr || *ppList == nullptr || sz == nullptr) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    POLIBC_SZLIST list = *ppList;
    if (Reserve(list) != 0) return -1;
    char *copy = orlo::olibc::Strdup(sz);
    if (copy == nullptr) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return -1;
    }
    list->ppszItem[list->nItem] = copy;
    return list->nItem++;
}

ORLO_EXPORT const char *OLIBCSzListGet(const OLIBC_SZLIST *pList, int idx) {
    if (pList == nullptr || idx < 0 || idx >= pList->nItem) return nullptr;
    return pList->ppszItem[idx];
}

ORLO_EXPORT int OLIBCSzListFind(const OLIBC_SZLIST *pList, const char *sz) {
    if (pList == nullptr || sz == nullptr) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    for (int i = 0; i < pList->nItem; ++i)
        if (strcmp(pList->ppszItem[i], sz) == 0) return i;
    return -1;
}

ORLO_EXPORT int OLIBCSzListBinaryFind(const OLIBC_SZLIST *pList, const char *sz) {
    if (pList == nullptr || sz == nullptr) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    int lo = 0;
    int hi = pList->nItem - 1;
    while (lo <= hi) {
        int mid = lo + (hi - lo) / 2;
        int c = strcmp(pList->ppszItem[mid], sz);
        if (c == 0) return mid;
        if (c < 0)
            lo = mid + 1;
        else
            hi = mid - 1;
    }
    return -1;
}

ORLO_EXPORT int OLIBCSzListSortItems(POLIBC_SZLIST pList, int descending) {
    if (pList == nullptr) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    if (pList->nItem > 1)
        qsort(pList->ppszItem, static_cast<size_t>(pList->nItem), sizeof(char *),
              descending ? CompareDescending : CompareAscending);
    return 0;
}

ORLO_EXPORT void OLIBCSzListRemoveAll(POLIBC_SZLIST pList) {
    if (pList == nullptr) return;
    for (int i = 0; i < pList->nItem; ++i) free(pList->ppszItem[i]);
    pList->nItem = 0;
}

ORLO_EXPORT int OLIBCSzListJoin(const OLIBC_SZLIST *pList, const char *sep, char *buf, size_t size) {
    if (pList == nullptr || buf == nullptr || size == 0) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    if (sep == nullptr) sep = "";
    size_t sepLen = strlen(sep);
    size_t total = 0;
    for (int i = 0; i < pList->nItem; ++i) total += strlen(pList->ppszItem[i]) + (i > 0 ? sepLen : 0);
    if (total >= size || total > INT_MAX) {
        buf[0] = '\0';  // refused, never cut
        OLIBCErrSet(OLIBC_ERR_TOO_LONG);
        return -1;
    }
    char *p = buf;
    for (int i = 0; i < pList->nItem; ++i) {
        if (i > 0) {
            memcpy(p, sep, sepLen);
            p += sepLen;
        }
        size_t n = strlen(pList->ppszItem[i]);
        memcpy(p, pList->ppszItem[i], n);
        p += n;
    }
    *p = '\0';
    return static_cast<int>(total);
}

ORLO_EXPORT int OLIBCSzListPop(POLIBC_SZLIST pList, char *buf, size_t size) {
    if (pList == nullptr) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    if (pList->nItem == 0) {
        OLIBCErrSet(OLIBC_ERR_NOT_FOUND);
        return -1;
    }
    char *last = pList->ppszItem[pList->nItem - 1];
    if (buf != nullptr) {
        size_t n = strlen(last);
        if (n >= size) {
            OLIBCErrSet(OLIBC_ERR_TOO_LONG);
            return -1;
        }
        memcpy(buf, last, n + 1);
    }
    free(last);
    --pList->nItem;
    return 0;
}

ORLO_EXPORT int OLIBCSzListCount(const OLIBC_SZLIST *pList) {
    if (pList == nullptr) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    return pList->nItem;
}

}  // extern "C"
