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

bool IsDefault(const char *initiator) { return strcmp(initiator, ORLO_ISCSI_DEFAULT_ACL_INITIATOR) == 0; }

// The arguments of every acl action (only the chosen action's are filled).
struct AclArgs {
    std::string target, initiator, permission;
    bool ro = false, rw = false, none = false;
};

// The target named, with its secrets wiped (only its tid, name and kernel state matter
// here).  0, or the exit status.
int TargetOf(const std::string &ref, ORLOiSCSITarget *t) {
    uint32_t ret = FindTarget(ref, t);
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
int EntryArgs(const AclArgs &a, bool wantPermission, ORLOiSCSITarget *t, ORLOiSCSIAcl *record) {
    memset(record, 0, sizeof(*record));
    record->authority = ISCSI_TARGET_AUTHORITY_NONE;
    if (wantPermission)
        record->authority = a.rw ? ISCSI_TARGET_AUTHORITY_RW : a.ro ? ISCSI_TARGET_AUTHORITY_RO : ISCSI_TARGET_AUTHORITY_NONE;
    const std::string &initiator = a.initiator;
    if (IsDefault(initiator.c_str())) {
        fprintf(stderr, "orloiscsi: the default entry is set with 'acl default TARGET none|read-only|read-write'\n");
        return Fail(kErrBadAcl);
    }
    if (initiator.size() >= sizeof(record->initiator) || !ORLOiSCSIIsValidIscsiName(initiator.c_str())) {
        fprintf(stderr, "orloiscsi: '%s' is not an iSCSI initiator name (iqn., eui. or naa.)\n", initiator.c_str());
        return Fail(kErrBadAcl);
    }
    int rc = TargetOf(a.target, t);
    if (rc != 0) return rc;
    record->tid = t->tid;
    memcpy(record->initiator, initiator.c_str(), initiator.size() + 1);
    return 0;
}

int RunAdd(const AclArgs &a) {
    ORLOiSCSITarget t;
    ORLOiSCSIAcl record;
    int rc = EntryArgs(a, true, &t, &record);
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

int RunUpdate(const AclArgs &a) {
    ORLOiSCSITarget t;
    ORLOiSCSIAcl record;
    int rc = EntryArgs(a, true, &t, &record);
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

int RunRemove(const AclArgs &a) {
    ORLOiSCSITarget t;
    ORLOiSCSIAcl record;
    int rc = EntryArgs(a, false, &t, &record);
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

int RunList(const AclArgs &a) {
    ORLOiSCSITarget t;
    int rc = TargetOf(a.target, &t);
    if (rc != 0) return rc;
    std::vector<ORLOiSCSIAcl> entries;
    uint32_t ret = ORLOiSCSITargetMaskingGet(t.tid, entries);
    if (ret != ORLO_OK) return Fail(ret);
    if (Ctx().json) {
        Json doc = Json::Array();
        for (const ORLOiSCSIAcl &e : entries)
            doc.Push(Json::Object()
                         .SetStr("initiator", e.initiator)
                         .SetBool("default", IsDefault(e.initiator))
                         .SetInt("authority", e.authority)
                         .SetStr("permission", PermissionWord(e.authority)));
        PrintJson(doc);
        return 0;
    }
    printf("%-60s %s\n", "INITIATOR", "PERMISSION");
    for (const ORLOiSCSIAcl &e : entries)
        printf("%-60s %s\n", IsDefault(e.initiator) ? "(default: every initiator not listed)" : e.initiator,
               PermissionWord(e.authority));
    return 0;
}

int RunDefault(const AclArgs &a) {
    int32_t authority = 0;
    if (!ParsePermission(a.permission, &authority))
        return UsageError("'" + a.permission + "' is not none, read-only or read-write");
    ORLOiSCSITarget t;
    int rc = TargetOf(a.target, &t);
    if (rc != 0) return rc;
    uint32_t ret = ORLOiSCSITargetDefaultAclSet(&t, authority);
    if (ret != ORLO_OK) return Fail(ret);
    printf("target %d '%s': initiators not listed get %s\n", t.tid, t.name, PermissionWord(authority));
    return 0;
}

// TARGET | --name NAME, first of the action's positionals.
void AddTargetRef(CLI::App *act, std::string *ref) {
    CLI::Option *pos = AddPositional(act, "TARGET", ref, "the target's tid or name");
    AddAlias(act, pos, "--name", "NAME", "the target's name, as target create takes it");
}

void AddInitiator(CLI::App *act, std::string *initiator) {
    AddPositional(act, "INITIATOR", initiator, "the initiator's iSCSI name (iqn., eui. or naa.)");
}

void AddPermission(CLI::App *act, AclArgs *a) {
    CLI::Option *ro = AddFlag(act, "--ro", &a->ro, "reading only");
    CLI::Option *rw = AddFlag(act, "--rw", &a->rw, "reading and writing");
    CLI::Option *none = AddFlag(act, "--none", &a->none, "not at all");
    OneOf(act, {ro, rw, none}, true);
}

}  // namespace

void RegisterAcl(CLI::App *root) {
    static AclArgs a;
    CLI::App *obj = AddObject(root, "acl", "access lists: which initiators may use a target, and how");
    CLI::App *act = AddAction(obj, "add",
                              "let an initiator (its iSCSI name) log in to a target (tid or name), reading only, "
                              "reading and writing, or not at all",
                              [] { return RunAdd(a); });
    AddTargetRef(act, &a.target);
    AddInitiator(act, &a.initiator);
    AddPermission(act, &a);
    act = AddAction(obj, "update", "change what a listed initiator may do", [] { return RunUpdate(a); });
    AddTargetRef(act, &a.target);
    AddInitiator(act, &a.initiator);
    AddPermission(act, &a);
    act = AddAction(obj, "remove", "take an initiator off the access list", [] { return RunRemove(a); });
    AddTargetRef(act, &a.target);
    AddInitiator(act, &a.initiator);
    act = AddAction(obj, "list", "the target's access list, the default entry included", [] { return RunList(a); });
    AddTargetRef(act, &a.target);
    act = AddAction(obj, "default", "what every initiator not listed may do", [] { return RunDefault(a); });
    AddTargetRef(act, &a.target);
    AddPositional(act, "none|read-only|read-write", &a.permission, "the right (ro and rw are taken too)");
}

}  // namespace cli
