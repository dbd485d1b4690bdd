// The private pieces of LUN creation: the web-API debug line, the LUN count setting, the
// look-ups on one loaded list of every LUN, the plug-ins' JSON and the space rule.
#include <json-c/json.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "lun/lun_create_internal.h"
#include "lun/lun_internal.h"
#include "orloiscsi_file.h"
#include "platform/olibc_file_internal.h"

void OrloWebApiDebug(const char *file, int line, const char *func, const char *format, ...) {
    char message[1024];
    va_list ap;
    va_start(ap, format);
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
    vsnprintf(message, sizeof(message), format, ap);
#pragma GCC diagnostic pop
    va_end(ap);
    OrloLog(LOG_DEBUG, "[D] iSCSIWebAPI:%s:%d:%s %s", file, line, func, message);
}

namespace orlo {
namespace lun {

namespace {

constexpr const char *kOrloInfoDefaults = "/etc.defaults/orloinfo.conf";
constexpr const char *kKeyMaxLuns = "max_iscsiluns";
constexpr int kUuidAttempts = 16;

}  // namespace

int QuantityLimit() {
    if (!OLIBCFileExist(kOrloInfoDefaults)) return kDefaultQuantityLimit;
    char value[32];
    if (OLIBCFileGetKeyValue(kOrloInfoDefaults, kKeyMaxLuns, value, sizeof(value)) < 0) {
        if (OLIBCErrGet() != OLIBC_ERR_NOT_FOUND)
            ORLO_LOG_PLATFORM("OLIBCFileGetKeyValue(\"%s\", \"%s\", %p, %zu)", kOrloInfoDefaults, kKeyMaxLuns,
                              static_cast<void *>(value), sizeof(value));
        return kDefaultQuantityLimit;
    }
    char *end = nullptr;
    errno = 0;
    long limit = strtol(value, &end, 10);
    if (end == value || *end != '\0' || errno != 0 || limit > 0x7FFFFFFFL) {
        ORLO_LOG_ERR("Bad %s in %s: \"%s\"", kKeyMaxLuns, kOrloInfoDefaults, value);
        return kDefaultQuantityLimit;
    }
    return limit < 0 ? kDefaultQuantityLimit : static_cast<int>(limit);
}

uint32_t LoadIdentities(std::vector<LunIdentity> *luns) {
    luns->clear();
    FileLockGuard lock(kConfLockPath, false, kConfLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kConfLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    olibc::FileImage image;
    if (olibc::ReadImage(kGlobalConfPath, &image, false) != 0) {
        if (OLIBCErrGet() == OLIBC_ERR_NOT_FOUND) return ORLO_OK;
        ORLO_LOG_PLATFORM("ReadImage(\"%s\", %p, false)", kGlobalConfPath, static_cast<void *>(&image));
        return ORLO_ERR_OPEN_FILE;
    }
    olibc::LineScanner scanner(image.data);
    olibc::Line line;
    while (scanner.Next(&line)) {
        if (line.kind == olibc::LineKind::kHeader || line.kind == olibc::LineKind::kBadHeader) {
            luns->emplace_back();
            continue;
        }
        if (luns->empty()) continue;  // lines before the first section belong to no LUN
        scanner.Parse(&line);
        if (line.kind != olibc::LineKind::kKey) continue;
        LunIdentity &lun = luns->back();
        if (line.key == "lid")
            lun.lid = static_cast<int>(strtol(std::string(line.value).c_str(), nullptr, 10));
        else if (line.key == "name")
            lun.name.assign(line.value);
        else if (line.key == "uuid")
            lun.uuid.assign(line.value);
    }
    return ORLO_OK;
}

int UnusedLidIn(const std::vector<LunIdentity> &luns) {
    // With n LUNs, one of the lids 1..n+1 is free: mark those in use and take the first gap.
    const size_t n = luns.size();
    std::vector<bool> used(n + 1, false);
    for (const LunIdentity &lun : luns)
        if (lun.lid >= 1 && static_cast<size_t>(lun.lid) <= n) used[static_cast<size_t>(lun.lid)] = true;
    size_t lid = n + 1;
    for (size_t i = 1; i <= n; ++i) {
        if (!used[i]) {
            lid = i;
            break;
        }
    }
    return lid <= ORLO_ISCSI_LID_MAX ? static_cast<int>(lid) : -1;
}

bool NameIn(const std::vector<LunIdentity> &luns, const char *name) {
    for (const LunIdentity &lun : luns)
        if (lun.name == name) return true;
    return false;
}

bool UuidIn(const std::vector<LunIdentity> &luns, const char *uuid) {
    for (const LunIdentity &lun : luns)
        if (lun.uuid == uuid) return true;
    return false;
}

uint32_t UuidGenerateAvoiding(const std::vector<LunIdentity> &luns, char *uuid) {
    for (int attempt = 0; attempt < kUuidAttempts; ++attempt) {
        uint32_t ret = ORLOiSCSIUuidStrGen(uuid);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIUuidStrGen(%p) failed, err=%s", static_cast<void *>(uuid), ORLOiSCSIErrStr(ret));
            uuid[0] = '\0';
            return ret;
        }
        if (!UuidIn(luns, uuid)) return ORLO_OK;
    }
    ORLO_LOG_ERR("Failed to generate a UUID that no LUN uses after %d attempts", kUuidAttempts);
    uuid[0] = '\0';
    return kErrGenerateUuid;
}

std::string PluginJson(const ORLOiSCSILun *lun, bool withResult, uint32_t result) {
    json_object *obj = json_object_new_object();
    if (obj == nullptr) return std::string();
    auto freeObj = MakeScopeExit([obj] { json_object_put(obj); });
    struct Field {
        const char *key;
        json_object *value;
    };
    const Field fields[] = {
        {"name", json_object_new_string(lun->name)},
        {"type", json_object_new_string(ORLOiSCSILunTypeName(lun->type))},
        {"uuid", json_object_new_string(lun->uuid)},
        {"lid", json_object_new_int(lun->lid)},
        {"size", json_object_new_int64(static_cast<int64_t>(lun->size))},
        {"block_size", json_object_new_int64(lun->blockSize)},
        {"root_path", json_object_new_string(lun->rootPath)},
        {"result", withResult ? json_object_new_int64(result) : nullptr},
    };
    bool ok = true;
    for (const Field &f : fields) {
        if (f.value == nullptr) {
            // Only "result" is left out on purpose (the pre-step has none).
            if (withResult || strcmp(f.key, "result") != 0) ok = false;
            continue;
        }
        // On success the object owns the value; on failure it is ours to drop.
        if (json_object_object_add(obj, f.key, f.value) != 0) {
            json_object_put(f.value);
            ok = false;
        }
    }
    if (!ok) return std::string();
    const char *text = json_object_to_json_string_ext(obj, JSON_C_TO_STRING_PLAIN);
    return text != nullptr ? std::string(text) : std::string();
}

uint64_t SpaceReserve(uint64_t totalBytes) {
    // One per cent of the volume, at most 1 GiB: enough for the file system's own
    // metadata and the appliance's logs once the LUN is there.
    const uint64_t onePercent = totalBytes / 100;
    return onePercent < (1ULL << 30) ? onePercent : (1ULL << 30);
}

uint64_t SpaceNeeded(const ORLOiSCSILun *lun, uint64_t totalBytes) {
    const uint64_t reserve = SpaceReserve(totalBytes);
    if (ORLO_ISCSI_LUN_IS_ADV(lun->type)) return reserve + kAdvMetaBytes;
    if (ORLO_ISCSI_LUN_TYPE_HAS(lun->type, ORLO_ISCSI_LUN_TYPE_THIN)) return reserve + kThinMetaBytes;
    return reserve + lun->size;
}

}  // namespace lun
}  // namespace orlo
