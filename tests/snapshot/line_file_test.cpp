// The platform's line files (one entry per line), on which the snapshot application keys
// rest.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "olibc.h"
#include "support/sandbox.h"

namespace {

class LineFileTest : public orlotest::SandboxTest {};

TEST_F(LineFileTest, MatchAddRemoveAndReadLines) {
    const char *path = "/tmp/keys";
    EXPECT_EQ(0, OLIBCFileMatchLineNo(path, "a")) << "a missing file has no lines";
    EXPECT_EQ(0, OLIBCFileRemoveLine(path, "a"));
    EXPECT_FALSE(Exists(path));
    POLIBC_SZLIST lines = nullptr;
    EXPECT_EQ(0, OLIBCFileReadLines(path, &lines));
    ASSERT_NE(nullptr, lines);
    EXPECT_EQ(0, OLIBCSzListCount(lines));

    ASSERT_EQ(0, OLIBCFileAddLine(path, "alpha"));
    struct stat st;
    ASSERT_EQ(0, stat(Real(path).c_str(), &st));
    EXPECT_EQ(0644u, st.st_mode & 0777);
    WriteFile(path, ReadFile(path) + "beta\nalpha\ngamma");  // the last line without a newline
    ASSERT_EQ(0, OLIBCFileAddLine(path, ""));
    ASSERT_EQ(0, OLIBCFileAddLine(path, "delta"));
    EXPECT_EQ("alpha\nbeta\nalpha\ngamma\n\ndelta\n", ReadFile(path));
    EXPECT_EQ(1, OLIBCFileMatchLineNo(path, "alpha"));
    EXPECT_EQ(4, OLIBCFileMatchLineNo(path, "gamma"));
    EXPECT_EQ(5, OLIBCFileMatchLineNo(path, ""));
    EXPECT_EQ(0, OLIBCFileMatchLineNo(path, "alp"));
    EXPECT_EQ(0, OLIBCFileMatchLineNo(path, "alpha\n"));

    EXPECT_EQ(6, OLIBCFileReadLines(path, &lines));
    EXPECT_STREQ("alpha\n", OLIBCSzListGet(lines, 0));
    EXPECT_STREQ("\n", OLIBCSzListGet(lines, 4));
    EXPECT_EQ(6, OLIBCFileReadLines(path, &lines)) << "lines are appended to a list given";
    EXPECT_EQ(12, OLIBCSzListCount(lines));
    OLIBCSzListFree(lines);

    // Removing drops every equal line; removing nothing leaves the file (and its inode).
    EXPECT_EQ(2, OLIBCFileRemoveLine(path, "alpha"));
    EXPECT_EQ("beta\ngamma\n\ndelta\n", ReadFile(path));
    ASSERT_EQ(0, stat(Real(path).c_str(), &st));
    EXPECT_EQ(0, OLIBCFileRemoveLine(path, "zeta"));
    struct stat after;
    ASSERT_EQ(0, stat(Real(path).c_str(), &after));
    EXPECT_EQ(st.st_ino, after.st_ino);

    // Refused before the file is touched.
    const std::string longest(OLIBC_FILE_LINE_MAX - 1, 'x');
    EXPECT_EQ(0, OLIBCFileAddLine(path, longest.c_str()));
    const std::string tooLong(OLIBC_FILE_LINE_MAX, 'x');
    const std::string before = ReadFile(path);
    EXPECT_GT(0, OLIBCFileAddLine(path, tooLong.c_str()));
    EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
    EXPECT_GT(0, OLIBCFileAddLine(path, "two\nlines"));
    EXPECT_GT(0, OLIBCFileAddLine(path, "cr\r"));
    EXPECT_GT(0, OLIBCFileMatchLineNo(nullptr, "x"));
    EXPECT_EQ(before, ReadFile(path));

    // Writers refuse a symbolic link at the path; readers follow it.
    ASSERT_EQ(0, symlink(Real(path).c_str(), Real("/tmp/link").c_str()));
    EXPECT_GT(0, OLIBCFileAddLine("/tmp/link", "y"));
    EXPECT_EQ(OLIBC_ERR_FOPEN, OLIBCErrGet());
    EXPECT_GT(0, OLIBCFileRemoveLine("/tmp/link", "beta"));
    EXPECT_EQ(1, OLIBCFileMatchLineNo("/tmp/link", "beta"));
    EXPECT_EQ(before, ReadFile(path));
}

}  // namespace
