// The command line itself, on a sandbox root without a kernel target: what is a usage
// mistake (exit 2) and what a failure (exit 1), "--", options after the action, the
// version, roots that cannot be used, JSON that json-c reads back, and bash completion.
#include <dirent.h>
#include <gtest/gtest.h>
#include <json-c/json.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fstream>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "support/sandbox.h"

namespace {

using orlotest::RunProgram;

bool Has(const std::string &text, const std::string &part) { return text.find(part) != std::string::npos; }

std::string Tool() { return orlotest::BuiltProgram("orloiscsi"); }

// Runs the tool with an environment and user of its own (uid -1: as the test).  The
// exit status; stdout and stderr into out and err.
int RunWith(const std::vector<std::string> &args, const char *sysroot, uid_t uid, std::string *out, std::string *err) {
    int o[2], e[2];
    if (pipe(o) != 0 || pipe(e) != 0) return -1;
    pid_t pid = fork();
    if (pid == 0) {
        dup2(o[1], 1);
        dup2(e[1], 2);
        for (int fd : {o[0], o[1], e[0], e[1]}) close(fd);
        if (sysroot != nullptr)
            setenv("ORLO_SYSROOT", sysroot, 1);
        else
            unsetenv("ORLO_SYSROOT");
        if (uid != static_cast<uid_t>(-1) && (setgid(uid) != 0 || setuid(uid) != 0)) _exit(126);
        std::vector<std::string> argv = {Tool()};
        argv.insert(argv.end(), args.begin(), args.end());
        std::vector<char *> raw;
        for (std::string &a : argv) raw.push_back(&a[0]);
        raw.push_back(nullptr);
        execv(raw[0], raw.data());
        _exit(127);
    }
    close(o[1]);
    close(e[1]);
    auto drain = [](int fd) {
        std::string s;
        char buf[4096];
        ssize_t n;
        while ((n = read(fd, buf, sizeof(buf))) > 0) s.append(buf, static_cast<size_t>(n));
        close(fd);
        return s;
    };
    *out = drain(o[0]);
    *err = drain(e[0]);
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

class OrloiscsiCommandLine : public orlotest::SandboxTest {
  protected:
    int Cli(std::vector<std::string> args, std::string *out = nullptr, std::string *err = nullptr) {
        std::vector<std::string> argv = {Tool(), "--root", root()};
        argv.insert(argv.end(), args.begin(), args.end());
        std::string o, e;
        int rc = RunProgram(argv, &o, &e);
        if (out != nullptr) *out = o;
        if (err != nullptr) *err = e;
        return rc;
    }
};

TEST_F(OrloiscsiCommandLine, UsageMistakesExitTwoWithAUsageLineAndFailuresExitOne) {
    std::string out, err;
    EXPECT_EQ(2, Cli({"lun", "show", "--colour", "red"}, &out, &err));
    EXPECT_EQ("orloiscsi: unknown option '--colour'\nusage: orloiscsi lun show LUN | --name NAME | --lid N | --uuid UUID\n",
              err);
    EXPECT_EQ("", out);
    EXPECT_EQ(2, Cli({"conf", "get", "/usr/orlo/etc/x.conf"}, &out, &err));
    EXPECT_EQ("orloiscsi: missing SECTION\nusage: orloiscsi conf get FILE SECTION\n", err);
    EXPECT_EQ(2, Cli({"target", "create", "x", "--max-sessions"}, &out, &err));
    EXPECT_TRUE(Has(err, "orloiscsi: --max-sessions needs a value\nusage: orloiscsi target create (NAME | --name NAME) [--iqn IQN]")) << err;
    EXPECT_EQ(2, Cli({"conf", "get", "/usr/orlo/etc/x.conf", "S", "extra"}, &out, &err));
    EXPECT_TRUE(Has(err, "unexpected argument 'extra'")) << err;
    // No object, an unknown object or action: the help of that level on stderr.
    EXPECT_EQ(2, Cli({"lunn", "list"}, &out, &err));
    EXPECT_TRUE(Has(err, "orloiscsi: unknown object 'lunn'\n")) << err;
    EXPECT_TRUE(Has(err, "Objects:")) << err;
    EXPECT_EQ(2, Cli({"lun", "lst"}, &out, &err));
    EXPECT_TRUE(Has(err, "orloiscsi: unknown action 'lun lst'\n")) << err;
    EXPECT_TRUE(Has(err, "  lock-status LUN | --name NAME")) << err;
    EXPECT_EQ(2, Cli({"lun"}, &out, &err));
    EXPECT_TRUE(Has(err, "give an ACTION of lun")) << err;
    EXPECT_EQ(2, Cli({}, &out, &err));
    // Rules of the actions themselves: one of several ways to name a thing, exclusive
    // global options, values the action checks.
    EXPECT_EQ(2, Cli({"lun", "show", "--lid", "3", "--uuid", "x"}, &out, &err));
    EXPECT_TRUE(Has(err, "give only one of LUN, --name, --lid or --uuid")) << err;
    EXPECT_EQ(2, Cli({"lun", "delete"}, &out, &err));
    EXPECT_TRUE(Has(err, "give one of LUN, --name, --lid or --uuid")) << err;
    EXPECT_EQ(2, Cli({"lun", "show", "a", "--name", "b"}, &out, &err));
    EXPECT_EQ(2, Cli({"--verbose", "--quiet", "lun", "list"}, &out, &err));
    EXPECT_EQ(2, Cli({"acl", "default", "t1", "everything"}, &out, &err));
    EXPECT_TRUE(Has(err, "orloiscsi: 'everything' is not none, read-only or read-write\nusage: orloiscsi acl default"))
        << err;
    EXPECT_EQ(2, Cli({"errstr", "12abc"}, &out, &err));
    EXPECT_EQ(2, RunProgram({Tool(), "--root", "", "lun", "list"}, &out, &err));
    EXPECT_TRUE(Has(err, "--root needs a directory")) << err;

    // The operation itself failing is 1, with the decoded code.
    EXPECT_EQ(1, Cli({"conf", "get", "/usr/orlo/etc/x.conf", "S"}, &out, &err));
    EXPECT_EQ("orloiscsi: there is no file /usr/orlo/etc/x.conf\nerror: 18990303 Failed to get section\n", err);
    EXPECT_EQ(1, Cli({"lun", "show", "nosuch"}, &out, &err));
    EXPECT_EQ("error: 18990531 No such LUN\n", err);
    EXPECT_EQ(1, Cli({"target", "status", "--name", "nosuch"}, &out, &err));
    EXPECT_TRUE(Has(err, "error: 18990713 No such target\n  err: ")) << err;
    EXPECT_TRUE(Has(err, "No such target, name: nosuch\n")) << "the lookup says what it looked for: " << err;
}

TEST_F(OrloiscsiCommandLine, DoubleDashEndsTheOptionsAndGlobalOptionsMayFollowTheAction) {
    std::string out, err;
    EXPECT_EQ(0, Cli({"errstr", "--", "-2"}, &out, &err)) << err;
    EXPECT_EQ("-2\tNo such file or directory\n", out);
    EXPECT_EQ(0, Cli({"errstr", "18990028", "-2"}, &out, &err)) << "a negative code needs no '--': " << err;
    EXPECT_EQ("18990028\tFailed to cerate directory\n-2\tNo such file or directory\n", out);
    // After "--" an option's name is a name: here a LUN's, there a key.
    EXPECT_EQ(1, Cli({"lun", "show", "--", "--json"}, &out, &err));
    EXPECT_EQ("error: 18990531 No such LUN\n", err);
    const std::string file = "/usr/orlo/etc/odd.conf";
    EXPECT_EQ(0, Cli({"conf", "put", file, "--", "S", "--replace=x"}, &out, &err)) << err;
    EXPECT_EQ(0, Cli({"conf", "get", file, "S"}, &out, &err)) << err;
    EXPECT_EQ("--replace=x\n", out);

    // --json, --root and --quiet after the object and action.
    EXPECT_EQ(0, Cli({"conf", "sections", file, "--json"}, &out, &err)) << err;
    EXPECT_EQ("[\"S\"]\n", out);
    EXPECT_EQ(0, RunProgram({Tool(), "conf", "put", "/usr/orlo/etc/late.conf", "T", "k=v", "--root", root()}, &out, &err))
        << err;
    EXPECT_EQ("[T]\n\tk=v\n", ReadFile("/usr/orlo/etc/late.conf"));

    EXPECT_EQ(0, Cli({"--version"}, &out, &err));
    EXPECT_EQ(std::string("orloiscsi ") + ORLO_PROJECT_VERSION + "\n", out);
    // Help on every level, as an option or as a word.
    std::string help;
    EXPECT_EQ(0, Cli({"lun", "--help"}, &help, &err));
    EXPECT_TRUE(Has(help, "usage: orloiscsi [OPTIONS] lun ACTION [ARGS]\n")) << help;
    EXPECT_EQ(0, Cli({"help", "lun"}, &out, &err));
    EXPECT_EQ(help, out);
    EXPECT_EQ(0, Cli({"lun", "help"}, &out, &err));
    EXPECT_EQ(help, out);
    EXPECT_EQ(0, Cli({"map", "add", "--help"}, &out, &err));
    EXPECT_TRUE(Has(out, "usage: orloiscsi map add TARGET LUN [--lun N]\n")) << out;
    EXPECT_TRUE(Has(out, "\n  --lun N ")) << out;
    EXPECT_TRUE(Has(out, " the LUN number initiators see (0..255)\n")) << out;
    EXPECT_EQ(2, Cli({"help", "nosuch"}, &out, &err));
}

TEST_F(OrloiscsiCommandLine, SecretsAreRefusedWhereverTheyStand) {
    std::string out, err;
    for (const std::vector<std::string> &args :
         {std::vector<std::string>{"--password=x", "target", "list"},
          std::vector<std::string>{"target", "update", "t", "--mutual-secret", "s"},
          std::vector<std::string>{"target", "create", "t", "--chap", "u", "--chap-secret=s"}}) {
        EXPECT_EQ(2, Cli(args, &out, &err));
        EXPECT_TRUE(Has(err, "CHAP secrets are never taken from the command line")) << err;
    }
    EXPECT_FALSE(Exists("/usr/orlo/etc/iscsi_target.conf"));
    // After "--" it is no option at all.
    EXPECT_EQ(2, Cli({"errstr", "--", "--secret"}, &out, &err));
    EXPECT_TRUE(Has(err, "'--secret' is not a result code")) << err;
}

TEST_F(OrloiscsiCommandLine, RootThatCannotBeUsedIsRefusedBeforeAnythingIsMade) {
    std::string out, err;
    WriteFile("/plain", "x");
    const std::string file = Real("/plain");
    EXPECT_EQ(1, RunProgram({Tool(), "--root", file, "target", "create", "t", "--disabled"}, &out, &err));
    EXPECT_EQ("orloiscsi: --root " + file + " cannot be used as the appliance root: Not a directory\n", err);
    EXPECT_EQ("", out);
    const std::string missing = Real("/missing");
    EXPECT_EQ(1, RunProgram({Tool(), "--root", missing, "lun", "list"}, &out, &err));
    EXPECT_EQ("orloiscsi: --root " + missing + " cannot be used as the appliance root: No such file or directory\n", err);
    EXPECT_FALSE(Exists("/missing"));
    EXPECT_EQ(1, RunWith({"service", "in-use"}, file.c_str(), static_cast<uid_t>(-1), &out, &err));
    EXPECT_EQ("orloiscsi: ORLO_SYSROOT=" + file + " cannot be used as the appliance root: Not a directory\n", err);
    // Decoding codes leaves the root alone.
    EXPECT_EQ(0, RunProgram({Tool(), "--root", file, "errstr", "-13"}, &out, &err)) << err;

    if (geteuid() != 0) GTEST_SKIP() << "the permission checks run the tool as nobody, which needs root";
    // A directory the caller may not write (0755) or not even enter (0700).
    for (mode_t mode : {0755, 0700}) {
        const std::string dir = orlotest::MakeTempDir("orlo-locked");
        ASSERT_FALSE(dir.empty());
        ASSERT_EQ(0, chmod(dir.c_str(), mode));
        int rc = RunWith({"--root", dir, "lun", "list"}, nullptr, 65534, &out, &err);
        int entries = 0;
        std::unique_ptr<DIR, int (*)(DIR *)> d(opendir(dir.c_str()), closedir);
        while (struct dirent *e = d ? readdir(d.get()) : nullptr) entries += e->d_name[0] != '.';
        EXPECT_EQ(1, rc) << std::oct << mode << ": " << err;
        EXPECT_EQ("orloiscsi: --root " + dir +
                      " cannot be used as the appliance root: Permission denied (the tool must read, write and "
                      "search it)\n",
                  err)
            << std::oct << mode;
        EXPECT_EQ(0, entries) << "nothing is made in a refused root";
        orlotest::RemoveTree(dir);
    }
}

// A JSON document of the tool, read back by json-c.
json_object *Parse(const std::string &text) {
    json_tokener *tok = json_tokener_new();
    json_object *doc = json_tokener_parse_ex(tok, text.c_str(), static_cast<int>(text.size()));
    bool complete = json_tokener_get_error(tok) == json_tokener_success &&
                    json_tokener_get_parse_end(tok) == text.size() && text.back() == '\n';
    json_tokener_free(tok);
    if (!complete) {
        json_object_put(doc);
        return nullptr;
    }
    return doc;
}

std::string StringOf(json_object *o) {
    return std::string(json_object_get_string(o), static_cast<size_t>(json_object_get_string_len(o)));
}

TEST_F(OrloiscsiCommandLine, JsonDocumentsReadBackByteForByte) {
    std::string out, err;
    const std::string file = "/usr/orlo/etc/odd.conf";
    const std::string section = "S \"quoted\" \\back\\slash \xc3\xa9 \x01";
    const std::string value = "v\"\\\t\x01\x7f\xff/end";
    ASSERT_EQ(0, Cli({"conf", "put", file, section, "k=" + value, "slash=/usr/orlo/etc"}, &out, &err)) << err;

    ASSERT_EQ(0, Cli({"--json", "conf", "get", file, section}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "\"slash\":\"/usr/orlo/etc\"")) << "slashes stay as they are: " << out;
    json_object *doc = Parse(out);
    ASSERT_NE(nullptr, doc) << out;
    json_object *v = nullptr;
    ASSERT_TRUE(json_object_object_get_ex(doc, "k", &v)) << out;
    EXPECT_EQ(value, StringOf(v));
    json_object_put(doc);

    ASSERT_EQ(0, Cli({"--json", "conf", "sections", file}, &out, &err)) << err;
    doc = Parse(out);
    ASSERT_NE(nullptr, doc) << out;
    ASSERT_EQ(1u, json_object_array_length(doc));
    EXPECT_EQ(section, StringOf(json_object_array_get_idx(doc, 0)));
    json_object_put(doc);

    // Target names as the library takes them (UTF-8), in a list of records.
    const std::string name = "we\"b\\\xc3\xa9 \xf0\x9f\x92\xbe \xe2\x80\xa8";
    ASSERT_EQ(0, Cli({"target", "create", name, "--disabled"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"target", "list", "--json"}, &out, &err)) << err;
    doc = Parse(out);
    ASSERT_NE(nullptr, doc) << out;
    ASSERT_EQ(1u, json_object_array_length(doc));
    ASSERT_TRUE(json_object_object_get_ex(json_object_array_get_idx(doc, 0), "name", &v));
    EXPECT_EQ(name, StringOf(v));
    json_object_put(doc);

    // Codes keep both readings of a negated errno value.
    ASSERT_EQ(0, Cli({"--json", "errstr", "--", "-2", "18990004"}, &out, &err)) << err;
    EXPECT_EQ("[{\"code\":4294967294,\"signed\":-2,\"message\":\"No such file or directory\"},"
              "{\"code\":18990004,\"signed\":18990004,\"message\":\"Bad parameter\"}]\n",
              out);
}

// Completes the words as bash would, with the completion script sourced; the offers,
// sorted.
std::vector<std::string> Complete(const std::vector<std::string> &words) {
    std::vector<std::string> argv = {"/bin/bash", "-c",
                                     "source \"$1\"; shift; COMP_WORDS=(\"$@\"); COMP_CWORD=$(($# - 1)); "
                                     "_orloiscsi; printf '%s\\n' \"${COMPREPLY[@]}\"",
                                     "bash", std::string(ORLO_SOURCE_DIR) + "/tools/completion/orloiscsi", Tool()};
    argv.insert(argv.end(), words.begin(), words.end());
    std::string out, err;
    EXPECT_EQ(0, RunProgram(argv, &out, &err)) << err;
    std::vector<std::string> offers;
    std::istringstream in(out);
    std::string line;
    while (std::getline(in, line))
        if (!line.empty()) offers.push_back(line);
    std::sort(offers.begin(), offers.end());
    return offers;
}

using Offers = std::vector<std::string>;

TEST_F(OrloiscsiCommandLine, BashCompletionOffersObjectsActionsOptionsAndNames) {
    // Two roots: the sandbox (ORLO_SYSROOT of every program run here) and another one
    // named with --root on the line being completed.
    const std::string other = orlotest::MakeTempDir("orlo-other");
    ASSERT_FALSE(other.empty());
    std::string out, err;
    for (const char *t : {"web", "db"})
        ASSERT_EQ(0, RunProgram({Tool(), "--root", other, "target", "create", t, "--disabled"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"target", "create", "elsewhere", "--disabled"}, &out, &err)) << err;
    std::string luns;
    for (int lid : {1, 2}) {
        std::string uuid = "0000000" + std::to_string(lid) + "-0000-4000-8000-000000000000";
        luns += "[LUN_" + uuid + "]\n\tlid=" + std::to_string(lid) + "\n\tname=" + (lid == 1 ? "data" : "logs") +
                "\n\trootpath=/volume1\n\tuuid=" + uuid + "\n\tvpd_unit_serial=s" + std::to_string(lid) +
                "\n\tbytes=1048576\n\trestored_time=0\n\tdevtype=1\n\tpre_alloc=yes\n\tbkp_obj=0\n\tvaai_support=no\n";
    }
    {
        std::string dir = other + "/usr/orlo/etc";
        std::ofstream(dir + "/iscsi_lun.conf") << luns;
    }
    ASSERT_EQ(0, RunProgram({Tool(), "--root", other, "lun", "list"}, &out, &err)) << err;
    ASSERT_TRUE(Has(out, "logs")) << out;

    Offers objects = Complete({""});
    EXPECT_TRUE(std::find(objects.begin(), objects.end(), "overview") != objects.end());
    EXPECT_TRUE(std::find(objects.begin(), objects.end(), "errstr") != objects.end());
    EXPECT_TRUE(std::find(objects.begin(), objects.end(), "help") == objects.end()) << "hidden actions are not offered";
    EXPECT_EQ(Offers({"list", "load", "lock-status"}), Complete({"--json", "lun", "l"}));
    EXPECT_EQ(Offers({"--data-digest", "--disabled"}), Complete({"target", "update", "web", "--d"}));
    EXPECT_EQ(Offers({"--json"}), Complete({"lun", "show", "--j"})) << "global options after the action too";

    // Names from the root on the line, wherever it stands.
    EXPECT_EQ(Offers({"data", "logs"}), Complete({"--root", other, "lun", "show", ""}));
    EXPECT_EQ(Offers({"logs"}), Complete({"lun", "delete", "--root=" + other, "--name", "l"}));
    EXPECT_EQ(Offers({"db", "web"}), Complete({"--root", other, "acl", "add", ""}));
    EXPECT_EQ(Offers({"db", "web"}), Complete({"--root", other, "acl", "list", "--name", ""}));
    EXPECT_EQ(Offers({"data", "logs"}), Complete({"--root", other, "map", "add", "web", ""}))
        << "the second positional of map add is a LUN";
    EXPECT_EQ(Offers({}), Complete({"--root", other, "acl", "add", "web", ""})) << "an initiator is not a target";
    EXPECT_EQ(Offers({"elsewhere"}), Complete({"target", "show", ""})) << "without --root: ORLO_SYSROOT";
    // Values the placeholder lists.
    EXPECT_EQ(Offers({"lio", "lio4x"}), Complete({"service", "version", "--set", ""}));
    EXPECT_EQ(Offers({"read-only", "read-write"}), Complete({"acl", "default", "web", "r"}));
    orlotest::RemoveTree(other);
}

}  // namespace
