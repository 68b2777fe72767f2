// tests/unit/usermgmt/hashing_sources.cpp: what hashing takes from outside (randomness, the time,
// crypt), seen and replaced.
#include "tests/unit/usermgmt/hashing_sources.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include <glib.h>

static hashing_sources *active;

hashing_sources::hashing_sources() {
    active = this;
}

hashing_sources::~hashing_sources() {
    active = nullptr;
}

std::string hashing_sources::left_of_answer() const {
    return last_ != nullptr ? std::string(last_, last_size_) : "(no answer)";
}

void hashing_sources::copied(const char *original, const char *copy) const {
    if (watch != nullptr && original == last_)
        watch->add(copy);
}

// The linker sends the calls here (--wrap).

char *real_crypt(const char *clear_text, const char *setting) asm("__real_crypt");
char *wrap_crypt(const char *clear_text, const char *setting) asm("__wrap_crypt");
char *wrap_crypt(const char *clear_text, const char *setting) {
    return active != nullptr ? active->crypt(clear_text, setting) : real_crypt(clear_text, setting);
}

char *hashing_sources::crypt(const char *clear_text, const char *setting) {
    settings.emplace_back(setting);
    char *result = nullptr;
    if (answers.empty() && stand_in) {
        taken_ = stand_in(clear_text, setting);
        result = taken_.data();
        if (result[0] == '*')
            errno = EINVAL;
    } else if (answers.empty()) {
        result = real_crypt(clear_text, setting);
    } else {
        const answer next = answers.front();
        answers.erase(answers.begin());
        taken_ = next.hash != nullptr ? next.hash : "";
        result = next.hash != nullptr ? taken_.data() : nullptr;
        if (next.error != 0)
            errno = next.error;
    }
    last_ = result;
    last_size_ = result != nullptr ? std::strlen(result) : 0;
    if (result != nullptr)
        hashes.emplace_back(result);
    return result;
}

char *real_g_strdup(const char *text) asm("__real_g_strdup");
char *wrap_g_strdup(const char *text) asm("__wrap_g_strdup");
char *wrap_g_strdup(const char *text) {
    char *copy = real_g_strdup(text);
    if (active != nullptr && text != nullptr)
        active->copied(text, copy);
    return copy;
}

static bool is_random_device(int fd) {
    char target[64] = {};
    const std::string link = "/proc/self/fd/" + std::to_string(fd);
    return readlink(link.c_str(), target, sizeof target - 1) > 0 &&
           std::strcmp(target, "/dev/urandom") == 0;
}

ssize_t real_read(int fd, void *buffer, size_t size) asm("__real_read");
ssize_t wrap_read(int fd, void *buffer, size_t size) asm("__wrap_read");
ssize_t wrap_read(int fd, void *buffer, size_t size) {
    if (active == nullptr || !is_random_device(fd))
        return real_read(fd, buffer, size);
    active->reads.push_back(size);
    if (active->read_error != 0) {
        errno = active->read_error;
        return -1;
    }
    if (!active->random)
        return real_read(fd, buffer, size);
    const std::size_t given = std::min(size, active->random->size());
    std::memcpy(buffer, active->random->data(), given);
    return static_cast<ssize_t>(given);
}

time_t real_time(time_t *out) asm("__real_time");
time_t wrap_time(time_t *out) asm("__wrap_time");
time_t wrap_time(time_t *out) {
    if (active == nullptr || !active->now)
        return real_time(out);
    if (out != nullptr)
        *out = *active->now;
    return *active->now;
}

pid_t real_getpid() asm("__real_getpid");
pid_t wrap_getpid() asm("__wrap_getpid");
pid_t wrap_getpid() {
    return active != nullptr && active->pid ? *active->pid : real_getpid();
}

clock_t real_clock() asm("__real_clock");
clock_t wrap_clock() asm("__wrap_clock");
clock_t wrap_clock() {
    return active != nullptr && active->ticks ? *active->ticks : real_clock();
}
