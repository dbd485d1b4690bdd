// orloiscsi overview: the whole configuration at one look, as a tree: the service, the
// volumes with their LUNs, the targets with their portals, mapped LUNs and access lists,
// and what the kernel holds that no file knows.  Stored and kernel state stand side by
// side; where they differ the line says so ("!" in the text, "differences" in JSON).
#include <dirent.h>

#include <algorithm>
#include <cinttypes>
#include <cstdio>
#include <cstring>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "cli.h"
#include "olibc.h"
#include "orlo_storage.h"
#include "orloiscsi_base.h"
#include "orloiscsi_conf.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_service.h"
#include "platform/os_seam.h"

namespace cli {

namespace {

const char kIscsiFabric[] = "/config/target/iscsi";
const char kCore[] = "/config/target/core";
const int kMaxVolumes = 64;

// The entries of a directory of the kernel's tree (none when it is missing).
std::vector<std::string> List(const std::string &dir) {
    std::vector<std::string> names;
    std::unique_ptr<DIR, int (*)(DIR *)> d(orlo::os::Opendir(dir.c_str()), closedir);
    if (d == nullptr) return names;
    while (struct dirent *e = readdir(d.get())) {
        std::string n = e->d_name;
        if (n != "." && n != "..") names.push_back(n);
    }
    std::sort(names.begin(), names.end());
    return names;
}

bool Exists(const std::string &path) { return OLIBCFileExist(path.c_str()) == 1; }

std::string TpgPath(const ORLOiSCSITarget &t) {
    return std::string(kIscsiFabric) + "/" + t.iqn + "/tpgt_" + std::to_string(ISCSI_TARGET_DEFAULT_TPGT_NUMBER);
}

bool IsBackupLun(const ORLOiSCSILun &l) { return ORLO_ISCSI_LUN_TYPE_HAS(l.type, ORLO_ISCSI_LUN_BIT_BKP); }

// ---- The picture, gathered once and then printed as text or JSON ----

struct LunView {
    const ORLOiSCSILun *lun;
    bool loaded = false;
    std::vector<std::string> differences;
};

struct VolumeView {
    std::string path;
    bool present = true;
    std::vector<LunView> luns;
};

struct PortalView {
    std::string portal;
    bool stored = false, kernel = false;
};

struct MappingView {
    int32_t number, lid;
    std::string lunName;  // "" when no LUN has the lid
    bool kernel = false;
};

struct AclView {
    std::string initiator;
    bool isDefault = false;
    int32_t authority = 0;
    bool kernel = false;
};

struct TargetView {
    const ORLOiSCSITarget *target;
    int status = 0;
    char connection = ORLO_ISCSI_TARGET_CONN_DOWN;
    int sessions = 0;
    std::vector<PortalView> portals;
    std::vector<MappingView> mappings;
    std::vector<AclView> acls;
    std::vector<std::string> differences;
};

struct Overview {
    unsigned int version = 0;
    bool kernelTarget = false, fabric = false, inUse = false;
    int running = 0;
    std::vector<VolumeView> volumes;
    std::vector<TargetView> targets;
    std::vector<std::string> kernelOnlyTargets, kernelOnlyBackstores;
    int differences = 0;
};

// Owns the configuration snapshot and wipes the deciphered secrets it holds.
class ConfSnapshot {
  public:
    ConfSnapshot() { conf_ = ORLOiSCSIConf{}; }
    ~ConfSnapshot() {
        ORLOiSCSIListLink *link;
        ORLOiSCSITarget *t = nullptr;
        ORLO_ISCSI_TARGET_LIST_FOREACH(&conf_.targets, link, t) {
            explicit_bzero(t->password, sizeof(t->password));
            explicit_bzero(t->mutual_password, sizeof(t->mutual_password));
        }
        ORLOiSCSIConfFree(&conf_);
    }
    ConfSnapshot(const ConfSnapshot &) = delete;
    ConfSnapshot &operator=(const ConfSnapshot &) = delete;
    ORLOiSCSIConf *get() { return &conf_; }

  private:
    ORLOiSCSIConf conf_;
};

void GatherService(Overview *o) {
    o->version = ORLOiSCSIGetLioVersion();
    o->kernelTarget = Exists("/config/target");
    o->fabric = Exists(kIscsiFabric);
    bool inUse = false;
    o->inUse = ORLOiSCSIServiceIsInUse(&inUse) == ORLO_OK && inUse;
}

void GatherTarget(const ORLOiSCSITarget &t, const ORLOiSCSIConf &conf, TargetView *v) {
    v->target = &t;
    v->status = ORLOiSCSITargetStatusGet(t.tid, &t);
    const bool present = (v->status & ORLO_ISCSI_TARGET_STATUS_PRESENT) != 0;
    const bool running = (v->status & ORLO_ISCSI_TARGET_STATUS_ENABLED) != 0;
    if (ORLOiSCSITargetConnectionStatusGet(t.tid, &v->connection) != ORLO_OK) v->connection = -1;
    ORLOiSCSISessionStateList sessions;
    ORLOiSCSIListInit(&sessions);
    v->sessions = ORLOiSCSITargetSessionStateListGet(t.tid, &sessions);
    ORLOiSCSITargetSessionStateListFree(&sessions);
    if (t.enabled && !running)
        v->differences.push_back(present ? "stored enabled, but its portal group is off in the kernel"
                                         : "stored enabled, but not in the kernel");
    if (!t.enabled && present) v->differences.push_back("stored disabled, but in the kernel");

    const std::string tpg = TpgPath(t);
    // Portals: the stored list, and what the portal group listens on.
    std::vector<std::string> stored = SplitPortals(t.network_portals);
    for (const std::string &p : stored) v->portals.push_back({p, true, present && Exists(tpg + "/np/" + p)});
    for (const std::string &p : present ? List(tpg + "/np") : std::vector<std::string>()) {
        if (std::find(stored.begin(), stored.end(), p) == stored.end()) v->portals.push_back({p, false, true});
    }
    for (const PortalView &p : v->portals) {
        if (running && p.stored && !p.kernel) v->differences.push_back("portal " + p.portal + " is not in the kernel");
        // Without a stored list the target listens on the interfaces' addresses.
        if (!stored.empty() && !p.stored) v->differences.push_back("portal " + p.portal + " is in the kernel only");
    }

    // Mapped LUNs by number, as stored and as the portal group has them.
    std::set<int32_t> storedNumbers;
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m = nullptr;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf.mappings, link, m) {
        if (m->tid != t.tid) continue;
        MappingView mv{m->lun, m->lid, m->pLun != nullptr ? m->pLun->name : "", false};
        bool inKernel = false;
        if (present && ORLOiSCSITargetLunIsMapped(m, &inKernel) == ORLO_OK) mv.kernel = inKernel;
        if (mv.lunName.empty())
            v->differences.push_back("LUN " + std::to_string(m->lun) + " maps lid " + std::to_string(m->lid) +
                                     ", which no LUN has");
        if (present && !mv.kernel)
            v->differences.push_back("LUN " + std::to_string(m->lun) + " is mapped in the file but missing from "
                                     "the kernel");
        storedNumbers.insert(m->lun);
        v->mappings.push_back(mv);
    }
    for (const std::string &entry : present ? List(tpg + "/lun") : std::vector<std::string>()) {
        long n = -1;
        if (entry.compare(0, 4, "lun_") != 0 || !ParseNumber(entry.substr(4), 0, ORLO_ISCSI_MAPPING_LUN_MAX, &n))
            continue;
        if (storedNumbers.count(static_cast<int32_t>(n)) == 0) {
            v->mappings.push_back({static_cast<int32_t>(n), 0, "", true});
            v->differences.push_back("LUN " + std::to_string(n) + " is in the kernel only");
        }
    }
    std::sort(v->mappings.begin(), v->mappings.end(),
              [](const MappingView &a, const MappingView &b) { return a.number < b.number; });

    // The access list; each listed initiator has a node access list in the kernel.
    std::vector<ORLOiSCSIAcl> entries;
    if (ORLOiSCSITargetMaskingGet(t.tid, entries) != ORLO_OK) entries.clear();
    std::set<std::string> listed;
    for (const ORLOiSCSIAcl &e : entries) {
        AclView a;
        a.initiator = e.initiator;
        a.isDefault = strcmp(e.initiator, ORLO_ISCSI_DEFAULT_ACL_INITIATOR) == 0;
        a.authority = e.authority;
        a.kernel = present && Exists(tpg + "/acls/" + a.initiator);
        if (present && !a.kernel && !a.isDefault)
            v->differences.push_back("initiator " + a.initiator + " is listed but has no access list in the kernel");
        listed.insert(a.initiator);
        v->acls.push_back(a);
    }
    for (const std::string &initiator : present ? List(tpg + "/acls") : std::vector<std::string>()) {
        if (listed.count(initiator) || initiator == ORLO_ISCSI_DEFAULT_ACL_INITIATOR) continue;
        AclView a;
        a.initiator = initiator;
        a.authority = -1;
        a.kernel = true;
        v->acls.push_back(a);
        v->differences.push_back("initiator " + initiator + " has an access list in the kernel only");
    }
}

uint32_t Gather(bool all, ConfSnapshot *snapshot, Overview *o) {
    GatherService(o);
    // Everything, backup objects too: what the kernel holds is told apart from what no
    // file knows only against the whole configuration.
    ORLOiSCSILunFilter f = {};
    f.flags = ORLO_ISCSI_LUN_FILTER_ALL_WITH_BKP;
    uint32_t ret = ORLOiSCSIConfGet(&f, snapshot->get());
    if (ret != ORLO_OK) return ret;
    const ORLOiSCSIConf &conf = *snapshot->get();
    ORLOiSCSIListLink *link;

    // Targets first: a LUN's differences depend on the targets it is mapped into.
    std::set<std::string> iqns;
    std::map<int32_t, std::vector<int32_t>> runningTidsOfLid;
    ORLOiSCSITarget *t = nullptr;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&conf.targets, link, t) {
        iqns.insert(t->iqn);
        if (t->bkp_obj && !all) continue;
        TargetView v;
        GatherTarget(*t, conf, &v);
        if (v.status & ORLO_ISCSI_TARGET_STATUS_ENABLED) ++o->running;
        if (v.status & ORLO_ISCSI_TARGET_STATUS_PRESENT)
            for (const MappingView &m : v.mappings) runningTidsOfLid[m.lid].push_back(t->tid);
        o->targets.push_back(std::move(v));
    }

    // Volumes: every /volumeN there is, then any other place a LUN names.
    int nums[kMaxVolumes];
    int n = ORLOVolumeNumsList(nums, kMaxVolumes);
    for (int i = 0; i < n && i < kMaxVolumes; ++i) o->volumes.push_back({"/volume" + std::to_string(nums[i]), true, {}});
    std::set<std::string> uuids;
    ORLOiSCSILun *l = nullptr;
    ORLO_ISCSI_LUN_LIST_FOREACH(&conf.luns, link, l) {
        uuids.insert(l->uuid);
        if (IsBackupLun(*l) && !all) continue;
        auto vol = std::find_if(o->volumes.begin(), o->volumes.end(),
                                [&](const VolumeView &v) { return v.path == l->rootPath; });
        if (vol == o->volumes.end()) {
            o->volumes.push_back({l->rootPath, Exists(l->rootPath), {}});
            vol = o->volumes.end() - 1;
        }
        LunView lv;
        lv.lun = l;
        int loaded = 0;
        lv.loaded = ORLOiSCSILunIsLoaded(l, &loaded) == ORLO_OK && loaded != 0;
        if (!lv.loaded)
            for (int32_t tid : runningTidsOfLid[l->lid])
                lv.differences.push_back("mapped into target " + std::to_string(tid) +
                                         ", which is in the kernel, but not loaded");
        if (!vol->present) lv.differences.push_back("its location " + vol->path + " is missing");
        vol->luns.push_back(std::move(lv));
    }
    for (VolumeView &v : o->volumes)
        std::sort(v.luns.begin(), v.luns.end(), [](const LunView &a, const LunView &b) { return a.lun->lid < b.lun->lid; });

    // What the kernel holds that no file knows.
    for (const std::string &node : List(kIscsiFabric))
        if (node.compare(0, 4, "iqn.") == 0 || node.compare(0, 4, "eui.") == 0 || node.compare(0, 4, "naa.") == 0)
            if (!iqns.count(node)) o->kernelOnlyTargets.push_back(node);
    for (const std::string &host : List(kCore))
        for (const std::string &store : List(std::string(kCore) + "/" + host))
            if (store.compare(0, 4, "LUN_") == 0 && !uuids.count(store.substr(4)))
                o->kernelOnlyBackstores.push_back(std::string(kCore) + "/" + host + "/" + store);

    for (const VolumeView &v : o->volumes)
        for (const LunView &lv : v.luns) o->differences += static_cast<int>(lv.differences.size());
    for (const TargetView &tv : o->targets) o->differences += static_cast<int>(tv.differences.size());
    o->differences += static_cast<int>(o->kernelOnlyTargets.size() + o->kernelOnlyBackstores.size());
    return ORLO_OK;
}

const char *CoreName(unsigned int v) { return v == 4 ? "lio4x" : v == 0 ? "none" : "lio"; }
const char *ServiceState(const Overview &o) { return o.fabric ? "running" : "stopped"; }

// ---- Text ----

void PrintDifferences(const std::vector<std::string> &differences, const char *indent) {
    for (const std::string &d : differences) printf("%s! %s\n", indent, d.c_str());
}

void PrintText(const Overview &o) {
    printf("service: %s (target core %s", ServiceState(o), CoreName(o.version));
    if (!o.kernelTarget) printf(", no kernel target at /config/target");
    printf("); %d of %zu targets running\n", o.running, o.targets.size());

    printf("volumes\n");
    if (o.volumes.empty()) printf("  (none)\n");
    for (const VolumeView &v : o.volumes) {
        printf("  %s%s\n", v.path.c_str(), v.present ? "" : "  (missing)");
        for (const LunView &lv : v.luns) {
            const ORLOiSCSILun &l = *lv.lun;
            printf("    LUN %d '%s'  %s  %s  %s\n", l.lid, l.name, ORLOiSCSILunTypeName(l.type),
                   HumanSize(l.size).c_str(), lv.loaded ? "loaded" : "not loaded");
            PrintDifferences(lv.differences, "      ");
        }
    }

    printf("targets\n");
    if (o.targets.empty()) printf("  (none)\n");
    for (const TargetView &v : o.targets) {
        const ORLOiSCSITarget &t = *v.target;
        printf("  target %d '%s'  %s\n", t.tid, t.name, t.iqn);
        printf("    state:  stored %s, kernel %s, %s", t.enabled ? "enabled" : "disabled", KernelState(v.status),
               ConnectionName(v.connection));
        if (v.sessions > 0) printf(" (%d session%s)", v.sessions, v.sessions == 1 ? "" : "s");
        printf("\n    auth:   %s", AuthName(t.auth_type));
        if (t.auth_type != ORLO_ISCSI_AUTH_NONE) printf(", user %s", t.user);
        if (t.auth_type == ORLO_ISCSI_AUTH_MUTUAL_CHAP) printf(", target answers as %s", t.mutual_user);
        printf("\n");
        PrintDifferences(v.differences, "    ");
        printf("    portals\n");
        if (v.portals.empty()) printf("      (none)\n");
        for (const PortalView &p : v.portals)
            printf("      %s  %s\n", p.portal.c_str(),
                   p.stored && p.kernel ? "stored, in the kernel" : p.stored ? "stored" : "in the kernel");
        printf("    LUNs\n");
        if (v.mappings.empty()) printf("      (none)\n");
        for (const MappingView &m : v.mappings) {
            if (m.lid == 0)
                printf("      %d  (in the kernel only)\n", m.number);
            else
                printf("      %d  lid %d '%s'%s\n", m.number, m.lid, m.lunName.empty() ? "?" : m.lunName.c_str(),
                       m.kernel ? "  in the kernel" : "");
        }
        printf("    access\n");
        for (const AclView &a : v.acls) {
            printf("      %s  %s%s\n", a.isDefault ? "(every initiator not listed)" : a.initiator.c_str(),
                   a.authority < 0 ? "(in the kernel only)" : PermissionWord(a.authority),
                   a.kernel && a.authority >= 0 ? "  in the kernel" : "");
        }
        if (v.acls.empty()) printf("      (none)\n");
    }

    if (!o.kernelOnlyTargets.empty() || !o.kernelOnlyBackstores.empty()) {
        printf("in the kernel only\n");
        for (const std::string &n : o.kernelOnlyTargets) printf("  ! target node %s (no stored target)\n", n.c_str());
        for (const std::string &b : o.kernelOnlyBackstores) printf("  ! backstore %s (no stored LUN)\n", b.c_str());
    }
    if (o.differences == 0)
        printf("stored and kernel state agree\n");
    else
        printf("%d difference%s between stored and kernel state\n", o.differences, o.differences == 1 ? "" : "s");
}

// ---- JSON ----

Json Strings(const std::vector<std::string> &list) {
    Json a = Json::Array();
    for (const std::string &s : list) a.Push(Json::Str(s));
    return a;
}

Json ToJson(const Overview &o) {
    Json volumes = Json::Array();
    for (const VolumeView &v : o.volumes) {
        Json luns = Json::Array();
        for (const LunView &lv : v.luns) {
            const ORLOiSCSILun &l = *lv.lun;
            luns.Push(Json::Object()
                          .SetInt("lid", l.lid)
                          .SetStr("name", l.name)
                          .SetStr("type", ORLOiSCSILunTypeName(l.type))
                          .SetUint("size", l.size)
                          .SetStr("uuid", l.uuid)
                          .SetBool("loaded", lv.loaded)
                          .Set("differences", Strings(lv.differences)));
        }
        volumes.Push(Json::Object().SetStr("path", v.path).SetBool("present", v.present).Set("luns", std::move(luns)));
    }
    Json targets = Json::Array();
    for (const TargetView &v : o.targets) {
        const ORLOiSCSITarget &t = *v.target;
        Json portals = Json::Array();
        for (const PortalView &p : v.portals)
            portals.Push(Json::Object().SetStr("portal", p.portal).SetBool("stored", p.stored).SetBool("kernel", p.kernel));
        Json luns = Json::Array();
        for (const MappingView &m : v.mappings) {
            Json j = Json::Object();
            j.SetInt("lun", m.number);
            j.Set("lid", m.lid == 0 ? Json::Null() : Json::Int(m.lid));
            j.Set("name", m.lunName.empty() ? Json::Null() : Json::Str(m.lunName));
            j.SetBool("stored", m.lid != 0).SetBool("kernel", m.kernel);
            luns.Push(std::move(j));
        }
        Json acl = Json::Array();
        for (const AclView &a : v.acls)
            acl.Push(Json::Object()
                         .SetStr("initiator", a.initiator)
                         .SetBool("default", a.isDefault)
                         .Set("permission", a.authority < 0 ? Json::Null() : Json::Str(PermissionWord(a.authority)))
                         .SetBool("stored", a.authority >= 0)
                         .SetBool("kernel", a.kernel));
        Json j = Json::Object();
        j.SetInt("tid", t.tid)
            .SetStr("name", t.name)
            .SetStr("iqn", t.iqn)
            .SetBool("enabled", t.enabled)
            .SetInt("status", v.status)
            .SetStr("kernel", KernelState(v.status))
            .SetStr("connection", ConnectionName(v.connection))
            .SetInt("sessions", v.sessions)
            .SetStr("auth", AuthKey(t.auth_type));
        if (t.auth_type != ORLO_ISCSI_AUTH_NONE) j.SetStr("chap_user", t.user);
        if (t.auth_type == ORLO_ISCSI_AUTH_MUTUAL_CHAP) j.SetStr("mutual_chap_user", t.mutual_user);
        j.Set("portals", std::move(portals))
            .Set("luns", std::move(luns))
            .Set("acl", std::move(acl))
            .Set("differences", Strings(v.differences));
        targets.Push(std::move(j));
    }
    Json doc = Json::Object();
    doc.Set("service", Json::Object()
                           .SetStr("state", ServiceState(o))
                           .SetUint("version", o.version)
                           .SetStr("core", CoreName(o.version))
                           .SetBool("kernel_target", o.kernelTarget)
                           .SetBool("iscsi_fabric", o.fabric)
                           .SetBool("in_use", o.inUse)
                           .SetInt("targets_running", o.running))
        .Set("volumes", std::move(volumes))
        .Set("targets", std::move(targets))
        .Set("kernel_only", Json::Object()
                                .Set("targets", Strings(o.kernelOnlyTargets))
                                .Set("backstores", Strings(o.kernelOnlyBackstores)))
        .SetInt("differences", o.differences);
    return doc;
}

int RunOverview(bool all) {
    ConfSnapshot snapshot;
    Overview o;
    uint32_t ret = Gather(all, &snapshot, &o);
    if (ret != ORLO_OK) return Fail(ret);
    if (Ctx().json)
        PrintJson(ToJson(o));
    else
        PrintText(o);
    return 0;
}

}  // namespace

void RegisterOverview(CLI::App *root) {
    static bool all = false;
    CLI::App *act = AddAction(root, "overview",
                              "the whole configuration as a tree: the service, volumes with their LUNs, targets with "
                              "their portals, LUNs and access lists; stored and kernel state side by side, "
                              "differences marked with '!'",
                              [] { return RunOverview(all); });
    AddFlag(act, "--all", &all, "backup objects too");
}

}  // namespace cli
