// The platform string hash: owned key -> value strings, iterated in insertion order.
//
// Pairs live in an array in the order they were first set (replacing a value keeps the
// pair's place); an open-addressing index of twice the capacity (linear probing, FNV-1a)
// finds a key in constant time.  Removal compacts the array and rebuilds the index:
// section hashes are built once and read, so removal is the rare case.  Growing doubles
// both.  Every failure sets the per-thread platform error.
#include <climits>
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "olibc.h"
#include "platform/olibc_mem.h"

namespace {

constexpr int kMinCapacity = 8;

struct Entry {
    char *key;
    char *value;
    uint32_t hash;
};

uint32_t HashOf(const char *s) {
    uint32_t h = 2166136261u;
    for (const unsigned char *p = reinterpret_cast<const unsigned char *>(s); *p != '\0'; ++p) {
        h ^= *p;
        h *= 16777619u;
    }
    return h;
}

// Number of index slots for a capacity: a power of two of at least twice it.
size_t SlotsFor(int capacity) {
    size_t n = 16;
    while (n < static_cast<size_t>(capacity) * 2) n <<= 1;
    return n;
}

}  // namespace

struct _tag_OLIBC_SZHASH {
    int nAlloc;
    int nItem;
    Entry *entries;
    int *slots;  // index into entries, -1 when free
    size_t nSlots;
};

namespace {

void FillSlots(int *slots, size_t nSlots, const Entry *entries, int nItem) {
    for (size_t i = 0; i < nSlots; ++i) slots[i] = -1;
    size_t mask = nSlots - 1;
    for (int e = 0; e < nItem; ++e) {
        size_t i = entries[e].hash & mask;
        while (slots[i] != -1) i = (i + 1) & mask;
        slots[i] = e;
    }
}

// The index of key in the entries, or -1.
int Lookup(const OLIBC_SZHASH *h, const char *key, uint32_t hash) {
    size_t mask = h->nSlots - 1;
    for (size_t i = hash & mask; h->slots[i] != -1; i = (i + 1) & mask) {
        const Entry &e = h->entries[h->slots[i]];
        if (e.hash == hash && strcmp(e.key, key) == 0) return h->slots[i];
    }
    return -1;
}

int Grow(OLIBC_SZHASH *h) {
    if (h->nAlloc > INT_MAX / 4) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return -1;
    }
    int capacity = h->nAlloc * 2;
    size_t nSlots = SlotsFor(capacity);
    int *slots = static_cast<int *>(orlo::olibc::Malloc(sizeof(int) * nSlots));
    if (slots == nullptr) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return -1;
    }
    void *entries = orlo::olibc::Realloc(h->entries, sizeof(Entry) * static_cast<size_t>(capacity));
    if (entries == nullptr) {
        free(slots);
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return -1;
    }
    h->entries = static_cast<Entry *>(entries);
    free(h->slots);
    h->slots = slots;
    h->nSlots = nSlots;
    h->nAlloc = capacity;
    FillSlots(h->slots, h->nSlots, h->entries, h->nItem);
    return 0;
}

}  // namespace

extern "C" {

ORLO_EXPORT POLIBC_SZHASH OLIBCSzHashAlloc(int capacity) {
    if (capacity < 0 || capacity > INT_MAX / 4) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return nullptr;
    }
    if (capacity < kMinCapacity) capacity = kMinCapacity;
    auto *h = static_cast<POLIBC_SZHASH>(orlo::olibc::Malloc(sizeof(OLIBC_SZHASH)));
    if (h == nullptr) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return nullptr;
    }
    h->nAlloc = capacity;
    h->nItem = 0;
    h->nSlots = SlotsFor(capacity);
    h->entries = static_cast<Entry *>(orlo::olibc::Malloc(sizeof(Entry) * static_cast<size_t>(capacity)));
    h->slots = static_cast<int *>(orlo::olibc::Malloc(sizeof(int) * h->nSlots));
    if (h->entries == nullptr || h->slots == nullptr) {
        free(h->entries);
        free(h->slots);
        free(h);
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return nullptr;
    }
    FillSlots(h->slots, h->nSlots, h->entries, 0);
    return h;
}

ORLO_EXPORT void OLIBCSzHashFree(POLIBC_SZHASH pHash) {
    if (pHash == nullptr) return;
    OLIBCSzHashRemoveAll(pHash);
    free(pHash->entries);
    free(pHash->slots);
    free(pHash);
}

ORLO_EXPORT int OLIBCSzHashSetValue(POLIBC_SZHASH *ppHash, const char *key, const char *value) {
    if (ppHash == nullptr || *ppHash == nullptr || key == nullptr || value == nullptr) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    POLIBC_SZHASH h = *ppHash;
    uint32_t hash = HashOf(key);
    int found = Lookup(h, key, hash);
    if (found >= 0) {
        char *copy = orlo::olibc::Strdup(value);
        if (copy == nullptr) {
            OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
            return -1;
        }
        free(h->entries[found].value);
        h->entries[found].value = copy;
        return 0;
    }
    if (h->nItem == h->nAlloc && Grow(h) != 0) return -1;
    char *k = orlo::olibc::Strdup(key);
    char *v = k != nullptr ? orlo::olibc::Strdup(value) : nullptr;
    if (v == nullptr) {
        free(k);
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return -1;
    }
    int idx = h->nItem++;
    h->entries[idx] = Entry{k, v, hash};
    size_t mask = h->nSlots - 1;
    size_t i = hash & mask;
    while (h->slots[i] != -1) i = (i + 1) & mask;
    h->slots[i] = idx;
    return 0;
}

ORLO_EXPORT const char *OLIBCSzHashGetValue(const OLIBC_SZHASH *pHash, const char *key) {
    if (pHash == nullptr || key == nullptr) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return nullptr;
    }
    int found = Lookup(pHash, key, HashOf(key));
    return found >= 0 ? pHash->entries[found].value : nullptr;
}

ORLO_EXPORT int OLIBCSzHashRemove(POLIBC_SZHASH pHash, const char *key) {
    if (pHash == nullptr || key == nullptr) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return 0;
    }
    int found = Lookup(pHash, key, HashOf(key));
    if (found < 0) return 0;
    free(pHash->entries[found].key);
    free(pHash->entries[found].value);
    memmove(&pHash->entries[found], &pHash->entries[found + 1],
            sizeof(Entry) * static_cast<size_t>(pHash->nItem - found - 1));
    --pHash->nItem;
    FillSlots(pHash->slots, pHash->nSlots, pHash->entries, pHash->nItem);
    return 1;
}

ORLO_EXPORT void OLIBCSzHashRemoveAll(POLIBC_SZHASH pHash) {
    if (pHash == nullptr) return;
    for (int i = 0; i < pHash->nItem; ++i) {
        free(pHash->entries[i].key);
        free(pHash->entries[i].value);
    }
    pHash->nItem = 0;
    FillSlots(pHash->slots, pHash->nSlots, pHash->entries, 0);
}

ORLO_EXPORT int OLIBCSzHashCount(const OLIBC_SZHASH *pHash) {
    if (pHash == nullptr) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    return pHash->nItem;
}

ORLO_EXPORT int OLIBCSzHashEnum(const OLIBC_SZHASH *pHash, int idx, const char **pKey, const char **pValue) {
    if (pHash == nullptr || idx < 0 || idx >= pHash->nItem) return 0;
    if (pKey != nullptr) *pKey = pHash->entries[idx].key;
    if (pValue != nullptr) *pValue = pHash->entries[idx].value;
    return 1;
}

}  // extern "C"
