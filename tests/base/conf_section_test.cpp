// The library's three section operations: enumeration, writing one section, removing a
// list of sections.  Result codes, the exact log line of each failure, and what is left
// on disk after success, refusal and failure.
#include <dirent.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fnmatch.h>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_base.h"
#include "support/sandbox.h"

namespace {

using Pairs = std::vector<std::pair<std::string, std::string>>;

POLIBC_SZHASH MakeHash(const Pairs &pairs) {
    POLIBC_SZHASH h = OLIBCSzHashAlloc(4);
    for (const auto &kv : pairs) OLIBCSzHashSetValue(&h, kv.first.c_str(), kv.second.c_str());
    return h;
}

POLIBC_SZLIST MakeList(const std::vector<std::string> &names) {
    POLIBC_SZLIST l = OLIBCSzListAlloc(4);
    for (const std::string &n : names) OLIBCSzListPush(&l, n.c_str());
    return l;
}

class ConfSectionTest : public orlotest::SandboxTest {
  protected:
    const char *kConf = "/usr/orlo/etc/iscsi_lun.conf";

    // Exactly one log line, matching the shell pattern in full ("*" for line numbers and
    // pointers, "\\[" for a bracket).
    void ExpectOneLine(const std::string &pattern) {
        auto lines = log_.Lines();
        ASSERT_EQ(1u, lines.size()) << log_.Dump();
        EXPECT_EQ(0, fnmatch(pattern.c_str(), lines[0].c_str(), 0)) << lines[0] << "\n  vs " << pattern;
        log_.Clear();
    }
    ino_t Inode(const std::string &logical) {
        struct stat st;
        return lstat(Real(logical).c_str(), &st) == 0 ? st.st_ino : 0;
    }
    std::vector<std::string> DirEntries(const std::string &logical) {
        std::vector<std::string> out;
        DIR *d = opendir(Real(logical).c_str());
        while (struct dirent *e = readdir(d))
            if (std::string(e->d_name) != "." && std::string(e->d_name) != "..") out.emplace_back(e->d_name);
        closedir(d);
        return out;
    }
};

TEST_F(ConfSectionTest, EnumerateListsNamesAndLeavesOutputAloneWithoutAFile) {
    POLIBC_SZLIST sentinel = reinterpret_cast<POLIBC_SZLIST>(0x1);
    POLIBC_SZLIST list = sentinel;
    EXPECT_EQ(0, ORLOiSCSIConfSectionEnum(kConf, &list));
    EXPECT_EQ(sentinel, list);
    EXPECT_TRUE(log_.Lines().empty());

    WriteFile(kConf, "[LUN_b]\n\tname=b\n# [not a section]\n[LUN_a]\n\tname=a\n[iSCSI_T1]\n");
    list = nullptr;
    ASSERT_EQ(3, ORLOiSCSIConfSectionEnum(kConf, &list));
    ASSERT_NE(nullptr, list);
    EXPECT_STREQ("LUN_b", OLIBCSzListGet(list, 0));
    EXPECT_STREQ("LUN_a", OLIBCSzListGet(list, 1));
    EXPECT_STREQ("iSCSI_T1", OLIBCSzListGet(list, 2));
    OLIBCSzListFree(list);

    WriteFile(kConf, "");
    list = nullptr;
    EXPECT_EQ(0, ORLOiSCSIConfSectionEnum(kConf, &list));
    EXPECT_NE(nullptr, list);  // an existing empty file yields an empty list
    OLIBCSzListFree(list);

    EXPECT_EQ(-1, ORLOiSCSIConfSectionEnum(nullptr, &list));
    ExpectOneLine("iSCSI:iscsi_conf_section_enum.cpp:*:ORLOiSCSIConfSectionEnum Bad parameters");
    EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
    EXPECT_EQ(-1, ORLOiSCSIConfSectionEnum(kConf, nullptr));
    log_.Clear();

    list = nullptr;
    EXPECT_EQ(-1, ORLOiSCSIConfSectionEnum("/usr/orlo/etc", &list));
    EXPECT_EQ(nullptr, list);
    ExpectOneLine("iSCSI:iscsi_conf_section_enum.cpp:*:ORLOiSCSIConfSectionEnum "
                  "OLIBCFileEnumSection(\"/usr/orlo/etc\", 0x*) failed, "
                  "err=\\[0x0900 olibc_file_image.cpp:*\\]");
}

TEST_F(ConfSectionTest, PutCreatesReplacesAndAppends) {
    POLIBC_SZHASH a = MakeHash({{"lid", "1"}, {"name", "alpha"}});
    POLIBC_SZHASH b = MakeHash({{"lid", "2"}, {"name", "beta"}});
    ASSERT_EQ(0u, ORLOiSCSIPutSectionToConfig(kConf, "LUN_a", a));
    EXPECT_EQ("[LUN_a]\n\tlid=1\n\tname=alpha\n", ReadFile(kConf));
    ASSERT_EQ(0u, ORLOiSCSIPutSectionToConfig(kConf, "LUN_b", b));
    POLIBC_SZHASH a2 = MakeHash({{"name", "alpha2"}, {"lid", "1"}, {"size", "1073741824"}});
    ASSERT_EQ(0u, ORLOiSCSIPutSectionToConfig(kConf, "LUN_a", a2));
    EXPECT_EQ("[LUN_a]\n\tname=alpha2\n\tlid=1\n\tsize=1073741824\n[LUN_b]\n\tlid=2\n\tname=beta\n", ReadFile(kConf));
    POLIBC_SZHASH empty = MakeHash({});
    ASSERT_EQ(0u, ORLOiSCSIPutSectionToConfig(kConf, "LUN_c", empty));
    EXPECT_EQ("[LUN_a]\n\tname=alpha2\n\tlid=1\n\tsize=1073741824\n[LUN_b]\n\tlid=2\n\tname=beta\n[LUN_c]\n",
              ReadFile(kConf));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
    EXPECT_EQ((std::vector<std::string>{"iscsi_lun.conf"}), DirEntries("/usr/orlo/etc"));
    for (POLIBC_SZHASH h : {a, b, a2, empty}) OLIBCSzHashFree(h);
}

TEST_F(ConfSectionTest, PutRefusesBadInputBeforeTouchingTheFile) {
    POLIBC_SZHASH good = MakeHash({{"k", "v"}});
    EXPECT_EQ(18990003u, ORLOiSCSIPutSectionToConfig(nullptr, "A", good));
    ExpectOneLine("iSCSI:iscsi_put_section_to_config.cpp:*:ORLOiSCSIPutSectionToConfig Bad parameters");
    EXPECT_EQ(18990003u, ORLOiSCSIPutSectionToConfig(kConf, "", good));
    EXPECT_EQ(18990003u, ORLOiSCSIPutSectionToConfig(kConf, "A", nullptr));
    log_.Clear();

    // Against a missing file (which must not appear) and an existing one (unchanged).
    for (bool existing : {false, true}) {
        SCOPED_TRACE(existing);
        if (existing) WriteFile(kConf, "[A]\n\tk=1\n");
        ino_t ino = Inode(kConf);
        EXPECT_EQ(18990004u, ORLOiSCSIPutSectionToConfig(kConf, "LUN_]x", good));
        ExpectOneLine("iSCSI:iscsi_put_section_to_config.cpp:*:ORLOiSCSIPutSectionToConfig "
                      "Bad parameters, invalid section name: \"LUN_\\]x\"");
        EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
        EXPECT_EQ(18990004u, ORLOiSCSIPutSectionToConfig(kConf, "LUN_\nx", good));
        ExpectOneLine("iSCSI:iscsi_put_section_to_config.cpp:*:ORLOiSCSIPutSectionToConfig Bad parameters, invalid section name: \"LUN_\\\\nx\"");
        POLIBC_SZHASH badKey = MakeHash({{"ok", "1"}, {"a=b", "v"}});
        EXPECT_EQ(18990004u, ORLOiSCSIPutSectionToConfig(kConf, "A", badKey));
        ExpectOneLine("iSCSI:iscsi_put_section_to_config.cpp:*:ORLOiSCSIPutSectionToConfig Bad parameters, invalid key: \"a=b\" in section A");
        POLIBC_SZHASH nlKey = MakeHash({{"a\nb", "v"}});
        EXPECT_EQ(18990004u, ORLOiSCSIPutSectionToConfig(kConf, "A", nlKey));
        ExpectOneLine("iSCSI:iscsi_put_section_to_config.cpp:*:ORLOiSCSIPutSectionToConfig Bad parameters, invalid key: \"a\\\\nb\" in section A");
        POLIBC_SZHASH badValue = MakeHash({{"name", "x\n[LUN_evil]"}});
        EXPECT_EQ(18990004u, ORLOiSCSIPutSectionToConfig(kConf, "A", badValue));
        ExpectOneLine("iSCSI:iscsi_put_section_to_config.cpp:*:ORLOiSCSIPutSectionToConfig Bad parameters, invalid value of key name in section A");
        EXPECT_EQ(existing, Exists(kConf));
        if (existing) {
            EXPECT_EQ("[A]\n\tk=1\n", ReadFile(kConf));
            EXPECT_EQ(ino, Inode(kConf));
        }
        for (POLIBC_SZHASH h : {badKey, nlKey, badValue}) OLIBCSzHashFree(h);
    }
    OLIBCSzHashFree(good);
}

TEST_F(ConfSectionTest, PutReportsEachFailedStep) {
    POLIBC_SZHASH h = MakeHash({{"k", "v"}});
    // Touch: no such directory.
    EXPECT_EQ(18990023u, ORLOiSCSIPutSectionToConfig("/usr/orlo/none/x.conf", "A", h));
    ExpectOneLine("iSCSI:iscsi_put_section_to_config.cpp:*:ORLOiSCSIPutSectionToConfig "
                  "Failed to touch /usr/orlo/none/x.conf");
    EXPECT_EQ(OLIBC_ERR_CONF, OLIBCErrGet());

    // Get: a malformed header.
    WriteFile(kConf, "[A]\n\tk=1\n[]\n");
    EXPECT_EQ(18990303u, ORLOiSCSIPutSectionToConfig(kConf, "A", h));
    ExpectOneLine("iSCSI:iscsi_put_section_to_config.cpp:*:ORLOiSCSIPutSectionToConfig "
                  "Failed to get section: A from /usr/orlo/etc/iscsi_lun.conf, errno=0xB00");
    EXPECT_EQ(OLIBC_ERR_CONF, OLIBCErrGet());
    EXPECT_EQ("[A]\n\tk=1\n[]\n", ReadFile(kConf));

    // Set and add: the file is reached through a link, which can be read but is never
    // replaced.
    WriteFile("/usr/orlo/etc/real.conf", "[A]\n\tk=1\n");
    ASSERT_EQ(0, symlink(Real("/usr/orlo/etc/real.conf").c_str(), Real("/usr/orlo/etc/link.conf").c_str()));
    EXPECT_EQ(18990305u, ORLOiSCSIPutSectionToConfig("/usr/orlo/etc/link.conf", "A", h));
    ExpectOneLine("iSCSI:iscsi_put_section_to_config.cpp:*:ORLOiSCSIPutSectionToConfig "
                  "Failed to set section: A from /usr/orlo/etc/link.conf, errno=0x900");
    EXPECT_EQ(18990304u, ORLOiSCSIPutSectionToConfig("/usr/orlo/etc/link.conf", "B", h));
    ExpectOneLine("iSCSI:iscsi_put_section_to_config.cpp:*:ORLOiSCSIPutSectionToConfig "
                  "Failed to add section: B to /usr/orlo/etc/link.conf, errno=0x900");
    EXPECT_EQ("[A]\n\tk=1\n", ReadFile("/usr/orlo/etc/real.conf"));
    OLIBCSzHashFree(h);
}

TEST_F(ConfSectionTest, RemoveListRewritesKeepingCommentsOwnerAndMode) {
    const std::string content =
        "; file comment\n"
        "[LUN_a]\n\tname=a\n"
        "[LUN_b]\n\tname=b\n# note inside b\n\n\tsize=1\n;another\n"
        "[LUN_c]\n\tname=c\n"
        "[LUN_d]\n\tname=d";
    WriteFile(kConf, content, 0640);
    ASSERT_EQ(0, chown(Real(kConf).c_str(), 4321, 8765));

    // Names that match nothing: the same bytes, owner and mode, in a new file.
    POLIBC_SZLIST none = MakeList({"LUN_x", "LUN_", "UN_a"});
    ino_t ino = Inode(kConf);
    ASSERT_EQ(0u, ORLOiSCSIRemoveSectionList(kConf, none));
    EXPECT_EQ(content, ReadFile(kConf));
    EXPECT_NE(ino, Inode(kConf));
    struct stat st;
    ASSERT_EQ(0, stat(Real(kConf).c_str(), &st));
    EXPECT_EQ(0640u, st.st_mode & 07777);
    EXPECT_EQ(4321u, st.st_uid);
    EXPECT_EQ(8765u, st.st_gid);

    // Unsorted names, the last section without a final newline.
    POLIBC_SZLIST some = MakeList({"LUN_d", "LUN_b", "LUN_zz"});
    ASSERT_EQ(0u, ORLOiSCSIRemoveSectionList(kConf, some));
    EXPECT_EQ("; file comment\n[LUN_a]\n\tname=a\n# note inside b\n;another\n[LUN_c]\n\tname=c\n", ReadFile(kConf));
    ASSERT_EQ(0, stat(Real(kConf).c_str(), &st));
    EXPECT_EQ(0640u, st.st_mode & 07777);
    EXPECT_EQ(4321u, st.st_uid);
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
    EXPECT_EQ((std::vector<std::string>{"iscsi_lun.conf"}), DirEntries("/usr/orlo/etc"));
    OLIBCSzListFree(none);
    OLIBCSzListFree(some);
}

TEST_F(ConfSectionTest, RemoveListFailuresLeaveTheFileAsItWas) {
    POLIBC_SZLIST list = MakeList({"LUN_a"});
    EXPECT_EQ(18990003u, ORLOiSCSIRemoveSectionList(nullptr, list));
    ExpectOneLine("iSCSI:iscsi_remove_section_list.cpp:*:ORLOiSCSIRemoveSectionList Null input pointer");
    EXPECT_EQ(18990003u, ORLOiSCSIRemoveSectionList(kConf, nullptr));
    log_.Clear();

    EXPECT_EQ(18990038u, ORLOiSCSIRemoveSectionList(kConf, list));
    ExpectOneLine("iSCSI:iscsi_remove_section_list.cpp:*:ORLOiSCSIRemoveSectionList "
                  "Failed to open file: /usr/orlo/etc/iscsi_lun.conf");
    EXPECT_FALSE(Exists(kConf));
    EXPECT_EQ(18990006u, ORLOiSCSIRemoveSectionList("/usr/orlo/etc", list));
    ExpectOneLine("iSCSI:iscsi_remove_section_list.cpp:*:ORLOiSCSIRemoveSectionList Not a file. path: /usr/orlo/etc");

    for (const char *bad : {"[]\n", "[\n", "[]"}) {
        const std::string content = std::string("[LUN_a]\n\tk=1\n") + bad + "\tk=2\n";
        WriteFile(kConf, content);
        ino_t ino = Inode(kConf);
        EXPECT_EQ(18990050u, ORLOiSCSIRemoveSectionList(kConf, list));
        EXPECT_EQ(1u, log_.Lines().size()) << log_.Dump();
        EXPECT_TRUE(log_.Contains("Bad section header in /usr/orlo/etc/iscsi_lun.conf")) << log_.Dump();
        log_.Clear();
        EXPECT_EQ(content, ReadFile(kConf));
        EXPECT_EQ(ino, Inode(kConf));
        EXPECT_EQ((std::vector<std::string>{"iscsi_lun.conf"}), DirEntries("/usr/orlo/etc"));
    }

    const std::string content = "[LUN_a]\n\tk=1\n[LUN_b]\n\tk=2\n";
    WriteFile(kConf, content);
    ino_t ino = Inode(kConf);
    POLIBC_SZLIST bad = MakeList({"LUN_b", "LUN_]a"});
    EXPECT_EQ(18990004u, ORLOiSCSIRemoveSectionList(kConf, bad));
    ExpectOneLine("iSCSI:iscsi_remove_section_list.cpp:*:ORLOiSCSIRemoveSectionList Bad parameters, invalid section name: \"LUN_\\]a\"");
    POLIBC_SZLIST nl = MakeList({"LUN_\na"});
    EXPECT_EQ(18990004u, ORLOiSCSIRemoveSectionList(kConf, nl));
    log_.Clear();
    EXPECT_EQ(ino, Inode(kConf));

    // A path that would not fit its buffer with the temporary suffix is refused whole.
    std::string longPath = "/usr/orlo/etc/" + std::string(4090, 'x');
    EXPECT_EQ(18990050u, ORLOiSCSIRemoveSectionList(longPath.c_str(), list));
    ExpectOneLine("iSCSI:iscsi_remove_section_list.cpp:*:ORLOiSCSIRemoveSectionList Path too long: /usr/orlo/etc/xxxxxxxx*");

    // A write that fails part way (file-size limit in a child): old file kept, no temporary.
    std::string big;
    for (int i = 0; i < 3000; ++i) big += "[S" + std::to_string(i) + "]\n\tkey=value of some length\n";
    WriteFile(kConf, big);
    pid_t pid = fork();
    if (pid == 0) {
        signal(SIGXFSZ, SIG_IGN);
        struct rlimit lim = {2048, 2048};
        setrlimit(RLIMIT_FSIZE, &lim);
        POLIBC_SZLIST one = MakeList({"S1"});
        _exit(ORLOiSCSIRemoveSectionList(kConf, one) == 18990040u ? 0 : 1);
    }
    int status = 0;
    waitpid(pid, &status, 0);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
    EXPECT_EQ(big, ReadFile(kConf));
    EXPECT_EQ((std::vector<std::string>{"iscsi_lun.conf"}), DirEntries("/usr/orlo/etc"));
    for (POLIBC_SZLIST l : {list, bad, nl}) OLIBCSzListFree(l);
}

}  // namespace
