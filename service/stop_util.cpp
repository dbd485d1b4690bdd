// Dismantling what the kernel holds for the stops of the service.
#include "service/stop_util.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "lun/lun_kernel.h"
#include "orloiscsi_configfs.h"
#include "platform/os_seam.h"
#include "target/iscsi_lio_unload_util.h"

namespace orlo {
namespace service {

namespace {

using orlo::target::JoinConfigfsPath;
using orlo::target::ListConfigfsDir;
using orlo::target::RemoveConfigfsDir;
using orlo::target::RemoveConfigfsLink;

// The S_IFMT bits of an entry, 0 when it has gone.
mode_t TypeOf(const std::string &path) {
    struct stat st;
    return orlo::os::Lstat(path.c_str(), &st) == 0 ? (st.st_mode & S_IFMT) : 0;
}

void KeepFirst(uint32_t *first, uint32_t ret) {
    if (*first == ORLO_OK) *first = ret;
}

// Drops a portal group's I_T nexus when it has one: an initiator still attached keeps
// the group's LUNs in use.
uint32_t DropNexus(const std::string &tpg) {
    std::string nexus;
    uint32_t ret = JoinConfigfsPath(tpg, "nexus", &nexus);
    if (ret != ORLO_OK) return ret;
    if (TypeOf(nexus) != S_IFREG) return ORLO_OK;  // a fabric without nexus
    char value[256];
    ret = ORLOiSCSIConfigfsGetString(nexus.c_str(), value, sizeof(value));
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsGetString(\"%s\", %p, %zu) failed, err=%s", nexus.c_str(),
                     static_cast<void *>(value), sizeof(value), ORLOiSCSIErrStr(ret));
        return ret;
    }
    value[strcspn(value, "\r\n")] = '\0';
    if (value[0] == '\0') return ORLO_OK;
    ret = ORLOiSCSIConfigfsWrite(nexus.c_str(), "NULL");
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"NULL\") failed, err=%s", nexus.c_str(), ORLOiSCSIErrStr(ret));
    }
    return ret;
}

// Unlinks every link inside a LUN entry, then removes the entry.
uint32_t RemoveLunEntry(const std::string &entry) {
    std::vector<std::string> names;
    uint32_t ret = ListConfigfsDir(entry, &names);
    if (ret != ORLO_OK) return ret;
    for (const std::string &name : names) {
        std::string link;
        if ((ret = JoinConfigfsPath(entry, name, &link)) != ORLO_OK) return ret;
        if (TypeOf(link) != S_IFLNK) continue;
        if ((ret = RemoveConfigfsLink(link)) != ORLO_OK) return ret;
    }
    return RemoveConfigfsDir(entry);
}

uint32_t RemovePortalGroup(const std::string &tpg) {
    uint32_t ret = DropNexus(tpg);
    if (ret != ORLO_OK) return ret;
    std::string lunDir;
    if ((ret = JoinConfigfsPath(tpg, "lun", &lunDir)) != ORLO_OK) return ret;
    std::vector<std::string> luns;
    if ((ret = ListConfigfsDir(lunDir, &luns)) != ORLO_OK) return ret;
    for (const std::string &lun : luns) {
        std::string entry;
        if ((ret = JoinConfigfsPath(lunDir, lun, &entry)) != ORLO_OK) return ret;
        if ((ret = RemoveLunEntry(entry)) != ORLO_OK) return ret;
    }
    return RemoveConfigfsDir(tpg);
}

uint32_t RemoveFabricNode(const std::string &node) {
    std::vector<std::string> names;
    uint32_t ret = ListConfigfsDir(node, &names);
    if (ret != ORLO_OK) return ret;
    for (const std::string &name : names) {
        if (name.compare(0, 5, "tpgt_") != 0) continue;  // default groups such as fabric_statistics
        std::string tpg;
        if ((ret = JoinConfigfsPath(node, name, &tpg)) != ORLO_OK) return ret;
        if (TypeOf(tpg) != S_IFDIR) continue;
        if ((ret = RemovePortalGroup(tpg)) != ORLO_OK) return ret;
    }
    return RemoveConfigfsDir(node);
}

// Takes one backstore out unless something still uses it.
uint32_t RemoveBackstore(const std::string &dir) {
    char link[4096];
    int linked = orlo::lun::FindBackstoreLink(dir.c_str(), link, sizeof(link));
    if (linked < 0) {
        ORLO_LOG_ERR("Failed to look for links to %s", dir.c_str());
        return ORLO_ERR_OPEN_DIR;
    }
    if (linked > 0) {
        ORLO_LOG_ERR("LUN is mapped: %s links to %s", link, dir.c_str());
        return orlo::lun::kErrLunMapped;
    }
    if (orlo::os::Rmdir(dir.c_str()) != 0) {
        if (errno == ENOENT) return ORLO_OK;
        ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", dir.c_str());
        if (errno == EBUSY) return orlo::lun::kErrLunMapped;  // held outside the fabrics (a virtual LUN)
        return ORLO_ERR_RMDIR;
    }
    return ORLO_OK;
}

}  // namespace

uint32_t DismantleFabric(const char *fabricDir) {
    std::vector<std::string> nodes;
    uint32_t ret = ListConfigfsDir(fabricDir, &nodes);
    if (ret != ORLO_OK) return ret;
    uint32_t first = ORLO_OK;
    for (const std::string &name : nodes) {
        std::string node;
        if ((ret = JoinConfigfsPath(fabricDir, name, &node)) != ORLO_OK) {
            KeepFirst(&first, ret);
            continue;
        }
        if (TypeOf(node) != S_IFDIR) continue;
        if ((ret = RemoveFabricNode(node)) != ORLO_OK) {
            ORLO_LOG_ERR("Failed to remove %s, err=%s", node.c_str(), ORLOiSCSIErrStr(ret));
            KeepFirst(&first, ret);
        }
    }
    return first;
}

uint32_t RemoveAllBackstores() {
    std::vector<std::string> hosts;
    uint32_t ret = ListConfigfsDir(kTargetCoreDir, &hosts);
    if (ret != ORLO_OK) return ret;
    uint32_t first = ORLO_OK;
    for (const std::string &host : hosts) {
        std::string hostDir;
        if ((ret = JoinConfigfsPath(kTargetCoreDir, host, &hostDir)) != ORLO_OK) {
            KeepFirst(&first, ret);
            continue;
        }
        if (TypeOf(hostDir) != S_IFDIR) continue;
        std::vector<std::string> names;
        if ((ret = ListConfigfsDir(hostDir, &names)) != ORLO_OK) {
            KeepFirst(&first, ret);
            continue;
        }
        for (const std::string &name : names) {
            std::string dir;
            if ((ret = JoinConfigfsPath(hostDir, name, &dir)) != ORLO_OK) {
                KeepFirst(&first, ret);
                continue;
            }
            if (TypeOf(dir) != S_IFDIR) continue;  // the host's own attributes
            if ((ret = RemoveBackstore(dir)) != ORLO_OK) KeepFirst(&first, ret);
        }
    }
    return first;
}

}  // namespace service
}  // namespace orlo
