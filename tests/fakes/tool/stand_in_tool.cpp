// tests/fakes/tool/stand_in_tool.cpp: a program that stands in a tool's place.
//
// It talks through the folder /run/stand-ins/NAME (tests/fakes/folder), NAME being that of the file
// which is run, whatever argv[0] says. A call's words are argv. Further files:
//   output  the bytes that go to standard output
//   status  the exit status
// It leaves behind:
//   descriptors  the numbers of those that it was started with
#include <dirent.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include <glib.h>

#include "tests/fakes/folder/fake_folder.h"

static std::string folder() {
    g_autofree char *program = g_file_read_link("/proc/self/exe", nullptr);
    if (program == nullptr)
        g_error("a stand-in cannot tell which file it is");
    g_autofree char *name = g_path_get_basename(program);
    return std::string("/run/stand-ins/") + name;
}

static void tell_descriptors(const std::string &here) {
    DIR *folder = opendir("/proc/self/fd");
    std::string numbers;
    while (const struct dirent *entry = readdir(folder))
        if (entry->d_name[0] != '.' && atoi(entry->d_name) != dirfd(folder))
            numbers += std::string(entry->d_name) + "\n";
    (void)closedir(folder);
    g_autofree char *path = g_build_filename(here.c_str(), "descriptors", nullptr);
    if (!g_file_set_contents(path, numbers.c_str(), -1, nullptr))
        g_error("a stand-in cannot tell its descriptors");
}

int main(int argc, char **argv) {
    const std::string here = folder();
    tell_descriptors(here);
    fake_record(here.c_str(), {argv, static_cast<gsize>(argc)});

    g_autofree char *path = g_build_filename(here.c_str(), "output", nullptr);
    g_autofree char *output = nullptr;
    gsize length = 0;
    if (g_file_get_contents(path, &output, &length, nullptr))
        (void)fwrite(output, 1, length, stdout);
    return fake_number(here.c_str(), "status");
}
