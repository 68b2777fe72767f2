/* platform/log_backend/log_backend.h: where the process's GLib log goes. */
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

#pragma GCC visibility push(default)

/*
 * Both take over GLib's default log handler, of every domain, and may be called again; the last
 * call counts. A record is one line, "warning: text" or "critical: GLib-GIO: text" when it has a
 * domain, whose text is cut after 4096 bytes with a mark that counts what is missing. Control
 * characters and bytes that are not UTF-8 are shown as \xNN.
 * As elsewhere in GLib, info and debug records appear only where G_MESSAGES_DEBUG asks for them.
 */

/* Standard output, a write for each record; with priority prefixes when that is the journal. */
void log_backend_stdout(void);

/* syslog(3) as privane_system, facility daemon. */
void log_backend_syslog(void);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif
