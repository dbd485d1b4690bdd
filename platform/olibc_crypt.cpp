// The cipher for stored secrets: AES-256-GCM under a per-appliance key kept in a
// root-only file.
//
// The key is read from its file at every call rather than cached: calls are rare (a
// target's section being written or read), and the sandbox root may change between calls.
// A key file that is not a regular 32-byte file, or that anyone but its owner may read or
// write, is refused rather than used: a secret enciphered under a key others can read is
// no secret.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <openssl/evp.h>
#include <openssl/rand.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <string>

#include "olibc.h"
#include "platform/os_seam.h"

namespace {

constexpr size_t kKeyLen = 32;
constexpr size_t kNonceLen = 12;
constexpr size_t kTagLen = 16;
constexpr char kVersion = '~';  // stored form, version 1
constexpr int kKeyLockTimeoutSec = 60;
constexpr size_t kRawMax = kNonceLen + OLIBC_CRYPT_PLAIN_MAX + kTagLen;

const char kB64[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_";

// Wipes a buffer that held key or secret material on the way out of scope.
template <size_t N>
struct Wiped {
    unsigned char b[N] = {};
    ~Wiped() { OPENSSL_cleanse(b, N); }
};

size_t EncodedLen(size_t raw) { return (raw * 4 + 2) / 3; }

void Encode(const unsigned char *in, size_t n, char *out) {
    size_t o = 0;
    uint32_t acc = 0;
    int bits = 0;
    for (size_t i = 0; i < n; ++i) {
        acc = (acc << 8) | in[i];
        bits += 8;
        while (bits >= 6) {
            bits -= 6;
            out[o++] = kB64[(acc >> bits) & 0x3F];
        }
    }
    if (bits > 0) out[o++] = kB64[(acc << (6 - bits)) & 0x3F];
    out[o] = '\0';
}

// Decodes unpadded base64url; -1 for a character outside the alphabet, a length no
// encoder makes, or unused bits that are not zero (so every stored form has one spelling).
int Decode(const char *in, size_t len, unsigned char *out, size_t outSize) {
    if (len % 4 == 1) return -1;
    size_t o = 0;
    uint32_t acc = 0;
    int bits = 0;
    for (size_t i = 0; i < len; ++i) {
        const char *p = static_cast<const char *>(memchr(kB64, in[i], 64));
        if (p == nullptr || in[i] == '\0') return -1;
        acc = (acc << 6) | static_cast<uint32_t>(p - kB64);
        bits += 6;
        if (bits >= 8) {
            bits -= 8;
            if (o >= outSize) return -1;
            out[o++] = static_cast<unsigned char>((acc >> bits) & 0xFF);
        }
    }
    if ((acc & ((1u << bits) - 1)) != 0) return -1;
    return static_cast<int>(o);
}

int Fail(int code) {
    OLIBCErrSet(code);
    return -1;
}

// Reads the key from an open descriptor after checking what it is.  0, or -1 with the
// error state set.
int ReadKey(int fd, unsigned char *key) {
    struct stat st;
    if (fstat(fd, &st) != 0) return Fail(OLIBC_ERR_CRYPT);
    if (!S_ISREG(st.st_mode) || st.st_size != static_cast<off_t>(kKeyLen) || (st.st_mode & 077) != 0 ||
        st.st_uid != geteuid())
        return Fail(OLIBC_ERR_CRYPT);
    size_t got = 0;
    while (got < kKeyLen) {
        ssize_t n = read(fd, key + got, kKeyLen - got);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return Fail(OLIBC_ERR_IO);
        got += static_cast<size_t>(n);
    }
    return 0;
}

// Opens and reads an existing key file: 1 read, 0 absent, -1 failed.
int LoadKey(unsigned char *key) {
    int fd = orlo::os::Open(OLIBC_CRYPT_KEY_PATH, O_RDONLY | O_NOFOLLOW | O_CLOEXEC | O_NOCTTY);
    if (fd < 0) {
        if (errno == ENOENT) return 0;
        return Fail(OLIBC_ERR_FOPEN);
    }
    int ret = ReadKey(fd, key);
    close(fd);
    return ret == 0 ? 1 : -1;
}

// Makes a new key file: a 0600 temporary file beside it, written, synced and renamed into
// place, so a reader sees either no key or the whole key.  The caller holds the key lock.
int CreateKey(unsigned char *key) {
    if (RAND_bytes(key, static_cast<int>(kKeyLen)) != 1) return Fail(OLIBC_ERR_CRYPT);
    std::string tmp = std::string(OLIBC_CRYPT_KEY_PATH) + ".XXXXXX";
    int fd = orlo::os::Mkstemp(&tmp[0]);
    if (fd < 0) return Fail(OLIBC_ERR_FOPEN);
    bool ok = fchmod(fd, 0600) == 0;
    size_t put = 0;
    while (ok && put < kKeyLen) {
        ssize_t n = write(fd, key + put, kKeyLen - put);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) ok = false;
        else put += static_cast<size_t>(n);
    }
    if (ok && fsync(fd) != 0) ok = false;
    if (close(fd) != 0) ok = false;
    if (ok && orlo::os::Rename(tmp.c_str(), OLIBC_CRYPT_KEY_PATH) != 0) ok = false;
    if (!ok) {
        orlo::os::Unlink(tmp.c_str());
        return Fail(OLIBC_ERR_IO);
    }
    return 0;
}

// The appliance key, made on first use.  0, or -1 with the error state set.
int GetKey(unsigned char *key) {
    int got = LoadKey(key);
    if (got != 0) return got > 0 ? 0 : -1;
    int handle = -1;
    if (OLIBCFileLockTimeByFile(OLIBC_CRYPT_KEY_LOCK_PATH, 1, kKeyLockTimeoutSec, &handle) != 1)
        return Fail(OLIBC_ERR_CRYPT);
    // Another process may have made it while this one waited for the lock.
    got = LoadKey(key);
    int ret = got > 0 ? 0 : (got < 0 ? -1 : CreateKey(key));
    OLIBCFileUnlockByFile(handle);
    return ret;
}

struct CtxGuard {
    EVP_CIPHER_CTX *ctx = EVP_CIPHER_CTX_new();
    ~CtxGuard() { EVP_CIPHER_CTX_free(ctx); }
};

// The version character is authenticated along with the secret.
const unsigned char kAad[1] = {static_cast<unsigned char>(kVersion)};

}  // namespace

extern "C" {

ORLO_EXPORT int OLIBCCryptSzEncrypt(const char *plain, char *out, size_t outSize) {
    if (plain == nullptr || out == nullptr || outSize < 1) return Fail(OLIBC_ERR_BAD_PARAM);
    size_t n = strlen(plain);
    if (n == 0) {
        out[0] = '\0';
        return 0;
    }
    if (n > OLIBC_CRYPT_PLAIN_MAX || 1 + EncodedLen(kNonceLen + n + kTagLen) + 1 > outSize)
        return Fail(OLIBC_ERR_TOO_LONG);

    Wiped<kKeyLen> key;
    if (GetKey(key.b) != 0) return -1;
    unsigned char raw[kRawMax];
    unsigned char *nonce = raw;
    unsigned char *ct = raw + kNonceLen;
    unsigned char *tag = ct + n;
    if (RAND_bytes(nonce, static_cast<int>(kNonceLen)) != 1) return Fail(OLIBC_ERR_CRYPT);

    CtxGuard c;
    int len = 0;
    int fin = 0;
    if (c.ctx == nullptr || EVP_EncryptInit_ex(c.ctx, EVP_aes_256_gcm(), nullptr, nullptr, nullptr) != 1 ||
        EVP_CIPHER_CTX_ctrl(c.ctx, EVP_CTRL_GCM_SET_IVLEN, static_cast<int>(kNonceLen), nullptr) != 1 ||
        EVP_EncryptInit_ex(c.ctx, nullptr, nullptr, key.b, nonce) != 1 ||
        EVP_EncryptUpdate(c.ctx, nullptr, &len, kAad, sizeof(kAad)) != 1 ||
        EVP_EncryptUpdate(c.ctx, ct, &len, reinterpret_cast<const unsigned char *>(plain), static_cast<int>(n)) != 1 ||
        EVP_EncryptFinal_ex(c.ctx, ct + len, &fin) != 1 || static_cast<size_t>(len + fin) != n ||
        EVP_CIPHER_CTX_ctrl(c.ctx, EVP_CTRL_GCM_GET_TAG, static_cast<int>(kTagLen), tag) != 1)
        return Fail(OLIBC_ERR_CRYPT);

    out[0] = kVersion;
    Encode(raw, kNonceLen + n + kTagLen, out + 1);
    return 0;
}

ORLO_EXPORT int OLIBCCryptSzDecrypt(const char *stored, char *out, size_t outSize) {
    if (stored == nullptr || out == nullptr || outSize < 1) return Fail(OLIBC_ERR_BAD_PARAM);
    size_t len = strnlen(stored, OLIBC_CRYPT_STORED_MAX + 1);
    if (len == 0) {
        out[0] = '\0';
        return 0;
    }
    if (len > OLIBC_CRYPT_STORED_MAX || stored[0] != kVersion) return Fail(OLIBC_ERR_CRYPT);
    unsigned char raw[kRawMax];
    int rawLen = Decode(stored + 1, len - 1, raw, sizeof(raw));
    if (rawLen < 0 || static_cast<size_t>(rawLen) <= kNonceLen + kTagLen) return Fail(OLIBC_ERR_CRYPT);
    size_t n = static_cast<size_t>(rawLen) - kNonceLen - kTagLen;
    if (n + 1 > outSize) return Fail(OLIBC_ERR_TOO_LONG);

    Wiped<kKeyLen> key;
    if (GetKey(key.b) != 0) return -1;
    Wiped<OLIBC_CRYPT_PLAIN_MAX + 1> plain;
    unsigned char *nonce = raw;
    unsigned char *ct = raw + kNonceLen;
    unsigned char *tag = ct + n;
    CtxGuard c;
    int l = 0;
    int fin = 0;
    if (c.ctx == nullptr || EVP_DecryptInit_ex(c.ctx, EVP_aes_256_gcm(), nullptr, nullptr, nullptr) != 1 ||
        EVP_CIPHER_CTX_ctrl(c.ctx, EVP_CTRL_GCM_SET_IVLEN, static_cast<int>(kNonceLen), nullptr) != 1 ||
        EVP_DecryptInit_ex(c.ctx, nullptr, nullptr, key.b, nonce) != 1 ||
        EVP_DecryptUpdate(c.ctx, nullptr, &l, kAad, sizeof(kAad)) != 1 ||
        EVP_DecryptUpdate(c.ctx, plain.b, &l, ct, static_cast<int>(n)) != 1 ||
        EVP_CIPHER_CTX_ctrl(c.ctx, EVP_CTRL_GCM_SET_TAG, static_cast<int>(kTagLen), tag) != 1 ||
        EVP_DecryptFinal_ex(c.ctx, plain.b + l, &fin) != 1 || static_cast<size_t>(l + fin) != n)
        return Fail(OLIBC_ERR_CRYPT);
    // A secret with a NUL inside would read back cut: no encoder makes one.
    if (memchr(plain.b, '\0', n) != nullptr) return Fail(OLIBC_ERR_CRYPT);
    memcpy(out, plain.b, n);
    out[n] = '\0';
    return 0;
}

}  // extern "C"
