// service/quit_signals.h: SIGHUP, SIGINT and SIGTERM as events of the main loop.
#pragma once

#include <glib.h>

// Lets the three signals quit the loop. Unlike g_unix_signal_add this starts no thread, since
// threads do not survive daemon(3). False, with errno set, when there is no pipe to be had.
bool watch_quit_signals(GMainLoop *loop);

// Quits the loop. TRUE: the watch stays, and a second signal merely quits again.
gboolean on_quit_signal(gpointer loop);
