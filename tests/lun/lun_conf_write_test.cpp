// Writing and removing LUN sections: every type through both files, the exact text of a
// section, the refusals (which must leave both files as they were), removal with the
// mappings and clone relations that name the LUN, and the LUN's directory and paths.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <string>
#include <vector>

#include "lun_fixture.h"
#include "orlo_storage.h"
#include "orloiscsi_snapshot.h"
#include "orloiscsi_target.h"
#include "support/loop_volume.h"

namespace {

using lun_test::kGlobalConf;
using lun_test::kVolumeConf;
using lun_test::LunTest;
using lun_test::MakeLun;
using lun_test::Records;
using lun_test::UuidOf;

const uint32_t kAllTypes[] = {1, 3, 7, 15, 31, 47, 71, 79, 143, 263, 295};

void ExpectSameRecord(const ORLOiSCSILun &want, const ORLOiSCSILun &got) {
    EXPECT_EQ(want.lid, got.lid);
    EXPECT_EQ(want.type, got.type) << want.name;
    EXPECT_EQ(want.blockSize, got.blockSize) << want.name;
    EXPECT_EQ(want.size, got.size) << want.name;
    EXPECT_EQ(want.restoredTime, got.restoredTime) << want.name;
    EXPECT_STREQ(want.uuid, got.uuid);
    EXPECT_STREQ(want.vpdUnitSerial, got.vpdUnitSerial);
    EXPECT_STREQ(want.rootPath, got.rootPath);
    EXPECT_STREQ(want.name, got.name);
    EXPECT_EQ(-1, got.lockHandle);
}

bool IsDir(const std::string &real) {
    struct stat st;
    return stat(real.c_str(), &st) == 0 && S_ISDIR(st.st_mode);
}

class LunConfWriteTest : public LunTest {};

TEST_F(LunConfWriteTest, EveryTypeReadsBackAsWrittenFromBothFiles) {
    std::vector<ORLOiSCSILun> written;
    int lid = 0;
    for (uint32_t type : kAllTypes) {
        ++lid;
        ORLOiSCSILun lun = MakeLun(lid, type, type == 1 ? "/dev/sdb" : "/volume1");
        lun.blockSize = lid % 2 ? 4096 : 512;
        lun.restoredTime = lid == 3 ? -5 : 1700000000 + lid;
        snprintf(lun.name, sizeof(lun.name), "%s lun #%d", ORLOiSCSILunTypeName(type), lid);
        ASSERT_EQ(0u, ORLOiSCSILunConfSet(&lun)) << ORLOiSCSILunTypeName(type) << "\n" << log_.Dump();
        written.push_back(lun);
    }
    ASSERT_EQ(0u, ORLOiSCSILunConfGetAll(&list_, ORLO_ISCSI_LUN_FILTER_BKP)) << log_.Dump();
    std::vector<ORLOiSCSILun> global = Records(&list_);
    ASSERT_EQ(written.size(), global.size());
    for (size_t i = 0; i < written.size(); ++i) ExpectSameRecord(written[i], global[i]);

    // The volume's copy holds every file-backed LUN (all but BLOCK), read back the same.
    ORLOiSCSILunListFree(&list_);
    ASSERT_EQ(0u, ORLOiSCSILunConfInVolumeLoad("/volume1", &list_)) << log_.Dump();
    std::vector<ORLOiSCSILun> volume = Records(&list_);
    ASSERT_EQ(written.size() - 1, volume.size());
    for (size_t i = 1; i < written.size(); ++i) ExpectSameRecord(written[i], volume[i - 1]);

    // Each file-backed LUN got its directory, named after its type.
    for (size_t i = 1; i < written.size(); ++i)
        EXPECT_TRUE(IsDir(Real("/volume1/@iSCSI/LUN/") + ORLOiSCSILunTypeName(written[i].type) + "/" +
                          written[i].uuid))
            << written[i].name;
}

TEST_F(LunConfWriteTest, WritesTheExactSectionAndReplacesItInPlace) {
    ORLOiSCSILun lun = MakeLun(7, ORLO_ISCSI_LUN_TYPE_FILE);
    lun.blockSize = 4096;
    lun.restoredTime = -1;
    ASSERT_EQ(0u, ORLOiSCSILunConfSet(&lun)) << log_.Dump();
    const std::string u7 = UuidOf(7);
    const std::string section7 = "[LUN_" + u7 +
                                 "]\n\tlid=7\n\trootpath=/volume1\n\tname=LUN-7\n\tuuid=" + u7 +
                                 "\n\tvpd_unit_serial=serial-7\n\tbytes=7516192768\n"
                                 "\trestored_time=18446744073709551615\n\tdevtype=1\n\tpre_alloc=yes\n"
                                 "\tbkp_obj=0\n\tvaai_support=no\n\tblocksize=4096\n";
    EXPECT_EQ(section7, ReadFile(kGlobalConf));
    EXPECT_EQ(section7, ReadFile(kVolumeConf));
    EXPECT_TRUE(IsDir(Real("/volume1/@iSCSI/LUN/FILE/" + u7)));

    // A second LUN is appended; changing the first replaces its section where it stands.
    ORLOiSCSILun thin = MakeLun(8, ORLO_ISCSI_LUN_TYPE_BKP_ADV);
    ASSERT_EQ(0u, ORLOiSCSILunConfSet(&thin)) << log_.Dump();
    const std::string u8 = UuidOf(8);
    const std::string section8 = "[LUN_" + u8 +
                                 "]\n\tlid=8\n\trootpath=/volume1\n\tname=LUN-8\n\tuuid=" + u8 +
                                 "\n\tvpd_unit_serial=serial-8\n\tbytes=8589934592\n\trestored_time=0\n"
                                 "\tdevtype=1\n\tpre_alloc=no\n\tbkp_obj=1\n\tvaai_support=yes\n";
    lun.blockSize = 512;
    lun.size = 1024;
    snprintf(lun.name, sizeof(lun.name), "renamed = still one value");
    ASSERT_EQ(0u, ORLOiSCSILunConfSet(&lun)) << log_.Dump();
    const std::string changed7 = "[LUN_" + u7 +
                                 "]\n\tlid=7\n\trootpath=/volume1\n\tname=renamed = still one value\n\tuuid=" + u7 +
                                 "\n\tvpd_unit_serial=serial-7\n\tbytes=1024\n"
                                 "\trestored_time=18446744073709551615\n\tdevtype=1\n\tpre_alloc=yes\n"
                                 "\tbkp_obj=0\n\tvaai_support=no\n";
    EXPECT_EQ(changed7 + section8, ReadFile(kGlobalConf));
    EXPECT_EQ(changed7 + section8, ReadFile(kVolumeConf));
    ORLOiSCSILun back;
    ASSERT_EQ(0u, ORLOiSCSILunConfGetByUuid(u7.c_str(), &back));
    EXPECT_STREQ("renamed = still one value", back.name);

    // The caller-locked forms write one file each.
    ORLOiSCSILun other = MakeLun(9, ORLO_ISCSI_LUN_TYPE_THIN);
    ASSERT_EQ(0u, ORLOiSCSILunGlobalConfSetSection(&other));
    EXPECT_NE(std::string::npos, ReadFile(kGlobalConf).find("[LUN_" + UuidOf(9) + "]"));
    EXPECT_EQ(std::string::npos, ReadFile(kVolumeConf).find("[LUN_" + UuidOf(9) + "]"));
    ASSERT_EQ(0u, ORLOiSCSILunVolumeConfSetSection(&other));
    EXPECT_NE(std::string::npos, ReadFile(kVolumeConf).find("[LUN_" + UuidOf(9) + "]"));
}

TEST_F(LunConfWriteTest, RefusesBadRecordsBeforeWritingAnything) {
    ORLOiSCSILun good = MakeLun(1, ORLO_ISCSI_LUN_TYPE_FILE);
    ASSERT_EQ(0u, ORLOiSCSILunConfSet(&good));
    const std::string global = ReadFile(kGlobalConf);
    const std::string volume = ReadFile(kVolumeConf);

    struct Case {
        const char *what;
        void (*spoil)(ORLOiSCSILun *);
        uint32_t code;
        const char *line;
        size_t lines;  // log lines the refusal writes
    };
    const Case cases[] = {
        {"lid 0", [](ORLOiSCSILun *l) { l->lid = 0; }, 18990004, "invalid LUN id: 0", 2},
        {"lid 1025", [](ORLOiSCSILun *l) { l->lid = 1025; }, 18990004, "invalid LUN id: 1025", 2},
        {"relative root path", [](ORLOiSCSILun *l) { snprintf(l->rootPath, sizeof(l->rootPath), "volume1"); },
         18990004, "invalid LUN root path: 'volume1'", 2},
        {"no name", [](ORLOiSCSILun *l) { l->name[0] = '\0'; }, 18990004, "invalid LUN name", 2},
        {"no uuid", [](ORLOiSCSILun *l) { l->uuid[0] = '\0'; }, 18990004, "invalid LUN UUID", 2},
        {"no serial", [](ORLOiSCSILun *l) { l->vpdUnitSerial[0] = '\0'; }, 18990004,
         "invalid LUN vpd_unit_serial", 2},
        {"newline in name", [](ORLOiSCSILun *l) { snprintf(l->name, sizeof(l->name), "a\n[LUN_x]"); }, 18990004,
         "invalid LUN name: control character. lid: 2", 1},
        {"tab in name", [](ORLOiSCSILun *l) { snprintf(l->name, sizeof(l->name), "a\tb"); }, 18990004,
         "invalid LUN name: control character. lid: 2", 1},
        {"unterminated name", [](ORLOiSCSILun *l) { memset(l->name, 'x', sizeof(l->name)); }, 18990004,
         "invalid LUN name: longer than 255 characters. lid: 2", 1},
        {"leading blank in name", [](ORLOiSCSILun *l) { snprintf(l->name, sizeof(l->name), " padded"); },
         18990004, "invalid LUN name: leading blank. lid: 2", 1},
        {"quoted name", [](ORLOiSCSILun *l) { snprintf(l->name, sizeof(l->name), "\"q\""); }, 18990004,
         "invalid LUN name: enclosed in double quotes. lid: 2", 1},
        {"bracket in uuid", [](ORLOiSCSILun *l) { snprintf(l->uuid, sizeof(l->uuid), "ab]cd"); }, 18990004,
         "invalid LUN UUID: \"]\" is not allowed. lid: 2", 1},
        {"slash in uuid", [](ORLOiSCSILun *l) { snprintf(l->uuid, sizeof(l->uuid), "../../etc"); }, 18990004,
         "invalid LUN UUID: \"/\" is not allowed. lid: 2", 1},
        {"newline in serial", [](ORLOiSCSILun *l) { snprintf(l->vpdUnitSerial, sizeof(l->vpdUnitSerial), "s\nx"); },
         18990004, "invalid LUN vpd_unit_serial: line break. lid: 2", 1},
        {"newline in root path",
         [](ORLOiSCSILun *l) { snprintf(l->rootPath, sizeof(l->rootPath), "/volume1\n[LUN_y]"); }, 18990004,
         "invalid LUN root path: line break. lid: 2", 1},
        {"type 5", [](ORLOiSCSILun *l) { l->type = 5; }, 18990500, "Bad Lun type: 5", 1},
        {"type 0", [](ORLOiSCSILun *l) { l->type = 0; }, 18990500, "Bad Lun type: 0", 1},
        {"root path too long for the volume copy",
         [](ORLOiSCSILun *l) { snprintf(l->rootPath, sizeof(l->rootPath), "/volume1/%0300d", 0); }, 18990050,
         "snprintf() failed with buffer size 320", 1},
    };
    for (const Case &c : cases) {
        ORLOiSCSILun lun = MakeLun(2, ORLO_ISCSI_LUN_TYPE_THIN);
        c.spoil(&lun);
        log_.Clear();
        EXPECT_EQ(c.code, ORLOiSCSILunConfSet(&lun)) << c.what;
        EXPECT_TRUE(log_.Contains(c.line)) << c.what << "\n" << log_.Dump();
        EXPECT_EQ(c.lines, log_.Lines().size()) << c.what << "\n" << log_.Dump();
        if (c.lines == 2) {
            EXPECT_TRUE(log_.Contains("Bad parameters. Invalid LUN struct.")) << c.what;
        }
        EXPECT_EQ(global, ReadFile(kGlobalConf)) << c.what;
        EXPECT_EQ(volume, ReadFile(kVolumeConf)) << c.what;
    }
    EXPECT_FALSE(Exists("/volume1/@iSCSI/LUN/THIN")) << "no directory is made for a refused LUN";
    EXPECT_EQ(18990003u, ORLOiSCSILunConfSet(nullptr));
}

TEST_F(LunConfWriteTest, RemovalTakesTheSectionsMappingsAndCloneRelations) {
    ORLOiSCSILun one = MakeLun(1, ORLO_ISCSI_LUN_TYPE_FILE);
    ORLOiSCSILun two = MakeLun(2, ORLO_ISCSI_LUN_TYPE_ADV);
    ORLOiSCSILun block = MakeLun(3, ORLO_ISCSI_LUN_TYPE_BLOCK, "/dev/sdc");
    for (ORLOiSCSILun *l : {&one, &two, &block}) ASSERT_EQ(0u, ORLOiSCSILunConfSet(l)) << log_.Dump();
    const std::string section2 = "[LUN_" + UuidOf(2) + "]";

    WriteFile("/usr/orlo/etc/iscsi_mapping.conf",
              "[iSCSI_MAP_T1_L1]\n\ttid=1\n\tlid=1\n\tlun=0\n"
              "[iSCSI_MAP_T1_L2]\n\ttid=1\n\tlid=2\n\tlun=1\n"
              "[iSCSI_MAP_T2_L1]\n\ttid=2\n\tlid=1\n\tlun=0\n"
              "[iSCSI_MAP_T3_L11]\n\ttid=3\n\tlid=11\n\tlun=0\n");
    WriteFile("/usr/orlo/etc/iscsi_family_lun.conf",
              "[FAMILY_L1]\n\tlid=1\n\tparent_lid=5\n\tparent_sid=0\n\ttime=1\n\tstatus=Healthy\n"
              "[FAMILY_L4]\n\tlid=4\n\tparent_lid=1\n\tparent_sid=2\n\ttime=1\n\tstatus=Healthy\n"
              "[FAMILY_L6]\n\tlid=6\n\tparent_lid=2\n\tparent_sid=0\n\ttime=1\n\tstatus=Healthy\n"
              "[FAMILY_L11]\n\tlid=11\n\tparent_lid=10\n\tparent_sid=0\n\ttime=1\n\tstatus=Healthy\n");

    ASSERT_EQ(0u, ORLOiSCSILunConfRemove(&one)) << log_.Dump();
    EXPECT_EQ(std::string::npos, ReadFile(kGlobalConf).find("LUN_" + UuidOf(1)));
    EXPECT_EQ(std::string::npos, ReadFile(kVolumeConf).find("LUN_" + UuidOf(1)));
    EXPECT_NE(std::string::npos, ReadFile(kGlobalConf).find(section2));
    EXPECT_EQ("[iSCSI_MAP_T1_L2]\n\ttid=1\n\tlid=2\n\tlun=1\n[iSCSI_MAP_T3_L11]\n\ttid=3\n\tlid=11\n\tlun=0\n",
              ReadFile("/usr/orlo/etc/iscsi_mapping.conf"));
    EXPECT_EQ("[FAMILY_L6]\n\tlid=6\n\tparent_lid=2\n\tparent_sid=0\n\ttime=1\n\tstatus=Healthy\n"
              "[FAMILY_L11]\n\tlid=11\n\tparent_lid=10\n\tparent_sid=0\n\ttime=1\n\tstatus=Healthy\n",
              ReadFile("/usr/orlo/etc/iscsi_family_lun.conf"))
        << "the LUN's own entry and the entries naming it as parent go";

    // State flag 0x2 keeps the volume's copy.
    two.stateFlags = ORLO_ISCSI_LUN_STATE_KEEP_VOLUME_CONF;
    ASSERT_EQ(0u, ORLOiSCSILunConfRemove(&two)) << log_.Dump();
    EXPECT_EQ(std::string::npos, ReadFile(kGlobalConf).find(section2));
    EXPECT_NE(std::string::npos, ReadFile(kVolumeConf).find(section2));
    EXPECT_EQ("[iSCSI_MAP_T3_L11]\n\ttid=3\n\tlid=11\n\tlun=0\n", ReadFile("/usr/orlo/etc/iscsi_mapping.conf"));
    // ... which the caller-locked form removes on its own.
    ASSERT_EQ(0u, ORLOiSCSILunVolumeConfRemove(&two));
    EXPECT_EQ("", ReadFile(kVolumeConf));

    // A block LUN has no volume copy to touch; removing what is gone already is success.
    ASSERT_EQ(0u, ORLOiSCSILunConfRemove(&block)) << log_.Dump();
    EXPECT_EQ("", ReadFile(kGlobalConf));
    const std::string mappings = ReadFile("/usr/orlo/etc/iscsi_mapping.conf");
    log_.Clear();
    EXPECT_EQ(0u, ORLOiSCSILunConfRemove(&one));
    EXPECT_EQ(mappings, ReadFile("/usr/orlo/etc/iscsi_mapping.conf"));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();

    // No files at all.
    unlink(Real(kGlobalConf).c_str());
    unlink(Real(kVolumeConf).c_str());
    unlink(Real("/usr/orlo/etc/iscsi_mapping.conf").c_str());
    unlink(Real("/usr/orlo/etc/iscsi_family_lun.conf").c_str());
    EXPECT_EQ(0u, ORLOiSCSILunConfRemove(&one)) << log_.Dump();
    EXPECT_FALSE(Exists(kGlobalConf));

    // A malformed mapping file fails the removal, which is logged and reported, while the
    // LUN's own section still goes.
    ASSERT_EQ(0u, ORLOiSCSILunConfSet(&one));
    WriteFile("/usr/orlo/etc/iscsi_mapping.conf", "[iSCSI_MAP_T1_L1]\n\tlid=1\n[]\n");
    log_.Clear();
    EXPECT_EQ(18990301u, ORLOiSCSILunConfRemove(&one));
    EXPECT_TRUE(log_.Contains("ORLOiSCSILunMappingRemove(1) failed, err=Failed to enumerate section")) << log_.Dump();
    EXPECT_EQ("", ReadFile(kGlobalConf));
    EXPECT_EQ("", ReadFile(kVolumeConf));
    EXPECT_EQ(18990004u, ORLOiSCSILunMappingRemove(0));
    EXPECT_EQ(18990004u, ORLOiSCSILunFamilyConfRemove(1025));
}

TEST_F(LunConfWriteTest, DirectoriesAndPathsOnTheVolume) {
    ORLOiSCSILun lun = MakeLun(4, ORLO_ISCSI_LUN_TYPE_ADV);
    const std::string u = UuidOf(4);
    char buf[4096];
    ASSERT_EQ(0u, ORLOiSCSILunDirPathGet(&lun, buf, sizeof(buf)));
    EXPECT_EQ("/volume1/@iSCSI/LUN/ADV/" + u, buf);
    ASSERT_EQ(0u, ORLOiSCSILunDataPathGet(&lun, 3, buf, sizeof(buf)));
    EXPECT_EQ("/volume1/@iSCSI/LUN/ADV/" + u + "/" + u + "_00003", buf);
    ASSERT_EQ(0u, ORLOiSCSILunMapPathGet(&lun, buf, sizeof(buf)));
    const std::string mapPath = "/volume1/@iSCSI/LUN/ADV/" + u + "/" + u + "_00000";
    EXPECT_EQ(mapPath, buf);
    // A path that fits exactly is built; one byte less is refused, not cut.
    EXPECT_EQ(0u, ORLOiSCSILunMapPathGet(&lun, buf, mapPath.size() + 1));
    log_.Clear();
    EXPECT_EQ(18990050u, ORLOiSCSILunMapPathGet(&lun, buf, mapPath.size()));
    EXPECT_STREQ("", buf);
    EXPECT_TRUE(log_.Contains("snprintf() failed with buffer size " + std::to_string(mapPath.size()))) << log_.Dump();

    lun.stateFlags = ORLO_ISCSI_LUN_STATE_TMP;
    ASSERT_EQ(0u, ORLOiSCSILunDirPathGet(&lun, buf, sizeof(buf)));
    EXPECT_EQ("/volume1/@iSCSI/tmp/" + u, buf);
    ASSERT_EQ(0u, ORLOiSCSILunMapPathGet(&lun, buf, sizeof(buf)));
    EXPECT_EQ("/volume1/@iSCSI/tmp/" + u + "/" + u + "_00000", buf);
    lun.stateFlags = ORLO_ISCSI_LUN_STATE_EP_UNMAP | ORLO_ISCSI_LUN_STATE_TMP;
    ASSERT_EQ(0u, ORLOiSCSILunMapPathGet(&lun, buf, sizeof(buf)));
    EXPECT_EQ("/volume1/@iSCSI/EP_unmap/" + u, buf);
    lun.stateFlags = 0;
    lun.type = 11;
    ASSERT_EQ(0u, ORLOiSCSILunDirPathGet(&lun, buf, sizeof(buf)));
    EXPECT_EQ("/volume1/@iSCSI/LUN/UNKNOWN/" + u, buf);
    lun.rootPath[0] = '\0';
    EXPECT_EQ(18990004u, ORLOiSCSILunDirPathGet(&lun, buf, sizeof(buf))) << "a LUN without a volume has no directory";

    // Directories: the type's directory under "@iSCSI/LUN", or the temporary one.
    ORLOiSCSILun blun = MakeLun(5, ORLO_ISCSI_LUN_TYPE_BLUN);
    ASSERT_EQ(0u, ORLOiSCSILunMkdir(&blun)) << log_.Dump();
    EXPECT_TRUE(IsDir(Real("/volume1/@iSCSI/LUN/BLUN/" + UuidOf(5))));
    ASSERT_EQ(0u, ORLOiSCSILunMkdir(&blun)) << "an existing directory is fine";
    ORLOiSCSILun tmp = MakeLun(6, ORLO_ISCSI_LUN_TYPE_THIN);
    tmp.stateFlags = ORLO_ISCSI_LUN_STATE_TMP;
    ASSERT_EQ(0u, ORLOiSCSILunMkdir(&tmp)) << log_.Dump();
    EXPECT_TRUE(IsDir(Real("/volume1/@iSCSI/tmp/" + UuidOf(6))));
    EXPECT_FALSE(Exists("/volume1/@iSCSI/LUN/THIN"));

    // A block LUN has no directory; a volume that is not there gets nothing made on it.
    ORLOiSCSILun dev = MakeLun(9, ORLO_ISCSI_LUN_TYPE_BLOCK, "/volume1");
    EXPECT_EQ(18990500u, ORLOiSCSILunMkdir(&dev));
    EXPECT_FALSE(Exists("/volume1/@iSCSI/LUN/BLOCK"));
    ORLOiSCSILun lost = MakeLun(7, ORLO_ISCSI_LUN_TYPE_FILE, "/volume7");
    EXPECT_EQ(18990028u, ORLOiSCSILunMkdir(&lost));
    EXPECT_FALSE(Exists("/volume7"));

    // A new section needs the LUN's directory: when it cannot be made, nothing is written.
    WriteFile("/volume2/@iSCSI/LUN", "not a directory");
    ORLOiSCSILun blocked = MakeLun(8, ORLO_ISCSI_LUN_TYPE_FILE, "/volume2");
    log_.Clear();
    EXPECT_EQ(18990028u, ORLOiSCSILunConfSet(&blocked));
    EXPECT_TRUE(log_.Contains("Failed to create LUN directory. path: /volume2/@iSCSI/LUN")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("ORLOiSCSITrgMkdir(")) << log_.Dump();
    EXPECT_FALSE(Exists(kGlobalConf));
}

class LunBtrfsTest : public orlotest::VolumeTest {};

TEST_F(LunBtrfsTest, BlockLevelLunsAreSubvolumesOnBtrfs) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(orlotest::LoopVolume::Fs::kBtrfs);
    ASSERT_TRUE(MountVolume(orlotest::LoopVolume::Fs::kBtrfs, 256ull << 20));
    ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
    ORLOiSCSILun blun = MakeLun(1, ORLO_ISCSI_LUN_TYPE_VDISK_BLUN);
    ORLOiSCSILun file = MakeLun(2, ORLO_ISCSI_LUN_TYPE_FILE);
    ASSERT_EQ(0u, ORLOiSCSILunConfSet(&blun)) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSILunConfSet(&file)) << log_.Dump();
    EXPECT_EQ(1, ORLOBtrfsIsSubVol(("/volume1/@iSCSI/LUN/VDISK_BLUN/" + UuidOf(1)).c_str()));
    EXPECT_EQ(0, ORLOBtrfsIsSubVol(("/volume1/@iSCSI/LUN/FILE/" + UuidOf(2)).c_str()));
    EXPECT_EQ(0, ORLOBtrfsIsSubVol("/volume1/@iSCSI/LUN/VDISK_BLUN"));
    ORLOiSCSILun back;
    ASSERT_EQ(0u, ORLOiSCSILunConfInVolumeLoadByUuid("/volume1", UuidOf(1).c_str(), &back));
    EXPECT_EQ(295u, back.type);
}

}  // namespace
