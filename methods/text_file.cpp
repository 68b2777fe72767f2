// methods/text_file.cpp: reading a whole file for a reply.
#include "methods/text_file.h"

#include <array>
#include <cerrno>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

// A reply cannot carry more, so reading on would only fill the memory.
static constexpr gsize MAX_SIZE = 32U << 20;

// The texts are those of g_file_get_contents.
static bool fail_to(const char *action, const char *path, int saved_errno, GError **error) {
    g_autofree char *shown = g_filename_display_name(path);
    g_set_error(error, G_FILE_ERROR, g_file_error_from_errno(saved_errno), "%s “%s”: %s", action,
                shown, g_strerror(saved_errno));
    return false;
}

// Appends what the descriptor holds. 0, or the errno of what went wrong.
static int read_all(int fd, GString *text) {
    std::array<char, 16384> block;
    for (;;) {
        const ssize_t length = read(fd, block.data(), block.size());
        if (length < 0 && errno == EINTR)
            continue;
        if (length < 0)
            return errno;
        if (length == 0)
            return 0;
        if (text->len + static_cast<gsize>(length) > MAX_SIZE)
            return EFBIG;
        g_string_append_len(text, block.data(), length);
    }
}

bool read_text_file(const char *path, char **out_text, GError **error) {
    const int fd = open(path, O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);
    if (fd < 0)
        return fail_to("Failed to open file", path, errno, error);

    g_autoptr(GString) text = g_string_new(nullptr);
    struct stat st = {};
    int cause = fstat(fd, &st) != 0 ? errno : 0;
    if (cause == 0)
        // Without a writer a FIFO would read as an empty file.
        cause = S_ISFIFO(st.st_mode) ? EAGAIN : read_all(fd, text);
    (void)close(fd);  // it was only read from
    if (cause != 0) {
        const bool is_plain = S_ISREG(st.st_mode) && st.st_size > 0;
        return fail_to(is_plain ? "Failed to read from file" : "Error reading file", path, cause,
                       error);
    }
    *out_text = g_string_free(g_steal_pointer(&text), FALSE);
    return true;
}
