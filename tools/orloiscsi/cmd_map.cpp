// orloiscsi map: make LUNs visible through targets under a LUN number, take them away,
// and list what is mapped where.
#include <cctype>
#include <cstdio>
#include <cstring>
#include <string>

#include "cli.h"
#include "orloiscsi_base.h"
#include "orloiscsi_conf.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_target.h"

namespace cli {

namespace {

const uint32_t kErrNoSuchLun = 18990531;
const uint32_t kErrLoadMappingConf = 18990731;  // Failed to load mapping config
// The library picks the smallest free LUN number for any number of 256 or more.
const int32_t kAnyLunNumber = 256;

bool LooksLikeUuid(const std::string &s) {
    if (s.size() != ORLO_ISCSI_UUID_LEN) return false;
    for (size_t i = 0; i < s.size(); ++i) {
        bool dash = i == 8 || i == 13 || i == 18 || i == 23;
        if (dash != (s[i] == '-')) return false;
        if (!dash && !isxdigit(static_cast<unsigned char>(s[i]))) return false;
    }
    return true;
}

// The first LUN of a lookup into *lun: 0, 18990531 when none, or the lookup's code.
uint32_t FirstLun(uint32_t ret, ORLOiSCSILunList *list, ORLOiSCSILun *lun) {
    if (ret == ORLO_OK) {
        ret = kErrNoSuchLun;
        ORLOiSCSIListLink *link;
        ORLOiSCSILun *found = nullptr;
        ORLO_ISCSI_LUN_LIST_FOREACH(list, link, found) {
            *lun = *found;
            ret = ORLO_OK;
            break;
        }
    }
    ORLOiSCSILunListFree(list);
    return ret;
}

// The mapping of lid into tid, as stored: 0 and *number, 18990731 when there is none, or
// the query's code.
uint32_t StoredMapping(int32_t tid, int32_t lid, int32_t *number) {
    ORLOiSCSILunFilter f = {};
    f.flags = ORLO_ISCSI_LUN_FILTER_LOAD_TARGETS | ORLO_ISCSI_LUN_FILTER_LOAD_LUNS |
              ORLO_ISCSI_LUN_FILTER_LOAD_MAPPINGS | ORLO_ISCSI_LUN_FILTER_MAPPED_ONLY | ORLO_ISCSI_TARGET_FILTER_TID |
              ORLO_ISCSI_LUN_FILTER_LID;
    f.tid = tid;
    f.lid = lid;
    ORLOiSCSIConf conf = {};
    uint32_t ret = ORLOiSCSIConfGet(&f, &conf);
    if (ret != ORLO_OK) return ret;
    ret = kErrLoadMappingConf;
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m = nullptr;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf.mappings, link, m) {
        if (m->tid == tid && m->lid == lid) {
            *number = m->lun;
            ret = ORLO_OK;
            break;
        }
    }
    ORLOiSCSIConfFree(&conf);
    return ret;
}

// The arguments of every map action (only the chosen action's are filled).
struct MapArgs {
    std::string target, lun, number;
};

// TARGET and LUN of add and remove.  0, or the exit status.
int FindPair(const MapArgs &a, ORLOiSCSITarget *t, ORLOiSCSILun *l) {
    uint32_t ret = FindTarget(a.target, t);
    if (ret != ORLO_OK) return Fail(ret);
    explicit_bzero(t->password, sizeof(t->password));
    explicit_bzero(t->mutual_password, sizeof(t->mutual_password));
    ret = FindLun(a.lun, l);
    if (ret != ORLO_OK) {
        if (ret == kErrNoSuchLun) fprintf(stderr, "orloiscsi: no LUN '%s'\n", a.lun.c_str());
        return Fail(ret);
    }
    return 0;
}

int RunAdd(const MapArgs &a, bool numberGiven) {
    int32_t number = kAnyLunNumber;
    if (numberGiven) {
        long v = 0;
        if (!ParseNumber(a.number, 0, ORLO_ISCSI_MAPPING_LUN_MAX, &v))
            return UsageError("--lun takes a LUN number from 0 to " + std::to_string(ORLO_ISCSI_MAPPING_LUN_MAX));
        number = static_cast<int32_t>(v);
    }
    ORLOiSCSITarget t;
    ORLOiSCSILun l;
    int rc = FindPair(a, &t, &l);
    if (rc != 0) return rc;
    uint32_t ret = ORLOiSCSITargetMappingAdd(t.tid, l.lid, number);
    if (ret != ORLO_OK) return Fail(ret);
    // The number the library chose, as stored.
    if (StoredMapping(t.tid, l.lid, &number) != ORLO_OK) number = -1;
    if (Ctx().json) {
        PrintJson(Json::Object()
                      .SetInt("tid", t.tid)
                      .SetStr("target", t.name)
                      .SetInt("lid", l.lid)
                      .SetStr("lun_name", l.name)
                      .SetInt("lun", number));
    } else {
        printf("mapped LUN %d '%s' into target %d '%s' as LUN %d\n", l.lid, l.name, t.tid, t.name, number);
    }
    return 0;
}

int RunRemove(const MapArgs &a) {
    ORLOiSCSITarget t;
    ORLOiSCSILun l;
    int rc = FindPair(a, &t, &l);
    if (rc != 0) return rc;
    int32_t number = -1;
    uint32_t ret = StoredMapping(t.tid, l.lid, &number);
    if (ret == kErrLoadMappingConf)
        fprintf(stderr, "orloiscsi: LUN %d '%s' is not mapped into target %d '%s'\n", l.lid, l.name, t.tid, t.name);
    if (ret != ORLO_OK) return Fail(ret);
    ret = ORLOiSCSITargetMappingRemove(t.tid, l.lid);
    if (ret != ORLO_OK) return Fail(ret);
    printf("removed LUN %d '%s' (LUN %d) from target %d '%s'\n", l.lid, l.name, number, t.tid, t.name);
    return 0;
}

int RunList(const MapArgs &a) {
    ORLOiSCSILunFilter f = {};
    f.flags = ORLO_ISCSI_LUN_FILTER_ALL_WITH_BKP;
    if (!a.target.empty()) {
        ORLOiSCSITarget t;
        uint32_t ret = FindTarget(a.target, &t);
        f.tid = t.tid;
        explicit_bzero(&t, sizeof(t));
        if (ret != ORLO_OK) return Fail(ret);
        f.flags = ORLO_ISCSI_LUN_FILTER_LOAD_TARGETS | ORLO_ISCSI_LUN_FILTER_LOAD_LUNS |
                  ORLO_ISCSI_LUN_FILTER_LOAD_MAPPINGS | ORLO_ISCSI_LUN_FILTER_MAPPED_ONLY |
                  ORLO_ISCSI_TARGET_FILTER_TID | ORLO_ISCSI_TARGET_FILTER_BKP;
    }
    ORLOiSCSIConf conf = {};
    uint32_t ret = ORLOiSCSIConfGet(&f, &conf);
    if (ret != ORLO_OK) return Fail(ret);
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m = nullptr;
    Json doc = Json::Array();
    if (!Ctx().json) printf("%-4s %-20s %-4s %-5s %s\n", "TID", "TARGET", "LUN", "LID", "LUN NAME");
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf.mappings, link, m) {
        const char *target = m->pTrg != nullptr ? m->pTrg->name : "-";
        const char *lun = m->pLun != nullptr ? m->pLun->name : "-";
        if (Ctx().json) {
            doc.Push(Json::Object()
                         .SetInt("tid", m->tid)
                         .SetStr("target", target)
                         .SetInt("lun", m->lun)
                         .SetInt("lid", m->lid)
                         .SetStr("lun_name", lun));
        } else {
            printf("%-4d %-20s %-4d %-5d %s\n", m->tid, target, m->lun, m->lid, lun);
        }
    }
    if (Ctx().json) PrintJson(doc);
    // The snapshot's target records hold deciphered secrets.
    ORLOiSCSITarget *t = nullptr;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&conf.targets, link, t) {
        explicit_bzero(t->password, sizeof(t->password));
        explicit_bzero(t->mutual_password, sizeof(t->mutual_password));
    }
    ORLOiSCSIConfFree(&conf);
    return 0;
}

}  // namespace

uint32_t FindLun(const std::string &ref, ORLOiSCSILun *lun) {
    ORLOiSCSILunList list;
    ORLOiSCSIListInit(&list);
    if (LooksLikeUuid(ref)) return ORLOiSCSILunConfGetByUuid(ref.c_str(), lun);
    long lid = 0;
    if (AllDigits(ref) && ParseNumber(ref, ORLO_ISCSI_LID_MIN, ORLO_ISCSI_LID_MAX, &lid)) {
        uint32_t ret = FirstLun(
            ORLOiSCSILunConfGetByLid(static_cast<int32_t>(lid), ORLO_ISCSI_LUN_FILTER_BKP, &list), &list, lun);
        if (ret != kErrNoSuchLun) return ret;
        ORLOiSCSIListInit(&list);  // a LUN may also be named with digits
    }
    return FirstLun(ORLOiSCSILunConfGetByLunName(ref.c_str(), ORLO_ISCSI_LUN_FILTER_BKP, &list), &list, lun);
}

void RegisterMap(CLI::App *root) {
    static MapArgs a;
    static CLI::Option *number = nullptr;
    CLI::App *obj = AddObject(root, "map", "LUN-target mappings: which LUN a target shows under which number");
    // A mapping names a target and a LUN, both made with --name: they are told apart by
    // their places.
    CLI::App *act = AddAction(obj, "add",
                              "map a LUN (name, lid or uuid) into a target (tid or name) as LUN number N (0..255; "
                              "without --lun the smallest free one); a running target shows it at once",
                              [] { return RunAdd(a, number->count() > 0); });
    AddPositional(act, "TARGET", &a.target, "the target's tid or name");
    AddPositional(act, "LUN", &a.lun, "the LUN's name, lid or uuid");
    number = AddValue(act, "--lun", "N", &a.number, "the LUN number initiators see (0..255)");
    act = AddAction(obj, "remove", "take a LUN out of a target, in the kernel and in the mapping file",
                    [] { return RunRemove(a); });
    AddPositional(act, "TARGET", &a.target, "the target's tid or name");
    AddPositional(act, "LUN", &a.lun, "the LUN's name, lid or uuid");
    act = AddAction(obj, "list", "the mappings of one target, or of all", [] { return RunList(a); });
    CLI::Option *pos = AddPositional(act, "TARGET", &a.target, "the target's tid or name", false);
    AddAlias(act, pos, "--name", "NAME", "the target's name, as target create takes it");
}

}  // namespace cli
