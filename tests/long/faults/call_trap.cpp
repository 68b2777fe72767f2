// tests/long/faults/call_trap.cpp: the file-system calls of this process, caught by a filter of the
// kernel, which raises SIGSYS in place of all calls but those that touch no file.
#include "tests/long/faults/call_trap.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <iterator>
#include <span>

#include <fcntl.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <ucontext.h>
#include <unistd.h>

#include "tests/long/faults/call_table.h"

// A call with this as its sixth argument, which none of these calls has, is the trap's own. Calls
// that have a sixth are of those that pass.
static constexpr unsigned long OWN_CALL = 0x2ea7c0de;

static constexpr int MAX_DESCRIPTORS = 128;
static constexpr std::size_t PATH_SIZE = sizeof(trapped_call::path);

// Only the process's one thread works on these.
static call_trace *trace;
static trap_plan plan;
static char known_folder[PATH_SIZE];
static char paths[MAX_DESCRIPTORS][PATH_SIZE];
static char failing_line[sizeof(trapped_call::name) + PATH_SIZE + 1];
static int failing_error;

// What the proofs do not know, of this process and its children.
struct unknown_calls {
    long first;  // 0: none
    char behind[sizeof(trapped_call::name) + PATH_SIZE + 1];
};
static unknown_calls *unknown;

void *make_shared_memory(std::size_t size) {
    void *memory = mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    return memory != MAP_FAILED ? memory : nullptr;
}

call_trace *make_shared_trace() {
    return static_cast<call_trace *>(make_shared_memory(sizeof(call_trace)));
}

static bool is_labelled(long fd) {
    return fd >= 0 && fd < MAX_DESCRIPTORS && paths[fd][0] != '\0';
}

static void take_path(char *to, const char *path) {
    const std::size_t length = std::strlen(known_folder);
    if (length > 0 && std::strncmp(path, known_folder, length) == 0 && path[length] == '/')
        path += length + 1;
    (void)std::snprintf(to, PATH_SIZE, "%s", path);
}

static void take_path_in_folder(char *to, long folder, const char *path) {
    if (path[0] == '\0' && is_labelled(folder))
        (void)std::snprintf(to, PATH_SIZE, "%s", paths[folder]);
    else if (path[0] != '/' && is_labelled(folder))
        (void)std::snprintf(to, PATH_SIZE, "%.60s/%.50s", paths[folder], path);
    else
        take_path(to, path);
}

// The C library's own data, which it reads once in a process or not at all, and what the tests ask
// for the name of a descriptor.
static bool is_left_out(const trapped_call &call) {
    return std::strncmp(call.path, "/usr/", 5) == 0 || std::strncmp(call.path, "/proc/", 6) == 0;
}

static bool is_one_of(const char *name, std::span<const char *const> names) {
    return std::any_of(names.begin(), names.end(),
                       [name](const char *one) { return std::strcmp(one, name) == 0; });
}

static long open_flags(const known_call *row, const long *arguments) {
    if (std::strcmp(row->name, "open") != 0)
        return 0;
    if (row->first == takes::FOLDER_AND_PATH)
        return arguments[2];
#ifdef SYS_creat
    if (row->number == SYS_creat)
        return O_WRONLY | O_CREAT | O_TRUNC;
#endif
    return arguments[1];
}

static long make_call(long number, const long *arguments) {
    const long result = syscall(number, arguments[0], arguments[1], arguments[2], arguments[3],
                                arguments[4], OWN_CALL);
    return result >= 0 ? result : -errno;
}

// Whether an open would make its file.
static bool makes_file(const known_call *row, const long *arguments, long flags) {
    if ((flags & O_CREAT) == 0)
        return false;
    const bool in_folder = row->first == takes::FOLDER_AND_PATH;
    const long asked[] = {in_folder ? arguments[0] : AT_FDCWD, arguments[in_folder ? 1 : 0], F_OK,
                          0, 0};
    return make_call(SYS_faccessat, asked) != 0;
}

static void describe_effect(const known_call *row, const long *arguments, trapped_call *call) {
    static constexpr const char *writing[] = {"write",  "fsync",  "rename",  "unlink",
                                              "rmdir",  "mkdir",  "chmod",   "chown",
                                              "fchmod", "fchown", "truncate"};
    const long flags = open_flags(row, arguments);
    call->writes = is_one_of(call->name, writing) || (flags & O_TRUNC) != 0 ||
                   makes_file(row, arguments, flags);
    call->may_write = call->writes || (flags & O_ACCMODE) != O_RDONLY;
}

// False for a call on something that was opened before the trap began.
static bool describe(const known_call *row, const long *arguments, trapped_call *call) {
    *call = {};
    (void)std::snprintf(call->name, sizeof call->name, "%s", row->name);
    describe_effect(row, arguments, call);
    if (row->first == takes::PATH) {
        take_path(call->path, reinterpret_cast<const char *>(arguments[0]));
        return true;
    }
    if (row->first == takes::FOLDER_AND_PATH) {
        const char *path = reinterpret_cast<const char *>(arguments[1]);
        if (path[0] == '\0')
            (void)std::snprintf(call->name, sizeof call->name, "fstat");
        take_path_in_folder(call->path, arguments[0], path);
        return call->path[0] != '\0';
    }
    if (!is_labelled(arguments[0]))
        return false;
    (void)std::snprintf(call->path, PATH_SIZE, "%s", paths[arguments[0]]);
    call->mode = row->number == SYS_fchmod ? static_cast<mode_t>(arguments[1]) : 0;
    call->size = std::strcmp(row->name, "write") == 0 ? static_cast<std::size_t>(arguments[2]) : 0;
    return true;
}

[[noreturn]] static void die() {
    (void)syscall(SYS_kill, syscall(SYS_getpid), SIGKILL);
    _exit(99);
}

static bool is_on(const trapped_call &call, const char *name, const char *path) {
    return name != nullptr && std::strcmp(call.name, name) == 0 &&
           std::strcmp(call.path, path) == 0;
}

static void note_strike(int index) {
    if (!trace->struck)
        trace->struck_at = index;
    trace->struck = true;
}

// The error of this call, 0 for none. A short write is told by *out_short.
static int planned_error(const trapped_call &call, int index, bool *out_short) {
    char line[sizeof failing_line];
    (void)std::snprintf(line, sizeof line, "%s %s", call.name, call.path);
    const bool fails_on = failing_line[0] != '\0' && std::strcmp(line, failing_line) == 0;

    if (plan.disk_error != 0 && index >= plan.disk_fails_at &&
        (call.writes || (plan.disk_error == EROFS && call.may_write))) {
        note_strike(index);
        return plan.disk_error;
    }
    if (index == plan.fail_at && plan.choose != nullptr && !plan.choose(call, plan.choice, &plan))
        return 0;
    if (index == plan.fail_at) {
        note_strike(index);
        *out_short = plan.error == 0;
        if (plan.for_ever || plan.error_after_short != 0) {
            std::memcpy(failing_line, line, sizeof line);
            failing_error = plan.error != 0 ? plan.error : plan.error_after_short;
        }
        return plan.error;
    }
    if (fails_on)
        return failing_error;
    return is_on(call, plan.also_call, plan.also_path) ? plan.also_error : 0;
}

static void follow_descriptors(const trapped_call &call, const long *arguments) {
    if (std::strcmp(call.name, "open") == 0 && call.result >= 0 && call.result < MAX_DESCRIPTORS)
        std::memcpy(paths[call.result], call.path, PATH_SIZE);
    else if (std::strcmp(call.name, "close") == 0 && is_labelled(arguments[0]))
        paths[arguments[0]][0] = '\0';
}

static long follow_plan(const known_call *row, long *arguments, trapped_call *call) {
    const int index = trace->count;
    const bool is_write = call->size > 0;
    if (index == plan.die_before) {
        if (plan.torn && is_write) {
            arguments[2] /= 2;
            (void)make_call(row->number, arguments);
        }
        die();
    }
    bool cut = false;
    const int error = planned_error(*call, index, &cut);
    if (cut && is_write)
        arguments[2] = (arguments[2] + 1) / 2;
    // A failing close has still closed.
    if (error == 0 || row->number == SYS_close)
        call->result = make_call(row->number, arguments);
    if (error != 0)
        call->result = -error;
    return call->result;
}

static long refuse_unknown(long number) {
    if (unknown->first == 0) {
        const int last = std::min(trace->count, call_trace::MAX_CALLS) - 1;
        if (last >= 0)
            (void)std::snprintf(unknown->behind, sizeof unknown->behind, "%s %s",
                                trace->calls[last].name, trace->calls[last].path);
        unknown->first = number;
    }
    return -ENOSYS;
}

// A second descriptor of a file would not be followed; nor is one that was there before the trap,
// of which only what is printed is written.
static bool is_unknown(const known_call *row, const long *arguments) {
    static constexpr const char *changes[] = {"write",  "truncate", "fchmod",
                                              "fchown", "fsync",    "ioctl"};
    if (row == nullptr)
        return true;
    if (row->number == SYS_fcntl)
        return arguments[1] == F_DUPFD || arguments[1] == F_DUPFD_CLOEXEC;
    return row->first == takes::DESCRIPTOR && arguments[0] > STDERR_FILENO &&
           !is_labelled(arguments[0]) && is_one_of(row->name, changes);
}

static long answer(long number, long *arguments) {
    const known_call *row = find_call(number);
    trapped_call call;
    if (trace != nullptr && is_unknown(row, arguments))
        return refuse_unknown(number);
    if (trace == nullptr || !describe(row, arguments, &call) || is_left_out(call))
        return make_call(number, arguments);

    const long result = follow_plan(row, arguments, &call);
    follow_descriptors(call, arguments);
    if (trace->count < call_trace::MAX_CALLS)
        trace->calls[trace->count] = call;
    trace->count++;
    return result;
}

static void on_trapped_call(int /*signal*/, siginfo_t *info, void *context) {
    const int saved_errno = errno;
    mcontext_t *machine = &static_cast<ucontext_t *>(context)->uc_mcontext;
#if defined(__x86_64__)
    const auto *registers = machine->gregs;
    long arguments[] = {registers[REG_RDI], registers[REG_RSI], registers[REG_RDX],
                        registers[REG_R10], registers[REG_R8]};
    machine->gregs[REG_RAX] = answer(info->si_syscall, arguments);
#elif defined(__aarch64__)
    long arguments[5];
    for (std::size_t i = 0; i < std::size(arguments); i++)
        arguments[i] = static_cast<long>(machine->regs[i]);
    machine->regs[0] = static_cast<unsigned long long>(answer(info->si_syscall, arguments));
#else
#error "where this machine keeps the arguments of a system call"
#endif
    errno = saved_errno;
}

bool install_call_trap() {
    static constexpr std::size_t MAX_CALLS = 250;  // which a jump is able to pass over
    const std::span<const long> passing = passing_calls();
    const std::size_t count = passing.size();
    if (count > MAX_CALLS) {
        errno = E2BIG;
        return false;
    }
    // The end lets the call pass; the one before it is the trap.
    sock_filter filter[MAX_CALLS + 5] = {
        BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, args[5])),
        BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, OWN_CALL, static_cast<unsigned char>(count + 2), 0),
        BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
    };
    for (std::size_t i = 0; i < count; i++)
        filter[3 + i] = BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, static_cast<unsigned>(passing[i]),
                                 static_cast<unsigned char>(count - i), 0);
    filter[3 + count] = BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_TRAP);
    filter[4 + count] = BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW);
    const sock_fprog program = {static_cast<unsigned short>(count + 5), filter};

    unknown = static_cast<unknown_calls *>(make_shared_memory(sizeof *unknown));
    struct sigaction action = {};
    action.sa_sigaction = on_trapped_call;
    action.sa_flags = SA_SIGINFO;
    return unknown != nullptr && sigaction(SIGSYS, &action, nullptr) == 0 &&
           prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
           prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0;
}

std::string unknown_call() {
    if (unknown == nullptr || unknown->first == 0)
        return "";
    return "system call " + std::to_string(unknown->first) + " behind '" + unknown->behind + "'";
}

void begin_trap(call_trace *recorded, const trap_plan &wanted, const std::string &folder) {
    std::memset(paths, 0, sizeof paths);
    failing_line[0] = '\0';
    (void)std::snprintf(known_folder, sizeof known_folder, "%s", folder.c_str());
    plan = wanted;
    recorded->count = 0;
    recorded->struck = false;
    recorded->struck_at = -1;
    trace = recorded;
}

void end_trap() {
    trace = nullptr;
}

const trap_plan &followed_plan() {
    return plan;
}

std::string line_of(const trapped_call &call) {
    return std::string(call.name) + " " + call.path;
}
