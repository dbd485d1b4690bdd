// orloiscsi conf: reads and changes the appliance's section files under their lock files.
#include <cstdio>
#include <cstring>
#include <string>

#include "base/iscsi_base_internal.h"
#include "cli.h"
#include "olibc.h"
#include "orloiscsi_base.h"

namespace cli {

namespace {

const int kConfLockTimeout = 60;  // seconds, as for every configuration file

// Takes the lock file of a configuration file for the life of the object.
class ConfLock {
  public:
    ConfLock(const char *file, bool exclusive) {
        char lockPath[320];
        code_ = ORLOiSCSIConfLockPathGet(file, lockPath, sizeof(lockPath));
        if (code_ != ORLO_OK) return;
        if (!OLIBCFileLockTimeByFile(lockPath, exclusive ? 1 : 0, kConfLockTimeout, &handle_)) {
            fprintf(stderr, "orloiscsi: could not lock %s within %d seconds\n", lockPath, kConfLockTimeout);
            code_ = ORLO_ERR_LOCK_FILE;
        }
    }
    ~ConfLock() {
        if (handle_ >= 0) OLIBCFileUnlockByFile(handle_);
    }
    uint32_t code() const { return code_; }

  private:
    int handle_ = -1;
    uint32_t code_ = ORLO_OK;
};

int RunSections(const Context &ctx, const Args &args) {
    if (args.size() != 1) return Usage(kConfObject, kConfObject.actions[0]);
    ConfLock lock(args[0].c_str(), false);
    if (lock.code() != ORLO_OK) return Fail(lock.code());
    POLIBC_SZLIST list = nullptr;
    int n = ORLOiSCSIConfSectionEnum(args[0].c_str(), &list);
    orlo::SzListGuard guard(list);
    if (n < 0) return Fail(ORLO_ERR_ENUM_SECTION);
    if (ctx.json) printf("[");
    for (int i = 0; i < n; ++i) {
        const char *name = OLIBCSzListGet(list, i);
        if (ctx.json)
            printf("%s%s", i ? "," : "", JsonQuote(name).c_str());
        else
            printf("%s\n", name);
    }
    if (ctx.json) printf("]\n");
    return 0;
}

int RunGet(const Context &ctx, const Args &args) {
    if (args.size() != 2) return Usage(kConfObject, kConfObject.actions[1]);
    ConfLock lock(args[0].c_str(), false);
    if (lock.code() != ORLO_OK) return Fail(lock.code());
    orlo::SzHashGuard hash(OLIBCSzHashAlloc(128));
    if (hash.get() == nullptr) return Fail(ORLO_ERR_OUT_OF_MEMORY);
    int found = OLIBCFileGetSection(args[0].c_str(), args[1].c_str(), hash.addr());
    if (found < 0) return Fail(OLIBCErrGet() == OLIBC_ERR_BAD_PARAM ? ORLO_ERR_BAD_PARAMETER : ORLO_ERR_GET_SECTION);
    if (found == 0) {
        fprintf(stderr, "orloiscsi: no section [%s] in %s\n", args[1].c_str(), args[0].c_str());
        return Fail(ORLO_ERR_GET_SECTION);
    }
    const char *k = nullptr, *v = nullptr;
    if (ctx.json) printf("{");
    for (int i = 0; OLIBCSzHashEnum(hash.get(), i, &k, &v); ++i) {
        if (ctx.json)
            printf("%s%s:%s", i ? "," : "", JsonQuote(k).c_str(), JsonQuote(v).c_str());
        else
            printf("%s=%s\n", k, v);
    }
    if (ctx.json) printf("}\n");
    return 0;
}

int RunPut(const Context &, const Args &args) {
    bool replace = false;
    Args rest;
    for (const std::string &a : args) {
        if (a == "--replace")
            replace = true;
        else
            rest.push_back(a);
    }
    if (rest.size() < 3) return Usage(kConfObject, kConfObject.actions[2]);
    const char *file = rest[0].c_str();
    const char *section = rest[1].c_str();
    ConfLock lock(file, true);
    if (lock.code() != ORLO_OK) return Fail(lock.code());
    orlo::SzHashGuard hash(OLIBCSzHashAlloc(128));
    if (hash.get() == nullptr) return Fail(ORLO_ERR_OUT_OF_MEMORY);
    // Without --replace the keys given are set and the section's other keys are kept.
    if (!replace && OLIBCFileExist(file) && OLIBCFileGetSection(file, section, hash.addr()) < 0)
        return Fail(OLIBCErrGet() == OLIBC_ERR_BAD_PARAM ? ORLO_ERR_BAD_PARAMETER : ORLO_ERR_GET_SECTION);
    for (size_t i = 2; i < rest.size(); ++i) {
        size_t eq = rest[i].find('=');
        if (eq == std::string::npos || eq == 0) {
            fprintf(stderr, "orloiscsi: '%s' is not KEY=VALUE\n", rest[i].c_str());
            return 2;
        }
        std::string key = rest[i].substr(0, eq), value = rest[i].substr(eq + 1);
        if (OLIBCSzHashSetValue(hash.addr(), key.c_str(), value.c_str()) != 0) return Fail(ORLO_ERR_OUT_OF_MEMORY);
    }
    uint32_t ret = ORLOiSCSIPutSectionToConfig(file, section, hash.get());
    return ret == ORLO_OK ? 0 : Fail(ret);
}

int RunRemove(const Context &, const Args &args) {
    if (args.size() < 2) return Usage(kConfObject, kConfObject.actions[3]);
    const char *file = args[0].c_str();
    orlo::SzListGuard list(OLIBCSzListAlloc(static_cast<int>(args.size())));
    if (list.get() == nullptr) return Fail(ORLO_ERR_OUT_OF_MEMORY);
    for (size_t i = 1; i < args.size(); ++i)
        if (OLIBCSzListPush(list.addr(), args[i].c_str()) < 0) return Fail(ORLO_ERR_OUT_OF_MEMORY);
    ConfLock lock(file, true);
    if (lock.code() != ORLO_OK) return Fail(lock.code());
    uint32_t ret = ORLOiSCSIRemoveSectionList(file, list.get());
    return ret == ORLO_OK ? 0 : Fail(ret);
}

const Action kActions[] = {
    {"sections", "FILE", "list the sections of a configuration file", RunSections},
    {"get", "FILE SECTION", "print a section's keys, one KEY=VALUE a line", RunGet},
    {"put", "[--replace] FILE SECTION KEY=VALUE...",
     "set keys of a section, creating it (and the file) if needed; --replace drops the keys not given",
     RunPut},
    {"remove", "FILE SECTION...", "remove sections with their keys", RunRemove},
    {nullptr, nullptr, nullptr, nullptr},
};

}  // namespace

const Object kConfObject = {"conf",
                            "read and change section files (appliance paths such as /usr/orlo/etc/iscsi_lun.conf), "
                            "under their lock files",
                            kActions};

}  // namespace cli
