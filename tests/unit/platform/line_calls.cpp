// tests/unit/platform/line_calls.cpp: stands in front of getline, which may have another name.
#include "tests/unit/platform/line_calls.h"

#include <cstddef>
#include <cstdio>

#include <fcntl.h>
#include <sys/types.h>
#include <unistd.h>

static int calls;
static int failing_call;

void watch_line_calls(int failing) {
    calls = 0;
    failing_call = failing;
}

int line_calls() {
    return calls;
}

// A stream still has what is in its buffer, and a folder cannot be read.
static void before_line(FILE *stream) {
    calls++;
    if (calls == 1 && failing_call > 0)
        (void)setvbuf(stream, nullptr, _IONBF, 0);
    if (calls != failing_call)
        return;
    const int folder = open("/", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    (void)dup3(folder, fileno(stream), O_CLOEXEC);
    (void)close(folder);
}

extern "C" {

ssize_t __real___getdelim(char **line, std::size_t *size, int end, FILE *stream);
ssize_t __real_getline(char **line, std::size_t *size, FILE *stream);
ssize_t __wrap___getdelim(char **line, std::size_t *size, int end, FILE *stream);
ssize_t __wrap_getline(char **line, std::size_t *size, FILE *stream);

ssize_t __wrap___getdelim(char **line, std::size_t *size, int end, FILE *stream) {
    before_line(stream);
    return __real___getdelim(line, size, end, stream);
}

ssize_t __wrap_getline(char **line, std::size_t *size, FILE *stream) {
    before_line(stream);
    return __real_getline(line, size, stream);
}
}
