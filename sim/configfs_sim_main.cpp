/*
 * orlo-configfs-sim: mounts the configfs model as a FUSE file system.
 *
 * It speaks FUSE's low-level protocol: requests name files by inode number and the
 * model maps each number straight to its node, so no path is built or walked to
 * answer them.  An attribute write from a shell or the library (open, write, close)
 * costs three requests, open, write and release; the release is asynchronous and flush
 * is never sent.  Open cannot be skipped: it is where configfs refuses a read-only file
 * for writing, where the "open" fault fires, and it starts the one reading of a value
 * that the reads of that open share.
 *
 * Attribute files are opened with direct I/O so every read and write reaches the model
 * (nothing is kept in the page cache), and failed lookups are never cached.  Entries
 * and attributes that exist may be cached for --entry-timeout seconds: every change to
 * the tree passes through this mount (mkdir, rmdir, symlink and unlink are the
 * kernel's own requests, so it updates its cache itself), except the trees a module
 * removal takes away, which are invalidated before the control write returns.
 */
#define FUSE_USE_VERSION 314

#include <fuse3/fuse_lowlevel.h>
#include <getopt.h>
#include <limits.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "configfs_sim.h"
#include "configfs_sim_loop.h"

namespace {

using orlosim::DirEntry;
using orlosim::Handle;
using orlosim::Sim;

struct Settings {
    double entryTimeout = 1.0;
    struct fuse_session *session = nullptr;
    orlosim::RequestLoop *loop = nullptr;
};
Settings g_settings;

// The model, for a request answered on the reading thread.
Sim *TheSim(fuse_req_t req) {
    g_settings.loop->Served(fuse_req_ctx(req)->pid);
    return static_cast<Sim *>(fuse_req_userdata(req));
}
Handle *H(struct fuse_file_info *fi) { return reinterpret_cast<Handle *>(fi->fh); }

void ReplyEntry(fuse_req_t req, int rc, const struct stat &st) {
    if (rc != 0) {
        fuse_reply_err(req, -rc);
        return;
    }
    struct fuse_entry_param e;
    memset(&e, 0, sizeof(e));
    e.ino = st.st_ino;
    e.attr = st;
    e.attr_timeout = g_settings.entryTimeout;
    e.entry_timeout = g_settings.entryTimeout;
    fuse_reply_entry(req, &e);
}

void ReplyAttr(fuse_req_t req, int rc, const struct stat &st) {
    if (rc != 0)
        fuse_reply_err(req, -rc);
    else
        fuse_reply_attr(req, &st, g_settings.entryTimeout);
}

void SimInit(void *, struct fuse_conn_info *conn) {
    // O_TRUNC travels with the open instead of costing a setattr request of its own.
    if (conn->capable & FUSE_CAP_ATOMIC_O_TRUNC) conn->want |= FUSE_CAP_ATOMIC_O_TRUNC;
    conn->want &= ~static_cast<unsigned>(FUSE_CAP_WRITEBACK_CACHE | FUSE_CAP_SPLICE_READ | FUSE_CAP_SPLICE_WRITE |
                                         FUSE_CAP_SPLICE_MOVE);
}

void SimLookup(fuse_req_t req, fuse_ino_t parent, const char *name) {
    struct stat st;
    ReplyEntry(req, TheSim(req)->Lookup(parent, name, &st), st);
}

// The model keeps nothing per kernel reference: node numbers are never used twice.
void SimForget(fuse_req_t req, fuse_ino_t, uint64_t) { fuse_reply_none(req); }
void SimForgetMulti(fuse_req_t req, size_t, struct fuse_forget_data *) { fuse_reply_none(req); }

void SimGetattr(fuse_req_t req, fuse_ino_t ino, struct fuse_file_info *) {
    struct stat st;
    ReplyAttr(req, TheSim(req)->GetAttr(ino, &st), st);
}

void SimSetattr(fuse_req_t req, fuse_ino_t ino, struct stat *, int toSet, struct fuse_file_info *) {
    struct stat st;
    ReplyAttr(req, TheSim(req)->SetAttr(ino, (toSet & FUSE_SET_ATTR_SIZE) != 0, &st), st);
}

void SimReadlink(fuse_req_t req, fuse_ino_t ino) {
    std::string s;
    int rc = TheSim(req)->Readlink(ino, &s);
    if (rc != 0)
        fuse_reply_err(req, -rc);
    else
        fuse_reply_readlink(req, s.c_str());
}

void SimMknod(fuse_req_t req, fuse_ino_t parent, const char *name, mode_t, dev_t) {
    fuse_reply_err(req, -TheSim(req)->Create(parent, name));
}

void SimCreate(fuse_req_t req, fuse_ino_t parent, const char *name, mode_t, struct fuse_file_info *) {
    fuse_reply_err(req, -TheSim(req)->Create(parent, name));
}

void SimMkdir(fuse_req_t req, fuse_ino_t parent, const char *name, mode_t) {
    struct stat st;
    ReplyEntry(req, TheSim(req)->Mkdir(parent, name, &st), st);
}

void SimUnlink(fuse_req_t req, fuse_ino_t parent, const char *name) {
    fuse_reply_err(req, -TheSim(req)->Unlink(parent, name));
}

void SimRmdir(fuse_req_t req, fuse_ino_t parent, const char *name) {
    fuse_reply_err(req, -TheSim(req)->Rmdir(parent, name));
}

void SimSymlink(fuse_req_t req, const char *target, fuse_ino_t parent, const char *name) {
    struct stat st;
    ReplyEntry(req, TheSim(req)->Symlink(target, parent, name, &st), st);
}

void SimRename(fuse_req_t req, fuse_ino_t, const char *, fuse_ino_t, const char *, unsigned int) {
    fuse_reply_err(req, -TheSim(req)->Rename());
}

void SimLink(fuse_req_t req, fuse_ino_t, fuse_ino_t, const char *) { fuse_reply_err(req, EPERM); }

void SimOpen(fuse_req_t req, fuse_ino_t ino, struct fuse_file_info *fi) {
    Handle *h = nullptr;
    int rc = TheSim(req)->Open(ino, fi->flags, &h);
    if (rc != 0) {
        fuse_reply_err(req, -rc);
        return;
    }
    fi->fh = reinterpret_cast<uint64_t>(h);
    fi->direct_io = 1;
    fi->keep_cache = 0;
    fi->noflush = 1;  // close has nothing to report: no flush request
    // An open the caller gave up on (interrupted) gets no release: free it here.
    if (fuse_reply_open(req, fi) == -ENOENT) TheSim(req)->Release(h);
}

void SimRead(fuse_req_t req, fuse_ino_t, size_t size, off_t off, struct fuse_file_info *fi) {
    std::unique_ptr<char[]> buf(new char[size > 0 ? size : 1]);
    int n = TheSim(req)->Read(H(fi), buf.get(), size, off);
    if (n < 0)
        fuse_reply_err(req, -n);
    else
        fuse_reply_buf(req, buf.get(), static_cast<size_t>(n));
}

void Write(fuse_req_t req, Sim *sim, Handle *h, const char *buf, size_t size) {
    int rc = sim->Write(h, buf, size);
    if (!h->control.empty()) {
        // Trees a module removal took away: the kernel drops its entries for them before
        // the write returns, so the caller's next look finds them gone.
        for (const orlosim::Invalidation &inv : sim->TakeInvalidations())
            fuse_lowlevel_notify_inval_entry(g_settings.session, inv.parent, inv.name.c_str(), inv.name.size());
    }
    if (rc < 0)
        fuse_reply_err(req, -rc);
    else
        fuse_reply_write(req, static_cast<size_t>(rc));
}

void SimWrite(fuse_req_t req, fuse_ino_t, const char *buf, size_t size, off_t, struct fuse_file_info *fi) {
    Sim *sim = TheSim(req);
    Handle *h = H(fi);
    if (h->control.empty()) {
        Write(req, sim, h, buf, size);
        return;
    }
    // A control command may end in invalidations, which wait for the kernel's lock on
    // the directory: a helper sends them while this thread goes on answering whoever
    // holds that lock.  The bytes live only as long as this call: the helper gets a copy.
    std::string data(buf, size);
    g_settings.loop->Defer([req, sim, h, data] { Write(req, sim, h, data.data(), data.size()); });
}

void SimRelease(fuse_req_t req, fuse_ino_t, struct fuse_file_info *fi) {
    TheSim(req)->Release(H(fi));
    fuse_reply_err(req, 0);
}

void SimOpendir(fuse_req_t req, fuse_ino_t ino, struct fuse_file_info *fi) {
    Handle *h = nullptr;
    int rc = TheSim(req)->OpenDir(ino, &h);
    if (rc != 0) {
        fuse_reply_err(req, -rc);
        return;
    }
    fi->fh = reinterpret_cast<uint64_t>(h);
    if (fuse_reply_open(req, fi) == -ENOENT) TheSim(req)->Release(h);
}

void SimReaddir(fuse_req_t req, fuse_ino_t, size_t size, off_t off, struct fuse_file_info *fi) {
    const std::vector<DirEntry> *listing = nullptr;
    int rc = TheSim(req)->ReadDir(H(fi), off == 0, &listing);
    if (rc != 0) {
        fuse_reply_err(req, -rc);
        return;
    }
    std::unique_ptr<char[]> buf(new char[size > 0 ? size : 1]);
    size_t used = 0;
    for (size_t i = off < 0 ? listing->size() : static_cast<size_t>(off); i < listing->size(); ++i) {
        const DirEntry &e = (*listing)[i];
        struct stat st;
        memset(&st, 0, sizeof(st));
        st.st_ino = e.ino;
        st.st_mode = e.type;
        size_t need = fuse_add_direntry(req, buf.get() + used, size - used, e.name.c_str(), &st,
                                        static_cast<off_t>(i + 1));
        if (need > size - used) break;
        used += need;
    }
    fuse_reply_buf(req, buf.get(), used);
}

void SimReleasedir(fuse_req_t req, fuse_ino_t, struct fuse_file_info *fi) {
    TheSim(req)->Release(H(fi));
    fuse_reply_err(req, 0);
}

void SimStatfs(fuse_req_t req, fuse_ino_t) {
    struct statvfs st;
    memset(&st, 0, sizeof(st));
    st.f_bsize = 4096;
    st.f_frsize = 4096;
    st.f_namemax = 255;
    fuse_reply_statfs(req, &st);
}

const char kUsage[] =
    "Usage: orlo-configfs-sim [OPTIONS] MOUNTPOINT\n"
    "\n"
    "Mounts a simulated kernel SCSI target configfs tree at MOUNTPOINT (in a sandbox,\n"
    "$ORLO_SYSROOT/config) so that the iSCSI library and its tools can run without the\n"
    "appliance kernel.\n"
    "\n"
    "Modelled: target/core with the hosts iblock_0, fileio_0, fileio_1 (and epio_0,\n"
    "epio_1 with the newer module set) and their backstores (control, enable, info,\n"
    "udev_path, wwn/, attrib/ with uuid, lun_name, is_skip_resource_monitor,\n"
    "emulate_sync_cache, defer_queue_mode, hba_type, alua/, pr/, statistics/);\n"
    "target/iscsi with nodes, tpgt_N (enable, dynamic_sessions, max_session, attrib/,\n"
    "param/, auth/, np/, acls/, lun/), node ACLs with per-LUN entries, and the links\n"
    "between them; pool/ (ext_jnl_enable, EP_N with rod_* and unmap_*); vsys/.\n"
    "Writes are checked as the kernel checks them and fail with its errno.\n"
    "\n"
    "Nothing exists until modules are inserted: write \"insert NAME\" to\n"
    "MOUNTPOINT/.sim/modules (or run orlo-sim-insmod installed as /sbin/insmod).\n"
    "\n"
    "Control files in MOUNTPOINT/.sim/ (hidden from the listing of MOUNTPOINT):\n"
    "  modules   read: inserted modules; write: \"insert NAME\" or \"remove NAME\"\n"
    "  trace     read: one line per operation, OP<TAB>PATH<TAB>VALUE<TAB>RESULT;\n"
    "            write: \"clear\"\n"
    "  faults    write: \"OP PATTERN ERRNO [once|always]\" or \"clear\"; OP is mkdir,\n"
    "            rmdir, write, read, symlink, unlink, open or *; PATTERN is a shell\n"
    "            pattern of the path inside the mount; ERRNO a name such as EIO\n"
    "  sessions  write: \"add TARGET_IQN TPGT INITIATOR IP CID\",\n"
    "            \"drop TARGET_IQN TPGT INITIATOR [CID]\" or \"clear\"\n"
    "  clone     write: \"set BACKSTORE_PATH PERCENT\" or \"stop BACKSTORE_PATH\"\n"
    "\n"
    "Options:\n"
    "  --root DIR          resolve appliance paths in control strings under DIR\n"
    "                      (default: $ORLO_SYSROOT, else /)\n"
    "  --trace-limit N     keep the last N operations in the trace (default 1000000;\n"
    "                      0 turns tracing off)\n"
    "  --threads N         request threads: one reads and answers every request, the\n"
    "                      others send control writes' invalidations (default 8,\n"
    "                      at least 2)\n"
    "  --entry-timeout S   seconds the kernel may cache entries and attributes that\n"
    "                      exist (default 1); failed lookups are never cached\n"
    "  --no-follow         do not move the reading thread to its caller's CPU\n"
    "  --clone-rate PCT    clones and mirrors advance PCT percent a second on their own\n"
    "                      (default 0: only through MOUNTPOINT/.sim/clone)\n"
    "  -d, --daemon        detach once mounted\n"
    "  -h, --help          show this text\n"
    "\n"
    "Unmount with: fusermount3 -u MOUNTPOINT (or umount), or send SIGTERM.\n"
    "See docs/configfs-sim.md.\n";

}  // namespace

int main(int argc, char **argv) {
    Sim::Options opts;
    const char *envRoot = secure_getenv("ORLO_SYSROOT");
    opts.root = envRoot != nullptr && envRoot[0] != '\0' ? envRoot : "/";
    unsigned threads = 8;
    bool daemon = false;
    bool follow = true;
    static const struct option longOpts[] = {
        {"root", required_argument, nullptr, 'r'},        {"trace-limit", required_argument, nullptr, 't'},
        {"threads", required_argument, nullptr, 'n'},     {"entry-timeout", required_argument, nullptr, 'e'},
        {"no-follow", no_argument, nullptr, 'f'},         {"daemon", no_argument, nullptr, 'd'},
        {"clone-rate", required_argument, nullptr, 'c'},
        {"help", no_argument, nullptr, 'h'},
        {nullptr, 0, nullptr, 0}};
    int c;
    while ((c = getopt_long(argc, argv, "dh", longOpts, nullptr)) != -1) {
        switch (c) {
            case 'r': opts.root = optarg; break;
            case 't': opts.traceLimit = strtoul(optarg, nullptr, 10); break;
            case 'n': threads = static_cast<unsigned>(strtoul(optarg, nullptr, 10)); break;
            case 'e': g_settings.entryTimeout = strtod(optarg, nullptr); break;
            case 'f': follow = false; break;
            case 'd': daemon = true; break;
            case 'c': opts.cloneRate = static_cast<int>(strtol(optarg, nullptr, 10)); break;
            case 'h': fputs(kUsage, stdout); return 0;
            default: fputs(kUsage, stderr); return 2;
        }
    }
    if (optind + 1 != argc) {
        fputs(kUsage, stderr);
        return 2;
    }
    char real[PATH_MAX];
    if (realpath(argv[optind], real) == nullptr) {
        fprintf(stderr, "orlo-configfs-sim: %s: %s\n", argv[optind], strerror(errno));
        return 1;
    }
    opts.mountpoint = real;
    if (argv[optind][0] == '/') opts.mountAlias = argv[optind];
    // The reading thread and at least one helper for the requests that may wait.
    if (threads < 2) threads = 2;
    if (g_settings.entryTimeout < 0) g_settings.entryTimeout = 0;
    Sim sim(opts);

    struct fuse_lowlevel_ops ops;
    memset(&ops, 0, sizeof(ops));
    ops.init = SimInit;
    ops.lookup = SimLookup;
    ops.forget = SimForget;
    ops.forget_multi = SimForgetMulti;
    ops.getattr = SimGetattr;
    ops.setattr = SimSetattr;
    ops.readlink = SimReadlink;
    ops.mknod = SimMknod;
    ops.mkdir = SimMkdir;
    ops.unlink = SimUnlink;
    ops.rmdir = SimRmdir;
    ops.symlink = SimSymlink;
    ops.rename = SimRename;
    ops.link = SimLink;
    ops.open = SimOpen;
    ops.read = SimRead;
    ops.write = SimWrite;
    ops.release = SimRelease;
    ops.opendir = SimOpendir;
    ops.readdir = SimReaddir;
    ops.releasedir = SimReleasedir;
    ops.statfs = SimStatfs;
    ops.create = SimCreate;

    char arg0[] = "orlo-configfs-sim";
    char argO[] = "-o";
    char argOpts[] = "fsname=orlo-configfs-sim,subtype=orlo-configfs-sim";
    char *fargv[] = {arg0, argO, argOpts, nullptr};
    struct fuse_args args = FUSE_ARGS_INIT(3, fargv);
    struct fuse_session *se = fuse_session_new(&args, &ops, sizeof(ops), &sim);
    fuse_opt_free_args(&args);
    if (se == nullptr) {
        fprintf(stderr, "orlo-configfs-sim: cannot start a FUSE session\n");
        return 1;
    }
    g_settings.session = se;
    int rc = 1;
    if (fuse_set_signal_handlers(se) == 0) {
        if (fuse_session_mount(se, real) != 0) {
            fprintf(stderr, "orlo-configfs-sim: cannot mount on %s\n", real);
        } else {
            if (fuse_daemonize(daemon ? 0 : 1) == 0) {
                sim.StartRelationTicker();  // after the fork of --daemon, in the process that serves
                orlosim::RequestLoop loop(se, threads - 1, follow);
                g_settings.loop = &loop;
                int end = loop.Run();
                rc = end >= 0 ? 0 : 1;  // a positive value is the signal that ended it
            }
            g_settings.loop = nullptr;
            fuse_session_unmount(se);
        }
        fuse_remove_signal_handlers(se);
    }
    fuse_session_destroy(se);
    return rc;
}
