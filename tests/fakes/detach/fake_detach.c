/* tests/fakes/detach/fake_detach.c: stands in front of daemon(3), which it calls.
 *
 * Preloaded. FAKE_DETACH_RECORD names the file that gets a line "daemon NOCHDIR NOCLOSE TASKS" for
 * a call, TASKS being the number of threads; FAKE_DETACH_ERRNO, where set, makes the call fail with
 * that number instead.
 */
#include <dirent.h>
#include <dlfcn.h>
#include <errno.h>
#include <stdio.h>
#include <stdlib.h>

int daemon(int nochdir, int noclose);

static int count_tasks(void) {
    DIR *tasks = opendir("/proc/self/task");
    int count = 0;

    if (tasks == NULL)
        return -1;
    for (struct dirent *entry = readdir(tasks); entry != NULL; entry = readdir(tasks)) {
        if (entry->d_name[0] != '.')
            count++;
    }
    closedir(tasks);
    return count;
}

static void record(int nochdir, int noclose) {
    const char *path = getenv("FAKE_DETACH_RECORD");
    FILE *file = path != NULL ? fopen(path, "ae") : NULL;

    if (file == NULL)
        abort();
    fprintf(file, "daemon %d %d %d\n", nochdir, noclose, count_tasks());
    fclose(file);
}

int daemon(int nochdir, int noclose) {
    int (*real)(int, int) = (int (*)(int, int))dlsym(RTLD_NEXT, "daemon");
    const char *failure = getenv("FAKE_DETACH_ERRNO");

    record(nochdir, noclose);
    if (failure != NULL) {
        errno = atoi(failure);
        return -1;
    }
    return real(nochdir, noclose);
}
