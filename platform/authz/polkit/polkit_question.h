// platform/authz/polkit/polkit_question.h: one question to polkit, until its answer or its
// deadline; internal.
#pragma once

#include <gio/gio.h>

// Polkit's name on the bus, the service that decides.
inline constexpr const char *POLKIT_NAME = "org.freedesktop.PolicyKit1";

enum class polkit_answer { ALLOWED, REFUSED, NEEDS_PASSWORD };

// What questions go over.
struct polkit_channel {
    GDBusConnection *bus;
    // Of the questions alone: while one waits, nothing else of the program runs.
    GMainContext *context;
};

struct polkit_question {
    const char *sender;
    const char *action_id;
    const char *unit;         // null, or what the details tell of a unit
    const char *unit_action;  // and its own action
    gint64 deadline;          // in the monotonic time
};

// False with *error set where polkit did not answer: its own error, the bus's, or GDBus's. The
// caller waits meanwhile, no longer than the deadline.
bool polkit_question_ask(const polkit_channel &channel, const polkit_question &asked,
                         polkit_answer *out_answer, GError **error);

// 0 from the deadline on.
int polkit_question_remaining_ms(gint64 deadline);
