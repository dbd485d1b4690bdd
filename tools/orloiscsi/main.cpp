// Entry point of orloiscsi: the global options, the objects, the parse, the appliance
// root, and the action.
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "cli.h"
#include "orloiscsi_base.h"
#include "platform/os_seam.h"

#ifndef ORLO_VERSION
#error "ORLO_VERSION (the project version) must be defined by the build"
#endif

namespace cli {

namespace {

// Options that would carry a CHAP secret on the command line, where every user of the
// machine can read it (ps, /proc/<pid>/cmdline, shell history).
const char *const kSecretOptions[] = {"--secret",          "--password",        "--mutual-secret",
                                      "--mutual-password", "--chap-secret",     "--chap-password",
                                      "--mutual-chap-secret", "--mutual-chap-password"};

// A secret option anywhere before "--" stops the tool before anything is parsed.
bool RefuseSecrets(int argc, char **argv) {
    for (int i = 1; i < argc; ++i) {
        std::string a = argv[i];
        if (a == "--") break;
        std::string name = a.substr(0, a.find('='));
        for (const char *secret : kSecretOptions)
            if (name == secret) {
                fprintf(stderr,
                        "orloiscsi: %s: CHAP secrets are never taken from the command line, where other users "
                        "can read them; give --secret-file FILE (or --mutual-secret-file FILE), or answer the "
                        "prompt\n",
                        name.c_str());
                return true;
            }
    }
    return false;
}

// The appliance root named by --root or ORLO_SYSROOT must be a directory the caller may
// read, write and search: everything the tool does makes or locks files beneath it.
// Checked before anything is made.  0, or the exit status after saying why.
int CheckRoot(bool fromOption) {
    std::string root = orlo::os::SysRoot();
    if (root.empty()) return 0;
    std::string who = fromOption ? "--root " + root : "ORLO_SYSROOT=" + root;
    struct stat st;
    if (orlo::os::Stat("/", &st) != 0) {
        fprintf(stderr, "orloiscsi: %s cannot be used as the appliance root: %s\n", who.c_str(), strerror(errno));
        return kExitFailure;
    }
    if (!S_ISDIR(st.st_mode)) {
        fprintf(stderr, "orloiscsi: %s cannot be used as the appliance root: %s\n", who.c_str(), strerror(ENOTDIR));
        return kExitFailure;
    }
    if (orlo::os::Access("/", R_OK | W_OK | X_OK) != 0) {
        fprintf(stderr,
                "orloiscsi: %s cannot be used as the appliance root: %s (the tool must read, write and search "
                "it)\n",
                who.c_str(), strerror(errno));
        return kExitFailure;
    }
    return 0;
}

}  // namespace

}  // namespace cli

int main(int argc, char **argv) {
    using namespace cli;
    if (RefuseSecrets(argc, argv)) return kExitUsage;

    CLI::App app("Manages the appliance's iSCSI service: its configuration files and the kernel target.",
                 "orloiscsi");
    // Set before any subcommand is added, so that every object and action inherits them:
    // a repeated option keeps its last value, and the global options may follow the
    // action too.
    app.option_defaults()->multi_option_policy(CLI::MultiOptionPolicy::TakeLast);
    app.fallthrough();
    app.require_subcommand(1);
    app.set_help_flag("-h,--help", "this help; OBJECT --help and OBJECT ACTION --help on every level");

    Context &ctx = MutableCtx();
    std::string root;
    CLI::Option *rootOpt = AddValue(&app, "--root", "DIR", &root,
                                    "work on the appliance tree under DIR (sets ORLO_SYSROOT); paths on the "
                                    "command line and in the output stay the appliance's own");
    AddFlag(&app, "--json", &ctx.json, "print results as one JSON document");
    CLI::Option *verbose =
        AddFlag(&app, "--verbose", &ctx.verbose, "show the library's informational log lines as well");
    CLI::Option *quiet =
        AddFlag(&app, "--quiet", &ctx.quiet, "show no log lines of the library, only the error line of a failure");
    verbose->excludes(quiet);
    OneOf(&app, {verbose, quiet}, false);
    app.set_version_flag("--version", std::string("orloiscsi ") + ORLO_VERSION, "print the version of orloiscsi");

    RegisterOverview(&app);
    RegisterLun(&app);
    RegisterTarget(&app);
    RegisterMap(&app);
    RegisterAcl(&app);
    RegisterSnapshot(&app);
    RegisterEp(&app);
    RegisterService(&app);
    RegisterIsns(&app);
    RegisterConf(&app);
    RegisterErrstr(&app);

    // "orloiscsi help [OBJECT [ACTION]]" is the help of what it names.
    std::vector<std::string> helpWords;
    CLI::App *help = AddHiddenAction(&app, "help", [&app, &helpWords] {
        CLI::App *at = &app;
        for (const std::string &w : helpWords) {
            try {
                at = at->get_subcommand(w);
            } catch (const CLI::OptionNotFound &) {
                fprintf(stderr, "orloiscsi: nothing is called '%s'\n", w.c_str());
                return kExitUsage;
            }
        }
        fputs(HelpOf(at).c_str(), stdout);
        return 0;
    });
    AddPositionals(help, "WORD", &helpWords, "", false);
    // The words bash completion may offer (tools/completion/orloiscsi).
    std::vector<std::string> completeWords;
    CLI::App *complete = AddHiddenAction(&app, "__complete", [&app, &completeWords] {
        fputs(CompletionWords(&app, completeWords).c_str(), stdout);
        return 0;
    });
    AddPositionals(complete, "WORD", &completeWords, "", false);

    Chosen chosen;
    int status = 0;
    if (!Parse(&app, argc, argv, &chosen, &status)) return status;

    if (rootOpt->count() > 0) {
        if (root.empty()) return UsageError("--root needs a directory");
        setenv("ORLO_SYSROOT", root.c_str(), 1);
    }
    StartLogCapture();
    if ((chosen.flags & kLeavesRoot) == 0) {
        int rc = CheckRoot(rootOpt->count() > 0);
        if (rc != 0) return rc;
        // The runtime directories hold the lock files every action takes; the appliance
        // makes them at boot, a fresh root may not have them yet.
        uint32_t ret = ORLOiSCSIBaseMkdir(nullptr);
        if (ret != ORLO_OK) return Fail(ret);
    }
    int rc = chosen.run();
    if (rc == 0) ShowRemainingLogLines();
    return rc;
}
