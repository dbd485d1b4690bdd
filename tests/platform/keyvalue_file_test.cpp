// Flat key=value files: reading hand-edited lines, values refused rather than cut,
// setting in place (duplicates folded), appending, creating, and refusals.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <string>

#include "olibc.h"
#include "support/sandbox.h"

namespace {

class KeyValueFileTest : public orlotest::SandboxTest {
  protected:
    const char *kInfo = "/etc/orloinfo.conf";
    std::string Value(const char *key, const char *path = nullptr) {
        char buf[128];
        int n = OLIBCFileGetKeyValue(path ? path : kInfo, key, buf, sizeof(buf));
        if (n < 0) return "<" + std::to_string(OLIBCErrGet()) + ">";
        EXPECT_EQ(static_cast<size_t>(n), std::string(buf).size());
        return buf;
    }
};

TEST_F(KeyValueFileTest, ReadsWhatPeopleWrite) {
    WriteFile(kInfo,
              "# appliance settings\n"
              "max_iscsiluns=\"256\"\n"
              "support_iscsi_target = yes\n"
              "iscsi_target_type=lio\r\n"
              "empty=\n"
              "quoted_blank=\" \"\n"
              "dup=1\n"
              "[odd header]\n"
              "dup=2\n"
              ";max_snapshot_per_lun=9\n"
              "not a pair\n"
              "last=no newline");
    EXPECT_EQ("256", Value("max_iscsiluns"));
    EXPECT_EQ("yes", Value("support_iscsi_target"));
    EXPECT_EQ("lio", Value("iscsi_target_type"));
    EXPECT_EQ("", Value("empty"));
    EXPECT_EQ(" ", Value("quoted_blank"));
    EXPECT_EQ("2", Value("dup"));
    EXPECT_EQ("no newline", Value("last"));
    EXPECT_EQ("<" + std::to_string(OLIBC_ERR_NOT_FOUND) + ">", Value("max_snapshot_per_lun"));
    EXPECT_EQ("<" + std::to_string(OLIBC_ERR_NOT_FOUND) + ">", Value("x", "/etc.defaults/orloinfo.conf"));

    char small[3] = "zz";
    EXPECT_EQ(-1, OLIBCFileGetKeyValue(kInfo, "max_iscsiluns", small, sizeof(small)));
    EXPECT_EQ(OLIBC_ERR_TOO_LONG, OLIBCErrGet());
    EXPECT_STREQ("", small);
    char fits[4];
    EXPECT_EQ(3, OLIBCFileGetKeyValue(kInfo, "max_iscsiluns", fits, sizeof(fits)));

    POLIBC_SZHASH h = nullptr;
    EXPECT_EQ(7, OLIBCFileGetKeys(kInfo, &h));
    EXPECT_STREQ("2", OLIBCSzHashGetValue(h, "dup"));
    OLIBCSzHashFree(h);
    EXPECT_EQ(1, OLIBCFileCheckKeyValue(kInfo, "support_iscsi_target", "yes"));
    EXPECT_EQ(0, OLIBCFileCheckKeyValue(kInfo, "support_iscsi_target", "no"));
    EXPECT_EQ(0, OLIBCFileCheckKeyValue(kInfo, "support_rdma", "yes"));
    EXPECT_EQ(0, OLIBCFileCheckKeyValue("/etc/none.conf", "support_rdma", "yes"));
    EXPECT_EQ(-1, OLIBCFileCheckKeyValue("/etc", "support_rdma", "yes"));
}

TEST_F(KeyValueFileTest, SetsInPlaceAppendsAndCreates) {
    const char *isns = "/usr/orlo/etc/isns.conf";
    WriteFile(isns, "# iSNS\nisns_enable = yes\nisns_server=old\nisns_server=older\ntail=1", 0600);
    EXPECT_EQ(0, OLIBCFileSetKeyValue(isns, "isns_server", "10.0.0.1", "%s=%s\n"));
    EXPECT_EQ(0, OLIBCFileSetKeyValue(isns, "isns_port", "3205", "%s=\"%s\"\n"));
    EXPECT_EQ("# iSNS\nisns_enable = yes\nisns_server=10.0.0.1\ntail=1\nisns_port=\"3205\"\n", ReadFile(isns));
    EXPECT_EQ("3205", Value("isns_port", isns));
    // Quoting keeps what unquoted reading would trim or unquote.
    EXPECT_EQ(0, OLIBCFileSetKeyValue(isns, "note", " \"a\" b ", "%s=\"%s\"\n"));
    EXPECT_EQ(" \"a\" b ", Value("note", isns));
    struct stat st;
    ASSERT_EQ(0, stat(Real(isns).c_str(), &st));
    EXPECT_EQ(0600u, st.st_mode & 07777);

    const char *progress = "/tmp/progress.conf";
    EXPECT_EQ(0, OLIBCFileSetKeyValue(progress, "percent", "42", "%s=%s\n"));
    EXPECT_EQ("percent=42\n", ReadFile(progress));
    ASSERT_EQ(0, stat(Real(progress).c_str(), &st));
    EXPECT_EQ(0644u, st.st_mode & 07777);
    EXPECT_EQ(0, OLIBCFileSetKeyValue(progress, "percent", "43", "%s=%s\n"));
    EXPECT_EQ("percent=43\n", ReadFile(progress));
}

TEST_F(KeyValueFileTest, RefusalsLeaveTheFileAlone) {
    const char *isns = "/usr/orlo/etc/isns.conf";
    const std::string content = "isns_enable=yes\n";
    WriteFile(isns, content);
    struct Case {
        const char *key;
        const char *value;
        const char *fmt;
    };
    for (const Case &c : {Case{"a=b", "v", "%s=%s\n"}, Case{"a\nb", "v", "%s=%s\n"}, Case{"", "v", "%s=%s\n"},
                          Case{"k", "v\n", "%s=%s\n"}, Case{"k", "v", "%s=%n\n"}, Case{"k", "v", "%s=%s"},
                          Case{"k", "v", nullptr}, Case{nullptr, "v", "%s=%s\n"}, Case{"k", nullptr, "%s=%s\n"},
                          Case{";k", "v", "%s=%s\n"}}) {
        EXPECT_EQ(-1, OLIBCFileSetKeyValue(isns, c.key, c.value, c.fmt));
        EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
    }
    char buf[8];
    EXPECT_EQ(-1, OLIBCFileGetKeyValue(isns, "k", buf, 0));
    EXPECT_EQ(-1, OLIBCFileGetKeyValue(isns, "k", nullptr, 8));
    EXPECT_EQ(-1, OLIBCFileGetKeyValue(nullptr, "k", buf, 8));
    EXPECT_EQ(content, ReadFile(isns));
    EXPECT_EQ(-1, OLIBCFileSetKeyValue("/usr/orlo/etc", "k", "v", "%s=%s\n"));
    EXPECT_EQ(OLIBC_ERR_FOPEN, OLIBCErrGet());
    EXPECT_EQ(-1, OLIBCFileSetKeyValue("/usr/orlo/nodir/x.conf", "k", "v", "%s=%s\n"));
    EXPECT_EQ(OLIBC_ERR_NOT_FOUND, OLIBCErrGet());
}

}  // namespace
