// orloiscsi against the simulated kernel target: the reasons of a failure under its
// error line, objects named by --name as well as by position, and the overview with
// stored and kernel state side by side.
#include <gtest/gtest.h>
#include <json-c/json.h>
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

// A JSON document of the tool, read back by json-c (nullptr when it is not one document
// and a newline).
json_object *Parse(const std::string &text) {
    json_tokener *tok = json_tokener_new();
    json_object *doc = json_tokener_parse_ex(tok, text.c_str(), static_cast<int>(text.size()));
    bool complete = json_tokener_get_error(tok) == json_tokener_success &&
                    json_tokener_get_parse_end(tok) == text.size() && !text.empty() && text.back() == '\n';
    json_tokener_free(tok);
    if (!complete) {
        json_object_put(doc);
        return nullptr;
    }
    return doc;
}

json_object *At(json_object *o, const std::vector<std::string> &path) {
    for (const std::string &step : path) {
        if (o == nullptr) return nullptr;
        json_object *next = nullptr;
        if (json_object_is_type(o, json_type_array))
            next = json_object_array_get_idx(o, std::stoul(step));
        else if (!json_object_object_get_ex(o, step.c_str(), &next))
            return nullptr;
        o = next;
    }
    return o;
}

std::string Text(json_object *o) { return o == nullptr ? "<missing>" : json_object_to_json_string(o); }

TEST_F(OrloiscsiSession, OverviewShowsStoredAndKernelStateSideBySide) {
    const std::string odd = "odd \"name\" \\ \xc3\xa9";
    CreateLun("data");
    CreateLun(odd);
    CreateLun("spare");
    std::string out, err;
    ASSERT_EQ(0, Cli({"target", "create", "web", "--portal", "192.0.2.10:3260"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"map", "add", "web", "data"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"map", "add", "web", odd, "--lun", "3"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"acl", "add", "web", kHost1, "--rw"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"target", "create", "db", "--disabled"}, &out, &err)) << err;

    // Everything as stored is in the kernel: nothing is marked.
    ASSERT_EQ(0, Cli({"overview"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "service: running (target core lio4x); 1 of 2 targets running\n")) << out;
    EXPECT_TRUE(Has(out, "volumes\n  /volume1\n    LUN 1 'data'  FILE  1.0 MiB  loaded\n    LUN 2 '" + odd +
                             "'  FILE  1.0 MiB  loaded\n    LUN 3 'spare'  FILE  1.0 MiB  not loaded\n"))
        << out;
    EXPECT_TRUE(Has(out, "    state:  stored enabled, kernel running, no sessions\n")) << out;
    EXPECT_TRUE(Has(out, "    portals\n      192.0.2.10:3260  stored, in the kernel\n")) << out;
    EXPECT_TRUE(Has(out, "    LUNs\n      0  lid 1 'data'  in the kernel\n      3  lid 2 '" + odd +
                             "'  in the kernel\n"))
        << out;
    EXPECT_TRUE(Has(out, "      " + kHost1 + "  read-write  in the kernel\n")) << out;
    EXPECT_TRUE(Has(out, "  target 2 'db'  ")) << out;
    EXPECT_TRUE(Has(out, "    state:  stored disabled, kernel absent, not running\n")) << out;
    EXPECT_FALSE(Has(out, "!")) << out;
    EXPECT_TRUE(Has(out, "\nstored and kernel state agree\n")) << out;

    // Now the kernel and the files part ways: the target is switched off in the kernel
    // only, a mapping is written to the file only (for a LUN nothing loaded), and a node
    // no file knows appears.
    const std::string webIqn = IqnOf("web");
    ASSERT_EQ(0, Cli({"target", "disable", "web"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"target", "create", "app"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"conf", "put", "/usr/orlo/etc/iscsi_mapping.conf", "iSCSI_MAP_T3_L3", "tid=3", "lid=3", "lun=7"},
                     &out, &err))
        << err;
    ASSERT_EQ(0, mkdir(Cfg("/target/iscsi/iqn.2000-01.com.example:stray").c_str(), 0755));

    ASSERT_EQ(0, Cli({"overview"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "  target 1 'web'  " + webIqn + "\n    state:  stored enabled, kernel absent, not running\n"
                             "    auth:   none\n    ! stored enabled, but not in the kernel\n"))
        << out;
    EXPECT_TRUE(Has(out, "    ! LUN 7 is mapped in the file but missing from the kernel\n")) << out;
    EXPECT_TRUE(Has(out, "      7  lid 3 'spare'\n")) << out;
    EXPECT_TRUE(Has(out, "    LUN 3 'spare'  FILE  1.0 MiB  not loaded\n"
                         "      ! mapped into target 3, which is in the kernel, but not loaded\n"))
        << out;
    EXPECT_TRUE(Has(out, "in the kernel only\n  ! target node iqn.2000-01.com.example:stray (no stored target)\n")) << out;
    EXPECT_TRUE(Has(out, "\n4 differences between stored and kernel state\n")) << out;

    // The same tree as one JSON document.
    ASSERT_EQ(0, Cli({"--json", "overview"}, &out, &err)) << err;
    json_object *doc = Parse(out);
    ASSERT_NE(nullptr, doc) << out;
    EXPECT_EQ("4", Text(At(doc, {"differences"})));
    EXPECT_EQ("\"running\"", Text(At(doc, {"service", "state"})));
    EXPECT_EQ("1", Text(At(doc, {"service", "targets_running"})));
    EXPECT_EQ(odd, json_object_get_string(At(doc, {"volumes", "0", "luns", "1", "name"})));
    EXPECT_EQ("true", Text(At(doc, {"volumes", "0", "luns", "1", "loaded"})));
    EXPECT_EQ("[ \"mapped into target 3, which is in the kernel, but not loaded\" ]",
              Text(At(doc, {"volumes", "0", "luns", "2", "differences"})));
    EXPECT_EQ("\"web\"", Text(At(doc, {"targets", "0", "name"})));
    EXPECT_EQ("\"absent\"", Text(At(doc, {"targets", "0", "kernel"})));
    EXPECT_EQ("[ \"stored enabled, but not in the kernel\" ]", Text(At(doc, {"targets", "0", "differences"})));
    EXPECT_EQ("{ \"lun\": 3, \"lid\": 2, \"name\": \"odd \\\"name\\\" \\\\ \xc3\xa9\", \"stored\": true, \"kernel\": false }",
              Text(At(doc, {"targets", "0", "luns", "1"})));
    EXPECT_EQ("{ \"portal\": \"192.0.2.10:3260\", \"stored\": true, \"kernel\": false }",
              Text(At(doc, {"targets", "0", "portals", "0"})));
    EXPECT_EQ("\"app\"", Text(At(doc, {"targets", "2", "name"})));
    EXPECT_EQ("{ \"lun\": 7, \"lid\": 3, \"name\": \"spare\", \"stored\": true, \"kernel\": false }",
              Text(At(doc, {"targets", "2", "luns", "0"})));
    EXPECT_EQ("[ \"iqn.2000-01.com.example:stray\" ]", Text(At(doc, {"kernel_only", "targets"})));
    json_object_put(doc);
}

}  // namespace
