// An administrator's snapshots with orloiscsi: block-level LUN snapshots on a Btrfs volume
// taken, listed, held, refused deletion while held, released and deleted; an advanced
// LUN's snapshot waited for while the (simulated) kernel's clone runs; what a killed
// creation left repaired; bad input refused with the library's codes and usage mistakes
// with exit status 2.
#include <dirent.h>
#include <gtest/gtest.h>
#include <json-c/json.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <memory>
#include <regex>
#include <string>
#include <thread>
#include <vector>

#include "support/configfs_sim_fixture.h"
#include "support/loop_volume.h"

namespace {

using orlotest::LoopVolume;
using orlotest::RunProgram;

struct JsonPut {
    void operator()(json_object *o) const { json_object_put(o); }
};
using JsonDoc = std::unique_ptr<json_object, JsonPut>;

// A whole JSON document of the tool, read back by json-c (null when it is not one).
JsonDoc Parse(const std::string &text) {
    json_tokener *tok = json_tokener_new();
    json_object *doc = json_tokener_parse_ex(tok, text.c_str(), static_cast<int>(text.size()));
    bool complete = json_tokener_get_error(tok) == json_tokener_success &&
                    json_tokener_get_parse_end(tok) == text.size() && !text.empty() && text.back() == '\n';
    json_tokener_free(tok);
    if (!complete) {
        json_object_put(doc);
        return nullptr;
    }
    return JsonDoc(doc);
}

json_object *Member(json_object *o, const char *key) {
    json_object *v = nullptr;
    return json_object_object_get_ex(o, key, &v) ? v : nullptr;
}

std::string Str(json_object *o, const char *key) {
    json_object *v = Member(o, key);
    return v != nullptr && json_object_is_type(v, json_type_string) ? json_object_get_string(v) : "(missing)";
}

int64_t Int(json_object *o, const char *key) {
    json_object *v = Member(o, key);
    return v != nullptr && json_object_is_type(v, json_type_int) ? json_object_get_int64(v) : -12345;
}

bool Has(const std::string &text, const std::string &part) { return text.find(part) != std::string::npos; }

class OrloiscsiSnapshot : public orlotest::ConfigfsSimTest {
  protected:
    void SetUp() override {
        ConfigfsSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        std::string why = LoopVolume::Unavailable(LoopVolume::Fs::kBtrfs);
        if (!why.empty()) GTEST_SKIP() << why;
        std::string err;
        ASSERT_TRUE(volume_.Create(LoopVolume::Fs::kBtrfs, 512ull << 20, Real("/volume1"), &err)) << err;
        WriteFile("/etc.defaults/orloinfo.conf", "support_iscsi_target=\"yes\"\niscsi_target_type=\"lio4x\"\n");
        ASSERT_EQ(0, InsertModuleSet(kTcmModules, 4));
    }
    void TearDown() override {
        // An advanced snapshot's background finish may still wait on the kernel's clone:
        // let every clone end so that it exits before the volume goes.
        for (const std::string &b : Backstores("LUN_")) SetCloneProgress("/target/core/epio_0/" + b, 100);
        for (int i = 0; i < 100 && !Backstores("_SN_").empty(); ++i) usleep(100 * 1000);
        volume_.Destroy();
        ConfigfsSimTest::TearDown();
    }
    std::vector<std::string> Prefix() const { return {orlotest::BuiltProgram("orloiscsi"), "--root", root()}; }
    int Cli(std::vector<std::string> args, std::string *out = nullptr, std::string *err = nullptr) {
        std::vector<std::string> argv = Prefix();
        argv.insert(argv.end(), args.begin(), args.end());
        std::string o, e;
        int rc = RunProgram(argv, &o, &e);
        if (out != nullptr) *out = o;
        if (err != nullptr) *err = e;
        return rc;
    }
    // The JSON document an action prints (null, with a test failure, when it fails).
    JsonDoc CliJson(std::vector<std::string> args) {
        args.insert(args.begin(), "--json");
        std::string out, err;
        int rc = Cli(args, &out, &err);
        EXPECT_EQ(0, rc) << err;
        JsonDoc doc = Parse(out);
        EXPECT_NE(nullptr, doc) << "not one JSON document: " << out;
        return doc;
    }
    std::string LunUuid(const std::string &name) {
        JsonDoc doc = CliJson({"lun", "show", name});
        return doc ? Str(doc.get(), "uuid") : std::string();
    }
    // Backstores of the extent pool's host whose names contain part.
    std::vector<std::string> Backstores(const std::string &part) {
        std::vector<std::string> out;
        DIR *d = opendir(Cfg("/target/core/epio_0").c_str());
        if (d == nullptr) return out;
        while (struct dirent *e = readdir(d))
            if (std::string(e->d_name).find(part) != std::string::npos) out.push_back(e->d_name);
        closedir(d);
        return out;
    }
    // Whether a file can be made in a directory of the volume (a read-only snapshot refuses).
    bool Writable(const std::string &dir) {
        std::string probe = Real(dir) + "/probe";
        FILE *f = fopen(probe.c_str(), "w");
        if (f == nullptr) return false;
        fclose(f);
        unlink(probe.c_str());
        return true;
    }
    LoopVolume volume_;
};

TEST_F(OrloiscsiSnapshot, BlockSnapshotsTakenListedHeldRefusedReleasedAndDeleted) {
    std::string out, err;
    ASSERT_EQ(0, Cli({"lun", "create", "--name", "blk", "--type", "BLUN", "--size", "64M", "--volume", "/volume1"},
                     &out, &err))
        << err;
    const std::string lunUuid = LunUuid("blk");
    ASSERT_EQ(36u, lunUuid.size());
    const std::string snapDir = "/volume1/@iSCSI/Snapshot/BLUN/" + lunUuid + "/";
    const std::string snapFile = "/volume1/@iSCSI/Snapshot/iscsi_snapshot_" + lunUuid + ".conf";

    // Taken by the name given, then by the default name; the user named in the record.
    ASSERT_EQ(0, RunProgram({"/usr/bin/env", "-u", "SUDO_USER", "USER=alice", Prefix()[0], "--root", root(), "snapshot",
                             "create", "blk", "--name", "before upgrade", "--note", "nightly job off"},
                            &out, &err))
        << err;
    EXPECT_TRUE(std::regex_search(out, std::regex("^took snapshot 1 'before upgrade' of LUN 'blk', uuid [0-9a-f-]{36}: "
                                                  "Healthy\n$")))
        << out;
    ASSERT_EQ(0, RunProgram({"/usr/bin/env", "-i", Prefix()[0], "--root", root(), "snapshot", "create", "blk",
                             "--wait", "--progress"},
                            &out, &err))
        << err;
    EXPECT_TRUE(Has(out, "took snapshot 2 'SnapShot-1' of LUN 'blk'")) << out;
    EXPECT_EQ("", err) << "a block-level snapshot is done at once: no clone to wait for";

    JsonDoc list = CliJson({"snapshot", "list", "blk"});
    ASSERT_TRUE(list);
    ASSERT_EQ(2u, json_object_array_length(list.get()));
    json_object *first = json_object_array_get_idx(list.get(), 0), *second = json_object_array_get_idx(list.get(), 1);
    EXPECT_EQ(1, Int(first, "sid"));
    EXPECT_EQ("before upgrade", Str(first, "name"));
    EXPECT_EQ("nightly job off", Str(first, "note"));
    EXPECT_EQ("alice", Str(first, "taken_by"));
    EXPECT_EQ("orloiscsi", Str(second, "taken_by")) << "nobody named in the environment";
    EXPECT_EQ("BLUN", Str(first, "type"));
    EXPECT_EQ("Healthy", Str(first, "status"));
    EXPECT_EQ("blk", Str(first, "lun"));
    EXPECT_EQ(64 << 20, Int(first, "total_size"));
    EXPECT_TRUE(std::regex_match(Str(first, "taken_at"), std::regex("\\d{4}-\\d\\d-\\d\\d \\d\\d:\\d\\d:\\d\\d")));
    EXPECT_EQ(0u, json_object_array_length(Member(first, "held_by")));
    const std::string uuid1 = Str(first, "uuid"), uuid2 = Str(second, "uuid");
    ASSERT_EQ(36u, uuid1.size());
    EXPECT_TRUE(Exists(snapDir + uuid1));
    EXPECT_FALSE(Writable(snapDir + uuid1)) << "a block snapshot is a read-only subvolume";

    // Held by an application: the checked deletion is refused and nothing goes.
    ASSERT_EQ(0, Cli({"snapshot", "hold", "blk", "before upgrade", "backup-app"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"snapshot", "hold", "--uuid", uuid1, "replica"}, &out, &err)) << err;
    EXPECT_EQ("backup-app\nreplica\n", ReadFile("/tmp/iscsi/snapshot_app_lock/SN_" + uuid1 + ".app.lock"));
    EXPECT_EQ(1, Cli({"snapshot", "delete", "blk", "--sid", "1"}, &out, &err));
    EXPECT_TRUE(Has(err, "error: 18990540 ")) << err;
    EXPECT_TRUE(Has(err, "locked by app")) << "the library's reason follows: " << err;
    EXPECT_TRUE(Exists(snapDir + uuid1));
    EXPECT_TRUE(Has(ReadFile(snapFile), "[SNAPSHOT_" + uuid1 + "]"));

    ASSERT_EQ(0, Cli({"snapshot", "list"}, &out, &err)) << err;
    EXPECT_TRUE(std::regex_search(out, std::regex("\nblk +1 before upgrade +BLUN +Healthy .* no +backup-app,replica\n")))
        << out;
    EXPECT_TRUE(std::regex_search(out, std::regex("\nblk +2 SnapShot-1 +BLUN .* no +-\n"))) << out;
    ASSERT_EQ(0, Cli({"snapshot", "holds", "blk", "--sid", "1"}, &out, &err)) << err;
    EXPECT_EQ("backup-app\nreplica\n", out);

    ASSERT_EQ(0, Cli({"snapshot", "release", "blk", "--sid", "1", "backup-app"}, &out, &err)) << err;
    JsonDoc holds = CliJson({"snapshot", "release", "--uuid", uuid1, "replica"});
    ASSERT_TRUE(holds);
    EXPECT_EQ(0u, json_object_array_length(Member(holds.get(), "held_by")));
    ASSERT_EQ(0, Cli({"snapshot", "delete", "blk", "before upgrade"}, &out, &err)) << err;
    EXPECT_EQ("deleted snapshot 1 'before upgrade' of LUN 'blk'\n", out);
    EXPECT_FALSE(Exists(snapDir + uuid1));
    EXPECT_FALSE(Has(ReadFile(snapFile), uuid1));

    // Found by UUID also when the cache in /tmp was lost; --ignore-holds passes a holder by.
    orlotest::RemoveTree(Real("/tmp/iscsi/snapshot_cache"));
    JsonDoc shown = CliJson({"snapshot", "show", "--uuid", uuid2});
    ASSERT_TRUE(shown);
    EXPECT_EQ("SnapShot-1", Str(shown.get(), "name"));
    ASSERT_EQ(0, Cli({"snapshot", "hold", "blk", "SnapShot-1", "backup-app"}, &out, &err)) << err;
    EXPECT_EQ(1, Cli({"snapshot", "delete", "--uuid", uuid2}, &out, &err));
    ASSERT_EQ(0, Cli({"snapshot", "delete", "--uuid", uuid2, "--ignore-holds"}, &out, &err)) << err;
    EXPECT_FALSE(Exists(snapDir + uuid2));
    EXPECT_FALSE(Exists("/volume1/@iSCSI/Snapshot/BLUN/" + lunUuid)) << "the LUN's directory goes with its last one";
    ASSERT_EQ(0, Cli({"snapshot", "list", "blk"}, &out, &err)) << err;
    EXPECT_EQ(std::string::npos, out.find('\n', out.find('\n') + 1)) << "only the header is left: " << out;
}

TEST_F(OrloiscsiSnapshot, AdvancedSnapshotWaitsForTheKernelsCloneAndARealOneSecondTimeout) {
    std::string out, err;
    ASSERT_EQ(0, Cli({"lun", "create", "--name", "adv", "--type", "ADV", "--size", "64M", "--volume", "/volume1"},
                     &out, &err))
        << err;
    const std::string lunUuid = LunUuid("adv");

    // The creation waits while the clone runs, drawing its progress, and ends Healthy.
    std::atomic<bool> finished{false};
    int rc = -1;
    std::string wOut, wErr;
    std::thread creator([&] {
        rc = Cli({"--json", "snapshot", "create", "adv", "--name", "s1", "--wait", "--progress"}, &wOut, &wErr);
        finished = true;
    });
    std::vector<std::string> child;
    for (int i = 0; i < 200 && child.empty(); ++i) {
        child = Backstores("_SN_");
        if (child.empty()) usleep(50 * 1000);
    }
    ASSERT_EQ(1u, child.size()) << "the snapshot's backstore in the kernel";
    EXPECT_EQ(0u, child[0].find("LUN_" + lunUuid + "_SN_")) << child[0];
    const std::string backstore = "/target/core/epio_0/" + child[0];
    ASSERT_EQ(0, SetCloneProgress(backstore, 40));
    usleep(1500 * 1000);
    EXPECT_FALSE(finished.load()) << "--wait returned before the clone ended: " << wErr;
    ASSERT_EQ(0, SetCloneProgress(backstore, 100));
    creator.join();
    ASSERT_EQ(0, rc) << wErr;
    EXPECT_TRUE(Has(wErr, " 40% of 64.0 MiB cloned")) << wErr;
    EXPECT_TRUE(Has(wErr, "100% of 64.0 MiB cloned\n")) << wErr;
    JsonDoc made = Parse(wOut);
    ASSERT_TRUE(made) << wOut;
    EXPECT_EQ("Healthy", Str(made.get(), "status"));
    EXPECT_EQ(36u, Str(made.get(), "version").size()) << "the clone's version is recorded";
    EXPECT_FALSE(json_object_get_boolean(Member(made.get(), "background")));
    EXPECT_TRUE(Backstores("_SN_").empty()) << "the finished snapshot leaves the kernel";
    const std::string uuid1 = Str(made.get(), "uuid");
    EXPECT_TRUE(Exists("/volume1/@iSCSI/Snapshot/ADV/" + lunUuid + "/" + uuid1 + "/" + uuid1 + "_00000"));

    // Without --wait the snapshot finishes in the background, locked meanwhile.
    ASSERT_EQ(0, Cli({"snapshot", "create", "adv"}, &out, &err)) << err;
    EXPECT_TRUE(Has(out, "took snapshot 2 'SnapShot-1' of LUN 'adv'")) << out;
    EXPECT_TRUE(Has(out, ": Unhealthy (finishing in the background)\n")) << out;
    ASSERT_EQ(0, Cli({"snapshot", "lock-status", "adv", "SnapShot-1"}, &out, &err)) << err;
    EXPECT_EQ("snapshot 2 'SnapShot-1' of LUN 'adv': locked (creating)\n", out);
    ASSERT_EQ(0, Cli({"snapshot", "list", "adv"}, &out, &err)) << err;
    EXPECT_TRUE(std::regex_search(out, std::regex("\nadv +2 SnapShot-1 +ADV +Unhealthy .* creating +-\n"))) << out;
    EXPECT_EQ(1, Cli({"snapshot", "wait", "adv", "--sid", "2", "--timeout", "1"}, &out, &err));
    EXPECT_TRUE(Has(err, "error: 18990010 ")) << err;
    child = Backstores("_SN_");
    ASSERT_EQ(1u, child.size());
    ASSERT_EQ(0, SetCloneProgress("/target/core/epio_0/" + child[0], 100));
    ASSERT_EQ(0, Cli({"snapshot", "wait", "adv", "--sid", "2"}, &out, &err)) << err;
    EXPECT_EQ("snapshot 2 'SnapShot-1' of LUN 'adv': not locked, Healthy\n", out);

    ASSERT_EQ(0, Cli({"snapshot", "delete", "adv", "s1"}, &out, &err)) << err;
    EXPECT_FALSE(Exists("/volume1/@iSCSI/Snapshot/ADV/" + lunUuid + "/" + uuid1));
    JsonDoc left = CliJson({"snapshot", "list"});
    ASSERT_TRUE(left);
    ASSERT_EQ(1u, json_object_array_length(left.get()));
    EXPECT_EQ("SnapShot-1", Str(json_object_array_get_idx(left.get(), 0), "name"));
}

TEST_F(OrloiscsiSnapshot, RepairRemovesAnObjectWhoseRecordIsGone) {
    std::string out, err;
    ASSERT_EQ(0, Cli({"lun", "create", "--name", "blk", "--type", "BLUN", "--size", "16M", "--volume", "/volume1"},
                     &out, &err))
        << err;
    ASSERT_EQ(0, Cli({"snapshot", "create", "blk", "--name", "kept"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"snapshot", "create", "blk", "--name", "orphan"}, &out, &err)) << err;
    JsonDoc orphan = CliJson({"snapshot", "show", "blk", "orphan"});
    ASSERT_TRUE(orphan);
    const std::string uuid = Str(orphan.get(), "uuid"), lunUuid = LunUuid("blk");
    // A creation killed between the subvolume and its record leaves the subvolume alone.
    ASSERT_EQ(0, Cli({"conf", "remove", "/volume1/@iSCSI/Snapshot/iscsi_snapshot_" + lunUuid + ".conf",
                      "SNAPSHOT_" + uuid},
                     &out, &err))
        << err;
    ASSERT_TRUE(Exists("/volume1/@iSCSI/Snapshot/BLUN/" + lunUuid + "/" + uuid));

    ASSERT_EQ(0, Cli({"snapshot", "repair", "blk"}, &out, &err)) << err;
    EXPECT_EQ("LUN 'blk': 1 snapshot repaired\n", out);
    EXPECT_FALSE(Exists("/volume1/@iSCSI/Snapshot/BLUN/" + lunUuid + "/" + uuid));
    JsonDoc again = CliJson({"snapshot", "repair", "blk"});
    ASSERT_TRUE(again);
    EXPECT_EQ(0, Int(again.get(), "repaired"));
    ASSERT_EQ(0, Cli({"snapshot", "show", "blk", "kept"}, &out, &err)) << "the other one stays: " << err;
    ASSERT_EQ(0, Cli({"lun", "lock-status", "blk"}, &out, &err)) << err;
    EXPECT_EQ("LUN 1 'blk': not locked\n", out) << "repair releases the LUN's lock and its progress file";
}

TEST_F(OrloiscsiSnapshot, BadInputIsRefusedWithItsCodeAndUsageMistakesExitTwo) {
    std::string out, err;
    ASSERT_EQ(0, Cli({"lun", "create", "--name", "blk", "--type", "BLUN", "--size", "16M", "--volume", "/volume1"},
                     &out, &err))
        << err;
    ASSERT_EQ(0, Cli({"lun", "create", "--name", "file", "--type", "FILE", "--size", "1M", "--volume", "/volume1"},
                     &out, &err))
        << err;
    const std::string snapFile = "/volume1/@iSCSI/Snapshot/iscsi_snapshot_" + LunUuid("blk") + ".conf";
    struct Refusal {
        std::vector<std::string> args;
        const char *code;
    };
    const std::vector<Refusal> refusals = {
        {{"create", "file"}, "18990500"},
        {{"create", "blk", "--name", "a]b"}, "18990513"},
        {{"create", "blk", "--name", std::string(256, 'n')}, "18990513"},
        {{"create", "blk", "--note", "two\nlines"}, "18990518"},
        {{"create", "nosuch"}, "18990531"},
        {{"show", "blk", "nosuch"}, "18990532"},
        {{"show", "--uuid", "no/such"}, "18990520"},
    };
    for (const Refusal &r : refusals) {
        std::vector<std::string> args = {"snapshot"};
        args.insert(args.end(), r.args.begin(), r.args.end());
        EXPECT_EQ(1, Cli(args, &out, &err)) << args[1] << " " << args[2];
        EXPECT_TRUE(Has("\n" + err, std::string("\nerror: ") + r.code + " ")) << err;
    }
    EXPECT_FALSE(Exists(snapFile) && Has(ReadFile(snapFile), "[SNAPSHOT_")) << "nothing was recorded";

    ASSERT_EQ(0, Cli({"snapshot", "create", "blk", "--name", "one"}, &out, &err)) << err;
    EXPECT_EQ(1, Cli({"snapshot", "create", "blk", "--name", "one"}, &out, &err));
    EXPECT_EQ(0u, err.find("error: 18990513 ")) << "a name the LUN's snapshots have: " << err;
    EXPECT_EQ(1, Cli({"snapshot", "hold", "blk", "one", std::string(128, 'k')}, &out, &err));
    EXPECT_EQ(0u, err.find("error: 18990524 ")) << err;
    JsonDoc one = CliJson({"snapshot", "show", "blk", "one"});
    ASSERT_TRUE(one);
    EXPECT_FALSE(Exists("/tmp/iscsi/snapshot_app_lock/SN_" + Str(one.get(), "uuid") + ".app.lock"))
        << "a refused key touches no file";
    EXPECT_EQ(1, Cli({"snapshot", "show", "blk", "--sid", "2"}, &out, &err));
    EXPECT_EQ(0u, err.find("error: 18990532 ")) << err;

    const std::vector<std::vector<std::string>> mistakes = {
        {"show", "blk"},                              // no NAME or --sid
        {"show", "--sid", "1"},                       // --sid without a LUN
        {"show", "blk", "--sid", "0"},                // outside 1..256
        {"show", "blk", "--sid", "one"},
        {"show", "blk", "one", "--sid", "1"},         // both
        {"show", "--uuid", "u", "--sid", "1"},
        {"show", "--uuid", "u", "one"},
        {"hold", "blk", "one"},                       // no KEY
        {"hold", "--uuid", "u"},
        {"hold", "blk", "one", "k", "extra"},
        {"wait", "blk", "one", "--timeout", "soon"},
        {"wait", "blk", "one", "--timeout", "-1"},
        {"create"},
        {"create", "blk", "--colour", "red"},
        {"repair"},
    };
    for (const auto &m : mistakes) {
        std::vector<std::string> args = {"snapshot"};
        args.insert(args.end(), m.begin(), m.end());
        EXPECT_EQ(2, Cli(args, &out, &err)) << m[0] << " " << (m.size() > 1 ? m[1] : "") << ": " << err;
        EXPECT_TRUE(Has(err, "usage: orloiscsi snapshot " + m[0])) << err;
    }
}

}  // namespace
