// tests/fuzz/memory_file.h: a file that is only in memory, with a path to open it by.
#pragma once

#include <string>
#include <string_view>

class memory_file {
  public:
    memory_file();
    ~memory_file();
    memory_file(const memory_file &) = delete;
    memory_file &operator=(const memory_file &) = delete;

    const char *path() const { return path_.c_str(); }
    void fill(std::string_view text) const;

  private:
    int fd_;
    std::string path_;
};
