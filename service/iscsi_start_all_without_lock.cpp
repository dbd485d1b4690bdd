// Brings the whole iSCSI service up from the configuration files, under the caller's
// service lock: working directories, modules and the plug-in daemon, every LUN into its
// backstore, the fabric directory, iSNS, every target whose stored enabled flag is set,
// then the extent pools' unmap buffers and the release of deleted LUNs' space.  One
// target that cannot be enabled is logged and does not keep the others down.  Every
// step tolerates what a previous start left, so starting a running service succeeds.
#include <sys/stat.h>

#include <cerrno>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"
#include "orloiscsi_conf.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_service.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"

namespace {

constexpr const char kIscsiFabricDir[] = "/config/target/iscsi";
constexpr uint32_t kErrGetConfig = 18990425;

// Every target of the configuration but backup objects, in file order.
constexpr uint32_t kAllTargets = ORLO_ISCSI_TARGET_FILTER_ALL;

uint32_t EnableStoredTargets() {
    ORLOiSCSILunFilter filter;
    memset(&filter, 0, sizeof(filter));
    filter.flags = kAllTargets;
    ORLOiSCSIConf conf;
    memset(&conf, 0, sizeof(conf));
    auto freeConf = orlo::MakeScopeExit([&conf] { ORLOiSCSIConfFree(&conf); });
    uint32_t ret = ORLOiSCSIConfGet(&filter, &conf);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(%p, %p) failed, err=%s", static_cast<void *>(&filter),
                     static_cast<void *>(&conf), ORLOiSCSIErrStr(ret));
        return kErrGetConfig;
    }
    ORLOiSCSIListLink *link;
    ORLOiSCSITarget *target;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&conf.targets, link, target) {
        if (!target->enabled) continue;
        ret = ORLOiSCSITargetEnable(target);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetEnable(%p) failed, err=%s", static_cast<void *>(target),
                         ORLOiSCSIErrStr(ret));
        }
    }
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIStartAllWithoutLock(void) {
    uint32_t ret = ORLOiSCSIBaseMkdir(nullptr);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIBaseMkdir(NULL) failed, err=%s", ORLOiSCSIErrStr(ret));
        return ret;
    }
    ret = ORLOiSCSIStartBasicWithoutLock();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIStartBasicWithoutLock() failed, err=%s", ORLOiSCSIErrStr(ret));
        return ORLO_ERR_INSMOD;
    }
    // LUNs a killed creation or deletion left half-done are settled before any is loaded.
    orlo::lun::RecoverPending(false);
    ret = ORLOiSCSILunServiceStartAllWithoutLock();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunServiceStartAllWithoutLock() failed, err=%s", ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (orlo::os::Mkdir(kIscsiFabricDir, S_IRWXU) != 0 && errno != EEXIST) {
        ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", kIscsiFabricDir);
        return ORLO_ERR_MKDIR;
    }
    // Registration is best effort: targets serve without an iSNS server.
    if (!ORLOiSCSIiSNSIsConnected()) (void)ORLOiSCSIiSNSConnect();
    if ((ret = EnableStoredTargets()) != ORLO_OK) return ret;
    ret = ORLOiSCSIEpUnmapBufferCheckAndEnable();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpUnmapBufferCheckAndEnable() failed, err=%s", ORLOiSCSIErrStr(ret));
    }
    ret = ORLOiSCSILunUnmapTrashInBackground();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunUnmapTrashInBackground() failed, err=%s", ORLOiSCSIErrStr(ret));
    }
    OrloLog(LOG_INFO, "%s:%d Successfully started iSCSI service.", __FILE_NAME__, __LINE__);
    ORLO_LOG(LOG_INFO, "Successfully started iSCSI service.");
    return ORLO_OK;
}
