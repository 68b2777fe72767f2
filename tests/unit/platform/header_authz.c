/* tests/unit/platform/header_authz.c: authz.h is C, with the agreed functions. */
#include "platform/authz/authz.h"

#include "platform/authz/authz.h"

int main(void) {
    int (*init)(GError **) = authz_init;
    int (*check)(const char *, const char *, GError **) = authz_check;
    void (*release)(void) = authz_release;

    return init != 0 && check != 0 && release != 0 ? 0 : 1;
}
