// orloiscsi acl: a target's access list (its maskings): which initiators may log in and
// whether they may write, plus the default entry for every initiator not listed.
#include <strings.h>

#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "cli.h"
#include "orloiscsi_base.h"
#include "orloiscsi_target.h"

namespace cli {

namespace {

const uint32_t kErrBadAcl = 18990711;  // Bad target acl

enum ActionIndex { kAdd, kUpdate, kRemove, kList, kDefault };

int UsageOf(ActionIndex i);

// Permission words, as the command line takes them and as it prints them.
struct Permission {
    const char *word;
    const char *alias;
    int32_t authority;
};
const Permission kPermissions[] = {
    {"none", "no-access", ISCSI_TARGET_AUTHORITY_NONE},
    {"read-only", "ro", ISCSI_TARGET_AUTHORITY_RO},
    {"read-write", "rw", ISCSI_TARGET_AUTHORITY_RW},
};

bool ParsePermission(const std::string &s, int32_t *authority) {
    for (const Permission &p : kPermissions)
        if (strcasecmp(s.c_str(), p.word) == 0 || strcasecmp(s.c_str(), p.alias) == 0) {
            *authority = p.authority;
            return true;
        }
    return false;
}

const char *PermissionWord(int32_t authority) {
    switch (authority) {
        case ISCSI_TARGET_AUTHORITY_NONE: return "none";
        case ISCSI_TARGET_AUTHORITY_RO: return "read-only";
        case ISCSI_TARGET_AUTHORITY_LEGACY_RW:
        case ISCSI_TARGET_AUTHORITY_RW: return "read-write";
        default: return "unknown";
    }
}

bool IsDefault(const char *initiator) { return strcmp(initiator, ORLO_ISCSI_DEFAULT_ACL_INITIATOR) == 0; }

// The target of the first positional argument, with its secrets wiped (only its tid,
// name and kernel state matter here).  0, or the exit status.
int TargetOf(const ParsedOptions &o, ORLOiSCSITarget *t) {
    uint32_t ret = FindTarget(o.positional[0], t);
    explicit_bzero(t->password, sizeof(t->password));
    explicit_bzero(t->mutual_password, sizeof(t->mutual_password));
    return ret == ORLO_OK ? 0 : Fail(ret);
}

// The stored entry of initiator, if any.  0 (with *found), or the exit status.
int FindEntry(int32_t tid, const std::string &initiator, bool *found) {
    std::vector<ORLOiSCSIAcl> entries;
    uint32_t ret = ORLOiSCSITargetMaskingGet(tid, entries);
    if (ret != ORLO_OK) return Fail(ret);
    *found = false;
    for (const ORLOiSCSIAcl &e : entries)
        if (initiator == e.initiator) *found = true;
    return 0;
}

// TARGET INITIATOR [--ro|--rw|--none] of add, update and remove, into record.  0, or the
// exit status.
int EntryArgs(const Args &args, ActionIndex i, bool wantPermission, ORLOiSCSITarget *t, ORLOiSCSIAcl *record) {
    const OptionSpec withPermission[] = {{"--ro", false}, {"--rw", false}, {"--none", false}, {nullptr, false}};
    const OptionSpec without[] = {{nullptr, false}};
    ParsedOptions o;
    if (!ParseOptionList(args, wantPermission ? withPermission : without, &o) || o.positional.size() != 2)
        return UsageOf(i);
    memset(record, 0, sizeof(*record));
    record->authority = ISCSI_TARGET_AUTHORITY_NONE;
    if (wantPermission) {
        int given = o.Has("--ro") + o.Has("--rw") + o.Has("--none");
        if (given != 1) {
            fprintf(stderr, "orloiscsi: give exactly one of --ro, --rw and --none\n");
            return UsageOf(i);
        }
        record->authority = o.Has("--rw")   ? ISCSI_TARGET_AUTHORITY_RW
                            : o.Has("--ro") ? ISCSI_TARGET_AUTHORITY_RO
                                            : ISCSI_TARGET_AUTHORITY_NONE;
    }
    const std::string &initiator = o.positional[1];
    if (IsDefault(initiator.c_str())) {
        fprintf(stderr, "orloiscsi: the default entry is set with 'acl default TARGET none|read-only|read-write'\n");
        return Fail(kErrBadAcl);
    }
    if (initiator.size() >= sizeof(record->initiator) || !ORLOiSCSIIsValidIscsiName(initiator.c_str())) {
        fprintf(stderr, "orloiscsi: '%s' is not an iSCSI initiator name (iqn., eui. or naa.)\n", initiator.c_str());
        return Fail(kErrBadAcl);
    }
    int rc = TargetOf(o, t);
    if (rc != 0) return rc;
    record->tid = t->tid;
    memcpy(record->initiator, initiator.c_str(), initiator.size() + 1);
    return 0;
}

int RunAdd(const Context &, const Args &args) {
    ORLOiSCSITarget t;
    ORLOiSCSIAcl record;
    int rc = EntryArgs(args, kAdd, true, &t, &record);
    if (rc != 0) return rc;
    bool found = false;
    rc = FindEntry(t.tid, record.initiator, &found);
    if (rc != 0) return rc;
    if (found) {
        fprintf(stderr, "orloiscsi: target %d '%s' lists '%s' already; change it with 'acl update'\n", t.tid, t.name,
                record.initiator);
        return Fail(18990715);  // Failed to create ACL masking
    }
    uint32_t ret = ORLOiSCSITargetMaskingCreate(record);
    if (ret != ORLO_OK) return Fail(ret);
    printf("target %d '%s': %s may log in, %s\n", t.tid, t.name, record.initiator, PermissionWord(record.authority));
    return 0;
}

int RunUpdate(const Context &, const Args &args) {
    ORLOiSCSITarget t;
    ORLOiSCSIAcl record;
    int rc = EntryArgs(args, kUpdate, true, &t, &record);
    if (rc != 0) return rc;
    bool found = false;
    rc = FindEntry(t.tid, record.initiator, &found);
    if (rc != 0) return rc;
    if (!found) {
        fprintf(stderr, "orloiscsi: target %d '%s' does not list '%s'; add it with 'acl add'\n", t.tid, t.name,
                record.initiator);
        return Fail(kErrBadAcl);
    }
    uint32_t ret = ORLOiSCSITargetMaskingUpdate(record);
    if (ret != ORLO_OK) return Fail(ret);
    printf("target %d '%s': %s is now %s\n", t.tid, t.name, record.initiator, PermissionWord(record.authority));
    return 0;
}

int RunRemove(const Context &, const Args &args) {
    ORLOiSCSITarget t;
    ORLOiSCSIAcl record;
    int rc = EntryArgs(args, kRemove, false, &t, &record);
    if (rc != 0) return rc;
    std::vector<ORLOiSCSIAcl> entries;
    uint32_t ret = ORLOiSCSITargetMaskingGet(t.tid, entries);
    if (ret != ORLO_OK) return Fail(ret);
    bool found = false;
    for (const ORLOiSCSIAcl &e : entries)
        if (strcmp(e.initiator, record.initiator) == 0) {
            record.authority = e.authority;
            found = true;
        }
    if (!found) {
        fprintf(stderr, "orloiscsi: target %d '%s' does not list '%s'\n", t.tid, t.name, record.initiator);
        return Fail(kErrBadAcl);
    }
    ret = ORLOiSCSITargetMaskingRemove(record);
    if (ret != ORLO_OK) return Fail(ret);
    printf("target %d '%s': %s removed from the access list\n", t.tid, t.name, record.initiator);
    return 0;
}

int RunList(const Context &ctx, const Args &args) {
    const OptionSpec specs[] = {{nullptr, false}};
    ParsedOptions o;
    if (!ParseOptionList(args, specs, &o) || o.positional.size() != 1) return UsageOf(kList);
    ORLOiSCSITarget t;
    int rc = TargetOf(o, &t);
    if (rc != 0) return rc;
    std::vector<ORLOiSCSIAcl> entries;
    uint32_t ret = ORLOiSCSITargetMaskingGet(t.tid, entries);
    if (ret != ORLO_OK) return Fail(ret);
    if (ctx.json) {
        printf("[");
        bool first = true;
        for (const ORLOiSCSIAcl &e : entries) {
            printf("%s{\"initiator\":%s,\"default\":%s,\"authority\":%d,\"permission\":\"%s\"}", first ? "" : ",",
                   JsonQuote(e.initiator).c_str(), IsDefault(e.initiator) ? "true" : "false", e.authority,
                   PermissionWord(e.authority));
            first = false;
        }
        printf("]\n");
        return 0;
    }
    printf("%-60s %s\n", "INITIATOR", "PERMISSION");
    for (const ORLOiSCSIAcl &e : entries)
        printf("%-60s %s\n", IsDefault(e.initiator) ? "(default: every initiator not listed)" : e.initiator,
               PermissionWord(e.authority));
    return 0;
}

int RunDefault(const Context &, const Args &args) {
    const OptionSpec specs[] = {{nullptr, false}};
    ParsedOptions o;
    int32_t authority = 0;
    if (!ParseOptionList(args, specs, &o) || o.positional.size() != 2) return UsageOf(kDefault);
    if (!ParsePermission(o.positional[1], &authority)) {
        fprintf(stderr, "orloiscsi: '%s' is not none, read-only or read-write\n", o.positional[1].c_str());
        return UsageOf(kDefault);
    }
    ORLOiSCSITarget t;
    int rc = TargetOf(o, &t);
    if (rc != 0) return rc;
    uint32_t ret = ORLOiSCSITargetDefaultAclSet(&t, authority);
    if (ret != ORLO_OK) return Fail(ret);
    printf("target %d '%s': initiators not listed get %s\n", t.tid, t.name, PermissionWord(authority));
    return 0;
}

const Action kActions[] = {
    {"add", "TARGET INITIATOR --ro|--rw|--none",
     "let an initiator (its iSCSI name) log in to a target (tid or name), reading only, reading and writing, "
     "or not at all",
     RunAdd},
    {"update", "TARGET INITIATOR --ro|--rw|--none", "change what a listed initiator may do", RunUpdate},
    {"remove", "TARGET INITIATOR", "take an initiator off the access list", RunRemove},
    {"list", "TARGET", "the target's access list, the default entry included", RunList},
    {"default", "TARGET none|read-only|read-write", "what every initiator not listed may do", RunDefault},
    {nullptr, nullptr, nullptr, nullptr},
};

int UsageOf(ActionIndex i) { return Usage(kAclObject, kActions[i]); }

}  // namespace

const Object kAclObject = {"acl", "access lists: which initiators may use a target, and how", kActions};

}  // namespace cli
