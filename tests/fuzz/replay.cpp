// tests/fuzz/replay.cpp: runs a fuzz target over the files of a folder, in place of a fuzz engine.
#include <dirent.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>

#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/scratch.h"

// Null in a target that has none.
extern "C" int LLVMFuzzerInitialize(int *argc, char ***argv) __attribute__((weak));

// Each file is run twice in a row: what one input leaves behind must not change the next.
static constexpr int TIMES = 2;

static std::vector<std::string> names_in(const char *folder) {
    std::vector<std::string> names;
    DIR *listing = opendir(folder);
    if (listing == nullptr)
        return names;
    while (const struct dirent *entry = readdir(listing))
        if (entry->d_type == DT_REG)
            names.emplace_back(entry->d_name);
    (void)closedir(listing);
    std::sort(names.begin(), names.end());
    return names;
}

int main(int argc, char **argv) {
    if (argc != 2) {
        (void)std::fprintf(stderr, "usage: %s FOLDER\n", argv[0]);
        return 2;
    }
    const std::string folder = argv[1];
    const std::vector<std::string> names = names_in(folder.c_str());
    if (names.empty()) {
        (void)std::fprintf(stderr, "%s holds no input\n", folder.c_str());
        return 1;
    }
    if (LLVMFuzzerInitialize != nullptr && LLVMFuzzerInitialize(&argc, &argv) != 0)
        return 1;

    for (const std::string &name : names) {
        const std::string path = folder + "/" + name;
        hold(access(path.c_str(), R_OK) == 0, "the inputs can be read", path);
        const std::string input = read_whole(path);
        (void)std::printf("%s\n", name.c_str());
        (void)std::fflush(stdout);
        for (int i = 0; i < TIMES; i++)
            (void)LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t *>(input.data()),
                                         input.size());
    }
    (void)std::printf("%zu inputs hold\n", names.size());
    return 0;
}
