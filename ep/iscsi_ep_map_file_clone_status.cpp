// State of a kernel clone: running while the child's "info/extent/child" says
// "clone_ongoing" with a value other than 0 (or the bare key); otherwise done when the
// child's synced count reached its total, else failed.
#include <sys/stat.h>
#include <unistd.h>

#include <cctype>
#include <cstdlib>
#include <cstring>
#include <string>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orloiscsi_configfs.h"
#include "platform/os_seam.h"

namespace {

// Finds "clone_ongoing" at the start of a line, followed by nothing, or by '=' or ':'
// and a value; a value of 0, "no" or "false" means no clone runs.
bool CloneOngoing(const char *text) {
    static const char kKey[] = "clone_ongoing";
    const size_t keyLen = sizeof(kKey) - 1;
    for (const char *line = text; line != nullptr && *line != '\0';) {
        const char *end = strchr(line, '\n');
        size_t len = end != nullptr ? static_cast<size_t>(end - line) : strlen(line);
        const char *p = line;
        while (p < line + len && isspace(static_cast<unsigned char>(*p))) ++p;
        if (static_cast<size_t>(line + len - p) >= keyLen && strncmp(p, kKey, keyLen) == 0) {
            p += keyLen;
            while (p < line + len && (*p == ' ' || *p == '\t')) ++p;
            if (p == line + len) return true;
            if (*p == '=' || *p == ':') {
                ++p;
                while (p < line + len && (*p == ' ' || *p == '\t')) ++p;
                std::string v(p, static_cast<size_t>(line + len - p));
                while (!v.empty() && isspace(static_cast<unsigned char>(v.back()))) v.pop_back();
                if (v.empty()) return true;
                if (v == "no" || v == "false") return false;
                char *numEnd = nullptr;
                long n = strtol(v.c_str(), &numEnd, 10);
                return !(numEnd != v.c_str() && *numEnd == '\0' && n == 0);
            }
        }
        line = end != nullptr ? end + 1 : nullptr;
    }
    return false;
}

}  // namespace

extern "C" ORLO_EXPORT int ORLOiSCSIEpMapFileCloneStatus(const char *mapPath, const char *childConfigfsDir) {
    if (mapPath == nullptr || mapPath[0] == '\0' || childConfigfsDir == nullptr || childConfigfsDir[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    struct stat st;
    if (orlo::os::Stat(childConfigfsDir, &st) == 0 && S_ISDIR(st.st_mode)) {
        char info[320];
        if (orlo::ep::PathBuild(info, sizeof(info), "%s/info/extent/child", childConfigfsDir) != ORLO_OK) return -1;
        if (orlo::os::Access(info, F_OK) == 0) {
            char text[ORLO_CONFIGFS_BUF_SIZE];
            uint32_t ret = ORLOiSCSIConfigfsGetString(info, text, sizeof(text));
            if (ret != ORLO_OK)
                ORLO_LOG_ERR("ORLOiSCSIConfigfsGetString(\"%s\", %p, %zu) failed, err=%s", info,
                             static_cast<void *>(text), sizeof(text), ORLOiSCSIErrStr(ret));
            else if (CloneOngoing(text))
                return 1;
        }
    }
    bool done = false;
    uint32_t ret = ORLOiSCSIEpIsCloneDone(mapPath, &done);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpIsCloneDone(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(&done),
                     ORLOiSCSIErrStr(ret));
        return -1;
    }
    // The kernel no longer runs the clone: short of its total it failed.
    return done ? 0 : -1;
}
