// Lists the section names of a configuration file.  The caller holds the file's lock.
#include "base/iscsi_base_internal.h"

namespace {
constexpr int kSectionListCapacity = 1024;
}

extern "C" ORLO_EXPORT int ORLOiSCSIConfSectionEnum(const char *path, POLIBC_SZLIST *ppList) {
    if (path == nullptr || path[0] == '\0' || ppList == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    if (!OLIBCFileExist(path)) return 0;

    orlo::SzListGuard list(OLIBCSzListAlloc(kSectionListCapacity));
    if (list.get() == nullptr) {
        ORLO_LOG_ERR("OLIBCSzListAlloc(%d) failed", kSectionListCapacity);
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return -1;
    }
    int count = OLIBCFileEnumSection(path, list.addr());
    if (count < 0) {
        ORLO_LOG_PLATFORM("OLIBCFileEnumSection(\"%s\", %p)", path, static_cast<void *>(list.addr()));
        return -1;
    }
    *ppList = list.release();
    return count;
}
