// The upsert of one target section behind ORLOiSCSITargetConfAdd and
// ORLOiSCSITargetConfUpdate.  The two differ on purpose in what they accept and how they
// report: Add inserts or replaces, Update insists that an existing file already holds
// the section.  Secrets are enciphered; an empty secret is stored empty, an unchanged one
// keeps the form it is stored in.
#include <cstdio>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

namespace orlo {
namespace target {

namespace {

struct AuthWords {
    const char *authen;
    const char *mutual;
};

AuthWords AuthOf(int32_t type, bool update) {
    switch (type) {
        case ORLO_ISCSI_AUTH_NONE: return {"no", "no"};
        case ORLO_ISCSI_AUTH_CHAP: return {"yes", "no"};
        case ORLO_ISCSI_AUTH_MUTUAL_CHAP: return {"yes", "yes"};
        default: break;
    }
    if (update) return {"", ""};
    ORLO_LOG_ERR("Un-supported CHAP type %x", static_cast<unsigned>(type));
    return {"no", "no"};
}

// Enciphers a secret into out (64 bytes); an empty one stays empty.  A secret that the
// section already holds keeps its stored form (stored, or nullptr): the cipher draws a
// fresh nonce each time, and enciphering an unchanged secret again would rewrite the file
// (and make every reader parse it again) on each update, as every service start does.
int Encipher(const char *plain, const char *stored, char *out, size_t size) {
    out[0] = '\0';
    if (plain[0] == '\0') return 0;
    if (stored != nullptr && stored[0] != '\0' && strlen(stored) < size) {
        const int code = OLIBCErrGet();
        const char *file = OLIBCErrorGetFile();
        const int line = OLIBCErrorGetLine();
        char clear[ORLO_ISCSI_TARGET_CHAP_SIZE];
        const bool same = OLIBCCryptSzDecrypt(stored, clear, sizeof(clear)) == 0 && strcmp(clear, plain) == 0;
        explicit_bzero(clear, sizeof(clear));
        if (same) {
            strcpy(out, stored);
            return 0;
        }
        OLIBCErrSetEx(code, file, line);  // a stale or foreign stored form is no failure
    }
    return OLIBCCryptSzEncrypt(plain, out, size);
}

// Copies a stored value of the section (or "" when absent or too long to reuse).
void KeepStored(const OLIBC_SZHASH *section, const char *key, char *out, size_t size) {
    const char *v = OLIBCSzHashGetValue(section, key);
    out[0] = '\0';
    if (v != nullptr && strlen(v) < size) strcpy(out, v);
}

}  // namespace

uint32_t WriteTargetSection(const ORLOiSCSITarget *t, bool update) {
    if (t == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = CheckRecord(t, false);
    if (ret != ORLO_OK) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ret;
    }
    FileLockGuard lock(kLockPath, true, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    SzHashGuard hash(OLIBCSzHashAlloc(kHashSize));
    if (hash.get() == nullptr) {
        ORLO_LOG_ERR("OLIBCSzHashAlloc(%d) failed", kHashSize);
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    char section[kSectionNameSize];
    snprintf(section, sizeof(section), kSectionFmt, t->tid);

    const bool fileExists = OLIBCFileExist(kConfPath) == 1;
    bool present = false;
    char storedPassword[ORLO_ISCSI_TARGET_CHAP_SIZE] = "";
    char storedMutualPassword[ORLO_ISCSI_TARGET_CHAP_SIZE] = "";
    if (fileExists) {
        int got = OLIBCFileGetSection(kConfPath, section, hash.addr());
        if (got < 0) {
            if (update)
                ORLO_LOG_ERR("Failed to get section: %s from %s, errno=0x%X", section, kConfPath,
                             static_cast<unsigned>(OLIBCErrGet()));
            else
                ORLO_LOG_ERR("OLIBCFileGetSection(\"%s\", \"%s\", %p) failed, ret=%d", kConfPath, section,
                             static_cast<void *>(hash.addr()), got);
            return ORLO_ERR_GET_SECTION;
        }
        if (got == 0 && update) {
            ORLO_LOG_ERR("Failed to get old section: %s from %s, errno=0x%X", section, kConfPath,
                         static_cast<unsigned>(OLIBCErrGet()));
            return ORLO_ERR_DEFAULT;
        }
        present = got > 0;
        if (present) {
            KeepStored(hash.get(), "password", storedPassword, sizeof(storedPassword));
            KeepStored(hash.get(), "mutual_password", storedMutualPassword, sizeof(storedMutualPassword));
        }
        OLIBCSzHashRemoveAll(hash.get());
    }

    char tid[16];
    char recv[16];
    char send[16];
    char sessions[16];
    snprintf(tid, sizeof(tid), "%d", t->tid);
    snprintf(recv, sizeof(recv), "%d", t->max_recv_seg_bytes);
    snprintf(send, sizeof(send), "%d", t->max_send_seg_bytes);
    snprintf(sessions, sizeof(sessions), "%d", t->max_sessions);
    const AuthWords auth = AuthOf(t->auth_type, update);

    char password[ORLO_ISCSI_TARGET_CHAP_SIZE];
    char mutualPassword[ORLO_ISCSI_TARGET_CHAP_SIZE];
    if (Encipher(t->password, storedPassword, password, sizeof(password)) != 0) {
        ORLO_LOG_ERR("Failed to encrypt password[0x%04X %s:%d]", OLIBCErrGet(), OLIBCErrorGetFile(),
                     OLIBCErrorGetLine());
        return update ? kErrBadPassword : static_cast<uint32_t>(ORLO_ERR_DEFAULT);
    }
    if (Encipher(t->mutual_password, storedMutualPassword, mutualPassword, sizeof(mutualPassword)) != 0) {
        ORLO_LOG_ERR("Failed to encrypt mutual password[0x%04X %s:%d]", OLIBCErrGet(), OLIBCErrorGetFile(),
                     OLIBCErrorGetLine());
        return update ? kErrBadMutualPassword : static_cast<uint32_t>(ORLO_ERR_DEFAULT);
    }

    const char *pairs[][2] = {
        {"tid", tid},
        {"name", t->name},
        {"iqn", t->iqn},
        {"enabled", t->enabled ? "yes" : "no"},
        {"authen", auth.authen},
        {"username", t->user},
        {"password", password},
        {"mutual", auth.mutual},
        {"mutual_username", t->mutual_user},
        {"mutual_password", mutualPassword},
        {"hdr_chksum", t->has_header_checksum ? "yes" : "no"},
        {"data_chksum", t->has_data_checksum ? "yes" : "no"},
        {"send_seg_bytes", send},
        {"recv_seg_bytes", recv},
        {"max_sessions", sessions},
        {"bkp_obj", t->bkp_obj ? "1" : "0"},
        {"network_portals", t->network_portals},
    };
    for (const auto &kv : pairs) {
        if (OLIBCSzHashSetValue(hash.addr(), kv[0], kv[1]) != 0) {
            ORLO_LOG_PLATFORM("OLIBCSzHashSetValue(%p, \"%s\")", static_cast<void *>(hash.addr()), kv[0]);
            return ORLO_ERR_OUT_OF_MEMORY;
        }
    }

    if (present) {
        if (OLIBCFileSetSection(kConfPath, section, section, hash.get(), kLineFmt) < 1) {
            if (update)
                ORLO_LOG_ERR("Failed to set section: %s from %s, errno=0x%X", section, kConfPath,
                             static_cast<unsigned>(OLIBCErrGet()));
            else
                ORLO_LOG_PLATFORM("OLIBCFileSetSection(\"%s\", \"%s\", \"%s\", %p)", kConfPath, section, section,
                                  static_cast<void *>(hash.get()));
            return ORLO_ERR_SET_SECTION;
        }
        return ORLO_OK;
    }
    if (!fileExists && OLIBCFileTouch(kConfPath) < 0) {
        if (update)
            ORLO_LOG_ERR("Failed to touch %s", kConfPath);
        else
            ORLO_LOG_PLATFORM("OLIBCFileTouch(\"%s\")", kConfPath);
        return ORLO_ERR_TOUCH_FILE;
    }
    if (OLIBCFileAddSection(kConfPath, section, hash.get(), kLineFmt) < 1) {
        if (update)
            ORLO_LOG_ERR("Failed to add section: %s from %s, errno=0x%X", section, kConfPath,
                         static_cast<unsigned>(OLIBCErrGet()));
        else
            ORLO_LOG_PLATFORM("OLIBCFileAddSection(\"%s\", \"%s\", %p)", kConfPath, section,
                              static_cast<void *>(hash.get()));
        return ORLO_ERR_ADD_SECTION;
    }
    return ORLO_OK;
}

}  // namespace target
}  // namespace orlo
