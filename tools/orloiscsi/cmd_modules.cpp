// orloiscsi modules, service and selftest: the kernel target's module sets, the
// target-core generation in use, starting and stopping the whole service, and the
// kernel self-test.
#include <strings.h>

#include <cstdio>
#include <string>

#include "cli.h"
#include "orloiscsi_base.h"
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

int RunModules(const std::string &word, uint32_t (*op)(int), const char *done) {
    int set = 0;
    if (!ParseSet(word, &set)) return UsageError("'" + word + "' is not a module set (iscsi, vhost, tcm, loopback)");
    uint32_t ret = op(set);
    if (ret != 0) return Fail(ret);
    printf("%s module set %s\n", done, word.c_str());
    return 0;
}

const char *VersionName(unsigned int v) { return v == 4 ? "lio4x" : v == 0 ? "none" : "lio"; }

int RunVersion(const std::string &set, bool given) {
    if (given) {
        // The generation is named as the defaults file names it.
        unsigned int version = strcasecmp(set.c_str(), "lio4x") == 0 ? 4 : strcasecmp(set.c_str(), "lio") == 0 ? 2 : 0;
        if (version == 0) return UsageError("--set takes lio or lio4x");
        uint32_t ret = ORLOiSCSIConfigfsChangeCurrentVersion(version);
        if (ret != 0) return Fail(ret);
    }
    unsigned int v = ORLOiSCSIGetLioVersion();
    if (Ctx().json)
        PrintJson(Json::Object().SetUint("version", v).SetStr("name", VersionName(v)));
    else
        printf("%u %s\n", v, VersionName(v));
    return 0;
}

int RunStep(uint32_t (*op)(void), const char *done) {
    uint32_t ret = op();
    if (ret != 0) return Fail(ret);
    printf("%s\n", done);
    return 0;
}

int RunInUse() {
    bool inUse = false;
    uint32_t ret = ORLOiSCSIServiceIsInUse(&inUse);
    if (ret != 0) return Fail(ret);
    if (Ctx().json)
        PrintJson(Json::Object().SetBool("in_use", inUse));
    else
        printf("%s\n", inUse ? "in use" : "not in use");
    return 0;
}

int RunSelftest() {
    uint32_t ret = ORLOiSCSILioTargetDummyTest();
    if (ret != 0) return Fail(ret);
    printf("self-test passed: a trial target node loaded into the kernel target\n");
    return 0;
}

}  // namespace

void RegisterService(CLI::App *root) {
    static std::string set, versionSet;
    CLI::App *obj = AddObject(root, "service", "the iSCSI service as a whole");
    static CLI::Option *setOpt = nullptr;
    CLI::App *act = AddAction(obj, "version",
                              "the target-core generation in use: 4 (lio4x), 2 (lio) or 0 (no iSCSI target); --set "
                              "switches to another (stops the service, swaps the modules, records it in the defaults "
                              "file and starts again)",
                              [] { return RunVersion(versionSet, setOpt->count() > 0); });
    setOpt = AddValue(act, "--set", "lio|lio4x", &versionSet, "switch to this generation");
    AddAction(obj, "start", "load the iSCSI modules and every LUN, and start every enabled target", [] {
        return RunStep(ORLOiSCSIStartAll, "started: modules in, LUNs loaded, every enabled target running");
    });
    AddAction(obj, "stop", "take every target node out of the kernel (the files are kept)",
              [] { return RunStep(ORLOiSCSIStopAll, "stopped: every target node is out of the kernel"); });
    AddAction(obj, "total-stop",
              "stop, take every backstore out, and remove the module sets (iscsi, loopback, vhost, tcm)", [] {
                  return RunStep(ORLOiSCSITotallyStopAndUnload,
                                 "stopped and unloaded: no target node, backstore or module left");
              });
    AddAction(obj, "in-use", "whether the configuration holds any LUN or target", RunInUse);

    obj = AddObject(root, "modules", "the kernel target's module sets, under the service lock");
    act = AddAction(obj, "load", "insert the target-core modules and then the set's own (modules already in are kept)",
                    [] { return RunModules(set, ORLOiSCSILoadModules, "loaded"); });
    AddPositional(act, "iscsi|vhost|tcm|loopback", &set, "the module set");
    act = AddAction(obj, "unload", "remove the set's modules, last first (tcm removes the target core itself)",
                    [] { return RunModules(set, ORLOiSCSIUnloadModules, "unloaded"); });
    AddPositional(act, "iscsi|vhost|tcm|loopback", &set, "the module set");

    AddAction(root, "selftest",
              "check that the kernel target can load a target node: under the service lock, load a trial target "
              "node; the outcome is also kept in /tmp/iscsi_dummy_result",
              RunSelftest);
}

}  // namespace cli
