#!/bin/bash
# tests/bus/policy_library.sh: puts the libauthz that a policy file answers into an installed build.
#
#   policy_library.sh BUILD_DIR IMAGE POLICY_FILE
#
# In the place of the one that BUILD_DIR has installed into IMAGE, as another package would, with
# POLICY_FILE as its file. Exit status: 0, or 125 with a line that says why.
set -euo pipefail

die() { echo "policy_library.sh: $*" >&2; exit 125; }

build=$1 image=$2 policy=$3
library=$(find "$image" -name 'libauthz.so.1.*' -type f)
[ -f "$library" ] || die "$build installs no libauthz"
other=$build/platform/authz/policy/$(basename "$library")
[ -f "$other" ] || die "$build lacks the libauthz of the policy file; build it with -Dtests=true"
cp -- "$other" "$library" && install -D -m 644 -- "$policy" "$image/etc/privane/authz.conf" ||
    die "cannot put the libauthz of the policy file into $image"
