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

std::string HumanSize(uint64_t bytes) {
    static const char *const kUnits[] = {"B", "KiB", "MiB", "GiB", "TiB", "PiB"};
    double v = static_cast<double>(bytes);
    int u = 0;
    while (v >= 1024.0 && u < 5) {
        v /= 1024.0;
        ++u;
    }
    char buf[32];
    snprintf(buf, sizeof(buf), u == 0 ? "%.0f %s" : "%.1f %s", v, kUnits[u]);
    return buf;
}

// Options of the form --key VALUE; the rest are positional.
struct Options {
    std::string name, type, size, volume, blockSize, lid, uuid, extentSize;
    bool progress = false, all = false;
    Args positional;
};

bool ParseOptions(const Args &args, Options *o) {
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string &a = args[i];
        std::string *slot = nullptr;
        if (a == "--name") slot = &o->name;
        else if (a == "--type") slot = &o->type;
        else if (a == "--size") slot = &o->size;
        else if (a == "--volume" || a == "--device") slot = &o->volume;
        else if (a == "--block-size") slot = &o->blockSize;
        else if (a == "--lid") slot = &o->lid;
        else if (a == "--uuid") slot = &o->uuid;
        else if (a == "--extent-size") slot = &o->extentSize;
        else if (a == "--progress") { o->progress = true; continue; }
        else if (a == "--all") { o->all = true; continue; }
        else if (a.size() > 2 && a[0] == '-' && a[1] == '-') {
            fprintf(stderr, "orloiscsi: unknown option '%s'\n", a.c_str());
            return false;
        } else {
            o->positional.push_back(a);
            continue;
        }
        if (i + 1 >= args.size()) {
            fprintf(stderr, "orloiscsi: %s needs a value\n", a.c_str());
            return false;
        }
        *slot = args[++i];
    }
    return true;
}

// Finds the LUN named by NAME, --lid N or --uuid U.  0 or a result code.
uint32_t SelectLun(const Options &o, ORLOiSCSILun *lun, bool *usage) {
    *usage = false;
    int given = (!o.positional.empty()) + !o.lid.empty() + !o.uuid.empty();
    if (given != 1 || o.positional.size() > 1) {
        *usage = true;
        return ORLO_ERR_BAD_PARAMETER;
    }
    if (!o.uuid.empty()) return ORLOiSCSILunConfGetByUuid(o.uuid.c_str(), lun);
    ORLOiSCSILunList list;
    ORLOiSCSIListInit(&list);
    uint32_t ret;
    if (!o.lid.empty()) {
        long lid = 0;
        if (!ParseInt(o.lid, ORLO_ISCSI_LID_MIN, ORLO_ISCSI_LID_MAX, &lid)) {
            fprintf(stderr, "orloiscsi: --lid takes a number from 1 to 1024\n");
            *usage = true;
            return ORLO_ERR_BAD_PARAMETER;
        }
        ret = ORLOiSCSILunConfGetByLid(static_cast<int32_t>(lid), ORLO_ISCSI_LUN_FILTER_BKP, &list);
    } else {
        ret = ORLOiSCSILunConfGetByLunName(o.positional[0].c_str(), ORLO_ISCSI_LUN_FILTER_BKP, &list);
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

void PrintLunJson(const ORLOiSCSILun &l, int loaded, int locked) {
    printf("{\"lid\":%d,\"name\":%s,\"type\":%s,\"size\":%" PRIu64 ",\"block_size\":%" PRIu32
           ",\"root_path\":%s,\"uuid\":%s,\"vpd_unit_serial\":%s,\"extent_size\":%" PRIu32,
           l.lid, JsonQuote(l.name).c_str(), JsonQuote(ORLOiSCSILunTypeName(l.type)).c_str(), l.size, l.blockSize,
           JsonQuote(l.rootPath).c_str(), JsonQuote(l.uuid).c_str(), JsonQuote(l.vpdUnitSerial).c_str(),
           l.extentSize);
    if (loaded >= 0) printf(",\"loaded\":%s", loaded ? "true" : "false");
    if (locked >= 0) printf(",\"locked\":%s", locked ? "true" : "false");
    printf("}");
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

int RunCreate(const Context &ctx, const Args &args) {
    const Action &self = kLunObject.actions[0];
    Options o;
    if (!ParseOptions(args, &o) || !o.positional.empty() || o.name.empty() || o.type.empty() || o.size.empty() ||
        o.volume.empty())
        return Usage(kLunObject, self);
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
        if (!ParseInt(o.blockSize, 0, 1L << 30, &v)) return Usage(kLunObject, self);
        lun.blockSize = static_cast<uint32_t>(v);
    }
    if (!o.lid.empty()) {
        if (!ParseInt(o.lid, 0, 1L << 30, &v)) return Usage(kLunObject, self);
        lun.lid = static_cast<int32_t>(v);
    }
    if (!o.extentSize.empty()) {
        uint64_t es = 0;
        if (!ParseSize(o.extentSize, &es) || es > UINT32_MAX) return Usage(kLunObject, self);
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
    if (ctx.json) {
        PrintLunJson(lun, -1, -1);
        printf("\n");
    } else {
        printf("created LUN %d '%s' (%s, %s) on %s, uuid %s\n", lun.lid, lun.name, ORLOiSCSILunTypeName(lun.type),
               HumanSize(lun.size).c_str(), lun.rootPath, lun.uuid);
    }
    return 0;
}

int RunList(const Context &ctx, const Args &args) {
    Options o;
    if (!ParseOptions(args, &o) || !o.positional.empty()) return Usage(kLunObject, kLunObject.actions[1]);
    ORLOiSCSILunList list;
    ORLOiSCSIListInit(&list);
    uint32_t ret = ORLOiSCSILunConfGetAll(&list, o.all ? ORLO_ISCSI_LUN_FILTER_BKP : 0);
    if (ret != ORLO_OK) return Fail(ret);
    ORLOiSCSIListLink *link;
    ORLOiSCSILun *l = nullptr;
    if (ctx.json) {
        printf("[");
        bool first = true;
        ORLO_ISCSI_LUN_LIST_FOREACH(&list, link, l) {
            int loaded = 0;
            if (ORLOiSCSILunIsLoaded(l, &loaded) != ORLO_OK) loaded = 0;
            if (!first) printf(",");
            PrintLunJson(*l, loaded, -1);
            first = false;
        }
        printf("]\n");
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

int RunShow(const Context &ctx, const Args &args) {
    Options o;
    ORLOiSCSILun lun;
    bool usage = false;
    if (!ParseOptions(args, &o)) return Usage(kLunObject, kLunObject.actions[2]);
    uint32_t ret = SelectLun(o, &lun, &usage);
    if (usage) return Usage(kLunObject, kLunObject.actions[2]);
    if (ret != ORLO_OK) return Fail(ret);
    int loaded = 0, locked = 0;
    if (ORLOiSCSILunIsLoaded(&lun, &loaded) != ORLO_OK) loaded = 0;
    if (ORLOiSCSILunIsLocked(&lun, &locked) != ORLO_OK) locked = 0;
    if (ctx.json) {
        PrintLunJson(lun, loaded, locked);
        printf("\n");
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
int RunOnOne(const Args &args, size_t actionIndex, uint32_t (*op)(ORLOiSCSILun *), const char *done) {
    Options o;
    ORLOiSCSILun lun;
    bool usage = false;
    if (!ParseOptions(args, &o)) return Usage(kLunObject, kLunObject.actions[actionIndex]);
    uint32_t ret = SelectLun(o, &lun, &usage);
    if (usage) return Usage(kLunObject, kLunObject.actions[actionIndex]);
    if (ret != ORLO_OK) return Fail(ret);
    ret = op(&lun);
    if (ret != ORLO_OK) return Fail(ret);
    printf("%s LUN %d '%s'\n", done, lun.lid, lun.name);
    return 0;
}

uint32_t Load(ORLOiSCSILun *l) { return ORLOiSCSILunLoad(l); }
uint32_t Unload(ORLOiSCSILun *l) { return ORLOiSCSILunUnload(l); }
uint32_t Delete(ORLOiSCSILun *l) { return ORLOiSCSILunDelete(l); }

int RunLoad(const Context &, const Args &args) { return RunOnOne(args, 3, Load, "loaded"); }
int RunUnload(const Context &, const Args &args) { return RunOnOne(args, 4, Unload, "unloaded"); }
int RunDelete(const Context &, const Args &args) { return RunOnOne(args, 5, Delete, "deleted"); }

int RunLockStatus(const Context &ctx, const Args &args) {
    Options o;
    ORLOiSCSILun lun;
    bool usage = false;
    if (!ParseOptions(args, &o)) return Usage(kLunObject, kLunObject.actions[6]);
    uint32_t ret = SelectLun(o, &lun, &usage);
    if (usage) return Usage(kLunObject, kLunObject.actions[6]);
    if (ret != ORLO_OK) return Fail(ret);
    ORLOiSCSILunProgress p;
    ret = ORLOiSCSILunProgressGet(&lun, &p);
    if (ret != ORLO_OK) return Fail(ret);
    if (ctx.json) {
        printf("{\"lid\":%d,\"locked\":%s", lun.lid, p.isLocked ? "true" : "false");
        if (p.hasProgress)
            printf(",\"pid\":%d,\"step\":%d,\"total_bytes\":%" PRIu64 ",\"org_path\":%s,\"new_path\":%s", p.pid,
                   p.step, p.totalBytes, JsonQuote(p.orgPath).c_str(), JsonQuote(p.newPath).c_str());
        printf("}\n");
        return 0;
    }
    printf("LUN %d '%s': %s\n", lun.lid, lun.name, p.isLocked ? "locked" : "not locked");
    if (p.hasProgress)
        printf("  %s operation %d by process %d, %s, %s -> %s\n", p.isLocked ? "running" : "stale", p.step, p.pid,
               HumanSize(p.totalBytes).c_str(), p.orgPath, p.newPath);
    return 0;
}

const Action kActions[] = {
    {"create", "--name NAME --type TYPE --size SIZE --volume /volumeN [--block-size 512|4096] [--lid N] "
               "[--extent-size SIZE] [--progress]",
     "create a LUN (TYPE: BLOCK, FILE, THIN, ADV, SINK, VDISK_ADV, BKP_THIN, BKP_ADV, CINDER, BLUN, VDISK_BLUN; "
     "SIZE with K, M, G or T; a BLOCK LUN takes a /dev device as --volume)",
     RunCreate},
    {"list", "[--all]", "list the LUNs (--all: backup objects too)", RunList},
    {"show", "NAME | --lid N | --uuid UUID", "show one LUN", RunShow},
    {"load", "NAME | --lid N | --uuid UUID", "make the LUN a backstore of the kernel target", RunLoad},
    {"unload", "NAME | --lid N | --uuid UUID", "take the LUN's backstore out of the kernel target", RunUnload},
    {"delete", "NAME | --lid N | --uuid UUID", "delete the LUN, its data and its configuration", RunDelete},
    {"lock-status", "NAME | --lid N | --uuid UUID", "whether an operation holds the LUN, and which", RunLockStatus},
    {nullptr, nullptr, nullptr, nullptr},
};

}  // namespace

const Object kLunObject = {"lun", "LUNs: create, list, load into the kernel target, unload, delete", kActions};

}  // namespace cli
