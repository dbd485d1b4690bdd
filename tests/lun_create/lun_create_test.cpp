// LUN creation on real volumes: what each type leaves on disk and in both LUN files, the
// identities a creation hands out, the count limit, the space rule and the plug-ins.
#include <json-c/json.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <map>
#include <string>
#include <vector>

#include "ep_internal.h"
#include "lun_create_fixture.h"
#include "orlo_storage.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_file.h"

namespace {

using lun_create_test::CreateTest;
using lun_create_test::kGiB;
using lun_create_test::kGlobalConf;
using lun_create_test::kMiB;
using lun_create_test::kVolumeConf;
using lun_create_test::NewLun;
using orlotest::LoopVolume;

bool IsUuidString(const char *s) {
    if (strlen(s) != 36) return false;
    for (int i = 0; i < 36; ++i) {
        bool dash = i == 8 || i == 13 || i == 18 || i == 23;
        if (dash ? s[i] != '-' : !isxdigit(static_cast<unsigned char>(s[i]))) return false;
    }
    return true;
}

class LunCreateTypesTest : public CreateTest, public ::testing::WithParamInterface<LoopVolume::Fs> {};

// Every type on Btrfs and on ext4: lids in order, the directory (a subvolume only for the
// block-level types on Btrfs), the data or map file, and the same section in both files.
TEST_P(LunCreateTypesTest, EveryTypeLeavesItsDirectoryObjectAndSections) {
    const LoopVolume::Fs fs = GetParam();
    ORLO_SKIP_UNLESS_LOOP_VOLUME(fs);
    ASSERT_TRUE(MountVolume(fs, 512 * kMiB));
    const bool btrfs = fs == LoopVolume::Fs::kBtrfs;

    struct Case {
        uint32_t type;
        uint64_t size;
    };
    const Case cases[] = {
        {ORLO_ISCSI_LUN_TYPE_FILE, 64 * kMiB},      {ORLO_ISCSI_LUN_TYPE_THIN, 2 * kGiB},
        {ORLO_ISCSI_LUN_TYPE_ADV, 3 * kGiB},        {ORLO_ISCSI_LUN_TYPE_SINK, kGiB},
        {ORLO_ISCSI_LUN_TYPE_VDISK_ADV, kGiB},      {ORLO_ISCSI_LUN_TYPE_BKP_THIN, kGiB},
        {ORLO_ISCSI_LUN_TYPE_BKP_ADV, kGiB},        {ORLO_ISCSI_LUN_TYPE_CINDER, kGiB},
        {ORLO_ISCSI_LUN_TYPE_BLUN, 5 * kGiB},       {ORLO_ISCSI_LUN_TYPE_VDISK_BLUN, kGiB},
    };
    std::vector<ORLOiSCSILun> made;
    int lid = 0;
    for (const Case &c : cases) {
        SCOPED_TRACE(ORLOiSCSILunTypeName(c.type));
        ORLOiSCSILun lun = NewLun(std::string("lun-") + ORLOiSCSILunTypeName(c.type), c.type, c.size);
        if (c.type == ORLO_ISCSI_LUN_TYPE_FILE) lun.blockSize = 4096;
        lun.restoredTime = 12345;
        log_.Clear();
        ASSERT_EQ(0u, ORLOiSCSILunCreate(&lun)) << log_.Dump();
        EXPECT_EQ(++lid, lun.lid);
        EXPECT_TRUE(IsUuidString(lun.uuid)) << lun.uuid;
        EXPECT_STREQ(lun.uuid, lun.vpdUnitSerial) << "an empty serial becomes the uuid";
        EXPECT_EQ(0, lun.restoredTime);
        EXPECT_EQ(-1, lun.lockHandle);
        EXPECT_TRUE(log_.Contains("[D] iSCSIWebAPI:iscsi_lun_create.cpp:")) << log_.Dump();
        EXPECT_TRUE(log_.Contains(std::string("LUN UUID: ") + lun.uuid + " ,LUN ID: " + std::to_string(lun.lid)));

        struct stat st;
        ASSERT_TRUE(StatOf(LunDir(lun), &st));
        EXPECT_TRUE(S_ISDIR(st.st_mode));
        const bool blockLevel = (c.type & ORLO_ISCSI_LUN_BIT_BLUN) != 0;
        EXPECT_EQ(btrfs && blockLevel ? 1 : 0, ORLOBtrfsIsSubVol(LunDir(lun).c_str()));

        ASSERT_TRUE(StatOf(DataFile(lun), &st)) << "no data or map file";
        if (ORLO_ISCSI_LUN_IS_ADV(c.type)) {
            bool isMap = false;
            ASSERT_EQ(0u, ORLOiSCSIEpIsMapFile(DataFile(lun).c_str(), &isMap));
            EXPECT_TRUE(isMap);
            uint64_t total = 0;
            ASSERT_EQ(0u, ORLOiSCSIEpMapFileTotalCountGet(DataFile(lun).c_str(), &total));
            EXPECT_EQ(c.size / ORLO_EP_DEFAULT_EXTENT_SIZE, total);
            EXPECT_EQ(ORLO_EP_DEFAULT_EXTENT_SIZE, lun.extentSize);
            EXPECT_TRUE(Exists("/volume1/@iSCSI/EP/EP_TBL"));
        } else {
            EXPECT_EQ(static_cast<off_t>(c.size), st.st_size);
            const uint64_t allocated = static_cast<uint64_t>(st.st_blocks) * 512;
            if (ORLO_ISCSI_LUN_TYPE_HAS(c.type, ORLO_ISCSI_LUN_TYPE_THIN)) {
                EXPECT_LT(allocated, kMiB) << "thin LUNs are sparse";
            } else {
                EXPECT_GE(allocated, c.size) << "thick LUNs are allocated";
            }
        }
        EXPECT_FALSE(Exists(std::string("/tmp/iscsi/LUN_") + lun.uuid + ".progress")) << "the LUN lock is released";
        made.push_back(lun);
    }
    // The thick LUN's growth was published in this process's progress file, which goes
    // when the creation ends.
    EXPECT_FALSE(Exists("/tmp/iscsi/P" + std::to_string(getpid()) + ".progress"));

    const std::vector<ORLOiSCSILun> global = Records(kGlobalConf);
    const std::vector<ORLOiSCSILun> volume = Records(kVolumeConf);
    ASSERT_EQ(made.size(), global.size());
    ASSERT_EQ(made.size(), volume.size());
    for (size_t i = 0; i < made.size(); ++i) {
        for (const ORLOiSCSILun *stored : {&global[i], &volume[i]}) {
            EXPECT_EQ(made[i].lid, stored->lid);
            EXPECT_EQ(made[i].type, stored->type);
            EXPECT_EQ(made[i].size, stored->size);
            EXPECT_EQ(made[i].blockSize, stored->blockSize);
            EXPECT_STREQ(made[i].name, stored->name);
            EXPECT_STREQ(made[i].uuid, stored->uuid);
            EXPECT_STREQ(made[i].vpdUnitSerial, stored->vpdUnitSerial);
            EXPECT_STREQ("/volume1", stored->rootPath);
        }
    }

    // A BLOCK LUN is bound to a device: a section in the global file only, nothing on a
    // volume, no space check (it is larger than the volume has free).
    ORLOiSCSILun block = NewLun("lun-block", ORLO_ISCSI_LUN_TYPE_BLOCK, 400 * kMiB, Volume(1)->device());
    const auto before = Tree();
    ASSERT_EQ(0u, ORLOiSCSILunCreate(&block)) << log_.Dump();
    EXPECT_EQ(11, block.lid);
    EXPECT_EQ(made.size() + 1, Records(kGlobalConf).size());
    EXPECT_EQ(made.size(), Records(kVolumeConf).size());
    for (const std::string &p : Tree())
        EXPECT_TRUE(before.count(p) || p.rfind("/tmp/", 0) == 0 || p.rfind("/usr/orlo/etc/", 0) == 0) << p;
    EXPECT_NE(std::string::npos, ReadFile(kGlobalConf).find("\trootpath=" + Volume(1)->device() + "\n"));
    // ... and no larger than the device.
    ORLOiSCSILun huge = NewLun("lun-block-huge", ORLO_ISCSI_LUN_TYPE_BLOCK, 1024 * kGiB, Volume(1)->device());
    log_.Clear();
    EXPECT_EQ(18990502u, ORLOiSCSILunCreate(&huge));
    EXPECT_TRUE(log_.Contains("iscsi_lun_object_create_block.cpp:")) << log_.Dump();
    EXPECT_EQ(made.size() + 1, Records(kGlobalConf).size());
}

INSTANTIATE_TEST_SUITE_P(Fs, LunCreateTypesTest, ::testing::Values(LoopVolume::Fs::kBtrfs, LoopVolume::Fs::kExt4),
                         [](const ::testing::TestParamInfo<LoopVolume::Fs> &info) {
                             return std::string(LoopVolume::FsName(info.param));
                         });

// Lids fill the first gap, a preset lid, uuid or serial is kept, a name or uuid already in
// use is refused without anything being made.
TEST_F(CreateTest, IdentitiesFollowTheLunsAlreadyThere) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kExt4);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kExt4, 256 * kMiB));
    EXPECT_EQ(1, ORLOiSCSILunUnusedLidGet()) << "no LUNs";

    // LUNs with lids 1, 2 and 4 (written as a caller with preset lids would).
    for (int lid : {1, 2, 4}) {
        ORLOiSCSILun lun = NewLun("old-" + std::to_string(lid), ORLO_ISCSI_LUN_TYPE_THIN, kGiB);
        lun.lid = lid;
        ASSERT_EQ(0u, ORLOiSCSILunCreate(&lun)) << log_.Dump();
        EXPECT_EQ(lid, lun.lid) << "a preset lid is kept";
    }
    EXPECT_EQ(3, ORLOiSCSILunUnusedLidGet());
    ORLOiSCSILun third = NewLun("third", ORLO_ISCSI_LUN_TYPE_THIN, kGiB);
    ASSERT_EQ(0u, ORLOiSCSILunCreate(&third)) << log_.Dump();
    EXPECT_EQ(3, third.lid);
    ORLOiSCSILun fifth = NewLun("fifth", ORLO_ISCSI_LUN_TYPE_THIN, kGiB);
    ASSERT_EQ(0u, ORLOiSCSILunCreate(&fifth)) << log_.Dump();
    EXPECT_EQ(5, fifth.lid) << "1 to 4 in use";

    // A preset lid is not checked for uniqueness; preset uuid and serial are kept.
    ORLOiSCSILun preset = NewLun("preset", ORLO_ISCSI_LUN_TYPE_FILE, 8 * kMiB);
    preset.lid = 2;
    snprintf(preset.uuid, sizeof(preset.uuid), "%s", "0badc0de-0000-4000-8000-00000000abcd");
    snprintf(preset.vpdUnitSerial, sizeof(preset.vpdUnitSerial), "%s", "SERIAL-0001");
    ASSERT_EQ(0u, ORLOiSCSILunCreate(&preset)) << log_.Dump();
    EXPECT_EQ(2, preset.lid);
    EXPECT_STREQ("0badc0de-0000-4000-8000-00000000abcd", preset.uuid);
    EXPECT_STREQ("SERIAL-0001", preset.vpdUnitSerial);
    EXPECT_TRUE(Exists("/volume1/@iSCSI/LUN/FILE/0badc0de-0000-4000-8000-00000000abcd/"
                       "0badc0de-0000-4000-8000-00000000abcd_00000"));

    int exists = -1;
    ASSERT_EQ(0u, ORLOiSCSILunIsNameExist("fifth", &exists));
    EXPECT_EQ(1, exists);
    ASSERT_EQ(0u, ORLOiSCSILunIsNameExist("sixth", &exists));
    EXPECT_EQ(0, exists);
    char uuid[37];
    ASSERT_EQ(0u, ORLOiSCSILunUuidGenerate(uuid));
    EXPECT_TRUE(IsUuidString(uuid));

    // A name or a uuid in use: refused under the creation lock, nothing made.
    const auto before = Tree();
    ORLOiSCSILun dupName = NewLun("fifth", ORLO_ISCSI_LUN_TYPE_THIN, kGiB);
    log_.Clear();
    EXPECT_EQ(18990538u, ORLOiSCSILunCreate(&dupName));
    EXPECT_TRUE(log_.Contains(":ORLOiSCSILunCreate Duplicated LUN name: fifth") ||
                log_.Contains("Duplicated LUN name: fifth"))
        << log_.Dump();
    ORLOiSCSILun dupUuid = NewLun("other", ORLO_ISCSI_LUN_TYPE_THIN, kGiB);
    snprintf(dupUuid.uuid, sizeof(dupUuid.uuid), "%s", preset.uuid);
    EXPECT_EQ(18990505u, ORLOiSCSILunCreate(&dupUuid));
    for (const std::string &p : Tree()) EXPECT_TRUE(before.count(p) || p == "/var/log/orlo/event.log" ||
                                                    p == "/var" || p == "/var/log" || p == "/var/log/orlo") << p;
    EXPECT_EQ(6u, Records(kGlobalConf).size());
    EXPECT_EQ(6u, Records(kVolumeConf).size());
}

// Bad requests are refused with their code and one log line before anything is made.
TEST_F(CreateTest, BadRequestsAreRefusedBeforeAnythingIsMade) {
    const bool haveVolume = LoopVolume::Unavailable(LoopVolume::Fs::kExt4).empty();
    if (haveVolume) {
        ASSERT_TRUE(MountVolume(LoopVolume::Fs::kExt4, 256 * kMiB));
    }
    // A second directory that looks like a volume but is no mount.
    WriteFile("/volume2/.keep", "");

    const ORLOiSCSILun good = NewLun("good", ORLO_ISCSI_LUN_TYPE_THIN, kGiB);
    struct Case {
        const char *what;
        uint32_t code;
        void (*spoil)(ORLOiSCSILun *);
    };
    const Case cases[] = {
        {"empty name", 18990503, [](ORLOiSCSILun *l) { l->name[0] = '\0'; }},
        {"256-character name", 18990503, [](ORLOiSCSILun *l) { memset(l->name, 'n', sizeof(l->name)); }},
        {"name with a line break", 18990503, [](ORLOiSCSILun *l) { strcpy(l->name, "a\nb"); }},
        {"name with a tab", 18990503, [](ORLOiSCSILun *l) { strcpy(l->name, "a\tb"); }},
        {"name with ]", 18990503, [](ORLOiSCSILun *l) { strcpy(l->name, "a]b"); }},
        {"size 0", 18990502, [](ORLOiSCSILun *l) { l->size = 0; }},
        {"size not a multiple of the block size", 18990502, [](ORLOiSCSILun *l) { l->size = kGiB + 512; l->blockSize = 4096; }},
        {"block size 1024", 18990004, [](ORLOiSCSILun *l) { l->blockSize = 1024; }},
        {"block size 0", 18990004, [](ORLOiSCSILun *l) { l->blockSize = 0; }},
        {"type 0", 18990500, [](ORLOiSCSILun *l) { l->type = 0; }},
        {"type 5", 18990500, [](ORLOiSCSILun *l) { l->type = 5; }},
        {"lid 1025", 18990504, [](ORLOiSCSILun *l) { l->lid = 1025; }},
        {"malformed uuid", 18990505, [](ORLOiSCSILun *l) { strcpy(l->uuid, "../../etc"); }},
        {"extent size 3000", 18990507, [](ORLOiSCSILun *l) { l->type = ORLO_ISCSI_LUN_TYPE_ADV; l->extentSize = 3000; }},
        {"not a volume path", 18990501, [](ORLOiSCSILun *l) { strcpy(l->rootPath, "/tmp"); }},
        {"a path inside a volume", 18990501, [](ORLOiSCSILun *l) { strcpy(l->rootPath, "/volume1/sub"); }},
        {"volume with a leading zero", 18990501, [](ORLOiSCSILun *l) { strcpy(l->rootPath, "/volume01"); }},
        {"volume with a blank", 18990501, [](ORLOiSCSILun *l) { strcpy(l->rootPath, "/volume 1"); }},
        {"volume with a suffix", 18990501, [](ORLOiSCSILun *l) { strcpy(l->rootPath, "/volume1x"); }},
        {"a volume that is not mounted", 18990501, [](ORLOiSCSILun *l) { strcpy(l->rootPath, "/volume2"); }},
        {"relative root path", 18990501, [](ORLOiSCSILun *l) { strcpy(l->rootPath, "volume1"); }},
        {"BLOCK on a character device", 18990501,
         [](ORLOiSCSILun *l) { l->type = ORLO_ISCSI_LUN_TYPE_BLOCK; strcpy(l->rootPath, "/dev/null"); }},
        {"BLOCK on a volume", 18990501,
         [](ORLOiSCSILun *l) { l->type = ORLO_ISCSI_LUN_TYPE_BLOCK; strcpy(l->rootPath, "/volume1"); }},
    };
    const auto before = Tree();
    for (const Case &c : cases) {
        SCOPED_TRACE(c.what);
        ORLOiSCSILun lun = good;
        c.spoil(&lun);
        log_.Clear();
        EXPECT_EQ(c.code, ORLOiSCSILunCreate(&lun));
        ASSERT_EQ(1u, log_.Lines().size()) << log_.Dump();
        EXPECT_NE(std::string::npos, log_.Lines()[0].find("iSCSI:iscsi_lun_create.cpp:")) << log_.Dump();
        EXPECT_EQ(before, Tree()) << "something was made";
    }
    log_.Clear();
    EXPECT_EQ(18990003u, ORLOiSCSILunCreate(nullptr));
    EXPECT_EQ(1u, log_.Lines().size());
    EXPECT_EQ(before, Tree());

    // The unspoilt request works, so each refusal above was for its own fault.
    if (haveVolume) {
        ORLOiSCSILun lun = good;
        EXPECT_EQ(0u, ORLOiSCSILunCreate(&lun)) << log_.Dump();
    }
}

// "max_iscsiluns" caps the number of LUNs; missing or negative means 256.
TEST_F(CreateTest, TheCountLimitComesFromTheApplianceSettings) {
    EXPECT_EQ(256, ORLOiSCSILunQuantityLimitGet());
    WriteFile("/etc.defaults/orloinfo.conf", "max_iscsiluns=\"-1\"\n");
    EXPECT_EQ(256, ORLOiSCSILunQuantityLimitGet());
    WriteFile("/etc.defaults/orloinfo.conf", "company=\"x\"\nmax_iscsiluns=\"2\"\n");
    EXPECT_EQ(2, ORLOiSCSILunQuantityLimitGet());
    int reached = -1;
    ASSERT_EQ(0u, ORLOiSCSILunIsQuantityLimitReached(&reached));
    EXPECT_EQ(0, reached);

    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kExt4);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kExt4, 256 * kMiB));
    for (const char *name : {"one", "two"}) {
        ORLOiSCSILun lun = NewLun(name, ORLO_ISCSI_LUN_TYPE_THIN, kGiB);
        ASSERT_EQ(0u, ORLOiSCSILunCreate(&lun)) << log_.Dump();
    }
    ASSERT_EQ(0u, ORLOiSCSILunIsQuantityLimitReached(&reached));
    EXPECT_EQ(1, reached);
    const auto before = Tree();
    ORLOiSCSILun three = NewLun("three", ORLO_ISCSI_LUN_TYPE_THIN, kGiB);
    EXPECT_EQ(18990541u, ORLOiSCSILunCreate(&three));
    EXPECT_EQ(0, three.lid);
    EXPECT_EQ(2u, Records(kGlobalConf).size());
    for (const std::string &p : Tree()) EXPECT_TRUE(before.count(p) || p.rfind("/var", 0) == 0) << p;
    EXPECT_NE(std::string::npos, ReadFile("/var/log/orlo/event.log").find("\t0x13000038\tthree\tTHIN\t/volume1\n"));
}

// The space rule: a thick LUN needs its size and the reserve free; thin and advanced LUNs
// only their metadata and the reserve.
TEST_F(CreateTest, TheSpaceRuleDependsOnTheType) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kExt4);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kExt4, 256 * kMiB));
    ORLO_SPACE_INFO info;
    ASSERT_EQ(1, ORLOSpaceInfoGet("/volume1", &info));
    const uint64_t reserve = info.totalBytes / 100;

    ORLOiSCSILun thick = NewLun("thick", ORLO_ISCSI_LUN_TYPE_FILE, 0);
    thick.size = (info.freeBytes - reserve) / 4096 * 4096;
    EXPECT_EQ(0u, ORLOiSCSILunIsSpaceEnoughToCreate(&thick)) << log_.Dump();
    thick.size += 2 * kMiB;
    log_.Clear();
    EXPECT_EQ(18990584u, ORLOiSCSILunIsSpaceEnoughToCreate(&thick));
    const std::string expected = "Not enough space. " + std::to_string((thick.size + reserve + kMiB - 1) >> 20) +
                                 " >= " + std::to_string(info.freeBytes >> 20);
    EXPECT_TRUE(log_.Contains(expected)) << expected << "\n" << log_.Dump();

    ORLOiSCSILun thin = NewLun("thin", ORLO_ISCSI_LUN_TYPE_THIN, 1024 * kGiB);
    EXPECT_EQ(0u, ORLOiSCSILunIsSpaceEnoughToCreate(&thin));
    ORLOiSCSILun adv = NewLun("adv", ORLO_ISCSI_LUN_TYPE_ADV, 1024 * kGiB);
    EXPECT_EQ(0u, ORLOiSCSILunIsSpaceEnoughToCreate(&adv));
    ORLOiSCSILun block = NewLun("block", ORLO_ISCSI_LUN_TYPE_BLOCK, 1024 * kGiB, "/dev/nothing");
    EXPECT_EQ(0u, ORLOiSCSILunIsSpaceEnoughToCreate(&block)) << "a BLOCK LUN is its own space";

    // Fill the volume up to a little above the reserve: thin and advanced LUNs no longer fit.
    ASSERT_EQ(1, ORLOSpaceInfoGet("/volume1", &info));
    ASSERT_EQ(0, orlotest::RunProgram({"/usr/bin/fallocate", "-l",
                                       std::to_string(info.freeBytes - reserve - kMiB / 2),
                                       Real("/volume1/filler")}));
    log_.Clear();
    EXPECT_EQ(18990584u, ORLOiSCSILunIsSpaceEnoughToCreate(&adv));
    EXPECT_TRUE(log_.Contains("Not enough space for EP lun.")) << log_.Dump();
    EXPECT_EQ(18990584u, ORLOiSCSILunIsSpaceEnoughToCreate(&thin));
    EXPECT_EQ(18990584u, ORLOiSCSILunCreate(&thin));
}

std::map<std::string, std::string> JsonFields(const std::string &text) {
    std::map<std::string, std::string> out;
    json_object *obj = json_tokener_parse(text.c_str());
    if (obj == nullptr) return out;
    json_object_object_foreach(obj, key, value) out[key] = json_object_get_string(value);
    json_object_put(obj);
    return out;
}

// Plug-ins run in name order, pre before the data file is made (while the LUN is locked)
// and post after, each with the LUN in JSON.
TEST_F(CreateTest, PluginsHearOfTheCreationBeforeAndAfter) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kExt4);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kExt4, 256 * kMiB));
    const std::string out = Real("/plugin-out");
    for (const char *name : {"20-second", "10-first"}) {
        Plugin(name, "cat > " + out + "." + name + ".$1.json\n"
                     "echo \"" + name + " $1 $2 locked=$(ls " + Real("/tmp/iscsi") + " | grep -c '^LUN_.*progress$')"
                     " files=$(ls " + Real("/volume1/@iSCSI/LUN/THIN") + "/* | grep -c _00000)\" >> " + out + ".events\n");
    }
    WriteFile(std::string(lun_create_test::kPluginDir) + "/30-not-executable", "#!/bin/sh\nexit 1\n", 0644);

    ORLOiSCSILun lun = NewLun("seen", ORLO_ISCSI_LUN_TYPE_THIN, 2 * kGiB);
    lun.blockSize = 4096;
    ASSERT_EQ(0u, ORLOiSCSILunCreate(&lun)) << log_.Dump();
    EXPECT_EQ("10-first 4 lun_create locked=1 files=0\n"
              "20-second 4 lun_create locked=1 files=0\n"
              "10-first 5 lun_create locked=1 files=1\n"
              "20-second 5 lun_create locked=1 files=1\n",
              ReadFile("/plugin-out.events"));
    for (const char *event : {"4", "5"}) {
        auto fields = JsonFields(ReadFile(std::string("/plugin-out.10-first.") + event + ".json"));
        EXPECT_EQ("seen", fields["name"]);
        EXPECT_EQ("THIN", fields["type"]);
        EXPECT_EQ(lun.uuid, fields["uuid"]);
        EXPECT_EQ("1", fields["lid"]);
        EXPECT_EQ(std::to_string(2 * kGiB), fields["size"]);
        EXPECT_EQ("4096", fields["block_size"]);
        EXPECT_EQ("/volume1", fields["root_path"]);
        if (std::string(event) == "4") {
            EXPECT_EQ(0u, fields.count("result"));
        } else {
            EXPECT_EQ("0", fields["result"]);
        }
    }
    // A failing post-step is only logged: the LUN exists.
    Plugin("40-post-fails", "[ \"$1\" = 5 ] && exit 3\nexit 0\n");
    ORLOiSCSILun second = NewLun("second", ORLO_ISCSI_LUN_TYPE_THIN, kGiB);
    log_.Clear();
    EXPECT_EQ(0u, ORLOiSCSILunCreate(&second));
    EXPECT_TRUE(log_.Contains("Failed to execute lun_create plugin (POST). lid: 2, lun_name: second")) << log_.Dump();
    EXPECT_EQ(2u, Records(kGlobalConf).size());
}

}  // namespace
