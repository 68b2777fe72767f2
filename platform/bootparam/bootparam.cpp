// platform/bootparam/bootparam.cpp: named parameters in the boot block, through libubootenv.
#include "platform/bootparam/bootparam.h"

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <cstdlib>
#include <cstring>

#include <malloc.h>

#include <libuboot.h>

#include "platform/bootparam/boot_copies.h"
#include "platform/bootparam/boot_lock.h"

static constexpr const char *DEFAULT_CONFIG = "/etc/fw_env.config";
static constexpr int ONLY_UNIT = 0;

// U-Boot's list of what the other parameters may hold, which is no parameter for libubootenv.
static constexpr const char *FLAGS = ".flags";

// libubootenv writes its image buffer whole, with whatever the heap held behind the last parameter.
// With this value malloc hands out memory that is all zero, from then on and to the whole process;
// but for what its caches of small pieces hold, which an environment variable turns off.
static constexpr int PERTURB_TO_ZERO = 255;

static int fail(int result, int cause, int *error) {
    if (error != nullptr)
        *error = cause;
    errno = cause;
    return result;
}

// An environment, released when it goes out of scope. The functions that fail return a negative
// errno value, or a bare -1 with errno set.
class environment {
  public:
    environment() = default;
    ~environment() {
        if (ctx_ == nullptr)
            return;
        const int saved_errno = errno;
        // A failed open keeps its lock, for which the next one would wait for ever.
        libuboot_close(ctx_);
        libuboot_exit(ctx_);
        errno = saved_errno;
    }
    environment(const environment &) = delete;
    environment &operator=(const environment &) = delete;

    // libubootenv does not survive a copy smaller than its header.
    int configure(const bootparam_chip *chip) {
        int result = libuboot_initialize(&ctx_, nullptr);
        if (result == 0)
            result = libuboot_read_config(ctx_, chip->config_path);
        return result == 0 ? copies_.read_config(chip->config_path) : result;
    }

    // -ENODATA when no copy is valid; the environment is then empty.
    int open() {
        boot_lock lock;
        int result = lock.take();
        if (result == 0)
            result = copies_.open();
        if (result == 0)
            result = copies_.check_ends();
        lock.give_back();
        if (result == 0)
            result = libuboot_open(ctx_);
        // libubootenv holds the lock now. Somebody may have written before it did.
        return result == 0 ? copies_.check_ends() : result;
    }

    char *get(const char *name) { return libuboot_get_env(ctx_, name); }
    int set(const char *name, const char *value) { return libuboot_set_env(ctx_, name, value); }

    int store() {
        // libubootenv takes a list whose empty string behind the last parameter does not fit any
        // more, and then cannot read it; and it writes a list of flags beyond the end.
        std::size_t flags = 0;
        int result = copies_.flags_length(&flags);
        if (result != 0)
            return result;
        if (copies_.has_unchecked())
            flags = std::max(flags, longest_flags());
        if (length() + flags + 1 > copies_.capacity())
            return -ENOSPC;
        result = libuboot_env_store(ctx_);
        return result == 0 ? copies_.sync() : result;
    }

  private:
    // Of the parameters, each with its "=" and its NUL.
    std::size_t length() const {
        std::size_t used = 0;
        for (void *entry = libuboot_iterator(ctx_, nullptr); entry != nullptr;
             entry = libuboot_iterator(ctx_, entry))
            used +=
                std::strlen(libuboot_getname(entry)) + std::strlen(libuboot_getvalue(entry)) + 2;
        return used;
    }

    // A list of flags that names every parameter, each between a separator and its letters.
    std::size_t longest_flags() const {
        std::size_t longest = std::strlen(FLAGS) + 1;
        for (void *entry = libuboot_iterator(ctx_, nullptr); entry != nullptr;
             entry = libuboot_iterator(ctx_, entry))
            longest += std::strlen(libuboot_getname(entry)) + 2 + boot_copies::FLAG_LETTERS;
        return longest;
    }

    struct uboot_ctx *ctx_ = nullptr;
    boot_copies copies_;
};

static bool has_control_character(const char *text) {
    for (; *text != '\0'; text++)
        if (static_cast<unsigned char>(*text) < ' ' || *text == '\x7f')
            return true;
    return false;
}

static bool is_name(const char *name) {
    return name != nullptr && *name != '\0' && std::strchr(name, '=') == nullptr &&
           std::strcmp(name, FLAGS) != 0 && !has_control_character(name);
}

static bool is_value(const char *value) {
    return value != nullptr && *value != '\0' && !has_control_character(value);
}

static bool is_chip(const bootparam_chip *chip) {
    return chip != nullptr && *chip->config_path != '\0' &&
           std::memchr(chip->config_path, '\0', sizeof chip->config_path) != nullptr;
}

// libubootenv says no more than -1 or -EBADF where a file cannot be opened or written.
static int cause_of(int result) {
    if (result == -EBADF || result >= -1)
        return errno != 0 ? errno : EIO;
    return -result;
}

void bootparam_default_chip(struct bootparam_chip *chip) {
    *chip = {};
    std::memcpy(chip->config_path, DEFAULT_CONFIG, std::strlen(DEFAULT_CONFIG));
}

int bootparam_set_chip(int unit, int *error, struct bootparam_chip *chip) {
    if (unit != ONLY_UNIT || !is_chip(chip))
        return fail(BOOTPARAM_INVALID, EINVAL, error);
    errno = 0;
    environment boot;
    const int result = boot.configure(chip);
    return result == 0 ? BOOTPARAM_OK : fail(BOOTPARAM_FAILED, cause_of(result), error);
}

int bootparam_read(const char *name, char **value, int flags, int *error,
                   struct bootparam_chip *chip) {
    if (!is_name(name) || value == nullptr || flags != 0 || !is_chip(chip))
        return fail(BOOTPARAM_INVALID, EINVAL, error);

    errno = 0;
    environment boot;
    int result = boot.configure(chip);
    if (result == 0)
        result = boot.open();
    if (result == -ENODATA)
        return fail(BOOTPARAM_BLANK, ENODATA, error);
    if (result != 0)
        return fail(BOOTPARAM_FAILED, cause_of(result), error);

    char *found = boot.get(name);
    if (found == nullptr)
        return fail(BOOTPARAM_ABSENT, ENOENT, error);
    *value = found;
    return BOOTPARAM_OK;
}

int bootparam_write(const char *name, const char *value, int *error, struct bootparam_chip *chip) {
    if (!is_name(name) || !is_value(value) || !is_chip(chip))
        return fail(BOOTPARAM_INVALID, EINVAL, error);

    (void)mallopt(M_PERTURB, PERTURB_TO_ZERO);
    errno = 0;
    environment boot;
    int result = boot.configure(chip);
    if (result == 0)
        result = boot.open();
    if (result == 0 || result == -ENODATA)
        result = boot.set(name, value);
    if (result == 0)
        result = boot.store();
    return result == 0 ? BOOTPARAM_OK : fail(BOOTPARAM_FAILED, cause_of(result), error);
}
