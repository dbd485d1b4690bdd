// orlocomm-cat: a small client of the messaging engine, like netcat for services.
//
//   orlocomm-cat [--root DIR] --name SERVICE [--echo]
//       registers SERVICE and prints every message it receives, one per line
//       (--echo also sends each message back to whoever sent it)
//   orlocomm-cat [--root DIR] [--name NAME] --connect HOST SERVICE [--wait-reply]
//       connects to SERVICE on HOST and sends standard input line by line
//       (--wait-reply prints the answer to each line before sending the next)
//   orlocomm-cat [--root DIR] [--name NAME] --ping HOST SERVICE
//       asks where SERVICE on HOST is and prints the answer in words
//
// HOST is an IPv4 address, a host name, or localhost.  Exit status: 0 success (for --ping:
// the service exists), 1 failure (for --ping: no such service or host unreachable), 2 a
// usage mistake.
#include <signal.h>
#include <syslog.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "orlocomm.h"

namespace {

std::atomic<bool> gStop{false};
void OnSignal(int) { gStop.store(true); }

const char *PongWords(int status) {
    switch (status) {
        case ORLOCOMM_PONG_LOCAL_FOUND:
            return "the service runs on this host";
        case ORLOCOMM_PONG_LOCAL_MISSING:
            return "no such service on this host";
        case ORLOCOMM_PONG_REMOTE_FOUND:
            return "the service runs on that host";
        case ORLOCOMM_PONG_REMOTE_MISSING:
            return "no such service on that host";
        case ORLOCOMM_PONG_UNREACHABLE:
            return "that host cannot be reached";
        default:
            return "unknown answer";
    }
}

// Prints a received message's data as one line.
void PrintData(const void *data, int len) {
    fwrite(data, 1, static_cast<size_t>(len), stdout);
    if (len == 0 || static_cast<const char *>(data)[len - 1] != '\n') fputc('\n', stdout);
    fflush(stdout);
}

// A received value that says a route broke, or -1 for the engine's end.
bool ReportEvent(int n) {
    int index = DeCryptBrokenAppFD(n);
    if (index >= 0) {
        fprintf(stderr, "orlocomm-cat: route %d is broken\n", index);
        return true;
    }
    fprintf(stderr, "orlocomm-cat: the engine stopped or went away\n");
    return false;
}

int Serve(PORLOCOMM comm, bool echo) {
    PORLOCOMM_EVLP e = CreateOrloCommEvlp();
    if (e == nullptr) return 1;
    int status = 0;
    while (!gStop.load()) {
        e->buf[0] = 0;  // an envelope left empty means nothing came
        int n = CommRecvEvlpTimed(comm, e, 200);
        if (n == 0 && CommGetEvlpDataLen(e) < 0) continue;
        if (n < 0) {
            if (!ReportEvent(n)) {
                status = 1;
                break;
            }
            continue;
        }
        int len = CommGetEvlpDataLen(e);
        std::vector<char> copy(static_cast<char *>(CommGetEvlpData(e)), static_cast<char *>(CommGetEvlpData(e)) + len);
        PrintData(copy.data(), len);
        if (echo) CommRetEvlp(comm, e, copy.data(), len);
    }
    ReleaseOrloCommEvlp(e);
    return status;
}

int Connect(PORLOCOMM comm, const std::string &host, const std::string &service, bool wait_reply) {
    int index = OrloCommConnect(comm, host.c_str(), service.c_str());
    if (index < 0) {
        fprintf(stderr, "orlocomm-cat: cannot connect to %s on %s\n", service.c_str(), host.c_str());
        return 1;
    }
    std::vector<uint8_t> reply(ORLOCOMM_MSG_BUF_SIZE);
    char *line = nullptr;
    size_t cap = 0;
    ssize_t got;
    int status = 0;
    while (status == 0 && !gStop.load() && (got = getline(&line, &cap, stdin)) >= 0) {
        if (got > 0 && line[got - 1] == '\n') --got;
        // A line longer than one message travels in several.
        ssize_t off = 0;
        do {
            int chunk = static_cast<int>(got - off > MAX_DATA_PACKETS ? MAX_DATA_PACKETS : got - off);
            if (CommSendMessage(comm, index, line + off, chunk) < 0) {
                fprintf(stderr, "orlocomm-cat: sending to %s failed\n", service.c_str());
                status = 1;
                break;
            }
            off += chunk;
        } while (off < got);
        if (status == 0 && wait_reply) {
            int n = CommRecvMessage(comm, reply.data(), static_cast<int>(reply.size()));
            if (n < 0) {
                ReportEvent(n);
                status = 1;
            } else {
                const auto *d = reinterpret_cast<const ORLOCOMM_DATA_MSG *>(reply.data());
                PrintData(d->data, static_cast<int>(d->length));
            }
        }
    }
    free(line);
    OrloCommDisconnect(comm, index);
    return status;
}

int Ping(PORLOCOMM comm, const std::string &host, const std::string &service) {
    int status = 0;
    if (AppPing(comm->app, host.c_str(), service.c_str(), &status) != 0) {
        fprintf(stderr, "orlocomm-cat: no answer from the engine\n");
        return 1;
    }
    printf("0x%04x %s\n", status, PongWords(status));
    return status == ORLOCOMM_PONG_LOCAL_FOUND || status == ORLOCOMM_PONG_REMOTE_FOUND ? 0 : 1;
}

}  // namespace

int main(int argc, char **argv) {
    CLI::App app{"orlocomm-cat: talk to services through the orlocomm engine"};
    std::string root, name;
    std::vector<std::string> connect, ping;
    bool echo = false, wait_reply = false;
    app.add_option("--root", root, "work on the appliance tree under DIR (sets ORLO_SYSROOT)")->check(CLI::ExistingDirectory);
    app.add_option("--name", name, "the service name to register (default: cat-<pid>)");
    auto *c = app.add_option("--connect", connect, "connect to SERVICE on HOST and send standard input")
                  ->expected(2)
                  ->type_name("HOST SERVICE");
    auto *p = app.add_option("--ping", ping, "ask where SERVICE on HOST is")->expected(2)->type_name("HOST SERVICE");
    c->excludes(p);
    app.add_flag("--echo", echo, "with --name alone: send every message back to its sender");
    app.add_flag("--wait-reply", wait_reply, "with --connect: print one answer per line sent");
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError &e) {
        return app.exit(e) == 0 ? 0 : 2;
    }
    bool serving = connect.empty() && ping.empty();
    if (serving && name.empty()) {
        fprintf(stderr, "orlocomm-cat: say --name SERVICE, --connect HOST SERVICE or --ping HOST SERVICE\n%s",
                app.help().c_str());
        return 2;
    }
    if (!root.empty()) setenv("ORLO_SYSROOT", root.c_str(), 1);
    if (name.empty()) name = "cat-" + std::to_string(getpid());
    // The library logs to syslog; a person at a terminal wants only this program's words.
    setlogmask(LOG_UPTO(LOG_WARNING));
    OrloCommSetLogMask(LOG_UPTO(LOG_WARNING));
    struct sigaction sa;
    memset(&sa, 0, sizeof(sa));
    sa.sa_handler = OnSignal;
    sigaction(SIGINT, &sa, nullptr);
    sigaction(SIGTERM, &sa, nullptr);

    PORLOCOMM comm = CreateOrloComm(name.c_str());
    if (comm == nullptr) {
        fprintf(stderr, "orlocomm-cat: cannot join the engine (is orlocommd running%s?)\n",
                root.empty() ? "" : (" with --root " + root).c_str());
        return 1;
    }
    int status;
    if (!connect.empty())
        status = Connect(comm, connect[0], connect[1], wait_reply);
    else if (!ping.empty())
        status = Ping(comm, ping[0], ping[1]);
    else
        status = Serve(comm, echo);
    DestroyOrloComm(comm);
    return status;
}
