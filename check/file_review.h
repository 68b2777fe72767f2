// check/file_review.h: whether an account file is one that a write can replace.
#pragma once

#include "check/findings.h"
#include "check/mount_points.h"
#include "usermgmt/core_file.h"

// What becomes of a service that opens the file.
enum class file_state {
    READABLE,  // an ordinary file: its lines can be judged
    ABSENT,    // the service does without it
    HOPELESS,  // the service does not start
    UNKNOWN,   // the service may start, and with what lines is not known
};

// Looks at the file itself, not at its lines.
file_state review_file(const core_file &file, const mount_points &mounts, findings *out);

// Tells of a gshadow file, which the service neither reads nor writes.
void review_gshadow(findings *out);
