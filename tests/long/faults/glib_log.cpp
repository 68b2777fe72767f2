// tests/long/faults/glib_log.cpp: what is logged through GLib and syslog(3), taken.
#include "tests/long/faults/glib_log.h"

#include "tests/unit/usermgmt/log_capture.h"

glib_log::glib_log() {
    (void)take_syslog();
    old_ = g_log_set_default_handler(take, this);
    old_fatal_ = g_log_set_always_fatal(G_LOG_LEVEL_ERROR);
}

glib_log::~glib_log() {
    (void)g_log_set_always_fatal(old_fatal_);
    (void)g_log_set_default_handler(old_, nullptr);
}

void glib_log::take(const char * /*domain*/, GLogLevelFlags level, const char *text, gpointer log) {
    const char *name = (level & G_LOG_LEVEL_MESSAGE) != 0   ? "message "
                       : (level & G_LOG_LEVEL_WARNING) != 0 ? "warning "
                                                            : "other ";
    static_cast<glib_log *>(log)->lines_.push_back(name + std::string(text));
}

std::vector<std::string> glib_log::taken() const {
    std::vector<std::string> all = lines_;
    for (const std::string &line : take_syslog())
        all.push_back(line);
    return all;
}
