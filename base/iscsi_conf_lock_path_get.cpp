// The lock file that guards a configuration file.
#include <cstdio>
#include <cstring>
#include <string>

#include "base/iscsi_base_internal.h"

namespace {

struct FixedLock {
    const char *file;
    const char *lock;
};

// The appliance's configuration files and their lock files.
const FixedLock kFixedLocks[] = {
    {"/usr/orlo/etc/iscsi_lun.conf", "/tmp/iscsi/iscsi_lun.conf.lock"},
    {"/usr/orlo/etc/iscsi_target.conf", "/tmp/iscsi/iscsi_target.conf.lock"},
    {"/usr/orlo/etc/iscsi_mapping.conf", "/tmp/iscsi/iscsi_mapping.conf.lock"},
    {"/usr/orlo/etc/iscsi_acl.conf", "/tmp/iscsi/iscsi_acl.conf.lock"},
    {"/usr/orlo/etc/iscsi_family_lun.conf", "/tmp/iscsi/iscsi_family_lun.conf.lock"},
    {"/usr/orlo/etc/iscsi_virtual_lun.conf", "/tmp/iscsi/iscsi_virtual_lun.conf.lock"},
    {"/usr/orlo/etc/iscsi_sched_snap_task.conf", "/tmp/iscsi/iscsi_sched_snap_task.conf.lock"},
    {"/usr/orlo/etc/iscsi_replication_task.conf", "/tmp/iscsi/iscsi_replication_task.conf.lock"},
};

bool EndsWith(const std::string &s, const std::string &tail) {
    return s.size() >= tail.size() && s.compare(s.size() - tail.size(), tail.size(), tail) == 0;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfLockPathGet(const char *path, char *buf, size_t size) {
    if (path == nullptr || buf == nullptr || size == 0 || path[0] != '/') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    std::string p(path);
    std::string base = p.substr(p.rfind('/') + 1);
    std::string lock;
    for (const FixedLock &f : kFixedLocks)
        if (p == f.file) lock = f.lock;
    if (lock.empty()) {
        if (EndsWith(p, "/@iSCSI/LUN/iscsi_lun.conf")) {
            // A volume's copy of the LUN file shares the global file's lock.
            lock = "/tmp/iscsi/iscsi_lun.conf.lock";
        } else if (p.find("/@iSCSI/Snapshot/") != std::string::npos && base.rfind("iscsi_snapshot_", 0) == 0) {
            lock = "/tmp/iscsi/snapshot_conf_lock/" + base + ".lock";
        } else if (base.empty()) {
            ORLO_LOG_BAD_PARAMS();
            return ORLO_ERR_BAD_PARAMETER;
        } else {
            // Any other file gets a lock of its own name beside the others.
            lock = "/tmp/iscsi/" + base + ".lock";
        }
    }
    if (lock.size() >= size) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", size);
        buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    memcpy(buf, lock.c_str(), lock.size() + 1);
    return ORLO_OK;
}
