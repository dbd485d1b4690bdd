/*
 * orlo-sim-insmod: stands in for /sbin/insmod inside a sandbox root.
 *
 * Run as "insmod /lib/modules/NAME.ko", it checks that the module file exists under
 * $ORLO_SYSROOT and asks the simulated kernel target to insert NAME by writing
 * "insert NAME\n" to $ORLO_SYSROOT/config/.sim/modules.  Failures are reported as
 * insmod reports them: a message on standard error and exit status 1.
 */
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

namespace {

std::string Mapped(const std::string &root, const std::string &path) {
    if (root.empty() || root == "/" || path.empty() || path[0] != '/') return path;
    return root + path;
}

// The kernel's name of a module file: its base name less ".ko", dashes as underscores.
std::string ModuleName(const std::string &path) {
    std::string base = path.substr(path.rfind('/') == std::string::npos ? 0 : path.rfind('/') + 1);
    if (base.size() > 3 && base.compare(base.size() - 3, 3, ".ko") == 0) base.resize(base.size() - 3);
    for (char &c : base)
        if (c == '-') c = '_';
    return base;
}

int Fail(const std::string &module, int err) {
    fprintf(stderr, "insmod: ERROR: could not insert module %s: %s\n", module.c_str(), strerror(err));
    return 1;
}

}  // namespace

int main(int argc, char **argv) {
    if (argc >= 2 && (strcmp(argv[1], "--help") == 0 || strcmp(argv[1], "-h") == 0)) {
        printf("Usage: insmod FILENAME [ARGS...]\n"
               "Inserts a module into the simulated kernel target (orlo-configfs-sim) mounted\n"
               "at $ORLO_SYSROOT/config.\n");
        return 0;
    }
    if (argc < 2) {
        fprintf(stderr, "Usage: insmod FILENAME [ARGS...]\n");
        return 1;
    }
    const char *env = secure_getenv("ORLO_SYSROOT");
    std::string root = env != nullptr ? env : "";
    std::string file = argv[1];
    struct stat st;
    if (stat(Mapped(root, file).c_str(), &st) != 0) {
        fprintf(stderr, "insmod: ERROR: could not load module %s: %s\n", file.c_str(), strerror(errno));
        return 1;
    }
    std::string control = Mapped(root, "/config/.sim/modules");
    int fd = open(control.c_str(), O_WRONLY | O_CLOEXEC);
    if (fd < 0) return Fail(file, errno == ENOENT ? ENODEV : errno);
    std::string cmd = "insert " + ModuleName(file) + "\n";
    ssize_t n = write(fd, cmd.data(), cmd.size());
    int err = errno;
    close(fd);
    if (n != static_cast<ssize_t>(cmd.size())) return Fail(file, n < 0 ? err : EIO);
    return 0;
}
