// The directory the EP journal lives in: "vaai_journal_rootpath" of /etc/orloinfo.conf
// when it holds an absolute path and the caller does not ask for the default, else
// "/var/db/iscsi".
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT int ORLOiSCSIEpJournalRootPathGet(char *buf, size_t size, bool forceDefault) {
    if (buf == nullptr || size == 0) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    buf[0] = '\0';
    int n = -1;
    if (OLIBCFileExist(SZF_ORLO_INFO)) {
        n = OLIBCFileGetKeyValue(SZF_ORLO_INFO, SZK_JOURNAL_ROOTPATH, buf, size);
        if (n < 0 && OLIBCErrGet() != OLIBC_ERR_NOT_FOUND) {
            buf[0] = '\0';
            ORLO_LOG_ERR("failed to get journal root path");
            return -1;
        }
    }
    if (n > 0 && buf[0] == '/' && !forceDefault) {
        // "/var/db/iscsi/" and "/var/db/iscsi" are one directory.
        size_t len = strlen(buf);
        while (len > 1 && buf[len - 1] == '/') buf[--len] = '\0';
        return 0;
    }
    if (sizeof(EP_JNL_DEFAULT_ROOT) > size) {
        buf[0] = '\0';
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", size);
        return -1;
    }
    memcpy(buf, EP_JNL_DEFAULT_ROOT, sizeof(EP_JNL_DEFAULT_ROOT));
    return 0;
}
