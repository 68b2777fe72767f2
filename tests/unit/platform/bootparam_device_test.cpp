// tests/unit/platform/bootparam_device_test.cpp: boot blocks on flash, played by files: what fstat
// and ioctl tell of them is made up, and libubootenv goes by a device's name.
#include <cerrno>
#include <cstdarg>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include <linux/major.h>
#include <mtd/mtd-user.h>
#include <mtd/ubi-user.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <glib.h>

#include "platform/bootparam/copy_kind.h"
#include "tests/unit/platform/boot_block.h"
#include "tests/unit/platform/process_state.h"

// A number that is free for local use, and that UBI may get.
static constexpr unsigned OTHER_MAJOR = 240;
static constexpr int BROKEN_FLASH = -1;

// Files whose path begins like this are told to be character devices of that number.
static std::string played_path;
static unsigned played_major;
// What MEMGETINFO tells.
static int flash_type;
static int updates;

static std::string path_of(const std::string &descriptor) {
    char path[256] = "";
    const std::string link = "/proc/self/fd/" + descriptor;
    const ssize_t length = readlink(link.c_str(), path, sizeof path);
    return {path, length < 0 ? 0 : static_cast<std::size_t>(length)};
}

// Stand in front of the C library's.
int fstat(int fd, struct stat *status) noexcept {
    const long result = syscall(SYS_fstat, fd, status);
    if (result == 0 && !played_path.empty() &&
        path_of(std::to_string(fd)).starts_with(played_path)) {
        status->st_mode = S_IFCHR | 0600;
        status->st_rdev = makedev(played_major, 0);
    }
    return static_cast<int>(result);
}

static int open_times(const std::string &path) {
    int times = 0;
    g_autoptr(GDir) folder = g_dir_open("/proc/self/fd", 0, nullptr);
    for (const char *name = g_dir_read_name(folder); name != nullptr;
         name = g_dir_read_name(folder))
        times += path_of(name) == path ? 1 : 0;
    return times;
}

static int answer_request(int fd, unsigned long request, void *argument) {
    if (request == MEMGETINFO && flash_type != BROKEN_FLASH) {
        static_cast<struct mtd_info_user *>(argument)->type = static_cast<__u8>(flash_type);
        return 0;
    }
    if (request == UBI_IOCVOLUP) {
        // The kernel lets nobody else use the volume meanwhile.
        if (open_times(path_of(std::to_string(fd))) == 1) {
            updates++;
            return 0;
        }
        errno = EBUSY;
        return -1;
    }
    if (request != MEMGETINFO)
        return static_cast<int>(syscall(SYS_ioctl, fd, request, argument));
    errno = EIO;
    return -1;
}

int ioctl(int fd, unsigned long request, ...) noexcept {
    va_list arguments;
    va_start(arguments, request);
    void *argument = va_arg(arguments, void *);
    va_end(arguments);
    return answer_request(fd, request, argument);
}

class BootParamDevice : public BootParam {
  protected:
    void SetUp() override {
        BootParam::SetUp();
        play("/etc/copy", OTHER_MAJOR, MTD_ABSENT);
        updates = 0;
    }
    void TearDown() override { played_path.clear(); }

    static void play(const std::string &path, unsigned number, int type) {
        played_path = path;
        played_major = number;
        flash_type = type;
    }

    // libubootenv looks only at the parameters of the newer copy. These are the older one's.
    static void lay_older_without_end() {
        const std::string ended("a=1\0\0", 5);
        write_file(copy(0), image(std::string(COPY_SIZE - 5, 'x'), "\x01"));
        write_file(copy(1), image(ended + std::string(COPY_SIZE - 5 - ended.size(), '\0'), "\x02"));
    }

    // A UBI device of two volumes, "env" and "spare", in mounts of the child's own.
    static bool has_volumes() {
        if (unshare(CLONE_NEWNS) != 0 ||
            mount("none", "/", "", MS_REC | MS_PRIVATE, nullptr) != 0 ||
            mount("tmpfs", "/sys/class", "tmpfs", MS_NOSUID, "") != 0 ||
            mount("tmpfs", "/dev", "tmpfs", MS_NOSUID, "") != 0)
            return false;
        for (const char *folder : {"ubi0_0", "ubi0_1"})
            if (g_mkdir_with_parents((std::string("/sys/class/ubi/ubi0/") + folder).c_str(),
                                     0755) != 0)
                return false;
        write_file("/sys/class/ubi/ubi0/volumes_count", "2\n");
        write_file("/sys/class/ubi/ubi0/ubi0_0/name", "env\n");
        write_file("/sys/class/ubi/ubi0/ubi0_1/name", "spare\n");
        write_file("/dev/ubi0", "");
        write_file("/dev/ubi0_0", std::string(COPY_SIZE, '\xff'));
        write_file("/dev/ubi0_1", std::string(COPY_SIZE, '\xff'));
        play("/dev/ubi", OTHER_MAJOR, MTD_ABSENT);
        return true;
    }

    static std::string write_and_read_volumes(const std::string &config) {
        return from_child([&config]() -> std::string {
            if (!has_volumes())
                return "no volumes";
            write_file(CONFIG, config);
            std::string outcomes = read("a") == BLANK ? "blank" : "not blank";
            for (const char *value : {"1", "2", "3"}) {
                outcomes += " " + write("a", value);
                outcomes += " " + read("a");
            }
            return outcomes + ", updated " + std::to_string(updates) + " times";
        });
    }
};

struct kind_case {
    mode_t type;
    unsigned number;
    int flash;
    copy_kind kind;
};

TEST_F(BootParamDevice, KindGoesByTheTypeOfTheFileAndOfTheFlash) {
    const kind_case cases[] = {
        {S_IFREG, 0,              MTD_NANDFLASH,    copy_kind::KEPT_OPEN   },
        {S_IFREG, MTD_CHAR_MAJOR, MTD_NANDFLASH,    copy_kind::KEPT_OPEN   },
        {S_IFBLK, 8,              MTD_NANDFLASH,    copy_kind::KEPT_OPEN   },
        {S_IFBLK, MTD_CHAR_MAJOR, MTD_NANDFLASH,    copy_kind::KEPT_OPEN   },
        {S_IFCHR, OTHER_MAJOR,    MTD_NANDFLASH,    copy_kind::OPEN_TO_READ},
        {S_IFCHR, 1,              BROKEN_FLASH,     copy_kind::OPEN_TO_READ},
        {S_IFCHR, MTD_CHAR_MAJOR, MTD_NORFLASH,     copy_kind::OPEN_TO_READ},
        {S_IFCHR, MTD_CHAR_MAJOR, MTD_DATAFLASH,    copy_kind::OPEN_TO_READ},
        {S_IFCHR, MTD_CHAR_MAJOR, MTD_UBIVOLUME,    copy_kind::OPEN_TO_READ},
        {S_IFCHR, MTD_CHAR_MAJOR, MTD_NANDFLASH,    copy_kind::UNCHECKED   },
        {S_IFCHR, MTD_CHAR_MAJOR, MTD_MLCNANDFLASH, copy_kind::UNCHECKED   },
    };
    for (const kind_case &one : cases) {
        SCOPED_TRACE(testing::Message() << one.type << " " << one.number << " " << one.flash);
        struct stat status = {};
        status.st_mode = one.type | 0600;
        status.st_rdev = makedev(one.number, 2);
        flash_type = one.flash;
        for (const copy_kind before : {copy_kind::KEPT_OPEN, copy_kind::UNCHECKED}) {
            copy_kind kind = before;
            EXPECT_EQ(find_copy_kind(-1, &status, &kind), 0);
            EXPECT_EQ(kind, one.kind);
        }
    }
}

TEST_F(BootParamDevice, FlashWithoutATypeIsAnError) {
    struct stat status = {};
    status.st_mode = S_IFCHR | 0600;
    status.st_rdev = makedev(MTD_CHAR_MAJOR, 0);
    flash_type = BROKEN_FLASH;
    copy_kind kind = copy_kind::OPEN_TO_READ;
    EXPECT_EQ(find_copy_kind(-1, &status, &kind), -EIO);

    const std::vector<std::string> before = list_descriptors();
    play("/etc/copy", MTD_CHAR_MAJOR, BROKEN_FLASH);
    EXPECT_EQ(read("a"), failed(EIO));
    EXPECT_EQ(write("a", "1"), failed(EIO));
    EXPECT_EQ(list_descriptors(), before);
}

TEST_F(BootParamDevice, CharacterDeviceIsCheckedAndWritten) {
    const std::vector<std::string> before = list_descriptors();
    EXPECT_EQ(read("a"), BLANK);
    EXPECT_EQ(write("a", "1"), "ok");
    EXPECT_EQ(write("a", "2"), "ok");
    EXPECT_EQ(read("a"), "=2");
    lay_older_without_end();
    EXPECT_EQ(read("a"), failed(EBADMSG));
    EXPECT_EQ(write("a", "3"), failed(EBADMSG));
    play("/etc/copy", MTD_CHAR_MAJOR, MTD_NORFLASH);
    EXPECT_EQ(read("a"), failed(EBADMSG));
    EXPECT_EQ(list_descriptors(), before);
}

TEST_F(BootParamDevice, NandFlashIsNotChecked) {
    for (const int type : {MTD_NANDFLASH, MTD_MLCNANDFLASH}) {
        play("/etc/copy", MTD_CHAR_MAJOR, type);
        const std::vector<std::string> before = list_descriptors();
        lay_older_without_end();
        EXPECT_EQ(read("a"), "=1");
        EXPECT_EQ(write("a", "2"), "ok");
        EXPECT_EQ(read("a"), "=2");
        EXPECT_EQ(list_descriptors(), before);
    }
}

// One that is not checked does not excuse the other.
TEST_F(BootParamDevice, FileBesideNandFlashIsChecked) {
    lay_older_without_end();
    play(copy(1), MTD_CHAR_MAJOR, MTD_NANDFLASH);
    EXPECT_EQ(read("a"), failed(EBADMSG));
    play(copy(0), MTD_CHAR_MAJOR, MTD_NANDFLASH);
    EXPECT_EQ(read("a"), "=1");
}

// libubootenv writes U-Boot's list of flags beyond the end; here nobody knows how long it is.
TEST_F(BootParamDevice, UncheckedBlockKeepsRoomForFlags) {
    play("/etc/copy", MTD_CHAR_MAJOR, MTD_NANDFLASH);
    const std::string flagged(200, 'f');
    EXPECT_EQ(write(flagged, "1"), "ok");
    ASSERT_EQ(set_by_tool(".flags", flagged + ":so"), "");

    std::size_t length = COPY_SIZE - 5;
    std::string outcome;
    do
        outcome = write("a", std::string(--length, 'v'));
    while (outcome == FULL);
    EXPECT_EQ(outcome, "ok");
    EXPECT_GT(length, COPY_SIZE - 2 * flagged.size() - 64);
    EXPECT_LT(length, COPY_SIZE - 2 * flagged.size() - 16);
    EXPECT_EQ(read(flagged), "=1");
    EXPECT_EQ(printed("a"), std::string(length, 'v') + "\n");
}

TEST_F(BootParamDevice, VolumesOfUbiAreWritten) {
    const std::string outcomes = "blank ok =1 ok =2 ok =3, updated 3 times";
    EXPECT_EQ(write_and_read_volumes("/dev/ubi0_0 0x0 0x4000\n"), outcomes);
    EXPECT_EQ(write_and_read_volumes("/dev/ubi0_0 0x0 0x4000\n/dev/ubi0_1 0x0 0x4000\n"), outcomes);
}

TEST_F(BootParamDevice, VolumesOfUbiMayBeNamed) {
    const std::string outcomes = "blank ok =1 ok =2 ok =3, updated 3 times";
    EXPECT_EQ(write_and_read_volumes("/dev/ubi0:env 0x0 0x4000\n"), outcomes);
    EXPECT_EQ(write_and_read_volumes("/dev/ubi0:env 0x0 0x4000\n/dev/ubi0:spare 0x0 0x4000\n"),
              outcomes);
    EXPECT_EQ(write_and_read_volumes("/dev/ubi0_1 0x0 0x4000\n/dev/ubi0:env 0x0 0x4000\n"),
              outcomes);
}
