/* tests/fakes/long_lines/fake_long_lines.c: reads group files with huge lines in reasonable time.
 *
 * Preloaded. The C library's fgetgrent starts each line anew whenever its buffer proves too small,
 * and lets the buffer grow by a kilobyte: a line of 33 MiB takes it minutes. This one has the room
 * from the start, and is the C library's own reader otherwise.
 */
#include <grp.h>
#include <stdio.h>
#include <stdlib.h>

enum { ROOM = 256 * 1024 * 1024 };

struct group *fgetgrent(FILE *stream) {
    static struct group record;
    static char *room;
    struct group *result = NULL;

    if (room == NULL)
        room = malloc(ROOM);
    if (room == NULL)
        abort();
    return fgetgrent_r(stream, &record, room, ROOM, &result) == 0 ? result : NULL;
}
