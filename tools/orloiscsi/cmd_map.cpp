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

enum ActionIndex { kAdd, kRemove, kList };

int UsageOf(ActionIndex i);

bool AllDigits(const std::string &s) {
    if (s.empty()) return false;
    for (char c : s)
        if (c < '0' || c > '9') return false;
    return true;
}

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

// TARGET and LUN of add and remove.  0, or the exit status.
int FindPair(const ParsedOptions &o, ActionIndex i, ORLOiSCSITarget *t, ORLOiSCSILun *l) {
    if (o.positional.size() != 2) return UsageOf(i);
    uint32_t ret = FindTarget(o.positional[0], t);
    if (ret != ORLO_OK) return Fail(ret);
    explicit_bzero(t->password, sizeof(t->password));
    explicit_bzero(t->mutual_password, sizeof(t->mutual_password));
    ret = FindLun(o.positional[1], l);
    if (ret != ORLO_OK) {
        if (ret == kErrNoSuchLun) fprintf(stderr, "orloiscsi: no LUN '%s'\n", o.positional[1].c_str());
        return Fail(ret);
    }
    return 0;
}

int RunAdd(const Context &ctx, const Args &args) {
    const OptionSpec specs[] = {{"--lun", true}, {nullptr, false}};
    ParsedOptions o;
    if (!ParseOptionList(args, specs, &o)) return UsageOf(kAdd);
    int32_t number = kAnyLunNumber;
    if (o.Has("--lun")) {
        long v = 0;
        if (!ParseNumber(o.Last("--lun"), 0, ORLO_ISCSI_MAPPING_LUN_MAX, &v)) {
            fprintf(stderr, "orloiscsi: --lun takes a LUN number from 0 to %d\n", ORLO_ISCSI_MAPPING_LUN_MAX);
            return UsageOf(kAdd);
        }
        number = static_cast<int32_t>(v);
    }
    ORLOiSCSITarget t;
    ORLOiSCSILun l;
    int rc = FindPair(o, kAdd, &t, &l);
    if (rc != 0) return rc;
    uint32_t ret = ORLOiSCSITargetMappingAdd(t.tid, l.lid, number);
    if (ret != ORLO_OK) return Fail(ret);
    // The number the library chose, as stored.
    if (StoredMapping(t.tid, l.lid, &number) != ORLO_OK) number = -1;
    if (ctx.json) {
        printf("{\"tid\":%d,\"target\":%s,\"lid\":%d,\"lun_name\":%s,\"lun\":%d}\n", t.tid, JsonQuote(t.name).c_str(),
               l.lid, JsonQuote(l.name).c_str(), number);
    } else {
        printf("mapped LUN %d '%s' into target %d '%s' as LUN %d\n", l.lid, l.name, t.tid, t.name, number);
    }
    return 0;
}

int RunRemove(const Context &, const Args &args) {
    const OptionSpec specs[] = {{nullptr, false}};
    ParsedOptions o;
    if (!ParseOptionList(args, specs, &o)) return UsageOf(kRemove);
    ORLOiSCSITarget t;
    ORLOiSCSILun l;
    int rc = FindPair(o, kRemove, &t, &l);
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

int RunList(const Context &ctx, const Args &args) {
    const OptionSpec specs[] = {{nullptr, false}};
    ParsedOptions o;
    if (!ParseOptionList(args, specs, &o) || o.positional.size() > 1) return UsageOf(kList);
    ORLOiSCSILunFilter f = {};
    f.flags = ORLO_ISCSI_LUN_FILTER_ALL_WITH_BKP;
    if (o.positional.size() == 1) {
        ORLOiSCSITarget t;
        uint32_t ret = FindTarget(o.positional[0], &t);
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
    if (ctx.json) printf("[");
    else printf("%-4s %-20s %-4s %-5s %s\n", "TID", "TARGET", "LUN", "LID", "LUN NAME");
    bool first = true;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf.mappings, link, m) {
        const char *target = m->pTrg != nullptr ? m->pTrg->name : "-";
        const char *lun = m->pLun != nullptr ? m->pLun->name : "-";
        if (ctx.json) {
            printf("%s{\"tid\":%d,\"target\":%s,\"lun\":%d,\"lid\":%d,\"lun_name\":%s}", first ? "" : ",", m->tid,
                   JsonQuote(target).c_str(), m->lun, m->lid, JsonQuote(lun).c_str());
        } else {
            printf("%-4d %-20s %-4d %-5d %s\n", m->tid, target, m->lun, m->lid, lun);
        }
        first = false;
    }
    if (ctx.json) printf("]\n");
    // The snapshot's target records hold deciphered secrets.
    ORLOiSCSITarget *t = nullptr;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&conf.targets, link, t) {
        explicit_bzero(t->password, sizeof(t->password));
        explicit_bzero(t->mutual_password, sizeof(t->mutual_password));
    }
    ORLOiSCSIConfFree(&conf);
    return 0;
}

const Action kActions[] = {
    {"add", "TARGET LUN [--lun N]",
     "map a LUN (name, lid or uuid) into a target (tid or name) as LUN number N (0..255; without --lun the "
     "smallest free one); a running target shows it at once",
     RunAdd},
    {"remove", "TARGET LUN", "take a LUN out of a target, in the kernel and in the mapping file", RunRemove},
    {"list", "[TARGET]", "the mappings of one target, or of all", RunList},
    {nullptr, nullptr, nullptr, nullptr},
};

int UsageOf(ActionIndex i) { return Usage(kMapObject, kActions[i]); }

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

const Object kMapObject = {"map", "LUN-target mappings: which LUN a target shows under which number", kActions};

}  // namespace cli
