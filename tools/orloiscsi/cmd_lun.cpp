// orloiscsi lun: create, list, show, load, unload and delete LUNs.
#include <strings.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>

#include "cli.h"
#include "olibc.h"
#include "orloiscsi_base.h"
#include "orloiscsi_lun.h"
#include "platform/os_seam.h"

namespace cli {

namespace {

const uint32_t kTypes[] = {ORLO_ISCSI_LUN_TYPE_BLOCK, ORLO_ISCSI_LUN_TYPE_FILE,      ORLO_ISCSI_LUN_TYPE_THIN,
                           ORLO_ISCSI_LUN_TYPE_ADV,   ORLO_ISCSI_LUN_TYPE_SINK,      ORLO_ISCSI_LUN_TYPE_VDISK_ADV,
                           ORLO_ISCSI_LUN_TYPE_BKP_THIN, ORLO_ISCSI_LUN_TYPE_BKP_ADV, ORLO_ISCSI_LUN_TYPE_CINDER,
                           ORLO_ISCSI_LUN_TYPE_BLUN,  ORLO_ISCSI_LUN_TYPE_VDISK_BLUN};

bool ParseType(const std::string &s, uint32_t *type) {
    for (uint32_t t : kTypes)
        if (strcasecmp(s.c_str(), ORLOiSCSILunTypeName(t)) == 0) {
            *type = t;
            return true;
        }
    return false;
}

// "10G", "512M", "4096": a size in bytes with an optional binary K, M, G or T.
bool ParseSize(const std::string &s, uint64_t *bytes) {
    if (s.empty() || s[0] < '0' || s[0] > '9') return false;
    errno = 0;
    char *end = nullptr;
    unsigned long long v = strtoull(s.c_str(), &end, 10);
    if (errno != 0) return false;
    unsigned shift = 0;
    if (*end != '\0') {
        switch (*end) {
            case 'k': case 'K': shift = 10; break;
            case 'm': case 'M': shift = 20; break;
            case 'g': case 'G': shift = 30; break;
            case 't': case 'T': shift = 40; break;
            default: return false;
        }
        ++end;
        if (*end == 'i') ++end;
        if (*end == 'B' || *end == 'b') ++end;
        if (*end != '\0') return false;
    }
    if (shift != 0 && v > (UINT64_MAX >> shift)) return false;
    *bytes = static_cast<uint64_t>(v) << shift;
    return true;
}

bool ParseInt(const std::string &s, long min, long max, long *out) {
    errno = 0;
    char *end = nullptr;
    long v = strtol(s.c_str(), &end, 10);
    if (s.empty() || errno != 0 || *end != '\0' || v < min || v > max) return false;
    *out = v;
    return true;
}

// The arguments of every lun action (only the chosen action's are filled).
struct LunArgs {
    std::string lun, name, type, size, volume, blockSize, lid, uuid, extentSize;
    bool progress = false, all = false;
};

// Finds the LUN named by LUN (or --name), --lid N or --uuid U.  0 or a result code;
// when the command line was at fault, *exitStatus holds the exit status (after the
// usage line has been printed).
uint32_t SelectLun(const LunArgs &o, ORLOiSCSILun *lun, int *exitStatus) {
    *exitStatus = 0;
    if (!o.uuid.empty()) return ORLOiSCSILunConfGetByUuid(o.uuid.c_str(), lun);
    ORLOiSCSILunList list;
    ORLOiSCSIListInit(&list);
    uint32_t ret;
    if (!o.lid.empty()) {
        long lid = 0;
        if (!ParseInt(o.lid, ORLO_ISCSI_LID_MIN, ORLO_ISCSI_LID_MAX, &lid)) {
            *exitStatus = UsageError("--lid takes a number from 1 to 1024");
            return ORLO_ERR_BAD_PARAMETER;
        }
        ret = ORLOiSCSILunConfGetByLid(static_cast<int32_t>(lid), ORLO_ISCSI_LUN_FILTER_BKP, &list);
    } else {
        ret = ORLOiSCSILunConfGetByLunName(o.lun.c_str(), ORLO_ISCSI_LUN_FILTER_BKP, &list);
    }
    if (ret == ORLO_OK) {
        if (list.count < 1) {
            ret = 18990531;  // No such LUN
        } else {
            ORLOiSCSIListLink *link;
            ORLOiSCSILun *found = nullptr;
            ORLO_ISCSI_LUN_LIST_FOREACH(&list, link, found) {
                *lun = *found;
                break;
            }
        }
    }
    ORLOiSCSILunListFree(&list);
    return ret;
}

// The LUN of a show, load, unload, delete or lock-status.  0, or the exit status.
int LunOf(const LunArgs &o, ORLOiSCSILun *lun) {
    int status = 0;
    uint32_t ret = SelectLun(o, lun, &status);
    if (status != 0) return status;
    return ret == ORLO_OK ? 0 : Fail(ret);
}

Json LunJson(const ORLOiSCSILun &l, int loaded, int locked) {
    Json o = Json::Object();
    o.SetInt("lid", l.lid)
        .SetStr("name", l.name)
        .SetStr("type", ORLOiSCSILunTypeName(l.type))
        .SetUint("size", l.size)
        .SetUint("block_size", l.blockSize)
        .SetStr("root_path", l.rootPath)
        .SetStr("uuid", l.uuid)
        .SetStr("vpd_unit_serial", l.vpdUnitSerial)
        .SetUint("extent_size", l.extentSize);
    if (loaded >= 0) o.SetBool("loaded", loaded != 0);
    if (locked >= 0) o.SetBool("locked", locked != 0);
    return o;
}

// This process's progress file, where the growth of a LUN's data file is published.
std::string ProgressPath() {
    char path[64];
    snprintf(path, sizeof(path), "/tmp/iscsi/P%d.progress", static_cast<int>(getpid()));
    return path;
}

// Reads the progress file: false when it holds no plan.
bool ReadProgress(unsigned long long *total, unsigned long long *done) {
    std::string path = ProgressPath();
    char t[32] = "", d[32] = "";
    if (OLIBCFileGetKeyValue(path.c_str(), "total_bytes", t, sizeof(t)) <= 0 ||
        OLIBCFileGetKeyValue(path.c_str(), "done_bytes", d, sizeof(d)) < 0)
        return false;
    *total = strtoull(t, nullptr, 10);
    *done = strtoull(d, nullptr, 10);
    return *total > 0;
}

void DrawBar(unsigned long long total, unsigned long long done) {
    int percent = static_cast<int>(done >= total ? 100 : done * 100 / total);
    int bars = percent / 4;
    fprintf(stderr, "\r[%.*s%*s] %3d%% %s / %s", bars, "#########################", 25 - bars, "", percent,
            HumanSize(done).c_str(), HumanSize(total).c_str());
}

// Shows the growth of the LUN's data file while creation runs on another thread.  The
// creation removes its progress file when it ends, so the last plan seen is returned for
// the final bar.  Nothing is shown for a LUN that needs no growing (thin, advanced).
bool ShowProgress(const std::atomic<bool> &finished, unsigned long long *lastTotal) {
    unsigned long long total = 0, done = 0, lastDone = ~0ULL;
    bool shown = false;
    *lastTotal = 0;
    while (!finished.load()) {
        if (ReadProgress(&total, &done) && done != lastDone) {
            DrawBar(total, done);
            lastDone = done;
            *lastTotal = total;
            shown = true;
        }
        usleep(100 * 1000);
    }
    return shown;
}

int RunCreate(const LunArgs &o) {
    ORLOiSCSILun lun;
    memset(&lun, 0, sizeof(lun));
    lun.lockHandle = -1;
    lun.blockSize = 512;
    if (!ParseType(o.type, &lun.type)) {
        fprintf(stderr, "orloiscsi: unknown LUN type '%s'\n", o.type.c_str());
        return Fail(18990500);  // Bad LUN type
    }
    if (!ParseSize(o.size, &lun.size)) {
        fprintf(stderr, "orloiscsi: '%s' is not a size (a number with K, M, G or T)\n", o.size.c_str());
        return Fail(18990502);  // Bad LUN size
    }
    long v = 0;
    if (!o.blockSize.empty()) {
        if (!ParseInt(o.blockSize, 0, 1L << 30, &v)) return UsageError("--block-size takes a number of bytes");
        lun.blockSize = static_cast<uint32_t>(v);
    }
    if (!o.lid.empty()) {
        if (!ParseInt(o.lid, 0, 1L << 30, &v)) return UsageError("--lid takes a number");
        lun.lid = static_cast<int32_t>(v);
    }
    if (!o.extentSize.empty()) {
        uint64_t es = 0;
        if (!ParseSize(o.extentSize, &es) || es > UINT32_MAX) return UsageError("--extent-size takes a size");
        lun.extentSize = static_cast<uint32_t>(es);
    }
    if (o.name.size() >= sizeof(lun.name) || o.volume.size() >= sizeof(lun.rootPath)) {
        return Fail(o.name.size() >= sizeof(lun.name) ? 18990503 : 18990501);  // Bad LUN name / location
    }
    memcpy(lun.name, o.name.c_str(), o.name.size() + 1);
    memcpy(lun.rootPath, o.volume.c_str(), o.volume.size() + 1);

    std::atomic<bool> done{false};
    uint32_t ret = ORLO_OK;
    bool showProgress = o.progress || isatty(STDERR_FILENO);
    if (showProgress) {
        // Start from an empty plan, so that a file left by an earlier process of the same
        // pid is not taken for this one's.
        std::string path = ProgressPath();
        OLIBCFileSetKeyValue(path.c_str(), "total_bytes", "0", "%s=%s\n");
        OLIBCFileSetKeyValue(path.c_str(), "done_bytes", "0", "%s=%s\n");
    }
    std::thread worker([&] {
        ret = ORLOiSCSILunCreate(&lun);
        done.store(true);
    });
    unsigned long long planned = 0;
    bool shown = showProgress && ShowProgress(done, &planned);
    worker.join();
    if (showProgress) orlo::os::Unlink(ProgressPath().c_str());  // ours, when the creation did not get to it
    // A thick file LUN's data file was grown even when it was over before the first look.
    const bool thick = ORLO_ISCSI_LUN_IS_FILE_BACKED(lun.type) && !ORLO_ISCSI_LUN_TYPE_HAS(lun.type, ORLO_ISCSI_LUN_BIT_THIN);
    if (showProgress && ret == ORLO_OK && planned == 0 && thick) planned = lun.size;
    if (shown || (showProgress && ret == ORLO_OK && planned > 0)) {
        if (ret == ORLO_OK && planned > 0) DrawBar(planned, planned);
        fprintf(stderr, "\n");
    }
    if (ret != ORLO_OK) return Fail(ret);
    if (Ctx().json) {
        PrintJson(LunJson(lun, -1, -1));
    } else {
        printf("created LUN %d '%s' (%s, %s) on %s, uuid %s\n", lun.lid, lun.name, ORLOiSCSILunTypeName(lun.type),
               HumanSize(lun.size).c_str(), lun.rootPath, lun.uuid);
    }
    return 0;
}

int RunList(const LunArgs &o) {
    ORLOiSCSILunList list;
    ORLOiSCSIListInit(&list);
    uint32_t ret = ORLOiSCSILunConfGetAll(&list, o.all ? ORLO_ISCSI_LUN_FILTER_BKP : 0);
    if (ret != ORLO_OK) return Fail(ret);
    ORLOiSCSIListLink *link;
    ORLOiSCSILun *l = nullptr;
    if (Ctx().json) {
        Json doc = Json::Array();
        ORLO_ISCSI_LUN_LIST_FOREACH(&list, link, l) {
            int loaded = 0;
            if (ORLOiSCSILunIsLoaded(l, &loaded) != ORLO_OK) loaded = 0;
            doc.Push(LunJson(*l, loaded, -1));
        }
        PrintJson(doc);
    } else {
        printf("%-5s %-24s %-10s %12s  %-7s %-12s %s\n", "LID", "NAME", "TYPE", "SIZE", "LOADED", "LOCATION", "UUID");
        ORLO_ISCSI_LUN_LIST_FOREACH(&list, link, l) {
            int loaded = 0;
            if (ORLOiSCSILunIsLoaded(l, &loaded) != ORLO_OK) loaded = 0;
            printf("%-5d %-24s %-10s %12s  %-7s %-12s %s\n", l->lid, l->name, ORLOiSCSILunTypeName(l->type),
                   HumanSize(l->size).c_str(), loaded ? "yes" : "no", l->rootPath, l->uuid);
        }
    }
    ORLOiSCSILunListFree(&list);
    return 0;
}

int RunShow(const LunArgs &o) {
    ORLOiSCSILun lun;
    int rc = LunOf(o, &lun);
    if (rc != 0) return rc;
    int loaded = 0, locked = 0;
    if (ORLOiSCSILunIsLoaded(&lun, &loaded) != ORLO_OK) loaded = 0;
    if (ORLOiSCSILunIsLocked(&lun, &locked) != ORLO_OK) locked = 0;
    if (Ctx().json) {
        PrintJson(LunJson(lun, loaded, locked));
        return 0;
    }
    printf("lid:             %d\n", lun.lid);
    printf("name:            %s\n", lun.name);
    printf("type:            %s\n", ORLOiSCSILunTypeName(lun.type));
    printf("size:            %" PRIu64 " bytes (%s)\n", lun.size, HumanSize(lun.size).c_str());
    printf("block size:      %" PRIu32 "\n", lun.blockSize);
    printf("location:        %s\n", lun.rootPath);
    printf("uuid:            %s\n", lun.uuid);
    printf("vpd unit serial: %s\n", lun.vpdUnitSerial);
    if (lun.extentSize != 0) printf("extent size:     %" PRIu32 "\n", lun.extentSize);
    printf("loaded:          %s\n", loaded ? "yes" : "no");
    printf("locked:          %s\n", locked ? "yes" : "no");
    return 0;
}

// load, unload and delete: one LUN, one library call.
int RunOnOne(const LunArgs &o, uint32_t (*op)(ORLOiSCSILun *), const char *done) {
    ORLOiSCSILun lun;
    int rc = LunOf(o, &lun);
    if (rc != 0) return rc;
    uint32_t ret = op(&lun);
    if (ret != ORLO_OK) return Fail(ret);
    printf("%s LUN %d '%s'\n", done, lun.lid, lun.name);
    return 0;
}

uint32_t Load(ORLOiSCSILun *l) { return ORLOiSCSILunLoad(l); }
uint32_t Unload(ORLOiSCSILun *l) { return ORLOiSCSILunUnload(l); }
uint32_t Delete(ORLOiSCSILun *l) { return ORLOiSCSILunDelete(l); }

int RunLockStatus(const LunArgs &o) {
    ORLOiSCSILun lun;
    int rc = LunOf(o, &lun);
    if (rc != 0) return rc;
    ORLOiSCSILunProgress p;
    uint32_t ret = ORLOiSCSILunProgressGet(&lun, &p);
    if (ret != ORLO_OK) return Fail(ret);
    if (Ctx().json) {
        Json doc = Json::Object();
        doc.SetInt("lid", lun.lid).SetBool("locked", p.isLocked);
        if (p.hasProgress)
            doc.SetInt("pid", p.pid)
                .SetInt("step", p.step)
                .SetUint("total_bytes", p.totalBytes)
                .SetStr("org_path", p.orgPath)
                .SetStr("new_path", p.newPath);
        PrintJson(doc);
        return 0;
    }
    printf("LUN %d '%s': %s\n", lun.lid, lun.name, p.isLocked ? "locked" : "not locked");
    if (p.hasProgress)
        printf("  %s operation %d by process %d, %s, %s -> %s\n", p.isLocked ? "running" : "stale", p.step, p.pid,
               HumanSize(p.totalBytes).c_str(), p.orgPath, p.newPath);
    return 0;
}

// LUN | --name NAME | --lid N | --uuid UUID
void AddLunRef(CLI::App *act, LunArgs *a) {
    CLI::Option *pos = AddPositional(act, "LUN", &a->lun, "the LUN's name");
    AddAlias(act, pos, "--name", "NAME", "the LUN's name, as lun create takes it");
    CLI::Option *lid = AddValue(act, "--lid", "N", &a->lid, "the LUN's lid (1..1024)");
    CLI::Option *uuid = AddValue(act, "--uuid", "UUID", &a->uuid, "the LUN's uuid");
    OneOf(act, {pos, lid, uuid}, true);
}

}  // namespace

void RegisterLun(CLI::App *root) {
    static LunArgs a;
    CLI::App *obj = AddObject(root, "lun", "LUNs: create, list, load into the kernel target, unload, delete");
    CLI::App *act = AddAction(obj, "create",
                              "create a LUN (TYPE: BLOCK, FILE, THIN, ADV, SINK, VDISK_ADV, BKP_THIN, BKP_ADV, CINDER, "
                              "BLUN, VDISK_BLUN; SIZE with K, M, G or T; a BLOCK LUN takes a /dev device as --volume)",
                              [] { return RunCreate(a); });
    AddValue(act, "--name", "NAME", &a.name, "the new LUN's name (unique)")->required();
    AddValue(act, "--type", "TYPE", &a.type, "BLOCK, FILE, THIN, ADV, SINK, VDISK_ADV, BKP_THIN, BKP_ADV, CINDER, "
             "BLUN or VDISK_BLUN (any case)")->required();
    AddValue(act, "--size", "SIZE", &a.size, "bytes, or a number with K, M, G or T (binary)")->required();
    AddValue(act, "--volume,--device", "/volumeN", &a.volume, "the data volume, or a BLOCK LUN's /dev device")
        ->required();
    AddValue(act, "--block-size", "512|4096", &a.blockSize, "the logical block size (512 unless given)");
    AddValue(act, "--lid", "N", &a.lid, "the lid to use (the smallest free one unless given)");
    AddValue(act, "--extent-size", "SIZE", &a.extentSize, "an advanced LUN's extent size");
    AddFlag(act, "--progress", &a.progress, "draw the progress bar also when standard error is no terminal");
    act = AddAction(obj, "list", "list the LUNs (--all: backup objects too)", [] { return RunList(a); });
    AddFlag(act, "--all", &a.all, "backup objects too");
    act = AddAction(obj, "show", "show one LUN", [] { return RunShow(a); });
    AddLunRef(act, &a);
    act = AddAction(obj, "load", "make the LUN a backstore of the kernel target",
                    [] { return RunOnOne(a, Load, "loaded"); });
    AddLunRef(act, &a);
    act = AddAction(obj, "unload", "take the LUN's backstore out of the kernel target",
                    [] { return RunOnOne(a, Unload, "unloaded"); });
    AddLunRef(act, &a);
    act = AddAction(obj, "delete", "delete the LUN, its data and its configuration",
                    [] { return RunOnOne(a, Delete, "deleted"); });
    AddLunRef(act, &a);
    act = AddAction(obj, "lock-status", "whether an operation holds the LUN, and which",
                    [] { return RunLockStatus(a); });
    AddLunRef(act, &a);
}

}  // namespace cli
