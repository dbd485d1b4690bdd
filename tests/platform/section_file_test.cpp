// Section files through the OLIBCFile* calls: what the reader makes of hand-edited
// files, what every writer leaves around the section it changes, that refused or failed
// writes leave the file byte for byte (and inode for inode) as it was, and that a
// replacement keeps owner and mode.
#include <dirent.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <map>
#include <string>
#include <vector>

#include "olibc.h"
#include "support/sandbox.h"

namespace {

using Pairs = std::vector<std::pair<std::string, std::string>>;

POLIBC_SZHASH MakeHash(const Pairs &pairs) {
    POLIBC_SZHASH h = OLIBCSzHashAlloc(4);
    for (const auto &kv : pairs) OLIBCSzHashSetValue(&h, kv.first.c_str(), kv.second.c_str());
    return h;
}

Pairs HashPairs(const OLIBC_SZHASH *h) {
    Pairs out;
    const char *k = nullptr;
    const char *v = nullptr;
    for (int i = 0; OLIBCSzHashEnum(h, i, &k, &v); ++i) out.emplace_back(k, v);
    return out;
}

class SectionFileTest : public orlotest::SandboxTest {
  protected:
    const char *kConf = "/usr/orlo/etc/iscsi_test.conf";

    // The section's pairs, or {{"<absent>", ""}} / {{"<error>", code}}.
    Pairs Get(const char *section, const char *path = nullptr) {
        POLIBC_SZHASH h = nullptr;
        int rc = OLIBCFileGetSection(path ? path : kConf, section, &h);
        Pairs out = rc > 0 ? HashPairs(h) : rc == 0 ? Pairs{{"<absent>", ""}}
                                                  : Pairs{{"<error>", std::to_string(OLIBCErrGet())}};
        OLIBCSzHashFree(h);
        return out;
    }
    std::vector<std::string> Enum(const char *path = nullptr) {
        POLIBC_SZLIST l = nullptr;
        int n = OLIBCFileEnumSection(path ? path : kConf, &l);
        std::vector<std::string> out;
        if (n < 0) return {"<error>"};
        for (int i = 0; i < n; ++i) out.emplace_back(OLIBCSzListGet(l, i));
        OLIBCSzListFree(l);
        return out;
    }
    ino_t Inode(const std::string &logical) {
        struct stat st;
        return lstat(Real(logical).c_str(), &st) == 0 ? st.st_ino : 0;
    }
    // Files in the configuration directory other than the ones named.
    std::vector<std::string> Leftovers(const std::vector<std::string> &expected) {
        std::vector<std::string> out;
        DIR *d = opendir(Real("/usr/orlo/etc").c_str());
        while (struct dirent *e = readdir(d)) {
            std::string n = e->d_name;
            if (n == "." || n == "..") continue;
            bool known = false;
            for (const std::string &x : expected) known = known || x == n;
            if (!known) out.push_back(n);
        }
        closedir(d);
        return out;
    }
};

TEST_F(SectionFileTest, ReaderAcceptsHandEditedFiles) {
    std::string longValue(200000, 'x');
    WriteFile(kConf,
              "; preamble comment\n"
              "stray=before any section\n"
              "[LUN_a]\n"
              "\tname=alpha\n"
              "  spaced   =   around equals  \n"
              "quoted=\"  kept blanks \"\n"
              "half=\"open\n"
              "empty=\n"
              "\n"
              "# comment=not a key\n"
              "\t; also=comment\n"
              "no equals sign here\n"
              " = no key\n"
              "dup=first\n"
              "dup=second\n"
              "eq=a=b\n"
              "[LUN_b] trailing text after the bracket\r\n"
              "crlf=yes\r\n"
              "long=" + longValue + "\n"
              "[LUN_a]\n"
              "ignored=duplicate section\n"
              "[unclosed\n"
              "k=v");
    EXPECT_EQ((std::vector<std::string>{"LUN_a", "LUN_b", "unclosed"}), Enum());
    EXPECT_EQ((Pairs{{"name", "alpha"},
                     {"spaced", "around equals  "},
                     {"quoted", "  kept blanks "},
                     {"half", "\"open"},
                     {"empty", ""},
                     {"dup", "second"},
                     {"eq", "a=b"}}),
              Get("LUN_a"));
    EXPECT_EQ((Pairs{{"crlf", "yes"}, {"long", longValue}}), Get("LUN_b"));
    EXPECT_EQ((Pairs{{"k", "v"}}), Get("unclosed"));
    EXPECT_EQ((Pairs{{"<absent>", ""}}), Get("LUN_c"));
    char buf[16];
    EXPECT_EQ(5, OLIBCFileGetSectionValue(kConf, "LUN_a", "name", buf, sizeof(buf)));
    EXPECT_STREQ("alpha", buf);
    EXPECT_EQ(-1, OLIBCFileGetSectionValue(kConf, "LUN_b", "long", buf, sizeof(buf)));
    EXPECT_EQ(OLIBC_ERR_TOO_LONG, OLIBCErrGet());
    EXPECT_STREQ("", buf);
    EXPECT_EQ(-1, OLIBCFileGetSectionValue(kConf, "LUN_b", "name", buf, sizeof(buf)));
    EXPECT_EQ(OLIBC_ERR_NOT_FOUND, OLIBCErrGet());

    EXPECT_EQ(1, OLIBCIFileIsSection("[LUN_a]", 7));
    EXPECT_EQ(1, OLIBCIFileIsSection("[LUN_a]\n", 8));
    EXPECT_EQ(0, OLIBCIFileIsSection("[]", 2));
    EXPECT_EQ(0, OLIBCIFileIsSection("[", 1));
    EXPECT_EQ(0, OLIBCIFileIsSection(" [a]", 4));
    EXPECT_EQ(0, OLIBCIFileIsSection("\tk=v", 4));
    EXPECT_EQ(0, OLIBCIFileIsSection("[a]\nk=v", 7));
}

TEST_F(SectionFileTest, WritersChangeOnlyTheirSection) {
    const std::string before = "# header comment\n[A]\n\tk=1\n";
    const std::string after = "[C]\n\tc=3\n";
    WriteFile(kConf, before +
                         "[B]\n\told=1\n# about B, kept\n\n\tgone=2\nstray line\n[B]\n\tdup=drop\n; dup comment\n" +
                         after);
    POLIBC_SZHASH h = MakeHash({{"lid", "3"}, {"name", "bee"}});
    EXPECT_EQ(1, OLIBCFileSetSection(kConf, "B", "B", h, "\t%s=%s\n"));
    EXPECT_EQ(before + "[B]\n\tlid=3\n\tname=bee\n# about B, kept\n\n; dup comment\n" + after, ReadFile(kConf));

    // Renaming, and renaming onto an existing name (refused, nothing written).
    EXPECT_EQ(1, OLIBCFileSetSection(kConf, "B", "B2", h, "%s=\"%s\"\n"));
    EXPECT_EQ(before + "[B2]\nlid=\"3\"\nname=\"bee\"\n# about B, kept\n\n; dup comment\n" + after,
              ReadFile(kConf));
    EXPECT_EQ((Pairs{{"lid", "3"}, {"name", "bee"}}), Get("B2"));
    std::string snapshot = ReadFile(kConf);
    ino_t ino = Inode(kConf);
    EXPECT_EQ(-1, OLIBCFileSetSection(kConf, "B2", "C", h, "\t%s=%s\n"));
    EXPECT_EQ(OLIBC_ERR_CONF, OLIBCErrGet());
    EXPECT_EQ(0, OLIBCFileSetSection(kConf, "missing", "missing", h, "\t%s=%s\n"));
    EXPECT_EQ(-1, OLIBCFileAddSection(kConf, "A", h, "\t%s=%s\n"));
    EXPECT_EQ(0, OLIBCFileRemoveSection(kConf, "missing"));
    EXPECT_EQ(snapshot, ReadFile(kConf));
    EXPECT_EQ(ino, Inode(kConf));

    // Removal keeps the removed section's comments and drops its blank lines.
    EXPECT_EQ(1, OLIBCFileRemoveSection(kConf, "B2"));
    EXPECT_EQ(before + "# about B, kept\n; dup comment\n" + after, ReadFile(kConf));

    // Appending after a last line without its newline.
    WriteFile(kConf, "[A]\n\tk=1");
    EXPECT_EQ(1, OLIBCFileAddSection(kConf, "D", h, "\t%s=%s\n"));
    EXPECT_EQ("[A]\n\tk=1\n[D]\n\tlid=3\n\tname=bee\n", ReadFile(kConf));

    // Single values: replaced in place (duplicates dropped), added after the section's
    // last key, or added with a new section.
    WriteFile(kConf, "[A]\n\tk=1\n\tk=2\n# c\n[B]\n\tx=1");
    EXPECT_EQ(0, OLIBCFileSetSectionValue(kConf, "A", "k", "9", "\t%s=%s\n"));
    EXPECT_EQ(0, OLIBCFileSetSectionValue(kConf, "A", "n", "new", "\t%s=%s\n"));
    EXPECT_EQ(0, OLIBCFileSetSectionValue(kConf, "B", "y", "2", "\t%s=%s\n"));
    EXPECT_EQ(0, OLIBCFileSetSectionValue(kConf, "C", "z", "3", "\t%s=%s\n"));
    EXPECT_EQ("[A]\n\tk=9\n\tn=new\n# c\n[B]\n\tx=1\n\ty=2\n[C]\n\tz=3\n", ReadFile(kConf));
    EXPECT_TRUE(Leftovers({"iscsi_test.conf"}).empty());
    OLIBCSzHashFree(h);
}

TEST_F(SectionFileTest, ReplacementKeepsOwnerAndModeAndCreatesWhatItShould) {
    WriteFile(kConf, "[A]\n\tk=1\n", 0640);
    ASSERT_EQ(0, chown(Real(kConf).c_str(), 1234, 5678));
    ino_t ino = Inode(kConf);
    POLIBC_SZHASH h = MakeHash({{"k", "2"}});
    ASSERT_EQ(1, OLIBCFileSetSection(kConf, "A", "A", h, "\t%s=%s\n"));
    struct stat st;
    ASSERT_EQ(0, stat(Real(kConf).c_str(), &st));
    EXPECT_EQ(0640u, st.st_mode & 07777);
    EXPECT_EQ(1234u, st.st_uid);
    EXPECT_EQ(5678u, st.st_gid);
    EXPECT_NE(ino, st.st_ino);  // a new file renamed over the old one
    EXPECT_EQ("[A]\n\tk=2\n", ReadFile(kConf));

    // Missing files: readers and most writers refuse; the single-value writer and touch
    // create (0644).
    const char *fresh = "/usr/orlo/etc/fresh.conf";
    POLIBC_SZLIST none = nullptr;
    EXPECT_EQ(-1, OLIBCFileEnumSection(fresh, &none));
    EXPECT_EQ(nullptr, none);
    EXPECT_EQ(OLIBC_ERR_NOT_FOUND, OLIBCErrGet());
    EXPECT_EQ((Pairs{{"<error>", std::to_string(OLIBC_ERR_NOT_FOUND)}}), Get("A", fresh));
    EXPECT_EQ(-1, OLIBCFileAddSection(fresh, "A", h, "\t%s=%s\n"));
    EXPECT_EQ(-1, OLIBCFileRemoveSection(fresh, "A"));
    EXPECT_FALSE(Exists(fresh));
    EXPECT_EQ(0, OLIBCFileSetSectionValue(fresh, "A", "k", "v", "\t%s=%s\n"));
    EXPECT_EQ("[A]\n\tk=v\n", ReadFile(fresh));
    ASSERT_EQ(0, stat(Real(fresh).c_str(), &st));
    EXPECT_EQ(0644u, st.st_mode & 07777);
    EXPECT_EQ(0, OLIBCFileTouch("/usr/orlo/etc/touched.conf"));
    EXPECT_EQ(0, OLIBCFileTouch("/usr/orlo/etc/touched.conf"));
    EXPECT_EQ("", ReadFile("/usr/orlo/etc/touched.conf"));
    EXPECT_EQ(-1, OLIBCFileTouch("/usr/orlo/nodir/x.conf"));
    EXPECT_EQ(OLIBC_ERR_NOT_FOUND, OLIBCErrGet());
    EXPECT_EQ(-1, OLIBCFileTouch("/usr/orlo/etc"));
    EXPECT_EQ(OLIBC_ERR_FOPEN, OLIBCErrGet());
    EXPECT_EQ(1, OLIBCFileExist("/usr/orlo/etc/touched.conf"));
    EXPECT_EQ(0, OLIBCFileExist("/usr/orlo/etc/none.conf"));
    OLIBCSzHashFree(h);
}

TEST_F(SectionFileTest, RefusedWritesNeverTouchTheFile) {
    const std::string content = "[A]\n\tk=1\n[B]\n\tk=2\n";
    WriteFile(kConf, content);
    ino_t ino = Inode(kConf);
    struct Case {
        const char *section;
        Pairs pairs;
        const char *fmt;
    };
    const std::vector<Case> cases = {
        {"A]x", {{"k", "v"}}, "\t%s=%s\n"},    {"A\nB", {{"k", "v"}}, "\t%s=%s\n"},
        {"", {{"k", "v"}}, "\t%s=%s\n"},       {"A", {{"k=x", "v"}}, "\t%s=%s\n"},
        {"A", {{"k\n", "v"}}, "\t%s=%s\n"},    {"A", {{"", "v"}}, "\t%s=%s\n"},
        {"A", {{"#k", "v"}}, "\t%s=%s\n"},     {"A", {{"[k", "v"}}, "\t%s=%s\n"},
        {"A", {{" k", "v"}}, "\t%s=%s\n"},     {"A", {{"k", "v\nx=y"}}, "\t%s=%s\n"},
        {"A", {{"k", "v\r"}}, "\t%s=%s\n"},    {"A", {{"k", "v"}}, "\t%s=%d\n"},
        {"A", {{"k", "v"}}, "\t%s=%s"},        {"A", {{"k", "v"}}, "\t%s %s\n"},
        {"A", {{"k", "v"}}, "#%s=%s\n"},       {"A", {{"k", "v"}}, "%s=%s\n%s\n"},
        {"A", {{"k", "v"}}, "%s=%s\n\n"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(std::string(c.section) + " / " + c.fmt);
        POLIBC_SZHASH h = MakeHash(c.pairs);
        EXPECT_EQ(-1, OLIBCFileSetSection(kConf, "A", c.section, h, c.fmt));
        EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
        EXPECT_EQ(-1, OLIBCFileAddSection(kConf, c.section[0] == 'A' && c.section[1] == '\0' ? "Z" : c.section, h, c.fmt));
        EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
        EXPECT_EQ(-1, OLIBCFileSetSectionValue(kConf, c.section, c.pairs[0].first.c_str(), c.pairs[0].second.c_str(),
                                               c.fmt));
        OLIBCSzHashFree(h);
    }
    EXPECT_EQ(-1, OLIBCFileRemoveSection(kConf, "A]"));
    EXPECT_EQ(-1, OLIBCFileSetSection(kConf, "A", "A", nullptr, "\t%s=%s\n"));
    EXPECT_EQ(-1, OLIBCFileSetSection(nullptr, "A", "A", nullptr, "\t%s=%s\n"));
    EXPECT_EQ(-1, OLIBCFileGetSection("", "A", nullptr));
    EXPECT_EQ(content, ReadFile(kConf));
    EXPECT_EQ(ino, Inode(kConf));

    // A malformed header makes every section call refuse the file.
    for (const char *bad : {"[]\n", "[\n", "[]"}) {
        const std::string broken = content + bad + "k=v\n";
        WriteFile(kConf, broken);
        ino = Inode(kConf);
        POLIBC_SZHASH h = MakeHash({{"k", "9"}});
        EXPECT_EQ((std::vector<std::string>{"<error>"}), Enum());
        EXPECT_EQ(OLIBC_ERR_BAD_FORMAT, OLIBCErrGet());
        EXPECT_EQ((Pairs{{"<error>", std::to_string(OLIBC_ERR_BAD_FORMAT)}}), Get("A"));
        EXPECT_EQ(-1, OLIBCFileSetSection(kConf, "A", "A", h, "\t%s=%s\n"));
        EXPECT_EQ(-1, OLIBCFileAddSection(kConf, "C", h, "\t%s=%s\n"));
        EXPECT_EQ(-1, OLIBCFileRemoveSection(kConf, "A"));
        EXPECT_EQ(-1, OLIBCFileSetSectionValue(kConf, "A", "k", "9", "\t%s=%s\n"));
        EXPECT_EQ(OLIBC_ERR_BAD_FORMAT, OLIBCErrGet());
        EXPECT_EQ(broken, ReadFile(kConf));
        EXPECT_EQ(ino, Inode(kConf));
        OLIBCSzHashFree(h);
    }
}

TEST_F(SectionFileTest, PathsThatAreNotRegularFiles) {
    POLIBC_SZHASH h = MakeHash({{"k", "v"}});
    // A directory and a FIFO (which must not block the reader).
    ASSERT_EQ(0, mkdir(Real("/usr/orlo/etc/dir.conf").c_str(), 0755));
    ASSERT_EQ(0, mkfifo(Real("/usr/orlo/etc/fifo.conf").c_str(), 0644));
    for (const char *p : {"/usr/orlo/etc/dir.conf", "/usr/orlo/etc/fifo.conf"}) {
        SCOPED_TRACE(p);
        EXPECT_EQ((std::vector<std::string>{"<error>"}), Enum(p));
        EXPECT_EQ(OLIBC_ERR_FOPEN, OLIBCErrGet());
        EXPECT_EQ((Pairs{{"<error>", std::to_string(OLIBC_ERR_FOPEN)}}), Get("A", p));
        EXPECT_EQ(-1, OLIBCFileAddSection(p, "A", h, "\t%s=%s\n"));
        EXPECT_EQ(OLIBC_ERR_FOPEN, OLIBCErrGet());
        EXPECT_EQ(-1, OLIBCFileSetSectionValue(p, "A", "k", "v", "\t%s=%s\n"));
        EXPECT_EQ(OLIBC_ERR_FOPEN, OLIBCErrGet());
    }
    // A symbolic link: readers follow it, writers refuse to replace it.
    WriteFile("/usr/orlo/etc/target.conf", "[A]\n\tk=1\n");
    ASSERT_EQ(0, symlink(Real("/usr/orlo/etc/target.conf").c_str(), Real("/usr/orlo/etc/link.conf").c_str()));
    EXPECT_EQ((Pairs{{"k", "1"}}), Get("A", "/usr/orlo/etc/link.conf"));
    EXPECT_EQ(-1, OLIBCFileSetSection("/usr/orlo/etc/link.conf", "A", "A", h, "\t%s=%s\n"));
    EXPECT_EQ(OLIBC_ERR_FOPEN, OLIBCErrGet());
    EXPECT_EQ("[A]\n\tk=1\n", ReadFile("/usr/orlo/etc/target.conf"));
    struct stat st;
    ASSERT_EQ(0, lstat(Real("/usr/orlo/etc/link.conf").c_str(), &st));
    EXPECT_TRUE(S_ISLNK(st.st_mode));
    OLIBCSzHashFree(h);
}

// Runs body in a child process and returns its exit status.
template <typename F>
int InChild(F body) {
    pid_t pid = fork();
    if (pid == 0) _exit(body());
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

TEST_F(SectionFileTest, FailedWriteLeavesOldFileAndNoTemporary) {
    // A file-size limit makes the temporary file's write fail part way.
    std::string content = "[A]\n\tk=1\n";
    for (int i = 0; i < 200; ++i) content += "[S" + std::to_string(i) + "]\n\tkey=some value\n";
    WriteFile(kConf, content);
    int code = InChild([&]() {
        signal(SIGXFSZ, SIG_IGN);
        struct rlimit lim = {1024, 1024};
        setrlimit(RLIMIT_FSIZE, &lim);
        POLIBC_SZHASH h = MakeHash({{"k", "2"}});
        if (OLIBCFileSetSection(kConf, "A", "A", h, "\t%s=%s\n") != -1) return 1;
        if (OLIBCErrGet() != OLIBC_ERR_IO) return 2;
        if (OLIBCFileSetSectionValue(kConf, "S0", "key", "x", "\t%s=%s\n") != -1) return 3;
        return 0;
    });
    EXPECT_EQ(0, code);
    EXPECT_EQ(content, ReadFile(kConf));
    EXPECT_TRUE(Leftovers({"iscsi_test.conf"}).empty());

    // Unreadable to an ordinary user (root reads everything, so drop to nobody).
    WriteFile(kConf, content, 0600);
    chmod(root().c_str(), 0755);
    code = InChild([&]() {
        if (setgid(65534) != 0 || setuid(65534) != 0) return 10;
        POLIBC_SZLIST list = nullptr;
        if (OLIBCFileEnumSection(kConf, &list) != -1) return 1;
        return OLIBCErrGet() == OLIBC_ERR_FOPEN ? 0 : 2;
    });
    EXPECT_EQ(0, code);
}

}  // namespace
