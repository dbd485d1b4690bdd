/*
 * Allocation for the platform containers and files.
 *
 * The string lists, hashes and file readers allocate through these wrappers so that
 * an allocation failure is an ordinary, testable path (OLIBC_ERR_OUT_OF_MEM, nothing
 * leaked) rather than something only a full machine can show.  Tests arm a per-thread
 * countdown with FailAllocationIn(n): the n-th allocation after it fails, once.
 */
#ifndef ORLO_PLATFORM_OLIBC_MEM_H
#define ORLO_PLATFORM_OLIBC_MEM_H

#include <cstdlib>
#include <cstring>

namespace orlo {
namespace olibc {

inline thread_local int tlsFailAllocIn = 0;

// Makes the n-th allocation of this thread from now on fail (n <= 0 disarms).
inline void FailAllocationIn(int n) { tlsFailAllocIn = n > 0 ? n : 0; }

inline bool AllocationShouldFail() {
    if (tlsFailAllocIn > 0 && --tlsFailAllocIn == 0) return true;
    return false;
}

inline void *Malloc(size_t n) { return AllocationShouldFail() ? nullptr : malloc(n == 0 ? 1 : n); }

inline void *Realloc(void *p, size_t n) { return AllocationShouldFail() ? nullptr : realloc(p, n == 0 ? 1 : n); }

inline char *Strdup(const char *s) {
    size_t n = strlen(s) + 1;
    char *copy = static_cast<char *>(Malloc(n));
    if (copy != nullptr) memcpy(copy, s, n);
    return copy;
}

}  // namespace olibc
}  // namespace orlo

#endif
