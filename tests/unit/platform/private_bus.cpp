// tests/unit/platform/private_bus.cpp: starts and ends a dbus-daemon for one test.
#include "tests/unit/platform/private_bus.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>

#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <glib.h>

static constexpr const char *ADDRESS_VARIABLE = "DBUS_SYSTEM_BUS_ADDRESS";

static void write_file(const std::string &path, const std::string &text) {
    std::ofstream(path) << text;
}

static std::string bus_config(const std::string &folder) {
    return "<!DOCTYPE busconfig PUBLIC \"-//freedesktop//DTD D-Bus Bus Configuration 1.0//EN\""
           " \"http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd\">\n"
           "<busconfig>\n"
           "  <listen>unix:path=" +
           folder +
           "/bus</listen>\n"
           "  <auth>EXTERNAL</auth>\n"
           "  <servicedir>" +
           folder +
           "/services</servicedir>\n"
           "  <policy context=\"default\">\n"
           "    <allow send_destination=\"*\" eavesdrop=\"true\"/>\n"
           "    <allow eavesdrop=\"true\"/>\n"
           "    <allow own=\"*\"/>\n"
           "  </policy>\n"
           "</busconfig>\n";
}

// The daemon prints its address once it listens.
static bool wait_for_line(int fd) {
    char byte = '\0';

    while (byte != '\n') {
        const ssize_t count = read(fd, &byte, 1);
        if (count == 0 || (count < 0 && errno != EINTR))
            return false;
    }
    return true;
}

static pid_t start_daemon(const std::string &config_path, int ready_fd) {
    const std::string config_option = "--config-file=" + config_path;
    const pid_t daemon = fork();

    if (daemon == 0) {
        (void)prctl(PR_SET_PDEATHSIG, SIGKILL);
        if (dup2(ready_fd, STDOUT_FILENO) >= 0)
            (void)execlp("dbus-daemon", "dbus-daemon", config_option.c_str(), "--nofork",
                         "--nopidfile", "--nosyslog", "--print-address=1", nullptr);
        std::_Exit(99);
    }
    return daemon;
}

static void end_process(pid_t process) {
    if (process <= 0)
        return;
    (void)::kill(process, SIGKILL);
    while (waitpid(process, nullptr, 0) < 0 && errno == EINTR) {
    }
}

private_bus::private_bus(polkit known) {
    char name[] = "/tmp/privane-bus-XXXXXX";
    int ends[2] = {-1, -1};
    if (mkdtemp(name) == nullptr || pipe2(ends, O_CLOEXEC) != 0)
        return;

    folder_ = name;
    std::filesystem::create_directory(folder_ + "/services");
    if (known == polkit::STARTABLE)
        write_file(folder_ + "/services/org.freedesktop.PolicyKit1.service",
                   "[D-BUS Service]\nName=org.freedesktop.PolicyKit1\nExec=/bin/false\n");
    write_file(folder_ + "/bus.conf", bus_config(folder_));
    daemon_ = start_daemon(folder_ + "/bus.conf", ends[1]);
    (void)close(ends[1]);
    ready_ = wait_for_line(ends[0]);
    (void)close(ends[0]);
    g_setenv(ADDRESS_VARIABLE, ("unix:path=" + folder_ + "/bus").c_str(), TRUE);
}

private_bus::~private_bus() {
    g_unsetenv(ADDRESS_VARIABLE);
    end_process(daemon_);
    if (!folder_.empty())
        std::filesystem::remove_all(folder_);
}

void fake_polkit::freeze() const {
    (void)::kill(process_, SIGSTOP);
}

void fake_polkit::kill() const {
    (void)::kill(process_, SIGKILL);
}

fake_polkit::~fake_polkit() {
    end_process(process_);
}
