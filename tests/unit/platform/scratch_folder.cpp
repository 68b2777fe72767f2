// tests/unit/platform/scratch_folder.cpp: a temporary folder for one test, and the files in it.
#include "tests/unit/platform/scratch_folder.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <system_error>

#include <glib.h>

namespace fs = std::filesystem;

scratch_folder::scratch_folder() {
    std::string path = fs::temp_directory_path() / "platform-test-XXXXXX";

    if (mkdtemp(path.data()) == nullptr)
        std::abort();
    path_ = path;
}

scratch_folder::~scratch_folder() {
    std::error_code ignored;
    fs::remove_all(path_, ignored);
}

void scratch_folder::write(const std::string &name, const std::string &text) const {
    std::FILE *file = std::fopen(path(name).c_str(), "we");

    if (file == nullptr || std::fwrite(text.data(), 1, text.size(), file) != text.size() ||
        std::fclose(file) != 0)
        std::abort();
}

std::string scratch_folder::read(const std::string &name) const {
    g_autofree char *text = nullptr;
    gsize length = 0;

    if (!g_file_get_contents(path(name).c_str(), &text, &length, nullptr))
        return "[missing]";
    return {text, length};
}

bool scratch_folder::exists(const std::string &name) const {
    return fs::symlink_status(path(name)).type() != fs::file_type::not_found;
}

struct stat scratch_folder::status(const std::string &name) const {
    struct stat found = {};
    struct stat none = {};

    return lstat(path(name).c_str(), &found) == 0 ? found : none;
}

std::vector<std::string> scratch_folder::names() const {
    std::vector<std::string> names;

    for (const fs::directory_entry &entry : fs::directory_iterator(path_))
        names.push_back(entry.path().filename().string());
    std::sort(names.begin(), names.end());
    return names;
}
