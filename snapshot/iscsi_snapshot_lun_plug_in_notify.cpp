// The application plug-ins of application-consistent snapshots.  Software that keeps data
// on a LUN (a database, a hypervisor) installs an executable in
// /usr/orlo/plugins/snapshot/app_consistent/; before the snapshot it is asked to quiesce
// (event 4, "pre") and afterwards to resume (event 5, "post"), each time with a JSON
// description of the LUN and the snapshot on its standard input:
//   {"lun":{"name","uuid","lid","type","root_path"},
//    "snapshot":{"name","uuid","sid","type"},"step":"quiesce"|"resume"[,"result":N]}
// A plug-in that exits non-zero, is killed or runs longer than OLIB_PLUGIN_TIMEOUT seconds
// has failed: a failed quiesce aborts the snapshot.
//
// ORLOiSCSISnapshotLunPlugInNotify(lun, snap, event, result):
//   event -1: the number of plug-ins (0: the snapshot is taken the plain way), -1 when
//             they cannot be listed;
//   event 4:  quiesce; 0, or -1 when a plug-in failed (the others are not asked);
//   event 5:  resume, with the snapshot's result; 0, or -1 when a plug-in failed (every
//             plug-in is asked).
#include <json-c/json.h>

#include <string>

#include "base/iscsi_base_internal.h"
#include "olibc.h"
#include "orloiscsi_snapshot.h"
#include "snapshot/snapshot_internal.h"

namespace {

constexpr const char kCategory[] = "snapshot";
constexpr const char kAction[] = "app_consistent";

std::string Json(const ORLOiSCSILun *lun, const ORLOiSCSISnapshot *snap, int event, int result) {
    json_object *doc = json_object_new_object();
    json_object *l = json_object_new_object();
    json_object *s = json_object_new_object();
    json_object_object_add(l, "name", json_object_new_string(lun->name));
    json_object_object_add(l, "uuid", json_object_new_string(lun->uuid));
    json_object_object_add(l, "lid", json_object_new_int(lun->lid));
    json_object_object_add(l, "type", json_object_new_string(ORLOiSCSILunTypeName(lun->type)));
    json_object_object_add(l, "root_path", json_object_new_string(lun->rootPath));
    json_object_object_add(s, "name", json_object_new_string(snap->name));
    json_object_object_add(s, "uuid", json_object_new_string(snap->uuid));
    json_object_object_add(s, "sid", json_object_new_int(snap->sid));
    json_object_object_add(s, "type", json_object_new_string(orlo::snap::TypeWord(snap->type)));
    json_object_object_add(doc, "lun", l);
    json_object_object_add(doc, "snapshot", s);
    json_object_object_add(doc, "step", json_object_new_string(event == OLIB_PLUGIN_EVENT_PRE ? "quiesce" : "resume"));
    if (event == OLIB_PLUGIN_EVENT_POST) json_object_object_add(doc, "result", json_object_new_int(result));
    std::string out = json_object_to_json_string_ext(doc, JSON_C_TO_STRING_PLAIN | JSON_C_TO_STRING_NOSLASHESCAPE);
    json_object_put(doc);
    return out;
}

}  // namespace

extern "C" ORLO_EXPORT int ORLOiSCSISnapshotLunPlugInNotify(const ORLOiSCSILun *lun, const ORLOiSCSISnapshot *snap,
                                                            int event, int result) {
    if (lun == nullptr || snap == nullptr ||
        (event != -1 && event != OLIB_PLUGIN_EVENT_PRE && event != OLIB_PLUGIN_EVENT_POST)) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    POLIB_PLUGIN plugins = nullptr;
    if (OLIBPluginSDKInit(kCategory, kAction, &plugins) != 0 || !OLIBPluginHasInit(plugins)) {
        ORLO_LOG_PLATFORM("OLIBPluginSDKInit(\"%s\", \"%s\", %p)", kCategory, kAction, static_cast<void *>(&plugins));
        return -1;
    }
    auto exit = orlo::MakeScopeExit([plugins] { OLIBPluginExit(plugins); });
    if (event == -1) return OLIBPluginCount(plugins);
    const std::string json = Json(lun, snap, event, result);
    if (OLIBPluginRun(plugins, event, json.c_str()) != 0) {
        ORLO_LOG_ERR("A snapshot plug-in failed to %s. LUN: %s, snapshot: %s", event == OLIB_PLUGIN_EVENT_PRE ? "quiesce" : "resume",
                     lun->name, snap->name);
        return -1;
    }
    return 0;
}
