/*
 * orlo-configfs-sim: mounts the configfs model as a FUSE file system.
 *
 * Requests are served by libfuse's multithreaded loop; attribute files are opened
 * with direct I/O so every read reaches the model (nothing is kept in the page cache),
 * and negative lookups are never cached.  Positive directory entries may be cached for
 * a short time: every change to the tree passes through this mount, and the trees a
 * module removal takes away are invalidated explicitly.
 */
#define FUSE_USE_VERSION 314

#include <fuse3/fuse.h>
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

#include "configfs_sim.h"

namespace {

using orlosim::Handle;
using orlosim::Sim;

struct Settings {
    double entryTimeout = 1.0;
};
Settings g_settings;

Sim *TheSim() { return static_cast<Sim *>(fuse_get_context()->private_data); }
Handle *H(struct fuse_file_info *fi) { return reinterpret_cast<Handle *>(fi->fh); }

void *SimInit(struct fuse_conn_info *conn, struct fuse_config *cfg) {
    cfg->use_ino = 1;
    cfg->entry_timeout = g_settings.entryTimeout;
    cfg->attr_timeout = g_settings.entryTimeout;
    cfg->negative_timeout = 0;
    cfg->direct_io = 1;
    cfg->hard_remove = 1;
    cfg->kernel_cache = 0;
    if (conn->capable & FUSE_CAP_ATOMIC_O_TRUNC) conn->want |= FUSE_CAP_ATOMIC_O_TRUNC;
    conn->want &= ~static_cast<unsigned>(FUSE_CAP_WRITEBACK_CACHE);
    return fuse_get_context()->private_data;
}

int SimGetattr(const char *path, struct stat *st, struct fuse_file_info *) { return TheSim()->GetAttr(path, st); }

int SimReadlink(const char *path, char *buf, size_t size) {
    std::string s;
    int rc = TheSim()->Readlink(path, &s);
    if (rc != 0) return rc;
    if (size == 0) return -EINVAL;
    size_t n = std::min(s.size(), size - 1);
    memcpy(buf, s.data(), n);
    buf[n] = '\0';
    return 0;
}

int SimMkdir(const char *path, mode_t) { return TheSim()->Mkdir(path); }
int SimRmdir(const char *path) { return TheSim()->Rmdir(path); }
int SimUnlink(const char *path) { return TheSim()->Unlink(path); }
int SimSymlink(const char *target, const char *link) { return TheSim()->Symlink(target, link); }
int SimRename(const char *, const char *, unsigned int) { return TheSim()->Rename(); }
int SimLink(const char *, const char *) { return -EPERM; }
int SimMknod(const char *path, mode_t, dev_t) { return TheSim()->Create(path); }
int SimCreate(const char *path, mode_t, struct fuse_file_info *) { return TheSim()->Create(path); }

// Mode, owner and times are accepted and forgotten, as configfs keeps them only in
// its inode; truncating an attribute (echo > file) does nothing.
int SimChmod(const char *path, mode_t, struct fuse_file_info *) {
    struct stat st;
    return TheSim()->GetAttr(path, &st);
}
int SimChown(const char *path, uid_t, gid_t, struct fuse_file_info *) {
    struct stat st;
    return TheSim()->GetAttr(path, &st);
}
int SimUtimens(const char *path, const struct timespec *, struct fuse_file_info *) {
    struct stat st;
    return TheSim()->GetAttr(path, &st);
}
int SimTruncate(const char *path, off_t, struct fuse_file_info *) {
    struct stat st;
    int rc = TheSim()->GetAttr(path, &st);
    if (rc == 0 && S_ISDIR(st.st_mode)) return -EISDIR;
    return rc;
}

int SimOpen(const char *path, struct fuse_file_info *fi) {
    std::unique_ptr<Handle> h;
    int rc = TheSim()->Open(path, fi->flags, &h);
    if (rc != 0) return rc;
    fi->fh = reinterpret_cast<uint64_t>(h.release());
    fi->direct_io = 1;
    fi->keep_cache = 0;
    return 0;
}

int SimRead(const char *, char *buf, size_t size, off_t off, struct fuse_file_info *fi) {
    return TheSim()->Read(H(fi), buf, size, off);
}

int SimWrite(const char *, const char *buf, size_t size, off_t, struct fuse_file_info *fi) {
    Sim *sim = TheSim();
    int rc = sim->Write(H(fi), buf, size);
    if (!H(fi)->control.empty()) {
        // Trees a module removal took away: drop the kernel's cached entries for them.
        for (const std::string &p : sim->TakeInvalidations()) fuse_invalidate_path(fuse_get_context()->fuse, p.c_str());
    }
    return rc;
}

int SimRelease(const char *, struct fuse_file_info *fi) {
    delete H(fi);
    fi->fh = 0;
    return 0;
}

int SimReaddir(const char *path, void *buf, fuse_fill_dir_t filler, off_t, struct fuse_file_info *,
               enum fuse_readdir_flags) {
    std::vector<std::string> names;
    int rc = TheSim()->ReadDir(path, &names);
    if (rc != 0) return rc;
    filler(buf, ".", nullptr, 0, static_cast<fuse_fill_dir_flags>(0));
    filler(buf, "..", nullptr, 0, static_cast<fuse_fill_dir_flags>(0));
    for (const std::string &n : names) filler(buf, n.c_str(), nullptr, 0, static_cast<fuse_fill_dir_flags>(0));
    return 0;
}

int SimStatfs(const char *, struct statvfs *st) {
    memset(st, 0, sizeof(*st));
    st->f_bsize = 4096;
    st->f_frsize = 4096;
    st->f_namemax = 255;
    return 0;
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
    "  --threads N         at most N request threads (default 8)\n"
    "  --entry-timeout S   seconds the kernel may cache directory entries (default 1)\n"
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
    static const struct option longOpts[] = {
        {"root", required_argument, nullptr, 'r'},        {"trace-limit", required_argument, nullptr, 't'},
        {"threads", required_argument, nullptr, 'n'},     {"entry-timeout", required_argument, nullptr, 'e'},
        {"daemon", no_argument, nullptr, 'd'},            {"help", no_argument, nullptr, 'h'},
        {nullptr, 0, nullptr, 0}};
    int c;
    while ((c = getopt_long(argc, argv, "dh", longOpts, nullptr)) != -1) {
        switch (c) {
            case 'r': opts.root = optarg; break;
            case 't': opts.traceLimit = strtoul(optarg, nullptr, 10); break;
            case 'n': threads = static_cast<unsigned>(strtoul(optarg, nullptr, 10)); break;
            case 'e': g_settings.entryTimeout = strtod(optarg, nullptr); break;
            case 'd': daemon = true; break;
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
    if (threads == 0) threads = 1;
    Sim sim(opts);

    struct fuse_operations ops;
    memset(&ops, 0, sizeof(ops));
    ops.init = SimInit;
    ops.getattr = SimGetattr;
    ops.readlink = SimReadlink;
    ops.mkdir = SimMkdir;
    ops.rmdir = SimRmdir;
    ops.unlink = SimUnlink;
    ops.symlink = SimSymlink;
    ops.rename = SimRename;
    ops.link = SimLink;
    ops.mknod = SimMknod;
    ops.create = SimCreate;
    ops.chmod = SimChmod;
    ops.chown = SimChown;
    ops.utimens = SimUtimens;
    ops.truncate = SimTruncate;
    ops.open = SimOpen;
    ops.read = SimRead;
    ops.write = SimWrite;
    ops.release = SimRelease;
    ops.readdir = SimReaddir;
    ops.statfs = SimStatfs;

    char arg0[] = "orlo-configfs-sim";
    char argO[] = "-o";
    char argOpts[] = "fsname=orlo-configfs-sim,subtype=orlo-configfs-sim";
    char *fargv[] = {arg0, argO, argOpts, nullptr};
    struct fuse_args args = FUSE_ARGS_INIT(3, fargv);
    struct fuse *f = fuse_new(&args, &ops, sizeof(ops), &sim);
    if (f == nullptr) {
        fprintf(stderr, "orlo-configfs-sim: fuse_new failed\n");
        return 1;
    }
    int rc = 1;
    if (fuse_mount(f, real) != 0) {
        fprintf(stderr, "orlo-configfs-sim: cannot mount on %s\n", real);
    } else {
        struct fuse_session *se = fuse_get_session(f);
        if (fuse_set_signal_handlers(se) == 0) {
            if (fuse_daemonize(daemon ? 0 : 1) == 0) {
                struct fuse_loop_config *cfg = fuse_loop_cfg_create();
                fuse_loop_cfg_set_max_threads(cfg, threads);
                fuse_loop_cfg_set_idle_threads(cfg, threads < 4 ? threads : 4);
                int loop = fuse_loop_mt(f, cfg);
                rc = loop >= 0 ? 0 : 1;  // a positive value is the signal that ended it
                fuse_loop_cfg_destroy(cfg);
            }
            fuse_remove_signal_handlers(se);
        }
        fuse_unmount(f);
    }
    fuse_destroy(f);
    fuse_opt_free_args(&args);
    return rc;
}
