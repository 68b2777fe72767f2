// tests/long/faults/call_errors.cpp: how each file-system call can fail.
#include "tests/long/faults/call_errors.h"

#include <cerrno>
#include <cstring>

#include <glib.h>

struct errors_of_call {
    const char *call;
    std::vector<int> errors;
};

static const std::vector<errors_of_call> rows = {
    {"open",   {EIO, ENOSPC, EDQUOT, EROFS, EMFILE, EACCES, EPERM, EINTR}},
    {"read",   {EIO, EACCES, EPERM, EINTR}                               },
    {"write",  {EIO, ENOSPC, EDQUOT, EROFS, EPERM, EINTR}                },
    {"stat",   {EIO, EACCES, EPERM, EINTR}                               },
    {"fstat",  {EIO, EACCES, EPERM, EINTR}                               },
    {"access", {EIO, EACCES, EPERM, EROFS, EINTR}                        },
    {"unlink", {EIO, EROFS, EACCES, EPERM}                               },
    {"rename", {EIO, ENOSPC, EDQUOT, EROFS, EACCES, EPERM}               },
    {"fchmod", {EIO, EROFS, EACCES, EPERM, EINTR}                        },
    {"fchown", {EIO, EDQUOT, EROFS, EACCES, EPERM, EINTR}                },
    {"fsync",  {EIO, ENOSPC, EDQUOT, EROFS, EINTR}                       },
    {"close",  {EIO, ENOSPC, EDQUOT, EINTR}                              },
    {"flock",  {EIO, EINTR}                                              },
    {"mkdir",  {EIO, ENOSPC, EDQUOT, EROFS, EACCES, EPERM}               },
    {"lseek",  {}                                                        }, // of a file: never
};

static std::vector<int> errors_of(const trapped_call &call) {
    for (const errors_of_call &row : rows)
        if (std::strcmp(row.call, call.name) == 0)
            return row.errors;
    return {EIO};
}

std::vector<call_fault> faults_of(const trapped_call &call) {
    std::vector<call_fault> faults;
    for (const int error : errors_of(call)) {
        faults.push_back({error, 0, false});
        if (error != EINTR)
            faults.push_back({error, 0, true});
    }
    if (call.size > 1)
        for (const int then : {0, ENOSPC, EIO})
            faults.push_back({0, then, false});
    return faults;
}

std::string shown(const call_fault &fault) {
    if (fault.error == 0)
        return fault.error_after_short == 0
                   ? "short"
                   : std::string("short, then ") + g_strerror(fault.error_after_short);
    return std::string(g_strerror(fault.error)) + (fault.for_ever ? ", for ever" : ", once");
}
