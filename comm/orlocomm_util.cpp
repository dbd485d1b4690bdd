// Small helpers shared by the engine's files: names, addresses, clocks, packet queues and
// the engine's log mask.
#include <search.h>
#include <time.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "comm/orlocomm_internal.h"

std::atomic<int> gOrloCommLogMask{LOG_UPTO(LOG_DEBUG)};

extern "C" ORLO_EXPORT void OrloCommSetLogMask(int mask) { gOrloCommLogMask.store(mask); }

namespace orlocomm {

int64_t NowMs() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<int64_t>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

void CopyName(char *dst, const char *src) {
    memset(dst, 0, ORLOCOMM_NAME_SIZE);
    if (src != nullptr) memcpy(dst, src, strnlen(src, ORLOCOMM_NAME_SIZE - 1));
}

std::string IpText(uint32_t ip) {
    const auto *b = reinterpret_cast<const uint8_t *>(&ip);
    char buf[16];
    snprintf(buf, sizeof(buf), "%d.%d.%d.%d", b[0], b[1], b[2], b[3]);
    return buf;
}

void FillRouteHeader(uint8_t *msg, int code) {
    msg[0] = static_cast<uint8_t>(code);
    msg[1] = 1;
    msg[2] = 1;
    msg[3] = 0;
}

void FillHostAddr(uint32_t *ip_field, char *name_field, const ORLOCOMM_HOST *host) {
    if (host == nullptr) return;
    MutexGuard g(const_cast<pthread_mutex_t *>(&host->mutex));
    *ip_field = host->ip_count > 0 ? host->ips[0] : 0;
    CopyName(name_field, host->name);
}

uint8_t *NewZeroed(size_t size) {
    auto *p = static_cast<uint8_t *>(calloc(1, size));
    if (p == nullptr) COMM_ERR("Out of memory");
    return p;
}

void QueueInit(ORLOCOMM_CMD_PACKET *head) {
    head->next = head->prev = head;
    head->len = 0;
    head->data = nullptr;
}

bool QueueEmpty(const ORLOCOMM_CMD_PACKET *head) { return head->next == head; }

void QueueAppend(ORLOCOMM_CMD_PACKET *head, ORLOCOMM_CMD_PACKET *p) { insque(p, head->prev); }

ORLOCOMM_CMD_PACKET *QueuePopFront(ORLOCOMM_CMD_PACKET *head) {
    if (QueueEmpty(head)) return nullptr;
    ORLOCOMM_CMD_PACKET *p = head->next;
    remque(p);
    p->next = p->prev = p;
    return p;
}

void QueueFreeAll(ORLOCOMM_CMD_PACKET *head) {
    while (ORLOCOMM_CMD_PACKET *p = QueuePopFront(head)) FreeCmdPacket(p);
}

}  // namespace orlocomm
