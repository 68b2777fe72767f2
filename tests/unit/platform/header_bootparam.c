/* tests/unit/platform/header_bootparam.c: bootparam.h is C, and its functions have the agreed
 * types.
 */
#include "platform/bootparam/bootparam.h"

#include "platform/bootparam/bootparam.h"

int main(void) {
    void (*default_chip)(struct bootparam_chip *) = bootparam_default_chip;
    int (*set_chip)(int, int *, struct bootparam_chip *) = bootparam_set_chip;
    int (*read_one)(const char *, char **, int, int *, struct bootparam_chip *) = bootparam_read;
    int (*write_one)(const char *, const char *, int *, struct bootparam_chip *) = bootparam_write;

    return default_chip != 0 && set_chip != 0 && read_one != 0 && write_one != 0 ? 0 : 1;
}
