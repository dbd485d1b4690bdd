// The stored-secret cipher: the longest secret that fits round-trips and one byte more is
// refused, the stored form hides the secret and is safe in a section file, a changed or
// foreign stored form is refused, the key file is root-only and shared by processes.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <set>
#include <string>

#include "olibc.h"
#include "support/sandbox.h"

namespace {

class CryptTest : public orlotest::SandboxTest {};

std::string Enc(const std::string &plain, int *ret = nullptr) {
    char out[64];
    memset(out, 'Z', sizeof(out));
    int r = OLIBCCryptSzEncrypt(plain.c_str(), out, sizeof(out));
    if (ret != nullptr) *ret = r;
    return r == 0 ? std::string(out) : std::string();
}

int Dec(const std::string &stored, std::string *plain) {
    char out[64];
    int r = OLIBCCryptSzDecrypt(stored.c_str(), out, sizeof(out));
    if (r == 0) *plain = out;
    return r;
}

TEST_F(CryptTest, LongestSecretRoundTripsAndOneMoreIsRefused) {
    const std::string longest(OLIBC_CRYPT_PLAIN_MAX, 'k');
    int ret = -1;
    std::string stored = Enc(longest, &ret);
    ASSERT_EQ(0, ret);
    EXPECT_EQ(static_cast<size_t>(OLIBC_CRYPT_STORED_MAX), stored.size());
    std::string back;
    ASSERT_EQ(0, Dec(stored, &back));
    EXPECT_EQ(longest, back);

    char out[64] = "untouched";
    EXPECT_EQ(-1, OLIBCCryptSzEncrypt((longest + "k").c_str(), out, sizeof(out)));
    EXPECT_EQ(OLIBC_ERR_TOO_LONG, OLIBCErrGet());
    // A buffer too small for the stored form is refused too, never filled with a cut form.
    char small[40];
    EXPECT_EQ(-1, OLIBCCryptSzEncrypt("abcdefghijkl", small, sizeof(small)));
    EXPECT_EQ(OLIBC_ERR_TOO_LONG, OLIBCErrGet());
    // And so is a deciphered secret that would not fit the caller's buffer.
    char tiny[4];
    EXPECT_EQ(-1, OLIBCCryptSzDecrypt(stored.c_str(), tiny, sizeof(tiny)));

    // Every length in between, punctuation included, reads back exactly.
    for (size_t n = 1; n <= OLIBC_CRYPT_PLAIN_MAX; ++n) {
        std::string s;
        for (size_t i = 0; i < n; ++i) s += static_cast<char>('!' + (i * 7) % 94);
        std::string b;
        ASSERT_EQ(0, Dec(Enc(s), &b)) << n;
        EXPECT_EQ(s, b);
    }
    // The empty secret is stored as empty.
    EXPECT_EQ("", Enc("", &ret));
    EXPECT_EQ(0, ret);
    ASSERT_EQ(0, Dec("", &back));
    EXPECT_EQ("", back);
}

TEST_F(CryptTest, StoredFormHidesSecretAndIsSectionSafe) {
    const std::string secret = "SuperSecret12";
    std::set<std::string> seen;
    for (int i = 0; i < 8; ++i) {
        std::string s = Enc(secret);
        ASSERT_FALSE(s.empty());
        EXPECT_EQ(std::string::npos, s.find(secret));
        EXPECT_EQ(std::string::npos, s.find_first_of("=[]\"\n\r \t#;"));
        seen.insert(s);
    }
    // A fresh nonce each time: the same secret never gives the same text twice.
    EXPECT_EQ(8u, seen.size());
}

TEST_F(CryptTest, TamperedOrForeignTextIsRefused) {
    std::string stored = Enc("chapsecret123");
    ASSERT_FALSE(stored.empty());
    std::string back;
    for (size_t i = 0; i < stored.size(); ++i) {
        std::string t = stored;
        t[i] = (t[i] == 'A') ? 'B' : 'A';
        EXPECT_EQ(-1, Dec(t, &back)) << "position " << i;
    }
    EXPECT_EQ(-1, Dec(stored.substr(0, stored.size() - 1), &back));
    EXPECT_EQ(-1, Dec("chapsecret123", &back));  // plain text is no stored form
    EXPECT_EQ(OLIBC_ERR_CRYPT, OLIBCErrGet());

    // Made under another appliance's key: refused.
    ASSERT_EQ(0, unlink(Real(OLIBC_CRYPT_KEY_PATH).c_str()));
    EXPECT_EQ(-1, Dec(stored, &back));
    EXPECT_EQ(OLIBC_ERR_CRYPT, OLIBCErrGet());
}

TEST_F(CryptTest, KeyFileIsRootOnlyAndSharedAcrossProcesses) {
    EXPECT_FALSE(Exists(OLIBC_CRYPT_KEY_PATH));
    std::string stored = Enc("first-use");
    ASSERT_FALSE(stored.empty());
    struct stat st;
    ASSERT_EQ(0, lstat(Real(OLIBC_CRYPT_KEY_PATH).c_str(), &st));
    EXPECT_TRUE(S_ISREG(st.st_mode));
    EXPECT_EQ(0600u, st.st_mode & 07777);
    EXPECT_EQ(32, st.st_size);
    const std::string key = ReadFile(OLIBC_CRYPT_KEY_PATH);

    // A second process enciphers with the same key: this one reads its text back.
    int fds[2];
    ASSERT_EQ(0, pipe(fds));
    pid_t pid = fork();
    ASSERT_GE(pid, 0);
    if (pid == 0) {
        close(fds[0]);
        char out[64];
        int r = OLIBCCryptSzEncrypt("from-child", out, sizeof(out));
        if (r == 0 && write(fds[1], out, strlen(out)) < 0) r = -1;
        _exit(r == 0 ? 0 : 1);
    }
    close(fds[1]);
    char buf[128] = {};
    ssize_t n = read(fds[0], buf, sizeof(buf) - 1);
    close(fds[0]);
    int status = 0;
    waitpid(pid, &status, 0);
    ASSERT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
    ASSERT_GT(n, 0);
    std::string back;
    ASSERT_EQ(0, Dec(std::string(buf, static_cast<size_t>(n)), &back));
    EXPECT_EQ("from-child", back);
    EXPECT_EQ(key, ReadFile(OLIBC_CRYPT_KEY_PATH));  // not replaced

    // A key file others may read is not used.
    ASSERT_EQ(0, chmod(Real(OLIBC_CRYPT_KEY_PATH).c_str(), 0644));
    EXPECT_EQ(-1, Dec(stored, &back));
    EXPECT_EQ(OLIBC_ERR_CRYPT, OLIBCErrGet());
    // Nor one reached through a symbolic link.
    ASSERT_EQ(0, chmod(Real(OLIBC_CRYPT_KEY_PATH).c_str(), 0600));
    ASSERT_EQ(0, rename(Real(OLIBC_CRYPT_KEY_PATH).c_str(), Real("/usr/orlo/etc/elsewhere").c_str()));
    ASSERT_EQ(0, symlink(Real("/usr/orlo/etc/elsewhere").c_str(), Real(OLIBC_CRYPT_KEY_PATH).c_str()));
    EXPECT_EQ(-1, Dec(stored, &back));
    EXPECT_EQ(-1, OLIBCCryptSzEncrypt("x", buf, 64));
}

}  // namespace
