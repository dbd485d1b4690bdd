// orloiscsi snapshot: take snapshots of LUNs (waiting, with a progress bar, for an advanced
// one's clone to finish), list and show them, keep them from deletion with application
// keys, wait for the operation running on one, delete them, and repair what a killed
// creation left.
//
// A snapshot is named by its LUN and its name ("LUN NAME"), by its LUN and its sid ("LUN
// --sid N") or by its UUID alone ("--uuid UUID").  With the registry's aliases, --uuid
// stands in the LUN's slot and --sid in the name's, so that the words given after them
// move on; Resolve below undoes that for the words that follow the snapshot (a KEY).
#include <unistd.h>

#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <map>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "cli.h"
#include "olibc.h"
#include "orloiscsi_base.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_snapshot.h"
#include "platform/os_seam.h"

namespace cli {

namespace {

const uint32_t kErrBadName = 18990513;        // Bad snapshot_name
const uint32_t kErrBadNote = 18990518;        // Bad snapshot_note
const uint32_t kErrNoSuchSnapshot = 18990532; // No such snapshot
const uint32_t kErrTakeSnapshot = 18990569;   // the background finish of a snapshot failed
const uint32_t kErrLoadSnapshotConf = 18990573; // Failed to load snapshot config
// The LUN lock's operation code while its snapshots are worked on (as creation takes it).
const int kSnapshotLunStep = 10;
// Who takes or deletes a snapshot when the environment names nobody usable.
const char kToolName[] = "orloiscsi";

// The arguments of every snapshot action (only the chosen action's are filled).
struct SnapArgs {
    std::string lun;   // LUN, or --uuid's value
    std::string name;  // NAME, or --sid's value
    std::string key;   // KEY of hold and release
    std::string newName, note, timeout;
    bool appConsistent = false, wait = false, progress = false, ignoreHolds = false;
};

// The options of one action that name a snapshot another way than "LUN NAME".
struct RefOptions {
    CLI::Option *sid = nullptr;   // alias of the NAME slot
    CLI::Option *uuid = nullptr;  // alias of the LUN slot
};

// A snapshot found from the command line, with the name of its LUN.
struct Found {
    ORLOiSCSISnapshot snap;
    std::string lunName;
};

// The user's name for taken_by and the event log: SUDO_USER (the person behind sudo),
// else USER, else LOGNAME; "orloiscsi" when none is set or the name cannot be stored
// (longer than 31 characters, a line break, a leading blank).
std::string UserName() {
    for (const char *var : {"SUDO_USER", "USER", "LOGNAME"}) {
        const char *v = getenv(var);
        if (v == nullptr || v[0] == '\0') continue;
        std::string s = v;
        if (s.size() > ORLO_ISCSI_SNAPSHOT_TAKEN_BY_LEN || s.find_first_of("\r\n") != std::string::npos ||
            s[0] == ' ' || s[0] == '\t' || s[0] == '"')
            break;
        return s;
    }
    return kToolName;
}

std::string LocalTime(int32_t when) {
    time_t t = when;
    struct tm tmv;
    char buf[32];
    if (localtime_r(&t, &tmv) == nullptr || strftime(buf, sizeof(buf), "%Y-%m-%d %H:%M:%S", &tmv) == 0) return "?";
    return buf;
}

const char *TypeWord(int32_t type) {
    return type == ORLO_ISCSI_SNAPSHOT_TYPE_ADV ? "ADV" : type == ORLO_ISCSI_SNAPSHOT_TYPE_BLUN ? "BLUN" : "UNKNOWN";
}

// What the operation lock says, in a word: "no" while it is free.
std::string OperationWord(const ORLOiSCSISnapshotProgress &p) {
    if (!p.isLocked) return "no";
    switch (p.step) {
        case ORLO_ISCSI_SNAPSHOT_STEP_CREATE: return "creating";
        case ORLO_ISCSI_SNAPSHOT_STEP_DELETE: return "deleting";
        case ORLO_ISCSI_SNAPSHOT_STEP_UNKNOWN: return "busy";
        default: return "step " + std::to_string(p.step);
    }
}

// "snapshot 2 'nightly' of LUN 'db'"
std::string Title(const Found &f) {
    return "snapshot " + std::to_string(f.snap.sid) + " '" + f.snap.name + "' of LUN '" + f.lunName + "'";
}

// The application keys registered on the snapshot; false (after a warning) when they
// cannot be read.
bool HoldersOf(const ORLOiSCSISnapshot &s, std::vector<std::string> *keys, uint32_t *code) {
    keys->clear();
    POLIBC_SZLIST list = OLIBCSzListAlloc(4);
    if (list == nullptr) {
        *code = ORLO_ERR_OUT_OF_MEMORY;
        return false;
    }
    *code = ORLOiSCSISnapshotLockedAppKeysGet(&s, &list);
    if (*code == ORLO_OK)
        for (int i = 0; i < OLIBCSzListCount(list); ++i) keys->push_back(OLIBCSzListGet(list, i));
    OLIBCSzListFree(list);
    return *code == ORLO_OK;
}

std::string Joined(const std::vector<std::string> &words, const char *sep) {
    std::string out;
    for (const std::string &w : words) out += (out.empty() ? "" : sep) + w;
    return out;
}

// The state a listing shows beside a record: the operation lock and the holders.
struct Extras {
    ORLOiSCSISnapshotProgress progress;
    bool progressRead = false;
    std::vector<std::string> keys;
    bool keysRead = false;
};

Extras ExtrasOf(const ORLOiSCSISnapshot &s) {
    Extras e;
    memset(&e.progress, 0, sizeof(e.progress));
    uint32_t code = ORLOiSCSISnapshotProgressGet(&s, &e.progress);
    e.progressRead = code == ORLO_OK;
    if (!e.progressRead)
        fprintf(stderr, "orloiscsi: the operation lock of snapshot '%s' cannot be read: %" PRIu32 " %s\n", s.name,
                code, ORLOiSCSIErrStr(code));
    e.keysRead = HoldersOf(s, &e.keys, &code);
    if (!e.keysRead)
        fprintf(stderr, "orloiscsi: the application keys of snapshot '%s' cannot be read: %" PRIu32 " %s\n", s.name,
                code, ORLOiSCSIErrStr(code));
    return e;
}

Json SnapshotJson(const ORLOiSCSISnapshot &s, const std::string &lunName, const Extras *e) {
    Json o = Json::Object();
    o.SetStr("lun", lunName)
        .SetInt("lid", s.lid)
        .SetInt("sid", s.sid)
        .SetStr("name", s.name)
        .SetStr("uuid", s.uuid)
        .SetStr("type", TypeWord(s.type))
        .SetStr("status", s.status)
        .SetInt("snapshot_time", s.snapshot_time)
        .SetStr("taken_at", LocalTime(s.snapshot_time))
        .SetInt("time", s.time)
        .SetUint("total_size", s.total_size)
        .SetUint("mapped_size", s.mappedSize)
        .SetBool("app_consistent", s.isAppConsistence)
        .SetBool("lock", s.lock)
        .SetStr("taken_by", s.taken_by)
        .SetStr("note", s.note)
        .SetStr("version", s.version)
        .SetStr("rootpath", s.rootpath)
        .SetStr("parent_uuid", s.parent_uuid);
    if (e != nullptr) {
        if (e->progressRead) {
            o.SetBool("locked", e->progress.isLocked != 0);
            o.Set("operation", e->progress.isLocked ? Json::Str(OperationWord(e->progress)) : Json::Null());
        } else {
            o.Set("locked", Json::Null()).Set("operation", Json::Null());
        }
        if (e->keysRead) {
            Json keys = Json::Array();
            for (const std::string &k : e->keys) keys.Push(Json::Str(k));
            o.Set("held_by", std::move(keys));
        } else {
            o.Set("held_by", Json::Null());
        }
    }
    return o;
}

// Parses --sid: 0 and *sid, or the exit status of the usage error.
int ParseSid(const std::string &text, int32_t *sid) {
    long v = 0;
    if (!ParseNumber(text, ORLO_ISCSI_SID_MIN, ORLO_ISCSI_SID_MAX, &v))
        return UsageError("--sid takes a number from 1 to 256");
    *sid = static_cast<int32_t>(v);
    return 0;
}

// The name of the LUN of that uuid, or "lid N" when it cannot be found.
std::string LunNameOf(const ORLOiSCSISnapshot &s) {
    ORLOiSCSILun lun;
    if (ORLOiSCSILunConfGetByUuid(s.parent_uuid, &lun) == ORLO_OK) return lun.name;
    return "lid " + std::to_string(s.lid);
}

// The snapshot of a UUID: from the cache, which finds it without its LUN, and from the LUN
// files when the cache has lost it (the cache lives in /tmp).
uint32_t FindByUuid(const std::string &uuid, ORLOiSCSISnapshot *snap) {
    uint32_t ret = ORLOiSCSISnapshotConfGetByUuid(uuid.c_str(), snap);
    if (ret != kErrNoSuchSnapshot) return ret;
    ORLOiSCSISnapshotFilter filter = {};
    filter.flags = ORLO_ISCSI_SNAPSHOT_FILTER_UUID | ORLO_ISCSI_SNAPSHOT_FILTER_FIRST_ONLY;
    filter.uuid = uuid.c_str();
    ORLOiSCSISnapshotList list;
    ORLOiSCSIListInit(&list);
    ret = ORLOiSCSISnapshotConfLoad(&filter, &list);
    if (ret == ORLO_OK) {
        ret = kErrNoSuchSnapshot;
        ORLOiSCSIListLink *link;
        ORLOiSCSISnapshot *s = nullptr;
        ORLO_ISCSI_SNAPSHOT_LIST_FOREACH(&list, link, s) {
            *snap = *s;
            snap->link.next = snap->link.prev = nullptr;
            ret = ORLO_OK;
            break;
        }
    }
    ORLOiSCSISnapshotListFree(&list);
    return ret;
}

// Finds the snapshot the command line names and the words given after it (at most
// wanted of them, each of which must be there).  0, or the exit status.
int Resolve(const SnapArgs &a, const RefOptions &ref, std::vector<std::string> *after, size_t wanted, Found *f) {
    const bool byUuid = ref.uuid->count() > 0, bySid = ref.sid->count() > 0;
    std::vector<std::string> words;  // the positional words after the snapshot
    if (byUuid) {
        if (bySid) return UsageError("--sid goes with a LUN; --uuid names a snapshot alone");
        // --uuid took the LUN's slot: what was given for LUN sits in NAME, the next in KEY.
        for (const std::string *w : {&a.name, &a.key})
            if (!w->empty()) words.push_back(*w);
    } else {
        if (a.name.empty()) return UsageError("give the snapshot's NAME or --sid N after the LUN");
        if (!a.key.empty()) words.push_back(a.key);
    }
    if (words.size() > wanted) return UsageError("unexpected argument '" + words[wanted] + "'");
    if (after != nullptr) {
        if (words.size() < wanted) return UsageError("missing KEY");
        *after = words;
    }
    memset(&f->snap, 0, sizeof(f->snap));
    uint32_t ret;
    if (byUuid) {
        ret = FindByUuid(a.lun, &f->snap);
        if (ret != ORLO_OK) return Fail(ret);
        f->lunName = LunNameOf(f->snap);
    } else {
        int32_t sid = 0;
        if (bySid) {
            int rc = ParseSid(a.name, &sid);
            if (rc != 0) return rc;
        }
        ORLOiSCSILun lun;
        ret = FindLun(a.lun, &lun);
        if (ret != ORLO_OK) return Fail(ret);
        ret = bySid ? ORLOiSCSISnapshotConfGetBySid(lun.lid, sid, &f->snap)
                    : ORLOiSCSISnapshotConfGetByLidAndName(lun.lid, a.name.c_str(), &f->snap);
        if (ret != ORLO_OK) return Fail(ret);
        f->lunName = lun.name;
    }
    f->snap.lock_fd = -1;
    return 0;
}

// ---- create ----

// How far the kernel's clone into the snapshot's backstore has come (0..100), read from
// the backstore's info/extent/child; -1 while the backstore or its figure is not there.
int CloneProgress(const ORLOiSCSISnapshot &s) {
    std::string name = std::string("LUN_") + s.parent_uuid + "_SN_" + s.uuid;
    char dir[512];
    if (ORLOiSCSIConfigfsEpLunHbaPath(name.c_str(), dir, sizeof(dir)) != ORLO_OK) return -1;
    std::string info = std::string(dir) + "/info/extent/child";
    if (orlo::os::Access(info.c_str(), F_OK) != 0) return -1;  // not loaded (yet, or any more)
    char text[ORLO_CONFIGFS_BUF_SIZE];
    if (ORLOiSCSIConfigfsGetString(info.c_str(), text, sizeof(text)) != ORLO_OK) return -1;
    for (const char *line = text; line != nullptr && *line != '\0';) {
        if (strncmp(line, "progress=", 9) == 0) {
            long v = strtol(line + 9, nullptr, 10);
            return v < 0 ? 0 : v > 100 ? 100 : static_cast<int>(v);
        }
        line = strchr(line, '\n');
        if (line != nullptr) ++line;
    }
    return -1;
}

void DrawCloneBar(int percent, uint64_t total) {
    int bars = percent / 4;
    fprintf(stderr, "\r[%.*s%*s] %3d%% of %s cloned", bars, "#########################", 25 - bars, "", percent,
            HumanSize(total).c_str());
    fflush(stderr);
}

// Waits until no operation holds the snapshot, drawing the clone's progress, and reads
// its record again (from its LUN's file, which the background finish writes last).  0,
// or the exit status.
int WaitForClone(Found *f, bool bar) {
    int shown = -1;
    for (;;) {
        if (bar) {
            int pct = CloneProgress(f->snap);
            if (pct >= 0 && pct != shown) {
                DrawCloneBar(pct, f->snap.total_size);
                shown = pct;
            }
        }
        bool locked = false;
        uint32_t ret = ORLOiSCSISnapshotIsLocked(&f->snap, &locked);
        if (ret != ORLO_OK) {
            if (shown >= 0) fputc('\n', stderr);
            return Fail(ret);
        }
        if (!locked) break;
        usleep(200 * 1000);
    }
    ORLOiSCSISnapshot now;
    uint32_t ret = ORLOiSCSISnapshotConfInVolumeLoadByUuid(f->snap.rootpath, f->snap.parent_uuid, f->snap.uuid, &now);
    const bool healthy = ret == ORLO_OK && strcmp(now.status, "Healthy") == 0;
    if (bar && (shown >= 0 || healthy)) {
        if (healthy && shown != 100) DrawCloneBar(100, f->snap.total_size);
        fputc('\n', stderr);
    }
    if (ret != ORLO_OK) {
        fprintf(stderr, "orloiscsi: the record of snapshot '%s' is gone: its creation failed\n", f->snap.name);
        return Fail(ret == kErrNoSuchSnapshot ? kErrTakeSnapshot : ret);
    }
    now.lock_fd = -1;
    f->snap = now;
    if (!healthy) {
        fprintf(stderr, "orloiscsi: the clone of snapshot '%s' did not finish: its record says %s (see the system log)\n",
                now.name, now.status);
        return Fail(kErrTakeSnapshot);
    }
    return 0;
}

int RunCreate(const SnapArgs &a) {
    ORLOiSCSILun lun;
    uint32_t ret = FindLun(a.lun, &lun);
    if (ret != ORLO_OK) return Fail(ret);
    Found f;
    memset(&f.snap, 0, sizeof(f.snap));
    f.snap.lock_fd = -1;
    f.lunName = lun.name;
    // Longer texts would be cut by the record's fields; the library refuses them whole.
    if (a.newName.size() > ORLO_ISCSI_SNAPSHOT_NAME_LEN) {
        fprintf(stderr, "orloiscsi: a snapshot name has at most %d characters\n", ORLO_ISCSI_SNAPSHOT_NAME_LEN);
        return Fail(kErrBadName);
    }
    if (a.note.size() > ORLO_ISCSI_SNAPSHOT_NOTE_LEN) {
        fprintf(stderr, "orloiscsi: a note has at most %d characters\n", ORLO_ISCSI_SNAPSHOT_NOTE_LEN);
        return Fail(kErrBadNote);
    }
    snprintf(f.snap.name, sizeof(f.snap.name), "%s", a.newName.c_str());
    snprintf(f.snap.note, sizeof(f.snap.note), "%s", a.note.c_str());
    snprintf(f.snap.taken_by, sizeof(f.snap.taken_by), "%s", UserName().c_str());
    f.snap.isAppConsistence = a.appConsistent;
    ret = ORLOiSCSISnapshotCreate(&lun, &f.snap);
    if (ret != ORLO_OK) return Fail(ret);

    // A block-level snapshot (and an application-consistent advanced one) is done on
    // return; an advanced one is finished by the background process.
    bool background = strcmp(f.snap.status, "Healthy") != 0;
    if (a.wait && background) {
        int rc = WaitForClone(&f, a.progress || isatty(STDERR_FILENO));
        if (rc != 0) return rc;
        background = false;
    }
    if (Ctx().json) {
        Json doc = SnapshotJson(f.snap, f.lunName, nullptr);
        doc.SetBool("background", background);
        PrintJson(doc);
        return 0;
    }
    printf("took %s, uuid %s: %s%s\n", Title(f).c_str(), f.snap.uuid, f.snap.status,
           background ? " (finishing in the background)" : "");
    return 0;
}

// ---- list and show ----

int RunList(const SnapArgs &a) {
    ORLOiSCSISnapshotList list;
    ORLOiSCSIListInit(&list);
    ORLOiSCSISnapshotFilter all = {};
    std::map<std::string, std::string> lunNames;  // by LUN uuid
    uint32_t ret;
    if (!a.lun.empty()) {
        ORLOiSCSILun lun;
        if ((ret = FindLun(a.lun, &lun)) != ORLO_OK) return Fail(ret);
        lunNames[lun.uuid] = lun.name;
        ret = ORLOiSCSISnapshotConfLoadByParentLun(&lun, &all, &list);
    } else {
        ORLOiSCSILunList luns;
        ORLOiSCSIListInit(&luns);
        if ((ret = ORLOiSCSILunConfGetAll(&luns, ORLO_ISCSI_LUN_FILTER_BKP)) != ORLO_OK) return Fail(ret);
        ORLOiSCSIListLink *link;
        ORLOiSCSILun *l = nullptr;
        ORLO_ISCSI_LUN_LIST_FOREACH(&luns, link, l) { lunNames[l->uuid] = l->name; }
        ORLOiSCSILunListFree(&luns);
        ret = ORLOiSCSISnapshotConfLoad(&all, &list);
    }
    if (ret != ORLO_OK) return Fail(ret);
    auto lunOf = [&lunNames](const ORLOiSCSISnapshot &s) {
        auto it = lunNames.find(s.parent_uuid);
        return it != lunNames.end() ? it->second : "lid " + std::to_string(s.lid);
    };
    ORLOiSCSIListLink *link;
    ORLOiSCSISnapshot *s = nullptr;
    if (Ctx().json) {
        Json doc = Json::Array();
        ORLO_ISCSI_SNAPSHOT_LIST_FOREACH(&list, link, s) {
            Extras e = ExtrasOf(*s);
            doc.Push(SnapshotJson(*s, lunOf(*s), &e));
        }
        PrintJson(doc);
    } else {
        const char *fmt = "%-16s %4s %-20s %-5s %-10s %-19s %10s %10s  %-8s %s\n";
        printf(fmt, "LUN", "SID", "NAME", "TYPE", "STATUS", "TIME", "SIZE", "MAPPED", "LOCKED", "HELD BY");
        ORLO_ISCSI_SNAPSHOT_LIST_FOREACH(&list, link, s) {
            Extras e = ExtrasOf(*s);
            std::string held = !e.keysRead ? "?" : e.keys.empty() ? "-" : Joined(e.keys, ",");
            printf(fmt, lunOf(*s).c_str(), std::to_string(s->sid).c_str(), s->name, TypeWord(s->type), s->status,
                   LocalTime(s->snapshot_time).c_str(), HumanSize(s->total_size).c_str(),
                   HumanSize(s->mappedSize).c_str(), e.progressRead ? OperationWord(e.progress).c_str() : "?",
                   held.c_str());
        }
    }
    ORLOiSCSISnapshotListFree(&list);
    return 0;
}

int RunShow(const SnapArgs &a, const RefOptions &ref) {
    Found f;
    int rc = Resolve(a, ref, nullptr, 0, &f);
    if (rc != 0) return rc;
    Extras e = ExtrasOf(f.snap);
    if (Ctx().json) {
        PrintJson(SnapshotJson(f.snap, f.lunName, &e));
        return 0;
    }
    const ORLOiSCSISnapshot &s = f.snap;
    printf("LUN:             %s (lid %d)\n", f.lunName.c_str(), s.lid);
    printf("sid:             %d\n", s.sid);
    printf("name:            %s\n", s.name);
    printf("uuid:            %s\n", s.uuid);
    printf("type:            %s\n", TypeWord(s.type));
    printf("status:          %s\n", s.status);
    printf("taken:           %s by %s%s\n", LocalTime(s.snapshot_time).c_str(), s.taken_by,
           s.isAppConsistence ? ", application-consistent" : "");
    printf("size:            %" PRIu64 " bytes (%s)\n", s.total_size, HumanSize(s.total_size).c_str());
    printf("mapped size:     %" PRIu64 " bytes (%s)\n", s.mappedSize, HumanSize(s.mappedSize).c_str());
    printf("volume:          %s\n", s.rootpath);
    if (s.note[0] != '\0') printf("note:            %s\n", s.note);
    if (s.version[0] != '\0') printf("version:         %s\n", s.version);
    printf("locked:          %s\n", e.progressRead ? OperationWord(e.progress).c_str() : "?");
    printf("held by:         %s\n", !e.keysRead ? "?" : e.keys.empty() ? "nobody" : Joined(e.keys, ", ").c_str());
    return 0;
}

// ---- delete, hold, release, holds ----

int RunDelete(const SnapArgs &a, const RefOptions &ref) {
    Found f;
    int rc = Resolve(a, ref, nullptr, 0, &f);
    if (rc != 0) return rc;
    const std::string who = UserName();
    uint32_t ret = a.ignoreHolds ? ORLOiSCSISnapshotDeleteWithoutCheckingAppKey(&f.snap, who.c_str())
                                 : ORLOiSCSISnapshotDelete(&f.snap, who.c_str());
    if (ret != ORLO_OK) return Fail(ret);
    if (Ctx().json)
        PrintJson(Json::Object()
                      .SetStr("lun", f.lunName)
                      .SetInt("sid", f.snap.sid)
                      .SetStr("name", f.snap.name)
                      .SetStr("uuid", f.snap.uuid)
                      .SetBool("deleted", true));
    else
        printf("deleted %s\n", Title(f).c_str());
    return 0;
}

int PrintHolds(const Found &f) {
    std::vector<std::string> keys;
    uint32_t code = ORLO_OK;
    if (!HoldersOf(f.snap, &keys, &code)) return Fail(code);
    if (Ctx().json) {
        Json arr = Json::Array();
        for (const std::string &k : keys) arr.Push(Json::Str(k));
        PrintJson(Json::Object().SetStr("uuid", f.snap.uuid).Set("held_by", std::move(arr)));
        return 0;
    }
    if (keys.empty()) printf("%s: held by nobody\n", Title(f).c_str());
    for (const std::string &k : keys) printf("%s\n", k.c_str());
    return 0;
}

// hold and release: one key added or removed, then the keys registered.
int RunKey(const SnapArgs &a, const RefOptions &ref, bool hold) {
    Found f;
    std::vector<std::string> words;
    int rc = Resolve(a, ref, &words, 1, &f);
    if (rc != 0) return rc;
    const std::string &key = words[0];
    uint32_t ret = hold ? ORLOiSCSISnapshotLockByAppKey(&f.snap, key.c_str())
                        : ORLOiSCSISnapshotUnlockByAppKey(&f.snap, key.c_str());
    if (ret != ORLO_OK) return Fail(ret);
    if (!Ctx().json) printf("%s %s by '%s'\n", Title(f).c_str(), hold ? "held" : "released", key.c_str());
    if (!Ctx().json) return 0;
    return PrintHolds(f);
}

int RunHolds(const SnapArgs &a, const RefOptions &ref) {
    Found f;
    int rc = Resolve(a, ref, nullptr, 0, &f);
    if (rc != 0) return rc;
    return PrintHolds(f);
}

// ---- lock-status, wait, repair ----

int RunLockStatus(const SnapArgs &a, const RefOptions &ref) {
    Found f;
    int rc = Resolve(a, ref, nullptr, 0, &f);
    if (rc != 0) return rc;
    ORLOiSCSISnapshotProgress p;
    memset(&p, 0, sizeof(p));
    uint32_t ret = ORLOiSCSISnapshotProgressGet(&f.snap, &p);
    if (ret != ORLO_OK) return Fail(ret);
    if (Ctx().json) {
        Json doc = Json::Object();
        doc.SetStr("uuid", f.snap.uuid).SetBool("locked", p.isLocked != 0).SetInt("step", p.step);
        doc.Set("operation", p.isLocked ? Json::Str(OperationWord(p)) : Json::Null());
        doc.SetBool("progress_file", p.hasProgress != 0);
        if (p.hasProgress && p.isLocked) doc.SetUint("total_bytes", p.totalBytes);
        PrintJson(doc);
        return 0;
    }
    if (!p.isLocked)
        printf("%s: not locked%s\n", Title(f).c_str(),
               p.hasProgress ? " (a progress file was left by a holder that is gone)" : "");
    else
        printf("%s: locked (%s)\n", Title(f).c_str(), OperationWord(p).c_str());
    return 0;
}

int RunWait(const SnapArgs &a, const RefOptions &ref, bool timeoutGiven) {
    long seconds = 0;
    if (timeoutGiven && !ParseNumber(a.timeout, 0, 86400L * 365, &seconds))
        return UsageError("--timeout takes a number of seconds (0: wait without end)");
    Found f;
    int rc = Resolve(a, ref, nullptr, 0, &f);
    if (rc != 0) return rc;
    uint32_t ret = ORLOiSCSISnapshotWaitUntilUnlock(&f.snap, static_cast<int>(seconds));
    if (ret != ORLO_OK) return Fail(ret);
    // The operation that held it may have changed the record, or removed it.
    ORLOiSCSISnapshot now;
    ret = ORLOiSCSISnapshotConfInVolumeLoadByUuid(f.snap.rootpath, f.snap.parent_uuid, f.snap.uuid, &now);
    const bool gone = ret == kErrNoSuchSnapshot;
    if (ret != ORLO_OK && !gone) return Fail(ret);
    if (!gone) f.snap = now;
    if (Ctx().json) {
        Json doc = Json::Object();
        doc.SetStr("uuid", f.snap.uuid).SetBool("locked", false).SetBool("exists", !gone);
        doc.Set("status", gone ? Json::Null() : Json::Str(f.snap.status));
        PrintJson(doc);
    } else {
        printf("%s: not locked, %s\n", Title(f).c_str(), gone ? "deleted" : f.snap.status);
    }
    return 0;
}

int RunRepair(const SnapArgs &a) {
    ORLOiSCSILun lun;
    uint32_t ret = FindLun(a.lun, &lun);
    if (ret != ORLO_OK) return Fail(ret);
    // No creation of the LUN may run meanwhile: repair holds the LUN's lock, as creation does.
    if ((ret = ORLOiSCSILunLock(&lun, kSnapshotLunStep)) != ORLO_OK) return Fail(ret);
    int repaired = ORLOiSCSISnapshotRepair(&lun);
    ret = ORLOiSCSILunUnlock(&lun);
    if (repaired < 0) return Fail(kErrLoadSnapshotConf);  // the reason has been logged
    if (ret != ORLO_OK) return Fail(ret);
    if (Ctx().json)
        PrintJson(Json::Object().SetStr("lun", lun.name).SetInt("repaired", repaired));
    else
        printf("LUN '%s': %d snapshot%s repaired\n", lun.name, repaired, repaired == 1 ? "" : "s");
    return 0;
}

// LUN NAME | LUN --sid N | --uuid UUID
RefOptions AddSnapshotRef(CLI::App *act, SnapArgs *a) {
    RefOptions r;
    CLI::Option *lun = AddPositional(act, "LUN", &a->lun, "the snapshot's LUN: its name, lid or uuid");
    r.uuid = AddAlias(act, lun, "--uuid", "UUID", "the snapshot's UUID (without LUN and NAME)");
    CLI::Option *name = AddPositional(act, "NAME", &a->name, "the snapshot's name", false);
    r.sid = AddAlias(act, name, "--sid", "N", "the snapshot's sid within its LUN (1..256), in place of NAME");
    return r;
}

}  // namespace

void RegisterSnapshot(CLI::App *root) {
    static SnapArgs a;
    CLI::App *obj = AddObject(root, "snapshot",
                              "snapshots of LUNs: take, list, hold against deletion, wait for, delete, repair "
                              "(a snapshot is LUN NAME, LUN --sid N, or --uuid UUID)");
    CLI::App *act = AddAction(obj, "create",
                              "take a snapshot of an advanced (ADV, SINK, VDISK_ADV, BKP_ADV) or block-level (BLUN, "
                              "VDISK_BLUN) LUN; an advanced one is finished by the kernel's clone in the background",
                              [] { return RunCreate(a); });
    AddPositional(act, "LUN", &a.lun, "the LUN's name, lid or uuid");
    AddValue(act, "--name", "NAME", &a.newName, "the snapshot's name (SnapShot-<n> unless given)");
    AddValue(act, "--note", "TEXT", &a.note, "a note kept with the snapshot (one line)");
    AddFlag(act, "--app-consistent", &a.appConsistent,
            "ask the LUN's application plug-ins to quiesce around the snapshot");
    AddFlag(act, "--wait", &a.wait, "wait until the snapshot is finished and Healthy");
    AddFlag(act, "--progress", &a.progress, "with --wait, draw the progress bar also when standard error is no terminal");

    act = AddAction(obj, "list", "the snapshots of one LUN, or of every LUN", [] { return RunList(a); });
    AddPositional(act, "LUN", &a.lun, "the LUN's name, lid or uuid", false);

    static RefOptions show, del, hold, release, holds, lockStatus, wait;
    static CLI::Option *timeout = nullptr;
    act = AddAction(obj, "show", "one snapshot's record, its operation lock and its holders",
                    [] { return RunShow(a, show); });
    show = AddSnapshotRef(act, &a);
    act = AddAction(obj, "delete",
                    "delete a snapshot; refused (18990540) while an application key holds it, unless --ignore-holds",
                    [] { return RunDelete(a, del); });
    del = AddSnapshotRef(act, &a);
    AddFlag(act, "--ignore-holds", &a.ignoreHolds, "delete it even while application keys hold it");
    act = AddAction(obj, "hold", "register an application key that keeps the snapshot from deletion",
                    [] { return RunKey(a, hold, true); });
    hold = AddSnapshotRef(act, &a);
    AddPositional(act, "KEY", &a.key, "the application key (1 to 127 characters, one line; needed)", false);
    act = AddAction(obj, "release", "remove an application key from the snapshot",
                    [] { return RunKey(a, release, false); });
    release = AddSnapshotRef(act, &a);
    AddPositional(act, "KEY", &a.key, "the application key (needed)", false);
    act = AddAction(obj, "holds", "the application keys that hold the snapshot, one a line",
                    [] { return RunHolds(a, holds); });
    holds = AddSnapshotRef(act, &a);
    act = AddAction(obj, "lock-status", "whether an operation holds the snapshot, and which",
                    [] { return RunLockStatus(a, lockStatus); });
    lockStatus = AddSnapshotRef(act, &a);
    act = AddAction(obj, "wait", "wait until no operation holds the snapshot (its creation or deletion is over)",
                    [] { return RunWait(a, wait, timeout->count() > 0); });
    wait = AddSnapshotRef(act, &a);
    timeout = AddValue(act, "--timeout", "S", &a.timeout, "give up after S seconds (18990010); 0 or none: no end");
    act = AddAction(obj, "repair",
                    "settle what a killed creation or deletion left on the LUN's snapshots; prints how many",
                    [] { return RunRepair(a); });
    AddPositional(act, "LUN", &a.lun, "the LUN's name, lid or uuid");
}

}  // namespace cli
