// An administrator's session with orloiscsi's target, map, acl, service and selftest
// commands against the simulated kernel target: targets with and without CHAP (secrets
// from files, standard input and the terminal, never from the command line and never
// shown), LUNs mapped into them, access lists, sessions, the service as a whole, and bad
// input refused with a clear message.
#include <gtest/gtest.h>
#include <fcntl.h>
#include <poll.h>
#include <stdlib.h>
#include <sys/ioctl.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

#include "support/configfs_sim_fixture.h"

namespace {

using orlotest::RunProgram;

const std::string kHost1 = "iqn.1991-05.com.example:host1";
const std::string kHost2 = "iqn.1991-05.com.example:host2";
const char kChapSecret[] = "chap-secret-1234";   // 16 bytes
const char kMutualSecret[] = "mutual-secret-99";  // 16 bytes

bool Has(const std::string &text, const std::string &part) { return text.find(part) != std::string::npos; }

class OrloiscsiTarget : public orlotest::ConfigfsSimTest {
  protected:
    void SetUp() override {
        ConfigfsSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        WriteFile("/etc.defaults/orloinfo.conf", "support_iscsi_target=\"yes\"\niscsi_target_type=\"lio4x\"\n");
        ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
        ASSERT_EQ(0, mkdir(Cfg("/target/iscsi").c_str(), 0700));
    }
    void TearDown() override {
        if (volumeMounted_) umount2(Real("/volume1").c_str(), MNT_DETACH);
        ConfigfsSimTest::TearDown();
    }
    // A tmpfs data volume at /volume1, for LUNs.
    void MountVolume() {
        ASSERT_EQ(0, mount("tmpfs", Real("/volume1").c_str(), "tmpfs", 0, "size=64m")) << strerror(errno);
        volumeMounted_ = true;
    }
    int Cli(std::vector<std::string> args, std::string *out = nullptr, std::string *err = nullptr,
            const std::string &input = std::string()) {
        std::vector<std::string> argv = {orlotest::BuiltProgram("orloiscsi"), "--root", root()};
        argv.insert(argv.end(), args.begin(), args.end());
        std::string o, e;
        int rc = RunProgram(argv, &o, &e, input);
        if (out != nullptr) *out = o;
        if (err != nullptr) *err = e;
        return rc;
    }
    // Value of "key:  value" in the text output of show.
    static std::string Field(const std::string &text, const std::string &key) {
        size_t at = text.find(key + ":");
        if (at == std::string::npos) return "";
        size_t start = text.find_first_not_of(' ', at + key.size() + 1);
        return text.substr(start, text.find('\n', start) - start);
    }
    std::string IqnOf(const std::string &target) {
        std::string out;
        EXPECT_EQ(0, Cli({"target", "show", target}, &out));
        return Field(out, "iqn");
    }
    std::string CfgRead(const std::string &inside) {
        std::string v = ReadFile("/config" + inside);
        while (!v.empty() && v.back() == '\n') v.pop_back();
        return v;
    }

    bool volumeMounted_ = false;
};

TEST_F(OrloiscsiTarget, CreateListShowWithSecretsFromFilesNeverShown) {
    std::string out, err;
    ASSERT_EQ(0, Cli({"target", "create", "plain", "--portal", "127.0.0.1:3260", "--portal", "[::1]:3261",
                      "--header-digest", "--max-sessions", "0"},
                     &out, &err))
        << err;
    EXPECT_TRUE(Has(out, "created target 1 'plain' iqn.2000-01.com.orlo-nas:")) << out;
    EXPECT_TRUE(Has(out, "running")) << out;

    // A secret file's trailing newline is not part of the secret; relative to the
    // appliance tree when absolute.
    WriteFile("/root/chap.secret", std::string(kChapSecret) + "\n", 0600);
    ASSERT_EQ(0, Cli({"target", "create", "guarded", "--iqn", "iqn.2024-01.com.example:guarded", "--chap", "bob",
                      "--secret-file", "/root/chap.secret"},
                     &out, &err))
        << err;
    EXPECT_TRUE(Has(out, "created target 2 'guarded' iqn.2024-01.com.example:guarded")) << out;
    EXPECT_TRUE(err.empty()) << "a 0600 secret file draws no warning: " << err;

    // Mutual CHAP: the one-way secret from a world-readable file (warned about), the
    // mutual one from standard input.
    WriteFile("/root/open.secret", std::string(kChapSecret) + "\r\n", 0644);
    ASSERT_EQ(0, Cli({"target", "create", "mutual", "--chap", "carol", "--secret-file", "/root/open.secret",
                      "--mutual-chap", "tgt", "--mutual-secret-file", "-", "--disabled"},
                     &out, &err, std::string(kMutualSecret) + "\n"))
        << err;
    EXPECT_TRUE(Has(err, "warning: /root/open.secret can be read by other users")) << err;
    EXPECT_TRUE(Has(out, "created target 3 'mutual'")) << out;
    EXPECT_TRUE(Has(out, "disabled")) << out;

    ASSERT_EQ(0, Cli({"target", "list"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "plain")) << out;
    EXPECT_TRUE(Has(out, "guarded")) << out;
    EXPECT_TRUE(Has(out, "mutual CHAP")) << out;
    std::string all = out;

    ASSERT_EQ(0, Cli({"target", "show", "plain"}, &out));
    all += out;
    const std::string plainIqn = Field(out, "iqn");
    EXPECT_EQ(0u, plainIqn.find("iqn.2000-01.com.orlo-nas:")) << out;
    EXPECT_EQ("plain", plainIqn.substr(plainIqn.size() - 5)) << "the generated IQN ends in the name: " << plainIqn;
    EXPECT_EQ("127.0.0.1:3260,[::1]:3261", Field(out, "portals"));
    EXPECT_EQ("CRC32C", Field(out, "header digest"));
    EXPECT_EQ("no limit", Field(out, "max sessions"));
    EXPECT_EQ("running", Field(out, "kernel"));
    EXPECT_EQ("none", Field(out, "authentication"));

    ASSERT_EQ(0, Cli({"target", "show", "2"}, &out));
    all += out;
    EXPECT_EQ("bob (secret set)", Field(out, "chap user")) << out;
    EXPECT_EQ("1", Field(out, "max sessions")) << "one session unless told otherwise";
    ASSERT_EQ(0, Cli({"--json", "target", "show", "mutual"}, &out));
    all += out;
    EXPECT_TRUE(Has(out, "\"auth\":\"mutual_chap\",\"chap_user\":\"carol\",\"mutual_chap_user\":\"tgt\"")) << out;
    EXPECT_TRUE(Has(out, "\"kernel\":\"absent\"")) << out;
    ASSERT_EQ(0, Cli({"--json", "target", "list"}, &out));
    all += out;
    EXPECT_EQ('[', out[0]);
    EXPECT_FALSE(Has(all, kChapSecret)) << all;
    EXPECT_FALSE(Has(all, kMutualSecret)) << all;
    EXPECT_FALSE(Has(ReadFile("/usr/orlo/etc/iscsi_target.conf"), kChapSecret)) << "stored enciphered";

    // The kernel got the secret exactly as the file held it, without its line end.
    const std::string auth = "/target/iscsi/iqn.2024-01.com.example:guarded/tpgt_1/auth";
    EXPECT_EQ("bob", CfgRead(auth + "/userid"));
    EXPECT_EQ(kChapSecret, CfgRead(auth + "/password"));
    ASSERT_EQ(0, Cli({"target", "enable", "mutual"}, &out, &err)) << err;
    const std::string mauth = "/target/iscsi/" + IqnOf("mutual") + "/tpgt_1/auth";
    EXPECT_EQ(kChapSecret, CfgRead(mauth + "/password"));
    EXPECT_EQ(kMutualSecret, CfgRead(mauth + "/password_mutual"));
}

TEST_F(OrloiscsiTarget, SecretsOnTheCommandLineOrWithoutASourceAreRefused) {
    std::string out, err;
    for (const std::vector<std::string> &bad :
         {std::vector<std::string>{"--chap", "bob", "--secret", "hunter2hunter2"},
          std::vector<std::string>{"--chap", "bob", "--password=hunter2hunter2"},
          std::vector<std::string>{"--chap", "bob", "--mutual-chap", "m", "--mutual-secret", "x"}}) {
        std::vector<std::string> args = {"target", "create", "leaky"};
        args.insert(args.end(), bad.begin(), bad.end());
        EXPECT_EQ(2, Cli(args, &out, &err));
        EXPECT_TRUE(Has(err, "never taken from the command line")) << err;
    }
    // No terminal to ask on and no file: refused before anything is stored.
    EXPECT_EQ(2, Cli({"target", "create", "leaky", "--chap", "bob"}, &out, &err));
    EXPECT_TRUE(Has(err, "no terminal to ask for the CHAP secret of 'bob'")) << err;
    EXPECT_EQ(2, Cli({"target", "create", "leaky", "--chap", "bob", "--secret-file", "-"}, &out, &err, "\n"));
    EXPECT_TRUE(Has(err, "CHAP secret is empty")) << err;
    EXPECT_EQ(2, Cli({"target", "create", "leaky", "--chap", "bob", "--secret-file", "/root/missing"}, &out, &err));
    EXPECT_TRUE(Has(err, "cannot read the CHAP secret from /root/missing")) << err;
    // Longer than the target file can keep enciphered.
    EXPECT_EQ(1, Cli({"target", "create", "leaky", "--chap", "bob", "--secret-file", "-"}, &out, &err,
                     "0123456789abcdefghi\n"));
    EXPECT_TRUE(Has(err, "error: 18990705 Bad target password")) << err;
    EXPECT_EQ(2, Cli({"target", "create", "leaky", "--mutual-chap", "m", "--mutual-secret-file", "-"}, &out, &err,
                     "abcdefghijkl\n"));
    EXPECT_TRUE(Has(err, "mutual CHAP needs one-way CHAP")) << err;
    EXPECT_FALSE(Exists("/usr/orlo/etc/iscsi_target.conf") &&
                 Has(ReadFile("/usr/orlo/etc/iscsi_target.conf"), "leaky"));
}

// Runs the tool with a pseudo-terminal as standard input and standard error, answering
// each prompt with one line.  Returns the exit status; *screen is what the terminal
// showed, *out the standard output.
int RunOnTerminal(const std::vector<std::string> &argv, const std::vector<std::string> &answers,
                  std::string *screen, std::string *out) {
    int master = posix_openpt(O_RDWR | O_NOCTTY);
    if (master < 0 || grantpt(master) != 0 || unlockpt(master) != 0) return -1;
    std::string slaveName = ptsname(master);
    int outPipe[2];
    if (pipe(outPipe) != 0) return -1;
    pid_t pid = fork();
    if (pid == 0) {
        setsid();
        int slave = open(slaveName.c_str(), O_RDWR);
        ioctl(slave, TIOCSCTTY, 0);
        dup2(slave, 0);
        dup2(slave, 2);
        dup2(outPipe[1], 1);
        close(slave);
        close(master);
        close(outPipe[0]);
        close(outPipe[1]);
        std::vector<char *> args;
        for (const std::string &a : argv) args.push_back(const_cast<char *>(a.c_str()));
        args.push_back(nullptr);
        execv(args[0], args.data());
        _exit(127);
    }
    close(outPipe[1]);
    // Each answer goes in only once its prompt is shown: the tool flushes pending input
    // when it switches echo off.
    size_t next = 0;
    for (;;) {
        struct pollfd p = {master, POLLIN, 0};
        if (poll(&p, 1, 10000) <= 0) break;
        char buf[256];
        ssize_t n = read(master, buf, sizeof(buf));
        if (n <= 0) break;  // EIO once the child has closed the terminal
        screen->append(buf, static_cast<size_t>(n));
        if (next < answers.size() && screen->size() >= 2 && screen->compare(screen->size() - 2, 2, ": ") == 0) {
            std::string line = answers[next++] + "\n";
            if (write(master, line.data(), line.size()) != static_cast<ssize_t>(line.size())) break;
        }
    }
    char buf[4096];
    ssize_t n;
    while ((n = read(outPipe[0], buf, sizeof(buf))) > 0) out->append(buf, static_cast<size_t>(n));
    close(outPipe[0]);
    close(master);
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

TEST_F(OrloiscsiTarget, SecretsAreAskedTwiceOnTheTerminalWithoutEcho) {
    const std::string tool = orlotest::BuiltProgram("orloiscsi");
    std::string screen, out;
    ASSERT_EQ(0, RunOnTerminal({tool, "--root", root(), "target", "create", "asked", "--disabled", "--chap", "dave"},
                               {kChapSecret, kChapSecret}, &screen, &out))
        << screen;
    EXPECT_TRUE(Has(screen, "CHAP secret for 'dave': ")) << screen;
    EXPECT_TRUE(Has(screen, "again: ")) << screen;
    EXPECT_FALSE(Has(screen, kChapSecret)) << "echo is off while the secret is typed: " << screen;
    EXPECT_TRUE(Has(out, "created target 1 'asked'")) << out;

    // Two different answers store nothing new.
    screen.clear();
    out.clear();
    EXPECT_EQ(2, RunOnTerminal({tool, "--root", root(), "target", "update", "asked", "--chap", "erin"},
                               {kChapSecret, kMutualSecret}, &screen, &out));
    EXPECT_TRUE(Has(screen, "the two CHAP secrets differ")) << screen;
    std::string show;
    ASSERT_EQ(0, Cli({"target", "show", "asked"}, &show));
    EXPECT_EQ("dave (secret set)", Field(show, "chap user")) << show;
}

TEST_F(OrloiscsiTarget, UpdateKeepsWhatIsNotGivenAndRestartsTheTarget) {
    std::string out, err;
    ASSERT_EQ(0, Cli({"target", "create", "alpha", "--chap", "bob", "--secret-file", "-", "--portal",
                      "192.0.2.1:3260", "--data-digest", "--max-recv-seg", "65536"},
                     &out, &err, std::string(kChapSecret) + "\n"))
        << err;
    const std::string iqn = IqnOf("alpha");
    ASSERT_EQ(0, Cli({"target", "update", "alpha", "--max-sessions", "4", "--no-portals"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "updated target 1 'alpha' (running)")) << out;
    ASSERT_EQ(0, Cli({"target", "show", "1"}, &out));
    EXPECT_EQ("4", Field(out, "max sessions"));
    EXPECT_EQ("(none configured)", Field(out, "portals"));
    EXPECT_EQ("bob (secret set)", Field(out, "chap user"));
    EXPECT_EQ("CRC32C", Field(out, "data digest"));
    EXPECT_EQ("65536", Field(out, "max recv segment"));
    EXPECT_EQ(iqn, Field(out, "iqn"));
    // The restarted node carries the kept secret and the new limit.
    const std::string tpg = "/target/iscsi/" + iqn + "/tpgt_1";
    EXPECT_EQ(kChapSecret, CfgRead(tpg + "/auth/password"));
    EXPECT_EQ("4", CfgRead(tpg + "/max_session"));

    // Rename, then CHAP off and the target stored disabled (out of the kernel).
    ASSERT_EQ(0, Cli({"target", "update", "alpha", "--name", "beta", "--no-chap", "--disabled"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"target", "show", "beta"}, &out, &err)) << err;
    EXPECT_EQ("none", Field(out, "authentication"));
    EXPECT_EQ("no", Field(out, "enabled"));
    EXPECT_EQ("absent", Field(out, "kernel"));
    EXPECT_EQ(1, Cli({"target", "show", "alpha"}, &out, &err));
    EXPECT_TRUE(Has(err, "error: 18990713 No such target")) << err;

    // Contradictions and a taken name change nothing.
    ASSERT_EQ(0, Cli({"target", "create", "gamma", "--disabled"}, &out, &err)) << err;
    EXPECT_EQ(1, Cli({"target", "update", "gamma", "--name", "beta"}, &out, &err));
    EXPECT_TRUE(Has(err, "a target named 'beta' exists already")) << err;
    EXPECT_EQ(1, Cli({"target", "update", "gamma", "--iqn", iqn}, &out, &err));
    EXPECT_TRUE(Has(err, "another target has the IQN")) << err;
    EXPECT_EQ(2, Cli({"target", "update", "gamma", "--enabled", "--disabled"}, &out, &err));
    EXPECT_EQ(2, Cli({"target", "update", "gamma"}, &out, &err));
    EXPECT_TRUE(Has(err, "nothing to change")) << err;
    EXPECT_EQ(2, Cli({"target", "update", "gamma", "--secret-file", "-"}, &out, &err, "abcdefghijkl\n"));
    EXPECT_TRUE(Has(err, "--secret-file needs CHAP")) << err;

    ASSERT_EQ(0, Cli({"target", "remove", "beta"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"target", "list"}, &out));
    EXPECT_FALSE(Has(out, "beta")) << out;
    EXPECT_TRUE(Has(out, "gamma")) << out;
}

TEST_F(OrloiscsiTarget, MapWithAndWithoutANumberAndList) {
    MountVolume();
    if (HasFatalFailure()) return;
    std::string out, err;
    for (const char *name : {"data", "logs", "spare"})
        ASSERT_EQ(0, Cli({"lun", "create", "--name", name, "--type", "FILE", "--size", "2M", "--volume", "/volume1"},
                         &out, &err))
            << err;
    ASSERT_EQ(0, Cli({"target", "create", "t1"}, &out, &err)) << err;
    const std::string tpg = "/target/iscsi/" + IqnOf("t1") + "/tpgt_1";

    ASSERT_EQ(0, Cli({"map", "add", "t1", "data", "--lun", "5"}, &out, &err)) << err;
    EXPECT_EQ("mapped LUN 1 'data' into target 1 't1' as LUN 5\n", out);
    ASSERT_EQ(0, Cli({"map", "add", "1", "2"}, &out, &err)) << err;  // tid and lid
    EXPECT_EQ("mapped LUN 2 'logs' into target 1 't1' as LUN 0\n", out) << "the smallest free number";
    EXPECT_TRUE(Exists("/config" + tpg + "/lun/lun_5"));
    EXPECT_TRUE(Exists("/config" + tpg + "/lun/lun_0"));

    // A taken number, a number out of range, a LUN mapped twice, unknown names.
    EXPECT_EQ(1, Cli({"map", "add", "t1", "spare", "--lun", "5"}, &out, &err));
    EXPECT_TRUE(Has(err, "error: 18990534 LUN is mapped")) << err;
    EXPECT_EQ(2, Cli({"map", "add", "t1", "spare", "--lun", "300"}, &out, &err));
    EXPECT_TRUE(Has(err, "--lun takes a LUN number from 0 to 255")) << err;
    EXPECT_EQ(2, Cli({"map", "add", "t1", "spare", "--lun", "-1"}, &out, &err));
    EXPECT_EQ(1, Cli({"map", "add", "t1", "nosuch"}, &out, &err));
    EXPECT_TRUE(Has(err, "error: 18990531 No such LUN")) << err;
    EXPECT_EQ(1, Cli({"map", "add", "nosuch", "spare"}, &out, &err));
    EXPECT_TRUE(Has(err, "error: 18990713 No such target")) << err;

    ASSERT_EQ(0, Cli({"map", "list", "t1"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "data")) << out;
    EXPECT_TRUE(Has(out, "logs")) << out;
    EXPECT_FALSE(Has(out, "spare")) << out;
    ASSERT_EQ(0, Cli({"--json", "map", "list"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "{\"tid\":1,\"target\":\"t1\",\"lun\":5,\"lid\":1,\"lun_name\":\"data\"}")) << out;
    EXPECT_TRUE(Has(out, "{\"tid\":1,\"target\":\"t1\",\"lun\":0,\"lid\":2,\"lun_name\":\"logs\"}")) << out;

    ASSERT_EQ(0, Cli({"map", "remove", "t1", "data"}, &out, &err)) << err;
    EXPECT_EQ("removed LUN 1 'data' (LUN 5) from target 1 't1'\n", out);
    EXPECT_FALSE(Exists("/config" + tpg + "/lun/lun_5"));
    EXPECT_EQ(1, Cli({"map", "remove", "t1", "data"}, &out, &err));
    EXPECT_TRUE(Has(err, "LUN 1 'data' is not mapped into target 1 't1'")) << err;
    ASSERT_EQ(0, Cli({"--json", "map", "list", "t1"}, &out, &err)) << err;
    EXPECT_EQ("[{\"tid\":1,\"target\":\"t1\",\"lun\":0,\"lid\":2,\"lun_name\":\"logs\"}]\n", out);
    // The freed number is the smallest free one again.
    ASSERT_EQ(0, Cli({"map", "add", "t1", "spare"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "as LUN 1")) << out;
}

TEST_F(OrloiscsiTarget, AccessListEntriesAndTheDefault) {
    std::string out, err;
    ASSERT_EQ(0, Cli({"target", "create", "t1"}, &out, &err)) << err;
    const std::string tpg = "/target/iscsi/" + IqnOf("t1") + "/tpgt_1";

    ASSERT_EQ(0, Cli({"acl", "add", "t1", kHost1, "--rw"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"acl", "add", "1", kHost2, "--none"}, &out, &err)) << err;
    EXPECT_TRUE(Exists("/config" + tpg + "/acls/" + kHost1)) << "a running target gets the node access list";
    ASSERT_EQ(0, Cli({"--json", "acl", "list", "t1"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "{\"initiator\":\"" + kHost1 +
                             "\",\"default\":false,\"authority\":3,\"permission\":\"read-write\"}"))
        << out;
    EXPECT_TRUE(Has(out, "\"initiator\":\"" + kHost2 + "\",\"default\":false,\"authority\":0")) << out;

    ASSERT_EQ(0, Cli({"acl", "update", "t1", kHost1, "--ro"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"acl", "default", "t1", "read-only"}, &out, &err)) << err;
    EXPECT_EQ("1", CfgRead(tpg + "/attrib/generate_node_acls"));
    EXPECT_EQ("1", CfgRead(tpg + "/attrib/demo_mode_write_protect"));
    ASSERT_EQ(0, Cli({"acl", "list", "t1"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, kHost1)) << out;
    EXPECT_TRUE(Has(out, "(default: every initiator not listed)")) << out;
    EXPECT_EQ(std::string::npos, out.find("read-write")) << out;
    ASSERT_EQ(0, Cli({"acl", "default", "t1", "none"}, &out, &err)) << err;
    EXPECT_EQ("0", CfgRead(tpg + "/attrib/generate_node_acls"));

    ASSERT_EQ(0, Cli({"acl", "remove", "t1", kHost2}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"acl", "list", "t1"}, &out, &err)) << err;
    EXPECT_FALSE(Has(out, kHost2)) << out;

    // Entries that exist or do not, names that are not iSCSI names, bad permissions.
    EXPECT_EQ(1, Cli({"acl", "add", "t1", kHost1, "--rw"}, &out, &err));
    EXPECT_TRUE(Has(err, "lists '" + kHost1 + "' already")) << err;
    EXPECT_EQ(1, Cli({"acl", "update", "t1", kHost2, "--rw"}, &out, &err));
    EXPECT_TRUE(Has(err, "does not list")) << err;
    EXPECT_EQ(1, Cli({"acl", "remove", "t1", kHost2}, &out, &err));
    EXPECT_TRUE(Has(err, "error: 18990711 Bad target acl")) << err;
    EXPECT_EQ(1, Cli({"acl", "add", "t1", "Host 3", "--rw"}, &out, &err));
    EXPECT_TRUE(Has(err, "'Host 3' is not an iSCSI initiator name")) << err;
    EXPECT_EQ(2, Cli({"acl", "add", "t1", kHost2, "--rw", "--ro"}, &out, &err));
    EXPECT_EQ(2, Cli({"acl", "add", "t1", kHost2}, &out, &err));
    EXPECT_EQ(2, Cli({"acl", "default", "t1", "everything"}, &out, &err));
}

TEST_F(OrloiscsiTarget, StatusAndSessionsFollowTheKernel) {
    std::string out, err;
    ASSERT_EQ(0, Cli({"target", "create", "t1"}, &out, &err)) << err;
    const std::string iqn = IqnOf("t1");
    ASSERT_EQ(0, Cli({"--json", "target", "status", "t1"}, &out, &err)) << err;
    EXPECT_EQ("{\"tid\":1,\"name\":\"t1\",\"enabled\":true,\"status\":3,\"kernel\":\"running\",\"connection\":0,"
              "\"connection_state\":\"no sessions\",\"sessions\":0,\"isns\":\"off\"}\n",
              out);

    ASSERT_EQ(0, AddSession(iqn, 1, kHost1, "192.0.2.7", 3));
    ASSERT_EQ(0, AddSession(iqn, 1, kHost2, "2001:db8::9", 1));
    ASSERT_EQ(0, Cli({"target", "status", "1"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "kernel:     running (status 3)")) << out;
    EXPECT_TRUE(Has(out, "connection: active")) << out;
    EXPECT_TRUE(Has(out, "sessions:   2")) << out;
    ASSERT_EQ(0, Cli({"--json", "target", "sessions", "t1"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "{\"initiator\":\"" + kHost1 + "\",\"ip\":\"192.0.2.7\",\"cid\":3}")) << out;
    EXPECT_TRUE(Has(out, "{\"initiator\":\"" + kHost2 + "\",\"ip\":\"2001:db8::9\",\"cid\":1}")) << out;
    ASSERT_EQ(0, DropSession(iqn, 1, kHost2));
    ASSERT_EQ(0, Cli({"target", "sessions", "t1"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, kHost1)) << out;
    EXPECT_FALSE(Has(out, kHost2)) << out;

    // Out of the kernel and back; the stored flag stays.
    ASSERT_EQ(0, Cli({"target", "disable", "t1"}, &out, &err)) << err;
    EXPECT_EQ("disabled target 1 't1': absent\n", out);
    ASSERT_EQ(0, Cli({"target", "status", "t1"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "kernel:     absent (status 0)")) << out;
    EXPECT_TRUE(Has(out, "connection: not running")) << out;
    EXPECT_TRUE(Has(out, "sessions:   0")) << out;
    ASSERT_EQ(0, Cli({"target", "enable", "t1"}, &out, &err)) << err;
    EXPECT_EQ("enabled target 1 't1': running\n", out);
    EXPECT_EQ("1", CfgRead("/target/iscsi/" + iqn + "/tpgt_1/enable"));
}

TEST_F(OrloiscsiTarget, ServiceStartRebuildsEnabledTargetsAndSelftest) {
    std::string out, err;
    ASSERT_EQ(0, Cli({"target", "create", "on"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"target", "create", "off", "--disabled"}, &out, &err)) << err;
    const std::string on = IqnOf("on"), off = IqnOf("off");
    ASSERT_EQ(0, Cli({"service", "stop"}, &out, &err)) << err;
    EXPECT_FALSE(Exists("/config/target/iscsi/" + on));
    ASSERT_EQ(0, Cli({"service", "start"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "started")) << out;
    EXPECT_EQ("1", CfgRead("/target/iscsi/" + on + "/tpgt_1/enable"));
    EXPECT_FALSE(Exists("/config/target/iscsi/" + off)) << "a target stored disabled stays out";
    // Starting a running service is fine.
    ASSERT_EQ(0, Cli({"service", "start"}, &out, &err)) << err;
    EXPECT_EQ(0, Cli({"service", "version"}, &out, &err)) << err;
    EXPECT_EQ("4 lio4x\n", out);
    EXPECT_EQ(2, Cli({"service", "version", "--set", "lio5"}, &out, &err));
    EXPECT_TRUE(Has(err, "--set takes lio or lio4x")) << err;
    // Switching generations is remembered in the defaults file, so the next process
    // sees it too; the enabled target comes back on the other core.
    ASSERT_EQ(0, Cli({"service", "version", "--set", "lio"}, &out, &err)) << err;
    EXPECT_EQ("2 lio\n", out);
    EXPECT_EQ(0, Cli({"--json", "service", "version"}, &out, &err)) << err;
    EXPECT_EQ("{\"version\":2,\"name\":\"lio\"}\n", out);
    EXPECT_EQ("1", CfgRead("/target/iscsi/" + on + "/tpgt_1/enable"));
    ASSERT_EQ(0, Cli({"service", "version", "--set", "LIO4X"}, &out, &err)) << err;
    EXPECT_EQ("4 lio4x\n", out);

    ASSERT_EQ(0, Cli({"selftest"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "self-test passed")) << out;
    WriteFile("/tmp/iscsitrg_dummy_test_forced_failure", "");
    EXPECT_EQ(1, Cli({"selftest"}, &out, &err));
    EXPECT_TRUE(Has(err, "error: ")) << err;
    EXPECT_EQ(2, Cli({"selftest", "now"}, &out, &err));
}

TEST_F(OrloiscsiTarget, BadInputIsRefusedWithAClearMessage) {
    std::string out, err;
    EXPECT_EQ(1, Cli({"target", "create", "x", "--iqn", "iqn.2024-13.com.example:x"}, &out, &err));
    EXPECT_TRUE(Has(err, "is not an iSCSI name")) << err;
    EXPECT_TRUE(Has(err, "error: 18990701 Bad target iqn")) << err;
    EXPECT_EQ(1, Cli({"target", "create", "42"}, &out, &err));
    EXPECT_TRUE(Has(err, "would be taken for a tid")) << err;
    EXPECT_EQ(1, Cli({"target", "show", "300"}, &out, &err));
    EXPECT_TRUE(Has(err, "tid 300 is out of range (1 to 256)")) << err;
    EXPECT_TRUE(Has(err, "error: 18990710 Bad target ID")) << err;
    EXPECT_EQ(1, Cli({"target", "status", "nosuch"}, &out, &err));
    EXPECT_TRUE(Has(err, "error: 18990713 No such target")) << err;
    EXPECT_EQ(2, Cli({"target", "create", "x", "--colour", "red"}, &out, &err));
    EXPECT_TRUE(Has(err, "unknown option '--colour'")) << err;
    EXPECT_EQ(2, Cli({"target", "create", "x", "--max-sessions"}, &out, &err));
    EXPECT_TRUE(Has(err, "--max-sessions needs a value")) << err;
    EXPECT_EQ(1, Cli({"target", "create", "x", "--max-recv-seg", "100"}, &out, &err));
    EXPECT_TRUE(Has(err, "--max-recv-seg takes a number from 512 to 16777215")) << err;
    for (const char *portal : {"192.0.2.1", "fe80::1:3260", "[fe80::1]3260", "192.0.2.300:3260", "192.0.2.1:0",
                               "192.0.2.1:70000", "[::1]:32x"}) {
        EXPECT_EQ(2, Cli({"target", "create", "x", "--portal", portal}, &out, &err)) << portal;
        EXPECT_TRUE(Has(err, "portal '")) << portal << ": " << err;
    }
    EXPECT_EQ(2, Cli({"target", "frobnicate"}, &out, &err));
    EXPECT_EQ(2, Cli({"target", "show"}, &out, &err));
    EXPECT_TRUE(Has(err, "usage: orloiscsi target show TARGET")) << err;
    EXPECT_EQ(0, Cli({"target", "--help"}, &out, &err));
    EXPECT_TRUE(Has(out, "sessions TARGET")) << out;
    ASSERT_EQ(0, Cli({"target", "create", "x"}, &out, &err)) << err;
    EXPECT_EQ(1, Cli({"target", "create", "x"}, &out, &err));
    EXPECT_TRUE(Has(err, "a target named 'x' exists already")) << err;
    // Nothing but the one good target was stored.
    ASSERT_EQ(0, Cli({"--json", "target", "list"}, &out, &err)) << err;
    EXPECT_EQ(1u, std::count(out.begin(), out.end(), '{')) << out;
}

}  // namespace
