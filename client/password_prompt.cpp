// client/password_prompt.cpp: passwords from the terminal or from a descriptor.
#include "client/password_prompt.h"

#include <cerrno>
#include <csignal>
#include <cstddef>
#include <iterator>

#include <fcntl.h>
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

// Byte by byte: what stands behind the line is another's. Wipes nothing of what it returns.
static line_end read_line(int fd, char *line, std::size_t size, GError **error) {
    std::size_t length = 0;

    for (;;) {
        const ssize_t count = read(fd, line + length, 1);
        if (count < 0 && errno == EINTR) {
            if (caught_signal != 0)
                return line_end::SIGNAL;
            continue;
        }
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

static char *copy_password(const char *line, GError **error) {
    if (g_utf8_validate(line, -1, nullptr))
        return g_strdup(line);
    (void)fail_failed(error, "The password is no UTF-8");
    return nullptr;
}

char *password_read(int fd, GError **error) {
    char line[LONGEST_LINE] = {};
    char *password = nullptr;

    if (read_line(fd, line, sizeof line, error) == line_end::FOUND)
        password = copy_password(line, error);
    explicit_bzero(line, sizeof line);
    return password;
}

// The terminal without echo and the signals that would leave it so; the old state comes back with
// the end of its life.
class silent_terminal {
  public:
    explicit silent_terminal(int fd) : fd_(fd) {
        struct sigaction action = {};

        action.sa_handler = on_signal;  // No SA_RESTART: a signal ends the reading.
        caught_signal = 0;
        for (std::size_t i = 0; i < std::size(ENDING_SIGNALS); i++)
            (void)sigaction(ENDING_SIGNALS[i], &action, &old_actions_[i]);
        action.sa_handler = SIG_IGN;
        (void)sigaction(SIGTSTP, &action, &old_stop_);
        is_silent_ = tcgetattr(fd_, &old_state_) == 0;
        if (!is_silent_)
            return;
        termios silent = old_state_;
        silent.c_lflag &= ~static_cast<tcflag_t>(ECHO);
        silent.c_lflag |= ICANON | ECHONL | ISIG;
        is_silent_ = tcsetattr(fd_, TCSAFLUSH, &silent) == 0;
    }
    ~silent_terminal() {
        if (is_silent_)
            (void)tcsetattr(fd_, TCSAFLUSH, &old_state_);
        for (std::size_t i = 0; i < std::size(ENDING_SIGNALS); i++)
            (void)sigaction(ENDING_SIGNALS[i], &old_actions_[i], nullptr);
        (void)sigaction(SIGTSTP, &old_stop_, nullptr);
    }
    silent_terminal(const silent_terminal &) = delete;
    silent_terminal &operator=(const silent_terminal &) = delete;

    bool is_silent() const { return is_silent_; }

  private:
    int fd_;
    bool is_silent_ = false;
    termios old_state_ = {};
    struct sigaction old_actions_[std::size(ENDING_SIGNALS)] = {};
    struct sigaction old_stop_ = {};
};

static bool write_text(int fd, const char *text) {
    return write(fd, text, std::strlen(text)) == static_cast<ssize_t>(std::strlen(text));
}

static line_end ask_line(int fd, const char *prompt, char *line, std::size_t size, GError **error) {
    const silent_terminal terminal(fd);

    // Rather no password than one that everybody behind the user can read.
    if (!terminal.is_silent() || !write_text(fd, prompt)) {
        (void)fail_failed(error, "Cannot ask for the password: %s", g_strerror(errno));
        return line_end::FAILED;
    }
    return read_line(fd, line, size, error);
}

static char *ask_once(int fd, const char *prompt, GError **error) {
    char line[LONGEST_LINE] = {};
    char *password = nullptr;
    const line_end end = ask_line(fd, prompt, line, sizeof line, error);

    if (end == line_end::FOUND)
        password = copy_password(line, error);
    explicit_bzero(line, sizeof line);
    if (end == line_end::SIGNAL) {
        (void)raise(static_cast<int>(caught_signal));  // Now it has its usual end, if it ends.
        (void)fail_failed(error, "Interrupted");
    }
    return password;
}

char *password_ask(const char *prompt, bool is_new, GError **error) {
    const int fd = open("/dev/tty", O_RDWR | O_NOCTTY | O_CLOEXEC);

    if (fd < 0) {
        (void)fail_failed(error, "No terminal to ask for the password on; see --password-fd");
        return nullptr;
    }
    g_auto(wiped_string) password = ask_once(fd, prompt, error);
    if (password != nullptr && is_new) {
        g_auto(wiped_string) repeated = ask_once(fd, "Again: ", error);
        if (repeated != nullptr && std::strcmp(password, repeated) != 0)
            (void)fail_failed(error, "The passwords differ");
        if (repeated == nullptr || std::strcmp(password, repeated) != 0)
            g_clear_pointer(&password, wipe_free);
    }
    (void)close(fd);
    return g_steal_pointer(&password);
}
