/* platform/bootparam/bootparam.h: named parameters in the boot block, the environment of U-Boot.
 *
 * Where the environment is, U-Boot's own tools and this library read from the same file,
 * /etc/fw_env.config: with two lines there are two copies, each with a CRC, and a write replaces
 * the older one. A power cut during a write leaves the old values.
 *
 * A copy that is valid, but has no end to its parameters, would be read beyond its end: it is
 * refused. Two kinds of copies cannot be checked for that, and are left to libubootenv: those on
 * MTD NAND flash, whose bad blocks it skips, and those on UBI volumes that are given by a name only
 * it resolves, like /dev/ubi0:NAME (/dev/ubi0_0 is checked). With one of them a write also keeps
 * room for flags of all parameters (".flags"), so that ENOSPC comes earlier.
 *
 * Files and block devices are synced after a write. Of other devices, like flash, a write that
 * returned counts as done.
 *
 * Like those tools, each call holds a lock on /var/lock/fw_printenv.lock. It waits for it for about
 * 3 seconds, then fails with EBUSY; without a lock file that can be opened it fails, too.
 *
 * A write fills the process's memory that malloc hands out with zero bytes from then on
 * (mallopt(3), M_PERTURB), so that none of it reaches the boot block. For copies below about 1 KiB
 * the process needs GLIBC_TUNABLES=glibc.malloc.tcache_count=0 for that as well.
 */
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

#pragma GCC visibility push(default)

/* The results. On any but BOOTPARAM_OK, *error is an errno value that says more, and errno is set.
 */
enum bootparam_result {
    BOOTPARAM_OK = 0,
    BOOTPARAM_FAILED = -1,  /* the boot block cannot be read or written, or is full: ENOSPC; its
                               description cannot be read, or is none: EINVAL; a copy has a
                               right CRC, but no end to its parameters: EBADMSG, until that copy is
                               erased or replaced by other means */
    BOOTPARAM_INVALID = -2, /* a name, value, unit or chip that no boot block takes */
    BOOTPARAM_BLANK = -982, /* no copy of the environment is valid: nothing was written yet, or all
                               is broken; the next write begins anew, with its one parameter */
    BOOTPARAM_ABSENT = -988 /* the environment has no such parameter */
};

/* Where the boot block is described. Fixed size, owned by the caller, opaque. */
struct bootparam_chip {
    char config_path[256];
};

/* Fills the record with the defaults. */
void bootparam_default_chip(struct bootparam_chip *chip);

/* Checks that the boot block is described. There is one, unit 0. */
int bootparam_set_chip(int unit, int *error, struct bootparam_chip *chip);

/* Reads a parameter into a string from malloc, which the caller frees; on failure *value is left
 * alone. No flag is defined: flags is 0. */
int bootparam_read(const char *name, char **value, int flags, int *error,
                   struct bootparam_chip *chip);

/* Adds or replaces a parameter. The name is not empty, has no "=" and is not ".flags", U-Boot's
 * list of what others may hold; neither has a control character, and the value is not empty, which
 * would delete the parameter. On success the value is on the disk. On failure the old one is still
 * there, but where some of a copy was written or was not synced, as with EIO: either may be. */
int bootparam_write(const char *name, const char *value, int *error, struct bootparam_chip *chip);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif
