// Directory helpers for dismantling configfs trees.
#include "target/iscsi_lio_unload_util.h"

#include <dirent.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"

namespace orlo {
namespace target {

uint32_t JoinConfigfsPath(const std::string &dir, const std::string &name, std::string *out) {
    if (dir.size() + 1 + name.size() >= kConfigfsPathSize) {
        ORLO_LOG_ERR("path \"%s/%s\" exceeds %zu bytes", dir.c_str(), name.c_str(), kConfigfsPathSize);
        return ORLO_ERR_PARSE_STRING;
    }
    *out = dir + "/" + name;
    return ORLO_OK;
}

uint32_t ListConfigfsDir(const std::string &dir, std::vector<std::string> *names) {
    names->clear();
    DIR *d = os::Opendir(dir.c_str());
    if (d == nullptr) {
        if (errno == ENOENT) return ORLO_OK;
        ORLO_LOG_ERR("opendir(\"%s\") failed, err=%m", dir.c_str());
        return ORLO_ERR_OPEN_DIR;
    }
    while (struct dirent *e = readdir(d)) {
        if (strcmp(e->d_name, ".") == 0 || strcmp(e->d_name, "..") == 0) continue;
        names->push_back(e->d_name);
    }
    // The stream's address is printed before closedir frees it, for the log line only.
    char stream[32];
    snprintf(stream, sizeof(stream), "%p", static_cast<void *>(d));
    if (closedir(d) != 0) {
        ORLO_LOG_ERR("closedir(%s) failed, err=%m", stream);
        return ORLO_ERR_CLOSE_FILE;
    }
    std::sort(names->begin(), names->end());
    return ORLO_OK;
}

uint32_t RemoveConfigfsDir(const std::string &dir) {
    if (os::Rmdir(dir.c_str()) != 0 && errno != ENOENT) {
        ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", dir.c_str());
        return ORLO_ERR_RMDIR;
    }
    return ORLO_OK;
}

uint32_t RemoveConfigfsLink(const std::string &link) {
    if (os::Unlink(link.c_str()) != 0 && errno != ENOENT) {
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", link.c_str());
        return ORLO_ERR_UNLINK_FILE;
    }
    return ORLO_OK;
}

}  // namespace target
}  // namespace orlo
