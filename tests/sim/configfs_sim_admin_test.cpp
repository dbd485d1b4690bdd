// An administrator's sessions against the simulated kernel target: mkdir, echo, ln -s,
// rmdir in the kernel's order and in wrong orders, each result and errno checked.
#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <set>
#include <string>

#include "platform/os_seam.h"
#include "support/configfs_sim_fixture.h"

namespace orlotest {
namespace {

const char kIqn[] = "iqn.2000-01.com.orlo:target-1";
const char kInit[] = "iqn.1991-05.com.example:host-a";

class SimAdmin : public ConfigfsSimTest {
  protected:
    int Mkdir(const std::string &p) { return mkdir(Cfg(p).c_str(), 0700) == 0 ? 0 : errno; }
    int Rmdir(const std::string &p) { return rmdir(Cfg(p).c_str()) == 0 ? 0 : errno; }
    int Unlink(const std::string &p) { return unlink(Cfg(p).c_str()) == 0 ? 0 : errno; }
    // ln -s with the absolute target the library uses.
    int Ln(const std::string &target, const std::string &link) {
        return symlink(Cfg(target).c_str(), Cfg(link).c_str()) == 0 ? 0 : errno;
    }
    // echo -n value > path: one write, the errno of whichever step failed.
    int Put(const std::string &p, const std::string &value) {
        int fd = open(Cfg(p).c_str(), O_WRONLY | O_TRUNC);
        if (fd < 0) return errno;
        ssize_t n = write(fd, value.data(), value.size());
        int err = n < 0 ? errno : 0;
        close(fd);
        return err;
    }
    std::string Get(const std::string &p) {
        int fd = open(Cfg(p).c_str(), O_RDONLY);
        if (fd < 0) return "<" + std::string(strerror(errno)) + ">";
        std::string s;
        char buf[8192];
        ssize_t n;
        while ((n = read(fd, buf, sizeof(buf))) > 0) s.append(buf, static_cast<size_t>(n));
        if (n < 0) s = "<" + std::string(strerror(errno)) + ">";
        close(fd);
        return s;
    }
    std::set<std::string> Ls(const std::string &p) {
        std::set<std::string> names;
        DIR *d = opendir(Cfg(p).c_str());
        if (d == nullptr) return names;
        while (struct dirent *e = readdir(d))
            if (strcmp(e->d_name, ".") != 0 && strcmp(e->d_name, "..") != 0) names.insert(e->d_name);
        closedir(d);
        return names;
    }
    bool Has(const std::string &p) {
        struct stat st;
        return lstat(Cfg(p).c_str(), &st) == 0;
    }
    // A file backstore under fileio_0, configured and enabled as LUN loading does it.
    void FileBackstore(const std::string &name) {
        WriteFile("/volume1/@iSCSI/LUN/" + name + ".img", "");
        std::string d = "/target/core/fileio_0/" + name;
        ASSERT_EQ(0, Mkdir(d));
        ASSERT_EQ(0, Put(d + "/control", "fd_dev_name=/volume1/@iSCSI/LUN/" + name +
                                             ".img,fd_dev_size=1048576,thin_provision=0,block_size=512,"
                                             "enable_sink=x,fd_dio=0"));
        ASSERT_EQ(0, Put(d + "/enable", "1"));
    }
    std::string Tpg() { return std::string("/target/iscsi/") + kIqn + "/tpgt_1"; }
    void Target() {
        ASSERT_EQ(0, Mkdir("/target/iscsi"));
        ASSERT_EQ(0, Mkdir(std::string("/target/iscsi/") + kIqn));
        ASSERT_EQ(0, Mkdir(Tpg()));
    }
};

TEST_F(SimAdmin, InsertedModulesDecideWhichTreesExistAndRemovalFollowsReferenceCounts) {
    // Nothing before the modules, and the control directory never shows.
    EXPECT_TRUE(Ls("/").empty());
    EXPECT_TRUE(Has("/.sim/modules"));
    EXPECT_EQ(EPERM, Mkdir("/target"));

    // Newer generation: all five hosts; the fabric needs its own module.
    ASSERT_EQ(0, InsertModuleSet(kTcmModules, 4));
    EXPECT_EQ((std::set<std::string>{"pool", "target", "vsys"}), Ls("/"));
    EXPECT_EQ((std::set<std::string>{"iblock_0", "fileio_0", "fileio_1", "epio_0", "epio_1"}), Ls("/target/core"));
    EXPECT_EQ(EINVAL, Mkdir("/target/iscsi"));
    EXPECT_EQ(EPERM, Rmdir("/target/core/fileio_0"));  // made by the kernel
    EXPECT_EQ(EEXIST, SimControl("modules", "insert target_core_mod\n"));
    EXPECT_EQ(ENOENT, SimControl("modules", "insert ib_isert\n"));  // its fabric is not in
    EXPECT_EQ(ENOEXEC, SimControl("modules", "insert no_such_module\n"));
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    EXPECT_EQ(ModuleSetNames(kTcmModules, 4).size() + 1, Modules().size());
    EXPECT_EQ("iscsi_target_mod", Modules().back());
    ASSERT_EQ(0, Mkdir("/target/iscsi"));
    ASSERT_EQ(0, Mkdir(std::string("/target/iscsi/") + kIqn));
    ASSERT_EQ(0, Mkdir("/target/core/fileio_0/LUN_a"));

    // Removal as the kernel's delete-module call answers it (through the library's seam).
    errno = 0;
    EXPECT_EQ(-1, orlo::os::DeleteModule("target_core_mod", 0));
    EXPECT_EQ(EWOULDBLOCK, errno);  // modules depend on it
    EXPECT_EQ(-1, orlo::os::DeleteModule("iscsi_target_mod", 0));
    EXPECT_EQ(EWOULDBLOCK, errno);  // a target node exists
    EXPECT_EQ(-1, orlo::os::DeleteModule("tcm_loop", 0));
    EXPECT_EQ(ENOENT, errno);
    ASSERT_EQ(0, Rmdir(std::string("/target/iscsi/") + kIqn));
    EXPECT_EQ(0, orlo::os::DeleteModule("iscsi_target_mod", 0));
    EXPECT_FALSE(Has("/target/iscsi"));  // the fabric went with its module
    EXPECT_EQ(EWOULDBLOCK, SimControl("modules", "remove target_core_file\n"));  // LUN_a
    ASSERT_EQ(0, Rmdir("/target/core/fileio_0/LUN_a"));
    const std::vector<std::string> core = ModuleSetNames(kTcmModules, 4);
    for (auto it = core.rbegin(); it != core.rend(); ++it)
        EXPECT_EQ(0, SimControl("modules", "remove " + *it + "\n")) << *it;
    EXPECT_TRUE(Modules().empty());
    EXPECT_TRUE(Ls("/").empty());

    // Older generation: file hosts, no extent-pool hosts; mixing generations is refused.
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 2));
    EXPECT_EQ((std::set<std::string>{"iblock_0", "fileio_0", "fileio_1"}), Ls("/target/core"));
    EXPECT_EQ(ENOEXEC, SimControl("modules", "insert target_core_mod\n"));
    EXPECT_EQ(0, Mkdir("/target/iscsi"));
}

TEST_F(SimAdmin, BackstoresNeedAControlStringAndAnOpenableFileBeforeEnable) {
    ASSERT_EQ(0, InsertModuleSet(kTcmModules, 4));
    const std::string d = "/target/core/fileio_0/LUN_f";
    ASSERT_EQ(0, Mkdir(d));
    std::set<std::string> files = Ls(d);
    for (const char *f : {"control", "enable", "info", "udev_path", "wwn", "attrib", "alua", "statistics", "pr"})
        EXPECT_EQ(1u, files.count(f)) << f;
    for (const char *f : {"uuid", "lun_name", "is_skip_resource_monitor", "emulate_sync_cache", "defer_queue_mode",
                          "hba_type", "block_size", "emulate_tpu"})
        EXPECT_EQ(1u, Ls(d + "/attrib").count(f)) << f;
    EXPECT_TRUE(Has(d + "/alua/default_tg_pt_gp/alua_access_type"));
    EXPECT_EQ("0\n", Get(d + "/enable"));
    EXPECT_EQ("fileio\n", Get(d + "/attrib/hba_type"));

    EXPECT_EQ(EINVAL, Put(d + "/enable", "1"));  // no control string yet
    ASSERT_EQ(0, Put(d + "/control", "fd_dev_name=/volume1/missing.img,fd_dev_size=4096"));
    EXPECT_EQ(ENOENT, Put(d + "/enable", "1"));  // the kernel cannot open the file
    WriteFile("/volume1/lun_f.img", "");
    EXPECT_EQ(EINVAL, Put(d + "/control", "fd_dev_name=/volume1/lun_f.img,fd_dev_size=12abc"));
    EXPECT_NE(std::string::npos, Get(d + "/info").find("DEACTIVATED"));
    EXPECT_NE(std::string::npos, Get(d + "/info").find("File: /volume1/lun_f.img  Size: 4096"))
        << "keys before the bad one stay applied";
    ASSERT_EQ(0, Put(d + "/control",
                     "fd_dev_name=/volume1/lun_f.img,fd_dev_size=1048576,thin_provision=1,block_size=4096,"
                     "enable_sink=6c1bd2a4-1111-2222-3333-444455556666,fd_dio=1"));
    EXPECT_EQ(0, Put(d + "/wwn/vpd_unit_serial", "6c1bd2a4-1111-2222-3333-444455556666"));
    EXPECT_EQ(0, Put(d + "/attrib/uuid", "6c1bd2a4-1111-2222-3333-444455556666"));
    EXPECT_EQ(EINVAL, Put(d + "/attrib/uuid", "not-a-uuid"));
    EXPECT_EQ(0, Put(d + "/attrib/lun_name", "LUN-1"));
    EXPECT_EQ(EINVAL, Put(d + "/attrib/lun_name", std::string(256, 'n')));
    EXPECT_EQ(0, Put(d + "/attrib/is_skip_resource_monitor", "1"));
    EXPECT_EQ(EINVAL, Put(d + "/attrib/emulate_sync_cache", "2"));
    EXPECT_EQ(0, Put(d + "/attrib/defer_queue_mode", "multi"));
    EXPECT_EQ(0, Put(d + "/alua/default_tg_pt_gp/alua_access_type", "1"));
    EXPECT_EQ("Implicit\n", Get(d + "/alua/default_tg_pt_gp/alua_access_type"));
    EXPECT_EQ(EINVAL, Put(d + "/alua/default_tg_pt_gp/alua_access_type", "4"));
    EXPECT_EQ(0, Put(d + "/enable", "1"));
    EXPECT_EQ(EEXIST, Put(d + "/enable", "1"));
    EXPECT_EQ(EINVAL, Put(d + "/enable", "0"));  // only "1" is understood
    EXPECT_EQ("1\n", Get(d + "/enable"));
    std::string info = Get(d + "/info");
    EXPECT_NE(std::string::npos, info.find("Status: ACTIVATED")) << info;
    EXPECT_NE(std::string::npos, info.find("File: /volume1/lun_f.img  Size: 1048576")) << info;
    EXPECT_NE(std::string::npos, info.find("Thin: 1  BlockSize: 4096")) << info;
    EXPECT_EQ("LUN-1\n", Get(d + "/attrib/lun_name"));
    EXPECT_EQ("T10 VPD Unit Serial Number: 6c1bd2a4-1111-2222-3333-444455556666\n", Get(d + "/wwn/vpd_unit_serial"));
    EXPECT_EQ(EACCES, open(Cfg(d + "/control").c_str(), O_RDONLY) < 0 ? errno : 0);  // write-only
    EXPECT_EQ(0, Rmdir(d));

    // A block backstore wants a block device; an extent-pool one its map file.
    const std::string b = "/target/core/iblock_0/LUN_b";
    ASSERT_EQ(0, Mkdir(b));
    WriteFile("/volume1/not_a_device", "");
    ASSERT_EQ(0, Put(b + "/control", "udev_path=/volume1/not_a_device"));
    EXPECT_EQ(ENOTBLK, Put(b + "/enable", "1"));
    ASSERT_EQ(0, Put(b + "/control", "udev_path=/dev/orlo-no-such-device"));
    EXPECT_EQ(ENOENT, Put(b + "/enable", "1"));  // /dev is never mapped into the sandbox
    EXPECT_EQ("iblock\n", Get(b + "/attrib/hba_type"));
    const std::string e = "/target/core/epio_0/LUN_e";
    ASSERT_EQ(0, Mkdir(e));
    EXPECT_TRUE(Has(e + "/info/device"));  // info is a group here, holding the clone report
    EXPECT_TRUE(Has(e + "/info/extent/child"));
    EXPECT_EQ(EINVAL, Put(e + "/enable", "1"));
    WriteFile("/volume1/@iSCSI/LUN/ADV/u/u_00000", "");
    ASSERT_EQ(0, Put(e + "/control", "ep_map_table=1,ep_dev_name=/volume1/@iSCSI/LUN/ADV/u/u_00000"));
    EXPECT_EQ(0, Put(e + "/enable", "1"));
    EXPECT_EQ(EEXIST, Put(e + "/control", "ep_dev_name=/volume1/other"));
    EXPECT_EQ("epio\n", Get(e + "/attrib/hba_type"));
}

TEST_F(SimAdmin, AttributeFilesAndDefaultGroupsBelongToTheKernel) {
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    Target();
    const std::string tpg = Tpg();
    EXPECT_EQ(EACCES, open(Cfg(tpg + "/attrib/new_file").c_str(), O_WRONLY | O_CREAT, 0644) < 0 ? errno : 0);
    EXPECT_EQ(EPERM, Unlink(tpg + "/attrib/authentication"));
    EXPECT_EQ(EPERM, Unlink(tpg + "/enable"));
    EXPECT_EQ(EPERM, Mkdir(tpg + "/attrib/sub"));
    EXPECT_EQ(EPERM, Mkdir(tpg + "/param/sub"));
    EXPECT_EQ(EPERM, Rmdir(tpg + "/attrib"));
    EXPECT_EQ(EPERM, Rmdir(tpg + "/np"));
    EXPECT_EQ(EPERM, Rmdir(std::string("/target/iscsi/") + kIqn + "/fabric_statistics"));
    EXPECT_EQ(ENOTDIR, Rmdir(tpg + "/enable"));
    EXPECT_EQ(EEXIST, Mkdir(tpg + "/enable"));
    EXPECT_EQ(EPERM, rename(Cfg(tpg + "/np").c_str(), Cfg(tpg + "/np2").c_str()) == 0 ? 0 : errno);
    // What the kernel made is all still there.
    EXPECT_EQ((std::set<std::string>{"acls", "attrib", "auth", "dynamic_sessions", "enable", "lun", "max_session",
                                     "np", "param"}),
              Ls(tpg));
    EXPECT_EQ("1\n", Get(tpg + "/attrib/authentication"));  // the kernel's default
}

TEST_F(SimAdmin, TargetBuiltAndDismantledInTheKernelsOrder) {
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    FileBackstore("LUN_a");
    Target();
    const std::string tpg = Tpg();
    const std::string acl = tpg + "/acls/" + kInit;
    ASSERT_EQ(0, Put(tpg + "/attrib/default_cmdsn_depth", "16"));
    ASSERT_EQ(0, Mkdir(tpg + "/np/192.168.1.10:3260"));
    ASSERT_EQ(0, Mkdir(tpg + "/np/[fe80::1]%2:3260"));
    ASSERT_EQ(0, Mkdir(tpg + "/np/127.0.0.1:3260"));
    ASSERT_EQ(0, Mkdir(tpg + "/lun/lun_0"));
    ASSERT_EQ(0, Ln("/target/core/fileio_0/LUN_a", tpg + "/lun/lun_0/LUN_a"));
    ASSERT_EQ(0, Mkdir(acl));
    EXPECT_EQ("16\n", Get(acl + "/cmdsn_depth"));  // taken from the portal group
    ASSERT_EQ(0, Mkdir(acl + "/lun_0"));
    ASSERT_EQ(0, Ln(tpg + "/lun/lun_0", acl + "/lun_0/lio_lun"));
    ASSERT_EQ(0, Put(acl + "/lun_0/write_protect", "1"));
    ASSERT_EQ(0, Put(tpg + "/enable", "1"));

    // Links read back relative, as the kernel's do, and lead to the same directory.
    char buf[512];
    ssize_t n = readlink(Cfg(tpg + "/lun/lun_0/LUN_a").c_str(), buf, sizeof(buf));
    ASSERT_GT(n, 0);
    EXPECT_EQ("../../../../../../target/core/fileio_0/LUN_a", std::string(buf, static_cast<size_t>(n)));
    n = readlink(Cfg(acl + "/lun_0/lio_lun").c_str(), buf, sizeof(buf));
    ASSERT_GT(n, 0);
    EXPECT_EQ(std::string("../../../../../../../target/iscsi/") + kIqn + "/tpgt_1/lun/lun_0",
              std::string(buf, static_cast<size_t>(n)));
    struct stat viaLink, direct;
    ASSERT_EQ(0, stat(Cfg(tpg + "/lun/lun_0/LUN_a").c_str(), &viaLink));
    ASSERT_EQ(0, stat(Cfg("/target/core/fileio_0/LUN_a").c_str(), &direct));
    EXPECT_EQ(direct.st_ino, viaLink.st_ino);
    EXPECT_EQ("1\n", Get(tpg + "/lun/lun_0/LUN_a/enable"));
    // A relative target works as well.
    ASSERT_EQ(0, Mkdir(tpg + "/lun/lun_1"));
    FileBackstore("LUN_b");
    EXPECT_EQ(0, symlink("../../../../../../target/core/fileio_0/LUN_b", Cfg(tpg + "/lun/lun_1/LUN_b").c_str())
                     ? errno
                     : 0);

    // Dismantled bottom-up as the unload does: no step fails and nothing is left.
    EXPECT_EQ(0, Put(tpg + "/enable", "0"));
    for (const std::string &np : Ls(tpg + "/np")) EXPECT_EQ(0, Rmdir(tpg + "/np/" + np)) << np;
    EXPECT_EQ(0, Unlink(acl + "/lun_0/lio_lun"));
    EXPECT_EQ(0, Rmdir(acl + "/lun_0"));
    EXPECT_EQ(0, Rmdir(acl));
    EXPECT_EQ(0, Unlink(tpg + "/lun/lun_0/LUN_a"));
    EXPECT_EQ(0, Rmdir(tpg + "/lun/lun_0"));
    EXPECT_EQ(0, Unlink(tpg + "/lun/lun_1/LUN_b"));
    EXPECT_EQ(0, Rmdir(tpg + "/lun/lun_1"));
    EXPECT_EQ(0, Rmdir(tpg));
    EXPECT_EQ(0, Rmdir(std::string("/target/iscsi/") + kIqn));
    EXPECT_EQ(0, Rmdir("/target/core/fileio_0/LUN_a"));
    EXPECT_EQ(0, Rmdir("/target/core/fileio_0/LUN_b"));
    EXPECT_TRUE(Ls("/target/iscsi").empty());
    EXPECT_TRUE(Ls("/target/core/fileio_0").count("LUN_a") == 0);
}

TEST_F(SimAdmin, WrongOrdersFailWithTheKernelsErrors) {
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    FileBackstore("LUN_a");
    ASSERT_EQ(0, Mkdir("/target/core/fileio_0/LUN_off"));  // never enabled
    Target();
    const std::string tpg = Tpg();
    const std::string acl = tpg + "/acls/" + kInit;

    // Names the kernel does not parse.
    EXPECT_EQ(EINVAL, Mkdir(tpg + "/np/192.168.1.10"));
    EXPECT_EQ(EINVAL, Mkdir(tpg + "/np/192.168.1.300:3260"));
    EXPECT_EQ(EINVAL, Mkdir(tpg + "/np/[fe80::1:3260"));
    EXPECT_EQ(EINVAL, Mkdir(tpg + "/np/10.0.0.1:70000"));
    EXPECT_EQ(EINVAL, Mkdir(std::string("/target/iscsi/") + kIqn + "/portal_1"));
    EXPECT_EQ(EINVAL, Mkdir(tpg + "/lun/lun_x"));
    EXPECT_EQ(EINVAL, Mkdir(tpg + "/acls/" + std::string(224, 'i')));

    // Links: only to configured backstores, one per LUN entry, never from attribute groups.
    ASSERT_EQ(0, Mkdir(tpg + "/lun/lun_0"));
    EXPECT_EQ(ENODEV, Ln("/target/core/fileio_0/LUN_off", tpg + "/lun/lun_0/LUN_off"));
    EXPECT_EQ(EINVAL, Ln(tpg + "/np", tpg + "/lun/lun_0/np"));
    EXPECT_EQ(ENOENT, Ln("/target/core/fileio_0/LUN_a/enable", tpg + "/lun/lun_0/x"));
    EXPECT_EQ(ENOENT, Ln("/target/core/fileio_0/LUN_none", tpg + "/lun/lun_0/x"));
    EXPECT_EQ(EPERM, symlink(Real("/volume1").c_str(), Cfg(tpg + "/lun/lun_0/x").c_str()) == 0 ? 0 : errno);
    ASSERT_EQ(0, Ln("/target/core/fileio_0/LUN_a", tpg + "/lun/lun_0/LUN_a"));
    EXPECT_EQ(EEXIST, Ln("/target/core/fileio_0/LUN_a", tpg + "/lun/lun_0/LUN_a"));
    FileBackstore("LUN_b");
    EXPECT_EQ(EEXIST, Ln("/target/core/fileio_0/LUN_b", tpg + "/lun/lun_0/LUN_b"));
    EXPECT_EQ(EPERM, Ln("/target/core/fileio_0/LUN_a", tpg + "/attrib/link"));
    // The LUN alua attributes need the link; without one they answer ENODEV.
    ASSERT_EQ(0, Mkdir(tpg + "/lun/lun_5"));
    EXPECT_EQ(ENODEV, Put(tpg + "/lun/lun_5/alua_tg_pt_offline", "1"));
    EXPECT_EQ(0, Put(tpg + "/lun/lun_0/alua_tg_pt_offline", "1"));
    // The initiator's LUN entry must lead to a LUN entry of its own portal group that has a device.
    ASSERT_EQ(0, Mkdir(acl));
    ASSERT_EQ(0, Mkdir(acl + "/lun_0"));
    EXPECT_EQ(EINVAL, Ln(tpg + "/lun/lun_5", acl + "/lun_0/lio_lun"));
    ASSERT_EQ(0, Mkdir(std::string("/target/iscsi/") + kIqn + "/tpgt_2"));
    ASSERT_EQ(0, Mkdir(std::string("/target/iscsi/") + kIqn + "/tpgt_2/lun/lun_0"));
    EXPECT_EQ(EINVAL, Ln(std::string("/target/iscsi/") + kIqn + "/tpgt_2/lun/lun_0", acl + "/lun_0/lio_lun"));
    ASSERT_EQ(0, Ln(tpg + "/lun/lun_0", acl + "/lun_0/lio_lun"));

    // Removal in the wrong order.
    EXPECT_EQ(EBUSY, Rmdir("/target/core/fileio_0/LUN_a"));        // a LUN entry links to it
    EXPECT_EQ(EWOULDBLOCK, SimControl("modules", "remove target_core_file\n"));
    EXPECT_EQ(ENOTEMPTY, Rmdir(tpg + "/lun/lun_0"));                // still holds its link
    EXPECT_EQ(ENOTEMPTY, Rmdir(acl));                               // holds lun_0
    EXPECT_EQ(ENOTEMPTY, Rmdir(tpg));                               // user-made entries inside
    EXPECT_EQ(ENOTEMPTY, Rmdir(std::string("/target/iscsi/") + kIqn));
    EXPECT_EQ(ENOTEMPTY, Rmdir("/target/iscsi"));
    EXPECT_EQ(0, Unlink(tpg + "/lun/lun_0/LUN_a"));
    EXPECT_EQ(EBUSY, Rmdir(tpg + "/lun/lun_0"));                    // the initiator's entry links to it
    EXPECT_EQ(EISDIR, Unlink(acl + "/lun_0"));
    EXPECT_EQ(ENOENT, Unlink(acl + "/lun_0/missing"));
    EXPECT_EQ(0, Unlink(acl + "/lun_0/lio_lun"));
    EXPECT_EQ(0, Rmdir(tpg + "/lun/lun_0"));
    EXPECT_EQ(0, Rmdir("/target/core/fileio_0/LUN_a"));            // free again
    EXPECT_EQ(ENOENT, Rmdir("/target/core/fileio_0/LUN_a"));
}

TEST_F(SimAdmin, WritesAreCheckedAsTheKernelChecksThem) {
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    Target();
    const std::string tpg = Tpg();
    struct Case {
        std::string file, value;
        int err;
        std::string reads;  // what a read shows afterwards ("" when unchanged/not checked)
    };
    const Case cases[] = {
        {"/attrib/authentication", "0", 0, "0\n"},
        {"/attrib/authentication", "1\n", 0, "1\n"},
        {"/attrib/authentication", "2", EINVAL, "1\n"},
        {"/attrib/authentication", "yes", EINVAL, ""},
        {"/attrib/default_cmdsn_depth", "0", EINVAL, ""},
        {"/attrib/default_cmdsn_depth", "1", 0, "1\n"},
        {"/attrib/default_cmdsn_depth", "0x20", 0, "32\n"},
        {"/attrib/default_cmdsn_depth", "513", EINVAL, "32\n"},
        {"/attrib/default_cmdsn_depth", "99999999999", ERANGE, ""},
        {"/attrib/generate_node_acls", "1", 0, "1\n"},
        {"/attrib/login_timeout", "4", EINVAL, "15\n"},
        {"/param/MaxRecvDataSegmentLength", "511", EINVAL, "8192\n"},
        {"/param/MaxRecvDataSegmentLength", "512", 0, "512\n"},
        {"/param/MaxXmitDataSegmentLength", "262144\n", 0, "262144\n"},
        {"/param/MaxXmitDataSegmentLength", "16777216", EINVAL, ""},
        {"/param/HeaderDigest", "CRC32C", 0, "CRC32C\n"},
        {"/param/HeaderDigest", "None", 0, "None\n"},
        {"/param/DataDigest", "CRC32C,None", 0, "CRC32C,None\n"},
        {"/param/DataDigest", "None,CRC32C", 0, "None,CRC32C\n"},
        {"/param/DataDigest", "CRC32", EINVAL, "None,CRC32C\n"},
        {"/param/DataDigest", "CRC32C,", EINVAL, ""},
        {"/param/TargetAlias", "Orlo Target", 0, "Orlo Target\n"},
        {"/param/InitialR2T", "Maybe", EINVAL, "Yes\n"},
        {"/max_session", "65535", 0, "65535\n"},
        {"/max_session", "65536", EINVAL, ""},
        {"/enable", "2", EINVAL, "0\n"},
        {"/auth/userid", "user", 0, "user\n"},
        {"/auth/password", std::string(256, 'p'), EINVAL, "\n"},
        {"/auth/userid_mutual", "mu", 0, "mu\n"},
        {"/auth/password_mutual", "mp", 0, "mp\n"},
        {"/auth/authenticate_target", "1", EACCES, "1\n"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.file + " <- " + c.value);
        EXPECT_EQ(c.err, Put(tpg + c.file, c.value)) << strerror(c.err);
        std::string now = Get(tpg + c.file);
        ASSERT_FALSE(now.empty());
        EXPECT_EQ('\n', now.back()) << "reads end in a newline";
        if (!c.reads.empty() && c.reads != "\n") {
            EXPECT_EQ(c.reads, now);
        }
    }
    // Initiator entries and extent-pool attributes.
    const std::string acl = tpg + "/acls/" + kInit;
    ASSERT_EQ(0, Mkdir(acl));
    EXPECT_EQ(EINVAL, Put(acl + "/cmdsn_depth", "0"));
    EXPECT_EQ(0, Put(acl + "/cmdsn_depth", "128"));
    EXPECT_EQ(EINVAL, Put(acl + "/attrib/nopin_timeout", "2"));
    EXPECT_EQ(0, Put(acl + "/attrib/nopin_timeout", "0"));
    EXPECT_EQ(EACCES, Put(acl + "/info", "x"));
    EXPECT_EQ(EACCES, Put(acl + "/param/MaxConnections", "2"));
    ASSERT_EQ(0, Mkdir("/pool/EP_1"));
    EXPECT_EQ(EINVAL, Mkdir("/pool/EP_one"));
    EXPECT_EQ(EINVAL, Put("/pool/EP_1/rod_enable", "1"));  // no path yet
    ASSERT_EQ(0, Put("/pool/EP_1/rod_path", "/volume1/@iSCSI/EP/EP_ROD"));
    EXPECT_EQ(ENOENT, Put("/pool/EP_1/rod_enable", "1"));
    WriteFile("/volume1/@iSCSI/EP/EP_ROD", "");
    EXPECT_EQ(0, Put("/pool/EP_1/rod_enable", "1"));
    EXPECT_EQ(EBUSY, Put("/pool/EP_1/rod_path", "/volume1/elsewhere"));
    EXPECT_EQ("0\n", Get("/pool/ext_jnl_enable"));
    EXPECT_EQ(EINVAL, Put("/pool/ext_jnl_enable", "2"));
    EXPECT_EQ(0, Put("/pool/ext_jnl_enable", "1"));
    EXPECT_EQ("1\n", Get("/pool/ext_jnl_enable"));
}

TEST_F(SimAdmin, TraceFaultsSessionsAndCloneProgressAreControlledFromBeside) {
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    Target();
    const std::string tpg = Tpg();
    ClearTrace();
    ASSERT_EQ(0, Mkdir(tpg + "/np/10.0.0.1:3260"));
    ASSERT_EQ(EINVAL, Put(tpg + "/attrib/authentication", "7"));
    ASSERT_EQ("0\n", Get(tpg + "/enable"));
    ASSERT_EQ(0, Rmdir(tpg + "/np/10.0.0.1:3260"));
    std::vector<SimOp> t = Trace();
    ASSERT_EQ(4u, t.size()) << TraceDump();
    EXPECT_EQ("mkdir", t[0].op);
    EXPECT_EQ(tpg + "/np/10.0.0.1:3260", t[0].path);
    EXPECT_EQ("0", t[0].result);
    EXPECT_EQ("write", t[1].op);
    EXPECT_EQ("7", t[1].value);
    EXPECT_EQ("EINVAL", t[1].result);
    EXPECT_EQ("read", t[2].op);
    EXPECT_EQ("0\n", t[2].value);
    EXPECT_EQ("rmdir", t[3].op);

    // Faults: once fires on the first match only; always until cleared; paths by pattern.
    ASSERT_EQ(0, SetFault("write", "*/attrib/default_cmdsn_depth", "EIO", true));
    EXPECT_EQ(EIO, Put(tpg + "/attrib/default_cmdsn_depth", "8"));
    EXPECT_EQ(0, Put(tpg + "/attrib/default_cmdsn_depth", "8"));
    ASSERT_EQ(0, SetFault("mkdir", "/target/iscsi/*/tpgt_1/lun/*", "ENOSPC", false));
    EXPECT_EQ(ENOSPC, Mkdir(tpg + "/lun/lun_0"));
    EXPECT_EQ(ENOSPC, Mkdir(tpg + "/lun/lun_1"));
    EXPECT_FALSE(Has(tpg + "/lun/lun_0"));
    ASSERT_EQ(0, SetFault("read", tpg + "/enable", "EACCES"));
    EXPECT_EQ("<" + std::string(strerror(EACCES)) + ">", Get(tpg + "/enable"));
    EXPECT_NE(std::string::npos, SimRead("faults").find("mkdir /target/iscsi/*/tpgt_1/lun/* ENOSPC always"));
    ASSERT_EQ(0, SimControl("faults", "clear\n"));
    EXPECT_EQ(0, Mkdir(tpg + "/lun/lun_0"));
    EXPECT_EQ(EINVAL, SetFault("chmod", "*", "EIO"));
    EXPECT_EQ(EINVAL, SetFault("write", "*", "ENOTANERRNO"));
    t = Trace();
    ASSERT_FALSE(t.empty());
    EXPECT_EQ("mkdir", t.back().op);
    EXPECT_EQ("0", t.back().result);

    // Sessions show in dynamic_sessions and the initiator's info; disabling drops them.
    ASSERT_EQ(0, Put(tpg + "/enable", "1"));
    ASSERT_EQ(0, Mkdir(tpg + "/acls/" + kInit));
    ASSERT_EQ(0, AddSession(kIqn, 1, kInit, "10.0.0.9", 1));
    ASSERT_EQ(0, AddSession(kIqn, 1, "iqn.1991-05.com.example:host-b", "10.0.0.10", 2));
    EXPECT_EQ(ENOENT, AddSession(kIqn, 7, kInit, "10.0.0.9", 1));
    EXPECT_EQ(std::string("IQN=") + kInit + ",IP=10.0.0.9,CID=1\nIQN=iqn.1991-05.com.example:host-b,IP=10.0.0.10,CID=2\n",
              Get(tpg + "/dynamic_sessions"));
    EXPECT_NE(std::string::npos, Get(tpg + "/acls/" + kInit + "/info").find("Address 10.0.0.9"));
    ASSERT_EQ(0, DropSession(kIqn, 1, "iqn.1991-05.com.example:host-b"));
    EXPECT_EQ(ENOENT, DropSession(kIqn, 1, "iqn.1991-05.com.example:host-b"));
    EXPECT_EQ(std::string("IQN=") + kInit + ",IP=10.0.0.9,CID=1\n", Get(tpg + "/dynamic_sessions"));
    ASSERT_EQ(0, Put(tpg + "/enable", "0"));
    EXPECT_EQ("", Get(tpg + "/dynamic_sessions"));
    EXPECT_EQ(std::string("No active iSCSI Session for Initiator Endpoint: ") + kInit + "\n",
              Get(tpg + "/acls/" + kInit + "/info"));

    // Clone: started through control, reported in info/extent/child until it completes.
    const std::string child = "/target/core/epio_0/LUN_child";
    ASSERT_EQ(0, Mkdir(child));
    EXPECT_EQ(EINVAL, Put(child + "/control", "ep_clone_parent=6c1bd2a4-1111-2222-3333-444455556666"))
        << "the parent's name comes first";
    ASSERT_EQ(0, Put(child + "/control", "ep_parent_name=LUN_parent"));
    ASSERT_EQ(0, Put(child + "/control", "ep_clone_parent=6c1bd2a4-1111-2222-3333-444455556666"));
    std::string info = Get(child + "/info/extent/child");
    EXPECT_NE(std::string::npos, info.find("clone_ongoing=1\n")) << info;
    EXPECT_NE(std::string::npos, info.find("parent_uuid=6c1bd2a4-1111-2222-3333-444455556666\n")) << info;
    ASSERT_EQ(0, SetCloneProgress(child, 40));
    EXPECT_NE(std::string::npos, Get(child + "/info/extent/child").find("progress=40\n"));
    ASSERT_EQ(0, SetCloneProgress(child, 100));
    EXPECT_NE(std::string::npos, Get(child + "/info/extent/child").find("clone_ongoing=0\n"));
    EXPECT_EQ(EINVAL, SetCloneProgress(child, 101));
    EXPECT_EQ(ENOENT, SetCloneProgress("/target/core/epio_0/none", 10));
    EXPECT_EQ(EINVAL, Put(child + "/control", "ep_relation_promote=1"));  // not a mirror
}

TEST_F(SimAdmin, InsmodStandInInsertsLikeInsmodAndFailsLikeIt) {
    std::string out, err;
    std::vector<std::string> argv = {Real("/sbin/insmod"), "/lib/modules/target_core_mod.ko"};
    EXPECT_EQ(0, RunProgram(argv, &out, &err)) << err;
    EXPECT_EQ(std::vector<std::string>{"target_core_mod"}, Modules());
    EXPECT_EQ(1, RunProgram(argv, &out, &err));
    EXPECT_NE(std::string::npos, err.find("could not insert module /lib/modules/target_core_mod.ko: File exists"))
        << err;
    EXPECT_EQ(1, RunProgram({Real("/sbin/insmod"), "/lib/modules/not_there.ko"}, &out, &err));
    EXPECT_NE(std::string::npos, err.find("No such file or directory")) << err;
    // The library runs it through the seam, without a shell.
    EXPECT_EQ(0, orlo::os::Run({"/sbin/insmod", "/lib/modules/target_core_file.ko"}));
    EXPECT_EQ((std::set<std::string>{"fileio_0", "fileio_1"}), Ls("/target/core"));
}

}  // namespace
}  // namespace orlotest
