// usermgmt/usermgmt.cpp: opening, closing, reloading and writing the database.
#include "usermgmt/usermgmt.h"

#include <cerrno>
#include <type_traits>

#include <sys/stat.h>
#include <syslog.h>

#include "usermgmt/context.h"

G_DEFINE_QUARK(usermgmt, usermgmt_error)

static_assert(std::is_trivial_v<usermgmt_ctx>);

// Held from open to close: a second context would not see the first one's changes.
static GMutex open_lock;

bool context_is_usable(const usermgmt_ctx *ctx, const char *action, GError **error) {
    if (ctx != nullptr && ctx->initialised)
        return true;
    g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_ARGUMENT,
                "Failed to %s: Invalid or uninitialised context", action);
    return false;
}

bool fail_missing_argument(const char *action, const char *argument, GError **error) {
    g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_ARGUMENT,
                "Failed to %s: Invalid or missing '%s' argument", action, argument);
    return false;
}

bool fail_and_reload(usermgmt_ctx *ctx, const char *action, const char *name, guint32 file_mask,
                     GError **error) {
    g_prefix_error(error, "Failed to %s '%s', ", action, name);
    usermgmt_reload(ctx, file_mask);
    return false;
}

static void usermgmt_ctx_free(usermgmt_ctx *ctx) {
    user_database_clear(&ctx->user_db);
    group_database_clear(&ctx->group_db);
    core_file_free_data(ctx, CORE_FILE_ALL);
    g_mutex_clear(&ctx->mutex);
    g_free(ctx);
}

// A file that cannot be looked at counts as there, so that reading it fails: taken for missing, it
// would cost every user whose password it holds.
static bool shadow_file_exists() {
    struct stat st;
    return stat(core_file_table[CORE_FILE_ROW_SHADOW].path, &st) == 0 || errno != ENOENT;
}

usermgmt_ctx *usermgmt_open(guint32 flags, GError **error) {
    if ((flags & USERMGMT_OPEN_TRYLOCK) == 0) {
        g_mutex_lock(&open_lock);
    } else if (!g_mutex_trylock(&open_lock)) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_ALREADY_OPEN,
                    "User database already open");
        return nullptr;
    }

    auto *ctx = g_new0(usermgmt_ctx, 1);
    g_mutex_init(&ctx->mutex);
    ctx->open_flags = flags;
    ctx->has_shadow = shadow_file_exists() ? TRUE : FALSE;
    if (!group_database_init(ctx, TRUE, error) || !user_database_init(ctx, error)) {
        g_prefix_error(error, "Could not initialise user management: ");
        usermgmt_ctx_free(ctx);
        g_mutex_unlock(&open_lock);
        return nullptr;
    }
    warn_of_unknown_members(ctx);
    if ((flags & USERMGMT_OPEN_NO_CACHE) != 0)
        core_file_free_data(ctx, CORE_FILE_ALL);
    ctx->initialised = TRUE;
    return ctx;
}

gboolean usermgmt_close(usermgmt_ctx *ctx) {
    if (!context_is_usable(ctx, "free usermgmt ctx", nullptr))
        return FALSE;
    usermgmt_ctx_free(ctx);
    g_mutex_unlock(&open_lock);
    return TRUE;
}

static void reread_group_data(usermgmt_ctx *ctx) {
    g_autoptr(GError) error = nullptr;
    if (!group_database_init(ctx, FALSE, &error))
        syslog(LOG_ERR, "Could not re-read group data!! %s",
               error != nullptr ? error->message : "");
}

void usermgmt_reload(usermgmt_ctx *ctx, guint32 file_mask) {
    if (file_mask == 0)
        return;
    const bool no_cache = (ctx->open_flags & USERMGMT_OPEN_NO_CACHE) != 0;
    const bool users = (file_mask & (CORE_FILE_PASSWD | CORE_FILE_SHADOW)) != 0;
    const bool groups = (file_mask & CORE_FILE_GROUP) != 0;

    // Without a cache the users are read from the live files, so the groups have to be as well.
    if (groups || (users && no_cache))
        reread_group_data(ctx);
    if (users) {
        g_autoptr(GError) error = nullptr;
        if (!user_database_init(ctx, &error))
            syslog(LOG_ERR, "Could not re-read user data!! %s",
                   error != nullptr ? error->message : "");
    }
    if (no_cache)
        core_file_free_data(ctx, CORE_FILE_ALL);
}

gboolean usermgmt_sync(usermgmt_ctx *ctx, GError **error) {
    const core_file_data users = {ctx->user_db.entries, ctx->user_db.dirty, FALSE};
    const core_file_data groups = {ctx->group_db.entries, ctx->group_db.dirty, FALSE};
    core_file_data outgoing[CORE_FILE_COUNT] = {users, users, groups};

    core_file_warn_of_strangers(ctx, outgoing);
    const gboolean synced = core_file_sync_all(core_file_table, outgoing, TRUE, error);
    for (int row = 0; row < CORE_FILE_COUNT; row++)
        if (outgoing[row].replaced)
            core_file_remember(ctx, row);

    if (!synced) {
        g_prefix_error(error, "unable to sync core files, ");
        return FALSE;
    }
    ctx->user_db.dirty = FALSE;
    ctx->group_db.dirty = FALSE;
    return TRUE;
}
