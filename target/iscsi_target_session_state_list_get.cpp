// The iSCSI connections of a target, read from its portal group's dynamic_sessions: one
// line "IQN=<initiator>,IP=<address>,CID=<connection id>" per connection.  Lines of
// another form are skipped; a portal group without the file has no sessions.
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"
#include "target/lio_acl_util.h"
#include "target/target_life_util.h"

namespace {

namespace life = orlo::target::life;
namespace acl = orlo::target::acl;

constexpr const char kSessionsFmt[] = "/config/target/iscsi/%s/tpgt_%d/dynamic_sessions";
constexpr const char kSessionLineFmt[] = "IQN=%[^,],IP=%[^,],CID=%d\n";

// One line into a new record appended to list: 1 appended, 0 not a session line, -1
// no memory.
int ParseLine(const char *line, size_t len, ORLOiSCSISessionStateList *list) {
    // Fields are as long as the line at most; the record keeps what fits.
    std::string iqn(len + 1, '\0'), ip(len + 1, '\0');
    int cid = 0;
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
    if (sscanf(line, kSessionLineFmt, &iqn[0], &ip[0], &cid) != 3) return 0;
#pragma GCC diagnostic pop
    auto *s = static_cast<ORLOiSCSISessionState *>(calloc(1, ORLO_ISCSI_SESSION_STATE_ALLOC));
    if (s == nullptr) {
        ORLO_LOG_ERR("Failed to alloc session info.");
        return -1;
    }
    snprintf(s->ip, sizeof(s->ip), "%s", ip.c_str());
    snprintf(s->cid, sizeof(s->cid), "%d", cid);
    snprintf(s->iqn, sizeof(s->iqn), "%s", iqn.c_str());
    ORLOiSCSIListAppend(list, &s->link);
    return 1;
}

// The sessions of the target's portal group appended to list: their number, or -1 with
// the list freed.
int LioSessionsGet(const ORLOiSCSITarget *target, ORLOiSCSISessionStateList *list) {
    char path[acl::kPathSize];
    if (acl::FormatPath(path, kSessionsFmt, target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER) != ORLO_OK) return -1;
    if (orlo::os::Access(path, F_OK) != 0) {
        if (errno == ENOENT || errno == ENOTDIR) return 0;
        ORLO_LOG_ERR("access(\"%s\", F_OK) failed, err=%m", path);
        return -1;
    }
    orlo::FileGuard file(orlo::os::Fopen(path, "r"));
    if (file.get() == nullptr) {
        ORLO_LOG_ERR("fopen(\"%s\", \"r\") failed, err=%m", path);
        ORLOiSCSIStateListFree(list);
        return -1;
    }
    char *line = nullptr;
    size_t cap = 0;
    auto freeLine = orlo::MakeScopeExit([&line] { free(line); });
    int count = 0;
    ssize_t len;
    while ((len = getline(&line, &cap, file.get())) > 0) {
        int got = ParseLine(line, static_cast<size_t>(len), list);
        if (got < 0) {
            ORLOiSCSIStateListFree(list);
            return -1;
        }
        count += got;
    }
    if (ferror(file.get())) {
        ORLO_LOG_ERR("getline(\"%s\") failed, err=%m", path);
        ORLOiSCSIStateListFree(list);
        return -1;
    }
    return count;
}

}  // namespace

extern "C" ORLO_EXPORT int ORLOiSCSITargetSessionStateListGet(int32_t tid, ORLOiSCSISessionStateList *list) {
    if (list == nullptr || !life::TidValid(tid)) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    if (!ORLOiSCSIListIsInit(list)) ORLOiSCSIListInit(list);
    life::ConfScope conf;
    uint32_t ret = life::QueryConf(life::kQueryTarget, tid, 0, conf.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(0x%X, tid:%d) failed, err=%s", life::kQueryTarget, tid, ORLOiSCSIErrStr(ret));
        return -1;
    }
    const ORLOiSCSITarget *target = life::FirstTarget(*conf);
    if (target == nullptr) {
        ORLO_LOG_ERR("Failed to get iscsi target, tid:%d", tid);
        return -1;
    }
    int count = LioSessionsGet(target, list);
    if (count < 0) ORLO_LOG_ERR("Failed to Get Session of tid:%d, LIO", tid);
    return count;
}
