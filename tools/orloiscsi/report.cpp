// What the tool tells a person: the error line with the library's reasons, JSON
// documents, and the words and numbers every object family prints alike.
#include <syslog.h>

#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "base/orlo_log.h"
#include "cli.h"

namespace cli {

namespace {

struct LogLine {
    int priority;
    std::string text;
};

// The library's log lines of this run not yet shown.  The library may log from more
// than one thread (lun create grows the file on a worker thread).
std::mutex gLogMu;
std::vector<LogLine> gLog;

void CaptureLine(int priority, const char *line, void *) {
    // Syslog keeps getting every line, as without the tool's sink.
    syslog(priority, "%s", line);
    std::lock_guard<std::mutex> lock(gLogMu);
    gLog.push_back({priority, line});
}

const char *LevelWord(int priority) {
    switch (priority) {
        case LOG_EMERG: return "emerg";
        case LOG_ALERT: return "alert";
        case LOG_CRIT: return "crit";
        case LOG_ERR: return "err";
        case LOG_WARNING: return "warning";
        case LOG_NOTICE: return "notice";
        case LOG_INFO: return "info";
        default: return "debug";
    }
}

// Prints the collected lines a person asked for and forgets them all.
void FlushLog(bool onFailure) {
    std::vector<LogLine> lines;
    {
        std::lock_guard<std::mutex> lock(gLogMu);
        lines.swap(gLog);
    }
    const Context &ctx = Ctx();
    if (ctx.quiet || (!onFailure && !ctx.verbose)) return;
    for (const LogLine &l : lines) {
        if (!ctx.verbose && l.priority > LOG_WARNING) continue;
        fprintf(stderr, "  %s: %s\n", LevelWord(l.priority), l.text.c_str());
    }
}

}  // namespace

void StartLogCapture() { OrloLogSetSink(CaptureLine, nullptr); }

int Fail(uint32_t code) {
    fprintf(stderr, "error: %" PRIu32 " %s\n", code, ORLOiSCSIErrStr(code));
    FlushLog(true);
    return kExitFailure;
}

void ShowRemainingLogLines() { FlushLog(false); }

// ---- JSON ----

Json Json::Object() { return Json(json_object_new_object()); }
Json Json::Array() { return Json(json_object_new_array()); }
Json Json::Str(const std::string &s) { return Json(json_object_new_string_len(s.data(), static_cast<int>(s.size()))); }
Json Json::Int(int64_t v) { return Json(json_object_new_int64(v)); }
Json Json::Uint(uint64_t v) { return Json(json_object_new_uint64(v)); }
Json Json::Bool(bool v) { return Json(json_object_new_boolean(v ? 1 : 0)); }
Json Json::Null() { return Json(nullptr); }

Json &Json::operator=(Json &&other) noexcept {
    if (this != &other) {
        json_object_put(obj_);
        obj_ = other.obj_;
        other.obj_ = nullptr;
    }
    return *this;
}

Json::~Json() { json_object_put(obj_); }

Json &Json::Set(const char *key, Json value) & {
    json_object_object_add(obj_, key, value.obj_);
    value.obj_ = nullptr;
    return *this;
}

Json &Json::Push(Json value) & {
    json_object_array_add(obj_, value.obj_);
    value.obj_ = nullptr;
    return *this;
}

std::string Json::Text() const {
    // One line, no blanks, "/" unescaped: the output stays byte for byte the same.
    return json_object_to_json_string_ext(obj_, JSON_C_TO_STRING_PLAIN | JSON_C_TO_STRING_NOSLASHESCAPE);
}

void PrintJson(const Json &doc) { printf("%s\n", doc.Text().c_str()); }

// ---- Numbers and words ----

bool ParseNumber(const std::string &s, long min, long max, long *out) {
    if (s.empty() || !(s[0] == '-' || (s[0] >= '0' && s[0] <= '9'))) return false;
    errno = 0;
    char *end = nullptr;
    long v = strtol(s.c_str(), &end, 10);
    if (errno != 0 || *end != '\0' || v < min || v > max) return false;
    *out = v;
    return true;
}

bool ParseCode(const std::string &s, uint32_t *out) {
    if (s.empty()) return false;
    errno = 0;
    char *end = nullptr;
    long long v = strtoll(s.c_str(), &end, 0);
    if (errno != 0 || end == s.c_str() || *end != '\0') return false;
    if (v < -2147483648LL || v > 4294967295LL) return false;
    *out = static_cast<uint32_t>(v);
    return true;
}

bool AllDigits(const std::string &s) {
    if (s.empty()) return false;
    for (char c : s)
        if (c < '0' || c > '9') return false;
    return true;
}

std::string HumanSize(uint64_t bytes) {
    static const char *const kUnits[] = {"B", "KiB", "MiB", "GiB", "TiB", "PiB"};
    double v = static_cast<double>(bytes);
    int u = 0;
    while (v >= 1024.0 && u < 5) {
        v /= 1024.0;
        ++u;
    }
    char buf[32];
    snprintf(buf, sizeof(buf), u == 0 ? "%.0f %s" : "%.1f %s", v, kUnits[u]);
    return buf;
}

const char *KernelState(int word) {
    if (word & ORLO_ISCSI_TARGET_STATUS_ENABLED) return "running";
    if (word & ORLO_ISCSI_TARGET_STATUS_PRESENT) return "present";
    return "absent";
}

const char *AuthName(int32_t a) {
    return a == ORLO_ISCSI_AUTH_CHAP ? "CHAP" : a == ORLO_ISCSI_AUTH_MUTUAL_CHAP ? "mutual CHAP" : "none";
}

const char *AuthKey(int32_t a) {
    return a == ORLO_ISCSI_AUTH_CHAP ? "chap" : a == ORLO_ISCSI_AUTH_MUTUAL_CHAP ? "mutual_chap" : "none";
}

const char *ConnectionName(char c) {
    switch (c) {
        case ORLO_ISCSI_TARGET_CONN_NONE: return "no sessions";
        case ORLO_ISCSI_TARGET_CONN_ACTIVE: return "active";
        case ORLO_ISCSI_TARGET_CONN_DOWN: return "not running";
        default: return "unknown";
    }
}

const char *PermissionWord(int32_t authority) {
    switch (authority) {
        case ISCSI_TARGET_AUTHORITY_NONE: return "none";
        case ISCSI_TARGET_AUTHORITY_RO: return "read-only";
        case ISCSI_TARGET_AUTHORITY_LEGACY_RW:
        case ISCSI_TARGET_AUTHORITY_RW: return "read-write";
        default: return "unknown";
    }
}

std::vector<std::string> SplitPortals(const char *list) {
    std::vector<std::string> out;
    std::string cur;
    for (const char *p = list; *p != '\0'; ++p) {
        if (*p == ',') {
            if (!cur.empty()) out.push_back(cur);
            cur.clear();
        } else {
            cur += *p;
        }
    }
    if (!cur.empty()) out.push_back(cur);
    return out;
}

}  // namespace cli
