// A sandbox with a simulated kernel target mounted at /config.
//
// Each test gets a fresh orlo-configfs-sim mounted at Real("/config"), the insmod
// stand-in installed as /sbin/insmod and an empty /lib/modules/NAME.ko for every
// module of both target generations, so the library's module loading runs as on the
// appliance.  The simulator is always unmounted: in TearDown (also after a failed
// assertion), and by the simulator itself when the test process dies (it gets SIGTERM
// through PR_SET_PDEATHSIG and leaves its FUSE loop cleanly).  Its standard error goes
// to a file of its own, and the test fails when the simulator, once stopped, did not
// exit with status 0 or wrote a sanitizer's report (a leak, a memory error, undefined
// behaviour).  Tests skip with a message when not run as root or when /dev/fuse is
// missing.
#ifndef ORLO_TESTS_SUPPORT_CONFIGFS_SIM_FIXTURE_H
#define ORLO_TESTS_SUPPORT_CONFIGFS_SIM_FIXTURE_H

#include <sys/types.h>

#include <string>
#include <vector>

#include "support/sandbox.h"

namespace orlotest {

// One line of the simulator's trace.
struct SimOp {
    std::string op;      // mkdir, rmdir, write, read, symlink, unlink
    std::string path;    // inside the mount, e.g. "/target/core/fileio_0/LUN_x/enable"
    std::string value;   // written or read text (newlines as "\n"), or a link's target
    std::string result;  // "0" or an errno name such as "EINVAL"
};

class ConfigfsSimTest : public SandboxTest {
  public:
    // True when some file system is mounted exactly at path.
    static bool MountedAt(const std::string &path);
    // Starts a simulator on mount (appliance paths resolved under root) that ends when
    // the calling thread's process dies, and waits until it serves requests.  Its
    // standard error goes to stderrPath when one is given; extraArgs are added to its
    // options.  Its pid, or -1 when it did not come up.
    static pid_t LaunchSim(const std::string &root, const std::string &mount, const std::string &stderrPath = "",
                           const std::vector<std::string> &extraArgs = {});
    // What was wrong with how a simulator ended, or "" when nothing was: status is its
    // wait status, stopped tells whether it was still running when it was told to stop
    // (one that died before may only have been killed with SIGKILL, as tests do), and
    // errText is what it wrote on standard error.
    static std::string EndProblem(int status, bool stopped, const std::string &errText);
    // Aborts the FUSE connection of the file system mounted at mount (through the fuse
    // control file system, mounted when it is not), so that every request waiting on a
    // wedged simulator fails with ENOTCONN and the simulator itself can end.  True when
    // the connection was found and aborted.
    static bool AbortConnection(const std::string &mount);

  protected:
    // Module sets, numbered as the service numbers them.
    enum ModuleSet { kIscsiModules = 1, kVhostModules = 2, kTcmModules = 3, kLoopbackModules = 4 };

    void SetUp() override;
    void TearDown() override;

    // Names of one set for a target generation (4, or any other for the older one), in
    // insertion order; the RDMA module is part of the iSCSI set of generation 4 when
    // rdma is set.
    static std::vector<std::string> ModuleSetNames(int set, int version, bool rdma = false);
    // Every module name of both generations.
    static std::vector<std::string> AllModuleNames();
    // Inserts the target-core set and then the named set, as the service loads them,
    // straight through the control file.  0 or the errno of the first failure.
    int InsertModuleSet(int set, int version = 4, bool rdma = false);

    // Writes text to MOUNTPOINT/.sim/<file>; 0 or the write's errno.
    int SimControl(const std::string &file, const std::string &text);
    std::string SimRead(const std::string &file);
    std::vector<std::string> Modules();
    std::vector<SimOp> Trace();
    // The trace as "op path value result" lines, for failure messages.
    std::string TraceDump();
    void ClearTrace();
    int SetFault(const std::string &op, const std::string &pattern, const std::string &err, bool once = true);
    int AddSession(const std::string &targetIqn, int tpgt, const std::string &initiator, const std::string &ip,
                   int cid);
    int DropSession(const std::string &targetIqn, int tpgt, const std::string &initiator);
    // PATH is the backstore's path inside the mount, e.g. "/target/core/epio_0/LUN_x".
    int SetCloneProgress(const std::string &backstore, int percent);

    // Real path of the mount and of a path inside it ("/target/..." -> ".../config/target/...").
    std::string Mount() const { return Real("/config"); }
    std::string Cfg(const std::string &inside) const { return Real("/config") + inside; }

    pid_t sim_pid() const { return pid_; }
    // Stops the simulator (SIGTERM, then SIGKILL after a grace period, then an aborted
    // connection when it is wedged in a request to itself) and makes sure nothing stays
    // mounted; adds a test failure when it ended badly (EndProblem).  Safe to call twice.
    void StopSim();
    // Stops the simulator and mounts a fresh one started with extraArgs.
    void RestartSim(const std::vector<std::string> &extraArgs);

  private:
    pid_t pid_ = -1;
    std::string stderrPath_;  // the running simulator's standard error
};

}  // namespace orlotest

#endif
