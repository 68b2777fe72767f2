// platform/bootparam/boot_lock.cpp: the lock of U-Boot's tools.
#include "platform/bootparam/boot_lock.h"

#include <cerrno>
#include <ctime>

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

static constexpr const char *LOCK = "/var/lock/fw_printenv.lock";
static constexpr int LOCK_TRIES = 300;
static constexpr struct timespec LOCK_PAUSE = {0, 10'000'000};

int boot_lock::take() {
    fd_ = open(LOCK, O_RDWR | O_CREAT | O_NOFOLLOW | O_NOCTTY | O_CLOEXEC, 0600);
    if (fd_ < 0)
        return -errno;

    for (int tries = 0; tries < LOCK_TRIES; tries++) {
        if (flock(fd_, LOCK_EX | LOCK_NB) == 0)
            return 0;
        if (errno != EWOULDBLOCK && errno != EINTR)
            return -errno;
        (void)nanosleep(&LOCK_PAUSE, nullptr);  // A shorter pause does no harm.
    }
    return -EBUSY;
}

void boot_lock::give_back() {
    const int saved_errno = errno;
    if (fd_ >= 0)
        (void)close(fd_);  // which gives the lock back
    fd_ = -1;
    errno = saved_errno;
}
