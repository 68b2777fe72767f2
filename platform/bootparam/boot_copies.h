// platform/bootparam/boot_copies.h: the copies of the boot environment, beside libubootenv, which
// keeps them to itself; internal.
#pragma once

#include <cstddef>
#include <cstdlib>
#include <memory>

#include <sys/types.h>

// The copies that a description names: one, or two that are written in turn. What fails answers a
// negative errno value.
class boot_copies {
  public:
    boot_copies() = default;
    ~boot_copies();
    boot_copies(const boot_copies &) = delete;
    boot_copies &operator=(const boot_copies &) = delete;

    // Reads the description. -EINVAL where it names no copy that could hold a parameter.
    int read_config(const char *path);

    // Opens their devices. Before a write, so that sync learns of all that failed since.
    int open();

    // -EBADMSG where a copy that is valid has no end to its parameters: libubootenv would read on
    // behind it. -EIO where a copy cannot be read whole. The copies are open.
    int check_ends() const;

    // What of a copy is left for parameters.
    std::size_t capacity() const;

    // The longest list of flags in any copy, with what libubootenv adds to it when it writes the
    // list again; 0 where there is none. -EIO where a copy cannot be read whole. The copies are
    // open.
    int flags_length(std::size_t *out_length) const;

    // libubootenv does not look at the result of its own fsync. The copies are open.
    int sync() const;

  private:
    static constexpr int MAX_COPIES = 2;

    struct copy {
        char *device;
        off_t offset;  // from the end where it is negative
        std::size_t size;
        int fd;
    };

    struct from_malloc {
        void operator()(char *bytes) const { std::free(bytes); }
    };
    using copy_bytes = std::unique_ptr<char, from_malloc>;

    bool read_line(const char *line);
    // All bytes of the copy; null, and errno, where there are fewer.
    static copy_bytes read_copy(const copy &one);

    copy copies_[MAX_COPIES] = {};
    int count_ = 0;
};

// Waits until nobody holds the lock of U-Boot's tools, for at most 3 seconds: -EBUSY. libubootenv
// itself would wait for ever, and would go on without a lock where the file cannot be opened.
int await_boot_lock();
