// Data messages (SendMsg, RecvMsg) and the command tables: the engine's message codes with
// their names and sizes, and the backup protocol's JSON commands with their handlers.
#include <cstdlib>
#include <cstring>

#include "comm/orlocomm_internal.h"

extern "C" {
// The backup protocol provides these; a row whose handler is not linked in stays null.
int HandleProtRegister(void *, void *, void *, void **) __attribute__((weak));
int HandleProtConnect(void *, void *, void *, void **) __attribute__((weak));
int HandleProtDisConnect(void *, void *, void *, void **) __attribute__((weak));
int HandleProtUnRegister(void *, void *, void *, void **) __attribute__((weak));
int HandleProtInitSnapshot(void *, void *, void *, void **) __attribute__((weak));
int HandleProtIsLunSupport(void *, void *, void *, void **) __attribute__((weak));
int HandleProtStartMirror(void *, void *, void *, void **) __attribute__((weak));
int HandleProtIsMirrorDone(void *, void *, void *, void **) __attribute__((weak));
int HandleProtDepartRelation(void *, void *, void *, void **) __attribute__((weak));
int HandleProtAbortTask(void *, void *, void *, void **) __attribute__((weak));
int HandleProtGetMirroredLun(void *, void *, void *, void **) __attribute__((weak));
int HandleProtCreateMappedTarget(void *, void *, void *, void **) __attribute__((weak));
int HandleProtDeleteLun(void *, void *, void *, void **) __attribute__((weak));
int HandleProtRestoreLun(void *, void *, void *, void **) __attribute__((weak));
int HandleProtDepartDone(void *, void *, void *, void **) __attribute__((weak));
int HandleProtStartTPTask(void *, void *, void *, void **) __attribute__((weak));
int HandleProtTPTaskReady(void *, void *, void *, void **) __attribute__((weak));
int HandleProtPleaseWait(void *, void *, void *, void **) __attribute__((weak));

const ORLOCOMM_CMD_PATTERN pCommCmdPatterns[] = {
    {0x10, "Conn", 212},      {0x11, "ConnAck", 216},   {0x12, "RConn", 212},
    {0x13, "RConnAck", 216},  {0x14, "Register", 40},   {0x15, "Regisack", 72},
    {0x16, "UnRegister", 72}, {0x17, "UnRegisack", 72}, {0x18, "GetAppIP", 68},
    {0x19, "GetAppIPAck", 12}, {0x20, "SendMsg", 0},    {0x21, "RecvMsg", 0},
    {0x30, "Bind", 212},      {0x31, "Bond", 212},      {0x32, "Band", 212},
    {0x33, "UBind", 212},     {0x34, "UBond", 212},     {0x35, "UBand", 212},
    {0x36, "HostNty", 212},   {0x37, "HostIPs", 220},   {0x40, "Ping", 216},
    {0x41, "Pong", 216},      {0x01, "ABroken", 212},   {0x50, "SStop", 212},
    {-1, "Exception", 212},   {0, nullptr, 0},
};

const ORLOCOMM_PROT_PATTERN pCmdPatterns[] = {
    {1, "register", HandleProtRegister},
    {2, "connect", HandleProtConnect},
    {3, "disconnect", HandleProtDisConnect},
    {4, "unregister", HandleProtUnRegister},
    {5, "init_snapshot", HandleProtInitSnapshot},
    {6, "is_lun_supported", HandleProtIsLunSupport},
    {7, "start_mirror", HandleProtStartMirror},
    {8, "is_mirror_done", HandleProtIsMirrorDone},
    {9, "depart_relation", HandleProtDepartRelation},
    {10, "abort_task", HandleProtAbortTask},
    {11, "get_mirrored_lun", HandleProtGetMirroredLun},
    {12, "create_mapped_target", HandleProtCreateMappedTarget},
    {13, "delete_lun", HandleProtDeleteLun},
    {14, "restore_lun", HandleProtRestoreLun},
    {15, "depart_done", HandleProtDepartDone},
    {16, "start_tp_task", HandleProtStartTPTask},
    {17, "tp_task_ready", HandleProtTPTaskReady},
    {18, "please_wait", HandleProtPleaseWait},
    {0, nullptr, nullptr},
};

}  // extern "C"

namespace {

// Which codes carry the routed layout (their addresses are dumped) and which are control
// messages; kept beside pCommCmdPatterns, in its order.
struct CmdKind {
    int32_t code;
    bool routed;
    bool control;
};
const CmdKind kCmdKinds[] = {
    {0x10, true, false},  {0x11, true, false},  {0x12, true, false},  {0x13, true, false},
    {0x14, false, true},  {0x15, false, true},  {0x16, false, true},  {0x17, false, true},
    {0x18, false, true},  {0x19, false, true},  {0x20, false, false}, {0x21, false, false},
    {0x30, true, true},   {0x31, true, true},   {0x32, true, true},   {0x33, true, true},
    {0x34, true, true},   {0x35, true, true},   {0x36, true, false},  {0x37, true, false},
    {0x40, true, true},   {0x41, true, true},   {0x01, true, false},  {0x50, true, false},
    {-1, true, false},
};

const ORLOCOMM_CMD_PATTERN *FindPattern(const void *msg) {
    if (msg == nullptr) return nullptr;
    int32_t code = static_cast<int8_t>(*static_cast<const uint8_t *>(msg));
    for (const ORLOCOMM_CMD_PATTERN *p = pCommCmdPatterns; p->name != nullptr; ++p)
        if (p->code == code) return p;
    return nullptr;
}

const CmdKind *FindKind(const void *msg) {
    if (msg == nullptr) return nullptr;
    int32_t code = static_cast<int8_t>(*static_cast<const uint8_t *>(msg));
    for (const CmdKind &k : kCmdKinds)
        if (k.code == code) return &k;
    return nullptr;
}

uint8_t *FillDataPacket(uint8_t *buf, int code, const char *from_uuid, const char *to_uuid, const void *data,
                        int len) {
    if (data == nullptr || len < 0 || len > MAX_DATA_PACKETS || from_uuid == nullptr || to_uuid == nullptr) {
        COMM_ERR("Invalid parameter");
        return nullptr;
    }
    uint8_t *msg = buf != nullptr ? buf : static_cast<uint8_t *>(malloc(ORLOCOMM_MSG_BUF_SIZE));
    if (msg == nullptr) {
        COMM_ERR("Out of memory");
        return nullptr;
    }
    memset(msg, 0, ORLOCOMM_MSG_BUF_SIZE);
    msg[0] = static_cast<uint8_t>(code);
    msg[1] = 1;
    msg[2] = 1;
    auto *d = reinterpret_cast<ORLOCOMM_DATA_MSG *>(msg);
    orlocomm::CopyName(d->from_uuid, from_uuid);
    orlocomm::CopyName(d->to_uuid, to_uuid);
    d->length = static_cast<uint32_t>(len);
    memcpy(d->data, data, static_cast<size_t>(len));
    return msg;
}

void Bounded(char *dst, const char *src) {
    memcpy(dst, src, ORLOCOMM_NAME_SIZE);
    dst[ORLOCOMM_NAME_SIZE - 1] = '\0';
}

}  // namespace

namespace orlocomm {

int MsgCode(const void *msg) { return msg == nullptr ? -1 : *static_cast<const uint8_t *>(msg); }

bool IsKnownCode(int code) {
    int32_t c = static_cast<int8_t>(static_cast<uint8_t>(code));
    for (const ORLOCOMM_CMD_PATTERN *p = pCommCmdPatterns; p->name != nullptr; ++p)
        if (p->code == c) return true;
    return false;
}

int TableSize(int code) {
    int32_t c = static_cast<int8_t>(static_cast<uint8_t>(code));
    for (const ORLOCOMM_CMD_PATTERN *p = pCommCmdPatterns; p->name != nullptr; ++p)
        if (p->code == c) return p->size;
    return -1;
}

}  // namespace orlocomm

extern "C" {

ORLO_EXPORT uint8_t *CreateSendDataPacket(uint8_t *buf, const char *from_uuid, const char *to_uuid, const void *data,
                                          int len) {
    return FillDataPacket(buf, ORLOCOMM_OP_SENDMSG, from_uuid, to_uuid, data, len);
}

ORLO_EXPORT uint8_t *CreateRecvDataPacket(uint8_t *buf, const char *from_uuid, const char *to_uuid, const void *data,
                                          int len) {
    return FillDataPacket(buf, ORLOCOMM_OP_RECVMSG, from_uuid, to_uuid, data, len);
}

ORLO_EXPORT int ExtractFromUUIDByDataPacket(const void *msg, char *out) {
    if (msg == nullptr || out == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    memcpy(out, static_cast<const ORLOCOMM_DATA_MSG *>(msg)->from_uuid, ORLOCOMM_NAME_SIZE);
    return 0;
}

ORLO_EXPORT int ExtractToUUIDByDataPacket(const void *msg, char *out) {
    if (msg == nullptr || out == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    memcpy(out, static_cast<const ORLOCOMM_DATA_MSG *>(msg)->to_uuid, ORLOCOMM_NAME_SIZE);
    return 0;
}

ORLO_EXPORT int FillInFromUUID(void *msg, const char *uuid) {
    if (msg == nullptr || uuid == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    memcpy(static_cast<ORLOCOMM_DATA_MSG *>(msg)->from_uuid, uuid, ORLOCOMM_NAME_SIZE);
    return 0;
}

ORLO_EXPORT int FillInToUUID(void *msg, const char *uuid) {
    if (msg == nullptr || uuid == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    memcpy(static_cast<ORLOCOMM_DATA_MSG *>(msg)->to_uuid, uuid, ORLOCOMM_NAME_SIZE);
    return 0;
}

ORLO_EXPORT const char *GetCommCmdNameExt(const void *msg) {
    const ORLOCOMM_CMD_PATTERN *p = FindPattern(msg);
    return p == nullptr ? nullptr : p->name;
}

ORLO_EXPORT int GetCommCmdDetail(const void *msg) {
    if (msg == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    const ORLOCOMM_CMD_PATTERN *p = FindPattern(msg);
    const CmdKind *k = FindKind(msg);
    if (p == nullptr || k == nullptr) {
        COMM_ERR("Unrecognized opcode 0x%x", orlocomm::MsgCode(msg));
        return -1;
    }
    if (!k->routed) {
        COMM_INFO("%s is not a routable Msg with %d bytes", p->name, p->size);
        return 0;
    }
    const auto *r = static_cast<const ORLOCOMM_ROUTE_MSG *>(msg);
    char host[ORLOCOMM_NAME_SIZE], name[ORLOCOMM_NAME_SIZE], uuid[ORLOCOMM_NAME_SIZE];
    COMM_INFO("%s Msg should be %d bytes", p->name, p->size);
    Bounded(host, r->src_host);
    Bounded(name, r->src_id.service_name);
    Bounded(uuid, r->src_id.uuid);
    COMM_INFO("From %s, service_name %s, owner %d, uuid %s @host %s", orlocomm::IpText(r->src_ip).c_str(), name,
              r->src_id.owner, uuid, host);
    Bounded(host, r->dst_host);
    Bounded(name, r->dst_id.service_name);
    Bounded(uuid, r->dst_id.uuid);
    COMM_INFO("To   %s, service_name %s, owner %d, uuid %s @host %s", orlocomm::IpText(r->dst_ip).c_str(), name,
              r->dst_id.owner, uuid, host);
    return 0;
}

ORLO_EXPORT int IsControlMsg(const void *msg) {
    const CmdKind *k = FindKind(msg);
    return k != nullptr && k->control ? 1 : 0;
}

}  // extern "C"
