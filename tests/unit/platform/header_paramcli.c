/* tests/unit/platform/header_paramcli.c: paramcli.h is C, and its functions have the agreed types.
 */
#include "platform/paramcli/paramcli.h"

#include "platform/paramcli/paramcli.h"

int main(void) {
    struct paramcli_options options;
    void (*reset)(struct paramcli_options *) = paramcli_reset_options;
    void (*set)(const char *, const char *, struct paramcli_options *, int *) =
        paramcli_set_custom_param;
    void (*sync)(struct paramcli_options *, int *) = paramcli_sync;

    return reset != 0 && set != 0 && sync != 0 && sizeof options == 4096 ? 0 : 1;
}
