/*
 * The table of node kinds: what the kernel target makes when a directory of each kind
 * comes into being, what its attribute files accept, and which children and links a
 * user may add.  It reads top to bottom like the tree: target core (hosts, backstores
 * and their groups), the iSCSI fabric (nodes, portal groups, portals, LUN entries,
 * access lists), then the extent pool and vsys.
 */
#include <arpa/inet.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>

#include "configfs_modules.h"
#include "configfs_sim.h"
#include "configfs_values.h"

namespace orlosim {
namespace {

// ---- Building blocks -------------------------------------------------------------

AttrDef RW(const char *name, std::string initial, CheckFn check) {
    AttrDef a;
    a.name = name;
    a.mode = 0644;
    a.initial = std::move(initial);
    a.check = std::move(check);
    return a;
}

AttrDef RO(const char *name, std::string initial) {
    AttrDef a;
    a.name = name;
    a.mode = 0444;
    a.initial = std::move(initial);
    return a;
}

AttrDef ROShow(const char *name, ShowFn show) {
    AttrDef a;
    a.name = name;
    a.mode = 0444;
    a.show = std::move(show);
    return a;
}

AttrDef Custom(const char *name, int mode, std::string initial, StoreFn store, ShowFn show = nullptr) {
    AttrDef a;
    a.name = name;
    a.mode = mode;
    a.initial = std::move(initial);
    a.store = std::move(store);
    a.show = std::move(show);
    return a;
}

// A kind of read-only counters, as the statistics groups are.
Kind Stats(const char *name, std::vector<std::pair<const char *, const char *>> files) {
    Kind k;
    k.name = name;
    for (auto &f : files) k.attrs.push_back(RO(f.first, f.second));
    return k;
}

// Child-name rules.
MakeChildFn AnyName(const char *kind) {
    return [kind](Sim &, Node &, const std::string &, const Kind **k) {
        *k = KindByName(kind);
        return 0;
    };
}

// "<prefix><number>" with the number parsed as kstrtoull does and at most max.
bool NumberedName(const std::string &name, const std::string &prefix, unsigned long long max,
                  unsigned long long *n = nullptr) {
    if (name.compare(0, prefix.size(), prefix) != 0) return false;
    unsigned long long v = 0;
    if (KStrToULL(name.substr(prefix.size()), &v) != 0 || v > max) return false;
    if (n != nullptr) *n = v;
    return true;
}

MakeChildFn Numbered(const char *prefix, unsigned long long max, const char *kind) {
    return [prefix, max, kind](Sim &, Node &, const std::string &name, const Kind **k) {
        if (!NumberedName(name, prefix, max)) return EINVAL;
        *k = KindByName(kind);
        return 0;
    };
}

// Initiator and target names are limited to the iSCSI name length.
MakeChildFn IqnName(const char *kind) {
    return [kind](Sim &, Node &, const std::string &name, const Kind **k) {
        if (name.size() >= 224) return EINVAL;
        *k = KindByName(kind);
        return 0;
    };
}

Node *Up(Node *n, int levels) {
    while (n != nullptr && levels-- > 0) n = n->parent;
    return n;
}

bool IsBackstore(const Node &n) { return n.kind != nullptr && n.kind->name.compare(0, 4, "dev_") == 0; }

// The one link a directory holds, if any.
Node *LinkOf(const Node &dir) {
    for (auto &c : dir.children)
        if (c.second->IsLink()) return c.second->target;
    return nullptr;
}

int OpenLikeKernel(Sim &sim, const std::string &appliancePath, bool wantBlock) {
    std::string p = sim.HostPath(appliancePath);
    struct stat st;
    if (::stat(p.c_str(), &st) != 0) return errno;
    if (wantBlock && !S_ISBLK(st.st_mode)) return ENOTBLK;
    if (S_ISDIR(st.st_mode)) return EISDIR;
    int fd = ::open(p.c_str(), O_RDWR | O_CLOEXEC | O_NONBLOCK);
    if (fd < 0) return errno;
    ::close(fd);
    return 0;
}

std::string Param(const Node &dev, const char *key) {
    auto it = dev.params.find(key);
    return it == dev.params.end() ? std::string() : it->second;
}

// ---- Backstores ------------------------------------------------------------------

// One key of a control string and what it does to the backstore.
struct ControlKey {
    const char *key;
    std::function<int(Sim &, Node &dev, const std::string &value)> apply;
};

std::function<int(Sim &, Node &, const std::string &)> SetPath(const char *key, bool refuseWhenEnabled) {
    return [key, refuseWhenEnabled](Sim &, Node &dev, const std::string &v) {
        if (refuseWhenEnabled && dev.enabled) return EEXIST;
        if (v.empty() || v.size() >= 4096) return EINVAL;
        dev.params[key] = v;
        return 0;
    };
}

std::function<int(Sim &, Node &, const std::string &)> SetChecked(const char *key, CheckFn check) {
    return [key, check](Sim &, Node &dev, const std::string &v) {
        std::string stored;
        int rc = check(v, &stored);
        if (rc != 0) return EINVAL;
        dev.params[key] = stored;
        return 0;
    };
}

std::function<int(Sim &, Node &, const std::string &)> StartRelation(const char *relation) {
    return [relation](Sim &sim, Node &dev, const std::string &v) {
        if (!IsUuid(v) || Param(dev, "ep_parent_name").empty()) return EINVAL;
        dev.clone = CloneState();
        dev.clone.relation = relation;
        dev.clone.parentName = Param(dev, "ep_parent_name");
        dev.clone.parentUuid = v;
        dev.clone.ongoing = true;
        dev.clone.started = std::chrono::steady_clock::now();
        EpRelationStarted(sim, dev);
        return 0;
    };
}

int Promote(Sim &sim, Node &dev, const std::string &v) {
    uint32_t one = 0;
    if (KStrToU32(v, &one) != 0 || one != 1 || dev.clone.relation != "mirror") return EINVAL;
    // A mirror is split off in step: whatever it still lacked is copied at the split.
    if (!dev.clone.synced) EpRelationDone(sim, dev);
    dev.clone.promoted = true;
    dev.clone.ongoing = false;
    dev.clone.progress = 100;
    EpRelationPromoted(sim, dev);
    return 0;
}

const std::vector<ControlKey> &IblockKeys() {
    static const std::vector<ControlKey> keys = {
        {"udev_path", SetPath("udev_path", true)},
        {"readonly", SetChecked("readonly", U32Range(0, 0xFFFFFFFF))},
    };
    return keys;
}

// The extent-pool keys: the map table switch and the map file, and the commands that
// start a clone or mirror from a parent and promote a mirror child.
std::vector<ControlKey> EpKeys() {
    return {
        {"ep_map_table", SetChecked("ep_map_table", Bool01())},
        {"ep_dev_name", SetPath("ep_dev_name", true)},
        {"ep_parent_name", SetChecked("ep_parent_name", Text(255))},
        {"ep_clone_parent", StartRelation("clone")},
        {"ep_mirror_parent", StartRelation("mirror")},
        {"ep_relation_promote", Promote},
    };
}

const std::vector<ControlKey> &FileioKeys() {
    static const std::vector<ControlKey> keys = [] {
        std::vector<ControlKey> k = {
            {"fd_dev_name", SetPath("fd_dev_name", false)},
            {"fd_dev_size", SetChecked("fd_dev_size", [](const std::string &in, std::string *out) {
                 unsigned long long v = 0;
                 if (KStrToULL(in, &v) != 0) return EINVAL;
                 *out = std::to_string(v);
                 return 0;
             })},
            {"fd_buffered_io", SetChecked("fd_buffered_io", U32Range(1, 1))},
            {"fd_async_io", SetChecked("fd_async_io", U32Range(1, 1))},
            {"thin_provision", SetChecked("thin_provision", Bool01())},
            {"block_size", SetChecked("block_size", U32Set({512, 1024, 2048, 4096}))},
            {"enable_sink", SetChecked("enable_sink", Text(255))},
            {"fd_dio", SetChecked("fd_dio", Bool01())},
        };
        // The older target core keeps extent-pool LUNs in the file host.
        for (ControlKey &e : EpKeys()) k.push_back(e);
        return k;
    }();
    return keys;
}

const std::vector<ControlKey> &EpioKeys() {
    static const std::vector<ControlKey> keys = EpKeys();
    return keys;
}

const std::vector<ControlKey> &KeysOf(const Node &dev) {
    if (dev.kind->name == "dev_iblock") return IblockKeys();
    if (dev.kind->name == "dev_fileio") return FileioKeys();
    return EpioKeys();
}

// The control file: "key=value" tokens separated by commas or newlines; unknown keys
// are ignored, a bad value ends the parse with EINVAL (earlier keys stay applied).
int ControlStore(Sim &sim, Node &dev, int, const std::string &in) {
    const std::vector<ControlKey> &keys = KeysOf(dev);
    size_t start = 0;
    while (start <= in.size()) {
        size_t end = in.find_first_of(",\n", start);
        if (end == std::string::npos) end = in.size();
        std::string tok = in.substr(start, end - start);
        start = end + 1;
        if (tok.empty()) continue;
        size_t eq = tok.find('=');
        std::string key = tok.substr(0, eq);
        std::string value = eq == std::string::npos ? std::string() : tok.substr(eq + 1);
        for (const ControlKey &k : keys) {
            if (key != k.key) continue;
            int rc = k.apply(sim, dev, value);
            if (rc != 0) return rc;
        }
    }
    return 0;
}

// Configures the device as the backend's configure routine does: the data path must
// have been given and must open.
int Configure(Sim &sim, Node &dev) {
    const std::string &kind = dev.kind->name;
    if (kind == "dev_iblock") {
        std::string path = Param(dev, "udev_path");
        if (path.empty()) return EINVAL;
        return OpenLikeKernel(sim, path, true);
    }
    if (kind == "dev_fileio") {
        std::string path = Param(dev, "fd_dev_name");
        bool ep = path.empty();
        if (ep) path = Param(dev, "ep_dev_name");
        if (path.empty()) return EINVAL;
        int rc = OpenLikeKernel(sim, path, false);
        if (rc != 0) return rc;
        struct stat st;
        if (!ep && ::stat(sim.HostPath(path).c_str(), &st) == 0 && S_ISREG(st.st_mode) &&
            Param(dev, "fd_dev_size").empty())
            return EINVAL;  // a file without its size
        return 0;
    }
    std::string path = Param(dev, "ep_dev_name");
    if (path.empty()) return EINVAL;
    return OpenLikeKernel(sim, path, false);
}

int EnableStore(Sim &sim, Node &dev, int, const std::string &in) {
    if (in.find('1') == std::string::npos) return EINVAL;  // only "1" is understood
    if (dev.enabled) return EEXIST;
    int rc = Configure(sim, dev);
    if (rc != 0) return rc;
    dev.enabled = true;
    return 0;
}

int EnableShow(Sim &, Node &dev, int, std::string *out) {
    *out = dev.enabled ? "1\n" : "0\n";
    return 0;
}

std::string DevState(const Node &dev) {
    Node *attrib = dev.Child("attrib");
    std::string qd = attrib != nullptr ? attrib->Value("queue_depth") : "128";
    std::string bs = attrib != nullptr ? attrib->Value("block_size") : "512";
    std::string ms = attrib != nullptr ? attrib->Value("hw_max_sectors") : "2048";
    return std::string("Status: ") + (dev.enabled ? "ACTIVATED" : "DEACTIVATED") + "  Max Queue Depth: " + qd +
           "  SectorSize: " + bs + "  HwMaxSectors: " + ms + "\n";
}

int InfoShow(Sim &, Node &dev, int, std::string *out) {
    std::string s = DevState(dev);
    if (dev.kind->name == "dev_iblock") {
        s += "        iBlock device: " + Param(dev, "udev_path") + "  UDEV PATH: " + Param(dev, "udev_path") +
             "  readonly: " + (Param(dev, "readonly").empty() ? "0" : Param(dev, "readonly")) + "\n";
    } else {
        std::string file = Param(dev, "fd_dev_name");
        if (file.empty()) file = Param(dev, "ep_dev_name");
        std::string size = Param(dev, "fd_dev_size").empty() ? "0" : Param(dev, "fd_dev_size");
        s += "        TCM FILEIO ID: 0        File: " + file + "  Size: " + size + "  Mode: O_DSYNC Async: 0\n";
        auto p = [&](const char *k, const char *def) {
            std::string v = Param(dev, k);
            return v.empty() ? std::string(def) : v;
        };
        s += "        Thin: " + p("thin_provision", "0") + "  BlockSize: " + p("block_size", "512") +
             "  Sink: " + p("enable_sink", "") + "  DIO: " + p("fd_dio", "0") +
             "  MapTable: " + p("ep_map_table", "0") + "\n";
    }
    *out = s;
    return 0;
}

int EpDeviceShow(Sim &, Node &info, int, std::string *out) {
    Node &dev = *info.parent;
    *out = DevState(dev) + "        TCM EPIO ID: 0        Map: " + Param(dev, "ep_dev_name") +
           "  MapTable: " + (Param(dev, "ep_map_table").empty() ? "0" : Param(dev, "ep_map_table")) + "\n";
    return 0;
}

// info/extent/child of an extent-pool backstore: the relation the kernel runs for it.
int EpChildShow(Sim &, Node &extent, int, std::string *out) {
    Node &dev = *extent.parent->parent;
    const CloneState &c = dev.clone;
    std::string s = "relation=" + (c.relation.empty() ? std::string("none") : c.relation) + "\n";
    s += "parent_name=" + c.parentName + "\n";
    s += "parent_uuid=" + c.parentUuid + "\n";
    s += "clone_ongoing=" + std::string(c.ongoing && c.relation == "clone" ? "1" : "0") + "\n";
    s += "mirror_ongoing=" + std::string(c.ongoing && c.relation == "mirror" ? "1" : "0") + "\n";
    s += "promoted=" + std::string(c.promoted ? "1" : "0") + "\n";
    s += "progress=" + std::to_string(c.progress) + "\n";
    *out = s;
    return 0;
}

// udev_path and alias show nothing at all until they are set, as the kernel's do.
int OptionalShow(Sim &, Node &n, int attr, std::string *out) {
    const std::string &v = n.values[static_cast<size_t>(attr)];
    *out = v.empty() ? std::string() : v + "\n";
    return 0;
}

int HbaTypeShow(Sim &, Node &attrib, int, std::string *out) {
    *out = attrib.parent->kind->name.substr(4) + "\n";  // "dev_iblock" -> "iblock"
    return 0;
}

// A device attribute that cannot change while a fabric exports the device.
StoreFn Unexported(CheckFn check) {
    return [check](Sim &, Node &attrib, int attr, const std::string &in) {
        std::string v;
        int rc = check(in, &v);
        if (rc != 0) return rc;
        if (attrib.parent->exports > 0) return EINVAL;
        attrib.values[static_cast<size_t>(attr)] = v;
        return 0;
    };
}

// An attribute bounded by another of the same group (queue_depth by hw_queue_depth).
StoreFn AtMost(const char *limitAttr) {
    return [limitAttr](Sim &, Node &n, int attr, const std::string &in) {
        uint32_t v = 0;
        int rc = KStrToU32(in, &v);
        if (rc != 0) return rc;
        if (v == 0 || v > strtoul(n.Value(limitAttr).c_str(), nullptr, 10)) return EINVAL;
        n.values[static_cast<size_t>(attr)] = std::to_string(v);
        return 0;
    };
}

Kind DevAttrib() {
    Kind k;
    k.name = "dev_attrib";
    for (const char *b : {"emulate_model_alias", "emulate_dpo", "emulate_fua_write", "emulate_fua_read",
                          "emulate_tas", "emulate_caw", "emulate_3pc", "emulate_pr", "enforce_pr_isids"})
        k.attrs.push_back(RW(b, "1", KBool()));
    for (const char *b : {"emulate_write_cache", "emulate_tpu", "emulate_tpws", "is_nonrot", "emulate_rest_reord",
                          "force_pr_aptpl", "unmap_zeroes_data", "pi_prot_verify"})
        k.attrs.push_back(RW(b, "0", KBool()));
    k.attrs.push_back(RW("emulate_ua_intlck_ctrl", "0", U32Range(0, 2)));
    k.attrs.push_back(RW("pi_prot_type", "0", U32Set({0, 1, 2, 3})));
    k.attrs.push_back(RO("hw_pi_prot_type", "0"));
    k.attrs.push_back(RW("pi_prot_format", "0", U32Range(0, 1)));
    k.attrs.push_back(RO("hw_block_size", "512"));
    k.attrs.push_back(Custom("block_size", 0644, "512", Unexported(U32Set({512, 1024, 2048, 4096}))));
    k.attrs.push_back(RO("hw_max_sectors", "2048"));
    k.attrs.push_back(Custom("optimal_sectors", 0644, "2048", AtMost("hw_max_sectors")));
    k.attrs.push_back(RO("hw_queue_depth", "128"));
    k.attrs.push_back(Custom("queue_depth", 0644, "128", AtMost("hw_queue_depth")));
    for (const char *n : {"max_unmap_lba_count", "max_unmap_block_desc_count", "unmap_granularity",
                          "unmap_granularity_alignment", "max_write_same_len"})
        k.attrs.push_back(RW(n, "0", U32Range(0, 0xFFFFFFFF)));
    k.attrs.push_back(RO("alua_support", "1"));
    k.attrs.push_back(RO("pgr_support", "1"));
    // The appliance kernel's own attributes.
    k.attrs.push_back(RW("uuid", "", Uuid()));
    k.attrs.push_back(RW("lun_name", "", Text(255)));
    k.attrs.push_back(RW("is_skip_resource_monitor", "0", Bool01()));
    k.attrs.push_back(RW("emulate_sync_cache", "0", Bool01()));
    k.attrs.push_back(RW("defer_queue_mode", "multi", Word(16)));
    k.attrs.push_back(ROShow("hba_type", HbaTypeShow));
    return k;
}

int UnitSerialStore(Sim &, Node &wwn, int attr, const std::string &in) {
    if (wwn.parent->exports > 0) return EINVAL;
    std::string v = StripRight(in);
    if (v.size() >= 254) return EOVERFLOW;
    wwn.values[static_cast<size_t>(attr)] = v;
    return 0;
}

int UnitSerialShow(Sim &, Node &wwn, int attr, std::string *out) {
    *out = "T10 VPD Unit Serial Number: " + wwn.values[static_cast<size_t>(attr)] + "\n";
    return 0;
}

Kind DevWwn() {
    Kind k;
    k.name = "dev_wwn";
    k.attrs = {
        Custom("vpd_unit_serial", 0644, "", UnitSerialStore, UnitSerialShow),
        RO("vpd_protocol_identifier", ""),
        RO("vpd_assoc_logical_unit", ""),
        RO("vpd_assoc_target_port", ""),
        RO("vpd_assoc_scsi_target_device", ""),
        RW("vendor_id", "LIO-ORG", Text(8)),
        RW("product_id", "", Text(16)),
        RW("revision", "4.0", Text(4)),
        RW("company_id", "0x001405", U32Range(0, 0xFFFFFF)),
    };
    k.onCreate = [](Sim &, Node &wwn) {
        std::string type = wwn.parent->kind->name.substr(4);
        for (char &c : type) c = static_cast<char>(toupper(static_cast<unsigned char>(c)));
        wwn.Value("product_id") = type;
    };
    return k;
}

const char *kAccessTypeNames[] = {"None", "Implicit", "Explicit", "Implicit and Explicit"};

int AccessTypeShow(Sim &, Node &gp, int attr, std::string *out) {
    *out = std::string(kAccessTypeNames[atoi(gp.values[static_cast<size_t>(attr)].c_str()) & 3]) + "\n";
    return 0;
}

Kind TgPtGp() {
    Kind k;
    k.name = "tg_pt_gp";
    k.attrs = {
        RW("alua_access_state", "0", U32Set({0, 1, 2, 3, 4, 14, 15})),
        RW("alua_access_status", "0", U32Range(0, 2)),
        Custom("alua_access_type", 0644, "3",
               [](Sim &, Node &n, int attr, const std::string &in) {
                   std::string v;
                   int rc = U32Range(0, 3)(in, &v);
                   if (rc == 0) n.values[static_cast<size_t>(attr)] = v;
                   return rc;
               },
               AccessTypeShow),
        RW("alua_support_transitioning", "1", Bool01()),
        RW("alua_support_offline", "1", Bool01()),
        RW("alua_support_lba_dependent", "0", Bool01()),
        RW("alua_support_unavailable", "1", Bool01()),
        RW("alua_support_standby", "1", Bool01()),
        RW("alua_support_active_optimized", "1", Bool01()),
        RW("alua_support_active_nonoptimized", "1", Bool01()),
        RW("alua_write_metadata", "0", Bool01()),
        RW("nonop_delay_msecs", "100", U32Range(0, 10000)),
        RW("trans_delay_msecs", "0", U32Range(0, 30000)),
        RW("implicit_trans_secs", "0", U32Range(0, 255)),
        RW("preferred", "0", Bool01()),
        RW("tg_pt_gp_id", "0", U32Range(0, 0xFFFF)),
        RO("members", ""),
    };
    return k;
}

Kind DevAlua() {
    Kind k;
    k.name = "dev_alua";
    k.groups = {{"default_tg_pt_gp", "tg_pt_gp"}};
    k.makeChild = AnyName("tg_pt_gp");
    return k;
}

Kind DevPr() {
    return Stats("dev_pr", {{"res_aptpl_active", "APTPL Bit Status: Disabled"},
                            {"res_holder", "No SPC-2 Reservation holder"},
                            {"res_pr_all_tgt_pts", "No SPC-3 Reservation holder"},
                            {"res_pr_generation", "0x00000000"},
                            {"res_pr_holder_tg_port", "No SPC-3 Reservation holder"},
                            {"res_pr_registered_i_pts", "SPC-3 PR Registrations:\nNone"},
                            {"res_pr_type", "No SPC-3 Reservation holder"},
                            {"res_type", "SPC3_PERSISTENT_RESERVATIONS"}});
}

Kind Backstore(const char *name) {
    Kind k;
    k.name = name;
    bool ep = std::string(name) == "dev_epio";
    k.attrs = {
        Custom("control", 0200, "", ControlStore),
        Custom("enable", 0644, "", EnableStore, EnableShow),
        Custom("udev_path", 0644, "",
               [](Sim &, Node &n, int attr, const std::string &in) {
                   std::string v = Chomp(in);
                   if (in.size() > 512) return EINVAL;
                   n.values[static_cast<size_t>(attr)] = v;
                   return 0;
               },
               OptionalShow),
        Custom("alias", 0644, "",
               [](Sim &, Node &n, int attr, const std::string &in) {
                   if (in.size() > 512) return EINVAL;
                   n.values[static_cast<size_t>(attr)] = Chomp(in);
                   return 0;
               },
               OptionalShow),
        RW("lba_map", "", Text(4095)),
        Custom("alua_lu_gp", 0644, "",
               [](Sim &, Node &, int, const std::string &in) {
                   std::string v = Chomp(in);
                   return v == "default_lu_gp" || v == "NULL" ? 0 : EINVAL;
               },
               [](Sim &, Node &, int, std::string *out) {
                   *out = "LU Group Alias: default_lu_gp\nLU Group ID: 0\n";
                   return 0;
               }),
    };
    if (!ep) k.attrs.push_back(ROShow("info", InfoShow));
    k.groups = {{"attrib", "dev_attrib"}, {"pr", "dev_pr"}, {"wwn", "dev_wwn"}, {"alua", "dev_alua"},
                {"statistics", "dev_stats"}};
    if (ep) k.groups.push_back({"info", "ep_info"});
    return k;
}

Kind Host(const char *name, const char *devKind) {
    Kind k;
    k.name = name;
    k.attrs = {
        ROShow("hba_info",
               [](Sim &, Node &host, int, std::string *out) {
                   std::string type = host.name.substr(0, host.name.rfind('_'));
                   *out = "HBA Index: " + host.name.substr(host.name.rfind('_') + 1) + " plugin: " + type +
                          " version: v5.0\n";
                   return 0;
               }),
        Custom("hba_mode", 0644, "0", [](Sim &, Node &, int, const std::string &) { return EINVAL; }),
    };
    k.makeChild = AnyName(devKind);
    return k;
}

// mkdir under target/core makes a new host "<backend>_<n>" when that backend is loaded.
int MakeHost(Sim &sim, Node &, const std::string &name, const Kind **k) {
    size_t us = name.rfind('_');
    if (us == std::string::npos) return EINVAL;
    std::string backend = name.substr(0, us);
    unsigned long long id = 0;
    if (KStrToULL(name.substr(us + 1), &id) != 0 || !BackendAvailable(sim, backend)) return EINVAL;
    *k = KindByName("host_" + backend);
    return 0;
}

int MakeFabric(Sim &sim, Node &, const std::string &name, const Kind **k) {
    if (!FabricAvailable(sim, name)) return EINVAL;  // the kernel finds no such fabric module
    *k = KindByName(name == "iscsi" ? "fabric_iscsi" : "fabric_other");
    return 0;
}

// ---- The iSCSI fabric --------------------------------------------------------------

std::string TpgPath(Sim &sim, Node &tpg) { return sim.TreePath(&tpg); }

int TpgEnableStore(Sim &sim, Node &tpg, int attr, const std::string &in) {
    uint32_t v = 0;
    int rc = KStrToU32(in, &v);
    if (rc != 0) return rc;
    if (v > 1) return EINVAL;
    tpg.values[static_cast<size_t>(attr)] = std::to_string(v);
    if (v == 0) {  // a disabled portal group drops its sessions
        std::string path = TpgPath(sim, tpg);
        auto &s = sim.sessions();
        for (size_t i = s.size(); i-- > 0;)
            if (s[i].tpg == path) s.erase(s.begin() + static_cast<long>(i));
    }
    return 0;
}

int DynamicSessionsShow(Sim &sim, Node &tpg, int, std::string *out) {
    std::string path = TpgPath(sim, tpg);
    out->clear();
    for (const Session &s : sim.sessions())
        if (s.tpg == path) *out += "IQN=" + s.initiator + ",IP=" + s.ip + ",CID=" + std::to_string(s.cid) + "\n";
    return 0;
}

int NaclInfoShow(Sim &sim, Node &nacl, int, std::string *out) {
    std::string path = TpgPath(sim, *Up(&nacl, 2));
    out->clear();
    int sid = 0;
    for (const Session &s : sim.sessions()) {
        if (s.tpg != path || s.initiator != nacl.name) continue;
        *out += "InitiatorName: " + s.initiator + "\nInitiatorAlias: \nLIO Session ID: " + std::to_string(++sid) +
                "   SessionType: Normal\nSession State: TARG_SESS_STATE_LOGGED_IN\nCID: " + std::to_string(s.cid) +
                "   Connection State: TARG_CONN_STATE_LOGGED_IN\n   Address " + s.ip + " TCP\n";
    }
    if (out->empty()) *out = "No active iSCSI Session for Initiator Endpoint: " + nacl.name + "\n";
    return 0;
}

// Portal names: "ADDR:PORT" or "[ADDR6]:PORT" (anything between "]" and ":" ignored).
int MakePortal(Sim &, Node &, const std::string &name, const Kind **k) {
    if (name.size() > 256) return EOVERFLOW;
    std::string ip, port;
    size_t lb = name.find('[');
    if (lb != std::string::npos) {
        size_t rb = name.find(']', lb);
        if (rb == std::string::npos) return EINVAL;
        size_t colon = name.find(':', rb);
        if (colon == std::string::npos) return EINVAL;
        ip = name.substr(lb + 1, rb - lb - 1);
        port = name.substr(colon + 1);
    } else {
        size_t colon = name.rfind(':');
        if (colon == std::string::npos) return EINVAL;
        ip = name.substr(0, colon);
        port = name.substr(colon + 1);
    }
    unsigned long long p = 0;
    if (KStrToULL(port, &p) != 0 || p > 65535) return EINVAL;
    std::string bare = ip.substr(0, ip.find('%'));  // an IPv6 scope may follow
    unsigned char buf[16];
    bool v4 = inet_pton(AF_INET, ip.c_str(), buf) == 1;
    bool v6 = inet_pton(AF_INET6, bare.c_str(), buf) == 1;
    if (!v4 && !v6) return EINVAL;
    *k = KindByName("iscsi_np");
    return 0;
}

int NpTransportStore(Sim &sim, Node &np, int attr, const std::string &in, const char *module) {
    uint32_t v = 0;
    int rc = KStrToU32(in, &v);
    if (rc != 0) return rc;
    if (v > 1) return EINVAL;
    if (v == 1 && (module == nullptr || !sim.ModuleInserted(module))) return EINVAL;
    np.values[static_cast<size_t>(attr)] = std::to_string(v);
    return 0;
}

// Portal-group LUN attributes need the backstore the entry links to.
StoreFn LunAttrStore(CheckFn check) {
    return [check](Sim &, Node &lun, int attr, const std::string &in) {
        if (LinkOf(lun) == nullptr) return ENODEV;
        std::string v;
        int rc = check(in, &v);
        if (rc != 0) return rc;
        lun.values[static_cast<size_t>(attr)] = v;
        return 0;
    };
}

ShowFn LunAttrShow() {
    return [](Sim &, Node &lun, int attr, std::string *out) {
        if (LinkOf(lun) == nullptr) return ENODEV;
        *out = lun.values[static_cast<size_t>(attr)] + "\n";
        return 0;
    };
}

int TgPtGpStore(Sim &, Node &lun, int attr, const std::string &in) {
    Node *dev = LinkOf(lun);
    if (dev == nullptr) return ENODEV;
    std::string v = StripRight(in);
    Node *alua = dev->Child("alua");
    if (v != "NULL" && (alua == nullptr || alua->Child(v) == nullptr)) return EINVAL;
    lun.values[static_cast<size_t>(attr)] = v;
    return 0;
}

int TgPtGpShow(Sim &, Node &lun, int attr, std::string *out) {
    if (LinkOf(lun) == nullptr) return ENODEV;
    *out = "TG Port Alias: " + lun.values[static_cast<size_t>(attr)] +
           "\nTG Port Group ID: 0\nTG Port Primary Access State: Active/Optimized\n"
           "TG Port Primary Access Status: None\nTG Port Secondary Access State: Online\n"
           "TG Port Secondary Access Status: None\nTG Port Preferred: 0\n";
    return 0;
}

// A portal-group LUN entry takes one link, to a configured backstore.
int TpgLunLink(Sim &, Node &lun, Node &target) {
    if (!IsBackstore(target)) return EINVAL;
    if (!target.enabled) return ENODEV;
    if (LinkOf(lun) != nullptr) return EEXIST;
    ++target.exports;
    return 0;
}

void TpgLunUnlink(Sim &, Node &, Node &target) { --target.exports; }

// An initiator's LUN entry links to a LUN entry of its own portal group that has a device.
int MappedLunLink(Sim &, Node &mlun, Node &target) {
    if (target.kind == nullptr || target.kind->name != "tpg_lun") return EINVAL;
    if (Up(&mlun, 3) != Up(&target, 2)) return EINVAL;
    if (LinkOf(target) == nullptr) return EINVAL;
    if (LinkOf(mlun) != nullptr) return EEXIST;
    return 0;
}

StoreFn TpgAuthStore() {
    return [](Sim &, Node &n, int attr, const std::string &in) {
        if (in.size() >= 256) return EINVAL;
        n.values[static_cast<size_t>(attr)] = Chomp(in);
        return 0;
    };
}

std::vector<AttrDef> AuthAttrs() {
    return {
        Custom("userid", 0644, "", TpgAuthStore()),
        Custom("password", 0644, "", TpgAuthStore()),
        Custom("userid_mutual", 0644, "", TpgAuthStore()),
        Custom("password_mutual", 0644, "", TpgAuthStore()),
        ROShow("authenticate_target",
               [](Sim &, Node &n, int, std::string *out) {
                   *out = !n.Value("userid_mutual").empty() && !n.Value("password_mutual").empty() ? "1\n" : "0\n";
                   return 0;
               }),
    };
}

Kind TpgParam() {
    Kind k;
    k.name = "tpg_param";
    CheckFn seg = ParamNumber(512, 16777215);
    k.attrs = {
        RW("AuthMethod", "CHAP,None", ParamList({"KRB5", "SPKM1", "SPKM2", "SRP", "CHAP", "None"})),
        RW("HeaderDigest", "CRC32C,None", ParamList({"CRC32C", "None"})),
        RW("DataDigest", "CRC32C,None", ParamList({"CRC32C", "None"})),
        RW("MaxConnections", "1", ParamNumber(1, 65535)),
        RW("TargetAlias", "LIO Target", ParamText(255)),
        RW("InitialR2T", "Yes", ParamYesNo()),
        RW("ImmediateData", "Yes", ParamYesNo()),
        RW("MaxRecvDataSegmentLength", "8192", seg),
        RW("MaxXmitDataSegmentLength", "262144", seg),
        RW("MaxBurstLength", "262144", seg),
        RW("FirstBurstLength", "65536", seg),
        RW("DefaultTime2Wait", "2", ParamNumber(0, 3600)),
        RW("DefaultTime2Retain", "20", ParamNumber(0, 3600)),
        RW("MaxOutstandingR2T", "1", ParamNumber(1, 65535)),
        RW("DataPDUInOrder", "Yes", ParamYesNo()),
        RW("DataSequenceInOrder", "Yes", ParamYesNo()),
        RW("ErrorRecoveryLevel", "0", ParamNumber(0, 2)),
        RW("IFMarker", "No", ParamYesNo()),
        RW("OFMarker", "No", ParamYesNo()),
        RW("IFMarkInt", "2048~65535", ParamText(255)),
        RW("OFMarkInt", "2048~65535", ParamText(255)),
    };
    return k;
}

Kind TpgAttrib() {
    Kind k;
    k.name = "tpg_attrib";
    k.attrs = {
        RW("authentication", "1", Bool01()),
        RW("login_timeout", "15", U32Range(5, 30)),
        RW("netif_timeout", "2", U32Range(2, 15)),
        RW("generate_node_acls", "0", Bool01()),
        RW("default_cmdsn_depth", "64", U32Range(1, 512)),
        RW("cache_dynamic_acls", "0", Bool01()),
        RW("demo_mode_write_protect", "1", Bool01()),
        RW("prod_mode_write_protect", "0", Bool01()),
        RW("demo_mode_discovery", "1", Bool01()),
        RW("default_erl", "0", U32Range(0, 2)),
        RW("t10_pi", "0", Bool01()),
        RW("fabric_prot_type", "0", U32Set({0, 1, 3})),
        RW("tpg_enabled_sendtargets", "1", Bool01()),
        RW("login_keys_workaround", "1", Bool01()),
    };
    return k;
}

Kind NaclAttrib() {
    Kind k;
    k.name = "nacl_attrib";
    k.attrs = {
        RW("dataout_timeout", "3", U32Range(2, 60)),
        RW("dataout_timeout_retries", "5", U32Range(1, 15)),
        RW("default_erl", "0", U32Range(0, 2)),
        RW("nopin_timeout", "15",
           [](const std::string &in, std::string *out) {
               uint32_t v = 0;
               int rc = KStrToU32(in, &v);
               if (rc != 0) return rc;
               if (v > 60 || (v != 0 && v < 3)) return EINVAL;
               *out = std::to_string(v);
               return 0;
           }),
        RW("nopin_response_timeout", "30", U32Range(3, 60)),
        RW("random_datain_pdu_offsets", "0", Bool01()),
        RW("random_datain_seq_offsets", "0", Bool01()),
        RW("random_r2t_offsets", "0", Bool01()),
    };
    return k;
}

Kind NaclParam() {
    return Stats("nacl_param", {{"MaxConnections", "1"},
                                {"InitialR2T", "Yes"},
                                {"ImmediateData", "Yes"},
                                {"MaxBurstLength", "262144"},
                                {"FirstBurstLength", "65536"},
                                {"DefaultTime2Wait", "2"},
                                {"DefaultTime2Retain", "20"},
                                {"MaxOutstandingR2T", "1"},
                                {"DataPDUInOrder", "Yes"},
                                {"DataSequenceInOrder", "Yes"},
                                {"ErrorRecoveryLevel", "0"}});
}

// ---- Extent pool ------------------------------------------------------------------

// rod_enable / unmap_enable need their path set and openable.
StoreFn PoolSwitch(const char *pathAttr) {
    return [pathAttr](Sim &sim, Node &pool, int attr, const std::string &in) {
        uint32_t v = 0;
        int rc = KStrToU32(in, &v);
        if (rc != 0) return rc;
        if (v > 1) return EINVAL;
        if (v == 1) {
            const std::string &path = pool.Value(pathAttr);
            if (path.empty()) return EINVAL;
            rc = OpenLikeKernel(sim, path, false);
            if (rc != 0) return rc;
        }
        pool.values[static_cast<size_t>(attr)] = std::to_string(v);
        return 0;
    };
}

StoreFn PoolPath(const char *switchAttr) {
    return [switchAttr](Sim &, Node &pool, int attr, const std::string &in) {
        std::string v = Chomp(in);
        if (v.empty() || v[0] != '/' || v.size() >= 4096) return EINVAL;
        if (pool.Value(switchAttr) == "1") return EBUSY;  // switch it off first
        pool.values[static_cast<size_t>(attr)] = v;
        return 0;
    };
}

Kind EpPool() {
    Kind k;
    k.name = "ep_pool";
    k.attrs = {
        Custom("rod_enable", 0644, "0", PoolSwitch("rod_path")),
        Custom("rod_path", 0644, "", PoolPath("rod_enable"), OptionalShow),
        Custom("unmap_enable", 0644, "0", PoolSwitch("unmap_path")),
        Custom("unmap_path", 0644, "", PoolPath("unmap_enable"), OptionalShow),
    };
    return k;
}

// ---- The table --------------------------------------------------------------------

std::vector<Kind> BuildTable() {
    std::vector<Kind> t;
    auto add = [&t](Kind k) { t.push_back(std::move(k)); };

    Kind root;
    root.name = "root";
    add(root);

    Kind target;
    target.name = "target";
    target.attrs = {
        RO("version", "Target Engine Core ConfigFS Infrastructure v5.0 on Linux/x86_64 on 6.1"),
        Custom("dbroot", 0644, "/var/target",
               [](Sim &sim, Node &n, int attr, const std::string &in) {
                   std::string v = Chomp(in);
                   struct stat st;
                   if (v.empty() || v.size() >= 4096 || ::stat(sim.HostPath(v).c_str(), &st) != 0 ||
                       !S_ISDIR(st.st_mode))
                       return EINVAL;
                   n.values[static_cast<size_t>(attr)] = v;
                   return 0;
               }),
    };
    target.makeChild = MakeFabric;
    add(target);

    Kind core;
    core.name = "core";
    core.makeChild = MakeHost;
    add(core);

    add(Host("host_iblock", "dev_iblock"));
    add(Host("host_fileio", "dev_fileio"));
    add(Host("host_epio", "dev_epio"));
    add(Backstore("dev_iblock"));
    add(Backstore("dev_fileio"));
    add(Backstore("dev_epio"));
    add(DevAttrib());
    add(DevPr());
    add(DevWwn());
    add(DevAlua());
    add(TgPtGp());
    Kind devStats;
    devStats.name = "dev_stats";
    devStats.groups = {{"scsi_dev", "stat_scsi_dev"}, {"scsi_tgt_dev", "stat_scsi_tgt_dev"}, {"scsi_lu", "stat_scsi_lu"}};
    add(devStats);
    add(Stats("stat_scsi_dev", {{"inst", "0"}, {"indx", "0"}, {"role", "Target"}, {"ports", "0"}}));
    add(Stats("stat_scsi_tgt_dev",
              {{"inst", "0"}, {"indx", "0"}, {"num_LUs", "1"}, {"status", "activated"}, {"non_access_lus", "0"},
               {"resets", "0"}, {"aborts_complete", "0"}, {"aborts_no_task", "0"}}));
    add(Stats("stat_scsi_lu", {{"inst", "0"}, {"dev", "0"}, {"indx", "0"}, {"lun", "0"}, {"vend", "LIO-ORG"},
                               {"rev", "4.0"}, {"dev_type", "0"}, {"status", "available"}, {"state_bit", "exposed"},
                               {"num_cmds", "0"}, {"read_mbytes", "0"}, {"write_mbytes", "0"}, {"resets", "0"},
                               {"full_stat", "0"}, {"hs_num_cmds", "0"}, {"creation_time", "0"}}));
    Kind epInfo;
    epInfo.name = "ep_info";
    epInfo.attrs = {ROShow("device", EpDeviceShow)};
    epInfo.groups = {{"extent", "ep_extent"}};
    add(epInfo);
    Kind epExtent;
    epExtent.name = "ep_extent";
    epExtent.attrs = {ROShow("child", EpChildShow)};
    add(epExtent);

    Kind fabric;
    fabric.name = "fabric_iscsi";
    fabric.makeChild = IqnName("iscsi_node");
    add(fabric);
    // The vhost and loopback fabrics: nodes ("naa." names) with portal groups that carry
    // an I_T nexus and LUN entries linked to backstores, like the iSCSI fabric's.
    Kind other;
    other.name = "fabric_other";
    other.makeChild = AnyName("other_node");
    add(other);
    Kind otherNode;
    otherNode.name = "other_node";
    otherNode.makeChild = Numbered("tpgt_", 0xFFFF, "other_tpg");
    add(otherNode);
    Kind otherTpg;
    otherTpg.name = "other_tpg";
    // "NULL" drops the nexus (ENODEV when there is none); a name makes one (EEXIST when
    // there is one already).
    otherTpg.attrs = {Custom("nexus", 0644, "", [](Sim &, Node &n, int attr, const std::string &in) {
        std::string &v = n.values[static_cast<size_t>(attr)];
        std::string want = Chomp(in);
        if (want == "NULL") {
            if (v.empty()) return ENODEV;
            v.clear();
            return 0;
        }
        if (want.compare(0, 4, "naa.") != 0) return EINVAL;
        if (!v.empty()) return EEXIST;
        v = want;
        return 0;
    })};
    otherTpg.groups = {{"lun", "tpg_lun_dir"}};
    add(otherTpg);

    Kind node;
    node.name = "iscsi_node";
    node.groups = {{"fabric_statistics", "iscsi_wwn_stats"}};
    node.makeChild = Numbered("tpgt_", 0xFFFF, "iscsi_tpg");
    add(node);
    Kind wwnStats;
    wwnStats.name = "iscsi_wwn_stats";
    wwnStats.groups = {{"iscsi_instance", "stat_iscsi_instance"}, {"iscsi_sess_err", "stat_iscsi_sess_err"},
                       {"iscsi_tgt_attr", "stat_iscsi_tgt_attr"}, {"iscsi_login_stats", "stat_iscsi_login"},
                       {"iscsi_logout_stats", "stat_iscsi_logout"}};
    add(wwnStats);
    add(Stats("stat_iscsi_instance", {{"inst", "0"}, {"min_ver", "0"}, {"max_ver", "0"}, {"portals", "0"},
                                      {"nodes", "1"}, {"sessions", "0"}, {"fail_sess", "0"}, {"version", "v4.1.0"}}));
    add(Stats("stat_iscsi_sess_err", {{"inst", "0"}, {"digest_errors", "0"}, {"cxn_errors", "0"},
                                      {"format_errors", "0"}}));
    add(Stats("stat_iscsi_tgt_attr", {{"inst", "0"}, {"indx", "1"}, {"login_fails", "0"}, {"last_fail_time", "0"},
                                      {"last_fail_type", "0"}, {"fail_intr_name", "None"}}));
    add(Stats("stat_iscsi_login", {{"inst", "0"}, {"indx", "1"}, {"accepts", "0"}, {"other_fails", "0"},
                                   {"redirects", "0"}, {"authorize_fails", "0"}, {"authenticate_fails", "0"},
                                   {"negotiate_fails", "0"}}));
    add(Stats("stat_iscsi_logout", {{"inst", "0"}, {"indx", "1"}, {"normal_logouts", "0"},
                                    {"abnormal_logouts", "0"}}));

    Kind tpg;
    tpg.name = "iscsi_tpg";
    tpg.attrs = {
        Custom("enable", 0644, "0", TpgEnableStore),
        ROShow("dynamic_sessions", DynamicSessionsShow),
        RW("max_session", "65535", U32Range(1, 65535)),
    };
    tpg.groups = {{"np", "tpg_np"},     {"lun", "tpg_lun_dir"}, {"acls", "tpg_acls"},
                  {"attrib", "tpg_attrib"}, {"auth", "tpg_auth"}, {"param", "tpg_param"}};
    tpg.onRemove = [](Sim &sim, Node &n) {
        std::string path = sim.TreePath(&n);
        auto &s = sim.sessions();
        for (size_t i = s.size(); i-- > 0;)
            if (s[i].tpg == path) s.erase(s.begin() + static_cast<long>(i));
    };
    add(tpg);

    Kind npDir;
    npDir.name = "tpg_np";
    npDir.makeChild = MakePortal;
    add(npDir);
    Kind np;
    np.name = "iscsi_np";
    np.attrs = {
        Custom("iser", 0644, "0",
               [](Sim &s, Node &n, int a, const std::string &in) { return NpTransportStore(s, n, a, in, "ib_isert"); }),
        Custom("cxgbit", 0644, "0",
               [](Sim &s, Node &n, int a, const std::string &in) { return NpTransportStore(s, n, a, in, nullptr); }),
    };
    add(np);

    Kind lunDir;
    lunDir.name = "tpg_lun_dir";
    lunDir.makeChild = Numbered("lun_", 0xFFFFFFFFULL, "tpg_lun");
    add(lunDir);
    Kind lun;
    lun.name = "tpg_lun";
    lun.attrs = {
        Custom("alua_tg_pt_gp", 0644, "default_tg_pt_gp", TgPtGpStore, TgPtGpShow),
        Custom("alua_tg_pt_offline", 0644, "0", LunAttrStore(U32Range(0, 1)), LunAttrShow()),
        Custom("alua_tg_pt_status", 0644, "0", LunAttrStore(U32Range(0, 2)), LunAttrShow()),
        Custom("alua_tg_pt_write_md", 0644, "0", LunAttrStore(U32Range(0, 1)), LunAttrShow()),
    };
    lun.groups = {{"statistics", "tpg_lun_stats"}};
    lun.allowLink = TpgLunLink;
    lun.dropLink = TpgLunUnlink;
    add(lun);
    Kind lunStats;
    lunStats.name = "tpg_lun_stats";
    lunStats.groups = {{"scsi_port", "stat_scsi_port"}, {"scsi_tgt_port", "stat_scsi_tgt_port"},
                       {"scsi_transport", "stat_scsi_transport"}};
    add(lunStats);
    add(Stats("stat_scsi_port", {{"inst", "0"}, {"dev", "0"}, {"indx", "0"}, {"role", "Device"}, {"busy_count", "0"}}));
    add(Stats("stat_scsi_tgt_port", {{"inst", "0"}, {"dev", "0"}, {"indx", "0"}, {"name", ""}, {"port_index", "0"},
                                     {"in_cmds", "0"}, {"write_mbytes", "0"}, {"read_mbytes", "0"},
                                     {"hs_in_cmds", "0"}}));
    add(Stats("stat_scsi_transport", {{"inst", "0"}, {"device", "0"}, {"indx", "0"}, {"dev_name", ""},
                                      {"proto_id", "5"}}));

    Kind acls;
    acls.name = "tpg_acls";
    acls.makeChild = IqnName("iscsi_nacl");
    add(acls);
    Kind nacl;
    nacl.name = "iscsi_nacl";
    nacl.attrs = {
        ROShow("info", NaclInfoShow),
        RW("cmdsn_depth", "64", U32Range(1, 512)),
    };
    nacl.groups = {{"attrib", "nacl_attrib"}, {"auth", "nacl_auth"}, {"param", "nacl_param"},
                   {"fabric_statistics", "nacl_stats"}};
    nacl.makeChild = Numbered("lun_", 0xFFFFFFFFULL, "mapped_lun");
    nacl.onCreate = [](Sim &, Node &n) {
        // The session window starts at the portal group's default depth.
        Node *tpgAttrib = Up(&n, 2)->Child("attrib");
        if (tpgAttrib != nullptr) n.Value("cmdsn_depth") = tpgAttrib->Value("default_cmdsn_depth");
    };
    add(nacl);
    Kind mlun;
    mlun.name = "mapped_lun";
    mlun.attrs = {RW("write_protect", "0", Bool01())};
    mlun.groups = {{"statistics", "mapped_lun_stats"}};
    mlun.allowLink = MappedLunLink;
    add(mlun);
    Kind mlunStats;
    mlunStats.name = "mapped_lun_stats";
    mlunStats.groups = {{"scsi_auth_intr", "stat_scsi_auth_intr"}, {"scsi_att_intr_port", "stat_scsi_att_intr_port"}};
    add(mlunStats);
    add(Stats("stat_scsi_auth_intr", {{"inst", "0"}, {"dev", "0"}, {"port", "0"}, {"indx", "0"}, {"dev_or_port", "1"},
                                      {"intr_name", ""}, {"att_count", "0"}, {"num_cmds", "0"},
                                      {"read_mbytes", "0"}, {"write_mbytes", "0"}, {"creation_time", "0"}}));
    add(Stats("stat_scsi_att_intr_port", {{"inst", "0"}, {"dev", "0"}, {"port", "0"}, {"indx", "0"},
                                          {"port_auth_indx", "0"}, {"port_ident", ""}}));
    add(TpgAttrib());
    Kind tpgAuth;
    tpgAuth.name = "tpg_auth";
    tpgAuth.attrs = AuthAttrs();
    add(tpgAuth);
    add(TpgParam());
    add(NaclAttrib());
    Kind naclAuth;
    naclAuth.name = "nacl_auth";
    naclAuth.attrs = AuthAttrs();
    add(naclAuth);
    add(NaclParam());
    Kind naclStats;
    naclStats.name = "nacl_stats";
    naclStats.groups = {{"iscsi_sess_stats", "stat_iscsi_sess"}};
    add(naclStats);
    add(Stats("stat_iscsi_sess", {{"inst", "0"}, {"node", "0"}, {"indx", "0"}, {"cmd_pdus", "0"},
                                  {"rsp_pdus", "0"}, {"txdata_octs", "0"}, {"rxdata_octs", "0"},
                                  {"conn_digest_errors", "0"}, {"conn_timeout_errors", "0"}}));

    Kind pool;
    pool.name = "pool";
    pool.attrs = {RW("ext_jnl_enable", "0", Bool01())};
    pool.makeChild = Numbered("EP_", 0x7FFFFFFF, "ep_pool");
    add(pool);
    add(EpPool());

    Kind vsys;
    vsys.name = "vsys";
    vsys.makeChild = AnyName("vsys_entry");
    add(vsys);
    Kind vsysEntry;
    vsysEntry.name = "vsys_entry";
    vsysEntry.makeChild = AnyName("vsys_entry");
    vsysEntry.allowLink = [](Sim &, Node &, Node &) { return 0; };
    add(vsysEntry);
    return t;
}

}  // namespace

const Kind *KindByName(const std::string &name) {
    static const std::map<std::string, Kind> table = [] {
        std::map<std::string, Kind> m;
        for (Kind &k : BuildTable()) {
            // Attribute files are numbered in the 255 inode numbers after their
            // directory's; the root's would take the control directory's numbers.
            if (k.attrs.size() > 255 || (k.name == "root" && !k.attrs.empty())) {
                fprintf(stderr, "orlo-configfs-sim: node kind '%s' has too many attribute files\n", k.name.c_str());
                abort();
            }
            for (size_t i = 0; i < k.attrs.size(); ++i) k.attrIndex[k.attrs[i].name] = static_cast<int>(i);
            std::string n = k.name;
            m.emplace(n, std::move(k));
        }
        return m;
    }();
    auto it = table.find(name);
    if (it == table.end()) {
        fprintf(stderr, "orlo-configfs-sim: no node kind '%s'\n", name.c_str());
        abort();
    }
    return &it->second;
}

}  // namespace orlosim
