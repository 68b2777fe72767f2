// benchmarks/clients/run_time.cpp: how long programs take that run one after the other.
//
//   run_time TEXT PROGRAM [ARGUMENT...] [-- PROGRAM [ARGUMENT...]]...
//
// Each reads TEXT as its standard input. Prints the microseconds from before the first is started
// until the last has ended; all must succeed.
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <vector>

#include <fcntl.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

static void require(bool holds, const char *what) {
    if (holds)
        return;
    (void)fprintf(stderr, "run_time: %s: %s\n", what, strerror(errno));
    exit(EXIT_FAILURE);
}

struct program {
    char **argv;  // ends with null
    int input;    // the text, from its beginning
};

static int open_text(const char *text) {
    const std::size_t length = strlen(text);
    const int fd = memfd_create("text", MFD_CLOEXEC);

    require(fd >= 0 && write(fd, text, length) == static_cast<ssize_t>(length) &&
                lseek(fd, 0, SEEK_SET) == 0,
            "the text");
    return fd;
}

// Each "--" becomes the end of a list of arguments.
static std::vector<program> parse(const char *text, char **words) {
    std::vector<program> programs = {
        {words, open_text(text)}
    };
    for (char **word = words; *word != nullptr; word++) {
        if (strcmp(*word, "--") != 0)
            continue;
        *word = nullptr;
        programs.push_back({word + 1, open_text(text)});
    }
    return programs;
}

static void run(const program &started, int null_fd, char **environment) {
    posix_spawn_file_actions_t actions;
    pid_t child = 0;
    int status = 0;

    require(posix_spawn_file_actions_init(&actions) == 0 &&
                posix_spawn_file_actions_adddup2(&actions, started.input, STDIN_FILENO) == 0 &&
                posix_spawn_file_actions_adddup2(&actions, null_fd, STDOUT_FILENO) == 0,
            "file actions");
    errno = posix_spawnp(&child, started.argv[0], &actions, nullptr, started.argv, environment);
    require(errno == 0, started.argv[0]);
    require(waitpid(child, &status, 0) == child, "wait");
    (void)posix_spawn_file_actions_destroy(&actions);
    if (status == 0)
        return;
    (void)fprintf(stderr, "run_time: %s ended with the status %d\n", started.argv[0], status);
    exit(EXIT_FAILURE);
}

static double now() {
    struct timespec time = {};
    (void)clock_gettime(CLOCK_MONOTONIC, &time);
    return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_nsec) / 1e3;
}

int main(int argc, char **argv) {
    if (argc < 3) {
        (void)fprintf(stderr, "usage: run_time TEXT PROGRAM [ARGUMENT...] [-- PROGRAM...]...\n");
        return 2;
    }
    const std::vector<program> programs = parse(argv[1], argv + 2);
    for (const program &each : programs) {
        if (each.argv[0] == nullptr) {
            (void)fprintf(stderr, "run_time: no program\n");
            return 2;
        }
    }
    const int null_fd = open("/dev/null", O_WRONLY | O_CLOEXEC);
    require(null_fd >= 0, "/dev/null");

    const double start = now();
    for (const program &each : programs)
        run(each, null_fd, environ);
    (void)printf("%.3f\n", now() - start);
}
