// Lists the application keys registered on a snapshot.  The key file is refused whole
// when one of its lines cannot be a key (empty, or longer than 127 characters): a file
// that was written by something else is not guessed at.
#include <unistd.h>

#include <cstring>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotLockedAppKeysGet(const ORLOiSCSISnapshot *snap,
                                                                  POLIBC_SZLIST *ppList) {
    if (snap == nullptr || ppList == nullptr || *ppList == nullptr) {
        ORLO_LOG_ERR("BAD parameters");
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = orlo::snap::CheckPathFields(snap, false);
    if (ret != ORLO_OK) return ret;
    char path[orlo::snap::kRuntimePathSize];
    ret = orlo::snap::AppKeyPath(snap, path, sizeof(path));
    if (ret != ORLO_OK) return ret;
    if (orlo::os::Access(path, F_OK) != 0) return ORLO_OK;  // no key was ever registered
    orlo::SzListGuard lines(nullptr);
    {
        orlo::FileLockGuard lock(path, false, orlo::snap::kConfLockTimeoutSec);
        if (!lock.held()) {
            ORLO_LOG_LOCK_FAILED(path);
            return ORLO_ERR_LOCK_FILE;
        }
        if (OLIBCFileReadLines(path, lines.addr()) < 0) {
            ORLO_LOG_ERR("Failed to read lines from file: %s. [0x%04X %s:%d]", path, OLIBCErrGet(),
                         OLIBCErrorGetFile(), OLIBCErrorGetLine());
            return ORLO_ERR_READ_FILE;
        }
    }
    std::vector<std::string> keys;
    for (int i = 0; i < OLIBCSzListCount(lines.get()); ++i) {
        std::string key = OLIBCSzListGet(lines.get(), i);
        if (!key.empty() && key.back() == '\n') key.pop_back();
        if (key.empty() || key.size() > orlo::snap::kAppKeyMax) {
            ORLO_LOG_ERR("Bad string length. string: %.*s, length: %d", 200, key.c_str(), static_cast<int>(key.size()));
            return ORLO_ERR_BAD_STRING_LENGTH;
        }
        keys.push_back(std::move(key));
    }
    const int before = OLIBCSzListCount(*ppList);
    for (const std::string &key : keys) {
        if (OLIBCSzListPush(ppList, key.c_str()) < 0) {
            ORLO_LOG_ERR("OLIBCSzListPush(%p, \"%s\") failed [0x%04X %s:%d]", static_cast<void *>(ppList),
                         key.c_str(), OLIBCErrGet(), OLIBCErrorGetFile(), OLIBCErrorGetLine());
            while (OLIBCSzListCount(*ppList) > before) OLIBCSzListPop(*ppList, nullptr, 0);
            return ORLO_ERR_OUT_OF_MEMORY;
        }
    }
    return ORLO_OK;
}
