// tests/long/faults/folder_state.cpp: the files of a folder as they lie there, to compare and to
// put back.
#include "tests/long/faults/folder_state.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <sstream>
#include <vector>

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

// A proof that cannot lay out its files proves nothing.
static void demand(bool done, const std::string &what) {
    if (done)
        return;
    std::perror(what.c_str());
    std::exit(125);
}

static std::vector<std::string> names_in(const std::string &folder) {
    std::vector<std::string> names;
    DIR *stream = opendir(folder.c_str());
    demand(stream != nullptr, folder);
    while (const dirent *entry = readdir(stream)) {
        const std::string name = entry->d_name;
        if (name != "." && name != "..")
            names.push_back(name);
    }
    (void)closedir(stream);
    return names;
}

static std::string text_of_link(const std::string &path) {
    char target[256];
    const ssize_t length = readlink(path.c_str(), target, sizeof target);
    return {target, static_cast<std::size_t>(std::max<ssize_t>(length, 0))};
}

static std::string text_of_file(const std::string &path) {
    std::string text;
    char block[16384];
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    demand(fd >= 0, path);
    for (ssize_t length = 1; length > 0;) {
        length = read(fd, block, sizeof block);
        demand(length >= 0, path);
        text.append(block, static_cast<std::size_t>(length));
    }
    (void)close(fd);
    return text;
}

folder_state look_at_folder(const std::string &folder) {
    folder_state state;
    for (const std::string &name : names_in(folder)) {
        const std::string path = folder + "/" + name;
        struct stat status = {};
        demand(lstat(path.c_str(), &status) == 0, path);
        lying_file file = {status.st_mode, status.st_uid, status.st_gid, ""};
        if (S_ISLNK(status.st_mode))
            file.text = text_of_link(path);
        else if (S_ISREG(status.st_mode))
            file.text = text_of_file(path);
        state[name] = file;
    }
    return state;
}

static void lay_file(const std::string &path, const lying_file &file) {
    if (S_ISLNK(file.mode)) {
        demand(symlink(file.text.c_str(), path.c_str()) == 0, path);
        return;
    }
    if (S_ISDIR(file.mode)) {
        demand(mkdir(path.c_str(), file.mode & 07777) == 0, path);
        return;
    }
    const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600);
    demand(fd >= 0, path);
    demand(write(fd, file.text.data(), file.text.size()) == static_cast<ssize_t>(file.text.size()),
           path);
    if (file.owner != geteuid() || file.group != getegid())
        demand(fchown(fd, file.owner, file.group) == 0, path);
    demand(fchmod(fd, file.mode & 07777) == 0, path);
    (void)close(fd);
}

void put_back_folder(const std::string &folder, const folder_state &state) {
    for (const std::string &name : names_in(folder))
        demand(std::remove((folder + "/" + name).c_str()) == 0, name);
    for (const auto &[name, file] : state)
        lay_file(folder + "/" + name, file);
}

lying_file plain_file(const std::string &text, mode_t mode) {
    return {S_IFREG | mode, geteuid(), getegid(), text};
}

static std::vector<std::string> lines_of(const std::string &text) {
    std::vector<std::string> lines;
    std::istringstream stream(text);
    for (std::string line; std::getline(stream, line);)
        lines.push_back(line.substr(0, 200));
    return lines;
}

std::string line_difference(const std::string &first, const std::string &second) {
    if (first == second)
        return "";
    std::string told;
    const std::vector<std::string> here = lines_of(first);
    const std::vector<std::string> there = lines_of(second);
    for (const std::string &line : here)
        if (std::find(there.begin(), there.end(), line) == there.end())
            told += "\n- " + line;
    for (const std::string &line : there)
        if (std::find(here.begin(), here.end(), line) == here.end())
            told += "\n+ " + line;
    return told.empty() ? "\nthe same lines, but not the same bytes" : told;
}

bool is_temporary(const std::string &name) {
    return name.ends_with(".tmp");
}

static std::string access_of(const lying_file &file) {
    char text[64];
    (void)std::snprintf(text, sizeof text, "%06o %u:%u", file.mode, file.owner, file.group);
    return text;
}

std::string state_difference(const folder_state &first, const folder_state &second,
                             bool with_temporaries) {
    std::string told;
    for (const auto &[name, file] : first) {
        if (is_temporary(name) && !with_temporaries)
            continue;
        const auto other = second.find(name);
        if (other == second.end())
            told += "\n" + name + " is gone";
        else if (access_of(file) != access_of(other->second))
            told += "\n" + name + ": " + access_of(file) + " is now " + access_of(other->second);
        else if (file.text != other->second.text)
            told += "\n" + name + ":" + line_difference(file.text, other->second.text);
    }
    for (const auto &[name, file] : second)
        if (first.count(name) == 0 && (with_temporaries || !is_temporary(name)))
            told += "\n" + name + " is new";
    return told;
}
