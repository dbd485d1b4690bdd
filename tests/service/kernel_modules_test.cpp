// Inserting and removing the kernel target's module sets against the simulated kernel:
// what goes in and out and in which order, what is skipped, where a failure stops the
// walk and the exact lines it leaves in the log.
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_service.h"
#include "service/service_test_util.h"

namespace service_test {
namespace {

std::vector<std::string> Concat(std::vector<std::string> a, const std::vector<std::string> &b) {
    a.insert(a.end(), b.begin(), b.end());
    return a;
}
std::vector<std::string> Prefixed(const std::string &prefix, const std::vector<std::string> &names) {
    std::vector<std::string> out;
    for (const std::string &n : names) out.push_back(prefix + n + "'");
    return out;
}
std::vector<std::string> Reversed(std::vector<std::string> v) { return {v.rbegin(), v.rend()}; }

class KernelModules : public ServiceSimTest {
  protected:
    std::vector<std::string> Core() const { return ModuleSetNames(kTcmModules, 4); }
};

class KernelModulesRdma : public KernelModules {
  protected:
    bool Rdma() const override { return true; }
};

class KernelModulesOlder : public ServiceSimTest {
  protected:
    const char *TargetType() const override { return "lio"; }
};

TEST_F(KernelModulesRdma, LoadInsertsTheCoreThenTheSetInOrderAndLeavesWhatIsInAlone) {
    ASSERT_EQ(0, mkdir(Real("/var").c_str(), 0755));
    ASSERT_EQ(ORLO_OK, ORLOiSCSILoadModules(ISCSI_KERNEL_MODULES)) << log_.Dump();
    std::vector<std::string> expected = Concat(Core(), {"iscsi_target_mod", "ib_isert"});
    EXPECT_EQ(expected, Modules());
    EXPECT_EQ(Prefixed("Loading module '", expected), Messages(log_, "Loading module")) << log_.Dump();
    std::vector<std::string> execs;
    for (const std::string &m : expected)
        execs.push_back("OLIBCExec(\"/sbin/insmod\", \"/lib/modules/" + m + ".ko\", nullptr, nullptr, nullptr), ret=0");
    EXPECT_EQ(execs, Messages(log_, "OLIBCExec("));
    for (const char *d : {"/var/crash", "/var/lock", "/var/lock/subsys", "/var/target", "/var/target/pr",
                          "/var/target/alua"}) {
        struct stat st;
        ASSERT_EQ(0, stat(Real(d).c_str(), &st)) << d;
        EXPECT_EQ(0700u, st.st_mode & 07777) << d;
    }

    // Another set inserts only its own modules; loading a set again inserts nothing.
    log_.Clear();
    ASSERT_EQ(ORLO_OK, ORLOiSCSILoadModules(VHOST_KERNEL_MODULES)) << log_.Dump();
    EXPECT_EQ(Concat(expected, {"vhost_scsi"}), Modules());
    EXPECT_EQ(std::vector<std::string>{"Loading module 'vhost_scsi'"}, Messages(log_, "Loading module"));
    log_.Clear();
    ASSERT_EQ(ORLO_OK, ORLOiSCSILoadModulesWithoutLock(ISCSI_KERNEL_MODULES)) << log_.Dump();
    EXPECT_TRUE(Messages(log_, "Loading module").empty()) << log_.Dump();
    EXPECT_EQ(Concat(expected, {"vhost_scsi"}), Modules());
}

TEST_F(KernelModulesOlder, TheOlderGenerationLoadsItsOwnLists) {
    ASSERT_EQ(ORLO_OK, ORLOiSCSILoadModules(TCM_KERNEL_MODULES)) << log_.Dump();
    EXPECT_EQ((std::vector<std::string>{"rodsp_ep_4_0", "target_core_mod_4_0", "iscsi_extent_pool"}), Modules());
    ASSERT_EQ(ORLO_OK, ORLOiSCSILoadModules(ISCSI_KERNEL_MODULES)) << log_.Dump();
    ASSERT_EQ(ORLO_OK, ORLOiSCSILoadModules(LOOPBACK_KERNEL_MODULES)) << log_.Dump();
    EXPECT_EQ((std::vector<std::string>{"rodsp_ep_4_0", "target_core_mod_4_0", "iscsi_extent_pool",
                                        "iscsi_target_mod_4_0", "tcm_loop"}),
              Modules());
    ASSERT_EQ(ORLO_OK, ORLOiSCSIUnloadModules(ISCSI_KERNEL_MODULES)) << log_.Dump();
    ASSERT_EQ(ORLO_OK, ORLOiSCSIUnloadModules(LOOPBACK_KERNEL_MODULES)) << log_.Dump();
    ASSERT_EQ(ORLO_OK, ORLOiSCSIUnloadModules(TCM_KERNEL_MODULES)) << log_.Dump();
    EXPECT_TRUE(Modules().empty());
}

TEST_F(KernelModules, UnloadRemovesOnlyTheSetLastFirstAndSkipsMissingModuleFiles) {
    // The appliance does not ship target_core_file: loading skips it without a word.
    ASSERT_EQ(0, unlink(Real("/lib/modules/target_core_file.ko").c_str()));
    ASSERT_EQ(ORLO_OK, ORLOiSCSILoadModules(ISCSI_KERNEL_MODULES)) << log_.Dump();
    ASSERT_EQ(ORLO_OK, ORLOiSCSILoadModules(LOOPBACK_KERNEL_MODULES)) << log_.Dump();
    std::vector<std::string> core = {"rodsp_ep", "orlo_extent_pool", "target_core_mod", "target_core_iblock",
                                     "target_core_ep"};
    EXPECT_EQ(Concat(core, {"iscsi_target_mod", "tcm_loop"}), Modules());
    EXPECT_EQ(std::string::npos, log_.Dump().find("target_core_file")) << log_.Dump();
    // No target directory exists without its /var parent: only logged, the load goes on.
    EXPECT_TRUE(HasLog(log_, "iscsi_load_modules_without_lock.cpp", "ORLOiSCSILoadModulesWithoutLock",
                       "mkdir(\"/var/crash\", S_IRWXU) failed, err=No such file or directory"))
        << log_.Dump();

    log_.Clear();
    ASSERT_EQ(ORLO_OK, ORLOiSCSIUnloadModules(ISCSI_KERNEL_MODULES)) << log_.Dump();
    EXPECT_EQ(Concat(core, {"tcm_loop"}), Modules());  // target_core_mod stays
    EXPECT_EQ(std::vector<std::string>{"Unloading module 'iscsi_target_mod'"}, Messages(log_, "Unloading"));
    ASSERT_EQ(ORLO_OK, ORLOiSCSIUnloadModules(LOOPBACK_KERNEL_MODULES)) << log_.Dump();
    EXPECT_EQ(core, Modules());

    log_.Clear();
    ASSERT_EQ(ORLO_OK, ORLOiSCSIUnloadModules(TCM_KERNEL_MODULES)) << log_.Dump();
    EXPECT_TRUE(Modules().empty());
    EXPECT_EQ(Prefixed("Unloading module '", Reversed(core)), Messages(log_, "Unloading")) << log_.Dump();
}

TEST_F(KernelModules, AModuleInUseStopsTheRemovalWalkWithItsCodeAndLines) {
    ASSERT_EQ(ORLO_OK, ORLOiSCSILoadModules(ISCSI_KERNEL_MODULES)) << log_.Dump();
    // A target node pins the iSCSI module, which pins the core module.
    ASSERT_EQ(0, mkdir(Cfg("/target/iscsi").c_str(), 0700));
    ASSERT_EQ(0, mkdir(Cfg("/target/iscsi/iqn.2000-01.com.orlo:busy").c_str(), 0700));

    EXPECT_EQ(ORLO_ERR_RMMOD, ORLOiSCSIUnloadModules(ISCSI_KERNEL_MODULES));
    EXPECT_EQ(Concat(Core(), {"iscsi_target_mod"}), Modules());
    EXPECT_TRUE(HasLog(log_, "kernel_modules.cpp", "rmmod_if_module_file_exist",
                       "syscall(__NR_delete_module, \"iscsi_target_mod\", O_NONBLOCK) failed, "
                       "err=Resource temporarily unavailable"))
        << log_.Dump();

    log_.Clear();
    EXPECT_EQ(ORLO_ERR_RMMOD, ORLOiSCSIUnloadModules(TCM_KERNEL_MODULES));
    // target_core_ep, _file and _iblock went, last first; target_core_mod is in use and
    // the walk stopped there, so orlo_extent_pool and rodsp_ep stay too.
    EXPECT_EQ((std::vector<std::string>{"rodsp_ep", "orlo_extent_pool", "target_core_mod", "iscsi_target_mod"}),
              Modules());
    EXPECT_EQ((std::vector<std::string>{"Unloading module 'target_core_ep'", "Unloading module 'target_core_file'",
                                        "Unloading module 'target_core_iblock'",
                                        "Unloading module 'target_core_mod'"}),
              Messages(log_, "Unloading"));
    const std::string err = "err=Failed to rmmod kernel module";
    EXPECT_TRUE(HasLog(log_, "kernel_modules.cpp", "rmmod_if_module_file_exist",
                       "syscall(__NR_delete_module, \"target_core_mod\", O_NONBLOCK) failed, "
                       "err=Resource temporarily unavailable"))
        << log_.Dump();
    EXPECT_TRUE(HasLog(log_, "kernel_modules.cpp", "rmmod_module_set",
                       "rmmod_if_module_file_exist(\"target_core_mod\") failed, " + err));
    EXPECT_TRUE(HasLog(log_, "iscsi_unload_modules_without_lock.cpp", "ORLOiSCSIUnloadModulesWithoutLock",
                       "rmmod_module_set(getTcmModuleSet()) failed, " + err));
    EXPECT_TRUE(HasLog(log_, "iscsi_unload_modules.cpp", "ORLOiSCSIUnloadModules",
                       "ORLOiSCSIUnloadModulesWithoutLock(module_set) failed, " + err));
}

TEST_F(KernelModules, AFailingInsmodEndsTheLoadAndBadSetNumbersAreRefused) {
    // The other generation's core is in: the kernel refuses target_core_mod's duplicate
    // symbols, and the modules after it are not tried.
    ASSERT_EQ(0, SimControl("modules", "insert rodsp_ep_4_0"));
    ASSERT_EQ(0, SimControl("modules", "insert target_core_mod_4_0"));
    EXPECT_EQ(ORLO_ERR_INSMOD, ORLOiSCSILoadModules(ISCSI_KERNEL_MODULES));
    const std::vector<std::string> after = {"rodsp_ep_4_0", "target_core_mod_4_0", "rodsp_ep", "orlo_extent_pool"};
    EXPECT_EQ(after, Modules());
    EXPECT_EQ((std::vector<std::string>{"Loading module 'rodsp_ep'", "Loading module 'orlo_extent_pool'",
                                        "Loading module 'target_core_mod'"}),
              Messages(log_, "Loading module"));
    const std::string err = "err=Failed to insmod kernel module";
    EXPECT_TRUE(HasLog(log_, "kernel_modules.cpp", "insmod_if_module_file_exist",
                       "OLIBCExec(\"/sbin/insmod\", \"/lib/modules/target_core_mod.ko\", nullptr, nullptr, "
                       "nullptr), ret=1"))
        << log_.Dump();
    EXPECT_TRUE(HasLog(log_, "kernel_modules.cpp", "insmod_module_set",
                       "insmod_if_module_file_exist(\"target_core_mod\") failed, " + err));
    EXPECT_TRUE(HasLog(log_, "iscsi_load_modules_without_lock.cpp", "ORLOiSCSILoadModulesWithoutLock",
                       "insmod_module_set(getTcmModuleSet()) failed, " + err));
    EXPECT_TRUE(HasLog(log_, "iscsi_load_modules.cpp", "ORLOiSCSILoadModules",
                       "ORLOiSCSILoadModulesWithoutLock(module_set) failed, " + err));

    log_.Clear();
    for (int set : {0, 5, -1}) {
        EXPECT_EQ(ORLO_ERR_BAD_PARAMETER, ORLOiSCSILoadModulesWithoutLock(set));
        EXPECT_EQ(ORLO_ERR_BAD_PARAMETER, ORLOiSCSIUnloadModulesWithoutLock(set));
        EXPECT_TRUE(HasLog(log_, "kernel_modules.cpp", "ModuleSetIsValid",
                           "invalid kernel module set: " + std::to_string(set)));
    }
    EXPECT_TRUE(Messages(log_, "Loading module").empty());
    EXPECT_TRUE(Messages(log_, "mkdir").empty());
    EXPECT_EQ(after, Modules());
}

}  // namespace
}  // namespace service_test
