// The service lock between processes: a second holder waits until the first lets go.
#include <poll.h>
#include <sys/wait.h>
#include <unistd.h>

#include "orloiscsi_base.h"
#include "orloiscsi_service.h"
#include "support/sandbox.h"

namespace service_test {
namespace {

class ServiceLock : public orlotest::SandboxTest {};

// Whether a byte arrives on fd within ms milliseconds.
bool Arrives(int fd, int ms) {
    struct pollfd p = {fd, POLLIN, 0};
    return poll(&p, 1, ms) == 1;
}

TEST_F(ServiceLock, AnotherProcessWaitsForTheGuardAndGetsTheLockOnceItIsReleased) {
    int pipefd[2];
    ASSERT_EQ(0, pipe(pipefd));
    pid_t child;
    {
        ORLOiSCSIServiceLockGuard guard;
        ASSERT_TRUE(guard.held()) << log_.Dump();
        EXPECT_TRUE(Exists("/tmp/tcm_service_state.lock"));
        child = fork();
        ASSERT_GE(child, 0);
        if (child == 0) {
            close(pipefd[0]);
            int fd = -1;
            // Waits for ever: only the parent's release lets it through.
            uint32_t ret = ORLOiSCSIServiceLock(&fd);
            char c = ret == ORLO_OK && fd >= 0 ? 'y' : 'n';
            if (write(pipefd[1], &c, 1) != 1) _exit(2);
            _exit(ORLOiSCSIServiceUnlock(&fd) == ORLO_OK && fd == -1 ? 0 : 1);
        }
        close(pipefd[1]);
        EXPECT_FALSE(Arrives(pipefd[0], 500)) << "the second process got the lock while the guard held it";
    }
    ASSERT_TRUE(Arrives(pipefd[0], 10000)) << "the second process never got the lock";
    char c = 0;
    EXPECT_EQ(1, read(pipefd[0], &c, 1));
    EXPECT_EQ('y', c);
    int status = 0;
    ASSERT_EQ(child, waitpid(child, &status, 0));
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
    close(pipefd[0]);

    // Released by the guard: taken again at once in this process, and an unlock of no
    // handle is nothing to do.
    int fd = -1;
    ASSERT_EQ(ORLO_OK, ORLOiSCSIServiceLock(&fd));
    EXPECT_GE(fd, 0);
    EXPECT_EQ(ORLO_OK, ORLOiSCSIServiceUnlock(&fd));
    EXPECT_EQ(-1, fd);
    EXPECT_EQ(ORLO_OK, ORLOiSCSIServiceUnlock(&fd));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
}

}  // namespace
}  // namespace service_test
