// usermgmt/core_file_cache.cpp: the parsed account files that a context keeps.
#include "usermgmt/core_file_cache.h"

#include <sys/stat.h>
#include <syslog.h>

#include "usermgmt/context.h"

static constexpr guint32 row_bits[CORE_FILE_COUNT] = {CORE_FILE_PASSWD, CORE_FILE_SHADOW,
                                                      CORE_FILE_GROUP};

static bool is_masked(const usermgmt_ctx *ctx, guint32 mask, int row) {
    if (row == CORE_FILE_ROW_SHADOW && !ctx->has_shadow)
        return false;
    return (mask & row_bits[row]) != 0;
}

static core_file_stamp stamp_of(const char *path) {
    struct stat st;
    if (stat(path, &st) != 0)
        return {};
    return {st.st_dev, st.st_ino, st.st_size, st.st_mtim};
}

static bool is_same(const core_file_stamp &a, const core_file_stamp &b) {
    return a.device == b.device && a.inode == b.inode && a.size == b.size &&
           a.modified.tv_sec == b.modified.tv_sec && a.modified.tv_nsec == b.modified.tv_nsec;
}

gboolean core_file_parse(usermgmt_ctx *ctx, guint32 mask, GError **error) {
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        if (!is_masked(ctx, mask, row))
            continue;
        const core_file &cf = core_file_table[row];
        // Taken before the reading: a change in between is then told once too often, not missed.
        const core_file_stamp stamp = stamp_of(cf.path);
        if (!core_file_read_data(&cf, &ctx->cached[row], error)) {
            syslog(LOG_ERR, "Unable to parse %s file (%s)", cf.name, cf.path);
            core_file_free_data(ctx, mask);
            return FALSE;
        }
        ctx->stamps[row] = stamp;
    }
    return TRUE;
}

void core_file_free_data(usermgmt_ctx *ctx, guint32 mask) {
    for (int row = 0; row < CORE_FILE_COUNT; row++)
        if (is_masked(ctx, mask, row))
            g_clear_pointer(&ctx->cached[row].data, g_ptr_array_unref);
}

void core_file_warn_of_strangers(const usermgmt_ctx *ctx, const core_file_data *outgoing) {
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        const core_file &cf = core_file_table[row];
        if (outgoing[row].dirty && !is_same(ctx->stamps[row], stamp_of(cf.path)))
            syslog(LOG_WARNING, "%s was changed by another program; its changes are lost", cf.path);
    }
}

void core_file_remember(usermgmt_ctx *ctx, int row) {
    ctx->stamps[row] = stamp_of(core_file_table[row].path);
}
