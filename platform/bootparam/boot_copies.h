// platform/bootparam/boot_copies.h: the copies of the boot environment, beside libubootenv, which
// keeps them to itself; internal.
#pragma once

#include <cstddef>
#include <cstdlib>
#include <memory>

#include <sys/types.h>

#include "platform/bootparam/copy_kind.h"

// The copies that a description names: one, or two that are written in turn. What fails answers a
// negative errno value.
class boot_copies {
  public:
    // libubootenv may write two letters for a parameter where U-Boot's list of flags had fewer.
    static constexpr std::size_t FLAG_LETTERS = 2;

    boot_copies() = default;
    ~boot_copies();
    boot_copies(const boot_copies &) = delete;
    boot_copies &operator=(const boot_copies &) = delete;

    // Reads the description, which libubootenv has taken. -EINVAL where it names no copy, or one
    // that could hold no parameter.
    int read_config(const char *path);

    // Finds what kind each copy is and opens those that are kept open: before a write, so that sync
    // learns of all that failed since. Unchecked, too, is a copy whose device has a name that only
    // libubootenv resolves.
    int open();

    // Whether any copy is never read here; then so much is left to libubootenv.
    bool has_unchecked() const;

    // -EBADMSG where a copy that is valid has no end to its parameters: libubootenv would read on
    // behind it. -EIO where a copy cannot be read whole. The copies are open, as for those below,
    // and somebody holds the lock: nobody writes.
    int check_ends() const;

    // What of a copy is left for parameters.
    std::size_t capacity() const;

    // The longest list of flags in any copy, with what libubootenv adds to it when it writes the
    // list again; 0 where there is none. -EIO where a copy cannot be read whole.
    int flags_length(std::size_t *out_length) const;

    // libubootenv does not look at the result of its own fsync.
    int sync() const;

  private:
    static constexpr int MAX_COPIES = 2;

    struct copy {
        char *device;
        off_t offset;  // from the end where it is negative
        std::size_t size;
        copy_kind kind;
        int fd;  // below 0 but for those that are kept open
    };

    struct from_malloc {
        void operator()(char *bytes) const { std::free(bytes); }
    };
    using copy_bytes = std::unique_ptr<char, from_malloc>;

    bool read_line(const char *line);
    static int open_copy(copy *one);
    // All bytes of the copy; null, and errno, where there are fewer.
    static copy_bytes read_copy(const copy &one);

    copy copies_[MAX_COPIES] = {};
    int count_ = 0;
};
