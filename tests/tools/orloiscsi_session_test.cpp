// orloiscsi against the simulated kernel target: the reasons of a failure under its
// error line, objects named by --name as well as by position.
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

#include "support/configfs_sim_fixture.h"

namespace {

using orlotest::RunProgram;

const std::string kHost1 = "iqn.1991-05.com.example:host1";

bool Has(const std::string &text, const std::string &part) { return text.find(part) != std::string::npos; }

class OrloiscsiSession : public orlotest::ConfigfsSimTest {
  protected:
    void SetUp() override {
        ConfigfsSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        WriteFile("/etc.defaults/orloinfo.conf", "support_iscsi_target=\"yes\"\niscsi_target_type=\"lio4x\"\n");
        ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
        ASSERT_EQ(0, mkdir(Cfg("/target/iscsi").c_str(), 0700));
        ASSERT_EQ(0, mount("tmpfs", Real("/volume1").c_str(), "tmpfs", 0, "size=64m")) << strerror(errno);
        mounted_ = true;
    }
    void TearDown() override {
        if (mounted_) umount2(Real("/volume1").c_str(), MNT_DETACH);
        ConfigfsSimTest::TearDown();
    }
    int Cli(std::vector<std::string> args, std::string *out = nullptr, std::string *err = nullptr) {
        std::vector<std::string> argv = {orlotest::BuiltProgram("orloiscsi"), "--root", root()};
        argv.insert(argv.end(), args.begin(), args.end());
        std::string o, e;
        int rc = RunProgram(argv, &o, &e);
        if (out != nullptr) *out = o;
        if (err != nullptr) *err = e;
        return rc;
    }
    void CreateLun(const std::string &name) {
        std::string out, err;
        ASSERT_EQ(0, Cli({"lun", "create", "--name", name, "--type", "FILE", "--size", "1M", "--volume", "/volume1"},
                         &out, &err))
            << err;
    }
    std::string UuidOf(const std::string &lun) {
        std::string out;
        EXPECT_EQ(0, Cli({"lun", "show", lun}, &out));
        size_t at = out.find("uuid:");
        return at == std::string::npos ? std::string() : out.substr(out.find_first_not_of(' ', at + 5), 36);
    }
    std::string IqnOf(const std::string &target) {
        std::string out;
        EXPECT_EQ(0, Cli({"target", "show", target}, &out));
        size_t at = out.find("iqn:");
        size_t start = out.find_first_not_of(' ', at + 4);
        return out.substr(start, out.find('\n', start) - start);
    }

    bool mounted_ = false;
};

TEST_F(OrloiscsiSession, AFailureShowsTheLibrarysReasonsUnderItsErrorLine) {
    CreateLun("data");
    const std::string uuid = UuidOf("data");
    std::string out, err;
    ASSERT_EQ(0, SimControl("faults", "mkdir /target/core/fileio_0/LUN_* ENOSPC always"));
    EXPECT_EQ(1, Cli({"lun", "load", "data"}, &out, &err));
    // The decoded code first, then the step that failed with its logical path and the
    // errno's text; nothing of the sandbox's real path.
    const std::string head = "error: 18990028 Failed to cerate directory\n  err: iSCSI:iscsi_lun_load.cpp:";
    EXPECT_EQ(0u, err.find(head)) << err;
    EXPECT_TRUE(Has(err, "mkdir(\"/config/target/core/fileio_0/LUN_" + uuid +
                             "\", S_IRWXU) failed, err=No space left on device\n"))
        << err;
    EXPECT_FALSE(Has(err, root())) << err;
    EXPECT_EQ("", out);

    EXPECT_EQ(1, Cli({"--quiet", "lun", "load", "data"}, &out, &err));
    EXPECT_EQ("error: 18990028 Failed to cerate directory\n", err) << "--quiet keeps the error line only";
    ASSERT_EQ(0, SimControl("faults", "clear"));

    // On success the log lines stay out of sight, unless --verbose asks for the
    // informational ones too.
    EXPECT_EQ(0, Cli({"service", "stop"}, &out, &err));
    EXPECT_EQ("", err);
    EXPECT_EQ(0, Cli({"service", "start"}, &out, &err)) << err;
    EXPECT_FALSE(Has(err, "info: ")) << err;
    EXPECT_EQ(0, Cli({"service", "start", "--verbose"}, &out, &err)) << err;
    EXPECT_TRUE(Has(err, "  info: iSCSI:iscsi_start_all_without_lock.cpp:")) << err;
    EXPECT_TRUE(Has(err, "Successfully started iSCSI service.\n")) << err;
    EXPECT_EQ("started: modules in, LUNs loaded, every enabled target running\n", out) << "log lines go to stderr";
}

TEST_F(OrloiscsiSession, ObjectsAreNamedByPositionOrByTheOptionTheirCreateTakes) {
    CreateLun("data");
    std::string out, err, byName;
    ASSERT_EQ(0, Cli({"lun", "show", "data"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"lun", "show", "--name", "data"}, &byName, &err)) << err;
    EXPECT_EQ(out, byName);
    ASSERT_EQ(0, Cli({"lun", "show", "--name=data"}, &byName, &err)) << err;
    EXPECT_EQ(out, byName);

    // A target made with --name is found by --name, and by its place.
    ASSERT_EQ(0, Cli({"target", "create", "--name", "t1"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "created target 1 't1'")) << out;
    ASSERT_EQ(0, Cli({"target", "status", "--name", "t1"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "target 1 't1'")) << out;
    // The access list takes the target by --name and the initiator by its place.
    ASSERT_EQ(0, Cli({"acl", "add", "--name", "t1", kHost1, "--rw"}, &out, &err)) << err;
    EXPECT_EQ("target 1 't1': " + kHost1 + " may log in, read-write\n", out);
    ASSERT_EQ(0, Cli({"acl", "update", kHost1, "--name", "t1", "--ro"}, &out, &err)) << "wherever --name stands: " << err;
    EXPECT_EQ("target 1 't1': " + kHost1 + " is now read-only\n", out);
    ASSERT_EQ(0, Cli({"map", "add", "t1", "data"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"map", "list", "--name", "t1", "--json"}, &out, &err)) << err;
    EXPECT_EQ("[{\"tid\":1,\"target\":\"t1\",\"lun\":0,\"lid\":1,\"lun_name\":\"data\"}]\n", out);
    // Update renames with --name, so there the target is named by its place only.
    ASSERT_EQ(0, Cli({"target", "update", "t1", "--name", "web"}, &out, &err)) << err;
    EXPECT_EQ(2, Cli({"target", "update", "--name", "web", "--max-sessions", "2"}, &out, &err));
    EXPECT_TRUE(Has(err, "missing TARGET")) << err;
    // Both at once is a usage mistake.
    EXPECT_EQ(2, Cli({"target", "show", "web", "--name", "web"}, &out, &err));
    EXPECT_EQ(2, Cli({"acl", "list", "web", "--name", "web"}, &out, &err));
}

}  // namespace
