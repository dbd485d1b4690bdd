// The target record and its file: every field through the file and back, the exact
// section text, the differences between Add and Update, refusal of bad records before
// anything changes, the load's edge cases and the filter.
#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

#include "olibc.h"
#include "target/target_fixture.h"

namespace {

using namespace target_test;

class TargetConfTest : public TargetTest {};

// text with the first "from" replaced by "to".
std::string With(std::string text, const std::string &from, const std::string &to) {
    size_t p = text.find(from);
    if (p != std::string::npos) text.replace(p, from.size(), to);
    return text;
}

// The value of key in the first section of text that has it ("" when absent).
std::string ValueOf(const std::string &text, const std::string &key) {
    std::string needle = "\t" + key + "=";
    size_t p = text.find(needle);
    if (p == std::string::npos) return "";
    p += needle.size();
    return text.substr(p, text.find('\n', p) - p);
}

TEST_F(TargetConfTest, EveryFieldRoundTripsThroughTheExactSection) {
    ORLOiSCSITarget t = MakeTarget(7);
    t.enabled = true;
    t.has_header_checksum = true;
    t.has_data_checksum = false;
    t.bkp_obj = true;
    snprintf(t.network_portals, sizeof(t.network_portals), "%s", "192.168.1.5:3260,[fe80::1]:3261");
    t.max_recv_seg_bytes = 8192;
    t.max_send_seg_bytes = 65536;
    t.max_sessions = 4;
    t.auth_type = ORLO_ISCSI_AUTH_MUTUAL_CHAP;
    snprintf(t.user, sizeof(t.user), "%s", "chap-user");
    snprintf(t.password, sizeof(t.password), "%s", "Pw=x]y#18charsLong");  // the longest secret
    snprintf(t.mutual_user, sizeof(t.mutual_user), "%s", "back-user");
    snprintf(t.mutual_password, sizeof(t.mutual_password), "%s", "mutualSecret1");
    ASSERT_EQ(static_cast<size_t>(OLIBC_CRYPT_PLAIN_MAX), strlen(t.password));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&t)) << log_.Dump();

    const std::string text = ReadFile(kTargetConf);
    const std::string pw = ValueOf(text, "password");
    const std::string mpw = ValueOf(text, "mutual_password");
    EXPECT_EQ(std::string::npos, text.find("Pw=x]y#18charsLong"));
    EXPECT_EQ(std::string::npos, text.find("mutualSecret1"));
    EXPECT_EQ('~', pw[0]);
    EXPECT_NE(pw, mpw);
    EXPECT_EQ("[iSCSI_T7]\n"
              "\ttid=7\n"
              "\tname=Target-7\n"
              "\tiqn=iqn.2000-01.com.orlo-nas:store.target-7\n"
              "\tenabled=yes\n"
              "\tauthen=yes\n"
              "\tusername=chap-user\n"
              "\tpassword=" + pw + "\n"
              "\tmutual=yes\n"
              "\tmutual_username=back-user\n"
              "\tmutual_password=" + mpw + "\n"
              "\thdr_chksum=yes\n"
              "\tdata_chksum=no\n"
              "\tsend_seg_bytes=65536\n"
              "\trecv_seg_bytes=8192\n"
              "\tmax_sessions=4\n"
              "\tbkp_obj=1\n"
              "\tnetwork_portals=192.168.1.5:3260,[fe80::1]:3261\n",
              text);

    ORLOiSCSITarget back;
    memset(&back, 0xAB, sizeof(back));
    ASSERT_EQ(0u, ORLOiSCSITargetGetByTid(7, 0, &back)) << log_.Dump();
    EXPECT_EQ(nullptr, back.link.next);
    EXPECT_TRUE(back.enabled_as_loaded);
    back.enabled_as_loaded = false;
    back.link = t.link;
    EXPECT_EQ(0, memcmp(&t, &back, sizeof(t)));

    // One-way CHAP: the mutual pair is written but not read back; no authentication: the
    // pair is not read either.
    t.auth_type = ORLO_ISCSI_AUTH_CHAP;
    ASSERT_EQ(0u, ORLOiSCSITargetConfUpdate(&t));
    EXPECT_EQ("yes", ValueOf(ReadFile(kTargetConf), "authen"));
    EXPECT_EQ("no", ValueOf(ReadFile(kTargetConf), "mutual"));
    ASSERT_EQ(0u, ORLOiSCSITargetGetByTid(7, 0, &back));
    EXPECT_EQ(1, back.auth_type);
    EXPECT_STREQ("Pw=x]y#18charsLong", back.password);
    EXPECT_STREQ("", back.mutual_user);
    EXPECT_STREQ("", back.mutual_password);
    t.auth_type = ORLO_ISCSI_AUTH_NONE;
    t.enabled = false;
    t.password[0] = '\0';
    ASSERT_EQ(0u, ORLOiSCSITargetConfUpdate(&t));
    EXPECT_EQ("", ValueOf(ReadFile(kTargetConf), "password"));  // empty secret stored empty
    ASSERT_EQ(0u, ORLOiSCSITargetGetByTid(7, 0, &back));
    EXPECT_EQ(0, back.auth_type);
    EXPECT_STREQ("", back.user);
    EXPECT_FALSE(back.enabled);
    EXPECT_FALSE(back.enabled_as_loaded);
}

TEST_F(TargetConfTest, AddReplacesUpdateInsistsAndUnsupportedAuthDiffers) {
    ORLOiSCSITarget a = MakeTarget(1);
    ORLOiSCSITarget b = MakeTarget(2);
    ASSERT_EQ(0u, ORLOiSCSITargetConfUpdate(&a)) << log_.Dump();  // no file yet: created
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&b));
    snprintf(a.name, sizeof(a.name), "%s", "renamed");
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&a));  // same tid: replaced in place, not appended
    std::string text = ReadFile(kTargetConf);
    EXPECT_EQ(text.find("[iSCSI_T1]"), text.rfind("[iSCSI_T1]"));
    EXPECT_LT(text.find("[iSCSI_T1]"), text.find("[iSCSI_T2]"));
    EXPECT_EQ("renamed", ValueOf(text, "name"));

    // Update of a tid without a section, while the file exists.
    ORLOiSCSITarget c = MakeTarget(3);
    log_.Clear();
    EXPECT_EQ(18990000u, ORLOiSCSITargetConfUpdate(&c));
    EXPECT_EQ(1, LinesWith("Failed to get old section: iSCSI_T3 from /usr/orlo/etc/iscsi_target.conf, errno=0x"))
        << log_.Dump();
    EXPECT_EQ(text, ReadFile(kTargetConf));

    // auth_type 5: Add logs it and stores no/no; Update stores empty values.
    a.auth_type = 5;
    log_.Clear();
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&a));
    EXPECT_EQ(1, LinesWith("Un-supported CHAP type 5")) << log_.Dump();
    text = ReadFile(kTargetConf);
    EXPECT_NE(std::string::npos, text.find("\tauthen=no\n\tusername=\n\tpassword=\n\tmutual=no\n"));
    log_.Clear();
    ASSERT_EQ(0u, ORLOiSCSITargetConfUpdate(&a));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
    text = ReadFile(kTargetConf);
    EXPECT_NE(std::string::npos, text.find("\tauthen=\n\tusername=\n\tpassword=\n\tmutual=\n"));
    // ... which the checker refuses outright.
    EXPECT_EQ(18990702u, ORLOiSCSITargetStructCheck(&a));
}

TEST_F(TargetConfTest, BadRecordsAreRefusedBeforeAnythingChanges) {
    ORLOiSCSITarget good = MakeTarget(1);
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&good));
    const std::string before = ReadFile(kTargetConf);

    struct Case {
        const char *what;
        void (*mutate)(ORLOiSCSITarget *);
        uint32_t code;
    };
    const Case cases[] = {
        {"tid 0", [](ORLOiSCSITarget *t) { t->tid = 0; }, 18990710},
        {"tid 257", [](ORLOiSCSITarget *t) { t->tid = 257; }, 18990710},
        {"empty name", [](ORLOiSCSITarget *t) { t->name[0] = '\0'; }, 18990700},
        {"name with line break", [](ORLOiSCSITarget *t) { strcpy(t->name, "a\n[iSCSI_T9]"); }, 18990700},
        {"unterminated name", [](ORLOiSCSITarget *t) { memset(t->name, 'n', sizeof(t->name)); }, 18990700},
        {"quoted name", [](ORLOiSCSITarget *t) { strcpy(t->name, "\"quoted\""); }, 18990700},
        {"empty iqn", [](ORLOiSCSITarget *t) { t->iqn[0] = '\0'; }, 18990701},
        {"upper-case iqn", [](ORLOiSCSITarget *t) { strcpy(t->iqn, "iqn.2000-01.com.Orlo:x"); }, 18990701},
        {"iqn month 13", [](ORLOiSCSITarget *t) { strcpy(t->iqn, "iqn.2000-13.com.orlo:x"); }, 18990701},
        {"iqn without authority", [](ORLOiSCSITarget *t) { strcpy(t->iqn, "iqn.2000-01."); }, 18990701},
        {"iqn with blank", [](ORLOiSCSITarget *t) { strcpy(t->iqn, "iqn.2000-01.com.orlo:a b"); }, 18990701},
        {"short eui", [](ORLOiSCSITarget *t) { strcpy(t->iqn, "eui.0123456789ABCDE"); }, 18990701},
        {"naa of 20 digits", [](ORLOiSCSITarget *t) { strcpy(t->iqn, "naa.0123456789abcdef0123"); }, 18990701},
        {"iqn of 224 bytes",
         [](ORLOiSCSITarget *t) {
             std::string s = "iqn.2000-01.com.orlo:" + std::string(224 - 21, 'x');
             strcpy(t->iqn, s.c_str());
         },
         18990701},
        {"negative max_sessions", [](ORLOiSCSITarget *t) { t->max_sessions = -1; }, 18990703},
        {"user with line break", [](ORLOiSCSITarget *t) { strcpy(t->user, "u\nv"); }, 18990704},
        {"secret one byte too long", [](ORLOiSCSITarget *t) { strcpy(t->password, "0123456789abcdefghi"); }, 18990705},
        {"mutual user unterminated", [](ORLOiSCSITarget *t) { memset(t->mutual_user, 'm', 64); }, 18990706},
        {"mutual secret too long",
         [](ORLOiSCSITarget *t) { strcpy(t->mutual_password, "0123456789abcdefghi"); }, 18990707},
        {"recv segment 511", [](ORLOiSCSITarget *t) { t->max_recv_seg_bytes = 511; }, 18990738},
        {"send segment 2^24", [](ORLOiSCSITarget *t) { t->max_send_seg_bytes = 16777216; }, 18990739},
        {"portals with line break", [](ORLOiSCSITarget *t) { strcpy(t->network_portals, "1.2.3.4:3260\n"); },
         18990004},
    };
    for (const Case &c : cases) {
        for (int update = 0; update < 2; ++update) {
            ORLOiSCSITarget t = good;
            c.mutate(&t);
            log_.Clear();
            uint32_t ret = update ? ORLOiSCSITargetConfUpdate(&t) : ORLOiSCSITargetConfAdd(&t);
            EXPECT_EQ(c.code, ret) << c.what << (update ? " (update)" : " (add)");
            EXPECT_EQ(1u, log_.Lines().size()) << c.what << "\n" << log_.Dump();
            EXPECT_EQ(c.code, ORLOiSCSITargetStructCheck(&t)) << c.what;
            EXPECT_EQ(before, ReadFile(kTargetConf)) << c.what;
        }
    }
    EXPECT_EQ(18990003u, ORLOiSCSITargetConfAdd(nullptr));
    EXPECT_EQ(before, ReadFile(kTargetConf));

    // The other two name forms, and the boundaries, are taken.
    const char *valid[] = {"eui.0123456789ABCDEF", "naa.0123456789abcdef", "naa.0123456789abcdef0123456789ABCDEF",
                           "iqn.1994-05.com.example", ORLO_ISCSI_DEFAULT_ACL_INITIATOR};
    for (const char *v : valid) EXPECT_EQ(1, ORLOiSCSIIsValidIscsiName(v)) << v;
    ORLOiSCSITarget edge = good;
    edge.tid = 256;
    edge.max_recv_seg_bytes = 512;
    edge.max_send_seg_bytes = 16777215;
    std::string longest = "iqn.2000-01.com.orlo:" + std::string(223 - 21, 'x');
    strcpy(edge.iqn, longest.c_str());
    EXPECT_EQ(0u, ORLOiSCSITargetConfAdd(&edge)) << log_.Dump();
}

TEST_F(TargetConfTest, LoadEdgeCases) {
    // No file: an empty list and success.
    ORLOiSCSITargetList list = {};
    ORLOiSCSITargetFilter all = {};
    ASSERT_EQ(0u, ORLOiSCSITargetConfLoad(&all, &list));
    EXPECT_EQ(0, list.count);

    // Absent optional keys: one session, not a backup object, no portals.
    WriteFile(kTargetConf, Section(3, "plain"));
    ASSERT_EQ(0u, ORLOiSCSITargetConfLoad(&all, &list)) << log_.Dump();
    ASSERT_EQ(1, list.count);
    ORLOiSCSITarget t = Records(&list)[0];
    EXPECT_EQ(1, t.max_sessions);
    EXPECT_FALSE(t.bkp_obj);
    EXPECT_STREQ("", t.network_portals);
    EXPECT_EQ(262144, t.max_recv_seg_bytes);
    ORLOiSCSITargetListFree(&list);

    // "enabled" and the digests compare without case; "authen" other than "no" means CHAP.
    WriteFile(kTargetConf, With(Section(4, "cased", "\tbkp_obj=7\n"), "enabled=no", "enabled=YeS"));
    ASSERT_EQ(0u, ORLOiSCSITargetConfLoad(&all, &list)) << log_.Dump();
    ASSERT_EQ(1, list.count);
    EXPECT_TRUE(Records(&list)[0].enabled);
    EXPECT_TRUE(Records(&list)[0].bkp_obj);
    ORLOiSCSITargetListFree(&list);

    // A section missing mutual_password fails the whole load, even without authentication,
    // and the list holds nothing afterwards (also what an earlier section had added).
    WriteFile(kTargetConf, Section(1, "one") + Section(2, "two", "", "mutual_password"));
    log_.Clear();
    EXPECT_EQ(18990033u, ORLOiSCSITargetConfLoad(&all, &list));
    EXPECT_EQ(0, list.count);
    EXPECT_EQ(nullptr, ORLOiSCSIListFirst(&list));
    EXPECT_EQ(1, LinesWith("Failed to get mutual_password in /usr/orlo/etc/iscsi_target.conf, errno=0X700"))
        << log_.Dump();
    EXPECT_EQ(1, LinesWith("ORLOiSCSITargetStructCreate("));

    // A stored secret that does not decipher.
    WriteFile(kTargetConf, With(With(Section(5, "bad"), "authen=no", "authen=yes"), "\tpassword=\n",
                                "\tpassword=~AAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAA\n"));
    log_.Clear();
    EXPECT_EQ(18990705u, ORLOiSCSITargetConfLoad(&all, &list));
    EXPECT_EQ(1, LinesWith("Failed to decrypt password[0x5000 ")) << log_.Dump();
    ORLOiSCSITarget out;
    memset(&out, 0, sizeof(out));
    log_.Clear();
    EXPECT_EQ(18990724u, ORLOiSCSITargetGetByTid(5, 0, &out));
    EXPECT_EQ(2, LinesWith("err=Bad target password")) << log_.Dump();  // the build and the load
    EXPECT_EQ(18990425u, ORLOiSCSITargetGetByFilter(&all, &list));
    EXPECT_EQ(0, list.count);
}

TEST_F(TargetConfTest, FilterSelectsSections) {
    WriteFile(kTargetConf, Section(1, "alpha") + Section(2, "Alpha", "\tbkp_obj=1\n") + Section(3, "gamma") +
                               Section(4, "alpha"));
    auto load = [this](ORLOiSCSITargetFilter f) {
        ORLOiSCSITargetList list = {};
        EXPECT_EQ(0u, ORLOiSCSITargetConfLoad(&f, &list)) << log_.Dump();
        std::vector<int> tids = Tids(&list);
        ORLOiSCSITargetListFree(&list);
        return tids;
    };
    ORLOiSCSITargetFilter f = {};
    EXPECT_EQ((std::vector<int>{1, 2, 3, 4}), load(f));  // flags 0: everything
    f.flags = 0x7000;
    EXPECT_EQ((std::vector<int>{1, 3, 4}), load(f));  // load-all hides backup objects
    f.flags = 0x207000;
    EXPECT_EQ((std::vector<int>{1, 3, 4}), load(f));
    f.flags = 0x7400;
    EXPECT_EQ((std::vector<int>{1, 2, 3, 4}), load(f));
    f = {};
    f.flags = 0x1004;
    f.name = "alpha";
    EXPECT_EQ((std::vector<int>{1, 4}), load(f));  // exact, case-sensitive
    f.flags = 0x1005;
    f.tid = 4;
    EXPECT_EQ((std::vector<int>{4}), load(f));  // all criteria must hold
    f = {};
    f.flags = 0x1008;
    f.iqn = "iqn.2000-01.com.orlo-nas:t3";
    EXPECT_EQ((std::vector<int>{3}), load(f));
    const int32_t tids[] = {4, 2, 9};
    f = {};
    f.flags = 0x1100;
    f.tids = tids;
    f.tidCount = 3;
    EXPECT_EQ((std::vector<int>{2, 4}), load(f));  // file order, not list order
    f.tidCount = 0;
    EXPECT_TRUE(load(f).empty());
    f = {};
    f.flags = 0x1004;  // name wanted but none given: each section refused with a log line
    log_.Clear();
    EXPECT_TRUE(load(f).empty());
    EXPECT_EQ(4, LinesWith("Bad parameters")) << log_.Dump();
}

}  // namespace
