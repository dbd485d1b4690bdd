// The per-thread cache of parsed section files behind OLIBCFileGetSection,
// OLIBCFileEnumSection and the configuration loaders: a file changed between two reads
// (replaced, edited in place with the same size, rewritten by this or another thread,
// removed) is read again; a file read twice is parsed once; the odd lines of hand-edited
// files read as they always have, by name and by the one-pass LUN reader; and writers
// leave a file they would not change exactly as it is.
#include <dirent.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "olibc.h"
#include "orloiscsi_base.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_target.h"
#include "platform/olibc_file_cache.h"
#include "platform/olibc_file_internal.h"
#include "support/sandbox.h"

namespace {

using Pairs = std::vector<std::pair<std::string, std::string>>;
using orlo::olibc::SectionFileCacheEntries;

constexpr const char *kConf = "/usr/orlo/etc/iscsi_cache.conf";

Pairs HashPairs(const OLIBC_SZHASH *h) {
    Pairs out;
    const char *k = nullptr;
    const char *v = nullptr;
    for (int i = 0; OLIBCSzHashEnum(h, i, &k, &v); ++i) out.emplace_back(k, v);
    return out;
}

// The section's pairs, or {{"<absent>", ""}} / {{"<error>", code}}.
Pairs Get(const char *section, const char *path = kConf) {
    POLIBC_SZHASH h = nullptr;
    int rc = OLIBCFileGetSection(path, section, &h);
    Pairs out = rc > 0 ? HashPairs(h) : rc == 0 ? Pairs{{"<absent>", ""}}
                                              : Pairs{{"<error>", std::to_string(OLIBCErrGet())}};
    OLIBCSzHashFree(h);
    return out;
}

std::vector<std::string> Enum(const char *path = kConf) {
    POLIBC_SZLIST l = nullptr;
    int n = OLIBCFileEnumSection(path, &l);
    if (n < 0) return {"<error " + std::to_string(OLIBCErrGet()) + ">"};
    std::vector<std::string> out;
    for (int i = 0; i < n; ++i) out.emplace_back(OLIBCSzListGet(l, i));
    OLIBCSzListFree(l);
    return out;
}

uint64_t Parsed() { return orlo::olibc::SectionStatsGet().parsed; }

POLIBC_SZHASH MakeHash(const Pairs &pairs) {
    POLIBC_SZHASH h = OLIBCSzHashAlloc(4);
    for (const auto &kv : pairs) OLIBCSzHashSetValue(&h, kv.first.c_str(), kv.second.c_str());
    return h;
}

// A LUN section with lid written as given (so "007" can stand for 7).
std::string LunSection(const std::string &name, const std::string &lid, const std::string &extra = "") {
    return "[" + name + "]\n\tlid=" + lid + "\n\tname=n" + lid + "\n\trootpath=/volume1\n\tbytes=1048576\n" +
           "\tpre_alloc=yes\n\tdevtype=1\n\tuuid=u" + lid + "\n\tvpd_unit_serial=s" + lid + "\n" + extra;
}

std::vector<std::string> LunNames(ORLOiSCSILunList *list) {
    std::vector<std::string> out;
    ORLOiSCSIListLink *link;
    ORLOiSCSILun *lun;
    ORLO_ISCSI_LUN_LIST_FOREACH(list, link, lun) out.push_back(std::string(lun->name) + "#" + std::to_string(lun->lid));
    return out;
}

class SectionCacheTest : public orlotest::SandboxTest {
  protected:
    void SetUp() override {
        SandboxTest::SetUp();
        orlo::olibc::SectionFileCacheClear();
        orlo::olibc::SectionFileCacheSetRacySeconds(-1);
    }
    void TearDown() override {
        orlo::olibc::SectionFileCacheClear();
        orlo::olibc::SectionFileCacheSetRacySeconds(-1);
        orlo::olibc::SectionFileCacheSetTimestampTick(0);
        SandboxTest::TearDown();
    }
    // Replaces a file the way every writer does: a new file renamed over the old one.
    void Replace(const std::string &logical, const std::string &content) {
        WriteFile(logical + ".new", content);
        ASSERT_EQ(0, rename(Real(logical + ".new").c_str(), Real(logical).c_str()));
    }
    struct stat Stat(const std::string &logical) {
        struct stat st {};
        EXPECT_EQ(0, lstat(Real(logical).c_str(), &st));
        return st;
    }
    std::vector<std::string> DirEntries(const std::string &logical) {
        std::vector<std::string> out;
        DIR *d = opendir(Real(logical).c_str());
        while (struct dirent *e = readdir(d)) {
            std::string n = e->d_name;
            if (n != "." && n != "..") out.push_back(n);
        }
        closedir(d);
        return out;
    }
    std::vector<std::string> LoadLuns(const char *path, uint32_t flags, int32_t lid = 0) {
        ORLOiSCSILunFilter f = {};
        f.flags = flags;
        f.lid = lid;
        ORLOiSCSILunList list = {};
        uint32_t ret = ORLOiSCSILunConfLoadByPath(&f, &list, path);
        std::vector<std::string> out = ret == 0 ? LunNames(&list) : std::vector<std::string>{std::to_string(ret)};
        ORLOiSCSILunListFree(&list);
        return out;
    }
};

TEST_F(SectionCacheTest, AFileChangedBetweenTwoReadsIsReadAgain) {
    WriteFile(kConf, "[s]\n\tk=aaaa\n[t]\n\tk=1\n");
    uint64_t p0 = Parsed();
    EXPECT_EQ((Pairs{{"k", "aaaa"}}), Get("s"));
    EXPECT_EQ(2u, Parsed() - p0);  // both sections, once
    EXPECT_EQ((Pairs{{"k", "1"}}), Get("t"));
    EXPECT_EQ((std::vector<std::string>{"s", "t"}), Enum());
    EXPECT_EQ(2u, Parsed() - p0);  // the same file again: nothing parsed

    // Edited in place to the same size, right after the read, on a file system whose
    // timestamps have not moved on since: the stat cannot tell, the bytes do.
    orlo::olibc::SectionFileCacheSetTimestampTick(3600LL * 1000000000);
    WriteFile(kConf, "[s]\n\tk=bbbb\n[t]\n\tk=1\n");
    EXPECT_EQ((Pairs{{"k", "bbbb"}}), Get("s"));
    EXPECT_EQ(4u, Parsed() - p0);
    WriteFile(kConf, "[s]\n\tk=BBBB\n[t]\n\tk=1\n");
    EXPECT_EQ((Pairs{{"k", "BBBB"}}), Get("s"));
    EXPECT_EQ((Pairs{{"k", "1"}}), Get("t"));
    EXPECT_EQ(6u, Parsed() - p0);
    orlo::olibc::SectionFileCacheSetTimestampTick(0);

    // Replaced by rename, by hand and by a writer of this thread.
    Replace(kConf, "[s]\n\tk=cccc\n[t]\n\tk=1\n");
    EXPECT_EQ((Pairs{{"k", "cccc"}}), Get("s"));
    POLIBC_SZHASH h = MakeHash({{"k", "dddd"}});
    EXPECT_EQ(1, OLIBCFileSetSection(kConf, "s", "s", h, "\t%s=%s\n"));
    OLIBCSzHashFree(h);
    EXPECT_EQ((Pairs{{"k", "dddd"}}), Get("s"));
    EXPECT_EQ((Pairs{{"<absent>", ""}}), Get("u"));

    // Gone, or no longer a file: the error a fresh read gives, not the kept parse.
    ASSERT_EQ(0, unlink(Real(kConf).c_str()));
    EXPECT_EQ((Pairs{{"<error>", std::to_string(OLIBC_ERR_NOT_FOUND)}}), Get("s"));
    EXPECT_EQ((std::vector<std::string>{"<error " + std::to_string(OLIBC_ERR_NOT_FOUND) + ">"}), Enum());
    ASSERT_EQ(0, mkdir(Real(kConf).c_str(), 0755));
    EXPECT_EQ((Pairs{{"<error>", std::to_string(OLIBC_ERR_FOPEN)}}), Get("s"));
    ASSERT_EQ(0, rmdir(Real(kConf).c_str()));
    WriteFile(kConf, "[s]\n\tk=eeee\n");
    EXPECT_EQ((Pairs{{"k", "eeee"}}), Get("s"));
}

TEST_F(SectionCacheTest, AFileOldEnoughIsTrustedByItsStatAndAReplacementStillSeen) {
    // Every change counts as old at once: the parse is kept on the stat alone.
    orlo::olibc::SectionFileCacheSetRacySeconds(0);
    WriteFile(kConf, "[s]\n\tk=aaaa\n");
    usleep(20000);  // past the timestamp tick of the write
    uint64_t p0 = Parsed();
    EXPECT_EQ((Pairs{{"k", "aaaa"}}), Get("s"));
    EXPECT_EQ((Pairs{{"k", "aaaa"}}), Get("s"));
    EXPECT_EQ(1u, Parsed() - p0);
    // The same size by rename: a new inode.
    Replace(kConf, "[s]\n\tk=bbbb\n");
    EXPECT_EQ((Pairs{{"k", "bbbb"}}), Get("s"));
    EXPECT_EQ(2u, Parsed() - p0);
    // Written as it was (a new inode, the same bytes): the parse is kept.
    Replace(kConf, "[s]\n\tk=bbbb\n");
    EXPECT_EQ((Pairs{{"k", "bbbb"}}), Get("s"));
    EXPECT_EQ(2u, Parsed() - p0);

    // The same logical path under another root is another file.
    const std::string other = orlotest::MakeTempDir("orlo-cache-root");
    for (const char *dir : {"/usr", "/usr/orlo", "/usr/orlo/etc"}) ASSERT_EQ(0, mkdir((other + dir).c_str(), 0755));
    FILE *f = fopen((other + kConf).c_str(), "w");
    ASSERT_NE(nullptr, f);
    fputs("[s]\n\tk=zzzz\n", f);
    fclose(f);
    setenv("ORLO_SYSROOT", other.c_str(), 1);
    EXPECT_EQ((Pairs{{"k", "zzzz"}}), Get("s"));
    setenv("ORLO_SYSROOT", root().c_str(), 1);
    EXPECT_EQ((Pairs{{"k", "bbbb"}}), Get("s"));
    orlotest::RemoveTree(other);
}

TEST_F(SectionCacheTest, OddLinesAndDuplicateHeadersReadAsBefore) {
    const std::string odd =
        "stray=before the first header\n"
        "# comment\n"
        "[a]\n"
        "\tk=1\n"
        "\tk=2\n"
        "\tq = \"x y\"\n"
        "; note\n"
        "\n"
        "not a key line\n"
        "[b]\r\n"
        "\tx=1\r\n"
        "[a]\n"
        "\tk=3\n"
        "\tonly=in the duplicate\n"
        "[c]\n";
    WriteFile(kConf, odd);
    // Twice: the fresh parse and the kept one answer alike.
    for (int round = 0; round < 2; ++round) {
        SCOPED_TRACE(round);
        EXPECT_EQ((std::vector<std::string>{"a", "b", "c"}), Enum());
        EXPECT_EQ((Pairs{{"k", "2"}, {"q", "x y"}}), Get("a"));  // the first [a]; a repeated key keeps its place
        EXPECT_EQ((Pairs{{"x", "1"}}), Get("b"));
        EXPECT_EQ(Pairs{}, Get("c"));
        EXPECT_EQ((Pairs{{"<absent>", ""}}), Get("stray"));
    }
    // A malformed header makes the section calls refuse the file...
    WriteFile(kConf, odd + "[]\n\tk=9\n");
    EXPECT_EQ((Pairs{{"<error>", std::to_string(OLIBC_ERR_BAD_FORMAT)}}), Get("a"));
    EXPECT_EQ((std::vector<std::string>{"<error " + std::to_string(OLIBC_ERR_BAD_FORMAT) + ">"}), Enum());

    // ...while the LUN reader takes every header, duplicates and malformed ones included,
    // as the start of a LUN; lines before the first header belong to none.
    ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr));
    const char *luns = "/usr/orlo/etc/iscsi_lun.conf";
    WriteFile(luns, "\tlid=99\n" + LunSection("LUN_x", "1") + LunSection("LUN_x", "2") + "[]\n" +
                        LunSection("LUN_y", "007").substr(std::string("[LUN_y]\n").size()) + LunSection("LUN_z", "2"));
    for (int round = 0; round < 2; ++round) {
        SCOPED_TRACE(round);
        EXPECT_EQ((std::vector<std::string>{"n1#1", "n2#2", "n007#7", "n2#2"}), LoadLuns(luns, 0x7400));
        EXPECT_EQ((std::vector<std::string>{"n2#2", "n2#2"}), LoadLuns(luns, 0x2020, 2));
        EXPECT_EQ((std::vector<std::string>{"n007#7"}), LoadLuns(luns, 0x2020, 7));
        EXPECT_EQ((std::vector<std::string>{"n2#2"}), LoadLuns(luns, 0x402020, 2));  // the first only
        EXPECT_EQ(std::vector<std::string>{}, LoadLuns(luns, 0x2020, 99));
    }
    // A section that cannot become a LUN fails the load wherever it stands.
    WriteFile(luns, LunSection("LUN_a", "1") + "[LUN_b]\n\tlid=2\n");
    EXPECT_EQ((std::vector<std::string>{"18990033"}), LoadLuns(luns, 0x7400));
    EXPECT_EQ((std::vector<std::string>{"n1#1"}), LoadLuns(luns, 0x2020, 1));

    // The target reader reads by name: of two sections of one name only the first counts,
    // and a query by tid finds a section by its tid key whatever its name.
    const char *targets = "/usr/orlo/etc/iscsi_target.conf";
    auto section = [](const std::string &name, const std::string &tid) {
        return "[" + name + "]\n\ttid=" + tid + "\n\tname=" + name + "\n\tiqn=iqn.2000-01.com.orlo-nas:" + tid +
               "\n\tenabled=no\n\tauthen=no\n\tusername=\n\tpassword=\n\tmutual=no\n\tmutual_username=\n"
               "\tmutual_password=\n\thdr_chksum=no\n\tdata_chksum=no\n\tsend_seg_bytes=8192\n\trecv_seg_bytes=8192\n";
    };
    WriteFile(targets, section("iSCSI_T1", "1") + section("iSCSI_T2", "5") + section("iSCSI_T1", "3"));
    auto names = [](uint32_t flags, int32_t tid) {
        ORLOiSCSITargetFilter f = {};
        f.flags = flags;
        f.tid = tid;
        ORLOiSCSITargetList list = {};
        std::vector<std::string> out;
        if (ORLOiSCSITargetConfLoad(&f, &list) != 0) return std::vector<std::string>{"<error>"};
        ORLOiSCSIListLink *link;
        ORLOiSCSITarget *t;
        ORLO_ISCSI_TARGET_LIST_FOREACH(&list, link, t) out.push_back(std::string(t->name) + "#" + std::to_string(t->tid));
        ORLOiSCSITargetListFree(&list);
        return out;
    };
    EXPECT_EQ((std::vector<std::string>{"iSCSI_T1#1", "iSCSI_T2#5"}), names(0, 0));
    EXPECT_EQ((std::vector<std::string>{"iSCSI_T2#5"}), names(0x1001, 5));
    EXPECT_EQ(std::vector<std::string>{}, names(0x1001, 2));
    EXPECT_EQ(std::vector<std::string>{}, names(0x1001, 3));  // only in the shadowed duplicate
    WriteFile(targets, section("iSCSI_T1", "1") + "[]\n");
    EXPECT_EQ((std::vector<std::string>{"<error>"}), names(0x1001, 1));
}

// A section's key lines are parsed when it is first asked about: whatever the order of the
// questions, each section reads as a fresh parse read in file order does, and what was
// handed out earlier stays where it was (it is never moved by a later section's parse).
// The file ends in a key line without a newline, the case that fills the parse's string
// buffer most; NUL bytes cut a key or value as a C string, without upsetting the pairs
// after them.
TEST_F(SectionCacheTest, KeyLinesParsedAtFirstUseReadAlikeInAnyOrder) {
    std::string text = "[a]\n\tk=1\n\tk=2\n[b]\r\n\tx = \"q\"\r\n";
    const char withNul[] = "[n\0ul]\n\tke\0y=va\0lue\n\tafter=ok\n";
    text.append(withNul, sizeof(withNul) - 1);
    for (int i = 0; i < 40; ++i) text += "[s" + std::to_string(i) + "]\n\tv=" + std::to_string(i) + "\n";
    text += "[last]\n\tk=v\n\tend=z";
    WriteFile(kConf, text);

    using orlo::olibc::SectionFile;
    auto pairsOf = [](const SectionFile &f, size_t i) {
        Pairs out;
        f.ForEachPair(i, [&out](const char *k, const char *v) { out.emplace_back(k, v); });
        return out;
    };
    std::shared_ptr<const SectionFile> forward = orlo::olibc::SectionFileLoad(kConf);
    ASSERT_NE(nullptr, forward);
    std::vector<Pairs> inOrder;
    for (size_t i = 0; i < forward->Count(); ++i) inOrder.push_back(pairsOf(*forward, i));
    ASSERT_EQ(44u, inOrder.size());
    EXPECT_EQ((Pairs{{"k", "1"}, {"k", "2"}}), inOrder[0]);
    EXPECT_EQ((Pairs{{"x", "q"}}), inOrder[1]);
    EXPECT_STREQ("n", forward->Name(2));
    EXPECT_EQ((Pairs{{"ke", "va"}, {"after", "ok"}}), inOrder[2]);
    EXPECT_EQ((Pairs{{"v", "39"}}), inOrder[42]);
    EXPECT_EQ((Pairs{{"k", "v"}, {"end", "z"}}), inOrder[43]);

    orlo::olibc::SectionFileCacheClear();
    std::shared_ptr<const SectionFile> file = orlo::olibc::SectionFileLoad(kConf);
    ASSERT_NE(nullptr, file);
    ASSERT_NE(forward.get(), file.get());
    const char *end = file->ValueOf(43, "end");
    ASSERT_NE(nullptr, end);
    const char *name = file->Name(43);
    for (size_t i = file->Count(); i-- > 0;) EXPECT_EQ(inOrder[i], pairsOf(*file, i)) << i;
    EXPECT_EQ(end, file->ValueOf(43, "end"));  // the same string, not a copy of it
    EXPECT_STREQ("z", end);
    EXPECT_EQ(name, file->Name(43));
    EXPECT_STREQ("2", file->ValueOf(0, "k"));
    EXPECT_EQ(nullptr, file->ValueOf(2, "key"));
    EXPECT_EQ((Pairs{{"k", "v"}, {"end", "z"}}), Get("last"));

    // Every byte stored: a header without "]" and key lines without blanks, the last one
    // without its newline.
    WriteFile(kConf, "[t\na=1\nb=2\nc=3");
    EXPECT_EQ((Pairs{{"a", "1"}, {"b", "2"}, {"c", "3"}}), Get("t"));
}

// Whole-file reads reuse the buffers of earlier ones (a writer's image, a parse the cache
// dropped): a read never shows bytes of another file or of an earlier version, and a
// parse someone still holds keeps its image when the cache lets go of it.
TEST_F(SectionCacheTest, ReusedReadBuffersNeverShowOtherBytes) {
    auto sections = [](const std::string &prefix, int n, const std::string &value) {
        std::string text;
        for (int i = 0; i < n; ++i) text += "[" + prefix + std::to_string(i) + "]\n\tk=" + value + std::to_string(i) + "\n";
        return text;
    };
    const std::string big = sections("s", 4000, "big-value-");  // well over the buffers kept
    WriteFile(kConf, big);
    EXPECT_EQ((Pairs{{"k", "big-value-3999"}}), Get("s3999"));
    std::shared_ptr<const orlo::olibc::SectionFile> held = orlo::olibc::SectionFileLoad(kConf);
    ASSERT_NE(nullptr, held);

    // A writer replaces the file and drops the cache's parse; the one held here stays whole.
    POLIBC_SZHASH h = MakeHash({{"k", "new"}});
    ASSERT_EQ(1, OLIBCFileSetSection(kConf, "s0", "s0", h, "\t%s=%s\n"));
    EXPECT_TRUE(held->Data() == big) << "the held parse lost its image";
    long i = held->Find("s2500");
    ASSERT_GE(i, 0);
    EXPECT_STREQ("big-value-2500", held->ValueOf(static_cast<size_t>(i), "k"));
    EXPECT_EQ((Pairs{{"k", "new"}}), Get("s0"));
    held.reset();
    ASSERT_EQ(1, OLIBCFileSetSection(kConf, "s1", "s1", h, "\t%s=%s\n"));
    OLIBCSzHashFree(h);

    // Smaller files after the big ones: exactly their own bytes, whichever buffer they got.
    const char *mid = "/usr/orlo/etc/mid.conf";
    const std::string midText = sections("m", 3000, "") + "[tail]\n\tend=z";  // no final newline
    WriteFile(mid, midText);
    for (int round = 0; round < 2; ++round) {
        SCOPED_TRACE(round);
        std::vector<std::string> names = Enum(mid);
        ASSERT_EQ(3001u, names.size());
        EXPECT_EQ("tail", names.back());
        EXPECT_EQ((Pairs{{"end", "z"}}), Get("tail", mid));
        orlo::olibc::FileImage image;
        ASSERT_EQ(0, orlo::olibc::ReadImage(mid, &image, false));
        EXPECT_TRUE(image.data == midText) << image.data.size() << " bytes read of " << midText.size();
        orlo::olibc::SectionFileCacheClear();
    }
    const char *small = "/usr/orlo/etc/small.conf";
    WriteFile(small, "[only]\n\tk=1\n");
    EXPECT_EQ((std::vector<std::string>{"only"}), Enum(small));
    char value[16];
    EXPECT_EQ(1, OLIBCFileGetSectionValue(small, "only", "k", value, sizeof(value)));
    ASSERT_EQ(0, OLIBCFileSetSectionValue(small, "only", "k", "2", "\t%s=%s\n"));
    EXPECT_EQ("[only]\n\tk=2\n", ReadFile(small));
    std::string rewritten = big;
    for (const char *line : {"\tk=big-value-0\n", "\tk=big-value-1\n"})
        rewritten.replace(rewritten.find(line), strlen(line), "\tk=new\n");
    EXPECT_TRUE(ReadFile(kConf) == rewritten);
}

TEST_F(SectionCacheTest, WritingTheSameBytesLeavesTheFileAsItIs) {
    POLIBC_SZHASH h = MakeHash({{"k", "1"}, {"v", "two"}});
    ASSERT_EQ(0, OLIBCFileTouch(kConf));
    ASSERT_EQ(1, OLIBCFileAddSection(kConf, "s", h, "\t%s=%s\n"));
    ASSERT_EQ(1, OLIBCFileAddSection(kConf, "t", h, "\t%s=%s\n"));
    const std::string before = ReadFile(kConf);
    const struct stat st0 = Stat(kConf);
    usleep(20000);  // a rewrite now would show in the times, not only in the inode

    EXPECT_EQ(1, OLIBCFileSetSection(kConf, "s", "s", h, "\t%s=%s\n"));
    EXPECT_EQ(0, OLIBCFileSetSectionValue(kConf, "t", "v", "two", "\t%s=%s\n"));
    EXPECT_EQ(0u, ORLOiSCSIPutSectionToConfig(kConf, "s", h));
    const struct stat st1 = Stat(kConf);
    EXPECT_EQ(st0.st_ino, st1.st_ino);
    EXPECT_EQ(st0.st_mtim.tv_sec, st1.st_mtim.tv_sec);
    EXPECT_EQ(st0.st_mtim.tv_nsec, st1.st_mtim.tv_nsec);
    EXPECT_EQ(st0.st_ctim.tv_nsec, st1.st_ctim.tv_nsec);
    EXPECT_EQ(before, ReadFile(kConf));
    EXPECT_EQ((std::vector<std::string>{"iscsi_cache.conf"}), DirEntries("/usr/orlo/etc"));  // no temporary file
    EXPECT_EQ(st0.st_ino, Stat(kConf).st_ino);

    // A real change replaces the file; so does one that keeps the length.
    POLIBC_SZHASH changed = MakeHash({{"k", "1"}, {"v", "TWO"}});
    EXPECT_EQ(1, OLIBCFileSetSection(kConf, "s", "s", changed, "\t%s=%s\n"));
    const struct stat st2 = Stat(kConf);
    EXPECT_NE(st0.st_ino, st2.st_ino);
    EXPECT_EQ((Pairs{{"k", "1"}, {"v", "TWO"}}), Get("s"));
    EXPECT_EQ((Pairs{{"k", "1"}, {"v", "two"}}), Get("t"));
    // Edits that keep the length but move lines are changes: the keys go before a
    // comment inside the section.
    WriteFile("/usr/orlo/etc/moved.conf", "[m]\n# c\n\tk=1\n[n]\n");
    POLIBC_SZHASH one = MakeHash({{"k", "1"}});
    EXPECT_EQ(1, OLIBCFileSetSection("/usr/orlo/etc/moved.conf", "m", "m", one, "\t%s=%s\n"));
    EXPECT_EQ("[m]\n\tk=1\n# c\n[n]\n", ReadFile("/usr/orlo/etc/moved.conf"));
    OLIBCSzHashFree(one);
    // Renaming a section onto its own content with another name is a change too.
    EXPECT_EQ(1, OLIBCFileSetSection(kConf, "s", "r", changed, "\t%s=%s\n"));
    EXPECT_EQ((std::vector<std::string>{"r", "t"}), Enum());
    OLIBCSzHashFree(changed);
    OLIBCSzHashFree(h);
}

// The writers' test for "no change" agrees with applying the edits, whatever the edits:
// random images of few letters, random edits whose texts are often cut from the image
// itself (so that shifted stretches may line up by chance).
TEST(SectionEditsTest, ChangesNothingAgreesWithApplyingTheEdits) {
    unsigned seed = 12345;
    auto next = [&seed](unsigned n) {
        seed = seed * 1103515245u + 12345u;
        return (seed >> 16) % n;
    };
    int unchanged = 0;
    for (int round = 0; round < 20000; ++round) {
        std::string data;
        const unsigned size = next(12);
        for (unsigned i = 0; i < size; ++i) data.push_back("ab"[next(2)]);
        std::vector<orlo::olibc::Edit> edits;
        size_t at = 0;
        while (at <= data.size() && next(3) != 0) {
            size_t begin = at + next(static_cast<unsigned>(data.size() - at + 1));
            size_t end = begin + next(static_cast<unsigned>(data.size() - begin + 1));
            std::string text;
            if (next(2) == 0 && !data.empty()) {
                size_t from = next(static_cast<unsigned>(data.size()));
                text = data.substr(from, next(4));
            } else {
                for (unsigned i = next(4); i > 0; --i) text.push_back("ab"[next(2)]);
            }
            edits.push_back(orlo::olibc::Edit{begin, end, text});
            at = end + 1;
        }
        const bool same = orlo::olibc::ApplyEdits(data, edits) == data;
        unchanged += same ? 1 : 0;
        ASSERT_EQ(same, orlo::olibc::ChangesNothing(data, edits)) << "round " << round << " data " << data;
    }
    EXPECT_GT(unchanged, 1000);  // both answers were exercised
}

TEST_F(SectionCacheTest, EachThreadKeepsItsOwnParses) {
    WriteFile(kConf, "[s]\n\tk=main\n");
    EXPECT_EQ((Pairs{{"k", "main"}}), Get("s"));
    EXPECT_EQ(1u, SectionFileCacheEntries());

    size_t seenByOther = 99;
    Pairs readByOther;
    uint64_t parsedByOther = 0;
    std::thread other([&] {
        seenByOther = SectionFileCacheEntries();  // nothing of the main thread's
        uint64_t p0 = Parsed();
        readByOther = Get("s");
        parsedByOther = Parsed() - p0;
        POLIBC_SZHASH h = MakeHash({{"k", "other"}});
        OLIBCFileSetSection(kConf, "s", "s", h, "\t%s=%s\n");  // drops the other thread's parse only
        OLIBCSzHashFree(h);
    });
    other.join();
    EXPECT_EQ(0u, seenByOther);
    EXPECT_EQ((Pairs{{"k", "main"}}), readByOther);
    EXPECT_EQ(1u, parsedByOther);  // its own parse, not the main thread's
    EXPECT_EQ(1u, SectionFileCacheEntries());
    EXPECT_EQ((Pairs{{"k", "other"}}), Get("s"));  // the change made elsewhere is seen

    // At most eight files are kept; the least recently used one goes first.
    for (int i = 0; i < 8; ++i) WriteFile("/usr/orlo/etc/f" + std::to_string(i), "[s]\n\tk=" + std::to_string(i) + "\n");
    for (int i = 0; i < 8; ++i) Get("s", ("/usr/orlo/etc/f" + std::to_string(i)).c_str());
    EXPECT_EQ(orlo::olibc::kSectionFileCacheSize, SectionFileCacheEntries());
    uint64_t p0 = Parsed();
    EXPECT_EQ((Pairs{{"k", "7"}}), Get("s", "/usr/orlo/etc/f7"));
    EXPECT_EQ(0u, Parsed() - p0);
    EXPECT_EQ((Pairs{{"k", "other"}}), Get("s"));  // dropped: parsed again
    EXPECT_EQ(1u, Parsed() - p0);
}

}  // namespace
