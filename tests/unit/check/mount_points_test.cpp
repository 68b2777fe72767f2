// tests/unit/check/mount_points_test.cpp: mount points in the kernel's list.
#include "check/mount_points.h"

#include <gtest/gtest.h>

namespace {

constexpr const char *LIST =
    "22 1 8:1 / / rw,relatime shared:1 - ext4 /dev/sda1 rw\n"
    "23 22 0:21 / /proc rw shared:2 - proc proc rw\n"
    "24 22 0:21 /etc/passwd /elsewhere rw - ext4 /etc/group rw\n"
    "25 22 8:2 /a/passwd /etc/passwd rw,relatime shared:3 master:1 - ext4 /dev/sda2 rw\n"
    "26 22 8:2 /b /with\\040a\\134blank rw - ext4 /dev/sda2 rw\n";

TEST(MountPoints, AreTheFifthFieldAlone) {
    EXPECT_TRUE(mountinfo_has(LIST, "/etc/passwd"));
    EXPECT_TRUE(mountinfo_has(LIST, "/"));
    EXPECT_FALSE(mountinfo_has(LIST, "/etc/group"));
    EXPECT_FALSE(mountinfo_has(LIST, "/etc"));
    EXPECT_FALSE(mountinfo_has(LIST, "/etc/passw"));
}

TEST(MountPoints, AreWrittenAsTheKernelDoes) {
    EXPECT_TRUE(mountinfo_has(LIST, "/with a\\blank"));
    EXPECT_FALSE(mountinfo_has(LIST, "/with\\040a\\134blank"));
}

TEST(MountPoints, OfAListThatWasCutOffAreThoseThatAreWhole) {
    EXPECT_FALSE(mountinfo_has("", "/"));
    EXPECT_FALSE(mountinfo_has("22 1 8:1 /", "/"));
    EXPECT_TRUE(mountinfo_has("22 1 8:1 / /", "/"));
}

TEST(MountPoints, OfThisProcessHaveProc) {
    const mount_points mounts(nullptr);
    ASSERT_EQ(mounts.fault(), nullptr);
    EXPECT_TRUE(mounts.has("/proc"));
    EXPECT_FALSE(mounts.has("/proc/self"));
}

}  // namespace
