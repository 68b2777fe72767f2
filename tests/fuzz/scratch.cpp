// tests/fuzz/scratch.cpp: a folder of the process's own, in memory where there is some.
#include "tests/fuzz/scratch.h"

#include <fcntl.h>
#include <stdlib.h>
#include <unistd.h>

#include <filesystem>

#include "tests/fuzz/fuzz.h"

namespace {

class scratch_folder {
  public:
    scratch_folder();
    ~scratch_folder();
    scratch_folder(const scratch_folder &) = delete;
    scratch_folder &operator=(const scratch_folder &) = delete;

    const std::string &path() const { return path_; }

  private:
    std::string path_;
};

}  // namespace

scratch_folder::scratch_folder() {
    const char *wanted = getenv("TMPDIR");
    const std::string memory = access("/dev/shm", W_OK) == 0 ? "/dev/shm" : "/tmp";

    path_ = (wanted != nullptr ? wanted : memory) + "/fuzz-XXXXXX";
    hold(mkdtemp(path_.data()) != nullptr, "a scratch folder can be made", path_);
}

scratch_folder::~scratch_folder() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
}

const std::string &scratch_path() {
    static const scratch_folder folder;
    return folder.path();
}

void write_whole(const std::string &path, std::string_view text) {
    const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    const bool written =
        fd >= 0 && write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size());
    hold(written && close(fd) == 0, "a scratch file can be written", path);
}

std::string read_whole(const std::string &path) {
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    std::string text;
    char block[16384];
    ssize_t length = 0;

    while (fd >= 0 && (length = read(fd, block, sizeof block)) > 0)
        text.append(block, static_cast<std::size_t>(length));
    if (fd >= 0)
        (void)close(fd);
    return text;
}
