// tests/unit/usermgmt/secret_watch.h: proof that secrets are wiped before they are freed.
#pragma once

#include <string>
#include <vector>

// Watches strings while it lives: what their memory holds at the moment it is given to g_free.
class secret_watch {
  public:
    secret_watch();
    ~secret_watch();
    secret_watch(const secret_watch &) = delete;
    secret_watch &operator=(const secret_watch &) = delete;

    void add(const char *secret);

    // How many of the watched strings were freed with every byte zero, and what the others held.
    int wiped() const { return wiped_; }
    const std::vector<std::string> &readable() const { return readable_; }

    void on_free(const void *memory);

  private:
    struct watched {
        const char *memory;
        std::size_t size;
    };
    std::vector<watched> watched_;
    int wiped_ = 0;
    std::vector<std::string> readable_;
};
