// tests/unit/platform/digest_file_tool.cpp: the digest library's operations on a file anywhere, as
// a program: digest_file_tool FILE, then lines "set USER PASSWORD" or "delete USER" on standard
// input, each answered by its number.
#include <cstdio>
#include <cstring>

#include "platform/digest_entry/digest_file.h"

static int run(const char *path, char *line) {
    char *rest = nullptr;
    const char *verb = strtok_r(line, " \n", &rest);
    const char *user = strtok_r(nullptr, " \n", &rest);
    const char *password = strtok_r(nullptr, " \n", &rest);

    if (verb != nullptr && user != nullptr && password != nullptr)
        return digest_file_set(path, user, password);
    return user != nullptr ? digest_file_delete(path, user) : -1;
}

int main(int argc, char **argv) {
    char line[1024];

    while (argc == 2 && std::fgets(line, sizeof line, stdin) != nullptr) {
        (void)std::printf("%d\n", run(argv[1], line));
        (void)std::fflush(stdout);
    }
    return argc == 2 ? 0 : 2;
}
