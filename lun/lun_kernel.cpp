// Helpers shared by loading, unloading and deleting LUNs.
#include "lun/lun_kernel.h"

#include <dirent.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"

namespace orlo {
namespace lun {

namespace {

constexpr const char *kTargetRoot = "/config/target";

// "a/b/../c/./d" -> "/a/c/d": the path a link's text leads to, worked out by name as
// configfs links never lead through further links.
std::string Normalize(const std::string &path) {
    std::vector<std::string> parts;
    size_t i = 0;
    while (i <= path.size()) {
        size_t j = path.find('/', i);
        if (j == std::string::npos) j = path.size();
        std::string part = path.substr(i, j - i);
        i = j + 1;
        if (part.empty() || part == ".") continue;
        if (part == "..") {
            if (!parts.empty()) parts.pop_back();
            continue;
        }
        parts.push_back(part);
    }
    std::string out;
    for (const std::string &p : parts) out += "/" + p;
    return out.empty() ? "/" : out;
}

bool StartsWith(const char *s, const char *prefix) { return strncmp(s, prefix, strlen(prefix)) == 0; }

// The file type of a directory entry: from readdir where the file system tells it,
// else from lstat (0 when the entry has gone).  Saves a request per entry on configfs.
mode_t EntryType(const std::string &dir, const struct dirent *e) {
    switch (e->d_type) {
        case DT_DIR: return S_IFDIR;
        case DT_LNK: return S_IFLNK;
        case DT_REG: return S_IFREG;
        default: break;
    }
    struct stat st;
    std::string path = dir + "/" + e->d_name;
    return orlo::os::Lstat(path.c_str(), &st) == 0 ? (st.st_mode & S_IFMT) : 0;
}

// Names of the subdirectories of dir (links and files skipped), optionally only those
// beginning with prefix.  False (logged) when dir cannot be read; a missing dir is empty.
bool SubDirs(const std::string &dir, const char *prefix, std::vector<std::string> *out) {
    out->clear();
    DirGuard d(orlo::os::Opendir(dir.c_str()));
    if (d.get() == nullptr) {
        if (errno == ENOENT || errno == ENOTDIR) return true;  // gone while we looked
        ORLO_LOG_ERR("opendir(\"%s\") failed, err=%m", dir.c_str());
        return false;
    }
    while (struct dirent *e = readdir(d.get())) {
        if (strcmp(e->d_name, ".") == 0 || strcmp(e->d_name, "..") == 0) continue;
        if (prefix != nullptr && !StartsWith(e->d_name, prefix)) continue;
        if (EntryType(dir, e) != S_IFDIR) continue;
        out->push_back(e->d_name);
    }
    return true;
}

// 1 when some link directly inside entry leads to want (its path in linkOut), 0 when
// none does, -1 on a read failure.
int LinkIn(const std::string &entry, const std::string &want, char *linkOut, size_t size) {
    DirGuard d(orlo::os::Opendir(entry.c_str()));
    if (d.get() == nullptr) {
        if (errno == ENOENT || errno == ENOTDIR) return 0;
        ORLO_LOG_ERR("opendir(\"%s\") failed, err=%m", entry.c_str());
        return -1;
    }
    while (struct dirent *e = readdir(d.get())) {
        if (strcmp(e->d_name, ".") == 0 || strcmp(e->d_name, "..") == 0) continue;
        if (EntryType(entry, e) != S_IFLNK) continue;
        std::string path = entry + "/" + e->d_name;
        char text[4096];
        ssize_t n = orlo::os::Readlink(path.c_str(), text, sizeof(text) - 1);
        if (n < 0) {
            if (errno == ENOENT) continue;
            ORLO_LOG_ERR("readlink(\"%s\") failed, err=%m", path.c_str());
            return -1;
        }
        text[n] = '\0';
        std::string target = text[0] == '/' ? std::string(text) : entry + "/" + text;
        if (Normalize(target) != want) continue;
        snprintf(linkOut, size, "%s", path.c_str());
        return 1;
    }
    return 0;
}

}  // namespace

uint32_t KernelDataPath(const ORLOiSCSILun *lun, char *buf, size_t size) {
    int n;
    if (lun->stateFlags & ORLO_ISCSI_LUN_STATE_EP_UNMAP)
        n = snprintf(buf, size, "%s/@iSCSI/EP_unmap/%s", lun->rootPath, lun->uuid);
    else if (lun->stateFlags & ORLO_ISCSI_LUN_STATE_TMP)
        n = snprintf(buf, size, "%s/@iSCSI/tmp/%s/%s_%05d", lun->rootPath, lun->uuid, lun->uuid, 0);
    else
        n = snprintf(buf, size, "%s/@iSCSI/LUN/%s/%s/%s_%05d", lun->rootPath, ORLOiSCSILunTypeName(lun->type),
                     lun->uuid, lun->uuid, 0);
    if (n < 0 || static_cast<size_t>(n) >= size) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", size);
        buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}

uint32_t BackstoreAttrPath(const char *dir, const char *leaf, char *buf, size_t size) {
    int n = snprintf(buf, size, "%s/%s", dir, leaf);
    if (n < 0 || static_cast<size_t>(n) >= size) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", size);
        buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}

int FindBackstoreLink(const char *dir, char *linkOut, size_t size) {
    const std::string want = Normalize(dir);
    std::vector<std::string> fabrics, nodes, tpgs, luns;
    if (!SubDirs(kTargetRoot, nullptr, &fabrics)) return -1;
    for (const std::string &fabric : fabrics) {
        if (fabric == "core") continue;
        const std::string fabricDir = std::string(kTargetRoot) + "/" + fabric;
        if (!SubDirs(fabricDir, nullptr, &nodes)) return -1;
        for (const std::string &node : nodes) {
            const std::string nodeDir = fabricDir + "/" + node;
            if (!SubDirs(nodeDir, "tpgt_", &tpgs)) return -1;
            for (const std::string &tpg : tpgs) {
                const std::string lunRoot = nodeDir + "/" + tpg + "/lun";
                if (!SubDirs(lunRoot, "lun_", &luns)) return -1;
                for (const std::string &entry : luns) {
                    int found = LinkIn(lunRoot + "/" + entry, want, linkOut, size);
                    if (found != 0) return found;
                }
            }
        }
    }
    return 0;
}

}  // namespace lun
}  // namespace orlo
