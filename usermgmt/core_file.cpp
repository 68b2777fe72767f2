// usermgmt/core_file.cpp: reading the account files and replacing them atomically.
#include "usermgmt/core_file.h"

#include <array>
#include <cerrno>
#include <cstdarg>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "usermgmt/precondition.h"
#include "usermgmt/secret.h"

G_DEFINE_QUARK(corefile, corefile_error)

// Access bits, set-ID bits and the sticky bit: what fchmod takes of a mode.
static constexpr mode_t MODE_BITS = 07777;
static constexpr mode_t PRIVATE_MODE = 0600;

// Why the call before failed. To be asked before any other call.
static const char *last_cause() {
    return errno != 0 ? g_strerror(errno) : "Unknown error";
}

gboolean core_file_read_data(const core_file *descriptor, core_file_data *dst_data,
                             GError **error) {
    require(descriptor != NULL, FALSE);
    require(dst_data != NULL, FALSE);
    require(dst_data->data == NULL, FALSE);

    if (descriptor->fetch == nullptr) {
        // Deliberate: the closing quote is missing.
        g_set_error(error, COREFILE_ERROR, COREFILE_ERROR_MISSING_FUNCTION,
                    "no fetch function for core file type '%s", descriptor->name);
        return FALSE;
    }

    FILE *stream = fopen(descriptor->path, "re");
    if (stream == nullptr) {
        g_set_error(error, COREFILE_ERROR, COREFILE_ERROR_READ, "could not open %s file '%s', %s",
                    descriptor->name, descriptor->path, g_strerror(errno));
        return FALSE;
    }

    wiped_read_buffer buffer;
    buffer.give_to(stream);
    // From here on the stream keeps its position. It would ask the kernel for it twice a line; what
    // has none fails at its first line.
    (void)fseek(stream, 0, SEEK_SET);
    g_autoptr(GPtrArray) data = g_ptr_array_new_with_free_func(descriptor->free_record);
    errno = 0;
    while (gpointer record = descriptor->fetch(stream))
        g_ptr_array_add(data, record);
    const int saved_errno = errno;
    (void)fclose(stream);  // it was only read from

    // The C library's readers tell the end of the file by ENOENT.
    if (saved_errno != ENOENT) {
        g_set_error(error, COREFILE_ERROR, COREFILE_ERROR_READ, "could not read '%s' entry %d: %s",
                    descriptor->name, static_cast<int>(data->len), g_strerror(saved_errno));
        dst_data->dirty = FALSE;
        return FALSE;
    }
    dst_data->data = g_steal_pointer(&data);
    return TRUE;
}

// One file during a write. The temporary file belongs to it until it is renamed.
struct sync_state {
    char name[30];
    GError *err;
    FILE *file;
    int fd;
    struct stat st;
    char *path;
    gboolean written;
};

static void sync_state_clear(sync_state *state) {
    if (state->file != nullptr)
        (void)fclose(state->file);  // a write that failed is reported already
    else if (state->fd >= 0)
        (void)close(state->fd);
    state->file = nullptr;
    state->fd = -1;
    if (state->path != nullptr)
        (void)unlink(state->path);  // it may have been renamed by now, or never made
    g_clear_pointer(&state->path, g_free);
    g_clear_error(&state->err);
}

static bool fail_step(sync_state *state, const char *format, ...) G_GNUC_PRINTF(2, 3);
static bool fail_step(sync_state *state, const char *format, ...) {
    va_list arguments;
    va_start(arguments, format);
    state->err = g_error_new_valist(COREFILE_ERROR, COREFILE_ERROR_WRITE, format, arguments);
    va_end(arguments);
    return false;
}

// A leftover is unlinked and the file made anew, so that it is private from its first moment and no
// planted link is followed.
static bool open_temporary(sync_state *state, wiped_stream_buffer *buffer) {
    errno = 0;
    if (unlink(state->path) == 0 || errno == ENOENT) {
        errno = 0;
        state->fd =
            open(state->path, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, PRIVATE_MODE);
        if (state->fd >= 0) {
            errno = 0;
            state->file = fdopen(state->fd, "w");
        }
    }
    if (state->file == nullptr)
        return fail_step(state, "could not fopen/fileno temporary file '%s': %s", state->path,
                         last_cause());
    buffer->give_to(state->file);
    return true;
}

static bool write_records(const core_file *cf, const core_file_data *source, sync_state *state) {
    for (guint i = 0; i < source->data->len; i++) {
        errno = 0;
        if (cf->write(g_ptr_array_index(source->data, i), state->file) < 0)
            return fail_step(state, "could not write entry #%d to %s: %s", static_cast<int>(i),
                             state->path, last_cause());
    }
    return true;
}

// From the stream's buffer to the disk, with the mode of the live file.
static bool finish_temporary(sync_state *state) {
    errno = 0;
    if (fflush(state->file) != 0)
        return fail_step(state, "could not fflush() file '%s': %s", state->path, last_cause());
    errno = 0;
    if (fchmod(state->fd, state->st.st_mode & MODE_BITS) != 0)
        return fail_step(state, "could not fchmod() file '%s': %s", state->path, last_cause());
    errno = 0;
    if (fsync(state->fd) != 0)
        return fail_step(state, "could not fsync() file '%s': %s", state->path, last_cause());

    // A failing fclose has still freed the stream and closed the descriptor.
    FILE *file = state->file;
    state->file = nullptr;
    state->fd = -1;
    errno = 0;
    if (fclose(file) != 0)
        return fail_step(state, "could not fclose() file '%s': %s", state->path, last_cause());
    return true;
}

static bool cfile_write_temp(const core_file *cf, const core_file_data *source, sync_state *state,
                             wiped_stream_buffer *buffer) {
    warn_unless(state->file == NULL);
    warn_unless(state->path == NULL);
    warn_unless(state->written == FALSE);

    if (cf->write == nullptr) {
        g_set_error(&state->err, COREFILE_ERROR, COREFILE_ERROR_MISSING_FUNCTION,
                    "no support for writing entries");
        return false;
    }

    errno = 0;
    if (stat(cf->path, &state->st) != 0)
        return fail_step(state, "could not stat() core file at '%s': %s", cf->path, last_cause());

    state->path = g_strconcat(cf->path, ".tmp", nullptr);
    if (!open_temporary(state, buffer))
        return false;
    errno = 0;
    if (fchmod(state->fd, PRIVATE_MODE) != 0)
        return fail_step(state, "could not chmod() temporary file '%s': %s", state->path,
                         last_cause());
    if (!write_records(cf, source, state) || !finish_temporary(state))
        return false;

    state->written = TRUE;
    return true;
}

static bool sync_directory(const char *directory) {
    const int fd = open(directory, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (fd < 0)
        return false;
    errno = 0;
    const bool synced = fsync(fd) == 0;
    const int saved_errno = errno;
    (void)close(fd);  // nothing was written through it
    errno = saved_errno;
    return synced;
}

enum class rename_result { DONE, NOT_RENAMED, NOT_SYNCED };

static rename_result rename_temporary(const core_file *cf, sync_state *state) {
    errno = 0;
    if (rename(state->path, cf->path) != 0) {
        fail_step(state, "%s: could not rename file '%s' -> '%s', %s", state->name, state->path,
                  cf->path, last_cause());
        return rename_result::NOT_RENAMED;
    }

    g_autofree char *directory = g_path_get_dirname(cf->path);
    errno = 0;
    if (!sync_directory(directory)) {
        fail_step(state, "%s: could not open/sync directory '%s/', %s", state->name, directory,
                  last_cause());
        return rename_result::NOT_SYNCED;
    }
    g_clear_pointer(&state->path, g_free);
    return rename_result::DONE;
}

// The temporary files of one call. What is left of them when it ends is removed.
class sync_states {
  public:
    explicit sync_states(gsize count) : states_(g_new0(sync_state, count)), count_(count) {
        for (sync_state &state : all())
            state.fd = -1;
    }
    ~sync_states() {
        for (sync_state &state : all())
            sync_state_clear(&state);
        g_free(states_);
    }
    sync_states(const sync_states &) = delete;
    sync_states &operator=(const sync_states &) = delete;

    std::span<sync_state> all() { return {states_, count_}; }
    sync_state &operator[](gsize i) { return states_[i]; }

  private:
    sync_state *states_;
    gsize count_;
};

// First pass. Returns how many files failed on the caller's error itself, without one of their own.
static bool write_temporaries(std::span<const core_file> descriptors, const core_file_data *source,
                              gboolean stop_on_error, sync_states &states, int *failed_bare,
                              GError **error) {
    bool all_written = true;
    for (gsize i = 0; i < descriptors.size(); i++) {
        // The stream is closed at the end of its round, whether or not its file was written.
        wiped_stream_buffer buffer;
        if (stop_on_error && !all_written)
            break;
        (void)g_strlcpy(states[i].name, descriptors[i].name, sizeof states[i].name);
        if (!source[i].dirty)
            continue;

        sync_state *state = &states[i];
        if (source[i].data == nullptr) {
            if (error == nullptr || *error == nullptr)
                g_set_error(error, COREFILE_ERROR, COREFILE_ERROR_MISSING_DATA,
                            "missing output data for cf '%s'", descriptors[i].name);
            *failed_bare += 1;
            all_written = false;
        } else if (!cfile_write_temp(&descriptors[i], &source[i], state, &buffer)) {
            warn_unless(state->err != NULL);
            GError *cause = g_steal_pointer(&state->err);
            sync_state_clear(state);
            state->err = cause;
            all_written = false;
        }
    }
    return all_written;
}

// Second pass.
static void rename_temporaries(std::span<const core_file> descriptors, core_file_data *source,
                               gboolean stop_on_error, sync_states &states) {
    for (gsize i = 0; i < descriptors.size(); i++) {
        if (!source[i].dirty || !states[i].written)
            continue;
        const rename_result result = rename_temporary(&descriptors[i], &states[i]);
        source[i].replaced = result != rename_result::NOT_RENAMED ? TRUE : FALSE;
        if (result == rename_result::DONE)
            source[i].dirty = FALSE;
        // A directory that was not synced does not stop the rest: with this file in place, the
        // others belong in place too.
        if (stop_on_error && result == rename_result::NOT_RENAMED)
            return;
    }
}

// The files' errors as one: as it is where there is one, else joined, the last file's first.
static GError *join_errors(sync_states &states) {
    GError *joined = nullptr;
    for (sync_state &state : states.all()) {
        if (state.err == nullptr)
            continue;
        g_prefix_error(&state.err, "%s: ", state.name);
        if (joined == nullptr) {
            joined = g_steal_pointer(&state.err);
        } else {
            GError *both = g_error_new(COREFILE_ERROR, COREFILE_ERROR_SEVERAL_FILES, "%s\n%s",
                                       state.err->message, joined->message);
            g_error_free(joined);
            joined = both;
        }
    }
    return joined;
}

gboolean core_file_sync_all(std::span<const core_file> descriptors, core_file_data *src_data,
                            gboolean stop_on_error, GError **error) {
    sync_states states(descriptors.size());
    int failed = 0;

    const bool all_written =
        write_temporaries(descriptors, src_data, stop_on_error, states, &failed, error);
    if (all_written || !stop_on_error)
        rename_temporaries(descriptors, src_data, stop_on_error, states);

    for (const sync_state &state : states.all())
        failed += state.err != nullptr ? 1 : 0;
    if (all_written && failed == 0)
        return TRUE;

    g_autoptr(GError) joined = join_errors(states);
    if (error == nullptr)
        return FALSE;
    // An error that is set by now tells of missing data: the caller's own slip comes first.
    if (*error == nullptr)
        *error = g_steal_pointer(&joined);
    if (*error == nullptr)
        g_set_error(error, COREFILE_ERROR, COREFILE_ERROR_UNKNOWN,
                    "sync operation failed, unknown error");
    else
        g_prefix_error(error, "failed to write %d/%d core file(s) ", failed,
                       static_cast<int>(descriptors.size()));
    return FALSE;
}

gboolean core_file_sync(const core_file *cf, core_file_data *src_data, GError **error) {
    require(cf != NULL, FALSE);
    require(src_data != NULL, FALSE);
    return core_file_sync_all({cf, 1}, src_data, TRUE, error);
}
