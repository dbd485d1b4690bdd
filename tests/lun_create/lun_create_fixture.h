// Shared pieces of the LUN creation tests: a sandbox with loop-mounted volumes, records
// filled the way a management service fills them, and readers of what a creation left
// on disk and in the configuration files.
#ifndef ORLO_TESTS_LUN_CREATE_LUN_CREATE_FIXTURE_H
#define ORLO_TESTS_LUN_CREATE_LUN_CREATE_FIXTURE_H

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cstdio>
#include <cstring>
#include <filesystem>
#include <set>
#include <string>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_lun.h"
#include "support/loop_volume.h"

namespace lun_create_test {

using orlotest::LoopVolume;

constexpr const char *kGlobalConf = "/usr/orlo/etc/iscsi_lun.conf";
constexpr const char *kVolumeConf = "/volume1/@iSCSI/LUN/iscsi_lun.conf";
constexpr const char *kEventLog = "/var/log/orlo/event.log";
constexpr const char *kPluginDir = "/usr/orlo/plugins/lun/lun_create";
constexpr uint64_t kMiB = 1ULL << 20;
constexpr uint64_t kGiB = 1ULL << 30;

// A record as a caller fills it: no lid, uuid or serial.
inline ORLOiSCSILun NewLun(const std::string &name, uint32_t type, uint64_t size,
                           const std::string &root = "/volume1") {
    ORLOiSCSILun lun;
    memset(&lun, 0, sizeof(lun));
    lun.type = type;
    lun.size = size;
    lun.blockSize = 512;
    snprintf(lun.name, sizeof(lun.name), "%s", name.c_str());
    snprintf(lun.rootPath, sizeof(lun.rootPath), "%s", root.c_str());
    return lun;
}

class CreateTest : public orlotest::VolumeTest {
  protected:
    void SetUp() override {
        VolumeTest::SetUp();
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
    }

    std::string LunDir(const ORLOiSCSILun &lun) const {
        return std::string(lun.rootPath) + "/@iSCSI/LUN/" + ORLOiSCSILunTypeName(lun.type) + "/" + lun.uuid;
    }
    std::string DataFile(const ORLOiSCSILun &lun) const { return LunDir(lun) + "/" + lun.uuid + "_00000"; }

    bool StatOf(const std::string &logical, struct stat *st) const { return stat(Real(logical).c_str(), st) == 0; }

    // Every record of a LUN file (backup objects included); empty on failure.
    std::vector<ORLOiSCSILun> Records(const char *file) const {
        ORLOiSCSILunList list;
        ORLOiSCSIListInit(&list);
        ORLOiSCSILunFilter filter;
        memset(&filter, 0, sizeof(filter));
        filter.flags = ORLO_ISCSI_LUN_FILTER_ALL_WITH_BKP;
        std::vector<ORLOiSCSILun> out;
        if (ORLOiSCSILunConfLoadByPath(&filter, &list, file) == 0) {
            ORLOiSCSIListLink *link;
            ORLOiSCSILun *lun;
            ORLO_ISCSI_LUN_LIST_FOREACH(&list, link, lun) out.push_back(*lun);
        }
        ORLOiSCSILunListFree(&list);
        return out;
    }

    // Every path under the sandbox (relative), to see what a call made.
    std::set<std::string> Tree() const {
        std::set<std::string> out;
        std::error_code ec;
        for (auto it = std::filesystem::recursive_directory_iterator(root_, ec);
             it != std::filesystem::recursive_directory_iterator(); it.increment(ec)) {
            if (ec) break;
            out.insert(it->path().string().substr(root_.size()));
        }
        return out;
    }

    // Installs a plug-in script (sh) under the creation plug-in directory.
    void Plugin(const std::string &name, const std::string &body) const {
        WriteFile(std::string(kPluginDir) + "/" + name, "#!/bin/sh\n" + body, 0755);
    }
};

}  // namespace lun_create_test

#endif
