// check/file_review.h: whether an account file is one that a write can replace.
#pragma once

#include "check/findings.h"
#include "check/mount_points.h"
#include "usermgmt/core_file.h"

// Looks at the file itself, not at its lines. False where it cannot be read or is not there.
bool review_file(const core_file &file, const mount_points &mounts, findings *out);
