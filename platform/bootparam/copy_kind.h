// platform/bootparam/copy_kind.h: how a copy of the boot environment may be looked at beside
// libubootenv; internal.
#pragma once

#include <sys/stat.h>

enum class copy_kind {
    // Files and block devices: a descriptor that is open over a write is told of its error by
    // fsync, one that is opened later is not.
    KEPT_OPEN,
    // Other character devices, whose writes are synchronous: open only while they are read. A
    // volume of UBI answers a write with EBUSY as long as anybody else has it open.
    OPEN_TO_READ,
    // NAND flash: libubootenv skips its bad blocks, a plain read does not, and finds other bytes.
    UNCHECKED
};

// The kind of what is open, with what fstat tells of it. A negative errno value where a flash
// device does not tell its type.
int find_copy_kind(int fd, const struct stat *status, copy_kind *out_kind);
