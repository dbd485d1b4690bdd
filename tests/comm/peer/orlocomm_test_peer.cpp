// orlocomm-test-peer: an application for the engine tests that run inside network
// namespaces, where the test process itself cannot be.
//
//   orlocomm-test-peer --root DIR serve NAME
//       registers NAME and answers every message with its bytes XOR 0x5A; prints
//       "broken N" for a route that broke; ends when its engine stops or goes
//   orlocomm-test-peer --root DIR stream HOST SERVICE COUNT [PROGRESS_FILE]
//       connects and sends COUNT messages of sizes 1..4012, each answered and every byte
//       checked; writes how many went through to PROGRESS_FILE every 100 messages
//
// Exit status of stream: 0 all checked, 3 a route broke (and a send after it failed),
// 4 a send failed, 5 an answer differed, 6 no connection, 7 no answer, 8 no engine.
#include <fcntl.h>
#include <syslog.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "orlocomm.h"

namespace {

int SizeOf(long i) { return 1 + static_cast<int>((i * 1999) % MAX_DATA_PACKETS); }

void Fill(std::vector<uint8_t> *b, long i, int size) {
    b->resize(static_cast<size_t>(size));
    for (int j = 0; j < size; ++j) (*b)[static_cast<size_t>(j)] = static_cast<uint8_t>(i * 31 + j * 7 + (i >> 8));
}

void Progress(const char *path, long n) {
    if (path == nullptr) return;
    std::string tmp = std::string(path) + ".tmp";
    FILE *f = fopen(tmp.c_str(), "w");
    if (f == nullptr) return;
    fprintf(f, "%ld\n", n);
    fclose(f);
    rename(tmp.c_str(), path);
}

int Serve(PORLOCOMM comm) {
    PORLOCOMM_EVLP e = CreateOrloCommEvlp();
    std::vector<uint8_t> out;
    for (;;) {
        int n = CommRecvEvlp(comm, e);
        if (n < 0) {
            int index = DeCryptBrokenAppFD(n);
            if (index < 0) break;
            printf("broken %d\n", index);
            fflush(stdout);
            continue;
        }
        int len = CommGetEvlpDataLen(e);
        const auto *in = static_cast<const uint8_t *>(CommGetEvlpData(e));
        out.assign(in, in + len);
        for (uint8_t &b : out) b ^= 0x5A;
        CommRetEvlp(comm, e, out.data(), len);
    }
    ReleaseOrloCommEvlp(e);
    printf("engine gone\n");
    return 0;
}

int Stream(PORLOCOMM comm, const char *host, const char *service, long count, const char *progress) {
    int index = OrloCommConnect(comm, host, service);
    if (index < 0) {
        printf("no connection\n");
        return 6;
    }
    std::vector<uint8_t> payload;
    std::vector<uint8_t> reply(ORLOCOMM_MSG_BUF_SIZE);
    for (long i = 0; i < count; ++i) {
        int size = SizeOf(i);
        Fill(&payload, i, size);
        if (CommSendMessage(comm, index, payload.data(), size) != size) {
            printf("send %ld failed\n", i);
            return 4;
        }
        int n = AppRecvMessageTimed(comm->app, reply.data(), static_cast<int>(reply.size()), 20000);
        if (n == 0) {
            printf("no answer to %ld\n", i);
            return 7;
        }
        if (n < 0) {
            printf("broken route %d after %ld\n", DeCryptBrokenAppFD(n), i);
            if (CommSendMessage(comm, index, payload.data(), size) < 0) printf("send after break failed\n");
            fflush(stdout);
            return 3;
        }
        const auto *d = reinterpret_cast<const ORLOCOMM_DATA_MSG *>(reply.data());
        if (static_cast<int>(d->length) != size) {
            printf("answer %ld has %u bytes, %d sent\n", i, d->length, size);
            return 5;
        }
        for (int j = 0; j < size; ++j)
            if ((d->data[j] ^ 0x5A) != payload[static_cast<size_t>(j)]) {
                printf("answer %ld differs at byte %d\n", i, j);
                return 5;
            }
        if ((i + 1) % 100 == 0) Progress(progress, i + 1);
    }
    printf("ok %ld\n", count);
    OrloCommDisconnect(comm, index);
    return 0;
}

}  // namespace

int main(int argc, char **argv) {
    if (argc < 5 || strcmp(argv[1], "--root") != 0) {
        fprintf(stderr, "usage: orlocomm-test-peer --root DIR serve NAME | stream HOST SERVICE COUNT [PROGRESS]\n");
        return 2;
    }
    setenv("ORLO_SYSROOT", argv[2], 1);
    OrloCommSetLogMask(LOG_UPTO(LOG_WARNING));
    setvbuf(stdout, nullptr, _IOLBF, 0);
    std::string mode = argv[3];
    PORLOCOMM comm = CreateOrloComm(mode == "serve" ? argv[4] : "streamer");
    if (comm == nullptr) {
        printf("no engine\n");
        return 8;
    }
    int status = 2;
    if (mode == "serve")
        status = Serve(comm);
    else if (mode == "stream" && argc >= 7)
        status = Stream(comm, argv[4], argv[5], atol(argv[6]), argc > 7 ? argv[7] : nullptr);
    DestroyOrloComm(comm);
    return status;
}
