// tests/unit/usermgmt/reread_lines.cpp: account lines on their way through memory, altered and
// watched.
#include "tests/unit/usermgmt/reread_lines.h"

#include <cerrno>
#include <cstdio>
#include <utility>

static reread_lines *active;

reread_lines::reread_lines() {
    active = this;
}

reread_lines::~reread_lines() {
    active = nullptr;
}

// The last record's strings are still in the C library's buffer at the end of a file.
template <typename record>
record *reread_lines::pass_on(record *line, record *last,
                              const std::function<void(record *)> &alter) {
    if (line == nullptr)
        return repeat_last && std::exchange(has_last_, false) ? last : nullptr;
    *last = *line;
    has_last_ = true;
    if (alter)
        alter(line);
    return line;
}

// The linker sends the calls here (--wrap).

struct passwd *real_fgetpwent(FILE *stream) asm("__real_fgetpwent");
struct passwd *wrap_fgetpwent(FILE *stream) asm("__wrap_fgetpwent");
struct passwd *wrap_fgetpwent(FILE *stream) {
    static struct passwd last;
    struct passwd *line = real_fgetpwent(stream);
    return active != nullptr ? active->pass_on(line, &last, active->on_passwd) : line;
}

struct spwd *real_fgetspent(FILE *stream) asm("__real_fgetspent");
struct spwd *wrap_fgetspent(FILE *stream) asm("__wrap_fgetspent");
struct spwd *wrap_fgetspent(FILE *stream) {
    static struct spwd last;
    struct spwd *line = real_fgetspent(stream);
    return active != nullptr ? active->pass_on(line, &last, active->on_shadow) : line;
}

struct group *real_fgetgrent(FILE *stream) asm("__real_fgetgrent");
struct group *wrap_fgetgrent(FILE *stream) asm("__wrap_fgetgrent");
struct group *wrap_fgetgrent(FILE *stream) {
    static struct group last;
    struct group *line = real_fgetgrent(stream);
    return active != nullptr ? active->pass_on(line, &last, active->on_group) : line;
}

FILE *real_fopencookie(void *cookie, const char *mode,
                       cookie_io_functions_t functions) asm("__real_fopencookie");
FILE *wrap_fopencookie(void *cookie, const char *mode,
                       cookie_io_functions_t functions) asm("__wrap_fopencookie");
FILE *wrap_fopencookie(void *cookie, const char *mode, cookie_io_functions_t functions) {
    if (active == nullptr || active->write_stream_error == 0)
        return real_fopencookie(cookie, mode, functions);
    errno = active->write_stream_error;
    return nullptr;
}

FILE *real_fmemopen(void *text, size_t size, const char *mode) asm("__real_fmemopen");
FILE *wrap_fmemopen(void *text, size_t size, const char *mode) asm("__wrap_fmemopen");
FILE *wrap_fmemopen(void *text, size_t size, const char *mode) {
    if (active == nullptr || active->read_stream_error == 0)
        return real_fmemopen(text, size, mode);
    errno = active->read_stream_error;
    return nullptr;
}
