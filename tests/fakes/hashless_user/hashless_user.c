/* tests/fakes/hashless_user/hashless_user.c: a getpwnam(3) that finds everyone, without a password
 * field. Preloaded.
 */
#include <pwd.h>
#include <string.h>

struct passwd *getpwnam(const char *name) {
    static char copy[32];
    static struct passwd user;

    strncpy(copy, name, sizeof copy - 1);
    user.pw_name = copy;
    return &user;
}
