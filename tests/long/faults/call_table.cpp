// tests/long/faults/call_table.cpp: the system calls that the trap knows.
#include "tests/long/faults/call_table.h"

#include <sys/syscall.h>

#define AT(call, name) \
    { SYS_##call, name, takes::FOLDER_AND_PATH }
#define ON(call, name) \
    { SYS_##call, name, takes::DESCRIPTOR }
static constexpr known_call known_calls[] = {
    AT(openat, "open"),
    AT(newfstatat, "stat"),
    AT(statx, "stat"),
    AT(renameat, "rename"),
    AT(renameat2, "rename"),
    AT(unlinkat, "unlink"),
    AT(mkdirat, "mkdir"),
    AT(faccessat, "access"),
    AT(faccessat2, "access"),
    AT(fchmodat, "chmod"),
    AT(fchownat, "chown"),
    AT(readlinkat, "readlink"),
    ON(read, "read"),
    ON(pread64, "read"),
    ON(readv, "read"),
    ON(write, "write"),
    ON(pwrite64, "write"),
    ON(writev, "write"),
    ON(close, "close"),
    ON(fstat, "fstat"),
    ON(fchmod, "fchmod"),
    ON(fchown, "fchown"),
    ON(fsync, "fsync"),
    ON(fdatasync, "fsync"),
    ON(flock, "flock"),
    ON(fcntl, "fcntl"),
    ON(lseek, "lseek"),
    ON(ftruncate, "truncate"),
    ON(ioctl, "ioctl"),
    ON(getdents64, "list"),
#ifdef SYS_open  // Newer machines have only the calls above.
    {SYS_open,     "open",     takes::PATH},
    {SYS_creat,    "open",     takes::PATH},
    {SYS_stat,     "stat",     takes::PATH},
    {SYS_lstat,    "stat",     takes::PATH},
    {SYS_access,   "access",   takes::PATH},
    {SYS_rename,   "rename",   takes::PATH},
    {SYS_unlink,   "unlink",   takes::PATH},
    {SYS_mkdir,    "mkdir",    takes::PATH},
    {SYS_rmdir,    "rmdir",    takes::PATH},
    {SYS_chmod,    "chmod",    takes::PATH},
    {SYS_chown,    "chown",    takes::PATH},
    {SYS_truncate, "truncate", takes::PATH},
    {SYS_readlink, "readlink", takes::PATH},
#endif
};
#undef AT
#undef ON

static constexpr long passing[] = {
#ifdef SYS_fork
    SYS_fork,
    SYS_vfork,
    SYS_poll,
    SYS_time,
    SYS_arch_prctl,
#endif
    SYS_clone,
    SYS_clone3,
    SYS_wait4,
    SYS_waitid,
    SYS_exit,
    SYS_exit_group,
    SYS_kill,
    SYS_tkill,
    SYS_tgkill,
    SYS_getpid,
    SYS_getppid,
    SYS_gettid,
    SYS_getuid,
    SYS_geteuid,
    SYS_getgid,
    SYS_getegid,
    SYS_brk,
    SYS_mmap,
    SYS_munmap,
    SYS_mremap,
    SYS_mprotect,
    SYS_madvise,
    SYS_futex,
    SYS_set_robust_list,
    SYS_rseq,
    SYS_membarrier,
    SYS_rt_sigaction,
    SYS_rt_sigprocmask,
    SYS_rt_sigreturn,
    SYS_sigaltstack,
    SYS_prctl,
    SYS_seccomp,
    SYS_prlimit64,
    SYS_getrusage,
    SYS_sysinfo,
    SYS_uname,
    SYS_umask,
    SYS_sched_yield,
    SYS_clock_gettime,
    SYS_clock_nanosleep,
    SYS_nanosleep,
    SYS_gettimeofday,
    SYS_times,
    SYS_getrandom,
    SYS_ppoll,
    SYS_socket,
    SYS_connect,
    SYS_sendto,
    SYS_sendmsg,
    SYS_sendmmsg,
    SYS_recvfrom,
    SYS_recvmsg,
    SYS_restart_syscall,
    SYS_sched_getaffinity,
};

const known_call *find_call(long number) {
    for (const known_call &row : known_calls)
        if (row.number == number)
            return &row;
    return nullptr;
}

std::span<const long> passing_calls() {
    return passing;
}
