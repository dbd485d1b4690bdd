// Base file utilities in a sandbox: directories, growing files with the progress file,
// copies and renames, UUIDs and the CRC-32.
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "olibc.h"
#include "orlo_storage.h"
#include "orloiscsi_file.h"
#include "support/sandbox.h"

namespace {

class FileUtilTest : public orlotest::SandboxTest {
  protected:
    void SetUp() override {
        SandboxTest::SetUp();
        mkdir(Real("/tmp/iscsi").c_str(), 0700);
    }
    std::string ProgressFile() const { return "/tmp/iscsi/P" + std::to_string(getpid()) + ".progress"; }
    // The one captured line, or a dump of them all when there is not exactly one.
    std::string OnlyLine() const {
        auto lines = log_.Lines();
        return lines.size() == 1 ? lines[0] : "lines:\n" + log_.Dump();
    }
    // Lines are "iSCSI:<file>:<line>:<function> <text>"; the line number is dropped.
    std::string OnlyLineWithoutNumber() const {
        std::string l = OnlyLine();
        size_t a = l.find(':', 6), b = a == std::string::npos ? a : l.find(':', a + 1);
        return b == std::string::npos ? l : l.substr(0, a) + l.substr(b);
    }
    off_t SizeOf(const std::string &logical) const {
        struct stat st;
        return stat(Real(logical).c_str(), &st) == 0 ? st.st_size : -1;
    }
};

TEST_F(FileUtilTest, DirPathGetRefusesMissingDirectoriesAndShortBuffers) {
    char buf[64];
    EXPECT_EQ(18990427u, ORLOiSCSIDirPathGet("/volume1", buf, sizeof(buf)));
    EXPECT_EQ("iSCSI:iscsi_dir_path_get.cpp:ORLOiSCSIDirPathGet iSCSI folder do not exist on /volume1",
              OnlyLineWithoutNumber());

    mkdir(Real("/volume1/@iSCSI").c_str(), 0700);
    log_.Clear();
    EXPECT_EQ(0u, ORLOiSCSIDirPathGet("/volume1", buf, sizeof(buf)));
    EXPECT_STREQ("/volume1/@iSCSI", buf);
    EXPECT_TRUE(log_.Lines().empty());

    // "/volume1/@iSCSI" is 15 characters: 16 bytes fit, 15 do not, and nothing is cut.
    char exact[16];
    EXPECT_EQ(0u, ORLOiSCSIDirPathGet("/volume1", exact, sizeof(exact)));
    char shorter[15];
    log_.Clear();
    EXPECT_EQ(18990050u, ORLOiSCSIDirPathGet("/volume1", shorter, sizeof(shorter)));
    EXPECT_STREQ("", shorter);
    EXPECT_EQ("iSCSI:iscsi_dir_path_get.cpp:ORLOiSCSIDirPathGet snprintf() failed with buffer size 15",
              OnlyLineWithoutNumber());

    EXPECT_EQ(18990004u, ORLOiSCSIDirPathGet(nullptr, buf, sizeof(buf)));
    EXPECT_EQ(18990004u, ORLOiSCSIDirPathGet("/volume1", nullptr, 10));
}

TEST_F(FileUtilTest, MkdirAndRmdirOfPlainDirectories) {
    EXPECT_EQ(0u, ORLOiSCSIMkdir("/volume1/LUN", 0));
    struct stat st;
    ASSERT_EQ(0, stat(Real("/volume1/LUN").c_str(), &st));
    EXPECT_EQ(0700u, st.st_mode & 07777);
    EXPECT_EQ(0u, ORLOiSCSIMkdir("/volume1/LUN", 0));  // exists: fine

    WriteFile("/volume1/afile", "x");
    log_.Clear();
    EXPECT_EQ(18990028u, ORLOiSCSIMkdir("/volume1/afile", 0));
    EXPECT_EQ("iSCSI:iscsi_mkdir.cpp:ORLOiSCSIMkdir mkdir(\"/volume1/afile\", S_IRWXU) failed, err=File exists",
              OnlyLineWithoutNumber());
    EXPECT_EQ(18990028u, ORLOiSCSIMkdir("/volume1/no/parent", 0));
    EXPECT_EQ(18990003u, ORLOiSCSIMkdir(nullptr, 0));

    // A plain directory asked to be a subvolume: "exists", whatever the file system.
    log_.Clear();
    EXPECT_EQ(18990012u, ORLOiSCSIMkdir("/volume1/LUN", 1));
    EXPECT_EQ("iSCSI:iscsi_mkdir.cpp:ORLOiSCSIMkdir LUN directory exists. path: /volume1/LUN", OnlyLineWithoutNumber());

    WriteFile("/volume1/LUN/keep", "k");
    log_.Clear();
    EXPECT_EQ(18990029u, ORLOiSCSIRmdir("/volume1/LUN"));
    EXPECT_EQ("iSCSI:iscsi_rmdir.cpp:ORLOiSCSIRmdir rmdir(\"/volume1/LUN\") failed, err=Directory not empty",
              OnlyLineWithoutNumber());
    EXPECT_EQ("k", ReadFile("/volume1/LUN/keep"));
    unlink(Real("/volume1/LUN/keep").c_str());
    EXPECT_EQ(0u, ORLOiSCSIRmdir("/volume1/LUN"));
    EXPECT_FALSE(Exists("/volume1/LUN"));
    EXPECT_EQ(0u, ORLOiSCSIRmdir("/volume1/LUN"));  // gone already
    EXPECT_EQ(18990003u, ORLOiSCSIRmdir(nullptr));
}

TEST_F(FileUtilTest, TruncModeFollowsTheFileSystemType) {
    for (int type = -2; type <= 20; ++type) {
        unsigned int mode = 99;
        int rc = ORLOiSCSIFileTruncModeGet(0, type, &mode);
        if (type < 0 || (type > 14 && type != 18)) {
            EXPECT_EQ(-1, rc) << type;
            EXPECT_EQ(0x0D00, OLIBCErrGet()) << type;
            EXPECT_EQ(99u, mode) << type;
            continue;
        }
        EXPECT_EQ(0, rc) << type;
        EXPECT_EQ(type == 2 || type == 3 ? 3u : 2u, mode) << type;
        EXPECT_EQ(0, ORLOiSCSIFileTruncModeGet(1, type, &mode));
        EXPECT_EQ(1u, mode) << type;
    }
    EXPECT_EQ(-1, ORLOiSCSIFileTruncModeGet(1, 15, nullptr));
    EXPECT_EQ(-1, ORLOiSCSIFileTruncModeGet(0, 3, nullptr));
}

TEST_F(FileUtilTest, TruncOnlyGrowsAndGrowingToThePresentSizeWritesNothing) {
    uint64_t progress = 0;
    EXPECT_EQ(0u, ORLOiSCSIFileTrunc("/volume1/lun", 8 << 20, &progress, ORLO_ISCSI_TRUNC_MODE_SPARSE));
    EXPECT_EQ(8 << 20, SizeOf("/volume1/lun"));
    EXPECT_EQ(8u << 20, progress);
    struct stat st;
    ASSERT_EQ(0, stat(Real("/volume1/lun").c_str(), &st));
    EXPECT_LT(st.st_blocks * 512, 1 << 20) << "sparse mode wrote data";
    EXPECT_FALSE(Exists(ProgressFile())) << "sparse mode needs no progress";

    // Present size, in every mode: success, no data, no progress file, same times.
    struct timespec before = st.st_mtim;
    for (unsigned int mode : {1u, 2u, 3u}) {
        progress = 0;
        EXPECT_EQ(0u, ORLOiSCSIFileTrunc("/volume1/lun", 8 << 20, &progress, mode)) << mode;
        EXPECT_EQ(0u, progress);
    }
    ASSERT_EQ(0, stat(Real("/volume1/lun").c_str(), &st));
    EXPECT_EQ(before.tv_sec, st.st_mtim.tv_sec);
    EXPECT_EQ(before.tv_nsec, st.st_mtim.tv_nsec);
    EXPECT_FALSE(Exists(ProgressFile()));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();

    EXPECT_EQ(18990007u, ORLOiSCSIFileTrunc("/volume1/lun", (8 << 20) - 1, nullptr, ORLO_ISCSI_TRUNC_MODE_SPARSE));
    EXPECT_EQ("iSCSI:iscsi_file_trunc.cpp:ORLOiSCSIFileTrunc Trunc file size is smaller than original file size. "
              "trunc: 8388607, orig: 8388608",
              OnlyLineWithoutNumber());
    EXPECT_EQ(8 << 20, SizeOf("/volume1/lun"));

    EXPECT_EQ(18990004u, ORLOiSCSIFileTrunc("/volume1/lun", 9 << 20, nullptr, 0));
    EXPECT_EQ(18990004u, ORLOiSCSIFileTrunc("/volume1/lun", 9 << 20, nullptr, 4));
    EXPECT_EQ(18990003u, ORLOiSCSIFileTrunc(nullptr, 1, nullptr, 1));
    mkdir(Real("/volume1/dir").c_str(), 0700);
    EXPECT_EQ(18990006u, ORLOiSCSIFileTrunc("/volume1/dir", 1, nullptr, 1));
    EXPECT_EQ(8 << 20, SizeOf("/volume1/lun"));
}

TEST_F(FileUtilTest, ZeroFillingAppendsZerosAndWritesTheProgressFile) {
    WriteFile("/volume1/lun", "abc");
    // A stale progress file of this pid from an earlier run is started afresh.
    WriteFile(ProgressFile(), "total_bytes=1\ndone_bytes=999\n");
    const uint64_t size = 3 + (2u << 20) + (1u << 19);  // 2.5 MiB more: a short last piece
    uint64_t progress = 10;
    ASSERT_EQ(0u, ORLOiSCSIFileTrunc("/volume1/lun", size, &progress, ORLO_ISCSI_TRUNC_MODE_ZERO)) << log_.Dump();
    EXPECT_EQ(10u + size - 3, progress);

    std::string data = ReadFile("/volume1/lun");
    ASSERT_EQ(size, data.size());
    EXPECT_EQ("abc", data.substr(0, 3));
    EXPECT_EQ(std::string::npos, data.find_first_not_of('\0', 3));
    EXPECT_EQ("total_bytes=2621440\ndone_bytes=2621440\n", ReadFile(ProgressFile()));
}

TEST_F(FileUtilTest, GrowingGoesOnWithoutAProgressFileAndSaysSoOnce) {
    // The runtime directory cannot be used (something else took its name).
    ASSERT_EQ(0, rmdir(Real("/tmp/iscsi").c_str()));
    WriteFile("/tmp/iscsi", "not a directory");
    for (unsigned int mode : {ORLO_ISCSI_TRUNC_MODE_ZERO, ORLO_ISCSI_TRUNC_MODE_ALLOC}) {
        log_.Clear();
        std::string name = "/volume1/lun" + std::to_string(mode);
        ASSERT_EQ(0u, ORLOiSCSIFileTrunc(name.c_str(), (2 << 20) + 5, nullptr, mode)) << log_.Dump();
        EXPECT_EQ((2 << 20) + 5, SizeOf(name));
        ASSERT_EQ(1u, log_.Lines().size()) << log_.Dump();
        EXPECT_NE(std::string::npos, log_.Lines()[0].find(" Error OLIBCFileSetKeyValue key=total_bytes, error["))
            << log_.Lines()[0];
    }
}

TEST_F(FileUtilTest, AllocationReservesSpaceAndReportsProgress) {
    uint64_t progress = 0;
    ASSERT_EQ(0u, ORLOiSCSIFileTrunc("/volume1/lun", 3 << 20, &progress, ORLO_ISCSI_TRUNC_MODE_ALLOC))
        << log_.Dump();
    struct stat st;
    ASSERT_EQ(0, stat(Real("/volume1/lun").c_str(), &st));
    EXPECT_EQ(3 << 20, st.st_size);
    EXPECT_GE(st.st_blocks * 512, 3 << 20);
    EXPECT_EQ(3u << 20, progress);
    EXPECT_EQ("total_bytes=3145728\ndone_bytes=3145728\n", ReadFile(ProgressFile()));

    progress = 5;
    EXPECT_EQ(0u, ORLOiSCSIFileAlloc("/volume1/lun", 4096, &progress));
    EXPECT_EQ((3 << 20) + 4096, SizeOf("/volume1/lun"));
    EXPECT_EQ(4101u, progress);

    log_.Clear();
    OLIBCErrSetEx(0, "", 0);
    EXPECT_EQ(18990003u, ORLOiSCSIFileAlloc("/volume1/lun", 0, &progress));
    EXPECT_EQ(0x0D00, OLIBCErrGet());
    EXPECT_EQ("iSCSI:iscsi_file_alloc.cpp:ORLOiSCSIFileAlloc Bad parameters", OnlyLineWithoutNumber());
    EXPECT_EQ(18990003u, ORLOiSCSIFileAlloc(nullptr, 1, &progress));
    EXPECT_EQ(18990003u, ORLOiSCSIFileAlloc("/volume1/lun", 1, nullptr));
    EXPECT_EQ(18990038u, ORLOiSCSIFileAlloc("/volume1/missing", 1, &progress));
    EXPECT_FALSE(Exists("/volume1/missing"));
}

TEST_F(FileUtilTest, ProgressWriteAddsToDoneBytes) {
    EXPECT_EQ(0u, ORLOiSCSIFileProgressWrite(5));
    EXPECT_EQ(0u, ORLOiSCSIFileProgressWrite(7));
    EXPECT_EQ("done_bytes=12\n", ReadFile(ProgressFile()));
    WriteFile(ProgressFile(), "total_bytes=100\ndone_bytes=40\n");
    EXPECT_EQ(0u, ORLOiSCSIFileProgressWrite(2));
    EXPECT_EQ("total_bytes=100\ndone_bytes=42\n", ReadFile(ProgressFile()));

    WriteFile(ProgressFile(), "done_bytes=abc\n");
    log_.Clear();
    EXPECT_EQ(18990424u, ORLOiSCSIFileProgressWrite(1));
    EXPECT_EQ("done_bytes=abc\n", ReadFile(ProgressFile()));
    EXPECT_EQ(1u, log_.Lines().size()) << log_.Dump();
}

TEST_F(FileUtilTest, UuidStringsHaveTheirFixedForm) {
    std::set<std::string> seen;
    for (int i = 0; i < 200; ++i) {
        char buf[37];
        memset(buf, 'Z', sizeof(buf));
        ASSERT_EQ(0u, ORLOiSCSIUuidStrGen(buf));
        std::string s(buf);
        ASSERT_EQ(36u, s.size()) << s;
        for (size_t k = 0; k < s.size(); ++k) {
            if (k == 8 || k == 13 || k == 18 || k == 23)
                EXPECT_EQ('-', s[k]) << s;
            else
                EXPECT_TRUE((s[k] >= '0' && s[k] <= '9') || (s[k] >= 'a' && s[k] <= 'f')) << s;
        }
        seen.insert(s);
    }
    EXPECT_EQ(200u, seen.size());
    EXPECT_EQ(18990003u, ORLOiSCSIUuidStrGen(nullptr));

    unsigned char a[16], b[16];
    ASSERT_EQ(0u, ORLOiSCSIUuidGen(a));
    ASSERT_EQ(0u, ORLOiSCSIUuidGen(b));
    EXPECT_NE(0, memcmp(a, b, 16));
    EXPECT_EQ(18990003u, ORLOiSCSIUuidGen(nullptr));
}

uint32_t BitwiseCrc32(const unsigned char *p, size_t n) {
    uint32_t c = 0xFFFFFFFFu;
    for (size_t i = 0; i < n; ++i) {
        c ^= p[i];
        for (int k = 0; k < 8; ++k) c = (c >> 1) ^ (0xEDB88320u & (0u - (c & 1u)));
    }
    return ~c;
}

TEST_F(FileUtilTest, Crc32MatchesTheStandardAndChains) {
    EXPECT_EQ(0xCBF43926u, ORLOiSCSIFileCRC32CksumCompute(0, "123456789", 9));
    EXPECT_EQ(0x414FA339u, ORLOiSCSIFileCRC32CksumCompute(0, "The quick brown fox jumps over the lazy dog", 43));
    EXPECT_EQ(0u, ORLOiSCSIFileCRC32CksumCompute(0, "", 0));
    EXPECT_EQ(0x1234u, ORLOiSCSIFileCRC32CksumCompute(0x1234u, nullptr, 0));

    std::mt19937 rng(42);
    std::vector<unsigned char> data(4099);
    for (unsigned char &c : data) c = static_cast<unsigned char>(rng());
    // Every length around the eight-byte stride and every alignment of the start.
    for (size_t start = 0; start < 8; ++start)
        for (size_t len = 0; len < 40; ++len)
            ASSERT_EQ(BitwiseCrc32(data.data() + start, len),
                      ORLOiSCSIFileCRC32CksumCompute(0, data.data() + start, len))
                << start << "+" << len;
    const uint32_t whole = ORLOiSCSIFileCRC32CksumCompute(0, data.data(), data.size());
    EXPECT_EQ(BitwiseCrc32(data.data(), data.size()), whole);
    uint32_t chained = 0;
    for (size_t off = 0, piece = 1; off < data.size(); off += piece, piece = piece * 3 % 97 + 1)
        chained = ORLOiSCSIFileCRC32CksumCompute(chained, data.data() + off, std::min(piece, data.size() - off));
    EXPECT_EQ(whole, chained);
}

TEST_F(FileUtilTest, FileCopyRunsCpAndReportsItsFailure) {
    // The sandbox's /bin/cp is the machine's own.
    mkdir(Real("/bin").c_str(), 0755);
    const char *cp = access("/bin/cp", X_OK) == 0 ? "/bin/cp" : "/usr/bin/cp";
    ASSERT_EQ(0, symlink(cp, Real("/bin/cp").c_str()));

    WriteFile("/volume1/src file", "payload", 0604);
    EXPECT_EQ(0u, ORLOiSCSIFileCopy("/volume1/src file", "/volume1/dst", ORLO_ISCSI_FILE_COPY_PRESERVE));
    EXPECT_EQ("payload", ReadFile("/volume1/dst"));
    struct stat st;
    ASSERT_EQ(0, stat(Real("/volume1/dst").c_str(), &st));
    EXPECT_EQ(0604u, st.st_mode & 07777);

    log_.Clear();
    EXPECT_EQ(18990011u, ORLOiSCSIFileCopy("/volume1/none", "/volume1/dst2", 0));
    EXPECT_EQ("iSCSI:iscsi_file_copy.cpp:ORLOiSCSIFileCopy access(\"/volume1/none\", F_OK) failed, "
              "err=No such file or directory",
              OnlyLineWithoutNumber());
    EXPECT_FALSE(Exists("/volume1/dst2"));

    log_.Clear();
    EXPECT_EQ(18990043u, ORLOiSCSIFileCopy("/volume1/src file", "/volume1/no/dir/dst", 0));
    EXPECT_NE(std::string::npos, OnlyLine().find("OLIBCExecv(\"/bin/cp\", \"/volume1/src file\", "
                                                 "\"/volume1/no/dir/dst\") with status 1 failed, err=[0x3C00 "))
        << OnlyLine();
    EXPECT_EQ(18990004u, ORLOiSCSIFileCopy("/volume1/src file", "/volume1/dst", 0x80));
    EXPECT_EQ(18990003u, ORLOiSCSIFileCopy(nullptr, "/volume1/dst", 0));
}

TEST_F(FileUtilTest, RenameWithinAFileSystem) {
    WriteFile("/volume1/a", "A");
    EXPECT_EQ(0u, ORLOiSCSIFileRename("/volume1/a", "/volume1/b", 0));
    EXPECT_EQ("A", ReadFile("/volume1/b"));
    EXPECT_FALSE(Exists("/volume1/a"));

    log_.Clear();
    EXPECT_EQ(18990042u, ORLOiSCSIFileRename("/volume1/a", "/volume1/c", 1));
    EXPECT_EQ("iSCSI:iscsi_file_rename.cpp:ORLOiSCSIFileRename rename(\"/volume1/a\", \"/volume1/c\") failed, "
              "err=No such file or directory",
              OnlyLineWithoutNumber());
    EXPECT_EQ(18990003u, ORLOiSCSIFileRename(nullptr, "/volume1/c", 0));
}

}  // namespace
