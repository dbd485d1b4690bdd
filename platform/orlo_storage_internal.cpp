// Error recording and path splitting shared by the storage platform library.
#include "platform/orlo_storage_internal.h"

#include <cerrno>
#include <cstring>

#include "olibc.h"

namespace orlo {
namespace storage {

void SetErrFromErrno(int err, int fallbackCode, const char *file, int line) {
    int code;
    switch (err) {
        case ENOENT:
            code = OLIBC_ERR_NOT_FOUND;
            break;
        case ENOSPC:
        case EDQUOT:
            code = OLIBC_ERR_NO_SPACE;
            break;
        case ENAMETOOLONG:
            code = OLIBC_ERR_TOO_LONG;
            break;
        case ENOMEM:
            code = OLIBC_ERR_OUT_OF_MEM;
            break;
        case EACCES:
        case EPERM:
            code = OLIBC_ERR_ACCESS;
            break;
        default:
            code = fallbackCode;
            break;
    }
    OLIBCErrSetEx(code, file, line);
    errno = err;
}

bool SplitPath(const char *path, std::string *parent, std::string *name) {
    if (path == nullptr) {
        errno = EINVAL;
        return false;
    }
    std::string p(path);
    while (p.size() > 1 && p.back() == '/') p.pop_back();
    size_t slash = p.rfind('/');
    std::string last = slash == std::string::npos ? p : p.substr(slash + 1);
    if (last.empty() || last == "." || last == "..") {
        errno = EINVAL;
        return false;
    }
    if (slash == std::string::npos) {
        *parent = ".";
    } else if (slash == 0) {
        *parent = "/";
    } else {
        *parent = p.substr(0, slash);
    }
    *name = last;
    return true;
}

}  // namespace storage
}  // namespace orlo
