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
 * Requests name files by inode number, which is also the FUSE node id: the root is 1,
 * the control directory .sim is 2 and its files 3 to 7; every other directory or link
 * gets the next multiple of 256 and its attribute files the numbers just after it, so
 * an inode number leads straight to its node without a walk.  Numbers are never used
 * twice, so a number the kernel still holds after its node went away only finds ENOENT.
 *
 * Every public call takes the simulator's one mutex, so the model may be driven from
 * any number of FUSE worker threads; results are 0 or a negative errno.  The simulator
 * owns every open handle: those the kernel never released (the mount went away while
 * files were open) are freed with it.
 */
#ifndef ORLO_SIM_CONFIGFS_SIM_H
#define ORLO_SIM_CONFIGFS_SIM_H

#include <sys/stat.h>

#include <cstdint>
#include <deque>
#include <functional>
#include <list>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>
#include <vector>
#include <thread>
#include <condition_variable>
#include <chrono>

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
    bool synced = false;  // the child's map file holds the parent's extents
    int progress = 0;     // percent
    std::chrono::steady_clock::time_point started;  // for --clone-rate
    int startProgress = 0;
};

struct Node {
    std::string name;
    std::string path;            // tree path, "/target/core/..." ("/" for the root)
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

// One name of a directory listing, with the inode number and file type it has.
struct DirEntry {
    std::string name;
    uint64_t ino = 0;
    mode_t type = 0;  // S_IFDIR, S_IFREG or S_IFLNK
};

// An open attribute file, control file or directory.
struct Handle {
    uint64_t ino = 0;
    int attr = -1;
    std::string control;  // name of the control file, or empty
    bool filled = false;
    std::string content;  // what show produced at the first read
    std::string path;
    std::vector<DirEntry> listing;  // directories: the names as of the first readdir
    std::list<Handle>::iterator self;
};

// A directory entry the kernel may hold that went away without a request of its own.
struct Invalidation {
    uint64_t parent = 0;
    std::string name;
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
        int cloneRate = 0;  // percent a second that clones and mirrors advance on their own
    };
    explicit Sim(const Options &o);
    ~Sim();

    static constexpr uint64_t kRootIno = 1;
    static constexpr uint64_t kControlIno = 2;

    // File-system operations on inode numbers; 0 or -errno.  Those that return an
    // entry fill st (st_ino is the entry's inode number).
    int Lookup(uint64_t parent, const std::string &name, struct stat *st);
    int GetAttr(uint64_t ino, struct stat *st);
    // Mode, owner and times are accepted and forgotten, as configfs keeps them only in
    // its inode; truncating an attribute does nothing, a directory is EISDIR.
    int SetAttr(uint64_t ino, bool truncate, struct stat *st);
    int Mkdir(uint64_t parent, const std::string &name, struct stat *st);
    int Rmdir(uint64_t parent, const std::string &name);
    int Symlink(const std::string &target, uint64_t parent, const std::string &name, struct stat *st);
    int Unlink(uint64_t parent, const std::string &name);
    int Readlink(uint64_t ino, std::string *out);
    int Create(uint64_t parent, const std::string &name);
    int Rename();
    int Open(uint64_t ino, int flags, Handle **h);
    // Returns the byte count or -errno.
    int Read(Handle *h, char *buf, size_t size, off_t off);
    int Write(Handle *h, const char *data, size_t size);
    int OpenDir(uint64_t ino, Handle **h);
    // The listing of an open directory, taken anew when rewind is set (a read from
    // offset 0) and kept for the later reads of the same open.
    int ReadDir(Handle *h, bool rewind, const std::vector<DirEntry> **listing);
    void Release(Handle *h);

    // Clones and mirrors advance on their own (--clone-rate): a thread looks at them ten
    // times a second until the simulator is destroyed.
    void StartRelationTicker();
    // Advances every running relation by the clone rate and ends those that reach 100.
    void Tick();

    // Entries the kernel must drop (trees taken away by a module removal); the FUSE
    // glue calls this after each control write.
    std::vector<Invalidation> TakeInvalidations();

    // The control commands (also reachable through MOUNTPOINT/.sim/).  0 or -errno.
    int InsertModule(const std::string &name);
    int RemoveModule(const std::string &name);
    std::vector<std::string> Modules();

    // Helpers for kinds (called with the mutex held).
    const Options &options() const { return opts_; }
    bool ModuleInserted(const std::string &name) const;
    std::string HostPath(const std::string &appliancePath) const;  // maps under root
    const std::string &TreePath(const Node *n) const { return n->path; }
    std::vector<Session> &sessions() { return sessions_; }
    Node *root() { return root_.get(); }
    Node *Find(const std::string &path);
    // Records that the kernel must drop its entry for n (called before n is destroyed).
    void Invalidate(const Node *n) { invalidations_.push_back(Invalidation{n->parent->ino, n->name}); }

  private:
    friend class Control;
    struct Resolved {
        Node *node = nullptr;
        int attr = -1;
    };
    int Resolve(const std::string &path, Resolved *r);
    // The node (and attribute, or -1) an inode number names; false when it is gone or
    // names a control file.
    bool ByIno(uint64_t ino, Resolved *r) const;
    // The directory an inode number names (ENOENT gone, ENOTDIR an attribute or link).
    int DirByIno(uint64_t ino, Node **dir) const;
    std::string ChildPath(uint64_t parent, const std::string &name) const;
    int ControlStat(uint64_t ino, struct stat *st) const;
    Handle *NewHandle();
    Node *MakeNode(Node *parent, const std::string &name, const Kind *kind, bool user);
    void DestroyNode(Node *n);
    int CheckRemovable(Node *n);
    bool HoldsUserContent(const Node *n) const;
    void Trace(const std::string &op, const std::string &path, const std::string &value, int err);
    int Faulted(const std::string &op, const std::string &path);
    void FillStat(const Node *n, int attr, struct stat *st) const;
    std::string LinkText(const Node *link) const;
    int ControlOpen(uint64_t ino, Handle **h);
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
    std::vector<Invalidation> invalidations_;
    std::list<Handle> handles_;  // every open file and directory
    time_t started_;
    std::thread ticker_;
    std::condition_variable tickerWake_;
    bool tickerStop_ = false;
};

// What the extent-pool module writes into a child's map file (configfs_ep_relation.cpp):
// a mirror child is marked so at its start; when a clone or mirror reaches its end the
// child gets the parent's extents and counts, synced in full; a promoted mirror child is
// marked stable.  Called with the model's mutex held; a map file that cannot be read or
// written is left as it is (the library then sees the relation fail).
void EpRelationStarted(Sim &sim, Node &dev);
void EpRelationDone(Sim &sim, Node &dev);
void EpRelationPromoted(Sim &sim, Node &dev);

}  // namespace orlosim

#endif
