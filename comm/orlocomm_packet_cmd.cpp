// Frames: a 32-byte header (magic, length) before every payload written to a pipe or a
// socket, and command packets, the in-memory unit a read or an extraction yields.
#include <search.h>

#include <cstdlib>
#include <cstring>

#include "comm/orlocomm_internal.h"

namespace {

const uint8_t kMagic[ORLOCOMM_MAGIC_SIZE] = {0x12, 0x18, 0x0D, 0x0E, 0x0B, 0x0E, 0x06, 0x18};

uint32_t HeaderLength(const uint8_t *header) {
    uint32_t len;
    memcpy(&len, header + 24, sizeof(len));
    return len;
}

}  // namespace

extern "C" {

ORLO_EXPORT int CreatePacket(uint8_t **out, const void *data, int len) {
    if (out == nullptr || len < 0 || (len > 0 && data == nullptr)) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    auto *buf = static_cast<uint8_t *>(calloc(1, static_cast<size_t>(len) + ORLOCOMM_HEADER_SIZE));
    if (buf == nullptr) {
        COMM_ERR("Out of memory");
        return -1;
    }
    memcpy(buf, kMagic, sizeof(kMagic));
    uint32_t n = static_cast<uint32_t>(len);
    memcpy(buf + 24, &n, sizeof(n));
    if (len > 0) memcpy(buf + ORLOCOMM_HEADER_SIZE, data, static_cast<size_t>(len));
    *out = buf;
    return len + ORLOCOMM_HEADER_SIZE;
}

ORLO_EXPORT int PacketWrite(void *channel, ORLOCOMM_WRITE_FN write, const void *data, int len) {
    if (channel == nullptr || write == nullptr || data == nullptr || len <= 0) {
        COMM_ERR("Invalid parameter channel %p, data %p, len %d", channel, data, len);
        return -1;
    }
    uint8_t *packet = nullptr;
    int total = CreatePacket(&packet, data, len);
    if (total < 0) return -1;
    int n = write(channel, packet, total);
    free(packet);
    if (n < 0) return n;
    return n - ORLOCOMM_HEADER_SIZE;
}

ORLO_EXPORT int PacketRead(void *channel, ORLOCOMM_READ_FN read, void *buf, int size) {
    if (channel == nullptr || read == nullptr || buf == nullptr || size <= 0) {
        COMM_ERR("Invalid parameter channel %p, buf %p, size %d", channel, buf, size);
        return 0;
    }
    uint8_t header[ORLOCOMM_HEADER_SIZE];
    if (read(channel, header, ORLOCOMM_HEADER_SIZE) != ORLOCOMM_HEADER_SIZE) return 0;
    if (memcmp(header, kMagic, sizeof(kMagic)) != 0) {
        COMM_ERR("Not match header");
        return 0;
    }
    uint32_t len = HeaderLength(header);
    // Bounded before it is trusted: no message of the engine is larger than a data buffer.
    if (len == 0 || len > static_cast<uint32_t>(orlocomm::kMaxPayload)) {
        COMM_ERR("Frame of %u bytes refused (at most %d)", len, orlocomm::kMaxPayload);
        return 0;
    }
    auto *payload = static_cast<uint8_t *>(malloc(len));
    if (payload == nullptr) {
        COMM_ERR("Out of memory");
        return 0;
    }
    int got = read(channel, payload, static_cast<int>(len));
    if (got < 0) got = 0;
    if (static_cast<uint32_t>(got) < len) COMM_ERR("Not complete packet(s) request %d, read %d", static_cast<int>(len), got);
    int copy = got < size ? got : size;
    memcpy(buf, payload, static_cast<size_t>(copy));
    free(payload);
    return copy;
}

ORLO_EXPORT ORLOCOMM_CMD_PACKET *CreateCmdPacket(const void *data, int len) {
    if (len < 0 || (len > 0 && data == nullptr)) {
        COMM_ERR("Invalid parameter");
        return nullptr;
    }
    auto *p = static_cast<ORLOCOMM_CMD_PACKET *>(calloc(1, sizeof(ORLOCOMM_CMD_PACKET)));
    if (p == nullptr) {
        COMM_ERR("Out of memory");
        return nullptr;
    }
    p->data = static_cast<uint8_t *>(malloc(len > 0 ? static_cast<size_t>(len) : 1));
    if (p->data == nullptr) {
        free(p);
        COMM_ERR("Out of memory");
        return nullptr;
    }
    if (len > 0) memcpy(p->data, data, static_cast<size_t>(len));
    p->len = static_cast<uint32_t>(len);
    p->next = p->prev = p;
    return p;
}

ORLO_EXPORT void FreeCmdPacket(ORLOCOMM_CMD_PACKET *p) {
    if (p == nullptr) return;
    free(p->data);
    free(p);
}

// Splits a received buffer into command packets appended to queue.  The cursor stays on the
// first frame of the buffer: every round takes the first frame's payload and counts its
// size off the remainder, so a buffer of k equal frames yields k copies of the first one.
// Callers hand it buffers that hold one frame.
ORLO_EXPORT int ExtractPacket(const void *buf, int len, ORLOCOMM_CMD_PACKET *queue) {
    if (buf == nullptr || len <= 0 || queue == nullptr) {
        COMM_ERR(">>>>>>>>>> Fail to extract packet, %d", -1);
        return -1;
    }
    const auto *bytes = static_cast<const uint8_t *>(buf);
    if (len < ORLOCOMM_MAGIC_SIZE || memcmp(bytes, kMagic, sizeof(kMagic)) != 0) {
        COMM_ERR("Not match header");
        COMM_ERR(">>>>>>>>>> Fail to extract packet, %d", -1);
        return -1;
    }
    if (len < ORLOCOMM_HEADER_SIZE) {
        COMM_ERR(">>>>>>>>>> Fail to extract packet, %d", -1);
        return -1;
    }
    uint32_t first = HeaderLength(bytes);
    // The payload copied is never read past the end of the buffer.
    uint32_t avail = static_cast<uint32_t>(len - ORLOCOMM_HEADER_SIZE);
    uint32_t take = first < avail ? first : avail;
    int64_t remain = len;
    int count = 0;
    while (remain > 0) {
        ORLOCOMM_CMD_PACKET *p = CreateCmdPacket(bytes + ORLOCOMM_HEADER_SIZE, static_cast<int>(take));
        if (p == nullptr) {
            COMM_ERR(">>>>>>>>>> Fail to extract packet, %d", count);
            return -1;
        }
        insque(p, queue->prev);
        ++count;
        remain -= ORLOCOMM_HEADER_SIZE + static_cast<int64_t>(first);
    }
    if (remain < 0) COMM_INFO("Warnning remain %d bytes", static_cast<int>(remain < INT32_MIN ? INT32_MIN : remain));
    COMM_INFO(">>>>>>>>>> extract %d packet(s)", count);
    return count;
}

}  // extern "C"
