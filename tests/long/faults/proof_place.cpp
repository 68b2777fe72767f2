// tests/long/faults/proof_place.cpp: where the proofs work: a /etc and a folder of their own.
#include "tests/long/faults/proof_place.h"

#include <cstdio>
#include <filesystem>

#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <glib.h>

#include "tests/long/faults/call_trap.h"
#include "tests/long/faults/folder_state.h"
#include "tests/unit/platform/private_etc.h"

static constexpr const char *OUTSIDE = "outside";
static constexpr const char *OUTSIDE_TEXT = "not to be touched\n";

proof_place::proof_place() {
    ready_ = prepare();
    if (!ready_)
        std::perror("no place to work in");
}

// Memory, so that renames wait for no disk; and modes are what the product asks for.
bool proof_place::prepare() {
    (void)umask(0);
    if (!enter_private_etc() ||
        mount("tmpfs", "/run/lock", "tmpfs", MS_NOSUID | MS_NODEV, "mode=1777") != 0)
        return false;
    const std::string parent = access("/dev/shm", W_OK) == 0 ? "/dev/shm" : g_get_tmp_dir();
    folder_ = parent + "/faults-XXXXXX";
    if (g_mkdtemp(folder_.data()) == nullptr || chdir(folder_.c_str()) != 0 ||
        mkdir("etc", 0755) != 0)
        return false;
    return g_file_set_contents(OUTSIDE, OUTSIDE_TEXT, -1, nullptr) && install_call_trap();
}

proof_place::~proof_place() {
    std::error_code ignored;
    if (!folder_.empty())
        std::filesystem::remove_all(folder_, ignored);
}

bool outside_is_untouched() {
    const folder_state beside = look_at_folder(".");
    return beside.count("nowhere") == 0 && beside.count(OUTSIDE) == 1 &&
           beside.at(OUTSIDE).text == OUTSIDE_TEXT;
}
