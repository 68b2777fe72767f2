// tests/long/faults/call_trap.h: the file-system calls of this process, those that the C library
// makes for itself among them: seen, made to fail, or the last thing that the process does.
#pragma once

#include <cstddef>
#include <string>

#include <sys/types.h>

struct trapped_call {
    char name[12];     // "open", "rename", ..., whichever of its variants was called
    char path[112];    // also where the call is only given a descriptor
    mode_t mode;       // what fchmod sets
    std::size_t size;  // what write was given
    bool writes;       // on the disk: it makes, changes, syncs or removes something
    bool may_write;    // it opens something that is there in order to write
    long result;       // a negative error number on failure
};

// Lies in memory that a child shares with its parent, so that it outlives the child.
struct call_trace {
    static constexpr int MAX_CALLS = 600;

    int count;  // may be above MAX_CALLS: then the rest is not recorded
    bool struck;
    int struck_at;  // the first call that the plan made fail
    trapped_call calls[MAX_CALLS];

    bool is_whole() const { return count <= MAX_CALLS; }
};
call_trace *make_shared_trace();
// Likewise, of any size; null where there is none.
void *make_shared_memory(std::size_t size);

// What becomes of the calls, which are counted from 0; -1: of none.
struct trap_plan {
    int die_before = -1;
    bool torn = false;  // half of what that call was to write is written before the death
    int fail_at = -1;
    int error = 0;              // 0: the write is short
    int error_after_short = 0;  // of the next write to that path
    bool for_ever = false;      // from then on every such call on that path fails
    // Which way the call of fail_at fails is chosen when it is seen, from the call alone: it sets
    // error, error_after_short and for_ever. False where it cannot fail; it then does not.
    bool (*choose)(const trapped_call &call, unsigned choice, trap_plan *plan) = nullptr;
    unsigned choice = 0;
    // From a call on the whole disk is bad: each call that writes on it fails like that; those that
    // open what is there in order to write do where the disk is read-only.
    int disk_fails_at = -1;
    int disk_error = 0;
    // A call and a path that fail from the beginning, beside all that.
    const char *also_call = nullptr;
    const char *also_path = nullptr;
    int also_error = 0;
};

// Sends all calls of the process but those that touch no file through here, for good; children
// inherit it. False with errno set where the kernel refuses.
bool install_call_trap();

// Between the two, calls are recorded and the plan is followed. A path below the folder is recorded
// without it. Close closes also where it is made to fail.
void begin_trap(call_trace *recorded, const trap_plan &wanted, const std::string &folder = "");
void end_trap();
// With what was chosen meanwhile.
const trap_plan &followed_plan();

// The first call that was made between the two, by whatever process, though the proofs do not know
// it: one that may change a file, and that could neither be told of nor struck. It was not made,
// and failed with ENOSYS. "" for none; what proves anything by the trap fails with it.
std::string unknown_call();

// "<call> <path>"
std::string line_of(const trapped_call &call);
