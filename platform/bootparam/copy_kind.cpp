// platform/bootparam/copy_kind.cpp: how a copy of the boot environment may be looked at.
#include "platform/bootparam/copy_kind.h"

#include <cerrno>

#include <linux/major.h>
#include <mtd/mtd-user.h>
#include <sys/ioctl.h>
#include <sys/sysmacros.h>

int find_copy_kind(int fd, const struct stat *status, copy_kind *out_kind) {
    if (!S_ISCHR(status->st_mode)) {
        *out_kind = copy_kind::KEPT_OPEN;
        return 0;
    }
    struct mtd_info_user flash = {};
    // Of other devices the request may be any.
    if (major(status->st_rdev) == MTD_CHAR_MAJOR && ioctl(fd, MEMGETINFO, &flash) != 0)
        return -errno;
    *out_kind = flash.type == MTD_NANDFLASH || flash.type == MTD_MLCNANDFLASH
                    ? copy_kind::UNCHECKED
                    : copy_kind::OPEN_TO_READ;
    return 0;
}
