// orloiscsi target: create, list, show, update, enable, disable and remove iSCSI targets,
// and ask the kernel target how they are doing (status, sessions).
//
// CHAP secrets never come from the command line: they are read from a file's first line
// (--secret-file FILE, "-" for standard input) or asked for on the terminal with echo
// off, and they are never printed.  The buffers that held them are wiped before exit.
#include <arpa/inet.h>
#include <strings.h>
#include <sys/stat.h>
#include <termios.h>
#include <unistd.h>

#include <cctype>
#include <csignal>
#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <map>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "cli.h"
#include "olibc.h"
#include "orloiscsi_base.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"

namespace cli {

namespace {

// Result codes this file reports itself (their messages come from the library's table).
const uint32_t kErrBadTargetName = 18990700;
const uint32_t kErrBadTargetIqn = 18990701;
const uint32_t kErrBadTargetPassword = 18990705;
const uint32_t kErrBadTargetMutualPassword = 18990707;
const uint32_t kErrBadTargetId = 18990710;

// What a new target gets unless told otherwise.
const int32_t kDefaultSegBytes = 262144;
const int32_t kDefaultMaxSessions = 1;
// Generated IQNs: the maker's naming authority, then host and target name.
const char kIqnPrefix[] = "iqn.2000-01.com.orlo-nas:";

// ---- Secrets ----

// A secret in a fixed buffer that is wiped when it goes out of scope.
struct Secret {
    char text[ORLO_ISCSI_TARGET_CHAP_SIZE] = "";
    ~Secret() { explicit_bzero(text, sizeof(text)); }
};

void StripLineEnd(char *s) {
    size_t n = strlen(s);
    while (n > 0 && (s[n - 1] == '\n' || s[n - 1] == '\r')) s[--n] = '\0';
}

// Reads one line into buf (size bytes); false when nothing could be read or the line
// does not fit (a cut secret would silently differ from the one the initiator uses).
bool ReadLine(FILE *in, char *buf, size_t size, bool *tooLong) {
    *tooLong = false;
    if (fgets(buf, static_cast<int>(size), in) == nullptr) return false;
    size_t n = strlen(buf);
    if (n == size - 1 && buf[n - 1] != '\n' && !feof(in)) {
        *tooLong = true;
        int c;
        while ((c = fgetc(in)) != EOF && c != '\n') {
        }
    }
    StripLineEnd(buf);
    return true;
}

// The terminal settings while echo is off, so that an interrupt gives the terminal back
// as it was.
struct termios gSavedTerminal;

void RestoreTerminalAndDie(int sig) {
    tcsetattr(STDIN_FILENO, TCSAFLUSH, &gSavedTerminal);
    signal(sig, SIG_DFL);
    raise(sig);
}

// Asks for a secret on the terminal twice, with echo off.  0, or the exit status after
// saying why.
int PromptSecret(const char *what, const char *user, Secret *out) {
    if (!isatty(STDIN_FILENO)) {
        fprintf(stderr,
                "orloiscsi: no terminal to ask for the %s of '%s'; give it in a file with %s FILE "
                "(\"-\" reads standard input)\n",
                what, user, strcmp(what, "CHAP secret") == 0 ? "--secret-file" : "--mutual-secret-file");
        return 2;
    }
    struct termios saved;
    bool restore = tcgetattr(STDIN_FILENO, &saved) == 0;
    if (restore) {
        gSavedTerminal = saved;
        signal(SIGINT, RestoreTerminalAndDie);
        signal(SIGTERM, RestoreTerminalAndDie);
        signal(SIGHUP, RestoreTerminalAndDie);
        struct termios quiet = saved;
        quiet.c_lflag &= ~static_cast<tcflag_t>(ECHO);
        quiet.c_lflag |= ECHONL;
        tcsetattr(STDIN_FILENO, TCSAFLUSH, &quiet);
    }
    Secret again;
    bool tooLong = false, tooLong2 = false;
    fprintf(stderr, "%s for '%s': ", what, user);
    fflush(stderr);
    bool ok = ReadLine(stdin, out->text, sizeof(out->text), &tooLong);
    if (ok) {
        fprintf(stderr, "again: ");
        fflush(stderr);
        ok = ReadLine(stdin, again.text, sizeof(again.text), &tooLong2);
    }
    if (restore) {
        tcsetattr(STDIN_FILENO, TCSAFLUSH, &saved);
        signal(SIGINT, SIG_DFL);
        signal(SIGTERM, SIG_DFL);
        signal(SIGHUP, SIG_DFL);
    }
    if (!ok) {
        fprintf(stderr, "orloiscsi: no %s given\n", what);
        return 2;
    }
    if (tooLong || tooLong2) {
        fprintf(stderr, "orloiscsi: the %s is longer than %d bytes\n", what, OLIBC_CRYPT_PLAIN_MAX);
        return 2;
    }
    if (strcmp(out->text, again.text) != 0) {
        fprintf(stderr, "orloiscsi: the two %ss differ\n", what);
        return 2;
    }
    return 0;
}

// Reads a secret from the first line of file ("-": standard input).  A relative path is
// taken from the working directory, an absolute one inside the appliance tree (--root).
int ReadSecretFile(const std::string &file, const char *what, Secret *out) {
    FILE *in = stdin;
    if (file != "-") {
        struct stat st;
        if (orlo::os::Stat(file.c_str(), &st) == 0 && (st.st_mode & (S_IRGRP | S_IROTH)) != 0)
            fprintf(stderr, "orloiscsi: warning: %s can be read by other users\n", file.c_str());
        in = orlo::os::Fopen(file.c_str(), "r");
        if (in == nullptr) {
            fprintf(stderr, "orloiscsi: cannot read the %s from %s: %s\n", what, file.c_str(), strerror(errno));
            return 2;
        }
    }
    bool tooLong = false;
    bool ok = ReadLine(in, out->text, sizeof(out->text), &tooLong);
    if (in != stdin) fclose(in);
    if (!ok) {
        fprintf(stderr, "orloiscsi: %s holds no %s\n", file == "-" ? "standard input" : file.c_str(), what);
        return 2;
    }
    if (tooLong) {
        fprintf(stderr, "orloiscsi: the %s in %s is longer than %d bytes\n", what, file.c_str(),
                OLIBC_CRYPT_PLAIN_MAX);
        return 2;
    }
    return 0;
}

// Fills field (a record's secret) from file or the terminal and checks what the file
// format can hold.  0 or the exit status.
int GetSecret(const std::string &file, bool mutual, const char *user, char *field) {
    const char *what = mutual ? "mutual CHAP secret" : "CHAP secret";
    Secret s;
    int rc = file.empty() ? PromptSecret(what, user, &s) : ReadSecretFile(file, what, &s);
    if (rc != 0) return rc;
    if (s.text[0] == '\0') {
        fprintf(stderr, "orloiscsi: the %s is empty\n", what);
        return 2;
    }
    if (strlen(s.text) > OLIBC_CRYPT_PLAIN_MAX) {
        fprintf(stderr, "orloiscsi: the %s is longer than %d bytes, the most the target file keeps\n", what,
                OLIBC_CRYPT_PLAIN_MAX);
        return Fail(mutual ? kErrBadTargetMutualPassword : kErrBadTargetPassword);
    }
    snprintf(field, ORLO_ISCSI_TARGET_CHAP_SIZE, "%s", s.text);
    return 0;
}

// ---- Names, IQNs, portals ----

// Lower-case letters, digits, '.' and '-' as they are; anything else becomes '-'.
std::string IqnWord(const std::string &s) {
    std::string o;
    for (unsigned char c : s) {
        char l = static_cast<char>(tolower(c));
        o += (isalnum(static_cast<unsigned char>(l)) && c < 0x80) || l == '.' || l == '-' ? l : '-';
    }
    return o;
}

// Number of targets (backup objects too) whose IQN is iqn, or -1.
int IqnUseCount(const std::string &iqn, int32_t exceptTid) {
    ORLOiSCSITargetFilter f = {};
    f.flags = ORLO_ISCSI_TARGET_FILTER_KIND | ORLO_ISCSI_TARGET_FILTER_IQN | ORLO_ISCSI_TARGET_FILTER_BKP;
    f.iqn = iqn.c_str();
    ORLOiSCSITargetList list;
    ORLOiSCSIListInit(&list);
    if (ORLOiSCSITargetConfLoad(&f, &list) != ORLO_OK) return -1;
    int n = 0;
    ORLOiSCSIListLink *link;
    ORLOiSCSITarget *t = nullptr;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&list, link, t) {
        if (t->tid != exceptTid) ++n;
    }
    ORLOiSCSITargetListFree(&list);
    return n;
}

// "iqn.2000-01.com.orlo-nas:<host>.<name>", with "-2", "-3", ... when taken.
uint32_t GenerateIqn(const std::string &name, std::string *iqn) {
    char host[256] = "";
    if (gethostname(host, sizeof(host) - 1) != 0 || host[0] == '\0') snprintf(host, sizeof(host), "%s", "nas");
    std::string base = kIqnPrefix + IqnWord(host) + "." + IqnWord(name);
    const size_t room = ORLO_ISCSI_ISCSI_NAME_MAX - 5;  // leaves space for "-NNNN"
    if (base.size() > room) base.resize(room);
    for (int k = 1; k < 10000; ++k) {
        std::string candidate = k == 1 ? base : base + "-" + std::to_string(k);
        int used = IqnUseCount(candidate, 0);
        if (used < 0) return 18990724;  // Failed to load target config
        if (used == 0) {
            *iqn = candidate;
            return ORLO_OK;
        }
    }
    return kErrBadTargetIqn;
}

// "a.b.c.d:port" or "[v6]:port", checked and written back in the form the target file
// keeps.  False after saying why.
bool ParsePortal(const std::string &s, std::string *out) {
    std::string addr, port;
    bool v6 = !s.empty() && s[0] == '[';
    if (v6) {
        size_t close = s.find(']');
        if (close == std::string::npos || close + 1 >= s.size() || s[close + 1] != ':') {
            fprintf(stderr, "orloiscsi: portal '%s' is not [IPV6-ADDRESS]:PORT\n", s.c_str());
            return false;
        }
        addr = s.substr(1, close - 1);
        port = s.substr(close + 2);
    } else {
        size_t colon = s.rfind(':');
        if (colon == std::string::npos) {
            fprintf(stderr, "orloiscsi: portal '%s' has no port (ADDRESS:PORT)\n", s.c_str());
            return false;
        }
        addr = s.substr(0, colon);
        port = s.substr(colon + 1);
        if (addr.find(':') != std::string::npos) {
            fprintf(stderr, "orloiscsi: portal '%s': an IPv6 address goes in brackets, [ADDRESS]:PORT\n", s.c_str());
            return false;
        }
    }
    unsigned char bin[16];
    if (inet_pton(v6 ? AF_INET6 : AF_INET, addr.c_str(), bin) != 1) {
        fprintf(stderr, "orloiscsi: portal '%s': '%s' is not an IPv%d address\n", s.c_str(), addr.c_str(),
                v6 ? 6 : 4);
        return false;
    }
    long p = 0;
    if (!AllDigits(port) || !ParseNumber(port, 1, 65535, &p)) {
        fprintf(stderr, "orloiscsi: portal '%s': the port must be a number from 1 to 65535\n", s.c_str());
        return false;
    }
    *out = (v6 ? "[" + addr + "]" : addr) + ":" + std::to_string(p);
    return true;
}

// ---- Options shared by create and update ----

// The options of create or update as given: values by option name, and which were given.
struct TargetOptions {
    std::string target;  // TARGET (update), NAME (create)
    std::map<std::string, std::string> values;
    std::map<std::string, bool> switches;
    std::vector<std::string> portals;
    std::vector<CLI::Option *> options;

    bool Has(const std::string &name) const {
        for (const CLI::Option *o : options)
            if (o->check_name(name)) return o->count() > 0;
        return false;
    }
    std::string Last(const std::string &name) const {
        auto it = values.find(name);
        return it == values.end() ? std::string() : it->second;
    }
    const std::vector<std::string> &All(const std::string &) const { return portals; }
    bool AnyGiven() const {
        for (const CLI::Option *o : options)
            if (o->count() > 0) return true;
        return false;
    }
};

int Conflict(const TargetOptions &o, const char *a, const char *b) {
    if (o.Has(a) && o.Has(b)) return UsageError(std::string(a) + " and " + b + " contradict each other");
    return 0;
}

bool CopyField(const std::string &value, char *field, size_t size, const char *what) {
    if (value.size() >= size) {
        fprintf(stderr, "orloiscsi: the %s is longer than %zu bytes\n", what, size - 1);
        return false;
    }
    memcpy(field, value.c_str(), value.size() + 1);
    return true;
}

// Applies the options of create/update to t (a new record or the stored one).  0, or the
// exit status after saying why.
int ApplyOptions(const TargetOptions &o, const std::string *newName, ORLOiSCSITarget *t) {
    const char *const kPairs[][2] = {{"--chap", "--no-chap"},           {"--mutual-chap", "--no-mutual-chap"},
                                     {"--mutual-chap", "--no-chap"},    {"--portal", "--no-portals"},
                                     {"--header-digest", "--no-header-digest"},
                                     {"--data-digest", "--no-data-digest"}, {"--enabled", "--disabled"}};
    for (const auto &pair : kPairs) {
        int rc = Conflict(o, pair[0], pair[1]);
        if (rc != 0) return rc;
    }
    if (newName != nullptr) {
        const std::string &name = *newName;
        if (AllDigits(name)) {
            fprintf(stderr, "orloiscsi: a target name of digits only would be taken for a tid\n");
            return Fail(kErrBadTargetName);
        }
        if (name != t->name) {
            int used = ORLOiSCSITargetIsNameUsed(name.c_str());
            if (used < 0) return Fail(18990724);  // Failed to load target config
            if (used > 0) {
                fprintf(stderr, "orloiscsi: a target named '%s' exists already\n", name.c_str());
                return Fail(kErrBadTargetName);
            }
        }
        if (!CopyField(name, t->name, sizeof(t->name), "target name")) return Fail(kErrBadTargetName);
    }
    if (o.Has("--iqn")) {
        std::string iqn = o.Last("--iqn");
        if (!ORLOiSCSIIsValidIscsiName(iqn.c_str())) {
            fprintf(stderr,
                    "orloiscsi: '%s' is not an iSCSI name (iqn.YYYY-MM.reversed.domain[:id] in lower case, "
                    "eui. and 16 hex digits, or naa. and 16 or 32 hex digits)\n",
                    iqn.c_str());
            return Fail(kErrBadTargetIqn);
        }
        int used = IqnUseCount(iqn, t->tid);
        if (used < 0) return Fail(18990724);
        if (used > 0) {
            fprintf(stderr, "orloiscsi: another target has the IQN '%s' already\n", iqn.c_str());
            return Fail(kErrBadTargetIqn);
        }
        snprintf(t->iqn, sizeof(t->iqn), "%s", iqn.c_str());
    }

    // Authentication.  The user names come from the options, the secrets from files or
    // the terminal.
    if (o.Has("--no-chap")) {
        if (o.Has("--secret-file") || o.Has("--mutual-secret-file")) {
            fprintf(stderr, "orloiscsi: --no-chap takes no secret\n");
            return 2;
        }
        t->auth_type = ORLO_ISCSI_AUTH_NONE;
        explicit_bzero(t->user, sizeof(t->user));
        explicit_bzero(t->password, sizeof(t->password));
    }
    if (o.Has("--no-chap") || o.Has("--no-mutual-chap")) {
        if (o.Has("--mutual-secret-file")) {
            fprintf(stderr, "orloiscsi: --no-mutual-chap takes no mutual secret\n");
            return 2;
        }
        if (t->auth_type == ORLO_ISCSI_AUTH_MUTUAL_CHAP) t->auth_type = ORLO_ISCSI_AUTH_CHAP;
        explicit_bzero(t->mutual_user, sizeof(t->mutual_user));
        explicit_bzero(t->mutual_password, sizeof(t->mutual_password));
    }
    if (o.Has("--chap")) {
        if (!CopyField(o.Last("--chap"), t->user, sizeof(t->user), "CHAP user name") || t->user[0] == '\0')
            return Fail(18990704);  // Bad target user
        if (t->auth_type == ORLO_ISCSI_AUTH_NONE) t->auth_type = ORLO_ISCSI_AUTH_CHAP;
    }
    if (o.Has("--chap") || o.Has("--secret-file")) {
        if (t->auth_type == ORLO_ISCSI_AUTH_NONE) {
            fprintf(stderr, "orloiscsi: --secret-file needs CHAP: give --chap USER\n");
            return 2;
        }
        int rc = GetSecret(o.Last("--secret-file"), false, t->user, t->password);
        if (rc != 0) return rc;
    }
    if (o.Has("--mutual-chap")) {
        if (t->auth_type == ORLO_ISCSI_AUTH_NONE) {
            fprintf(stderr, "orloiscsi: mutual CHAP needs one-way CHAP as well: give --chap USER too\n");
            return 2;
        }
        if (!CopyField(o.Last("--mutual-chap"), t->mutual_user, sizeof(t->mutual_user), "mutual CHAP user name") ||
            t->mutual_user[0] == '\0')
            return Fail(18990706);  // Bad target mutual_user
        t->auth_type = ORLO_ISCSI_AUTH_MUTUAL_CHAP;
    }
    if (o.Has("--mutual-chap") || o.Has("--mutual-secret-file")) {
        if (t->auth_type != ORLO_ISCSI_AUTH_MUTUAL_CHAP) {
            fprintf(stderr, "orloiscsi: --mutual-secret-file needs mutual CHAP: give --mutual-chap USER\n");
            return 2;
        }
        int rc = GetSecret(o.Last("--mutual-secret-file"), true, t->mutual_user, t->mutual_password);
        if (rc != 0) return rc;
    }

    if (o.Has("--portal") || o.Has("--no-portals")) {
        std::string list;
        for (const std::string &p : o.All("--portal")) {
            std::string one;
            if (!ParsePortal(p, &one)) return 2;
            list += (list.empty() ? "" : ",") + one;
        }
        if (!CopyField(list, t->network_portals, sizeof(t->network_portals), "portal list")) return 2;
    }
    if (o.Has("--header-digest") || o.Has("--no-header-digest")) t->has_header_checksum = o.Has("--header-digest");
    if (o.Has("--data-digest") || o.Has("--no-data-digest")) t->has_data_checksum = o.Has("--data-digest");
    struct {
        const char *option;
        int32_t *field;
        long min, max;
        uint32_t code;
    } numbers[] = {
        {"--max-recv-seg", &t->max_recv_seg_bytes, ORLO_ISCSI_SEG_BYTES_MIN, ORLO_ISCSI_SEG_BYTES_MAX, 18990738},
        {"--max-send-seg", &t->max_send_seg_bytes, ORLO_ISCSI_SEG_BYTES_MIN, ORLO_ISCSI_SEG_BYTES_MAX, 18990739},
        {"--max-sessions", &t->max_sessions, 0, 65535, 18990703},
    };
    for (auto &n : numbers) {
        if (!o.Has(n.option)) continue;
        long v = 0;
        if (!ParseNumber(o.Last(n.option), n.min, n.max, &v)) {
            fprintf(stderr, "orloiscsi: %s takes a number from %ld to %ld\n", n.option, n.min, n.max);
            return Fail(n.code);
        }
        *n.field = static_cast<int32_t>(v);
    }
    if (o.Has("--enabled") || o.Has("--disabled")) t->enabled = o.Has("--enabled");
    return 0;
}

// ---- Output ----

// One target as a JSON object; never the secrets.
Json TargetJson(const ORLOiSCSITarget &t, int status) {
    Json o = Json::Object();
    o.SetInt("tid", t.tid)
        .SetStr("name", t.name)
        .SetStr("iqn", t.iqn)
        .SetBool("enabled", t.enabled)
        .SetInt("status", status)
        .SetStr("kernel", KernelState(status))
        .SetStr("auth", AuthKey(t.auth_type));
    if (t.auth_type != ORLO_ISCSI_AUTH_NONE) o.SetStr("chap_user", t.user);
    if (t.auth_type == ORLO_ISCSI_AUTH_MUTUAL_CHAP) o.SetStr("mutual_chap_user", t.mutual_user);
    o.SetBool("header_digest", t.has_header_checksum)
        .SetBool("data_digest", t.has_data_checksum)
        .SetInt("max_recv_seg", t.max_recv_seg_bytes)
        .SetInt("max_send_seg", t.max_send_seg_bytes)
        .SetInt("max_sessions", t.max_sessions);
    Json portals = Json::Array();
    for (const std::string &p : SplitPortals(t.network_portals)) portals.Push(Json::Str(p));
    o.Set("portals", std::move(portals)).SetBool("backup_object", t.bkp_obj);
    return o;
}

void PrintTargetText(const ORLOiSCSITarget &t, int status) {
    printf("tid:              %d\n", t.tid);
    printf("name:             %s\n", t.name);
    printf("iqn:              %s\n", t.iqn);
    printf("enabled:          %s\n", t.enabled ? "yes" : "no");
    printf("kernel:           %s\n", KernelState(status));
    printf("authentication:   %s\n", AuthName(t.auth_type));
    if (t.auth_type != ORLO_ISCSI_AUTH_NONE)
        printf("chap user:        %s (secret %s)\n", t.user, t.password[0] ? "set" : "NOT set");
    if (t.auth_type == ORLO_ISCSI_AUTH_MUTUAL_CHAP)
        printf("mutual chap user: %s (secret %s)\n", t.mutual_user, t.mutual_password[0] ? "set" : "NOT set");
    printf("header digest:    %s\n", t.has_header_checksum ? "CRC32C" : "CRC32C or none");
    printf("data digest:      %s\n", t.has_data_checksum ? "CRC32C" : "CRC32C or none");
    printf("max recv segment: %d\n", t.max_recv_seg_bytes);
    printf("max send segment: %d\n", t.max_send_seg_bytes);
    if (t.max_sessions == 0)
        printf("max sessions:     no limit\n");
    else
        printf("max sessions:     %d\n", t.max_sessions);
    printf("portals:          %s\n", t.network_portals[0] ? t.network_portals : "(none configured)");
    if (t.bkp_obj) printf("backup object:    yes\n");
}

// A record that wipes its secrets when it goes out of scope.
struct TargetRecord {
    ORLOiSCSITarget t;
    TargetRecord() { memset(&t, 0, sizeof(t)); }
    ~TargetRecord() { explicit_bzero(&t, sizeof(t)); }
};

// Looks up the target an action names.  0, or the exit status.
int TargetArg(const std::string &ref, TargetRecord *r) {
    uint32_t ret = FindTarget(ref, &r->t);
    return ret == ORLO_OK ? 0 : Fail(ret);
}

// ---- Actions ----

int RunCreate(const TargetOptions &o) {
    const std::string &name = o.target;
    if (name.empty()) return UsageError("the target's name is empty");

    TargetRecord r;
    ORLOiSCSITarget &t = r.t;
    t.enabled = true;
    t.max_recv_seg_bytes = kDefaultSegBytes;
    t.max_send_seg_bytes = kDefaultSegBytes;
    t.max_sessions = kDefaultMaxSessions;
    t.auth_type = ORLO_ISCSI_AUTH_NONE;
    int rc = ApplyOptions(o, &name, &t);
    if (rc != 0) return rc;
    if (!o.Has("--iqn")) {
        std::string iqn;
        uint32_t ret = GenerateIqn(name, &iqn);
        if (ret != ORLO_OK) return Fail(ret);
        snprintf(t.iqn, sizeof(t.iqn), "%s", iqn.c_str());
    }
    // Check the whole record before anything is written (the tid is chosen by the create).
    t.tid = ORLO_ISCSI_TID_MIN;
    uint32_t ret = ORLOiSCSITargetStructCheck(&t);
    t.tid = 0;
    if (ret != ORLO_OK) return Fail(ret);

    ret = ORLOiSCSITargetCreate(&t);
    if (ret != ORLO_OK) {
        if (t.tid >= ORLO_ISCSI_TID_MIN && ret == 18990722)  // Failed to load target
            fprintf(stderr, "orloiscsi: target %d '%s' is stored but could not be loaded into the kernel\n", t.tid,
                    t.name);
        return Fail(ret);
    }
    int status = ORLOiSCSITargetStatusGet(t.tid, &t);
    if (Ctx().json) {
        PrintJson(TargetJson(t, status));
    } else {
        printf("created target %d '%s' %s (%s, authentication %s)\n", t.tid, t.name, t.iqn,
               t.enabled ? KernelState(status) : "disabled", AuthName(t.auth_type));
    }
    return 0;
}

int RunList(bool all) {
    ORLOiSCSITargetFilter f = {};
    f.flags = ORLO_ISCSI_TARGET_FILTER_ALL | (all ? ORLO_ISCSI_TARGET_FILTER_BKP : 0);
    ORLOiSCSITargetList list;
    ORLOiSCSIListInit(&list);
    uint32_t ret = ORLOiSCSITargetConfLoad(&f, &list);
    if (ret != ORLO_OK) return Fail(ret);
    ORLOiSCSIListLink *link;
    ORLOiSCSITarget *t = nullptr;
    if (Ctx().json) {
        Json doc = Json::Array();
        ORLO_ISCSI_TARGET_LIST_FOREACH(&list, link, t) { doc.Push(TargetJson(*t, ORLOiSCSITargetStatusGet(t->tid, t))); }
        PrintJson(doc);
    } else {
        printf("%-4s %-20s %-8s %-8s %-12s %s\n", "TID", "NAME", "ENABLED", "KERNEL", "AUTH", "IQN");
        ORLO_ISCSI_TARGET_LIST_FOREACH(&list, link, t) {
            printf("%-4d %-20s %-8s %-8s %-12s %s\n", t->tid, t->name, t->enabled ? "yes" : "no",
                   KernelState(ORLOiSCSITargetStatusGet(t->tid, t)), AuthName(t->auth_type), t->iqn);
        }
    }
    // The loaded records hold deciphered secrets.
    ORLO_ISCSI_TARGET_LIST_FOREACH(&list, link, t) {
        explicit_bzero(t->password, sizeof(t->password));
        explicit_bzero(t->mutual_password, sizeof(t->mutual_password));
    }
    ORLOiSCSITargetListFree(&list);
    return 0;
}

int RunShow(const std::string &ref) {
    TargetRecord r;
    int rc = TargetArg(ref, &r);
    if (rc != 0) return rc;
    int status = ORLOiSCSITargetStatusGet(r.t.tid, &r.t);
    if (Ctx().json)
        PrintJson(TargetJson(r.t, status));
    else
        PrintTargetText(r.t, status);
    return 0;
}

int RunUpdate(const TargetOptions &o) {
    if (!o.AnyGiven()) return UsageError("nothing to change");
    TargetRecord r;
    uint32_t ret = FindTarget(o.target, &r.t);
    if (ret != ORLO_OK) return Fail(ret);
    std::string newName = o.Last("--name");
    int rc = ApplyOptions(o, o.Has("--name") ? &newName : nullptr, &r.t);
    if (rc != 0) return rc;
    ret = ORLOiSCSITargetStructCheck(&r.t);
    if (ret != ORLO_OK) return Fail(ret);
    ret = ORLOiSCSITargetUpdate(&r.t);
    if (ret != ORLO_OK) return Fail(ret);
    int status = ORLOiSCSITargetStatusGet(r.t.tid, &r.t);
    if (Ctx().json) {
        PrintJson(TargetJson(r.t, status));
    } else {
        printf("updated target %d '%s' (%s)\n", r.t.tid, r.t.name, r.t.enabled ? KernelState(status) : "disabled");
    }
    return 0;
}

// enable, disable and remove: one target, one library call.
int RunOnOne(const std::string &ref, uint32_t (*op)(ORLOiSCSITarget *), const char *done, bool showState) {
    TargetRecord r;
    int rc = TargetArg(ref, &r);
    if (rc != 0) return rc;
    uint32_t ret = op(&r.t);
    if (ret != ORLO_OK) return Fail(ret);
    if (showState)
        printf("%s target %d '%s': %s\n", done, r.t.tid, r.t.name, KernelState(ORLOiSCSITargetStatusGet(r.t.tid, &r.t)));
    else
        printf("%s target %d '%s' with its mappings and access list\n", done, r.t.tid, r.t.name);
    return 0;
}

uint32_t Enable(ORLOiSCSITarget *t) { return ORLOiSCSITargetEnable(t); }
uint32_t Disable(ORLOiSCSITarget *t) { return ORLOiSCSITargetDisable(t); }
uint32_t Remove(ORLOiSCSITarget *t) { return ORLOiSCSITargetRemove(t); }

// Loads the target's sessions; their number, or -1.
int LoadSessions(int32_t tid, ORLOiSCSISessionStateList *list) {
    ORLOiSCSIListInit(list);
    return ORLOiSCSITargetSessionStateListGet(tid, list);
}

int RunStatus(const std::string &ref) {
    TargetRecord r;
    int rc = TargetArg(ref, &r);
    if (rc != 0) return rc;
    int status = ORLOiSCSITargetStatusGet(r.t.tid, &r.t);
    char conn = ORLO_ISCSI_TARGET_CONN_DOWN;
    uint32_t ret = ORLOiSCSITargetConnectionStatusGet(r.t.tid, &conn);
    if (ret != ORLO_OK) return Fail(ret);
    ORLOiSCSISessionStateList list;
    int sessions = LoadSessions(r.t.tid, &list);
    ORLOiSCSITargetSessionStateListFree(&list);
    // iSNS: off, or whether the server holds the target (a server that cannot be asked
    // is reported, not a failure of the status).
    bool isnsOn = ORLOiSCSIiSNSIsEnabled(), registered = false;
    uint32_t isnsErr = isnsOn ? ORLOiSCSITargetiSNSIsRegistered(&r.t, &registered) : 0;
    std::string isns = !isnsOn ? "off"
                       : isnsErr != 0 ? "unknown (" + std::to_string(isnsErr) + " " + ORLOiSCSIErrStr(isnsErr) + ")"
                       : registered ? "registered"
                                    : "not registered";
    if (Ctx().json) {
        PrintJson(Json::Object()
                      .SetInt("tid", r.t.tid)
                      .SetStr("name", r.t.name)
                      .SetBool("enabled", r.t.enabled)
                      .SetInt("status", status)
                      .SetStr("kernel", KernelState(status))
                      .SetInt("connection", conn)
                      .SetStr("connection_state", ConnectionName(conn))
                      .SetInt("sessions", sessions)
                      .SetStr("isns", isns));
        return 0;
    }
    printf("target %d '%s' %s\n", r.t.tid, r.t.name, r.t.iqn);
    printf("  stored:     %s\n", r.t.enabled ? "enabled" : "disabled");
    printf("  kernel:     %s (status %d)\n", KernelState(status), status);
    printf("  connection: %s\n", ConnectionName(conn));
    if (sessions >= 0)
        printf("  sessions:   %d\n", sessions);
    else
        printf("  sessions:   unknown\n");
    printf("  iSNS:       %s\n", isns.c_str());
    return 0;
}

int RunSessions(const std::string &ref) {
    TargetRecord r;
    int rc = TargetArg(ref, &r);
    if (rc != 0) return rc;
    ORLOiSCSISessionStateList list;
    int n = LoadSessions(r.t.tid, &list);
    if (n < 0) {
        ORLOiSCSITargetSessionStateListFree(&list);
        fprintf(stderr, "orloiscsi: cannot read the sessions of target %d '%s'\n", r.t.tid, r.t.name);
        return Fail(ORLO_ERR_READ_FILE);
    }
    ORLOiSCSIListLink *link;
    ORLOiSCSISessionState *s = nullptr;
    if (Ctx().json) {
        Json doc = Json::Array();
        ORLO_ISCSI_SESSION_STATE_LIST_FOREACH(&list, link, s) {
            // The connection id is a decimal number; anything else is kept as text.
            doc.Push(Json::Object()
                         .SetStr("initiator", s->iqn)
                         .SetStr("ip", s->ip)
                         .Set("cid", AllDigits(s->cid) && strlen(s->cid) < 19 ? Json::Int(strtoll(s->cid, nullptr, 10))
                                                                              : Json::Str(s->cid)));
        }
        PrintJson(doc);
    } else {
        printf("%-48s %-40s %s\n", "INITIATOR", "IP", "CID");
        ORLO_ISCSI_SESSION_STATE_LIST_FOREACH(&list, link, s) { printf("%-48s %-40s %s\n", s->iqn, s->ip, s->cid); }
    }
    ORLOiSCSITargetSessionStateListFree(&list);
    return 0;
}

// The options of create (update: also the ones that turn things off, and --name to
// rename).
void AddTargetOptions(CLI::App *act, TargetOptions *o, bool update) {
    auto value = [&](const char *name, const char *placeholder, const char *description) {
        o->options.push_back(AddValue(act, name, placeholder, &o->values[name], description));
    };
    auto flag = [&](const char *name, const char *description) {
        o->options.push_back(AddFlag(act, name, &o->switches[name], description));
    };
    if (update) value("--name", "NAME", "rename the target (names are unique and not all digits)");
    value("--iqn", "IQN", "the target's iSCSI name (iqn., eui. or naa.); no two targets share one");
    value("--chap", "USER", "one-way CHAP: initiators log in as USER");
    value("--secret-file", "FILE", "the CHAP secret: the file's first line (- reads standard input); asked for on "
                                   "the terminal when not given");
    value("--mutual-chap", "USER", "mutual CHAP as well: the target answers as USER");
    value("--mutual-secret-file", "FILE", "the mutual CHAP secret, as --secret-file");
    if (update) {
        flag("--no-chap", "turn CHAP off");
        flag("--no-mutual-chap", "turn only mutual CHAP off");
    }
    o->options.push_back(AddValues(act, "--portal", "ADDR:PORT", &o->portals,
                                   "a portal besides the appliance's interfaces: 192.0.2.1:3260 or [2001:db8::1]:3260"));
    if (update) flag("--no-portals", "clear the portal list");
    flag("--header-digest", "insist on CRC32C header digests");
    flag("--data-digest", "insist on CRC32C data digests");
    if (update) {
        flag("--no-header-digest", "header digests CRC32C or none, as the initiator asks");
        flag("--no-data-digest", "data digests CRC32C or none, as the initiator asks");
    }
    value("--max-recv-seg", "BYTES", "MaxRecvDataSegmentLength, 512..16777215");
    value("--max-send-seg", "BYTES", "MaxXmitDataSegmentLength, 512..16777215");
    value("--max-sessions", "N", "most sessions at one time, 0 for no limit");
    if (update) flag("--enabled", "store the target enabled (service start starts it)");
    flag("--disabled", update ? "store the target disabled" : "store the target without starting it");
}

// TARGET | --name NAME
void AddTargetRef(CLI::App *act, std::string *ref) {
    CLI::Option *pos = AddPositional(act, "TARGET", ref, "the target's tid or name");
    AddAlias(act, pos, "--name", "NAME", "the target's name, as target create takes it");
}

}  // namespace

void RegisterTarget(CLI::App *root) {
    static TargetOptions create, update;
    static std::string ref;
    static bool all = false;
    CLI::App *obj = AddObject(root, "target", "iSCSI targets: create, list, change, run in the kernel, remove");
    CLI::App *act = AddAction(obj, "create",
                              "create a target and start it in the kernel (unless --disabled); without --iqn one is "
                              "made from the host name and NAME; CHAP secrets are asked for on the terminal unless "
                              "given in a file",
                              [] { return RunCreate(create); });
    CLI::Option *pos = AddPositional(act, "NAME", &create.target, "the new target's name (unique, not all digits)");
    AddAlias(act, pos, "--name", "NAME", "the new target's name");
    AddTargetOptions(act, &create, false);
    act = AddAction(obj, "list", "list the targets with their kernel state (--all: backup objects too)",
                    [] { return RunList(all); });
    AddFlag(act, "--all", &all, "backup objects too");
    act = AddAction(obj, "show", "show one target (TARGET: tid or name); secrets are never shown",
                    [] { return RunShow(ref); });
    AddTargetRef(act, &ref);
    act = AddAction(obj, "update",
                    "change a target (TARGET: tid or name; --name renames it); what is not given is kept; a running "
                    "target is restarted",
                    [] { return RunUpdate(update); });
    AddPositional(act, "TARGET", &update.target, "the target's tid or name");
    AddTargetOptions(act, &update, true);
    act = AddAction(obj, "enable", "load the target into the kernel and accept logins (the stored flag is kept)",
                    [] { return RunOnOne(ref, Enable, "enabled", true); });
    AddTargetRef(act, &ref);
    act = AddAction(obj, "disable", "take the target out of the kernel (the stored flag is kept)",
                    [] { return RunOnOne(ref, Disable, "disabled", true); });
    AddTargetRef(act, &ref);
    act = AddAction(obj, "remove", "take the target out of the kernel and remove it, its mappings and its access list",
                    [] { return RunOnOne(ref, Remove, "removed", false); });
    AddTargetRef(act, &ref);
    act = AddAction(obj, "status", "kernel state (running, present, absent), connection state and number of sessions",
                    [] { return RunStatus(ref); });
    AddTargetRef(act, &ref);
    act = AddAction(obj, "sessions", "the target's iSCSI connections: initiator, IP address, connection id",
                    [] { return RunSessions(ref); });
    AddTargetRef(act, &ref);
}

uint32_t FindTarget(const std::string &ref, ORLOiSCSITarget *target) {
    if (AllDigits(ref)) {
        long tid = 0;
        if (!ParseNumber(ref, ORLO_ISCSI_TID_MIN, ORLO_ISCSI_TID_MAX, &tid)) {
            fprintf(stderr, "orloiscsi: tid %s is out of range (%d to %d)\n", ref.c_str(), ORLO_ISCSI_TID_MIN,
                    ORLO_ISCSI_TID_MAX);
            return kErrBadTargetId;
        }
        return ORLOiSCSITargetGetByTid(static_cast<int32_t>(tid), ORLO_ISCSI_TARGET_FILTER_BKP, target);
    }
    return ORLOiSCSITargetGetByName(ref.c_str(), ORLO_ISCSI_TARGET_FILTER_BKP, target);
}

}  // namespace cli
