// tests/long/power/account_reader.cpp: loads account files as the service does when it starts.
//
//   account_reader FOLDER
//
// Reads passwd, shadow and group of FOLDER/etc and prints a line "NAME UID HASH" for each user that
// is loaded. Exit status: 0, or 1 where the service would not start.
#include <cstdio>

#include <syslog.h>
#include <unistd.h>

#include <glib.h>

#include "usermgmt/account_records.h"
#include "usermgmt/context.h"
#include "usermgmt/usermgmt.h"

static int print_users() {
    g_autoptr(GError) error = nullptr;
    usermgmt_ctx *ctx = usermgmt_open(USERMGMT_OPEN_TRYLOCK, &error);
    if (ctx == nullptr) {
        (void)std::fprintf(stderr, "%s\n", error->message);
        return 1;
    }
    for (const internal_user *user : records<const internal_user>(ctx->user_db.entries))
        g_print("%s %u %s\n", user->name, user->uid, user->password);
    return usermgmt_close(ctx) ? 0 : 1;
}

int main(int argc, char **argv) {
    // Users that are skipped are missed in what is printed; they have no place in this machine's
    // log.
    (void)setlogmask(LOG_MASK(LOG_EMERG));
    if (argc != 2 || chdir(argv[1]) != 0) {
        (void)std::fprintf(stderr, "usage: account_reader FOLDER\n");
        return 2;
    }
    return print_users();
}
