// tests/unit/platform/policy_store_clock_test.cpp: that files are read no more often than they have
// to be, and no less, whatever the clock does.
#include <climits>
#include <ctime>
#include <string>

#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include "tests/unit/platform/policy_store_fixture.h"

// How often one of the files was opened since the last count.
class open_count {
  public:
    explicit open_count(const std::string &path) : fd_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
        EXPECT_GE(inotify_add_watch(fd_, path.c_str(), IN_OPEN), 0);
    }
    ~open_count() { (void)close(fd_); }
    open_count(const open_count &) = delete;
    open_count &operator=(const open_count &) = delete;

    // Asked after each opening: the kernel counts those that follow each other as one.
    bool happened() const {
        char events[sizeof(struct inotify_event) + NAME_MAX + 1];
        return read(fd_, events, sizeof events) > 0;
    }

  private:
    int fd_;
};

class PolicyStoreClock : public PolicyStore {
  protected:
    // Of that many calls, in how many any of the three files was opened.
    int readings(int calls, const std::string &answer) {
        const open_count policy(policy_);
        const open_count passwd(passwd_);
        const open_count group(group_);
        int count = 0;
        for (int i = 0; i < calls; i++) {
            EXPECT_EQ(ask(701), answer);
            // Each of them is asked, so that nothing is left for the next time.
            const bool opened[] = {policy.happened(), passwd.happened(), group.happened()};
            count += opened[0] || opened[1] || opened[2] ? 1 : 0;
        }
        return count;
    }
};

static constexpr gint64 HOUR = 3600;

TEST_F(PolicyStoreClock, FileThatStaysIsReadOnce) {
    g_usleep(200000);
    EXPECT_EQ(readings(20, "yes"), 1);
    EXPECT_EQ(readings(20, "yes"), 0);
}

TEST_F(PolicyStoreClock, FileIsReadOnceAfterTheClockWasSet) {
    g_usleep(200000);
    EXPECT_EQ(readings(20, "yes"), 1);
    for (const time_t error : {-HOUR, HOUR, -2 * HOUR, gint64{-1}, gint64{0}}) {
        set_clock_error(error);
        // A second back, the files have changed in a moment that is about to come.
        g_usleep(error == -1 ? 1500000 : 0);
        EXPECT_EQ(readings(20, "yes"), 1) << error;
    }
}

TEST_F(PolicyStoreClock, FileFromTheFutureIsReadOnce) {
    set_clock_error(-HOUR);
    EXPECT_EQ(readings(20, "yes"), 1);
    pass_time(HOUR / 2);
    EXPECT_EQ(readings(20, "yes"), 0);
}

TEST_F(PolicyStoreClock, TimeOfTheContentMayBeInTheFuture) {
    const struct timespec times[2] = {
        {4000000000, 0},
        {4000000000, 0}
    };
    ASSERT_EQ(utimensat(AT_FDCWD, policy_.c_str(), times, 0), 0);
    g_usleep(200000);
    EXPECT_EQ(readings(20, "yes"), 1);
    EXPECT_EQ(readings(20, "yes"), 0);
}

TEST_F(PolicyStoreClock, EveryChangeUnderAClockThatWasSetBackCounts) {
    set_clock_error(-HOUR);
    for (int i = 0; i < 200; i++) {
        grant("users=clerk", "x.y");
        ASSERT_EQ(ask(701), "yes") << i;
        grant("users=clerk", "x.z");
        ASSERT_EQ(ask(701), "no") << i;
    }
}

// With times as coarse as these, the change leaves no trace in those of the file.
TEST_F(PolicyStoreClock, ChangeInTheMomentThatComesAgainCounts) {
    set_time_step(1000 * HOUR * 1'000'000'000);
    folder_.write("policy", "[role a]\nusers=clerk\nactions=x.y\n");
    const time_t now = time(nullptr);
    const time_t moment = now - now % (1000 * HOUR);

    EXPECT_EQ(ask(701), "yes");
    set_clock_error(moment - now);
    grant("users=clerk", "x.z");
    EXPECT_EQ(ask(701), "no");
}

TEST_F(PolicyStoreClock, ChangeInTheMomentThatWasYetToComeCounts) {
    set_time_step(1000 * HOUR * 1'000'000'000);
    const time_t now = time(nullptr);
    const time_t moment = now - now % (1000 * HOUR);

    set_clock_error(moment - now - 60);
    EXPECT_EQ(readings(5, "yes"), 1);
    EXPECT_EQ(readings(5, "yes"), 0);
    pass_time(60);
    grant("users=clerk", "x.z");
    EXPECT_EQ(ask(701), "no");
}
