// tests/long/faults/call_errors.cpp: how each file-system call can fail.
#include "tests/long/faults/call_errors.h"

#include <cerrno>
#include <cstring>
#include <iterator>

#include <glib.h>

struct errors_of_call {
    const char *call;
    std::vector<int> errors;
};

static const std::vector<errors_of_call> rows = {
    {"open",     {EIO, ENOSPC, EDQUOT, EROFS, EMFILE, EACCES, EPERM, EINTR}},
    {"read",     {EIO, EACCES, EPERM, EINTR}                               },
    {"write",    {EIO, ENOSPC, EDQUOT, EROFS, EPERM, EINTR}                },
    {"stat",     {EIO, EACCES, EPERM, EINTR}                               },
    {"fstat",    {EIO, EACCES, EPERM, EINTR}                               },
    {"access",   {EIO, EACCES, EPERM, EROFS, EINTR}                        },
    {"unlink",   {EIO, EROFS, EACCES, EPERM}                               },
    {"rename",   {EIO, ENOSPC, EDQUOT, EROFS, EACCES, EPERM}               },
    {"fchmod",   {EIO, EROFS, EACCES, EPERM, EINTR}                        },
    {"fchown",   {EIO, EDQUOT, EROFS, EACCES, EPERM, EINTR}                },
    {"fsync",    {EIO, ENOSPC, EDQUOT, EROFS, EINTR}                       },
    {"close",    {EIO, ENOSPC, EDQUOT, EINTR}                              },
    {"flock",    {EIO, EINTR}                                              },
    {"mkdir",    {EIO, ENOSPC, EDQUOT, EROFS, EACCES, EPERM}               },
    {"lseek",    {}                                                        }, // of a file: never
    {"fcntl",    {EIO}                                                     }, // what fdopen asks
    {"readlink", {EIO, EACCES}                                             },
};

static const errors_of_call *find_errors(const trapped_call &call) {
    for (const errors_of_call &row : rows)
        if (std::strcmp(row.call, call.name) == 0)
            return &row;
    return nullptr;
}

bool has_errors(const trapped_call &call) {
    return find_errors(call) != nullptr;
}

// Allocates nothing: the trap asks in the middle of a call.
static bool nth_fault(const trapped_call &call, unsigned n, call_fault *fault) {
    static constexpr int after_short[] = {0, ENOSPC, EIO};
    const errors_of_call *row = find_errors(call);
    if (row == nullptr)
        return false;
    for (const int error : row->errors) {
        const unsigned ways = error == EINTR ? 1 : 2;
        if (n < ways) {
            *fault = {error, 0, n == 1};
            return true;
        }
        n -= ways;
    }
    if (call.size <= 1 || n >= std::size(after_short))
        return false;
    *fault = {0, after_short[n], false};
    return true;
}

std::vector<call_fault> faults_of(const trapped_call &call) {
    std::vector<call_fault> faults;
    call_fault fault = {};
    while (nth_fault(call, static_cast<unsigned>(faults.size()), &fault))
        faults.push_back(fault);
    return faults;
}

bool choose_fault(const trapped_call &call, unsigned choice, trap_plan *plan) {
    call_fault fault = {};
    unsigned count = 0;
    while (nth_fault(call, count, &fault))
        count++;
    if (count == 0 || !nth_fault(call, choice % count, &fault))
        return false;
    plan->error = fault.error;
    plan->error_after_short = fault.error_after_short;
    plan->for_ever = fault.for_ever;
    return true;
}

std::string shown(const call_fault &fault) {
    if (fault.error == 0)
        return fault.error_after_short == 0
                   ? "short"
                   : std::string("short, then ") + g_strerror(fault.error_after_short);
    return std::string(g_strerror(fault.error)) + (fault.for_ever ? ", for ever" : ", once");
}
