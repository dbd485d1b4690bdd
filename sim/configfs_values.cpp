#include "configfs_values.h"

#include <cctype>
#include <cerrno>
#include <cstdlib>

namespace orlosim {

int KStrToULL(const std::string &s, unsigned long long *out) {
    size_t i = 0, end = s.size();
    if (end > 0 && s[end - 1] == '\n') --end;
    if (i < end && s[i] == '+') ++i;
    unsigned base = 10;
    if (i + 1 < end && s[i] == '0' && (s[i + 1] == 'x' || s[i + 1] == 'X') && i + 2 < end &&
        isxdigit(static_cast<unsigned char>(s[i + 2]))) {
        base = 16;
        i += 2;
    } else if (i + 1 < end && s[i] == '0') {
        base = 8;
    }
    if (i >= end) return EINVAL;
    unsigned long long v = 0;
    bool overflow = false;
    for (; i < end; ++i) {
        int c = static_cast<unsigned char>(s[i]);
        unsigned d;
        if (isdigit(c))
            d = static_cast<unsigned>(c - '0');
        else if (isxdigit(c))
            d = static_cast<unsigned>(tolower(c) - 'a' + 10);
        else
            return EINVAL;
        if (d >= base) return EINVAL;
        if (v > (~0ULL - d) / base) overflow = true;
        v = v * base + d;
    }
    if (overflow) return ERANGE;
    *out = v;
    return 0;
}

int KStrToU32(const std::string &s, uint32_t *out) {
    unsigned long long v = 0;
    int rc = KStrToULL(s, &v);
    if (rc != 0) return rc;
    if (v > 0xFFFFFFFFULL) return ERANGE;
    *out = static_cast<uint32_t>(v);
    return 0;
}

int KStrToBool(const std::string &s, bool *out) {
    if (s.empty()) return EINVAL;
    switch (s[0]) {
        case 'y': case 'Y': case '1': *out = true; return 0;
        case 'n': case 'N': case '0': *out = false; return 0;
        case 'o': case 'O':
            if (s.size() > 1 && (s[1] == 'n' || s[1] == 'N')) { *out = true; return 0; }
            if (s.size() > 1 && (s[1] == 'f' || s[1] == 'F')) { *out = false; return 0; }
            return EINVAL;
        default: return EINVAL;
    }
}

std::string Chomp(const std::string &s) {
    if (!s.empty() && s.back() == '\n') return s.substr(0, s.size() - 1);
    return s;
}

std::string StripRight(const std::string &s) {
    size_t n = s.size();
    while (n > 0 && isspace(static_cast<unsigned char>(s[n - 1]))) --n;
    return s.substr(0, n);
}

bool IsUuid(const std::string &s) {
    if (s.size() != 36) return false;
    for (size_t i = 0; i < s.size(); ++i) {
        if (i == 8 || i == 13 || i == 18 || i == 23) {
            if (s[i] != '-') return false;
        } else if (!isxdigit(static_cast<unsigned char>(s[i]))) {
            return false;
        }
    }
    return true;
}

CheckFn U32Range(uint32_t lo, uint32_t hi) {
    return [lo, hi](const std::string &in, std::string *stored) {
        uint32_t v = 0;
        int rc = KStrToU32(in, &v);
        if (rc != 0) return rc;
        if (v < lo || v > hi) return EINVAL;
        *stored = std::to_string(v);
        return 0;
    };
}

CheckFn U32Set(std::vector<uint32_t> allowed) {
    return [allowed](const std::string &in, std::string *stored) {
        uint32_t v = 0;
        int rc = KStrToU32(in, &v);
        if (rc != 0) return rc;
        for (uint32_t a : allowed)
            if (a == v) {
                *stored = std::to_string(v);
                return 0;
            }
        return EINVAL;
    };
}

CheckFn Bool01() { return U32Range(0, 1); }

CheckFn KBool() {
    return [](const std::string &in, std::string *stored) {
        bool b = false;
        int rc = KStrToBool(in, &b);
        if (rc != 0) return rc;
        *stored = b ? "1" : "0";
        return 0;
    };
}

CheckFn Text(size_t maxLen) {
    return [maxLen](const std::string &in, std::string *stored) {
        std::string v = Chomp(in);
        if (v.size() > maxLen) return EINVAL;
        *stored = v;
        return 0;
    };
}

CheckFn Uuid() {
    return [](const std::string &in, std::string *stored) {
        std::string v = Chomp(in);
        if (!IsUuid(v)) return EINVAL;
        *stored = v;
        return 0;
    };
}

CheckFn Word(size_t maxLen) {
    return [maxLen](const std::string &in, std::string *stored) {
        std::string v = Chomp(in);
        if (v.empty() || v.size() > maxLen) return EINVAL;
        for (char c : v)
            if (!isalnum(static_cast<unsigned char>(c)) && c != '_' && c != '-') return EINVAL;
        *stored = v;
        return 0;
    };
}

// The login parameter table takes "Key=Value" with the trailing white space cut and
// values of at most 255 characters.
static int ParamValue(const std::string &in, std::string *v) {
    *v = StripRight(in);
    if (v->empty() || v->size() > 255) return EINVAL;
    return 0;
}

CheckFn ParamNumber(unsigned long lo, unsigned long hi) {
    return [lo, hi](const std::string &in, std::string *stored) {
        std::string v;
        if (ParamValue(in, &v) != 0) return EINVAL;
        for (char c : v)
            if (!isdigit(static_cast<unsigned char>(c))) return EINVAL;
        errno = 0;
        unsigned long n = strtoul(v.c_str(), nullptr, 10);
        if (errno != 0 || n < lo || n > hi) return EINVAL;
        *stored = std::to_string(n);
        return 0;
    };
}

CheckFn ParamYesNo() {
    return [](const std::string &in, std::string *stored) {
        std::string v;
        if (ParamValue(in, &v) != 0 || (v != "Yes" && v != "No")) return EINVAL;
        *stored = v;
        return 0;
    };
}

CheckFn ParamList(std::vector<std::string> allowed) {
    return [allowed](const std::string &in, std::string *stored) {
        std::string v;
        if (ParamValue(in, &v) != 0) return EINVAL;
        size_t start = 0;
        while (true) {
            size_t comma = v.find(',', start);
            std::string tok = v.substr(start, comma == std::string::npos ? std::string::npos : comma - start);
            bool ok = false;
            for (const std::string &a : allowed) ok = ok || tok == a;
            if (!ok) return EINVAL;
            if (comma == std::string::npos) break;
            start = comma + 1;
        }
        *stored = v;
        return 0;
    };
}

CheckFn ParamText(size_t maxLen) {
    return [maxLen](const std::string &in, std::string *stored) {
        std::string v;
        if (ParamValue(in, &v) != 0 || v.size() > maxLen) return EINVAL;
        *stored = v;
        return 0;
    };
}

}  // namespace orlosim
