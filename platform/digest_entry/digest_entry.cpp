// platform/digest_entry/digest_entry.cpp: the library's four functions, on the web server's file.
#include "platform/digest_entry/digest_entry.h"

#include "platform/digest_entry/digest_file.h"

static constexpr const char *DIGEST_FILE = "/etc/apache2/digest_auth_passwd";

static constexpr int SINGLE_FLAGS = 0;
static constexpr int LIST_FLAGS = 1;

int digest_entry_set(const char *user, const char *password, int flags) {
    if (user == nullptr || password == nullptr || flags != SINGLE_FLAGS)
        return DIGEST_ENTRY_ERROR_INVALID;
    return digest_file_set(DIGEST_FILE, user, password);
}

int digest_entry_delete(const char *user, int flags) {
    if (user == nullptr || flags != SINGLE_FLAGS)
        return DIGEST_ENTRY_ERROR_INVALID;
    return digest_file_delete(DIGEST_FILE, user);
}

int digest_entry_set_list(const char *user_list, int flags) {
    if (user_list == nullptr || flags != LIST_FLAGS)
        return DIGEST_ENTRY_ERROR_INVALID;
    return digest_file_set_list(DIGEST_FILE, user_list);
}

int digest_entry_delete_list(const char *user_list, int flags) {
    if (user_list == nullptr || flags != LIST_FLAGS)
        return DIGEST_ENTRY_ERROR_INVALID;
    return digest_file_delete_list(DIGEST_FILE, user_list);
}
