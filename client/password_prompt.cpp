// client/password_prompt.cpp: passwords from the terminal or from a descriptor.
#include "client/password_prompt.h"

#include <cerrno>
#include <csignal>
#include <cstddef>
#include <iterator>

#include <fcntl.h>
#include <poll.h>
#include <termios.h>
#include <unistd.h>

#include "client/client_error.h"

static constexpr std::size_t LONGEST_LINE = 1024;

static constexpr int ENDING_SIGNALS[] = {SIGHUP, SIGINT, SIGQUIT, SIGTERM};

static volatile std::sig_atomic_t caught_signal;

static void on_signal(int number) {
    caught_signal = number;
}

enum class line_end { FOUND, SIGNAL, FAILED };

// Until there is something to read, or one of the ending signals has come: they are blocked but
// here, so that none comes unseen right in front of the waiting.
static bool await_input(int fd, const sigset_t *mask) {
    pollfd waited = {fd, POLLIN, 0};

    while (caught_signal == 0)
        if (ppoll(&waited, 1, nullptr, mask) >= 0 || errno != EINTR)
            return true;
    return false;
}

// Byte by byte: what stands behind the line is another's. Wipes nothing of what it returns. mask:
// that of await_input, or null where signals are as ever.
static line_end read_line(int fd, const sigset_t *mask, char *line, std::size_t size,
                          GError **error) {
    std::size_t length = 0;

    for (;;) {
        if (mask != nullptr && !await_input(fd, mask))
            return line_end::SIGNAL;
        const ssize_t count = read(fd, line + length, 1);
        if (count < 0 && errno == EINTR)
            continue;
        if (count < 0) {
            (void)fail_failed(error, "Cannot read the password: %s", g_strerror(errno));
            return line_end::FAILED;
        }
        if (count == 0 || line[length] == '\n')
            break;
        if (line[length] == '\0' || ++length == size) {
            (void)fail_failed(error, "The password is too long, or has a NUL byte");
            return line_end::FAILED;
        }
    }
    line[length] = '\0';
    return line_end::FOUND;
}

// The service takes an empty password for none, and would leave the old one as it is.
static char *copy_password(const char *line, bool is_new, GError **error) {
    if (!g_utf8_validate(line, -1, nullptr)) {
        (void)fail_failed(error, "The password is no UTF-8");
        return nullptr;
    }
    if (is_new && *line == '\0') {
        (void)fail_failed(error, "The password is empty");
        return nullptr;
    }
    return g_strdup(line);
}

// Null with an error, or without one where a signal has ended it; mask as for read_line.
static char *read_password(int fd, const sigset_t *mask, bool is_new, GError **error) {
    wiped_bytes<LONGEST_LINE> line;

    if (read_line(fd, mask, line.bytes, sizeof line.bytes, error) != line_end::FOUND)
        return nullptr;
    return copy_password(line.bytes, is_new, error);
}

char *password_read(int fd, bool is_new, GError **error) {
    if (isatty(fd) != 0) {
        (void)fail_usage(error,
                         "descriptor %d is a terminal, which would show the password; let "
                         "privanectl ask for it",
                         fd);
        return nullptr;
    }
    return read_password(fd, nullptr, is_new, error);
}

// The terminal without echo, and the signals that would leave it so held back; the old state of
// both comes back with the end of its life.
class silent_terminal {
  public:
    explicit silent_terminal(int fd) : fd_(fd) {
        struct sigaction action = {};
        sigset_t ending;

        (void)sigemptyset(&ending);
        action.sa_handler = on_signal;
        caught_signal = 0;
        for (std::size_t i = 0; i < std::size(ENDING_SIGNALS); i++) {
            (void)sigaddset(&ending, ENDING_SIGNALS[i]);
            (void)sigaction(ENDING_SIGNALS[i], &action, &old_actions_[i]);
        }
        (void)sigprocmask(SIG_BLOCK, &ending, &old_mask_);
        action.sa_handler = SIG_IGN;
        (void)sigaction(SIGTSTP, &action, &old_stop_);
        if (tcgetattr(fd_, &old_state_) != 0)
            return;
        termios silent = old_state_;
        silent.c_lflag &= ~static_cast<tcflag_t>(ECHO);
        silent.c_lflag |= ICANON | ECHONL | ISIG;
        is_silent_ = tcsetattr(fd_, TCSAFLUSH, &silent) == 0;
    }
    ~silent_terminal() {
        if (is_silent_)
            (void)tcsetattr(fd_, TCSADRAIN, &old_state_);
        (void)sigprocmask(SIG_SETMASK, &old_mask_, nullptr);
        for (std::size_t i = 0; i < std::size(ENDING_SIGNALS); i++)
            (void)sigaction(ENDING_SIGNALS[i], &old_actions_[i], nullptr);
        (void)sigaction(SIGTSTP, &old_stop_, nullptr);
    }
    silent_terminal(const silent_terminal &) = delete;
    silent_terminal &operator=(const silent_terminal &) = delete;

    bool is_silent() const { return is_silent_; }
    const sigset_t *old_mask() const { return &old_mask_; }

  private:
    int fd_;
    bool is_silent_ = false;
    termios old_state_ = {};
    sigset_t old_mask_ = {};
    struct sigaction old_actions_[std::size(ENDING_SIGNALS)] = {};
    struct sigaction old_stop_ = {};
};

// Null with an error, or without one where a signal has ended it.
static char *ask_line(int fd, const silent_terminal &terminal, const char *prompt, bool is_new,
                      GError **error) {
    if (write(fd, prompt, std::strlen(prompt)) != static_cast<ssize_t>(std::strlen(prompt))) {
        (void)fail_failed(error, "Cannot ask for the password: %s", g_strerror(errno));
        return nullptr;
    }
    return read_password(fd, terminal.old_mask(), is_new, error);
}

static char *ask_in_silence(int fd, const char *prompt, bool is_new, GError **error) {
    const silent_terminal terminal(fd);

    // Rather no password than one that everybody behind the user can read.
    if (!terminal.is_silent()) {
        (void)fail_failed(error, "Cannot ask for the password: the terminal shows what is typed");
        return nullptr;
    }
    g_auto(wiped_string) password = ask_line(fd, terminal, prompt, is_new, error);
    if (password == nullptr || !is_new)
        return g_steal_pointer(&password);
    g_auto(wiped_string) repeated = ask_line(fd, terminal, "Again: ", is_new, error);
    if (repeated == nullptr)
        return nullptr;
    if (std::strcmp(password, repeated) == 0)
        return g_steal_pointer(&password);
    (void)fail_failed(error, "The passwords differ");
    return nullptr;
}

char *password_ask(const char *prompt, bool is_new, GError **error) {
    const int fd = open("/dev/tty", O_RDWR | O_NOCTTY | O_CLOEXEC);

    if (fd < 0) {
        (void)fail_failed(error, "No terminal to ask for the password on; see --password-fd");
        return nullptr;
    }
    char *password = ask_in_silence(fd, prompt, is_new, error);
    (void)close(fd);
    if (caught_signal != 0) {
        (void)raise(static_cast<int>(caught_signal));  // Its usual end; it may be ignored.
        if (error != nullptr && *error == nullptr)
            (void)fail_failed(error, "Interrupted");
        g_clear_pointer(&password, wipe_free);
    }
    return password;
}
