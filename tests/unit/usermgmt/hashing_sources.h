// tests/unit/usermgmt/hashing_sources.h: what hashing takes from outside (randomness, the time,
// crypt), seen and replaced.
#pragma once

#include <sys/types.h>

#include <ctime>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "tests/unit/usermgmt/log_capture.h"
#include "tests/unit/usermgmt/secret_watch.h"

// While it lives, the calls named here answer as its members say; those that say nothing leave the
// answer to the C library.
class hashing_sources {
  public:
    hashing_sources();
    ~hashing_sources();
    hashing_sources(const hashing_sources &) = delete;
    hashing_sources &operator=(const hashing_sources &) = delete;

    std::optional<time_t> now;
    std::optional<pid_t> pid;
    std::optional<clock_t> ticks;

    // What a read of /dev/urandom gives, as far as the reader asks for it, or how it fails.
    std::optional<std::string> random;
    int read_error = 0;
    // How many bytes each read of /dev/urandom asked for.
    std::vector<std::size_t> reads;

    // The answers of the next calls of crypt, with the error number that each leaves behind; 0
    // leaves errno as it was.
    struct answer {
        const char *hash;
        int error;
    };
    std::vector<answer> answers;
    // Answers the calls beyond those, in place of the C library.
    std::function<std::string(const char *clear_text, const char *setting)> stand_in;
    // The setting of each call of crypt.
    lines settings;
    // What is left in the memory that the last answer was in.
    std::string left_of_answer() const;
    // Every hash that crypt answered.
    lines hashes;
    // Told of each copy that is made of an answer of crypt.
    secret_watch *watch = nullptr;

    // For the wrapped calls.
    char *crypt(const char *clear_text, const char *setting);
    void copied(const char *original, const char *copy) const;

  private:
    std::string taken_;  // memory of an answer of the test's own
    const char *last_ = nullptr;
    std::size_t last_size_ = 0;
};
