// Snapshot records in their two files: what the writers put where, what the readers make
// of well-formed and damaged files, and what bad records leave behind (nothing).
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <string>
#include <vector>

#include "snapshot_fixture.h"

namespace {

using snap_test::CacheFile;
using snap_test::ExpectSameRecord;
using snap_test::LunFile;
using snap_test::LunUuidOf;
using snap_test::MakeLun;
using snap_test::MakeSnap;
using snap_test::Records;
using snap_test::SectionText;
using snap_test::SnapshotTest;

class SnapshotConfTest : public SnapshotTest {};

TEST_F(SnapshotConfTest, AddWritesBothFilesAndEveryReaderFindsTheRecord) {
    AddLuns({3, 4});
    ORLOiSCSISnapshot a = MakeSnap(3, 1);
    ORLOiSCSISnapshot b = MakeSnap(3, 2, "/volume1", "c0f");
    b.type = ORLO_ISCSI_SNAPSHOT_TYPE_BLUN;
    snprintf(b.note, sizeof(b.note), "%s", "");  // an empty value is a value
    ORLOiSCSISnapshot other = MakeSnap(4, 1, "/volume1", "5a9");
    for (ORLOiSCSISnapshot *s : {&a, &b, &other}) ASSERT_EQ(0u, ORLOiSCSISnapshotConfAdd(s)) << log_.Dump();

    // The LUN's file holds its records in the order they were added, key by key; the cache
    // files are chosen by the first three characters of each UUID.
    EXPECT_EQ(SectionText(a) + SectionText(b), ReadFile(LunFile(3)));
    EXPECT_EQ(SectionText(other), ReadFile(LunFile(4)));
    EXPECT_EQ(SectionText(a) + SectionText(other), ReadFile(CacheFile(a.uuid)));
    EXPECT_EQ(SectionText(b), ReadFile(CacheFile(b.uuid)));
    EXPECT_TRUE(Exists("/tmp/iscsi/snapshot_conf_lock/iscsi_snapshot_" + LunUuidOf(3) + ".conf.lock"));
    EXPECT_TRUE(Exists("/tmp/iscsi/snapshot_cache_lock/iscsi_snapshot_c0f.conf.cache.lock"));

    ORLOiSCSILun lun3 = MakeLun(3);
    ORLOiSCSISnapshotFilter all = {};
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfLoadByParentLun(&lun3, &all, &list_)) << log_.Dump();
    std::vector<ORLOiSCSISnapshot> got = Records(&list_);
    ASSERT_EQ(2u, got.size());
    ExpectSameRecord(a, got[0]);
    ExpectSameRecord(b, got[1]);
    EXPECT_EQ(-1, got[0].lock_fd);
    ORLOiSCSISnapshotListFree(&list_);

    // Across LUNs, in the LUN file's order.
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfLoad(&all, &list_)) << log_.Dump();
    got = Records(&list_);
    ASSERT_EQ(3u, got.size());
    EXPECT_STREQ(a.uuid, got[0].uuid);
    EXPECT_STREQ(b.uuid, got[1].uuid);
    EXPECT_STREQ(other.uuid, got[2].uuid);
    ORLOiSCSISnapshotListFree(&list_);
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfLoadByParentUuid(LunUuidOf(4).c_str(), &all, &list_));
    ASSERT_EQ(1, list_.count);
    ORLOiSCSISnapshotListFree(&list_);
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfGetByLid(3, &list_));
    EXPECT_EQ(2, list_.count);

    ORLOiSCSISnapshot found;
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfGetBySid(3, 2, &found)) << log_.Dump();
    ExpectSameRecord(b, found);
    EXPECT_EQ(nullptr, found.link.next) << "a copy is no list member";
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfGetByLidAndName(4, "SnapShot-1", &found));
    ExpectSameRecord(other, found);
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfGetByUuid(b.uuid, &found));
    ExpectSameRecord(b, found);
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfInVolumeLoadByUuid("/volume1", LunUuidOf(3).c_str(), a.uuid, &found));
    ExpectSameRecord(a, found);

    // Adding a record whose section exists replaces it in both files, in place.
    snprintf(a.status, sizeof(a.status), "Unhealthy");
    a.mappedSize = 1;
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfAdd(&a)) << log_.Dump();
    EXPECT_EQ(SectionText(a) + SectionText(b), ReadFile(LunFile(3)));
    EXPECT_EQ(SectionText(a) + SectionText(other), ReadFile(CacheFile(a.uuid)));
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfGetByUuid(a.uuid, &found));
    EXPECT_STREQ("Unhealthy", found.status);
}

TEST_F(SnapshotConfTest, ConfFlagsChooseTheCopies) {
    ORLOiSCSISnapshot s = MakeSnap(5, 1);
    s.conf_flags = ORLO_ISCSI_SNAPSHOT_CONF_NO_CACHE;
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfAdd(&s)) << log_.Dump();
    EXPECT_EQ(SectionText(s), ReadFile(LunFile(5)));
    EXPECT_FALSE(Exists(CacheFile(s.uuid)));

    ORLOiSCSISnapshot t = MakeSnap(5, 2, "/volume1", "d00");
    t.conf_flags = ORLO_ISCSI_SNAPSHOT_CONF_CACHE_ONLY;
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfAdd(&t)) << log_.Dump();
    EXPECT_EQ(SectionText(t), ReadFile(CacheFile(t.uuid)));
    EXPECT_EQ(SectionText(s), ReadFile(LunFile(5))) << "the LUN's file is left alone";

    ORLOiSCSISnapshot u = MakeSnap(5, 3, "/volume1", "e00");
    u.conf_flags = ORLO_ISCSI_SNAPSHOT_CONF_NO_CACHE | ORLO_ISCSI_SNAPSHOT_CONF_CACHE_ONLY;
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfAdd(&u));
    EXPECT_FALSE(Exists(CacheFile(u.uuid)));
    EXPECT_EQ(SectionText(s), ReadFile(LunFile(5)));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
}

TEST_F(SnapshotConfTest, FailureOnTheLunFileLeavesTheCacheWritten) {
    // The LUN's lock file is a directory: the cache has been written by then.
    ORLOiSCSISnapshot s = MakeSnap(6, 1);
    const std::string lunLock = "/tmp/iscsi/snapshot_conf_lock/iscsi_snapshot_" + LunUuidOf(6) + ".conf.lock";
    ASSERT_EQ(0, mkdir(Real(lunLock).c_str(), 0700));
    EXPECT_EQ(18990015u, ORLOiSCSISnapshotConfAdd(&s));
    EXPECT_EQ(SectionText(s), ReadFile(CacheFile(s.uuid)));
    EXPECT_FALSE(Exists(LunFile(6)));
    EXPECT_TRUE(log_.Contains("iscsi_snapshot_conf_add.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("Failed to lock file: " + lunLock + ". It is a directory, not a regular file"))
        << log_.Dump();

    // A volume that is not there: its directories cannot be made.
    log_.Clear();
    ORLOiSCSISnapshot t = MakeSnap(7, 1, "/volume9", "f00");
    EXPECT_EQ(18990028u, ORLOiSCSISnapshotConfAdd(&t));
    EXPECT_EQ(SectionText(t), ReadFile(CacheFile(t.uuid)));
    EXPECT_FALSE(Exists("/volume9"));

    // The cache's lock failing stops the add before anything is written.
    log_.Clear();
    ORLOiSCSISnapshot u = MakeSnap(8, 1, "/volume1", "abc");
    ASSERT_EQ(0, mkdir(Real("/tmp/iscsi/snapshot_cache_lock/iscsi_snapshot_abc.conf.cache.lock").c_str(), 0700));
    EXPECT_EQ(18990015u, ORLOiSCSISnapshotConfAdd(&u));
    EXPECT_FALSE(Exists(CacheFile(u.uuid)));
    EXPECT_FALSE(Exists(LunFile(8)));
}

TEST_F(SnapshotConfTest, ReaderOfDamagedFiles) {
    AddLuns({2});
    ORLOiSCSILun lun = MakeLun(2);
    ORLOiSCSISnapshotFilter all = {};
    // No file: no snapshots, and a list given with records keeps them.
    ORLOiSCSISnapshot kept = MakeSnap(9, 9);
    ORLOiSCSISnapshot *heap = static_cast<ORLOiSCSISnapshot *>(calloc(1, sizeof(ORLOiSCSISnapshot)));
    *heap = kept;
    ORLOiSCSIListAppend(&list_, &heap->link);
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfLoadByParentLun(&lun, &all, &list_)) << log_.Dump();
    EXPECT_EQ(1, list_.count);

    // A section without "note" after two good ones fails the whole read, and the list, the
    // records it held before included, ends empty.
    ORLOiSCSISnapshot s1 = MakeSnap(2, 1);
    ORLOiSCSISnapshot s2 = MakeSnap(2, 2);
    ORLOiSCSISnapshot s3 = MakeSnap(2, 3);
    std::string broken = SectionText(s3);
    broken.erase(broken.find("\tnote="), std::string("\tnote=nightly 3\n").size());
    WriteFile(LunFile(2), SectionText(s1) + SectionText(s2) + broken);
    EXPECT_EQ(18990033u, ORLOiSCSISnapshotConfLoadByParentLun(&lun, &all, &list_));
    EXPECT_EQ(0, list_.count);
    EXPECT_EQ(nullptr, ORLOiSCSIListFirst(&list_));
    EXPECT_TRUE(log_.Contains("iscsi_snapshot_conf_load_with_path.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("Failed to get some keys in snapshot config")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("Failed to create snapshot struct.")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("Failed to apply filter[")) << log_.Dump();
    // A filter that passes the broken section over is not troubled by it.
    ORLOiSCSISnapshotFilter bySid = {};
    bySid.flags = ORLO_ISCSI_SNAPSHOT_FILTER_LID | ORLO_ISCSI_SNAPSHOT_FILTER_SID;
    bySid.lid = 2;
    bySid.sid = 2;
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfLoadByParentLun(&lun, &bySid, &list_)) << log_.Dump();
    ASSERT_EQ(1, list_.count);
    ORLOiSCSISnapshotListFree(&list_);
    // A section without one of the keys every filter needs is skipped by a filter, with a
    // log line, but fails a read of everything.
    std::string noTime = SectionText(s3);
    noTime.erase(noTime.find("\tsnapshot_time="), std::string("\tsnapshot_time=1700000103\n").size());
    WriteFile(LunFile(2), SectionText(s1) + noTime);
    log_.Clear();
    bySid.sid = 3;
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfLoadByParentLun(&lun, &bySid, &list_));
    EXPECT_EQ(0, list_.count);
    EXPECT_TRUE(log_.Contains("Failed to get some keys in snapshot config")) << log_.Dump();
    EXPECT_EQ(18990033u, ORLOiSCSISnapshotConfLoadByParentLun(&lun, &all, &list_));

    // "UNKNOWN" (and any other word) is written but cannot be read back.
    ORLOiSCSISnapshot unknown = MakeSnap(2, 4, "/volume1", "0aa");
    unknown.type = 7;
    WriteFile(LunFile(2), "");
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfAdd(&unknown)) << log_.Dump();
    EXPECT_NE(std::string::npos, ReadFile(LunFile(2)).find("\ttype=UNKNOWN\n"));
    log_.Clear();
    EXPECT_EQ(18990598u, ORLOiSCSISnapshotConfLoadByParentLun(&lun, &all, &list_));
    EXPECT_TRUE(log_.Contains("Invalid snapshot type in snapshot config. type: UNKNOWN")) << log_.Dump();
    ORLOiSCSISnapshot found;
    EXPECT_EQ(18990598u, ORLOiSCSISnapshotConfGetByUuid(unknown.uuid, &found));

    // Booleans: "yes" in any case is true, anything else false.  Lines before the first
    // header, comments and unknown keys are ignored; blanks around "=" are not part of a
    // value.
    std::string text = "stray=1\n# made by hand\n";
    const char *const words[] = {"YES", "yEs", "yes ", "y", "true", "1"};
    for (int i = 0; i < 6; ++i) {
        ORLOiSCSISnapshot s = MakeSnap(2, 10 + i);
        std::string section = SectionText(s);
        size_t at = section.find("isAppConsistence=");
        section.replace(at, section.find('\n', at) - at, std::string("isAppConsistence = ") + words[i]);
        text += section + "\textra=ignored\n";
    }
    WriteFile(LunFile(2), text);
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfLoadByParentLun(&lun, &all, &list_)) << log_.Dump();
    std::vector<ORLOiSCSISnapshot> got = Records(&list_);
    ASSERT_EQ(6u, got.size());
    const bool want[] = {true, true, false, false, false, false};
    for (int i = 0; i < 6; ++i) EXPECT_EQ(want[i], got[i].isAppConsistence) << words[i];

    // A file that cannot be opened (a directory in its place) is a failure, not an empty
    // result.
    ORLOiSCSISnapshotListFree(&list_);
    ASSERT_EQ(0, mkdir(Real("/volume1/dir.conf").c_str(), 0700));
    EXPECT_EQ(18990038u, ORLOiSCSISnapshotConfLoadWithPath(&all, &list_, "/volume1/dir.conf"));
    EXPECT_TRUE(log_.Contains("fopen(\"/volume1/dir.conf\", \"r\") failed, err=")) << log_.Dump();
}

TEST_F(SnapshotConfTest, FilterTests) {
    std::string text;
    for (int sid = 1; sid <= 4; ++sid) {
        ORLOiSCSISnapshot s = MakeSnap(sid <= 2 ? 1 : 2, sid, sid % 2 ? "/volume1" : "/volume2");
        if (sid == 4) snprintf(s.parent_uuid, sizeof(s.parent_uuid), "%s", "other-parent");
        text += SectionText(s);
    }
    WriteFile("/volume1/f.conf", text);
    auto load = [&](const ORLOiSCSISnapshotFilter &f) {
        ORLOiSCSISnapshotListFree(&list_);
        EXPECT_EQ(0u, ORLOiSCSISnapshotConfLoadWithPath(&f, &list_, "/volume1/f.conf")) << log_.Dump();
        std::vector<int> sids;
        for (const ORLOiSCSISnapshot &s : Records(&list_)) sids.push_back(s.sid);
        return sids;
    };
    ORLOiSCSISnapshotFilter f = {};
    EXPECT_EQ((std::vector<int>{1, 2, 3, 4}), load(f));
    f.flags = ORLO_ISCSI_SNAPSHOT_FILTER_FIRST_ONLY;
    EXPECT_EQ(std::vector<int>{}, load(f)) << "a filter that compares nothing keeps nothing";
    f.flags = ORLO_ISCSI_SNAPSHOT_FILTER_ROOT_PATH;
    f.rootpath = "/volume2";
    EXPECT_EQ((std::vector<int>{2, 4}), load(f));
    f.flags |= ORLO_ISCSI_SNAPSHOT_FILTER_FIRST_ONLY;
    EXPECT_EQ((std::vector<int>{2}), load(f));
    f.flags = ORLO_ISCSI_SNAPSHOT_FILTER_LID;
    f.lid = 2;
    EXPECT_EQ((std::vector<int>{3, 4}), load(f));
    f.flags = ORLO_ISCSI_SNAPSHOT_FILTER_LID | ORLO_ISCSI_SNAPSHOT_FILTER_NAME;
    f.name = "SnapShot-4";
    EXPECT_EQ((std::vector<int>{4}), load(f));
    f.flags = ORLO_ISCSI_SNAPSHOT_FILTER_BEFORE;  // snapshot_time is 1700000100 + sid
    f.time = 1700000103;
    EXPECT_EQ((std::vector<int>{1, 2}), load(f));
    f.flags = ORLO_ISCSI_SNAPSHOT_FILTER_PARENT_UUID;
    f.parent_uuid = "other-parent";
    EXPECT_EQ((std::vector<int>{4}), load(f));
    f.flags = ORLO_ISCSI_SNAPSHOT_FILTER_BEFORE | ORLO_ISCSI_SNAPSHOT_FILTER_SID;
    f.sid = 3;
    EXPECT_EQ(std::vector<int>{}, load(f)) << "every set test must pass";
    // A test whose operand is missing rejects every section, with a log line each.
    log_.Clear();
    f.flags = ORLO_ISCSI_SNAPSHOT_FILTER_UUID;
    f.uuid = nullptr;
    EXPECT_EQ(std::vector<int>{}, load(f));
    EXPECT_EQ(4u, log_.Lines().size()) << log_.Dump();
    EXPECT_TRUE(log_.Contains("Bad parameters")) << log_.Dump();
}

TEST_F(SnapshotConfTest, LookupsThatFindNothing) {
    AddLuns({3});
    ORLOiSCSISnapshot s = MakeSnap(3, 1);
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfAdd(&s));
    ORLOiSCSISnapshot out = MakeSnap(99, 99);
    const ORLOiSCSISnapshot before = out;
    log_.Clear();
    EXPECT_EQ(18990532u, ORLOiSCSISnapshotConfGetBySid(3, 7, &out));
    EXPECT_TRUE(log_.Contains("No such snapshot. lid: 3, sid: 7")) << log_.Dump();
    EXPECT_EQ(18990532u, ORLOiSCSISnapshotConfGetByLidAndName(3, "nope", &out));
    EXPECT_TRUE(log_.Contains("No such snapshot. lid: 3, name: nope")) << log_.Dump();
    const std::string missing = snap_test::SnapUuidOf(3, 2);
    EXPECT_EQ(18990532u, ORLOiSCSISnapshotConfGetByUuid(missing.c_str(), &out));
    EXPECT_TRUE(log_.Contains("No such snapshot. UUID: " + missing)) << log_.Dump();
    log_.Clear();
    EXPECT_EQ(18990532u, ORLOiSCSISnapshotConfInVolumeLoadByUuid("/volume1", LunUuidOf(3).c_str(), missing.c_str(), &out));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
    EXPECT_EQ(0, memcmp(&before, &out, sizeof(out))) << "the caller's record is left as it was";
    // A LUN that is not there.
    EXPECT_EQ(18990531u, ORLOiSCSISnapshotConfGetBySid(8, 1, &out));
    EXPECT_TRUE(log_.Contains("Failed to load LUN config by lid: 8")) << log_.Dump();
    EXPECT_EQ(18990531u, ORLOiSCSISnapshotConfGetByLid(8, &list_));
    ORLOiSCSISnapshotFilter all = {};
    EXPECT_EQ(18990531u, ORLOiSCSISnapshotConfLoadByParentUuid(LunUuidOf(8).c_str(), &all, &list_));
    EXPECT_EQ(18990201u, ORLOiSCSISnapshotConfLoadByParentLun(nullptr, &all, &list_));
    EXPECT_EQ(18990003u, ORLOiSCSISnapshotConfAdd(nullptr));
    EXPECT_TRUE(log_.Contains("Null input pointer")) << log_.Dump();
}

TEST_F(SnapshotConfTest, DeleteRemovesBothCopiesAndTheClonesOfThatSnapshotOnly) {
    AddLuns({3});
    ORLOiSCSISnapshot a = MakeSnap(3, 1);
    ORLOiSCSISnapshot b = MakeSnap(3, 2);
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfAdd(&a));
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfAdd(&b));
    // Clones: 10 of snapshot 3/1, 11 of snapshot 3/2, 12 of LUN 3 itself, 13 of LUN 4's
    // snapshot 1.
    const std::string family =
        "[FAMILY_L10]\n\tlid=10\n\tparent_lid=3\n\tparent_sid=1\n\ttime=1\n\tstatus=Healthy\n"
        "[FAMILY_L11]\n\tlid=11\n\tparent_lid=3\n\tparent_sid=2\n\ttime=1\n\tstatus=Healthy\n"
        "[FAMILY_L12]\n\tlid=12\n\tparent_lid=3\n\tparent_sid=0\n\ttime=1\n\tstatus=Healthy\n"
        "[FAMILY_L13]\n\tlid=13\n\tparent_lid=4\n\tparent_sid=1\n\ttime=1\n\tstatus=Healthy\n";
    WriteFile("/usr/orlo/etc/iscsi_family_lun.conf", family);

    ASSERT_EQ(0u, ORLOiSCSISnapshotConfDelete(&a)) << log_.Dump();
    EXPECT_EQ(SectionText(b), ReadFile(LunFile(3)));
    EXPECT_EQ(SectionText(b), ReadFile(CacheFile(a.uuid)));
    EXPECT_EQ(family.substr(family.find("[FAMILY_L11]")), ReadFile("/usr/orlo/etc/iscsi_family_lun.conf"));
    // Deleting what is not there is no error.
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfDelete(&a)) << log_.Dump();

    // A family file that cannot be rewritten is logged; the record goes all the same.
    WriteFile("/usr/orlo/etc/iscsi_family_lun.conf", "[]\n" + family);
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfDelete(&b)) << log_.Dump();
    EXPECT_TRUE(log_.Contains("Failed to remove family config. lid: 11")) << log_.Dump();
    EXPECT_EQ("", ReadFile(LunFile(3)));
    EXPECT_EQ("", ReadFile(CacheFile(b.uuid)));
}

TEST_F(SnapshotConfTest, DeleteByParentLunDropsTheCacheCopiesTheClonesAndTheFile) {
    AddLuns({3, 4});
    ORLOiSCSISnapshot a = MakeSnap(3, 1, "/volume1", "aaa");
    ORLOiSCSISnapshot b = MakeSnap(3, 2, "/volume1", "bbb");
    ORLOiSCSISnapshot c = MakeSnap(4, 1, "/volume1", "aaa");
    for (ORLOiSCSISnapshot *s : {&a, &b, &c}) ASSERT_EQ(0u, ORLOiSCSISnapshotConfAdd(s));
    const std::string keep =
        "[FAMILY_L12]\n\tlid=12\n\tparent_lid=3\n\tparent_sid=0\n\ttime=1\n\tstatus=Healthy\n"
        "[FAMILY_L13]\n\tlid=13\n\tparent_lid=4\n\tparent_sid=1\n\ttime=1\n\tstatus=Healthy\n";
    WriteFile("/usr/orlo/etc/iscsi_family_lun.conf",
              "[FAMILY_L10]\n\tlid=10\n\tparent_lid=3\n\tparent_sid=1\n\ttime=1\n\tstatus=Healthy\n" + keep +
                  "[FAMILY_L11]\n\tlid=11\n\tparent_lid=3\n\tparent_sid=2\n\ttime=1\n\tstatus=x\n");
    ORLOiSCSILun lun = MakeLun(3);
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfDeleteByParentLun(&lun)) << log_.Dump();
    EXPECT_FALSE(Exists(LunFile(3)));
    EXPECT_EQ(SectionText(c), ReadFile(CacheFile(c.uuid)));
    EXPECT_EQ("", ReadFile(CacheFile(b.uuid)));
    EXPECT_EQ(keep, ReadFile("/usr/orlo/etc/iscsi_family_lun.conf"));
    EXPECT_EQ(SectionText(c), ReadFile(LunFile(4)));
    // A LUN without a snapshot file: nothing to do.
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfDeleteByParentLun(&lun)) << log_.Dump();
}

TEST_F(SnapshotConfTest, BadRecordsAreRefusedWithOneLineAndNothingWritten) {
    struct Case {
        const char *what;
        void (*spoil)(ORLOiSCSISnapshot *);
        uint32_t code;
    };
    const Case cases[] = {
        {"empty name", [](ORLOiSCSISnapshot *s) { s->name[0] = '\0'; }, 18990513},
        {"256-character name", [](ORLOiSCSISnapshot *s) { memset(s->name, 'n', sizeof(s->name)); }, 18990513},
        {"name not UTF-8", [](ORLOiSCSISnapshot *s) { snprintf(s->name, sizeof(s->name), "caf\xe9"); }, 18990513},
        {"name with a newline", [](ORLOiSCSISnapshot *s) { snprintf(s->name, sizeof(s->name), "a\nb"); }, 18990513},
        {"name with a control character", [](ORLOiSCSISnapshot *s) { snprintf(s->name, sizeof(s->name), "a\x01"); },
         18990513},
        {"name with ]", [](ORLOiSCSISnapshot *s) { snprintf(s->name, sizeof(s->name), "a]b"); }, 18990513},
        {"name with a leading blank", [](ORLOiSCSISnapshot *s) { snprintf(s->name, sizeof(s->name), " a"); },
         18990513},
        {"note with a newline", [](ORLOiSCSISnapshot *s) { snprintf(s->note, sizeof(s->note), "one\ntwo"); },
         18990518},
        {"note with a carriage return", [](ORLOiSCSISnapshot *s) { snprintf(s->note, sizeof(s->note), "one\r"); },
         18990518},
        {"uuid with a slash", [](ORLOiSCSISnapshot *s) { snprintf(s->uuid, sizeof(s->uuid), "../../x"); }, 18990520},
        {"empty uuid", [](ORLOiSCSISnapshot *s) { s->uuid[0] = '\0'; }, 18990520},
        {"parent uuid with ]", [](ORLOiSCSISnapshot *s) { snprintf(s->parent_uuid, sizeof(s->parent_uuid), "a]"); },
         18990599},
        {"relative root path", [](ORLOiSCSISnapshot *s) { snprintf(s->rootpath, sizeof(s->rootpath), "volume1"); },
         18990004},
        {"status with a newline", [](ORLOiSCSISnapshot *s) { snprintf(s->status, sizeof(s->status), "a\nb"); },
         18990004},
        {"quoted taken_by", [](ORLOiSCSISnapshot *s) { snprintf(s->taken_by, sizeof(s->taken_by), "\"x\""); },
         18990004},
        {"root path too long for its file",
         [](ORLOiSCSISnapshot *s) {
             memset(s->rootpath, 'v', 400);
             s->rootpath[0] = '/';
             s->rootpath[400] = '\0';
         },
         18990050},
    };
    for (const Case &c : cases) {
        ORLOiSCSISnapshot s = MakeSnap(3, 1);
        c.spoil(&s);
        log_.Clear();
        EXPECT_EQ(c.code, ORLOiSCSISnapshotConfAdd(&s)) << c.what;
        EXPECT_EQ(1u, log_.Lines().size()) << c.what << "\n" << log_.Dump();
        EXPECT_EQ(std::string::npos, log_.Dump().find("one\ntwo")) << "a log line is one line";
    }
    // Nothing was written anywhere.
    EXPECT_FALSE(Exists(LunFile(3)));
    EXPECT_FALSE(Exists("/volume1/@iSCSI"));
    EXPECT_FALSE(Exists(CacheFile(snap_test::SnapUuidOf(3, 1))));
    EXPECT_TRUE(snap_test::DirEntries(Real("/tmp/iscsi/snapshot_cache")).empty());

    // The limits themselves are fine: a 255-character UTF-8 name, a note of 1023
    // characters with tabs inside, quotes inside a value.
    ORLOiSCSISnapshot s = MakeSnap(3, 1);
    std::string name;
    while (name.size() < 253) name += "\xc3\xa9";  // é, two bytes each
    name += "xy";
    name.resize(255);
    snprintf(s.name, sizeof(s.name), "%s", name.c_str());
    ASSERT_EQ(255u, strlen(s.name));
    memset(s.note, 'n', 1023);
    s.note[5] = '\t';
    s.note[1023] = '\0';
    snprintf(s.status, sizeof(s.status), "say \"hi\"");
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfAdd(&s)) << log_.Dump();
    ORLOiSCSISnapshot found;
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfGetByUuid(s.uuid, &found)) << log_.Dump();
    ExpectSameRecord(s, found);
}

}  // namespace
