/* tests/fakes/old_statx/old_statx.c: a statx(2) of a kernel that does not tell mount points.
 * Preloaded.
 */
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

int statx(int folder, const char *restrict path, int flags, unsigned mask,
          struct statx *restrict status) {
    const long answer = syscall(SYS_statx, folder, path, flags, mask, status);

    status->stx_attributes &= ~(__u64)STATX_ATTR_MOUNT_ROOT;
    status->stx_attributes_mask &= ~(__u64)STATX_ATTR_MOUNT_ROOT;
    return (int)answer;
}
