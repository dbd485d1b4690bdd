/*
 * orlo-configfs-sim: an in-memory model of the kernel target's configfs tree.
 *
 * The tree is built from a table of node kinds (configfs_kinds.cpp).  A kind names the
 * attribute files a directory of that kind carries (each with its check, as the
 * kernel's store routine checks it, and its show routine), the default groups made with
 * it, which children a user may mkdir inside it and which symbolic links it accepts.
 * Which top-level trees exist is decided by the simulated kernel modules
 * (configfs_modules.cpp).  The FUSE glue (configfs_sim_main.cpp) only translates
 * requests into the calls below.
 *
 * Every public call takes the simulator's one mutex, so the model may be driven from
 * any number of FUSE worker threads; results are 0 or a negative errno.
 */
#ifndef ORLO_SIM_CONFIGFS_SIM_H
#define ORLO_SIM_CONFIGFS_SIM_H

#include <sys/stat.h>

#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>
#include <vector>

namespace orlosim {

class Sim;
struct Node;

// A show routine renders an attribute's text (0 or a positive errno).
using ShowFn = std::function<int(Sim &, Node &, int attr, std::string *out)>;
// A store routine takes the bytes of one write(2) (0 or a positive errno).
using StoreFn = std::function<int(Sim &, Node &, int attr, const std::string &in)>;
// A check turns written bytes into the stored value (0 or a positive errno).
using CheckFn = std::function<int(const std::string &in, std::string *stored)>;

struct AttrDef {
    std::string name;
    int mode = 0644;     // 0644 read-write, 0444 read-only, 0200 write-only
    std::string initial; // value of a freshly made directory
    CheckFn check;       // plain attributes: validate and store the value
    StoreFn store;       // attributes with side effects (enable, control, ...)
    ShowFn show;         // attributes whose text is computed
};

struct Kind;
struct GroupDef {
    std::string name;
    std::string kind;
};

// Decides whether a user may make the named child and of which kind (0 or errno).
using MakeChildFn = std::function<int(Sim &, Node &parent, const std::string &name, const Kind **kind)>;
// Accepts or refuses a link made in dir to target (0 or errno) and records it.
using LinkFn = std::function<int(Sim &, Node &dir, Node &target)>;
using UnlinkFn = std::function<void(Sim &, Node &dir, Node &target)>;

struct Kind {
    std::string name;
    std::vector<AttrDef> attrs;
    std::vector<GroupDef> groups;
    MakeChildFn makeChild;  // null: mkdir inside is refused with EPERM
    LinkFn allowLink;       // null: symlink inside is refused with EPERM
    UnlinkFn dropLink;
    std::function<void(Sim &, Node &)> onCreate;
    std::function<void(Sim &, Node &)> onRemove;
    std::unordered_map<std::string, int> attrIndex;  // filled when the table is built
    int Attr(const std::string &n) const {
        auto it = attrIndex.find(n);
        return it == attrIndex.end() ? -1 : it->second;
    }
};

// Looks a kind up in the table (aborts on a name the table lacks: a table bug).
const Kind *KindByName(const std::string &name);

// A clone or mirror relation the kernel runs for an extent-pool backstore.
struct CloneState {
    std::string relation;  // "", "clone" or "mirror"
    std::string parentName;
    std::string parentUuid;
    bool ongoing = false;
    bool promoted = false;
    int progress = 0;  // percent
};

struct Node {
    std::string name;
    const Kind *kind = nullptr;  // null for a symbolic link
    Node *parent = nullptr;
    bool user = false;  // made by a user (mkdir, symlink) rather than by the kernel
    uint64_t ino = 0;
    time_t ctime = 0;
    std::map<std::string, std::unique_ptr<Node>> children;  // directories and links
    std::vector<std::string> values;                        // one per attribute of the kind
    Node *target = nullptr;                                 // links: what they lead to
    int linkedBy = 0;                                       // links that lead here

    // Backstores: the parsed control string and whether the device is configured.
    std::map<std::string, std::string> params;
    bool enabled = false;
    int exports = 0;  // portal-group LUN entries linked to this backstore
    CloneState clone;

    bool IsLink() const { return kind == nullptr; }
    std::string &Value(const std::string &attr);
    Node *Child(const std::string &n) const {
        auto it = children.find(n);
        return it == children.end() ? nullptr : it->second.get();
    }
};

struct Session {
    std::string tpg;  // tree path of the portal group, "/target/iscsi/<iqn>/tpgt_<n>"
    std::string initiator;
    std::string ip;
    int cid = 0;
};

struct TraceEntry {
    std::string op, path, value;
    int err = 0;
};

struct Fault {
    std::string op;       // mkdir, rmdir, write, read, symlink, unlink, open or "*"
    std::string pattern;  // fnmatch pattern of the tree path
    int err = 0;
    bool once = true;
};

// An open attribute or control file.
struct Handle {
    uint64_t ino = 0;
    int attr = -1;
    std::string control;  // name of the control file, or empty
    bool filled = false;
    std::string content;  // what show produced at the first read
    std::string path;
};

// Errno names used in the trace and in the fault control file.
std::string ErrnoName(int err);
int ErrnoFromName(const std::string &name);  // 0 when unknown

class Sim {
  public:
    struct Options {
        std::string root = "/";  // appliance paths inside control strings resolve under it
        std::string mountpoint;  // absolute; absolute link targets are taken relative to it
        std::string mountAlias;  // the mount point as given, when it differs from its real path
        size_t traceLimit = 1000000;
    };
    explicit Sim(const Options &o);
    ~Sim();

    // File-system operations on tree paths ("/target/core/..."); 0 or -errno.
    int GetAttr(const std::string &path, struct stat *st);
    int ReadDir(const std::string &path, std::vector<std::string> *names);
    int Mkdir(const std::string &path);
    int Rmdir(const std::string &path);
    int Symlink(const std::string &target, const std::string &link);
    int Unlink(const std::string &path);
    int Readlink(const std::string &path, std::string *out);
    int Open(const std::string &path, int flags, std::unique_ptr<Handle> *h);
    // Returns the byte count or -errno.
    int Read(Handle *h, char *buf, size_t size, off_t off);
    int Write(Handle *h, const char *data, size_t size);
    int Rename();
    int Create(const std::string &path);

    // Paths whose cached entries the kernel must drop (trees taken away by a module
    // removal); the FUSE glue calls this after each control write.
    std::vector<std::string> TakeInvalidations();

    // The control commands (also reachable through MOUNTPOINT/.sim/).  0 or -errno.
    int InsertModule(const std::string &name);
    int RemoveModule(const std::string &name);
    std::vector<std::string> Modules();

    // Helpers for kinds (called with the mutex held).
    const Options &options() const { return opts_; }
    bool ModuleInserted(const std::string &name) const;
    std::string HostPath(const std::string &appliancePath) const;  // maps under root
    std::string TreePath(const Node *n) const;
    std::vector<Session> &sessions() { return sessions_; }
    Node *root() { return root_.get(); }
    Node *Find(const std::string &path);
    void Invalidate(const std::string &path) { invalidations_.push_back(path); }

  private:
    friend class Control;
    struct Resolved {
        Node *node = nullptr;
        int attr = -1;
    };
    int Resolve(const std::string &path, Resolved *r);
    Node *MakeNode(Node *parent, const std::string &name, const Kind *kind, bool user);
    void DestroyNode(Node *n);
    int CheckRemovable(Node *n);
    bool HoldsUserContent(const Node *n) const;
    void Trace(const std::string &op, const std::string &path, const std::string &value, int err);
    int Faulted(const std::string &op, const std::string &path);
    void FillStat(const Node *n, int attr, struct stat *st) const;
    std::string LinkText(const Node *link) const;
    int ControlOpen(const std::string &name, std::unique_ptr<Handle> *h);
    int ControlRead(Handle *h);
    int ControlWrite(Handle *h, const std::string &text);
    int ControlCommand(const std::string &file, const std::string &line);
    int RemoveModuleLocked(const std::string &name);
    int InsertModuleLocked(const std::string &name);

    Options opts_;
    std::mutex mu_;
    std::unique_ptr<Node> root_;
    std::unordered_map<uint64_t, Node *> byIno_;
    uint64_t nextIno_ = 1;
    std::vector<std::string> modules_;  // in insertion order
    std::vector<Session> sessions_;
    std::deque<TraceEntry> trace_;
    std::vector<Fault> faults_;
    std::vector<std::string> invalidations_;
    time_t started_;
};

}  // namespace orlosim

#endif
