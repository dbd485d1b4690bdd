// orloiscsi conf: reads and changes the appliance's section files under their lock files.
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

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

struct ConfArgs {
    std::string file, section;
    std::vector<std::string> rest;  // KEY=VALUE... or SECTION...
    bool replace = false;
};

int RunSections(const ConfArgs &a) {
    ConfLock lock(a.file.c_str(), false);
    if (lock.code() != ORLO_OK) return Fail(lock.code());
    POLIBC_SZLIST list = nullptr;
    int n = ORLOiSCSIConfSectionEnum(a.file.c_str(), &list);
    orlo::SzListGuard guard(list);
    if (n < 0) return Fail(ORLO_ERR_ENUM_SECTION);
    if (Ctx().json) {
        Json doc = Json::Array();
        for (int i = 0; i < n; ++i) doc.Push(Json::Str(OLIBCSzListGet(list, i)));
        PrintJson(doc);
        return 0;
    }
    for (int i = 0; i < n; ++i) printf("%s\n", OLIBCSzListGet(list, i));
    return 0;
}

int RunGet(const ConfArgs &a) {
    ConfLock lock(a.file.c_str(), false);
    if (lock.code() != ORLO_OK) return Fail(lock.code());
    orlo::SzHashGuard hash(OLIBCSzHashAlloc(128));
    if (hash.get() == nullptr) return Fail(ORLO_ERR_OUT_OF_MEMORY);
    int found = OLIBCFileGetSection(a.file.c_str(), a.section.c_str(), hash.addr());
    if (found < 0) {
        uint32_t code = OLIBCErrGet() == OLIBC_ERR_BAD_PARAM ? ORLO_ERR_BAD_PARAMETER : ORLO_ERR_GET_SECTION;
        if (!OLIBCFileExist(a.file.c_str())) fprintf(stderr, "orloiscsi: there is no file %s\n", a.file.c_str());
        return Fail(code);
    }
    if (found == 0) {
        fprintf(stderr, "orloiscsi: no section [%s] in %s\n", a.section.c_str(), a.file.c_str());
        return Fail(ORLO_ERR_GET_SECTION);
    }
    const char *k = nullptr, *v = nullptr;
    Json doc = Json::Object();
    for (int i = 0; OLIBCSzHashEnum(hash.get(), i, &k, &v); ++i) {
        if (Ctx().json)
            doc.SetStr(k, v);
        else
            printf("%s=%s\n", k, v);
    }
    if (Ctx().json) PrintJson(doc);
    return 0;
}

int RunPut(const ConfArgs &a) {
    const char *file = a.file.c_str();
    const char *section = a.section.c_str();
    for (const std::string &kv : a.rest) {
        size_t eq = kv.find('=');
        if (eq == std::string::npos || eq == 0) return UsageError("'" + kv + "' is not KEY=VALUE");
    }
    ConfLock lock(file, true);
    if (lock.code() != ORLO_OK) return Fail(lock.code());
    orlo::SzHashGuard hash(OLIBCSzHashAlloc(128));
    if (hash.get() == nullptr) return Fail(ORLO_ERR_OUT_OF_MEMORY);
    // Without --replace the keys given are set and the section's other keys are kept.
    if (!a.replace && OLIBCFileExist(file) && OLIBCFileGetSection(file, section, hash.addr()) < 0)
        return Fail(OLIBCErrGet() == OLIBC_ERR_BAD_PARAM ? ORLO_ERR_BAD_PARAMETER : ORLO_ERR_GET_SECTION);
    for (const std::string &kv : a.rest) {
        size_t eq = kv.find('=');
        std::string key = kv.substr(0, eq), value = kv.substr(eq + 1);
        if (OLIBCSzHashSetValue(hash.addr(), key.c_str(), value.c_str()) != 0) return Fail(ORLO_ERR_OUT_OF_MEMORY);
    }
    uint32_t ret = ORLOiSCSIPutSectionToConfig(file, section, hash.get());
    return ret == ORLO_OK ? 0 : Fail(ret);
}

int RunRemove(const ConfArgs &a) {
    const char *file = a.file.c_str();
    orlo::SzListGuard list(OLIBCSzListAlloc(static_cast<int>(a.rest.size()) + 1));
    if (list.get() == nullptr) return Fail(ORLO_ERR_OUT_OF_MEMORY);
    for (const std::string &s : a.rest)
        if (OLIBCSzListPush(list.addr(), s.c_str()) < 0) return Fail(ORLO_ERR_OUT_OF_MEMORY);
    ConfLock lock(file, true);
    if (lock.code() != ORLO_OK) return Fail(lock.code());
    uint32_t ret = ORLOiSCSIRemoveSectionList(file, list.get());
    return ret == ORLO_OK ? 0 : Fail(ret);
}

const char kFileHelp[] = "the section file, an appliance path such as /usr/orlo/etc/iscsi_target.conf";

}  // namespace

void RegisterConf(CLI::App *root) {
    static ConfArgs a;
    CLI::App *obj = AddObject(root, "conf",
                              "read and change section files (appliance paths such as "
                              "/usr/orlo/etc/iscsi_lun.conf), under their lock files");
    CLI::App *act = AddAction(obj, "sections", "list the sections of a configuration file", [] { return RunSections(a); });
    AddPositional(act, "FILE", &a.file, kFileHelp);
    act = AddAction(obj, "get", "print a section's keys, one KEY=VALUE a line", [] { return RunGet(a); });
    AddPositional(act, "FILE", &a.file, kFileHelp);
    AddPositional(act, "SECTION", &a.section, "the section's name");
    act = AddAction(obj, "put",
                    "set keys of a section, creating it (and the file) if needed; --replace drops the keys not given",
                    [] { return RunPut(a); });
    AddFlag(act, "--replace", &a.replace, "the section keeps only the keys given");
    AddPositional(act, "FILE", &a.file, kFileHelp);
    AddPositional(act, "SECTION", &a.section, "the section's name");
    AddPositionals(act, "KEY=VALUE", &a.rest, "a key and its value");
    act = AddAction(obj, "remove", "remove sections with their keys", [] { return RunRemove(a); });
    AddPositional(act, "FILE", &a.file, kFileHelp);
    AddPositionals(act, "SECTION", &a.rest, "a section's name");
}

}  // namespace cli
