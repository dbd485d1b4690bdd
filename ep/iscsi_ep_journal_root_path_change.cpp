// Moves the EP journal to a new root directory.  The kernel must not be using it; the
// whole service is stopped and its modules unloaded first (so nothing holds the old
// file), then the journal is copied, the new root stored under "vaai_journal_rootpath"
// and the old file removed.  Starting the service again is the caller's step.
//
// The whole-service stop belongs to the service code, which installs it here; until it
// does, a move is refused.  The stop runs before the journal lock is taken: the service
// lock it takes must never be taken inside a file lock.
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orlo_storage.h"
#include "platform/os_seam.h"

namespace orlo {
namespace ep {

namespace {
std::atomic<TotallyStopFn> gTotallyStop{nullptr};
}  // namespace

void SetTotallyStopHook(TotallyStopFn fn) { gTotallyStop.store(fn); }
TotallyStopFn GetTotallyStopHook(void) { return gTotallyStop.load(); }

}  // namespace ep
}  // namespace orlo

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpJournalRootPathChange(const char *newRoot) {
    if (newRoot == nullptr || newRoot[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (newRoot[0] != '/') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    char root[EP_PATH_SIZE];
    uint32_t ret = orlo::ep::PathBuild(root, sizeof(root), "%s", newRoot);
    if (ret != ORLO_OK) return ret;
    for (size_t len = strlen(root); len > 1 && root[len - 1] == '/';) root[--len] = '\0';

    bool used = false;
    ret = ORLOiSCSIEpIsJournalEnabled(&used);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpIsJournalEnabled(%p) failed, err=%s", static_cast<void *>(&used), ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (used) {
        ORLO_LOG_ERR("Fail to change EP journal root path, journal is used");
        return EP_ERR_TRY_AGAIN;
    }
    char oldRoot[EP_PATH_SIZE];
    if (ORLOiSCSIEpJournalRootPathGet(oldRoot, sizeof(oldRoot), false) != 0) {
        ORLO_LOG_ERR("ORLOiSCSIEpJournalRootPathGet(%p, %zu, false) failed", static_cast<void *>(oldRoot),
                     sizeof(oldRoot));
        return ORLO_ERR_READ_FILE;
    }
    if (strcmp(oldRoot, root) == 0) return ORLO_OK;  // already there

    orlo::ep::TotallyStopFn stop = orlo::ep::GetTotallyStopHook();
    ret = stop != nullptr ? stop() : static_cast<uint32_t>(EP_ERR_STOP_SERVICE);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITotallyStopAndUnload() failed, err=%s", ORLOiSCSIErrStr(ret));
        return EP_ERR_STOP_SERVICE;
    }

    int32_t lockFd = -1;
    ret = ORLOiSCSIEpJournalLock(&lockFd);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpJournalLock(%p) failed, err=%s", static_cast<void *>(&lockFd), ORLOiSCSIErrStr(ret));
        return ret;
    }
    auto unlock = orlo::MakeScopeExit([&] {
        uint32_t r = ORLOiSCSIEpJournalUnlock(lockFd);
        if (r != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSIEpJournalUnlock(%d) failed, err=%s", lockFd, ORLOiSCSIErrStr(r));
    });

    int rc = OLIBCExec("/bin/mkdir", "-p", root, nullptr, nullptr);
    if (rc != 0) {
        ORLO_LOG_ERR("Failed to do command 'mkdir -p %s', ret=%d", root, rc);
        return ORLO_ERR_RMDIR;
    }
    char oldPath[EP_PATH_SIZE];
    char newPath[EP_PATH_SIZE];
    if ((ret = orlo::ep::PathBuild(oldPath, sizeof(oldPath), "%s/%s", oldRoot, EP_JNL_FILE_NAME)) != ORLO_OK ||
        (ret = orlo::ep::PathBuild(newPath, sizeof(newPath), "%s/%s", root, EP_JNL_FILE_NAME)) != ORLO_OK)
        return ret;
    bool haveOld = orlo::os::Access(oldPath, F_OK) == 0;
    if (haveOld && ORLOFileCopy(oldPath, newPath) != 0) {
        ORLO_LOG_ERR("Failed to copy Ep journal from :%s, to :%s, orloerr=[0x%04X]", oldPath, newPath, OLIBCErrGet());
        return ORLO_ERR_COPY_FILE;
    }
    if (OLIBCFileSetKeyValue(SZF_ORLO_INFO, SZK_JOURNAL_ROOTPATH, root, "%s=\"%s\"\n") < 0) {
        ORLO_LOG_PLATFORM("OLIBCFileSetKeyValue(\"%s\", \"%s\", \"%s\")", SZF_ORLO_INFO, SZK_JOURNAL_ROOTPATH, root);
        // The setting still names the old root: the copy would only be a stray.
        if (haveOld && orlo::os::Unlink(newPath) != 0)
            ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", newPath);
        return ORLO_ERR_WRITE_FILE;
    }
    if (haveOld && orlo::os::Unlink(oldPath) != 0)
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", oldPath);
    return ORLO_OK;
}
