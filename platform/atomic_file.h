// platform/atomic_file.h: small files that are locked, read, and replaced whole; internal to the
// platform libraries.
#pragma once

#include <cstddef>
#include <string_view>

#include <sys/types.h>

// Bytes that are wiped before their memory is given back, also where they move to grow.
class wiped_text {
  public:
    wiped_text() = default;
    ~wiped_text();
    wiped_text(const wiped_text &) = delete;
    wiped_text &operator=(const wiped_text &) = delete;

    std::string_view view() const { return {bytes_, length_}; }
    void append(std::string_view bytes);
    // Cuts to a length that is not above the present one. The memory stays for what comes next.
    void truncate(std::size_t length) { length_ = length; }

  private:
    char *bytes_ = nullptr;
    std::size_t length_ = 0;
    std::size_t size_ = 0;
};

enum class file_result {
    DONE,
    BUSY,         // another writer held the lock until the deadline
    NO_FOLDER,    // the file's folder cannot be opened
    NO_LOCK,      // the lock file cannot be made, opened or locked
    NOT_REGULAR,  // the file is a link, a folder, a device
    TOO_BIG,      // the file, or what would become of it, is above MAX_SIZE
    NOT_READ,     // the file cannot be opened or read
    NOT_WRITTEN,  // the file could not be replaced, and is as it was
    NOT_SYNCED,   // the file was replaced, but a power cut may bring the old one back
};

struct file_access {
    uid_t owner;
    gid_t group;
    mode_t mode;
};

// One file from its lock to its replacement. Beside the file stand "<path>.lock", which every
// writer locks with flock(2) and nobody ever removes, and, during a replacement, "<path>.tmp".
class atomic_file {
  public:
    // Files beyond are no files of ours; reading on would only fill the memory.
    static constexpr std::size_t MAX_SIZE = 1U << 20;

    // A holder that is stuck must not stop the caller, who has one thread. An honest one takes
    // milliseconds.
    static constexpr int LOCK_DEADLINE_MS = 3000;

    // The path is absolute and outlives this.
    explicit atomic_file(const char *path) : path_(path) {}
    ~atomic_file();  // gives the lock back
    atomic_file(const atomic_file &) = delete;
    atomic_file &operator=(const atomic_file &) = delete;

    // Comes first; nothing but one of the first four results.
    file_result lock(int deadline_ms = LOCK_DEADLINE_MS);

    // Appends what the file holds; a missing file holds nothing.
    file_result read(wiped_text *out_text);

    // After reading, as are the calls below.
    bool exists() const { return exists_; }

    // Of the folder, for the access of a new file.
    file_result folder_group(gid_t *out_group) const;

    // The old file's owner and mode are kept; a new file gets those given.
    file_result replace(std::string_view text, const file_access &of_new_file);

    // Makes what the folder names last. DONE, or NOT_SYNCED.
    file_result sync_folder() const;

    // After a replacement that was not synced: brings back the text that was read, or removes a new
    // file, as far as the disk lets.
    void take_back(std::string_view old_text);

  private:
    file_result open_folder();
    file_result open_lock();
    file_result read_open(int fd, wiped_text *out_text);

    const char *path_;
    int folder_fd_ = -1;
    int lock_fd_ = -1;
    bool exists_ = false;
    file_access access_ = {};
};
