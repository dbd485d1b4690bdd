/*
 * The tree operations of the model: what mkdir, rmdir, symlink, unlink, open, read and
 * write do to it, with configfs's own rules (attribute files cannot be made or removed,
 * default groups cannot be removed, a directory holding anything a user made cannot be
 * removed, a directory that links lead to is busy).
 */
#include <fcntl.h>
#include <fnmatch.h>

#include <cerrno>
#include <cstring>
#include <ctime>

#include "configfs_sim.h"

namespace orlosim {

std::string &Node::Value(const std::string &attr) {
    int i = kind->Attr(attr);
    if (i < 0) {
        static std::string none;
        none.clear();
        return none;
    }
    return values[static_cast<size_t>(i)];
}

namespace {

struct ErrnoNameEntry {
    int err;
    const char *name;
};
const ErrnoNameEntry kErrnoNames[] = {
    {EPERM, "EPERM"},   {ENOENT, "ENOENT"},     {EIO, "EIO"},           {ENXIO, "ENXIO"},
    {E2BIG, "E2BIG"},   {ENOEXEC, "ENOEXEC"},   {EBADF, "EBADF"},       {EAGAIN, "EAGAIN"},
    {ENOMEM, "ENOMEM"}, {EACCES, "EACCES"},     {EFAULT, "EFAULT"},     {ENOTBLK, "ENOTBLK"},
    {EBUSY, "EBUSY"},   {EEXIST, "EEXIST"},     {ENODEV, "ENODEV"},     {ENOTDIR, "ENOTDIR"},
    {EISDIR, "EISDIR"}, {EINVAL, "EINVAL"},     {ENFILE, "ENFILE"},     {EMFILE, "EMFILE"},
    {ENOSPC, "ENOSPC"}, {EROFS, "EROFS"},       {ERANGE, "ERANGE"},     {ENAMETOOLONG, "ENAMETOOLONG"},
    {ENOSYS, "ENOSYS"}, {ENOTEMPTY, "ENOTEMPTY"}, {EOVERFLOW, "EOVERFLOW"}, {EOPNOTSUPP, "EOPNOTSUPP"},
    {ETIMEDOUT, "ETIMEDOUT"}, {EINTR, "EINTR"}, {ESRCH, "ESRCH"}, {EDQUOT, "EDQUOT"},
};

std::string Escape(const std::string &s) {
    std::string o;
    for (unsigned char c : s) {
        if (c == '\n') o += "\\n";
        else if (c == '\t') o += "\\t";
        else if (c == '\\') o += "\\\\";
        else if (c < 0x20 || c == 0x7f) {
            char b[8];
            snprintf(b, sizeof(b), "\\x%02x", c);
            o += b;
        } else {
            o += static_cast<char>(c);
        }
    }
    return o;
}

// Splits "/a/b" into {"a", "b"}.
std::vector<std::string> Components(const std::string &path) {
    std::vector<std::string> out;
    size_t i = 0;
    while (i < path.size()) {
        while (i < path.size() && path[i] == '/') ++i;
        size_t j = path.find('/', i);
        if (j == std::string::npos) j = path.size();
        if (j > i) out.push_back(path.substr(i, j - i));
        i = j;
    }
    return out;
}

bool IsControl(const std::string &path) { return path == "/.sim" || path.compare(0, 6, "/.sim/") == 0; }

const char *const kControlFiles[] = {"modules", "trace", "faults", "sessions", "clone"};

bool SubtreeLinked(const Node *n) {
    if (n->linkedBy > 0) return true;
    for (auto &c : n->children)
        if (!c.second->IsLink() && SubtreeLinked(c.second.get())) return true;
    return false;
}

}  // namespace

std::string ErrnoName(int err) {
    if (err == 0) return "0";
    for (const ErrnoNameEntry &e : kErrnoNames)
        if (e.err == err) return e.name;
    return std::to_string(err);
}

int ErrnoFromName(const std::string &name) {
    if (name == "EWOULDBLOCK") return EWOULDBLOCK;
    for (const ErrnoNameEntry &e : kErrnoNames)
        if (name == e.name) return e.err;
    char *end = nullptr;
    long v = strtol(name.c_str(), &end, 10);
    if (end != nullptr && *end == '\0' && v > 0 && v < 4096) return static_cast<int>(v);
    return 0;
}

Sim::Sim(const Options &o) : opts_(o), started_(time(nullptr)) {
    if (opts_.root.empty()) opts_.root = "/";
    root_.reset(new Node);
    root_->name = "";
    root_->path = "/";
    root_->kind = KindByName("root");
    root_->ino = kRootIno;
    root_->ctime = started_;
    byIno_[kRootIno] = root_.get();
    nextIno_ = 256;
}

Sim::~Sim() {
    {
        std::lock_guard<std::mutex> lock(mu_);
        tickerStop_ = true;
    }
    tickerWake_.notify_all();
    if (ticker_.joinable()) ticker_.join();
}

void Sim::StartRelationTicker() {
    if (opts_.cloneRate <= 0 || ticker_.joinable()) return;
    ticker_ = std::thread([this] {
        std::unique_lock<std::mutex> lock(mu_);
        while (!tickerStop_) {
            tickerWake_.wait_for(lock, std::chrono::milliseconds(100));
            if (tickerStop_) break;
            lock.unlock();
            Tick();
            lock.lock();
        }
    });
}

void Sim::Tick() {
    std::lock_guard<std::mutex> lock(mu_);
    if (opts_.cloneRate <= 0) return;
    const auto now = std::chrono::steady_clock::now();
    std::vector<Node *> stack{root_.get()};
    while (!stack.empty()) {
        Node *n = stack.back();
        stack.pop_back();
        for (auto &c : n->children)
            if (!c.second->IsLink()) stack.push_back(c.second.get());
        CloneState &c = n->clone;
        if (c.relation.empty() || !c.ongoing || c.synced) continue;
        const long ms = static_cast<long>(std::chrono::duration_cast<std::chrono::milliseconds>(now - c.started).count());
        const long pct = c.startProgress + ms * opts_.cloneRate / 1000;
        c.progress = pct >= 100 ? 100 : static_cast<int>(pct);
        if (c.progress < 100) continue;
        if (c.relation == "clone") c.ongoing = false;
        EpRelationDone(*this, *n);
    }
}

Node *Sim::MakeNode(Node *parent, const std::string &name, const Kind *kind, bool user) {
    std::unique_ptr<Node> n(new Node);
    n->name = name;
    n->path = (parent->parent == nullptr ? std::string() : parent->path) + "/" + name;
    n->kind = kind;
    n->parent = parent;
    n->user = user;
    n->ino = nextIno_;
    nextIno_ += 256;  // attribute files take the numbers in between
    n->ctime = time(nullptr);
    Node *raw = n.get();
    byIno_[raw->ino] = raw;
    parent->children[name] = std::move(n);
    if (kind != nullptr) {
        for (const AttrDef &a : kind->attrs) raw->values.push_back(a.initial);
        for (const GroupDef &g : kind->groups) MakeNode(raw, g.name, KindByName(g.kind), false);
        if (kind->onCreate) kind->onCreate(*this, *raw);
    }
    return raw;
}

void Sim::DestroyNode(Node *n) {
    // Children first, so links let go of their targets and hooks see a whole parent.
    while (!n->children.empty()) DestroyNode(n->children.begin()->second.get());
    if (n->IsLink()) {
        if (n->target != nullptr) {
            --n->target->linkedBy;
            if (n->parent->kind->dropLink) n->parent->kind->dropLink(*this, *n->parent, *n->target);
        }
    } else if (n->kind->onRemove) {
        n->kind->onRemove(*this, *n);
    }
    byIno_.erase(n->ino);
    Node *parent = n->parent;
    std::string name = n->name;
    parent->children.erase(name);  // frees n
}

bool Sim::HoldsUserContent(const Node *n) const {
    for (auto &c : n->children) {
        if (c.second->user) return true;
        if (!c.second->IsLink() && HoldsUserContent(c.second.get())) return true;
    }
    return false;
}

std::string Sim::HostPath(const std::string &path) const {
    if (path.empty() || path[0] != '/' || opts_.root == "/") return path;
    for (const char *keep : {"/dev", "/proc", "/sys"}) {
        size_t n = strlen(keep);
        if (path.compare(0, n, keep) == 0 && (path.size() == n || path[n] == '/')) return path;
    }
    return opts_.root + path;
}

Node *Sim::Find(const std::string &path) {
    Resolved r;
    if (Resolve(path, &r) != 0 || r.attr >= 0) return nullptr;
    return r.node;
}

// Walks the tree, following links met on the way; the last component is not followed.
// Used for the paths written into the control files and for link targets.
int Sim::Resolve(const std::string &path, Resolved *r) {
    Node *n = root_.get();
    std::vector<std::string> parts = Components(path);
    for (size_t i = 0; i < parts.size(); ++i) {
        if (n->IsLink()) n = n->target;
        if (n == nullptr) return -ENOENT;
        Node *c = n->Child(parts[i]);
        if (c != nullptr) {
            n = c;
            continue;
        }
        int a = n->kind->Attr(parts[i]);
        if (a < 0) return -ENOENT;
        if (i + 1 != parts.size()) return -ENOTDIR;
        r->node = n;
        r->attr = a;
        return 0;
    }
    r->node = n;
    r->attr = -1;
    return 0;
}

bool Sim::ByIno(uint64_t ino, Resolved *r) const {
    uint64_t base = ino == kRootIno ? kRootIno : ino & ~static_cast<uint64_t>(0xff);
    if (base == 0) return false;  // the control directory and its files
    auto it = byIno_.find(base);
    if (it == byIno_.end()) return false;
    int attr = static_cast<int>(ino - base) - 1;
    if (attr >= 0 && (it->second->IsLink() || static_cast<size_t>(attr) >= it->second->kind->attrs.size()))
        return false;
    r->node = it->second;
    r->attr = attr;
    return true;
}

int Sim::DirByIno(uint64_t ino, Node **dir) const {
    Resolved r;
    if (!ByIno(ino, &r)) return ENOENT;
    if (r.attr >= 0 || r.node->IsLink()) return ENOTDIR;
    *dir = r.node;
    return 0;
}

std::string Sim::ChildPath(uint64_t parent, const std::string &name) const {
    if (parent == kControlIno) return "/.sim/" + name;
    Resolved r;
    if (!ByIno(parent, &r) || r.node == root_.get()) return "/" + name;
    return r.node->path + "/" + name;
}

void Sim::Trace(const std::string &op, const std::string &path, const std::string &value, int err) {
    if (opts_.traceLimit == 0) return;
    while (trace_.size() >= opts_.traceLimit) trace_.pop_front();
    trace_.push_back(TraceEntry{op, path, value, err});
}

int Sim::Faulted(const std::string &op, const std::string &path) {
    for (auto it = faults_.begin(); it != faults_.end(); ++it) {
        if ((it->op == op || it->op == "*") && fnmatch(it->pattern.c_str(), path.c_str(), 0) == 0) {
            int err = it->err;
            if (it->once) faults_.erase(it);
            return err;
        }
    }
    return 0;
}

void Sim::FillStat(const Node *n, int attr, struct stat *st) const {
    memset(st, 0, sizeof(*st));
    st->st_uid = 0;
    st->st_gid = 0;
    st->st_atime = st->st_mtime = st->st_ctime = n->ctime;
    if (attr >= 0) {
        st->st_ino = n->ino + 1 + static_cast<uint64_t>(attr);
        st->st_mode = S_IFREG | static_cast<mode_t>(n->kind->attrs[static_cast<size_t>(attr)].mode);
        st->st_nlink = 1;
        st->st_size = 4096;
    } else if (n->IsLink()) {
        st->st_ino = n->ino;
        st->st_mode = S_IFLNK | 0777;
        st->st_nlink = 1;
        st->st_size = static_cast<off_t>(LinkText(n).size());
    } else {
        st->st_ino = n->ino;
        st->st_mode = S_IFDIR | 0755;
        nlink_t dirs = 2;
        for (auto &c : n->children)
            if (!c.second->IsLink()) ++dirs;
        st->st_nlink = dirs;
        st->st_size = 0;
    }
}

int Sim::ControlStat(uint64_t ino, struct stat *st) const {
    memset(st, 0, sizeof(*st));
    st->st_atime = st->st_mtime = st->st_ctime = started_;
    if (ino == kControlIno) {
        st->st_mode = S_IFDIR | 0755;
        st->st_nlink = 2;
        st->st_ino = kControlIno;
        return 0;
    }
    if (ino < kControlIno + 1 || ino >= kControlIno + 1 + sizeof(kControlFiles) / sizeof(kControlFiles[0]))
        return -ENOENT;
    st->st_mode = S_IFREG | 0644;
    st->st_nlink = 1;
    st->st_ino = ino;
    st->st_size = 4096;
    return 0;
}

int Sim::Lookup(uint64_t parent, const std::string &name, struct stat *st) {
    std::lock_guard<std::mutex> lock(mu_);
    if (parent == kRootIno && name == ".sim") return ControlStat(kControlIno, st);
    if (parent == kControlIno) {
        for (size_t i = 0; i < sizeof(kControlFiles) / sizeof(kControlFiles[0]); ++i)
            if (name == kControlFiles[i]) return ControlStat(kControlIno + 1 + i, st);
        return -ENOENT;
    }
    Node *dir = nullptr;
    int err = DirByIno(parent, &dir);
    if (err != 0) return -err;
    if (Node *c = dir->Child(name)) {
        FillStat(c, -1, st);
        return 0;
    }
    int a = dir->kind->Attr(name);
    if (a < 0) return -ENOENT;
    FillStat(dir, a, st);
    return 0;
}

int Sim::GetAttr(uint64_t ino, struct stat *st) {
    std::lock_guard<std::mutex> lock(mu_);
    Resolved r;
    if (!ByIno(ino, &r)) return ControlStat(ino, st);
    FillStat(r.node, r.attr, st);
    return 0;
}

int Sim::SetAttr(uint64_t ino, bool truncate, struct stat *st) {
    int rc = GetAttr(ino, st);
    if (rc == 0 && truncate && S_ISDIR(st->st_mode)) return -EISDIR;
    return rc;
}

int Sim::Mkdir(uint64_t parent, const std::string &name, struct stat *st) {
    std::lock_guard<std::mutex> lock(mu_);
    std::string path = ChildPath(parent, name);
    int err = Faulted("mkdir", path);
    if (err == 0 && IsControl(path)) err = EPERM;
    Node *dir = nullptr;
    if (err == 0) err = DirByIno(parent, &dir);
    if (err == 0) {
        const Kind *kind = nullptr;
        if (dir->Child(name) != nullptr || dir->kind->Attr(name) >= 0)
            err = EEXIST;
        else if (!dir->kind->makeChild)
            err = EPERM;
        else
            err = dir->kind->makeChild(*this, *dir, name, &kind);
        if (err == 0) FillStat(MakeNode(dir, name, kind, true), -1, st);
    }
    Trace("mkdir", path, "", err);
    return -err;
}

int Sim::CheckRemovable(Node *n) {
    if (n == root_.get() || !n->user) return EPERM;  // default groups and the kernel's own
    if (HoldsUserContent(n)) return ENOTEMPTY;
    if (SubtreeLinked(n)) return EBUSY;
    return 0;
}

int Sim::Rmdir(uint64_t parent, const std::string &name) {
    std::lock_guard<std::mutex> lock(mu_);
    std::string path = ChildPath(parent, name);
    int err = Faulted("rmdir", path);
    if (err == 0 && IsControl(path)) err = EPERM;
    Node *dir = nullptr;
    if (err == 0) err = DirByIno(parent, &dir);
    Node *n = nullptr;
    if (err == 0) {
        n = dir->Child(name);
        if (n == nullptr)
            err = dir->kind->Attr(name) >= 0 ? ENOTDIR : ENOENT;
        else if (n->IsLink())
            err = ENOTDIR;
        else
            err = CheckRemovable(n);
    }
    if (err == 0) DestroyNode(n);
    Trace("rmdir", path, "", err);
    return -err;
}

int Sim::Symlink(const std::string &target, uint64_t parent, const std::string &name, struct stat *st) {
    std::lock_guard<std::mutex> lock(mu_);
    std::string link = ChildPath(parent, name);
    std::string dirPath = link.substr(0, link.rfind('/'));
    // The link's target as a tree path: an absolute path must lie inside this mount
    // (configfs refuses links that leave it with EPERM); a relative one is taken from
    // the link's directory.
    std::string treeTarget;
    int err = Faulted("symlink", link);
    if (err == 0 && IsControl(link)) err = EPERM;
    if (err == 0) {
        std::vector<std::string> parts;
        if (!target.empty() && target[0] == '/') {
            auto inside = [&target](const std::string &mp) {
                return !mp.empty() && target.compare(0, mp.size(), mp) == 0 &&
                       (target.size() == mp.size() || target[mp.size()] == '/');
            };
            if (inside(opts_.mountpoint))
                parts = Components(target.substr(opts_.mountpoint.size()));
            else if (inside(opts_.mountAlias))
                parts = Components(target.substr(opts_.mountAlias.size()));
            else
                err = EPERM;
        } else {
            parts = Components(dirPath);
            for (const std::string &p : Components(target)) parts.push_back(p);
        }
        std::vector<std::string> norm;
        for (const std::string &p : parts) {
            if (p == ".") continue;
            if (p == "..") {
                if (norm.empty()) {
                    err = EPERM;
                    break;
                }
                norm.pop_back();
                continue;
            }
            norm.push_back(p);
        }
        for (const std::string &p : norm) treeTarget += "/" + p;
        if (treeTarget.empty()) treeTarget = "/";
    }
    Node *dir = nullptr;
    if (err == 0) err = DirByIno(parent, &dir);
    if (err == 0) {
        Resolved t;
        if (dir->Child(name) != nullptr || dir->kind->Attr(name) >= 0) {
            err = EEXIST;
        } else if (IsControl(treeTarget) || Resolve(treeTarget, &t) != 0 || t.attr >= 0 || t.node == root_.get()) {
            err = ENOENT;  // only directories of the tree can be linked to
        } else {
            Node *tn = t.node->IsLink() ? t.node->target : t.node;
            if (!dir->kind->allowLink)
                err = EPERM;
            else
                err = dir->kind->allowLink(*this, *dir, *tn);
            if (err == 0) {
                Node *l = MakeNode(dir, name, nullptr, true);
                l->target = tn;
                ++tn->linkedBy;
                treeTarget = TreePath(tn);
                FillStat(l, -1, st);
            }
        }
    }
    Trace("symlink", link, treeTarget, err);
    return -err;
}

int Sim::Unlink(uint64_t parent, const std::string &name) {
    std::lock_guard<std::mutex> lock(mu_);
    std::string path = ChildPath(parent, name);
    int err = Faulted("unlink", path);
    if (err == 0 && IsControl(path)) err = EPERM;
    Node *dir = nullptr;
    if (err == 0) err = DirByIno(parent, &dir);
    Node *n = nullptr;
    if (err == 0) {
        n = dir->Child(name);
        if (n == nullptr)
            err = dir->kind->Attr(name) >= 0 ? EPERM : ENOENT;  // attribute files belong to the kernel
        else if (!n->IsLink())
            err = EISDIR;
    }
    if (err == 0) DestroyNode(n);
    Trace("unlink", path, "", err);
    return -err;
}

// Links read back relative to the link's directory, "../" up to the mount root and
// then the target's path, as configfs writes them.
int Sim::Readlink(uint64_t ino, std::string *out) {
    std::lock_guard<std::mutex> lock(mu_);
    Resolved r;
    if (!ByIno(ino, &r)) return -ENOENT;
    if (r.attr >= 0 || !r.node->IsLink()) return -EINVAL;
    *out = LinkText(r.node);
    return 0;
}

std::string Sim::LinkText(const Node *link) const {
    std::string s;
    for (const Node *p = link->parent; p->parent != nullptr; p = p->parent) s += "../";
    return s + TreePath(link->target).substr(1);
}

int Sim::Create(uint64_t, const std::string &) {
    return -EACCES;  // users cannot make attribute files
}

int Sim::Rename() { return -EPERM; }

Handle *Sim::NewHandle() {
    handles_.emplace_back();
    Handle *h = &handles_.back();
    h->self = std::prev(handles_.end());
    return h;
}

void Sim::Release(Handle *h) {
    std::lock_guard<std::mutex> lock(mu_);
    handles_.erase(h->self);
}

int Sim::Open(uint64_t ino, int flags, Handle **h) {
    std::lock_guard<std::mutex> lock(mu_);
    Resolved r;
    if (!ByIno(ino, &r)) return ControlOpen(ino, h);
    std::string path = r.node->path;
    if (r.attr >= 0)
        path = (r.node == root_.get() ? std::string() : path) + "/" + r.node->kind->attrs[static_cast<size_t>(r.attr)].name;
    int err = Faulted("open", path);
    if (err != 0) return -err;
    if (r.attr < 0) return -EISDIR;
    int mode = r.node->kind->attrs[static_cast<size_t>(r.attr)].mode;
    int acc = flags & O_ACCMODE;
    if ((acc == O_WRONLY || acc == O_RDWR) && (mode & 0222) == 0) return -EACCES;
    if ((acc == O_RDONLY || acc == O_RDWR) && (mode & 0444) == 0) return -EACCES;
    *h = NewHandle();
    (*h)->ino = r.node->ino;
    (*h)->attr = r.attr;
    (*h)->path = std::move(path);
    return 0;
}

int Sim::Read(Handle *h, char *buf, size_t size, off_t off) {
    std::lock_guard<std::mutex> lock(mu_);
    if (!h->filled) {
        int err = 0;
        std::string content;
        if (!h->control.empty()) {
            err = ControlRead(h);
            if (err != 0) return -err;
            content = h->content;
        } else {
            err = Faulted("read", h->path);
            auto it = byIno_.find(h->ino);
            if (err == 0 && it == byIno_.end()) err = ENOENT;  // the directory went away
            if (err == 0) {
                Node *n = it->second;
                const AttrDef &a = n->kind->attrs[static_cast<size_t>(h->attr)];
                if (a.show)
                    err = a.show(*this, *n, h->attr, &content);
                else
                    content = n->values[static_cast<size_t>(h->attr)] + "\n";
            }
            if (content.size() > 4096) content.resize(4096);
            Trace("read", h->path, content, err);
            if (err != 0) return -err;
        }
        h->content = content;
        h->filled = true;
    }
    if (off < 0 || static_cast<size_t>(off) >= h->content.size()) return 0;
    size_t n = std::min(size, h->content.size() - static_cast<size_t>(off));
    memcpy(buf, h->content.data() + off, n);
    return static_cast<int>(n);
}

int Sim::Write(Handle *h, const char *data, size_t size) {
    std::lock_guard<std::mutex> lock(mu_);
    // Like configfs, one write(2) is one store, of at most a page less one byte.
    size_t count = size >= 4096 ? 4095 : size;
    std::string in(data, count);
    if (!h->control.empty()) {
        int err = ControlWrite(h, in);
        return err != 0 ? -err : static_cast<int>(size);
    }
    int err = Faulted("write", h->path);
    auto it = byIno_.find(h->ino);
    if (err == 0 && it == byIno_.end()) err = ENOENT;
    if (err == 0) {
        Node *n = it->second;
        const AttrDef &a = n->kind->attrs[static_cast<size_t>(h->attr)];
        if (a.store) {
            err = a.store(*this, *n, h->attr, in);
        } else if (a.check) {
            std::string v;
            err = a.check(in, &v);
            if (err == 0) n->values[static_cast<size_t>(h->attr)] = v;
        } else {
            err = EACCES;
        }
    }
    Trace("write", h->path, in, err);
    h->filled = false;  // the next read shows the new state
    return err != 0 ? -err : static_cast<int>(count);
}

int Sim::OpenDir(uint64_t ino, Handle **h) {
    std::lock_guard<std::mutex> lock(mu_);
    if (ino != kControlIno) {
        Node *dir = nullptr;
        int err = DirByIno(ino, &dir);
        if (err != 0) return -err;
    }
    *h = NewHandle();
    (*h)->ino = ino;
    return 0;
}

int Sim::ReadDir(Handle *h, bool rewind, const std::vector<DirEntry> **listing) {
    std::lock_guard<std::mutex> lock(mu_);
    *listing = &h->listing;
    if (h->filled && !rewind) return 0;
    std::vector<DirEntry> &l = h->listing;
    l.clear();
    if (h->ino == kControlIno) {
        l.push_back(DirEntry{".", kControlIno, S_IFDIR});
        l.push_back(DirEntry{"..", kRootIno, S_IFDIR});
        for (size_t i = 0; i < sizeof(kControlFiles) / sizeof(kControlFiles[0]); ++i)
            l.push_back(DirEntry{kControlFiles[i], kControlIno + 1 + i, S_IFREG});
    } else {
        Node *dir = nullptr;
        int err = DirByIno(h->ino, &dir);
        if (err != 0) return -err;
        l.push_back(DirEntry{".", dir->ino, S_IFDIR});
        l.push_back(DirEntry{"..", dir->parent != nullptr ? dir->parent->ino : kRootIno, S_IFDIR});
        for (size_t i = 0; i < dir->kind->attrs.size(); ++i)
            l.push_back(DirEntry{dir->kind->attrs[i].name, dir->ino + 1 + i, S_IFREG});
        for (auto &c : dir->children)
            l.push_back(DirEntry{c.first, c.second->ino, static_cast<mode_t>(c.second->IsLink() ? S_IFLNK : S_IFDIR)});
    }
    h->filled = true;
    return 0;
}

std::vector<Invalidation> Sim::TakeInvalidations() {
    std::lock_guard<std::mutex> lock(mu_);
    std::vector<Invalidation> v;
    v.swap(invalidations_);
    return v;
}

// ---- The control directory ----------------------------------------------------------

int Sim::ControlOpen(uint64_t ino, Handle **h) {
    if (ino == kControlIno) return -EISDIR;
    if (ino <= kControlIno || ino > kControlIno + sizeof(kControlFiles) / sizeof(kControlFiles[0])) return -ENOENT;
    *h = NewHandle();
    (*h)->control = kControlFiles[ino - kControlIno - 1];
    (*h)->path = "/.sim/" + (*h)->control;
    return 0;
}

int Sim::ControlRead(Handle *h) {
    std::string s;
    if (h->control == "modules") {
        for (const std::string &m : modules_) s += m + "\n";
    } else if (h->control == "trace") {
        for (const TraceEntry &e : trace_)
            s += e.op + "\t" + e.path + "\t" + Escape(e.value) + "\t" + ErrnoName(e.err) + "\n";
    } else if (h->control == "faults") {
        for (const Fault &f : faults_)
            s += f.op + " " + f.pattern + " " + ErrnoName(f.err) + (f.once ? " once\n" : " always\n");
    } else if (h->control == "sessions") {
        for (const Session &x : sessions_) {
            std::vector<std::string> p = Components(x.tpg);  // target iscsi IQN tpgt_N
            s += p[2] + " " + p[3].substr(5) + " " + x.initiator + " " + x.ip + " " + std::to_string(x.cid) + "\n";
        }
    } else if (h->control == "clone") {
        std::vector<Node *> stack{root_.get()};
        while (!stack.empty()) {
            Node *n = stack.back();
            stack.pop_back();
            if (!n->clone.relation.empty())
                s += TreePath(n) + " " + n->clone.relation + " " + (n->clone.ongoing ? "ongoing" : "stopped") + " " +
                     std::to_string(n->clone.progress) + "\n";
            for (auto &c : n->children)
                if (!c.second->IsLink()) stack.push_back(c.second.get());
        }
    }
    h->content = s;
    return 0;
}

int Sim::ControlWrite(Handle *h, const std::string &text) {
    size_t start = 0;
    while (start < text.size()) {
        size_t nl = text.find('\n', start);
        if (nl == std::string::npos) nl = text.size();
        std::string line = text.substr(start, nl - start);
        start = nl + 1;
        if (line.find_first_not_of(" \t\r") == std::string::npos) continue;
        int err = ControlCommand(h->control, line);
        if (err != 0) return err;
    }
    h->filled = false;
    return 0;
}

int Sim::ControlCommand(const std::string &file, const std::string &line) {
    std::vector<std::string> w;
    {
        size_t i = 0;
        while (i < line.size()) {
            while (i < line.size() && (line[i] == ' ' || line[i] == '\t' || line[i] == '\r')) ++i;
            size_t j = line.find_first_of(" \t\r", i);
            if (j == std::string::npos) j = line.size();
            if (j > i) w.push_back(line.substr(i, j - i));
            i = j;
        }
    }
    if (w.empty()) return 0;
    if (file == "modules") {
        if (w.size() != 2) return EINVAL;
        if (w[0] == "insert") return -InsertModuleLocked(w[1]);
        if (w[0] == "remove") return -RemoveModuleLocked(w[1]);
        return EINVAL;
    }
    if (file == "trace") {
        if (w[0] != "clear" || w.size() != 1) return EINVAL;
        trace_.clear();
        return 0;
    }
    if (file == "faults") {
        if (w[0] == "clear" && w.size() == 1) {
            faults_.clear();
            return 0;
        }
        // OP PATTERN ERRNO [once|always]
        if (w.size() < 3 || w.size() > 4) return EINVAL;
        static const char *ops[] = {"mkdir", "rmdir", "write", "read", "symlink", "unlink", "open", "*"};
        bool known = false;
        for (const char *o : ops) known = known || w[0] == o;
        int err = ErrnoFromName(w[2]);
        if (!known || err == 0) return EINVAL;
        if (w.size() == 4 && w[3] != "once" && w[3] != "always") return EINVAL;
        faults_.push_back(Fault{w[0], w[1], err, w.size() == 3 || w[3] == "once"});
        return 0;
    }
    if (file == "sessions") {
        if (w[0] == "clear" && w.size() == 1) {
            sessions_.clear();
            return 0;
        }
        if (w[0] == "add" && w.size() == 6) {
            std::string tpg = "/target/iscsi/" + w[1] + "/tpgt_" + w[2];
            Node *n = Find(tpg);
            if (n == nullptr || n->kind->name != "iscsi_tpg") return ENOENT;
            char *end = nullptr;
            long cid = strtol(w[5].c_str(), &end, 10);
            if (*end != '\0' || cid < 0) return EINVAL;
            sessions_.push_back(Session{tpg, w[3], w[4], static_cast<int>(cid)});
            return 0;
        }
        if (w[0] == "drop" && (w.size() == 4 || w.size() == 5)) {
            std::string tpg = "/target/iscsi/" + w[1] + "/tpgt_" + w[2];
            size_t before = sessions_.size();
            for (size_t i = sessions_.size(); i-- > 0;) {
                const Session &s = sessions_[i];
                if (s.tpg == tpg && s.initiator == w[3] && (w.size() == 4 || std::to_string(s.cid) == w[4]))
                    sessions_.erase(sessions_.begin() + static_cast<long>(i));
            }
            return sessions_.size() == before ? ENOENT : 0;
        }
        return EINVAL;
    }
    if (file == "clone") {
        // set PATH PERCENT | stop PATH
        if (w.size() < 2) return EINVAL;
        Node *n = Find(w[1]);
        if (n == nullptr) return ENOENT;
        if (n->kind == nullptr || n->kind->name.compare(0, 4, "dev_") != 0) return EINVAL;
        if (w[0] == "set" && w.size() == 3) {
            char *end = nullptr;
            long pct = strtol(w[2].c_str(), &end, 10);
            if (*end != '\0' || pct < 0 || pct > 100) return EINVAL;
            if (n->clone.relation.empty()) n->clone.relation = "clone";
            n->clone.progress = static_cast<int>(pct);
            n->clone.startProgress = n->clone.progress;
            n->clone.started = std::chrono::steady_clock::now();
            // A mirror stays in its relation when in step; a clone ends there.
            n->clone.ongoing = pct < 100 || (n->clone.relation == "mirror" && !n->clone.promoted);
            if (pct == 100 && !n->clone.synced) EpRelationDone(*this, *n);
            return 0;
        }
        if (w[0] == "stop" && w.size() == 2) {
            n->clone.ongoing = false;
            return 0;
        }
        return EINVAL;
    }
    return EINVAL;
}

}  // namespace orlosim
