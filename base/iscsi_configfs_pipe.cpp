// Runs a command and writes its whole output into a configfs attribute.
#include <cstdio>
#include <cstring>
#include <sstream>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"

namespace {

const size_t kPipeBufSize = 1024;  // one configfs value from a command, NUL included

// Splits a command line on blanks: the command runs without a shell.
std::vector<std::string> SplitCommand(const char *command) {
    std::vector<std::string> words;
    std::istringstream in(command);
    std::string w;
    while (in >> w) words.push_back(w);
    return words;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsPipe(const char *command, const char *path) {
    if (command == nullptr || path == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    std::vector<std::string> words = SplitCommand(command);
    std::vector<const char *> argv;
    for (const std::string &w : words) argv.push_back(w.c_str());
    argv.push_back(nullptr);
    FILE *stream = words.empty() ? nullptr : OLIBCPopenv(argv.data(), "r");
    if (stream == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_OPEN_FILE;
    }
    char text[kPipeBufSize] = "";
    size_t total = 0;
    char piece[kPipeBufSize];
    while (fgets(piece, sizeof(piece), stream) != nullptr) {
        size_t len = strlen(piece);
        if (total + len >= kPipeBufSize) {
            // Too long for one configfs value: nothing is written.
            OLIBCPclose(stream);
            ORLO_LOG_ERR("output of \"%s\" reached %zu bytes", command, kPipeBufSize);
            return ORLO_ERR_DEFAULT;
        }
        memcpy(text + total, piece, len + 1);
        total += len;
    }
    uint32_t ret = ORLOiSCSIConfigfsWrite(path, text);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"%s\") failed, err=%s", path, text, ORLOiSCSIErrStr(ret));
    if (OLIBCPclose(stream) < 0) {
        ORLO_LOG_PLATFORM("OLIBCPclose(%p)", static_cast<void *>(stream));
        if (ret == ORLO_OK) ret = ORLO_ERR_CLOSE_FILE;
    }
    return ret;
}
