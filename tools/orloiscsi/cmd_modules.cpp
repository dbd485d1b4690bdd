// orloiscsi modules, service and selftest: the kernel target's module sets, the
// target-core generation in use, starting and stopping the whole service, and the
// kernel self-test.
#include <strings.h>

#include <cstdio>
#include <string>

#include "cli.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_service.h"
#include "orloiscsi_target.h"

namespace cli {

namespace {

struct SetName {
    const char *name;
    int set;
};
const SetName kSets[] = {
    {"iscsi", ISCSI_KERNEL_MODULES},
    {"vhost", VHOST_KERNEL_MODULES},
    {"tcm", TCM_KERNEL_MODULES},
    {"loopback", LOOPBACK_KERNEL_MODULES},
};

bool ParseSet(const std::string &s, int *set) {
    for (const SetName &n : kSets)
        if (strcasecmp(s.c_str(), n.name) == 0 || s == std::to_string(n.set)) {
            *set = n.set;
            return true;
        }
    return false;
}

extern const Action kServiceActions[];
extern const Action kSelftestActions[];

int RunModules(const Args &args, size_t actionIndex, uint32_t (*op)(int), const char *done) {
    int set = 0;
    if (args.size() != 1 || !ParseSet(args[0], &set)) return Usage(kModulesObject, kModulesObject.actions[actionIndex]);
    uint32_t ret = op(set);
    if (ret != 0) return Fail(ret);
    printf("%s module set %s\n", done, args[0].c_str());
    return 0;
}

int RunLoad(const Context &, const Args &args) { return RunModules(args, 0, ORLOiSCSILoadModules, "loaded"); }
int RunUnload(const Context &, const Args &args) { return RunModules(args, 1, ORLOiSCSIUnloadModules, "unloaded"); }

const Action kModuleActions[] = {
    {"load", "iscsi|vhost|tcm|loopback",
     "insert the target-core modules and then the set's own (modules already in are kept)", RunLoad},
    {"unload", "iscsi|vhost|tcm|loopback",
     "remove the set's modules, last first (tcm removes the target core itself)", RunUnload},
    {nullptr, nullptr, nullptr, nullptr},
};

const char *VersionName(unsigned int v) { return v == 4 ? "lio4x" : v == 0 ? "none" : "lio"; }

int RunVersion(const Context &ctx, const Args &args) {
    const OptionSpec specs[] = {{"--set", true}, {nullptr, false}};
    ParsedOptions o;
    if (!ParseOptionList(args, specs, &o) || !o.positional.empty()) return Usage(kServiceObject, kServiceActions[0]);
    if (o.Has("--set")) {
        // The generation is named as the defaults file names it.
        std::string want = o.Last("--set");
        unsigned int version = strcasecmp(want.c_str(), "lio4x") == 0 ? 4 : strcasecmp(want.c_str(), "lio") == 0 ? 2 : 0;
        if (version == 0) {
            fprintf(stderr, "orloiscsi: --set takes lio or lio4x\n");
            return Usage(kServiceObject, kServiceActions[0]);
        }
        uint32_t ret = ORLOiSCSIConfigfsChangeCurrentVersion(version);
        if (ret != 0) return Fail(ret);
    }
    unsigned int v = ORLOiSCSIGetLioVersion();
    if (ctx.json)
        printf("{\"version\":%u,\"name\":\"%s\"}\n", v, VersionName(v));
    else
        printf("%u %s\n", v, VersionName(v));
    return 0;
}

int RunStep(const Args &args, size_t actionIndex, uint32_t (*op)(void), const char *done) {
    if (!args.empty()) return Usage(kServiceObject, kServiceActions[actionIndex]);
    uint32_t ret = op();
    if (ret != 0) return Fail(ret);
    printf("%s\n", done);
    return 0;
}

int RunStart(const Context &, const Args &args) {
    return RunStep(args, 1, ORLOiSCSIStartAll,
                   "started: modules in, LUNs loaded, every enabled target running");
}

int RunStop(const Context &, const Args &args) {
    return RunStep(args, 2, ORLOiSCSIStopAll, "stopped: every target node is out of the kernel");
}

int RunTotalStop(const Context &, const Args &args) {
    return RunStep(args, 3, ORLOiSCSITotallyStopAndUnload, "stopped and unloaded: no target node, backstore or module left");
}

int RunInUse(const Context &ctx, const Args &args) {
    if (!args.empty()) return Usage(kServiceObject, kServiceActions[4]);
    bool inUse = false;
    uint32_t ret = ORLOiSCSIServiceIsInUse(&inUse);
    if (ret != 0) return Fail(ret);
    if (ctx.json)
        printf("{\"in_use\":%s}\n", inUse ? "true" : "false");
    else
        printf("%s\n", inUse ? "in use" : "not in use");
    return 0;
}

int RunSelftest(const Context &, const Args &args) {
    if (!args.empty()) return Usage(kSelftestObject, kSelftestActions[0]);
    uint32_t ret = ORLOiSCSILioTargetDummyTest();
    if (ret != 0) return Fail(ret);
    printf("self-test passed: a trial target node loaded into the kernel target\n");
    return 0;
}

const Action kServiceActions[] = {
    {"version", "[--set lio|lio4x]",
     "the target-core generation in use: 4 (lio4x), 2 (lio) or 0 (no iSCSI target); --set switches to "
     "another (stops the service, swaps the modules, records it in the defaults file and starts again)",
     RunVersion},
    {"start", "", "load the iSCSI modules and every LUN, and start every enabled target", RunStart},
    {"stop", "", "take every target node out of the kernel (the files are kept)", RunStop},
    {"total-stop", "", "stop, take every backstore out, and remove the module sets (iscsi, loopback, vhost, tcm)",
     RunTotalStop},
    {"in-use", "", "whether the configuration holds any LUN or target", RunInUse},
    {nullptr, nullptr, nullptr, nullptr},
};

const Action kSelftestActions[] = {
    {"", "", "under the service lock, load a trial target node into the kernel target; the outcome is also "
             "kept in /tmp/iscsi_dummy_result",
     RunSelftest},
    {nullptr, nullptr, nullptr, nullptr},
};

}  // namespace

const Object kModulesObject = {"modules", "the kernel target's module sets, under the service lock", kModuleActions};
const Object kServiceObject = {"service", "the iSCSI service as a whole", kServiceActions};
const Object kSelftestObject = {"selftest", "check that the kernel target can load a target node", kSelftestActions};

}  // namespace cli
