// benchmarks/clients/cfgstore.cpp: the process that every change of an account is told to; it
// counts.
//
//   cfgstore COUNT_FILE
//
// COUNT_FILE holds how many SIGUSR1 have come. Two that wait at once are one for the kernel, so
// that it comes before other programs where it may.
#include <csignal>
#include <cstdio>
#include <cstdlib>

#include <fcntl.h>
#include <sched.h>
#include <unistd.h>

static void write_count(int fd, unsigned long count) {
    char text[32];
    const int length = snprintf(text, sizeof text, "%lu\n", count);

    if (pwrite(fd, text, static_cast<std::size_t>(length), 0) == length)
        return;
    perror("cfgstore");
    exit(EXIT_FAILURE);
}

int main(int argc, char **argv) {
    if (argc != 2) {
        (void)fprintf(stderr, "usage: cfgstore COUNT_FILE\n");
        return 2;
    }
    sigset_t awaited;
    (void)sigemptyset(&awaited);
    (void)sigaddset(&awaited, SIGUSR1);
    (void)sigprocmask(SIG_BLOCK, &awaited, nullptr);
    const struct sched_param first = {1};
    (void)sched_setscheduler(0, SCHED_FIFO, &first);  // It may be forbidden here.

    const int fd = open(argv[1], O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    if (fd < 0) {
        perror(argv[1]);
        return EXIT_FAILURE;
    }
    for (unsigned long count = 0;; count++) {
        write_count(fd, count);
        while (sigwaitinfo(&awaited, nullptr) != SIGUSR1) {
        }
    }
}
