// tests/unit/usermgmt/account_lines.cpp: what stands in the account files, read and written without
// the code under test.
#include "tests/unit/usermgmt/account_lines.h"

#include <grp.h>
#include <pwd.h>
#include <shadow.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <memory>

#include <gtest/gtest.h>

#include "tests/unit/usermgmt/account_files.h"

struct stream_close {
    void operator()(FILE *stream) const { (void)fclose(stream); }
};
using open_stream = std::unique_ptr<FILE, stream_close>;

static open_stream stream_of(int row) {
    return open_stream(fopen(core_file_table[row].path, "re"));
}

void create_account_file(int row, const std::string &text, unsigned mode) {
    const char *path = core_file_table[row].path;
    (void)unlink(path);
    const open_stream stream(fopen(path, "we"));
    ASSERT_NE(stream, nullptr) << path;
    ASSERT_EQ(fwrite(text.data(), 1, text.size(), stream.get()), text.size()) << path;
    ASSERT_EQ(fchmod(fileno(stream.get()), mode), 0) << path;
}

std::string read_account_text(int row) {
    const open_stream stream = stream_of(row);
    std::string text;
    char block[4096];
    for (std::size_t size = 1; stream != nullptr && size > 0;) {
        size = fread(block, 1, sizeof block, stream.get());
        text.append(block, size);
    }
    return row == CORE_FILE_ROW_GROUP && text.find(',') != std::string::npos
               ? with_members_sorted(text)
               : text;
}

static void read_passwd(FILE *stream, std::vector<passwd_line> *read) {
    while (const struct passwd *line = fgetpwent(stream))
        read->push_back({line->pw_name, line->pw_passwd, line->pw_uid, line->pw_gid, line->pw_gecos,
                         line->pw_dir, line->pw_shell});
}

static void read_shadow(FILE *stream, std::vector<shadow_line> *read) {
    while (const struct spwd *line = fgetspent(stream))
        read->push_back({line->sp_namp, line->sp_pwdp, line->sp_lstchg});
}

static void read_group(FILE *stream, std::vector<group_line> *read) {
    while (const struct group *line = fgetgrent(stream)) {
        read->push_back({line->gr_name, line->gr_passwd, line->gr_gid, {}});
        for (char **member = line->gr_mem; *member != nullptr; member++)
            read->back().members.insert(*member);
    }
}

void read_account_lines(int row, account_lines *read) {
    const open_stream stream = stream_of(row);
    if (row == CORE_FILE_ROW_PASSWD) {
        read->passwd.clear();
        read_passwd(stream.get(), &read->passwd);
    } else if (row == CORE_FILE_ROW_GROUP) {
        read->group.clear();
        read_group(stream.get(), &read->group);
    } else {
        read->shadow.clear();
        read->has_shadow = stream != nullptr;
        if (stream != nullptr)
            read_shadow(stream.get(), &read->shadow);
    }
}

account_lines read_account_files() {
    account_lines read;
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        read.texts[row] = read_account_text(row);
        read_account_lines(row, &read);
    }
    return read;
}

std::string as_text(const std::vector<passwd_line> &all) {
    std::string text;
    for (const passwd_line &line : all)
        text += line.name + ":" + line.password + ":" + std::to_string(line.uid) + ":" +
                std::to_string(line.gid) + ":" + line.gecos + ":" + line.home + ":" + line.shell +
                "\n";
    return text;
}

std::string as_text(const std::vector<shadow_line> &all) {
    std::string text;
    for (const shadow_line &line : all)
        text += line.name + ":" + line.password + ":" +
                (line.days != -1 ? std::to_string(line.days) : "") + ":0:99999:7:0::\n";
    return text;
}

std::string as_text(const std::vector<group_line> &all) {
    std::string text;
    for (const group_line &line : all) {
        text += line.name + ":" + line.password + ":" + std::to_string(line.gid) + ":";
        const char *separator = "";
        for (const std::string &member : line.members) {
            text += separator + member;
            separator = ",";
        }
        text += "\n";
    }
    return text;
}
