// orloiscsi ep: the extent pool behind advanced LUNs.
#include <cinttypes>
#include <cstdio>
#include <string>

#include "cli.h"
#include "orloiscsi_base.h"
#include "orloiscsi_ep.h"

namespace cli {

namespace {

const char *FileTypeName(uint32_t type) {
    static const char *const kNames[] = {"unknown", "table", "free index", "data", "map", "journal"};
    return type < sizeof(kNames) / sizeof(kNames[0]) ? kNames[type] : "unknown";
}

int RunInfo(const std::string &volume) {
    ORLOiSCSIEpInfo info;
    uint32_t ret = ORLOiSCSIEpInfoGet(volume.c_str(), &info);
    if (ret != ORLO_OK) return Fail(ret);
    if (Ctx().json) {
        PrintJson(Json::Object()
                      .SetStr("volume", volume)
                      .SetBool("exists", info.exists)
                      .SetUint("extent_size", info.extentSize)
                      .SetUint("extent_shift", info.extentShift)
                      .SetUint("total_extents", info.totalExtents)
                      .SetUint("free_extents", info.freeExtents)
                      .SetUint("used_bytes", info.usedBytes)
                      .SetStr("uuid", info.uuid)
                      .SetBool("enabled", info.enabled)
                      .SetBool("unmap_enabled", info.unmapEnabled)
                      .SetBool("rod_enabled", info.rodEnabled));
        return 0;
    }
    if (!info.exists) {
        printf("volume:       %s\npool:         none\n", volume.c_str());
        return 0;
    }
    printf("volume:       %s\n", volume.c_str());
    printf("pool uuid:    %s\n", info.uuid);
    printf("extent size:  %" PRIu32 " bytes (shift %" PRIu32 ")\n", info.extentSize, info.extentShift);
    printf("extents:      %" PRIu64 " total, %" PRIu64 " free\n", info.totalExtents, info.freeExtents);
    printf("used space:   %" PRIu64 " bytes\n", info.usedBytes);
    printf("state:        %s (unmap %s, ROD %s)\n", info.enabled ? "on" : "off", info.unmapEnabled ? "on" : "off",
           info.rodEnabled ? "on" : "off");
    return 0;
}

int RunHeader(const std::string &file) {
    ORLOiSCSIEpFileHeaderInfo h;
    uint32_t ret = ORLOiSCSIEpFileHeaderDecode(file.c_str(), &h);
    if (ret != ORLO_OK) return Fail(ret);
    if (Ctx().json) {
        PrintJson(Json::Object()
                      .SetStr("file", file)
                      .SetUint("checksum", h.checksumStored)
                      .SetUint("checksum_computed", h.checksumComputed)
                      .SetBool("checksum_ok", h.checksumOk)
                      .SetUint("version", h.version)
                      .SetBool("magic_ok", h.magicOk)
                      .SetUint("file_type", h.fileType)
                      .SetStr("file_type_name", FileTypeName(h.fileType))
                      .SetStr("uuid", h.uuid)
                      .SetUint("head_size", h.headSize)
                      .SetUint("create_time", h.createTime)
                      .Set("type_header_checksum_ok", h.typeHeaderPresent ? Json::Bool(h.typeChecksumOk) : Json::Null()));
        return 0;
    }
    printf("file:         %s\n", file.c_str());
    printf("checksum:     0x%08" PRIX32 " (%s; computed 0x%08" PRIX32 ")\n", h.checksumStored,
           h.checksumOk ? "good" : "BAD", h.checksumComputed);
    printf("version:      0x%08" PRIX32 "\n", h.version);
    printf("magic:        0x%08" PRIX32 " 0x%08" PRIX32 " (%s)\n", h.magic0, h.magic1, h.magicOk ? "good" : "BAD");
    printf("file type:    %" PRIu32 " (%s)\n", h.fileType, FileTypeName(h.fileType));
    printf("uuid:         %s\n", h.uuid);
    printf("head size:    %" PRIu32 "\n", h.headSize);
    printf("created:      %" PRIu32 "\n", h.createTime);
    if (h.typeHeaderPresent)
        printf("type header:  checksum 0x%08" PRIX32 " (%s)\n", h.typeChecksumStored,
               h.typeChecksumOk ? "good" : "BAD");
    // A damaged header is worth an exit status of its own to scripts.
    return h.checksumOk && h.magicOk ? 0 : 3;
}

int RunJournalCreate() {
    uint32_t ret = ORLOiSCSIEpJournalFileCreate();
    if (ret != ORLO_OK) return Fail(ret);
    char root[4096];
    if (ORLOiSCSIEpJournalRootPathGet(root, sizeof(root), false) == 0) printf("journal: %s/EP_JNL\n", root);
    return 0;
}

}  // namespace

void RegisterEp(CLI::App *root) {
    static std::string volume, file, word;
    CLI::App *obj = AddObject(root, "ep", "the extent pool behind advanced LUNs");
    CLI::App *act = AddAction(obj, "info", "the pool of a volume (/volumeN): extent size, used space, state in the kernel",
                              [] { return RunInfo(volume); });
    AddPositional(act, "VOLUME", &volume, "the data volume, /volumeN");
    act = AddAction(obj, "header", "decode an extent-pool file's header and check its checksum (exit 3 when damaged)",
                    [] { return RunHeader(file); });
    AddPositional(act, "FILE", &file, "an extent-pool file (appliance path)");
    act = AddAction(obj, "journal", "make the extent-pool journal under its root path", [] {
        if (word != "create") return UsageError("the only journal action is 'create'");
        return RunJournalCreate();
    });
    AddPositional(act, "create", &word, "");
}

}  // namespace cli
