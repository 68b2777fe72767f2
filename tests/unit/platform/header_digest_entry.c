/* tests/unit/platform/header_digest_entry.c: digest_entry.h is C, and its functions have the agreed
 * types. */
#include "platform/digest_entry/digest_entry.h"

#include "platform/digest_entry/digest_entry.h"

int main(void) {
    int (*set)(const char *, const char *, int) = digest_entry_set;
    int (*delete_one)(const char *, int) = digest_entry_delete;
    int (*set_list)(const char *, int) = digest_entry_set_list;
    int (*delete_list)(const char *, int) = digest_entry_delete_list;

    return set != 0 && delete_one != 0 && set_list != 0 && delete_list != 0 ? 0 : 1;
}
