// tests/fuzz/rewrite_fuzz.cpp: any three files, loaded and written: the second write changes
// nothing any more, and no record comes back as another.
#include "tests/fuzz/account_folder.h"
#include "tests/fuzz/fuzz.h"
#include "tests/unit/usermgmt/log_capture.h"

static open_database opened(guint32 flags) {
    g_autoptr(GError) error = nullptr;
    open_database ctx(usermgmt_open(flags | USERMGMT_OPEN_TRYLOCK, &error));
    hold(ctx != nullptr, "what lies there can be loaded", error != nullptr ? error->message : "");
    return ctx;
}

// The error of a write of everything, "" when there is none.
static std::string error_of_write(usermgmt_ctx *ctx) {
    g_autoptr(GError) error = nullptr;
    ctx->user_db.dirty = TRUE;
    ctx->group_db.dirty = TRUE;
    const gboolean done = usermgmt_sync(ctx, &error);
    hold((done == FALSE) == (error != nullptr), "a failing write has an error, and only that");
    hold((ctx->user_db.dirty == FALSE) == (done != FALSE), "what was written is not dirty");
    hold(!is_any_temporary_left(), "a write leaves no temporary file");
    return error != nullptr ? error->message : "";
}

static std::string joined(const account_texts &texts) {
    return texts.passwd + "%%\n" + texts.group + "%%\n" + texts.shadow;
}

static void check_rewrite(const account_texts &texts) {
    open_database ctx = opened(texts.open_flags & ~guint32{USERMGMT_OPEN_STRICT});
    const std::string before = described(ctx.get());
    const std::string original = joined(lying_texts());
    const std::string error = error_of_write(ctx.get());
    const std::string once = joined(lying_texts());

    hold(described(ctx.get()) == before, "a write changes no record", before);
    if (!error.empty()) {
        hold(error.find("could not write entry #") != std::string::npos || !texts.has_shadow,
             "only a record that no line holds stops a write", error);
        hold(once == original, "a write that stops leaves every file as it was", error);
        return;
    }
    // The C library writes such a record without its IDs.
    if (has_compat_names(ctx.get()))
        return;

    ctx.reset();
    ctx = opened(0);
    hold(described(ctx.get()) == before, "every record comes back as it was written",
         [&] { return before + "became\n" + described(ctx.get()); });
    hold(error_of_write(ctx.get()).empty(), "what was written can be written again");
    hold(joined(lying_texts()) == once, "the second write changes nothing", once);
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    const account_texts texts = texts_of(parts_of(data, size));

    lay(texts);
    check_rewrite(texts);
    (void)take_syslog();
    return 0;
}
