// service/reply.cpp: what may go out on the bus.
#include "service/reply.h"

#include <cstring>

// The build option; by default dbus-daemon's max_message_size for the system bus, dbus-daemon(1).
static constexpr gsize MESSAGE_LIMIT = BUS_MESSAGE_LIMIT;
static constexpr gsize HEADER_ROOM = gsize{64} * 1024;

// The D-Bus wire format: a length, a terminator, and padding to the next length's boundary.
static constexpr gsize LENGTH_SIZE = 4;
static constexpr gsize TERMINATOR_SIZE = 1;
static constexpr gsize MAX_PADDING = 3;
static constexpr gsize STRING_OVERHEAD = LENGTH_SIZE + TERMINATOR_SIZE + MAX_PADDING;

char *sendable_text(const char *text) {
    return text != nullptr ? g_utf8_make_valid(text, -1) : g_strdup("");
}

void make_sendable(char **list) {
    for (; *list != nullptr; list++) {
        if (g_utf8_validate(*list, -1, nullptr))
            continue;
        char *sendable = g_utf8_make_valid(*list, -1);
        g_free(*list);
        *list = sendable;
    }
}

gsize wire_size(const char *text) {
    return std::strlen(text) + STRING_OVERHEAD;
}

gsize wire_size(const char *const *list) {
    gsize size = LENGTH_SIZE;
    for (; *list != nullptr; list++)
        size += wire_size(*list);
    return size;
}

bool check_reply_size(gsize size, GError **error) {
    if (size <= MESSAGE_LIMIT - HEADER_ROOM)
        return true;
    g_set_error(error, G_FILE_ERROR, G_FILE_ERROR_FAILED,
                "The reply of %" G_GSIZE_FORMAT " bytes is larger than a bus message may be", size);
    return false;
}
