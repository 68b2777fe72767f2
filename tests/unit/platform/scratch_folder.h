// tests/unit/platform/scratch_folder.h: a temporary folder for one test, and the files in it.
#pragma once

#include <string>
#include <vector>

#include <sys/stat.h>

// Is removed with all that is in it.
class scratch_folder {
  public:
    scratch_folder();
    ~scratch_folder();
    scratch_folder(const scratch_folder &) = delete;
    scratch_folder &operator=(const scratch_folder &) = delete;

    std::string path() const { return path_; }
    std::string path(const std::string &name) const { return path_ + "/" + name; }

    void write(const std::string &name, const std::string &text) const;
    // "[missing]" where there is no such file.
    std::string read(const std::string &name) const;
    bool exists(const std::string &name) const;
    // Of a link itself. All zero where there is no such file.
    struct stat status(const std::string &name) const;
    // The names in the folder, sorted.
    std::vector<std::string> names() const;

  private:
    std::string path_;
};
