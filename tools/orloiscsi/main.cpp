// Entry point of orloiscsi: global options, then dispatch to the object's action table.
#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "base/iscsi_base_internal.h"
#include "cli.h"

namespace cli {

namespace {

const Object *const kObjects[] = {&kLunObject,     &kTargetObject, &kMapObject,     &kAclObject,
                                  &kEpObject,      &kServiceObject, &kModulesObject, &kSelftestObject,
                                  &kConfObject,    &kErrstrObject};

// Options that would carry a CHAP secret on the command line, where every user of the
// machine can read it (ps, /proc/<pid>/cmdline, shell history).
const char *const kSecretOptions[] = {"--secret",          "--password",        "--mutual-secret",
                                      "--mutual-password", "--chap-secret",     "--chap-password",
                                      "--mutual-chap-secret", "--mutual-chap-password"};

void PrintMainHelp(FILE *out) {
    fprintf(out,
            "usage: orloiscsi [--root DIR] [--json] OBJECT ACTION [ARGS]\n"
            "\n"
            "Manages the appliance's iSCSI service: its configuration files and the kernel target.\n"
            "\n"
            "Options:\n"
            "  --root DIR   work on the appliance tree under DIR (sets ORLO_SYSROOT)\n"
            "  --json       print results as JSON\n"
            "  --help       this help; 'orloiscsi OBJECT --help' lists an object's actions\n"
            "\n"
            "Objects:\n");
    for (const Object *o : kObjects) fprintf(out, "  %-12s %s\n", o->name, o->summary);
}

void PrintObjectHelp(FILE *out, const Object &obj) {
    if (obj.actions[0].name[0] == '\0') {  // one unnamed action: the object is the command
        const Action &a = obj.actions[0];
        fprintf(out, "usage: orloiscsi [--root DIR] [--json] %s%s%s\n\n%s\n  %s\n", obj.name, a.usage[0] ? " " : "",
                a.usage, obj.summary, a.summary);
        return;
    }
    fprintf(out, "usage: orloiscsi [--root DIR] [--json] %s ACTION [ARGS]\n\n%s\n\nActions:\n", obj.name,
            obj.summary);
    for (const Action *a = obj.actions; a->name != nullptr; ++a)
        fprintf(out, "  %s %s\n      %s\n", a->name, a->usage, a->summary);
}

const Object *FindObject(const std::string &name) {
    for (const Object *o : kObjects)
        if (name == o->name) return o;
    return nullptr;
}

bool IsHelp(const std::string &s) { return s == "--help" || s == "-h" || s == "help"; }

}  // namespace

bool ParseNumber(const std::string &s, long min, long max, long *out) {
    if (s.empty() || !(s[0] == '-' || (s[0] >= '0' && s[0] <= '9'))) return false;
    errno = 0;
    char *end = nullptr;
    long v = strtol(s.c_str(), &end, 10);
    if (errno != 0 || *end != '\0' || v < min || v > max) return false;
    *out = v;
    return true;
}

const std::vector<std::string> &ParsedOptions::All(const std::string &name) const {
    static const std::vector<std::string> kNone;
    auto it = values.find(name);
    return it == values.end() ? kNone : it->second;
}

bool ParseOptionList(const Args &args, const OptionSpec *specs, ParsedOptions *out) {
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string &a = args[i];
        if (a.size() < 3 || a[0] != '-' || a[1] != '-') {
            out->positional.push_back(a);
            continue;
        }
        size_t eq = a.find('=');
        std::string name = a.substr(0, eq);
        for (const char *secret : kSecretOptions)
            if (name == secret) {
                fprintf(stderr,
                        "orloiscsi: %s: CHAP secrets are never taken from the command line, where other users "
                        "can read them; give --secret-file FILE (or --mutual-secret-file FILE), or answer the "
                        "prompt\n",
                        name.c_str());
                return false;
            }
        const OptionSpec *known = nullptr;
        for (const OptionSpec *s = specs; s->name != nullptr; ++s)
            if (name == s->name) known = s;
        if (known == nullptr) {
            fprintf(stderr, "orloiscsi: unknown option '%s'\n", name.c_str());
            return false;
        }
        if (!known->takesValue) {
            if (eq != std::string::npos) {
                fprintf(stderr, "orloiscsi: %s takes no value\n", name.c_str());
                return false;
            }
            out->values[name].push_back(std::string());
            continue;
        }
        if (eq != std::string::npos) {
            out->values[name].push_back(a.substr(eq + 1));
        } else if (i + 1 < args.size()) {
            out->values[name].push_back(args[++i]);
        } else {
            fprintf(stderr, "orloiscsi: %s needs a value\n", name.c_str());
            return false;
        }
    }
    return true;
}

int Fail(uint32_t code) {
    fprintf(stderr, "error: %" PRIu32 " %s\n", code, ORLOiSCSIErrStr(code));
    return 1;
}

int Usage(const Object &obj, const Action &act) {
    fprintf(stderr, "usage: orloiscsi %s %s %s\n  %s\n", obj.name, act.name, act.usage, act.summary);
    return 2;
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

std::string JsonQuote(const std::string &s) {
    std::string o = "\"";
    for (unsigned char c : s) {
        switch (c) {
            case '"': o += "\\\""; break;
            case '\\': o += "\\\\"; break;
            case '\n': o += "\\n"; break;
            case '\t': o += "\\t"; break;
            case '\r': o += "\\r"; break;
            default:
                if (c < 0x20) {
                    char buf[8];
                    snprintf(buf, sizeof(buf), "\\u%04x", c);
                    o += buf;
                } else {
                    o += static_cast<char>(c);
                }
        }
    }
    return o + "\"";
}

}  // namespace cli

int main(int argc, char **argv) {
    using namespace cli;
    Context ctx;
    int i = 1;
    for (; i < argc; ++i) {
        std::string a = argv[i];
        if (a == "--root" || a.rfind("--root=", 0) == 0) {
            std::string dir;
            if (a == "--root") {
                if (i + 1 >= argc) {
                    fprintf(stderr, "orloiscsi: --root needs a directory\n");
                    return 2;
                }
                dir = argv[++i];
            } else {
                dir = a.substr(7);
            }
            if (dir.empty()) {
                fprintf(stderr, "orloiscsi: --root needs a directory\n");
                return 2;
            }
            setenv("ORLO_SYSROOT", dir.c_str(), 1);
        } else if (a == "--json") {
            ctx.json = true;
        } else if (IsHelp(a)) {
            PrintMainHelp(stdout);
            return 0;
        } else if (a.size() > 1 && a[0] == '-') {
            fprintf(stderr, "orloiscsi: unknown option '%s'\n", a.c_str());
            PrintMainHelp(stderr);
            return 2;
        } else {
            break;
        }
    }
    if (i >= argc) {
        PrintMainHelp(stderr);
        return 2;
    }
    const Object *obj = FindObject(argv[i]);
    if (obj == nullptr) {
        fprintf(stderr, "orloiscsi: unknown object '%s'\n", argv[i]);
        PrintMainHelp(stderr);
        return 2;
    }
    ++i;
    // An object whose only action is unnamed and takes no arguments ("selftest") runs
    // as it stands.
    bool bare = obj->actions[0].name[0] == '\0' && obj->actions[0].usage[0] == '\0';
    if ((i >= argc && !bare) || (i < argc && IsHelp(argv[i]))) {
        PrintObjectHelp(i >= argc ? stderr : stdout, *obj);
        return i >= argc ? 2 : 0;
    }
    // An object whose only action is unnamed ("errstr CODE...") takes its arguments at once.
    const Action *act = bare ? obj->actions : nullptr;
    for (const Action *a = obj->actions; act == nullptr && a->name != nullptr; ++a)
        if (a->name[0] == '\0' || strcmp(a->name, argv[i]) == 0) {
            act = a;
            break;
        }
    if (act == nullptr) {
        fprintf(stderr, "orloiscsi: unknown action '%s %s'\n", obj->name, argv[i]);
        PrintObjectHelp(stderr, *obj);
        return 2;
    }
    if (act->name[0] != '\0') ++i;
    // The runtime directories hold the lock files every action takes; the appliance
    // makes them at boot, a fresh root may not have them yet.
    if (obj != &kErrstrObject) {
        uint32_t ret = ORLOiSCSIBaseMkdir(nullptr);
        if (ret != ORLO_OK) return Fail(ret);
    }
    Args args(argv + i, argv + argc);
    for (const std::string &a : args)
        if (IsHelp(a)) {
            fprintf(stdout, "usage: orloiscsi %s %s %s\n  %s\n", obj->name, act->name, act->usage, act->summary);
            return 0;
        }
    return act->run(ctx, args);
}
