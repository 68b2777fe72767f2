// client/decision.h: what the device's own authorization library, which the service asks, says of
// an action.
#pragma once

#include <gio/gio.h>

struct session;

enum class verdict { YES, NO, UNKNOWN };

// By what the library decides, as far as can be told.
enum class decider { UNTOLD, POLKIT, POLICY_FILE };

struct decision {
    verdict allowed;
    char *reason;  // for people
    decider by;
    const char *policy_file;  // with POLICY_FILE, its path, which is the library's
    char *asked;  // the last action that polkit was asked about, which is the one that counts
};

void decision_clear(decision *made);
G_DEFINE_AUTO_CLEANUP_CLEAR_FUNC(decision, decision_clear)

// Of the process's library; it may be used once. It is asked before the process has threads, for
// one that works in a child: before anything else connects to the bus.
class authorization {
  public:
    authorization();
    ~authorization();
    authorization(const authorization &) = delete;
    authorization &operator=(const authorization &) = delete;

    // Whether the owner of the connection may perform the action.
    void decide(GDBusConnection *bus, const char *action_id, decision *out_made);

  private:
    void *library_ = nullptr;  // null: error_ tells why
    GError *error_ = nullptr;
};
