// Service identifiers: a name, an owner (a process id or a number the application chose)
// and the UUID "<name>-<owner>", each text field a 32-byte array holding at most 31
// characters.
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "comm/orlocomm_internal.h"

extern "C" {

ORLO_EXPORT int ServiceUUIDGenerate(const char *name, int owner, char *dst, size_t n) {
    if (name == nullptr || dst == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    snprintf(dst, n, "%s-%d", name, owner);
    return 0;
}

ORLO_EXPORT int ServiceIDGenerateUUID(ServiceID *id) {
    if (id == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    char name[ORLOCOMM_NAME_SIZE];
    memcpy(name, id->service_name, sizeof(name));
    name[sizeof(name) - 1] = '\0';
    return ServiceUUIDGenerate(name, id->owner, id->uuid, sizeof(id->uuid));
}

ORLO_EXPORT ServiceID *GenServiceID(const char *name, int owner, const char *uuid) {
    auto *id = static_cast<ServiceID *>(calloc(1, sizeof(ServiceID)));
    if (id == nullptr) {
        COMM_ERR("Out of memory");
        return nullptr;
    }
    if (name != nullptr) orlocomm::CopyName(id->service_name, name);
    id->owner = owner;
    if (uuid != nullptr) {
        memcpy(id->uuid, uuid, strnlen(uuid, sizeof(id->uuid)));
        id->uuid[sizeof(id->uuid) - 1] = '\0';
    }
    return id;
}

ORLO_EXPORT int CompareUUID(const char *a, const char *b) {
    if (a == nullptr || b == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    return strncmp(a, b, ORLOCOMM_NAME_SIZE) == 0 ? 0 : 1;
}

ORLO_EXPORT int CompareSID(const ServiceID *a, const ServiceID *b) {
    if (a == nullptr || b == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    if (strncmp(a->service_name, b->service_name, ORLOCOMM_NAME_SIZE) != 0) return 1;
    if (a->owner != b->owner) return 1;
    return strncmp(a->uuid, b->uuid, ORLOCOMM_NAME_SIZE) == 0 ? 0 : 1;
}

}  // extern "C"
