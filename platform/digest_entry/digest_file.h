// platform/digest_entry/digest_file.h: the library's four operations on a file anywhere; internal.
#pragma once

// As those of digest_entry.h.
int digest_file_set(const char *path, const char *user, const char *password);
int digest_file_delete(const char *path, const char *user);
int digest_file_set_list(const char *path, const char *user_list);
int digest_file_delete_list(const char *path, const char *user_list);
