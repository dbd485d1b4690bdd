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

int RunInfo(const Context &ctx, const Args &args) {
    if (args.size() != 1) return Usage(kEpObject, kEpObject.actions[0]);
    ORLOiSCSIEpInfo info;
    uint32_t ret = ORLOiSCSIEpInfoGet(args[0].c_str(), &info);
    if (ret != ORLO_OK) return Fail(ret);
    if (ctx.json) {
        printf("{\"volume\":%s,\"exists\":%s,\"extent_size\":%" PRIu32 ",\"extent_shift\":%" PRIu32
               ",\"total_extents\":%" PRIu64 ",\"free_extents\":%" PRIu64 ",\"used_bytes\":%" PRIu64
               ",\"uuid\":%s,\"enabled\":%s,\"unmap_enabled\":%s,\"rod_enabled\":%s}\n",
               JsonQuote(args[0]).c_str(), info.exists ? "true" : "false", info.extentSize, info.extentShift,
               info.totalExtents, info.freeExtents, info.usedBytes, JsonQuote(info.uuid).c_str(),
               info.enabled ? "true" : "false", info.unmapEnabled ? "true" : "false",
               info.rodEnabled ? "true" : "false");
        return 0;
    }
    if (!info.exists) {
        printf("volume:       %s\npool:         none\n", args[0].c_str());
        return 0;
    }
    printf("volume:       %s\n", args[0].c_str());
    printf("pool uuid:    %s\n", info.uuid);
    printf("extent size:  %" PRIu32 " bytes (shift %" PRIu32 ")\n", info.extentSize, info.extentShift);
    printf("extents:      %" PRIu64 " total, %" PRIu64 " free\n", info.totalExtents, info.freeExtents);
    printf("used space:   %" PRIu64 " bytes\n", info.usedBytes);
    printf("state:        %s (unmap %s, ROD %s)\n", info.enabled ? "on" : "off", info.unmapEnabled ? "on" : "off",
           info.rodEnabled ? "on" : "off");
    return 0;
}

int RunHeader(const Context &ctx, const Args &args) {
    if (args.size() != 1) return Usage(kEpObject, kEpObject.actions[1]);
    ORLOiSCSIEpFileHeaderInfo h;
    uint32_t ret = ORLOiSCSIEpFileHeaderDecode(args[0].c_str(), &h);
    if (ret != ORLO_OK) return Fail(ret);
    if (ctx.json) {
        printf("{\"file\":%s,\"checksum\":%" PRIu32 ",\"checksum_computed\":%" PRIu32
               ",\"checksum_ok\":%s,\"version\":%" PRIu32 ",\"magic_ok\":%s,\"file_type\":%" PRIu32
               ",\"file_type_name\":%s,\"uuid\":%s,\"head_size\":%" PRIu32 ",\"create_time\":%" PRIu32
               ",\"type_header_checksum_ok\":%s}\n",
               JsonQuote(args[0]).c_str(), h.checksumStored, h.checksumComputed, h.checksumOk ? "true" : "false",
               h.version, h.magicOk ? "true" : "false", h.fileType, JsonQuote(FileTypeName(h.fileType)).c_str(),
               JsonQuote(h.uuid).c_str(), h.headSize, h.createTime,
               !h.typeHeaderPresent ? "null" : h.typeChecksumOk ? "true" : "false");
        return 0;
    }
    printf("file:         %s\n", args[0].c_str());
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

int RunJournal(const Context &, const Args &args) {
    if (args.size() != 1 || args[0] != "create") return Usage(kEpObject, kEpObject.actions[2]);
    uint32_t ret = ORLOiSCSIEpJournalFileCreate();
    if (ret != ORLO_OK) return Fail(ret);
    char root[4096];
    if (ORLOiSCSIEpJournalRootPathGet(root, sizeof(root), false) == 0) printf("journal: %s/EP_JNL\n", root);
    return 0;
}

const Action kActions[] = {
    {"info", "VOLUME", "the pool of a volume (/volumeN): extent size, used space, state in the kernel", RunInfo},
    {"header", "FILE", "decode an extent-pool file's header and check its checksum (exit 3 when damaged)",
     RunHeader},
    {"journal", "create", "make the extent-pool journal under its root path", RunJournal},
    {nullptr, nullptr, nullptr, nullptr},
};

}  // namespace

const Object kEpObject = {"ep", "the extent pool behind advanced LUNs", kActions};

}  // namespace cli
