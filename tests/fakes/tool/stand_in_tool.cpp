// tests/fakes/tool/stand_in_tool.cpp: a program that stands in a tool's place.
//
// It talks through the folder /run/stand-ins/NAME (tests/fakes/folder), NAME being that of the file
// which is run, whatever argv[0] says. A call's words are argv. Further files:
//   output        the bytes that go to standard output
//   error-output  those that go to standard error
//   linger        milliseconds for which it lives on after it has closed both
//   status        the exit status
// It leaves behind:
//   descriptors  a line for each of those that it was started with: the number and what it leads to
//   environment  its environment, as /proc/self/environ shows it
#include <dirent.h>
#include <unistd.h>

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

static void tell(const std::string &here, const char *name, const std::string &content) {
    g_autofree char *path = g_build_filename(here.c_str(), name, nullptr);
    if (!g_file_set_contents(path, content.data(), static_cast<gssize>(content.size()), nullptr))
        g_error("a stand-in cannot tell its %s", name);
}

static std::string descriptors() {
    DIR *folder = opendir("/proc/self/fd");
    std::string lines;
    while (const struct dirent *entry = readdir(folder)) {
        if (entry->d_name[0] == '.' || atoi(entry->d_name) == dirfd(folder))
            continue;
        g_autofree char *path = g_build_filename("/proc/self/fd", entry->d_name, nullptr);
        g_autofree char *target = g_file_read_link(path, nullptr);
        lines += std::string(entry->d_name) + " " + target + "\n";
    }
    (void)closedir(folder);
    return lines;
}

static std::string environment() {
    g_autofree char *content = nullptr;
    gsize length = 0;
    if (!g_file_get_contents("/proc/self/environ", &content, &length, nullptr))
        g_error("a stand-in cannot read its environment");
    return {content, length};
}

static void print(const std::string &here, const char *name, FILE *stream) {
    g_autofree char *path = g_build_filename(here.c_str(), name, nullptr);
    g_autofree char *output = nullptr;
    gsize length = 0;
    if (g_file_get_contents(path, &output, &length, nullptr))
        (void)fwrite(output, 1, length, stream);
    (void)fflush(stream);
}

int main(int argc, char **argv) {
    const std::string here = folder();
    tell(here, "descriptors", descriptors());
    tell(here, "environment", environment());
    fake_record(here.c_str(), {argv, static_cast<gsize>(argc)});

    print(here, "output", stdout);
    print(here, "error-output", stderr);
    const int status = fake_number(here.c_str(), "status");
    if (const int milliseconds = fake_number(here.c_str(), "linger"); milliseconds != 0) {
        (void)fclose(stdout);
        (void)fclose(stderr);
        g_usleep(static_cast<gulong>(milliseconds) * 1000);
    }
    return status;
}
