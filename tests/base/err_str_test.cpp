// Result-code decoding: block boundaries, holes between blocks and errno fallbacks.
#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>
#include <string>

#include "base/iscsi_base_internal.h"

namespace {

TEST(ErrStr, BlockEdgesDecodeToTheirMessages) {
    EXPECT_STREQ("Default error code", ORLOiSCSIErrStr(18990000));
    EXPECT_STREQ("Failed to kill process", ORLOiSCSIErrStr(18990061));
    EXPECT_STREQ("No such API", ORLOiSCSIErrStr(18990200));
    EXPECT_STREQ("Not implemented yet", ORLOiSCSIErrStr(18990213));
    EXPECT_STREQ("Failed to get volume info", ORLOiSCSIErrStr(18990300));
    EXPECT_STREQ("Failed to get hardware vendor", ORLOiSCSIErrStr(18990321));
    EXPECT_STREQ("Bad EP file type", ORLOiSCSIErrStr(18990400));
    EXPECT_STREQ("Plugin abort depart task", ORLOiSCSIErrStr(18990431));
    EXPECT_STREQ("Bad LUN type", ORLOiSCSIErrStr(18990500));
    // The LUN block runs on past 18990599.
    EXPECT_STREQ("Failed to get loopback device path", ORLOiSCSIErrStr(18990600));
    EXPECT_STREQ("Bad new location", ORLOiSCSIErrStr(18990611));
    EXPECT_STREQ("Bad target name", ORLOiSCSIErrStr(18990700));
    EXPECT_STREQ("Bad target initiator_iqns", ORLOiSCSIErrStr(18990740));
    EXPECT_STREQ("Not a source task", ORLOiSCSIErrStr(18990800));
    EXPECT_STREQ("Failed to create replica LUN", ORLOiSCSIErrStr(18990888));
    EXPECT_STREQ("Bad vLUN type", ORLOiSCSIErrStr(18991000));
    EXPECT_STREQ("Failed to unload NAA", ORLOiSCSIErrStr(18991009));
    EXPECT_STREQ("Bad node UUID", ORLOiSCSIErrStr(18991100));
    EXPECT_STREQ("Bad iSCSI directory rootpath", ORLOiSCSIErrStr(18991125));
    EXPECT_STREQ("Failed to connect to target", ORLOiSCSIErrStr(18991200));
    EXPECT_STREQ("Bad lunbkp estimate size", ORLOiSCSIErrStr(18991207));
}

TEST(ErrStr, MisspellingsAreKept) {
    EXPECT_STREQ("Failed to cerate directory", ORLOiSCSIErrStr(18990028));
    EXPECT_STREQ("Invaild net family", ORLOiSCSIErrStr(18991108));
    EXPECT_STREQ("Failed to get update LUN backup task", ORLOiSCSIErrStr(18990583));
}

TEST(ErrStr, CodesOutsideEveryBlockFallBackToStrerror) {
    // Just past the end of a block, and in the gaps between blocks.
    for (unsigned int code : {18990062u, 18990214u, 18990322u, 18990432u, 18990612u, 18990741u,
                              18990889u, 18991010u, 18991126u, 18991208u, 18990100u}) {
        // strerror's text for an unknown number lives in a per-thread buffer that the next
        // call reuses: keep a copy before decoding.
        std::string expected = strerror(static_cast<int>(code));
        EXPECT_EQ(expected, ORLOiSCSIErrStr(code)) << code;
    }
}

TEST(ErrStr, ErrnoValuesPositiveAndNegated) {
    // Copies: an unknown number's text lives in a buffer the next strerror call reuses.
    const std::string noent = strerror(ENOENT), eperm = strerror(1), e255 = strerror(255);
    EXPECT_EQ(noent, ORLOiSCSIErrStr(ENOENT));
    EXPECT_EQ(noent, ORLOiSCSIErrStr(static_cast<unsigned int>(-ENOENT)));
    EXPECT_EQ(eperm, ORLOiSCSIErrStr(static_cast<unsigned int>(-1)));
    EXPECT_EQ(e255, ORLOiSCSIErrStr(static_cast<unsigned int>(-255)));
    // -256 is not a negated errno: it is passed on unchanged.
    std::string unknown = strerror(-256);
    EXPECT_EQ(unknown, ORLOiSCSIErrStr(0xFFFFFF00u));
}

}  // namespace
