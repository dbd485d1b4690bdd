// The common header and the fixed blocks: what lands on disk byte for byte, checksums
// computed here independently, UUIDs in and out, and the codes of failed accesses.
#include <gtest/gtest.h>

#include <algorithm>
#include <ctime>
#include <string>

#include "ep/ep_test_util.h"
#include "ep_internal.h"
#include "orloiscsi_ep.h"
#include "support/sandbox.h"

namespace {

using eptest::BlockCrc;
using eptest::Le32;
using eptest::ReadAt;

class EpHeaderTest : public orlotest::SandboxTest {
  protected:
    void SetUp() override {
        SandboxTest::SetUp();
        WriteFile(kFile, std::string(8192, '\0'));
    }
    const char *kFile = "/volume1/f";
};

TEST_F(EpHeaderTest, FillWritesEveryFieldWithItsChecksum) {
    char uuid[37] = "";
    time_t before = time(nullptr);
    ASSERT_EQ(0u, ORLOiSCSIEpFileHeaderFill(kFile, uuid, EP_FILE_TYPE_DAT, 0)) << log_.Dump();
    time_t after = time(nullptr);
    ASSERT_EQ(36u, strlen(uuid));
    for (int dash : {8, 13, 18, 23}) EXPECT_EQ('-', uuid[dash]) << uuid;

    auto h = ReadAt(Real(kFile), 0, 64);
    ASSERT_EQ(64u, h.size());
    EXPECT_EQ(BlockCrc(h.data()), Le32(&h[0]));
    EXPECT_EQ(0x00010000u, Le32(&h[4]));
    const unsigned char magic[8] = {0x33, 0x06, 0x14, 0x18, 0x52, 0x25, 0x86, 0x08};
    EXPECT_EQ(0, memcmp(magic, &h[8], 8));
    EXPECT_EQ(3u, Le32(&h[16]));
    EXPECT_EQ(0x00100000u, Le32(&h[36]));
    EXPECT_EQ(0u, Le32(&h[40]));
    EXPECT_GE(Le32(&h[44]), static_cast<uint32_t>(before));
    EXPECT_LE(Le32(&h[44]), static_cast<uint32_t>(after));
    for (int i = 48; i < 64; ++i) EXPECT_EQ(0, h[i]) << "reserved byte " << i;

    // The binary UUID is the string's digits in order.
    char hex[33];
    for (int i = 0; i < 16; ++i) snprintf(hex + 2 * i, 3, "%02x", h[20 + i]);
    std::string digits(uuid);
    digits.erase(std::remove(digits.begin(), digits.end(), '-'), digits.end());
    EXPECT_EQ(digits, std::string(hex));

    char back[37] = "x";
    ASSERT_EQ(0u, ORLOiSCSIEpFileUuidGet(kFile, back));
    EXPECT_STREQ(uuid, back);
    // Nothing beyond the common header was touched.
    EXPECT_EQ(std::vector<unsigned char>(8192 - 64, 0), ReadAt(Real(kFile), 64, 8192 - 64));
}

TEST_F(EpHeaderTest, GivenUuidAndTimeAreKeptAndMalformedUuidsGiveZero) {
    char uuid[37] = "01234567-89AB-cdef-0011-223344556677";
    ASSERT_EQ(0u, ORLOiSCSIEpFileHeaderFill(kFile, uuid, EP_FILE_TYPE_MAP, 1234567890u));
    EXPECT_STREQ("01234567-89AB-cdef-0011-223344556677", uuid) << "a given UUID is not rewritten";
    auto h = ReadAt(Real(kFile), 0, 64);
    const unsigned char want[16] = {0x01, 0x23, 0x45, 0x67, 0x89, 0xab, 0xcd, 0xef,
                                    0x00, 0x11, 0x22, 0x33, 0x44, 0x55, 0x66, 0x77};
    EXPECT_EQ(0, memcmp(want, &h[20], 16));
    uint32_t ctime = 0;
    ASSERT_EQ(0u, ORLOiSCSIEpFileCreateTimeGet(kFile, &ctime));
    EXPECT_EQ(1234567890u, ctime);
    char back[37];
    ASSERT_EQ(0u, ORLOiSCSIEpFileUuidGet(kFile, back));
    EXPECT_STREQ("01234567-89ab-cdef-0011-223344556677", back);

    for (const char *bad : {"not-a-uuid", "0123456789ab-cdef-0011-223344556677",
                            "01234567-89ab-cdef-0011-2233445566778", "01234567-89ab-cdef-0011-22334455667",
                            "01234567-89ab-cdef-0011-22334455667g", "01234567_89ab-cdef-0011-223344556677"}) {
        char in[64];
        snprintf(in, sizeof(in), "%s", bad);
        std::string before(in);
        ASSERT_EQ(0u, ORLOiSCSIEpFileHeaderFill(kFile, in, EP_FILE_TYPE_MAP, 7)) << bad;
        EXPECT_EQ(before, std::string(in)) << "the buffer is left as given";
        auto z = ReadAt(Real(kFile), 0, 64);
        EXPECT_EQ(std::vector<unsigned char>(16, 0), std::vector<unsigned char>(z.begin() + 20, z.begin() + 36)) << bad;
        EXPECT_EQ(BlockCrc(z.data()), Le32(&z[0]));
        ASSERT_EQ(0u, ORLOiSCSIEpFileUuidGet(kFile, back));
        EXPECT_STREQ("00000000-0000-0000-0000-000000000000", back);
    }
}

TEST_F(EpHeaderTest, SettersChecksumACopyAndEveryByteCounts) {
    struct Accessor {
        uint32_t (*set)(const char *, const void *);
        uint32_t (*get)(const char *, void *);
        off_t off;
    };
    const Accessor accessors[] = {
        {ORLOiSCSIEpFileHeaderSet, ORLOiSCSIEpFileHeaderGet, 0},
        {ORLOiSCSIEpFileMapHeaderSet, ORLOiSCSIEpFileMapHeaderGet, 64},
        {ORLOiSCSIEpFileTblHeaderSet, ORLOiSCSIEpFileTblHeaderGet, 64},
        {ORLOiSCSIEpFileFriHeaderSet, ORLOiSCSIEpFileFriHeaderGet, 64},
        {ORLOiSCSIEpFileDatHeaderSet, ORLOiSCSIEpFileDatHeaderGet, 64},
        {ORLOiSCSIEpFileJnlHeaderSet, ORLOiSCSIEpFileJnlHeaderGet, 64},
        {ORLOiSCSIEpFileMapSetVar0, ORLOiSCSIEpFileMapGetVar0, 4096},
        {ORLOiSCSIEpFileMapSetVar1, ORLOiSCSIEpFileMapGetVar1, 4160},
        {ORLOiSCSIEpFileMapSetVar2, ORLOiSCSIEpFileMapGetVar2, 4224},
        {ORLOiSCSIEpFileJnlSetVar0, ORLOiSCSIEpFileJnlGetVar0, 4096},
        {ORLOiSCSIEpFileJnlSetVar1, ORLOiSCSIEpFileJnlGetVar1, 4160},
        {ORLOiSCSIEpFileFriSetVar0, ORLOiSCSIEpFileFriGetVar0, 4096},
    };
    for (const Accessor &a : accessors) {
        unsigned char block[64];
        for (int i = 0; i < 64; ++i) block[i] = static_cast<unsigned char>(i * 7 + a.off);
        unsigned char given[64];
        memcpy(given, block, 64);
        ASSERT_EQ(0u, a.set(kFile, block)) << a.off;
        EXPECT_EQ(0, memcmp(given, block, 64)) << "the caller's block is not modified";
        auto disk = ReadAt(Real(kFile), a.off, 64);
        EXPECT_EQ(BlockCrc(block), Le32(&disk[0])) << a.off;
        EXPECT_EQ(0, memcmp(block + 4, &disk[4], 60)) << a.off;

        unsigned char got[64];
        ASSERT_EQ(0u, a.get(kFile, got));
        EXPECT_EQ(0, memcmp(disk.data(), got, 64));

        // Any single changed byte changes the checksum.
        uint32_t first = Le32(&disk[0]);
        for (int i = 4; i < 64; ++i) {
            unsigned char changed[64];
            memcpy(changed, block, 64);
            changed[i] ^= 0x01;
            ASSERT_EQ(0u, a.set(kFile, changed));
            EXPECT_NE(first, Le32(ReadAt(Real(kFile), a.off, 4).data())) << "offset " << a.off << " byte " << i;
        }
    }
    // Getters do not verify: a damaged block is returned as stored.
    unsigned char junk[64];
    memset(junk, 0xEE, sizeof(junk));
    ASSERT_TRUE(eptest::WriteAt(Real(kFile), 4096, junk, 64));
    unsigned char got[64];
    ASSERT_EQ(0u, ORLOiSCSIEpFileMapGetVar0(kFile, got));
    EXPECT_EQ(0, memcmp(junk, got, 64));
}

TEST_F(EpHeaderTest, MapGetAllReadsTheWholeHead) {
    std::vector<unsigned char> head(4288);
    for (size_t i = 0; i < head.size(); ++i) head[i] = static_cast<unsigned char>(i % 251);
    ASSERT_TRUE(eptest::WriteAt(Real(kFile), 0, head.data(), head.size()));
    std::vector<unsigned char> got(4288);
    ASSERT_EQ(0u, ORLOiSCSIEpFileMapGetAll(kFile, got.data()));
    EXPECT_EQ(head, got);
}

TEST_F(EpHeaderTest, FailedAccessesReportTheirCodeAndThePath) {
    unsigned char block[64] = {};
    EXPECT_EQ(18990039u, ORLOiSCSIEpFileHeaderGet("/volume1/missing", block));
    EXPECT_TRUE(log_.Contains("open(\"/volume1/missing\", O_RDONLY | O_LARGEFILE) failed, err=")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("iSCSI:iscsi_ep_file_rw.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("FilePread(\"/volume1/missing\", ")) << log_.Dump();
    EXPECT_FALSE(log_.Contains(root())) << "logs speak of appliance paths:\n" << log_.Dump();

    // A write never creates the file.
    EXPECT_EQ(18990038u, ORLOiSCSIEpFileHeaderSet("/volume1/missing", block));
    EXPECT_FALSE(Exists("/volume1/missing"));

    // A file that ends before the block: a short read.
    WriteFile("/volume1/short", std::string(100, 'x'));
    log_.Clear();
    EXPECT_EQ(18990039u, ORLOiSCSIEpFileMapHeaderGet("/volume1/short", block));
    EXPECT_TRUE(log_.Contains(", 64, 64) failed, err=")) << log_.Dump();
    EXPECT_EQ(18990039u, ORLOiSCSIEpFileMapGetVar0("/volume1/short", block));
    std::vector<unsigned char> all(4288);
    EXPECT_EQ(18990039u, ORLOiSCSIEpFileMapGetAll("/volume1/short", all.data()));

    char uuid[37];
    uint32_t t = 0;
    EXPECT_EQ(18990003u, ORLOiSCSIEpFileHeaderFill(nullptr, uuid, 1, 0));
    EXPECT_EQ(18990003u, ORLOiSCSIEpFileHeaderFill(kFile, nullptr, 1, 0));
    EXPECT_EQ(18990003u, ORLOiSCSIEpFileHeaderGet(kFile, nullptr));
    EXPECT_EQ(18990003u, ORLOiSCSIEpFileUuidGet("", uuid));
    EXPECT_EQ(18990003u, ORLOiSCSIEpFileCreateTimeGet(kFile, nullptr));
    EXPECT_EQ(18990039u, ORLOiSCSIEpFileCreateTimeGet("/volume1/missing", &t));
}

TEST_F(EpHeaderTest, DecodeGivesFieldsAndVerdicts) {
    char uuid[37] = "aaaaaaaa-bbbb-cccc-dddd-eeeeeeeeeeee";
    ASSERT_EQ(0u, ORLOiSCSIEpFileHeaderFill(kFile, uuid, EP_FILE_TYPE_FRI, 42));
    unsigned char type[64] = {};
    ASSERT_EQ(0u, ORLOiSCSIEpFileFriHeaderSet(kFile, type));
    ORLOiSCSIEpFileHeaderInfo info;
    ASSERT_EQ(0u, ORLOiSCSIEpFileHeaderDecode(kFile, &info));
    EXPECT_TRUE(info.checksumOk);
    EXPECT_TRUE(info.magicOk);
    EXPECT_TRUE(info.typeHeaderPresent);
    EXPECT_TRUE(info.typeChecksumOk);
    EXPECT_EQ(2u, info.fileType);
    EXPECT_EQ(0x00010000u, info.version);
    EXPECT_EQ(0x00100000u, info.headSize);
    EXPECT_EQ(42u, info.createTime);
    EXPECT_STREQ(uuid, info.uuid);

    // One damaged byte in each block is caught.
    unsigned char x = 0x5A;
    ASSERT_TRUE(eptest::WriteAt(Real(kFile), 50, &x, 1));
    ASSERT_TRUE(eptest::WriteAt(Real(kFile), 100, &x, 1));
    ASSERT_EQ(0u, ORLOiSCSIEpFileHeaderDecode(kFile, &info));
    EXPECT_FALSE(info.checksumOk);
    EXPECT_NE(info.checksumStored, info.checksumComputed);
    EXPECT_TRUE(info.magicOk);
    EXPECT_FALSE(info.typeChecksumOk);

    // Not a pool file at all; and one that ends after its common header.
    WriteFile("/volume1/text", std::string(64, 'a'));
    ASSERT_EQ(0u, ORLOiSCSIEpFileHeaderDecode("/volume1/text", &info));
    EXPECT_FALSE(info.magicOk);
    EXPECT_FALSE(info.checksumOk);
    EXPECT_FALSE(info.typeHeaderPresent);
    EXPECT_EQ(18990039u, ORLOiSCSIEpFileHeaderDecode("/volume1/missing", &info));
}

}  // namespace
