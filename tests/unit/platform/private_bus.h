// tests/unit/platform/private_bus.h: a message bus for one test, and a polkit on it that obeys.
#pragma once

#include <string>

#include <sys/types.h>

// A real dbus-daemon that allows everything, in a temporary folder. DBUS_SYSTEM_BUS_ADDRESS names
// it until the end. ready() is false when something of it could not be set up.
class private_bus {
  public:
    enum class polkit { UNKNOWN, STARTABLE };

    explicit private_bus(polkit known);
    ~private_bus();
    private_bus(const private_bus &) = delete;
    private_bus &operator=(const private_bus &) = delete;

    bool ready() const { return ready_; }

  private:
    std::string folder_;
    pid_t daemon_ = -1;
    bool ready_ = false;
};

// Owns polkit's name on the bus that DBUS_SYSTEM_BUS_ADDRESS names, or stands in line for it, and
// answers by the action ID:
//
//   test.allowed       yes
//   test.refused       no
//   test.password      only with a password
//   test.undeclared    the error of the real polkit for an action that it does not know
//   test.question      an error whose text shows the question as it came
//   test.silent        nothing
//   test.lost-answers  nothing the first two times, then yes
//   test.late          yes, after 1.3 s in which nothing is answered
//   test.late-in-vain  likewise, but the first answer does not arrive
//   test.questions     an error whose text tells how many were asked, this one included
//   test.last-answer   yes, and exits
//   test.last-question exits without an answer where it is a mortal one, else yes
//
// Of the actions on units, which begin with com.zintor.privane-system:
//
//   ACTION.declared-WORD  the word: allowed, refused or password
//   ACTION.broken         an error of another text than an action has that is not known
//   ACTION.slow           after 1.2 s, the error for an action that is not known
//   ACTION.OTHER          the error for an action that is not known
//   setdefaulttarget      likewise
//   ACTION                by the detail "unit": one of the words, nothing for silent and slow, else
//                         an error whose text shows the question as it came
class fake_polkit {
  public:
    enum class end { MORTAL, IMMORTAL };

    explicit fake_polkit(end its_end = end::IMMORTAL);
    ~fake_polkit();
    fake_polkit(const fake_polkit &) = delete;
    fake_polkit &operator=(const fake_polkit &) = delete;

    bool ready() const { return ready_; }

    // For the test or a child of it. A killed one loses the name.
    void freeze() const;
    void kill() const;

  private:
    pid_t process_ = -1;
    bool ready_ = false;
};
