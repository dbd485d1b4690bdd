// Volume numbers: the N of the "/volumeN" mount point a path lies on, and the volumes the
// root holds.
#include <dirent.h>

#include <algorithm>
#include <climits>
#include <cerrno>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "olibc.h"
#include "orlo_storage.h"
#include "platform/orlo_storage_internal.h"
#include "platform/os_seam.h"

namespace {

// "/volumeN" followed by the end or a slash; N is decimal, 1 or more, without a
// leading zero.  -1 for anything else ("/volumeUSB1", "/volume", "/volume01").
int ParseVolumeNum(const char *p) {
    static const char kPrefix[] = "/volume";
    const size_t n = sizeof(kPrefix) - 1;
    while (p[0] == '/' && p[1] == '/') ++p;
    if (strncmp(p, kPrefix, n) != 0) return -1;
    const char *d = p + n;
    if (*d < '1' || *d > '9') return -1;
    long long num = 0;
    for (; *d >= '0' && *d <= '9'; ++d) {
        num = num * 10 + (*d - '0');
        if (num > INT_MAX) return -1;
    }
    if (*d != '\0' && *d != '/') return -1;
    return static_cast<int>(num);
}

}  // namespace

extern "C" {

ORLO_EXPORT int ORLOVolumeNumGet(const char *path) {
    if (path == nullptr || path[0] != '/') {
        ORLO_STORAGE_FAIL(EINVAL, OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    // An existing path is resolved first, so that links and ".." lead to the volume the
    // object really lies on; a path still to be made is read as written.
    char resolved[PATH_MAX];
    const char *p = orlo::os::Realpath(path, resolved) != nullptr ? resolved : path;
    int num = ParseVolumeNum(p);
    if (num < 0) {
        ORLO_STORAGE_FAIL(EINVAL, OLIBC_ERR_NOT_FOUND);
        return -1;
    }
    return num;
}

ORLO_EXPORT int ORLOVolumeNumsList(int *out, int max) {
    if (max < 0 || (out == nullptr && max > 0)) {
        ORLO_STORAGE_FAIL(EINVAL, OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    std::vector<int> nums;
    {
        std::unique_ptr<DIR, int (*)(DIR *)> root(orlo::os::Opendir("/"), closedir);
        if (root == nullptr) {
            ORLO_STORAGE_FAIL(errno, OLIBC_ERR_FOPEN);
            return -1;
        }
        std::string path;
        while (struct dirent *e = readdir(root.get())) {
            path.assign("/").append(e->d_name);
            if (strchr(e->d_name, '/') != nullptr) continue;
            int n = ParseVolumeNum(path.c_str());
            if (n > 0) nums.push_back(n);
        }
    }
    std::sort(nums.begin(), nums.end());
    for (size_t i = 0; i < nums.size() && i < static_cast<size_t>(max); ++i) out[i] = nums[i];
    return static_cast<int>(nums.size());
}

}  // extern "C"
