// tests/unit/usermgmt/outgoing_files.cpp: databases on their way to the account files.
#include "tests/unit/usermgmt/outgoing_files.h"

void OutgoingFiles::SetUp() {
    AccountFiles::SetUp();
    for (int row = 0; row < CORE_FILE_COUNT; row++)
        write(core_file_table[row].name, OLD_TEXT[row]);

    users_ = g_ptr_array_new_with_free_func(
        [](gpointer user) { internal_user_free(static_cast<internal_user *>(user)); });
    g_ptr_array_add(
        users_, new_user({"root", true, "rootshash", 0, 0, nullptr, "/root", "/bin/sh", 86400}));
    g_ptr_array_add(users_, new_user({"alice", true, "aliceshash", 1000, 100, "Alice",
                                      "/home/alice", "/bin/false", 172800}));
    groups_ = g_ptr_array_new_with_free_func(
        [](gpointer group) { internal_group_free(static_cast<internal_group *>(group)); });
    g_ptr_array_add(groups_, new_group({"root", nullptr, 0, {}}));
    g_ptr_array_add(groups_, new_group({"users", nullptr, 100, {"alice"}}));

    data_[CORE_FILE_ROW_PASSWD] = {users_, TRUE, FALSE};
    data_[CORE_FILE_ROW_SHADOW] = {users_, TRUE, FALSE};
    data_[CORE_FILE_ROW_GROUP] = {groups_, TRUE, FALSE};
}

void OutgoingFiles::TearDown() {
    g_ptr_array_unref(users_);
    g_ptr_array_unref(groups_);
    AccountFiles::TearDown();
}

bool OutgoingFiles::sync(bool stop_on_error) {
    return core_file_sync_all(core_file_table, data_, stop_on_error, error_.out()) != FALSE;
}

lines OutgoingFiles::states() {
    lines words;
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        const std::string text = read(core_file_table[row].name);
        words.emplace_back(text == OLD_TEXT[row] ? "old" : text == NEW_TEXT[row] ? "new" : "other");
    }
    return words;
}

std::string OutgoingFiles::dirty() const {
    std::string digits;
    for (const core_file_data &file : data_)
        digits += file.dirty ? '1' : '0';
    return digits;
}
