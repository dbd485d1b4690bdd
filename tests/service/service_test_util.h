// Shared pieces of the service tests: a simulated kernel target whose defaults file
// chooses the target-core generation, and matching of the library's exact log lines.
#ifndef ORLO_TESTS_SERVICE_SERVICE_TEST_UTIL_H
#define ORLO_TESTS_SERVICE_SERVICE_TEST_UTIL_H

#include <fcntl.h>
#include <unistd.h>

#include <regex>
#include <string>
#include <vector>

#include "service/lio_version.h"
#include "support/configfs_sim_fixture.h"

namespace service_test {

// True when one captured line is exactly "iSCSI:<file>:<line>:<func> <message>".
inline bool HasLog(const orlotest::LogCapture &log, const std::string &file, const std::string &func,
                   const std::string &message) {
    const std::string head = "iSCSI:" + file + ":";
    const std::string tail = ":" + func + " " + message;
    for (const std::string &l : log.Lines()) {
        if (l.size() <= head.size() + tail.size() || l.compare(0, head.size(), head) != 0) continue;
        if (l.compare(l.size() - tail.size(), tail.size(), tail) != 0) continue;
        std::string lineNo = l.substr(head.size(), l.size() - head.size() - tail.size());
        if (std::regex_match(lineNo, std::regex("[0-9]+"))) return true;
    }
    return false;
}

// The messages of the captured lines that start with prefix (after the line's head).
inline std::vector<std::string> Messages(const orlotest::LogCapture &log, const std::string &prefix) {
    std::vector<std::string> out;
    const std::regex head("^iSCSI:[^:]+:[0-9]+:[^ ]+ (.*)$");
    for (const std::string &l : log.Lines()) {
        std::smatch m;
        if (std::regex_match(l, m, head) && m[1].str().compare(0, prefix.size(), prefix) == 0) out.push_back(m[1]);
    }
    return out;
}

class ServiceSimTest : public orlotest::ConfigfsSimTest {
  protected:
    // The generation the defaults file names, and whether it claims RDMA.
    virtual const char *TargetType() const { return "lio4x"; }
    virtual bool Rdma() const { return false; }

    void SetUp() override {
        ConfigfsSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        std::string defaults = std::string("support_iscsi_target=\"yes\"\niscsi_target_type=\"") + TargetType() +
                               "\"\nsupport_rdma=\"" + (Rdma() ? "yes" : "no") + "\"\n";
        WriteFile("/etc.defaults/orloinfo.conf", defaults);
        orlo::LioReset();
    }
    void TearDown() override {
        orlo::LioReset();
        ConfigfsSimTest::TearDown();
    }

    // One write to a kernel attribute, as an administrator's echo does it.
    int CfgWrite(const std::string &inside, const std::string &text) {
        int fd = ::open(Cfg(inside).c_str(), O_WRONLY);
        if (fd < 0) return errno;
        ssize_t n = ::write(fd, text.data(), text.size());
        int err = n < 0 ? errno : 0;
        ::close(fd);
        return err;
    }
};

}  // namespace service_test

#endif
