// tests/unit/usermgmt/account_files.cpp: a folder of account files for one test, and records to
// write.
#include "tests/unit/usermgmt/account_files.h"

#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>

#include <glib/gstdio.h>

#include "usermgmt/account_types.h"

namespace fs = std::filesystem;

std::string error_slot::text() const {
    if (error_ == nullptr)
        return "";
    return std::string(g_quark_to_string(error_->domain)) + " " + std::to_string(error_->code) +
           ": " + error_->message;
}

internal_user *new_user(const user_fields &fields) {
    auto *user = g_new0(internal_user, 1);
    user->type = user_type_of_uid(fields.uid);
    user->shadowed = fields.shadowed;
    user->name = g_strdup(fields.name);
    user->password = g_strdup(fields.password);
    user->gecos = g_strdup(fields.gecos);
    user->home = g_strdup(fields.home);
    user->shell = g_strdup(fields.shell);
    user->uid = fields.uid;
    user->gid = fields.gid;
    user->last_change = fields.last_change;
    return user;
}

internal_group *new_group(const group_fields &fields) {
    auto *group = g_new0(internal_group, 1);
    group->type = group_type_of_gid(fields.gid);
    group->name = g_strdup(fields.name);
    group->password = g_strdup(fields.password);
    group->gid = fields.gid;
    group->members = member_set_new();
    for (const char *member : fields.members)
        (void)g_hash_table_add(group->members, g_strdup(member));
    return group;
}

lines take_strings(char **strings) {
    lines texts;
    for (char **string = strings; string != nullptr && *string != nullptr; string++)
        texts.emplace_back(*string);
    g_strfreev(strings);
    return texts;
}

std::string with_members_sorted(const std::string &group_file) {
    std::string sorted;
    std::istringstream stream(group_file);
    for (std::string line; std::getline(stream, line);) {
        const std::size_t start = line.rfind(':') + 1;
        lines members;
        std::istringstream list(line.substr(start));
        for (std::string member; std::getline(list, member, ',');)
            members.push_back(member);
        std::sort(members.begin(), members.end());
        sorted += line.substr(0, start);
        for (std::size_t i = 0; i < members.size(); i++)
            sorted += (i == 0 ? "" : ",") + members[i];
        sorted += "\n";
    }
    return sorted;
}

int count_open_descriptors() {
    std::error_code ignored;
    return static_cast<int>(std::distance(fs::directory_iterator("/proc/self/fd", ignored), {}));
}

void AccountFiles::SetUp() {
    // Memory, where there is some: renames onto a disk wait for it.
    const std::string parent = access("/dev/shm", W_OK) == 0 ? "/dev/shm" : g_get_tmp_dir();
    folder_ = parent + "/usermgmt-XXXXXX";
    ASSERT_NE(g_mkdtemp(folder_.data()), nullptr) << folder_;
    ASSERT_EQ(chdir(folder_.c_str()), 0);
    ASSERT_EQ(g_mkdir("etc", 0755), 0);
    (void)take_syslog();
}

void AccountFiles::TearDown() {
    EXPECT_EQ(take_syslog(), lines());
    ASSERT_EQ(chdir("/"), 0);
    std::error_code ignored;
    fs::remove_all(folder_, ignored);
}

void AccountFiles::write(const std::string &name, const std::string &text) {
    std::ofstream("etc/" + name, std::ios::binary) << text;
    ASSERT_EQ(read(name), text);
}

std::string AccountFiles::read(const std::string &name) {
    std::ifstream file("etc/" + name, std::ios::binary);
    if (!file)
        return "(no file " + name + ")";
    std::ostringstream text;
    text << file.rdbuf();
    return text.str();
}

bool AccountFiles::exists(const std::string &name) {
    std::error_code ignored;
    return fs::exists(fs::symlink_status("etc/" + name, ignored));
}

void AccountFiles::remove(const std::string &name) {
    std::error_code ignored;
    ASSERT_TRUE(fs::remove("etc/" + name, ignored));
}

void AccountFiles::write_all(const std::map<std::string, std::string> &files) {
    for (const auto &[name, text] : files)
        write(name, text);
}

void AccountFiles::write_typical() {
    write("passwd",
          "root:x:0:0:root:/root:/bin/sh\n"
          "daemon:x:1:1:daemon:/usr/sbin:/bin/false\n"
          "alice:x:1000:100:Alice:/home/alice:/bin/false\n"
          "nobody:*:65534:65534:nobody:/:/bin/false\n");
    write("shadow",
          "root:$5$salt$rootshash:19000:0:99999:7:0::\n"
          "daemon:*:19001:0:99999:7:0::\n"
          "alice:$5$salt$aliceshash:19002:0:99999:7:0::\n");
    write("group",
          "root:x:0:\n"
          "daemon:x:1:\n"
          "video:x:44:alice\n"
          "users:x:100:alice\n"
          "nogroup:x:65534:\n");
}

lines AccountFiles::files() {
    lines names;
    std::error_code ignored;
    for (const fs::directory_entry &entry : fs::directory_iterator("etc", ignored))
        names.push_back(entry.path().filename().string());
    std::sort(names.begin(), names.end());
    return names;
}

open_context AccountFiles::opened(guint32 flags) {
    error_slot error;
    open_context ctx(usermgmt_open(flags | USERMGMT_OPEN_TRYLOCK, error.out()));
    EXPECT_EQ(error.text(), "");
    EXPECT_EQ(take_syslog(), lines());
    return ctx;
}

std::string AccountFiles::error_of_open(guint32 flags) {
    error_slot error;
    const open_context ctx(usermgmt_open(flags | USERMGMT_OPEN_TRYLOCK, error.out()));
    EXPECT_EQ(ctx, nullptr);
    return error.text();
}
