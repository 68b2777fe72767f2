// tests/unit/platform/fake_bus.h: a bus in the process that uses it, which tells what a test wants.
#pragma once

#include <atomic>
#include <string>

#include <gio/gio.h>

// The system bus of this process, until the end. It knows every name, and its user is the number in
// the name: of ":1.701", 701, with the groups 7 and 750. ready() is false when it could not start.
class fake_bus {
  public:
    enum class credentials {
        WHOLE,
        WITHOUT_GROUPS,
        WITHOUT_UID,
        UID_OF_ANOTHER_TYPE,
        OF_ANOTHER_TYPE,
        REFUSED
    };

    fake_bus();
    ~fake_bus();
    fake_bus(const fake_bus &) = delete;
    fake_bus &operator=(const fake_bus &) = delete;

    bool ready() const { return server_ != nullptr; }

    // The owner of the name has left the bus.
    void end(const std::string &name) const;

    std::atomic<credentials> told = credentials::WHOLE;
    std::atomic<int> lost = 0;       // how many of the next answers are
    std::atomic<int> questions = 0;  // for credentials
    std::atomic<int> watches = 0;    // match rules with an arg0, less those that were removed

  private:
    static void *serve(void *data);
    static gboolean on_connection(GDBusServer *server, GDBusConnection *connection, void *data);
    static GDBusMessage *on_message(GDBusConnection *connection, GDBusMessage *message,
                                    gboolean incoming, void *data);
    void answer(GDBusConnection *connection, GDBusMessage *call, const std::string &member);
    GVariant *tell(const std::string &name) const;

    GMainContext *context_ = g_main_context_new();
    std::atomic<bool> is_serving_ = true;
    GThread *thread_ = nullptr;
    GDBusServer *server_ = nullptr;
    GDBusConnection *connection_ = nullptr;  // of the one that connected last
};
