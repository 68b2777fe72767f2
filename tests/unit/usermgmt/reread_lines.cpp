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

// The last record's strings are still in the reader's room at the end of a file.
template <typename record>
int reread_lines::pass_on(int error, record *line, record **result, record *last,
                          const std::function<void(record *)> &alter) {
    calls++;
    if (error == 0) {
        *last = *line;
        has_last_ = true;
        if (alter)
            alter(line);
    } else if (error == ENOENT && repeat_last && std::exchange(has_last_, false)) {
        *line = *last;
        *result = line;
        return 0;
    }
    return error;
}

// The linker sends the calls here (--wrap).

int real_fgetpwent_r(FILE *stream, struct passwd *line, char *room, size_t size,
                     struct passwd **result) asm("__real_fgetpwent_r");
int wrap_fgetpwent_r(FILE *stream, struct passwd *line, char *room, size_t size,
                     struct passwd **result) asm("__wrap_fgetpwent_r");
int wrap_fgetpwent_r(FILE *stream, struct passwd *line, char *room, size_t size,
                     struct passwd **result) {
    static struct passwd last;
    const int error = real_fgetpwent_r(stream, line, room, size, result);
    return active != nullptr ? active->pass_on(error, line, result, &last, active->on_passwd)
                             : error;
}

int real_fgetspent_r(FILE *stream, struct spwd *line, char *room, size_t size,
                     struct spwd **result) asm("__real_fgetspent_r");
int wrap_fgetspent_r(FILE *stream, struct spwd *line, char *room, size_t size,
                     struct spwd **result) asm("__wrap_fgetspent_r");
int wrap_fgetspent_r(FILE *stream, struct spwd *line, char *room, size_t size,
                     struct spwd **result) {
    static struct spwd last;
    const int error = real_fgetspent_r(stream, line, room, size, result);
    return active != nullptr ? active->pass_on(error, line, result, &last, active->on_shadow)
                             : error;
}

int real_fgetgrent_r(FILE *stream, struct group *line, char *room, size_t size,
                     struct group **result) asm("__real_fgetgrent_r");
int wrap_fgetgrent_r(FILE *stream, struct group *line, char *room, size_t size,
                     struct group **result) asm("__wrap_fgetgrent_r");
int wrap_fgetgrent_r(FILE *stream, struct group *line, char *room, size_t size,
                     struct group **result) {
    static struct group last;
    const int error = real_fgetgrent_r(stream, line, room, size, result);
    return active != nullptr ? active->pass_on(error, line, result, &last, active->on_group)
                             : error;
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
